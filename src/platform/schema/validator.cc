// JSON schema validation: the schema engine (draft 4) for the standard
// keywords, plus our "unionTag" keyword, and the findings in our format.
#include <algorithm>
#include <cstdint>
#include <iterator>
#include <memory>
#include <set>
#include <string>
#include <string_view>
#include <tuple>
#include <vector>

#include <hoxcm/json.h>
#include <hoxcm/schema_store.h>

#include "foundation/compare/value_compare.h"
#include "foundation/schema_refs.h"
#include "platform/schema/patterns.h"
#include "platform/schema/prepared_schema.h"
#include "platform/schema/schema_file.h"
#include "platform/schema/schema_store_impl.h"
#include "platform/schema/validator_errors.h"
#include "platform/schema/valijson.h"

namespace JsonValidator {
namespace {

using detail::Finding;
using rapidjson::Value;

// Unions nest inside union variants; a schema that nests deeper is refused.
constexpr int kMaxUnionDepth = 32;

bool ContainsUnionTag(const Value& node) {
  if (node.IsObject()) {
    for (const auto& m : node.GetObject()) {
      if ((m.name == "unionTag" && m.value.IsString()) || ContainsUnionTag(m.value)) return true;
    }
  } else if (node.IsArray()) {
    for (const auto& v : node.GetArray()) {
      if (ContainsUnionTag(v)) return true;
    }
  }
  return false;
}

// The engine does not know union tags: it gets the schema without the
// variant lists of union nodes, which the union walk checks instead.
void RemoveUnionVariants(Value& node) {
  if (node.IsObject()) {
    auto tag = node.FindMember("unionTag");
    if (tag != node.MemberEnd() && tag->value.IsString()) node.RemoveMember("oneOf");
    for (auto& m : node.GetObject()) RemoveUnionVariants(m.value);
  } else if (node.IsArray()) {
    for (auto& v : node.GetArray()) RemoveUnionVariants(v);
  }
}

Finding SchemaInvalid(const std::string& path, const std::string& reason) {
  Finding f;
  f.field = path;
  f.code = VALIDATION_ERR_SCHEMA_INVALID;
  f.args.push_back(reason);
  f.text = "The schema is not usable: " + reason;
  return f;
}

std::string ContextToPath(const std::string& base, const std::vector<std::string>& context) {
  std::string path = base;
  // The first element names the root ("<root>"); the others are "[name]".
  for (std::size_t i = 1; i < context.size(); ++i) {
    const std::string& part = context[i];
    HoxConfigManager::detail::AppendPointerToken(path, part.size() >= 2 ? part.substr(1, part.size() - 2) : part);
  }
  return path;
}

// The type(s) the schema expects at `field` (below the validated root at
// `base`): "string", "string or null"; empty when the walk through
// properties, items and additionalProperties (local references followed)
// does not reach a node with a "type".
std::string ExpectedType(const Value& schema, const std::string& base, const std::string& field) {
  const Value* node = &schema;
  std::size_t start = base.size();
  while (start < field.size()) {
    std::size_t end = field.find('/', start + 1);
    if (end == std::string::npos) end = field.size();
    const std::string segment = HoxConfigManager::detail::PointerTokenName(field.substr(start + 1, end - start - 1));
    start = end;
    node = HoxConfigManager::detail::FollowReferences(schema, node);
    if (node == nullptr || !node->IsObject()) return std::string();
    const auto props = node->FindMember("properties");
    const auto items = node->FindMember("items");
    const auto extra = node->FindMember("additionalProperties");
    const Value name(rapidjson::StringRef(segment.data(), static_cast<rapidjson::SizeType>(segment.size())));
    const auto named = props != node->MemberEnd() && props->value.IsObject() ? props->value.FindMember(name)
                                                                              : node->MemberEnd();
    if (props != node->MemberEnd() && props->value.IsObject() && named != props->value.MemberEnd()) {
      node = &named->value;
    } else if (items != node->MemberEnd() && items->value.IsObject() && !segment.empty() &&
               segment.find_first_not_of("0123456789") == std::string::npos) {
      node = &items->value;
    } else if (extra != node->MemberEnd() && extra->value.IsObject()) {
      node = &extra->value;
    } else {
      return std::string();
    }
  }
  node = HoxConfigManager::detail::FollowReferences(schema, node);
  if (node == nullptr || !node->IsObject()) return std::string();
  const auto type = node->FindMember("type");
  if (type == node->MemberEnd()) return std::string();
  if (type->value.IsString()) return type->value.GetString();
  std::string types;
  if (type->value.IsArray()) {
    for (const auto& t : type->value.GetArray()) {
      if (!t.IsString()) return std::string();
      types += (types.empty() ? "" : " or ") + std::string(t.GetString());
    }
  }
  return types;
}

using Seen = std::set<std::tuple<std::string, int, std::string>>;

// The findings of an engine run on `schema` (the JSON form of what the
// engine ran, for the expected types) for the value at `path`.
void CollectEngineFindings(valijson::ValidationResults& results, const Value& schema, const std::string& path,
                           Seen& seen, std::vector<Finding>& out) {
  valijson::ValidationResults::Error error;
  while (results.popError(error)) {
    Finding f;
    if (!detail::ClassifyEngineError(ContextToPath(path, error.context), error.description, f)) continue;
    if (f.code == VALIDATION_ERR_TYPE) {
      if (std::string expected = ExpectedType(schema, path, f.field); !expected.empty()) {
        f.args.push_back(std::move(expected));
        f.text = DescribeFinding(f.code, f.args, error.description);
      }
    }
    // Variants of a failed oneOf/anyOf may report the same fault twice.
    if (!seen.emplace(f.field, f.code, f.text).second) continue;
    out.push_back(std::move(f));
  }
}

void RunEngine(const Value& schema, const Value& document, const std::string& path, std::vector<Finding>& out) {
  // A reference the engine cannot resolve in the schema itself would send
  // it after a document it never fetches, or round in circles.
  if (std::string unusable = HoxConfigManager::detail::CheckReferences(schema); !unusable.empty()) {
    out.push_back(SchemaInvalid(path, unusable));
    return;
  }
  if (std::string refused = detail::CheckPatterns(schema); !refused.empty()) {
    out.push_back(SchemaInvalid(path, refused));
    return;
  }
  valijson::ValidationResults results;
  try {
    valijson::Schema compiled;
    valijson::SchemaParser parser(valijson::SchemaParser::kDraft4);
    valijson::adapters::RapidJsonAdapter schemaAdapter(schema);
    parser.populateSchema(schemaAdapter, compiled);
    valijson::Validator validator;
    valijson::adapters::RapidJsonAdapter target(document);
    validator.validate(compiled, target, &results);
  } catch (const std::exception& e) {
    out.push_back(SchemaInvalid(path, e.what()));
    return;
  }
  Seen seen;
  CollectEngineFindings(results, schema, path, seen, out);
}

void ValidateValue(const Value& schema, const Value& document, const std::string& path, int depth,
                   std::vector<Finding>& out);

class UnionWalk {
 public:
  UnionWalk(const Value& root, int depth, std::vector<Finding>& out) : root_(root), depth_(depth), out_(out) {}

  void Walk(const Value& doc, const Value* node, const std::string& path) {
    node = HoxConfigManager::detail::FollowReferences(root_, node);
    if (node == nullptr || !node->IsObject()) return;
    auto tag = node->FindMember("unionTag");
    if (tag != node->MemberEnd() && tag->value.IsString() && doc.IsObject()) CheckUnion(doc, *node, tag->value, path);
    auto allOf = node->FindMember("allOf");
    if (allOf != node->MemberEnd() && allOf->value.IsArray()) {
      for (const auto& branch : allOf->value.GetArray()) Walk(doc, &branch, path);
    }
    if (doc.IsObject()) {
      auto props = node->FindMember("properties");
      auto extra = node->FindMember("additionalProperties");
      for (const auto& m : doc.GetObject()) {
        const Value* child = nullptr;
        if (props != node->MemberEnd() && props->value.IsObject()) {
          auto p = props->value.FindMember(m.name);
          if (p != props->value.MemberEnd()) child = &p->value;
        }
        if (child == nullptr && extra != node->MemberEnd() && extra->value.IsObject()) child = &extra->value;
        if (child == nullptr) continue;
        std::string childPath = path;
        HoxConfigManager::detail::AppendPointerToken(childPath, {m.name.GetString(), m.name.GetStringLength()});
        Walk(m.value, child, childPath);
      }
    } else if (doc.IsArray()) {
      auto items = node->FindMember("items");
      if (items == node->MemberEnd()) return;
      for (rapidjson::SizeType i = 0; i < doc.Size(); ++i) {
        const Value* child = nullptr;
        if (items->value.IsObject()) {
          child = &items->value;
        } else if (items->value.IsArray() && i < items->value.Size()) {
          child = &items->value[i];
        }
        if (child != nullptr) Walk(doc[i], child, path + "/" + std::to_string(i));
      }
    }
  }

 private:
  void CheckUnion(const Value& doc, const Value& node, const Value& tagName, const std::string& path) {
    const std::string tag = tagName.GetString();
    auto variants = node.FindMember("oneOf");
    if (variants == node.MemberEnd() || !variants->value.IsArray()) return;
    Finding f;
    f.field = path;
    HoxConfigManager::detail::AppendPointerToken(f.field, tag);
    f.code = VALIDATION_ERR_UNION_TAG;
    f.args.push_back(tag);
    auto value = doc.FindMember(tagName);
    if (value == doc.MemberEnd() || !value->value.IsString()) {
      f.text = "The union tag property '" + tag + "' is missing or not a string.";
      out_.push_back(std::move(f));
      return;
    }
    for (const auto& variant : variants->value.GetArray()) {
      if (!Selects(variant, tagName, value->value)) continue;
      // Validate against the chosen variant alone, so that the findings name
      // its faults instead of "matches no variant".
      rapidjson::Document sub;
      sub.CopyFrom(variant, sub.GetAllocator());
      auto definitions = root_.IsObject() ? root_.FindMember("definitions") : root_.MemberEnd();
      if (sub.IsObject() && !sub.HasMember("definitions") && definitions != root_.MemberEnd()) {
        sub.AddMember("definitions", Value(definitions->value, sub.GetAllocator()), sub.GetAllocator());
      }
      ValidateValue(sub, doc, path, depth_ + 1, out_);
      return;
    }
    f.text = "The union tag property '" + tag + "' does not name a variant.";
    out_.push_back(std::move(f));
  }

  // A variant is chosen by the values its tag property allows ("enum").
  static bool Selects(const Value& variant, const Value& tagName, const Value& tagValue) {
    if (!variant.IsObject()) return false;
    auto props = variant.FindMember("properties");
    if (props == variant.MemberEnd() || !props->value.IsObject()) return false;
    auto tag = props->value.FindMember(tagName);
    if (tag == props->value.MemberEnd() || !tag->value.IsObject()) return false;
    auto allowed = tag->value.FindMember("enum");
    if (allowed == tag->value.MemberEnd() || !allowed->value.IsArray()) return false;
    for (const auto& v : allowed->value.GetArray()) {
      if (v == tagValue) return true;
    }
    return false;
  }

  const Value& root_;
  const int depth_;
  std::vector<Finding>& out_;
};

void ValidateValue(const Value& schema, const Value& document, const std::string& path, int depth,
                   std::vector<Finding>& out) {
  if (!schema.IsObject()) {
    out.push_back(SchemaInvalid(path, "a schema must be a JSON object"));
    return;
  }
  if (depth > kMaxUnionDepth) {
    out.push_back(SchemaInvalid(path, "union variants nest too deeply"));
    return;
  }
  if (!ContainsUnionTag(schema)) {
    RunEngine(schema, document, path, out);
    return;
  }
  rapidjson::Document stripped;
  stripped.CopyFrom(schema, stripped.GetAllocator());
  RemoveUnionVariants(stripped);
  RunEngine(stripped, document, path, out);
  UnionWalk(schema, depth, out).Walk(document, &schema, path);
}

// A host document schema that is exactly what the store generates for its
// keys (one closed object schema per component and group level, each key
// node equal to the store's key schema as embedded), validated with the
// keys' compiled schemas. The findings, their order and the budget are the
// engine's on the whole schema: the engine visits the members a schema
// names in the order of their names, then reports the first member it does
// not name; union nodes are checked after the engine, in document order.
class StoreGeneratedSchema {
 public:
  // usable() is false when `schema` differs from what the store generates
  // in any way, or the store of the current root is not at hand.
  explicit StoreGeneratedSchema(const Value& schema) {
    // The store is consulted only for a schema of its shape: a caller's own
    // schema needs none (and a root without schemas would log its absence).
    if (!IsRoot(schema) || ClosedLevelProperties(schema, true) == nullptr) return;
    store_ = std::dynamic_pointer_cast<HoxSchemaStore::detail::DirectorySchemaStore>(
        HoxSchemaStore::SchemaStore::GetStore());
    usable_ = store_ != nullptr && Build(schema, 0, root_);
  }
  bool usable() const { return usable_; }

  void Validate(const Value& document, const std::string& context, std::vector<Finding>& out) const {
    std::vector<Finding> engine;
    try {
      Seen seen;
      std::string path = context;
      RunLevel(root_, document, path, 0, seen, engine);
    } catch (const std::exception& e) {
      // As the engine on the whole schema: nothing but why it stopped.
      engine.clear();
      engine.push_back(SchemaInvalid(context, e.what()));
    }
    out.insert(out.end(), std::make_move_iterator(engine.begin()), std::make_move_iterator(engine.end()));
    std::string path = context;
    WalkUnions(root_, document, path, 0, out);
  }

 private:
  // A component or group level (members) or a key (key).
  // Member is declared apart from Node: a pair holding Node inside Node
  // is refused by clang's standard library checks as an incomplete type.
  struct Member;
  struct Node {
    std::vector<Member> members;  // sorted by name
    std::shared_ptr<HoxSchemaStore::detail::KeySchema> key;
  };
  struct Member {
    std::string_view name;
    Node node;
  };

  // The constraints of a level node the engine evaluates: type, properties.
  static constexpr std::uint64_t kLevelSteps = 2;
  static constexpr int kKeyDepth = 3;

  static bool IsRoot(const Value& schema) {
    if (!schema.IsObject()) return false;
    const auto version = schema.FindMember("$schema");
    return version == schema.MemberEnd() || version->value == "http://json-schema.org/draft-04/schema#";
  }

  // {"type": "object", "properties": {...}, "additionalProperties": false},
  // with "$schema" at the root.
  static const Value* ClosedLevelProperties(const Value& node, bool root) {
    if (!node.IsObject()) return nullptr;
    const Value* properties = nullptr;
    bool type = false;
    bool closed = false;
    for (const auto& m : node.GetObject()) {
      if (m.name == "type" && !type && m.value == "object") {
        type = true;
      } else if (m.name == "properties" && properties == nullptr && m.value.IsObject()) {
        properties = &m.value;
      } else if (m.name == "additionalProperties" && !closed && m.value.IsFalse()) {
        closed = true;
      } else if (!(root && m.name == "$schema")) {
        return nullptr;
      }
    }
    return type && closed ? properties : nullptr;
  }

  bool Build(const Value& node, int depth, Node& out) {
    const Value* properties = ClosedLevelProperties(node, depth == 0);
    if (properties == nullptr) return false;
    out.members.reserve(properties->MemberCount());
    for (const auto& m : properties->GetObject()) {
      out.members.push_back(Member{HoxConfigManager::compare::NameOf(m.name), Node()});
      names_[depth] = out.members.back().name;
      Node& child = out.members.back().node;
      if (depth + 1 < kKeyDepth ? !Build(m.value, depth + 1, child) : !BuildKey(m.value, child)) return false;
    }
    std::sort(out.members.begin(), out.members.end(),
              [](const Member& a, const Member& b) { return a.name < b.name; });
    // The engine keeps one schema per name; a repeated name is left to it.
    return std::adjacent_find(out.members.begin(), out.members.end(), [](const Member& a, const Member& b) {
             return a.name == b.name;
           }) == out.members.end();
  }

  bool BuildKey(const Value& node, Node& out) {
    out.key = store_->FindKey(HoxSchemaStore::SchemaObjectId(std::string(names_[0]), std::string(names_[1]),
                                                             std::string(names_[2])));
    if (!out.key) return false;
    try {
      return node == out.key->Prepared().embedded;
    } catch (const std::exception&) {
      return false;  // the engine on the whole schema reports it
    }
  }

  void RunLevel(const Node& node, const Value& doc, std::string& path, int depth, Seen& seen,
                std::vector<Finding>& out) const {
    if (depth == kKeyDepth) {
      RunKey(*node.key, doc, path, seen, out);
      return;
    }
    detail::ValidationBudget::Charge(kLevelSteps);
    if (!doc.IsObject()) {
      Finding f;
      detail::ClassifyEngineError(path, "Value type not permitted by 'type' constraint.", f);
      f.args.push_back("object");
      f.text = DescribeFinding(f.code, f.args, "Value type not permitted by 'type' constraint.");
      if (seen.emplace(f.field, f.code, f.text).second) out.push_back(std::move(f));
      return;
    }
    // The document's members by name, the first of each name first.
    std::vector<std::pair<std::string_view, rapidjson::SizeType>> byName;
    byName.reserve(doc.MemberCount());
    for (auto m = doc.MemberBegin(); m != doc.MemberEnd(); ++m) {
      byName.emplace_back(HoxConfigManager::compare::NameOf(m->name),
                          static_cast<rapidjson::SizeType>(m - doc.MemberBegin()));
    }
    std::stable_sort(byName.begin(), byName.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
    std::vector<bool> named(doc.MemberCount(), false);
    std::size_t namesMatched = 0;
    auto member = byName.begin();
    for (const auto& [name, child] : node.members) {
      while (member != byName.end() && member->first < name) ++member;
      if (member == byName.end()) break;
      if (member->first != name) continue;
      ++namesMatched;
      const std::size_t length = path.size();
      HoxConfigManager::detail::AppendPointerToken(path, name);
      RunLevel(child, doc.MemberBegin()[member->second].value, path, depth + 1, seen, out);
      path.resize(length);
      for (; member != byName.end() && member->first == name; ++member) named[member->second] = true;
    }
    if (namesMatched == doc.MemberCount()) return;
    std::string unwanted;
    for (rapidjson::SizeType i = 0; i < doc.MemberCount(); ++i) {
      if (!named[i]) {
        unwanted = HoxConfigManager::compare::NameOf(doc.MemberBegin()[i].name);
        break;
      }
    }
    Finding f;
    detail::ClassifyEngineError(path,
                                "Object contains a property that could not be validated using 'properties' or "
                                "'additionalProperties' constraints: '" +
                                    unwanted + "'.",
                                f);
    if (seen.emplace(f.field, f.code, f.text).second) out.push_back(std::move(f));
  }

  static void RunKey(const HoxSchemaStore::detail::KeySchema& key, const Value& doc, const std::string& path,
                     Seen& seen, std::vector<Finding>& out) {
    valijson::ValidationResults results;
    valijson::Validator validator;
    validator.validate(*key.Prepared().engine, valijson::adapters::RapidJsonAdapter(doc), &results);
    CollectEngineFindings(results, key.GetJsonSchema(), path, seen, out);
  }

  // Members in document order, as the union walk on the whole schema goes.
  void WalkUnions(const Node& node, const Value& doc, std::string& path, int depth, std::vector<Finding>& out) const {
    if (depth == kKeyDepth) {
      if (node.key->Prepared().unions) {
        const Value& schema = node.key->GetJsonSchema();
        UnionWalk(schema, 0, out).Walk(doc, &schema, path);
      }
      return;
    }
    if (!doc.IsObject()) return;
    for (const auto& m : doc.GetObject()) {
      const std::string_view name = HoxConfigManager::compare::NameOf(m.name);
      const auto child = std::lower_bound(node.members.begin(), node.members.end(), name,
                                          [](const Member& entry, std::string_view n) { return entry.name < n; });
      if (child == node.members.end() || child->name != name) continue;
      const std::size_t length = path.size();
      HoxConfigManager::detail::AppendPointerToken(path, name);
      WalkUnions(child->node, m.value, path, depth + 1, out);
      path.resize(length);
    }
  }

  std::shared_ptr<HoxSchemaStore::detail::DirectorySchemaStore> store_;
  Node root_;
  std::string_view names_[kKeyDepth];  // of the key being built
  bool usable_ = false;
};

int WriteFindings(const std::vector<Finding>& findings, const std::set<int>& ignored, rapidjson::Document& result) {
  result.SetArray();
  auto& a = result.GetAllocator();
  int kept = 0;
  for (const Finding& f : findings) {
    if (ignored.count(f.code)) continue;
    Value entry(rapidjson::kObjectType);
    entry.AddMember("field", Value(f.field, a), a);
    entry.AddMember("errId", f.code, a);
    Value args(rapidjson::kArrayType);
    for (const auto& arg : f.args) args.PushBack(Value(arg, a), a);
    entry.AddMember("errArgs", args, a);
    entry.AddMember("error", Value(f.text, a), a);
    result.PushBack(entry, a);
    ++kept;
  }
  return kept;
}

std::size_t Depth(const std::string& field, const std::string& context) {
  std::size_t depth = 0;
  for (std::size_t i = context.size(); i < field.size(); ++i) depth += field[i] == '/';
  return depth;
}

}  // namespace

namespace detail {

bool UsesKeySchemas(const Value& schema) { return StoreGeneratedSchema(schema).usable(); }

PreparedSchema::PreparedSchema() = default;
PreparedSchema::~PreparedSchema() = default;

std::unique_ptr<const PreparedSchema> PrepareKeySchema(const HoxSchemaStore::SchemaObject& schema) {
  auto prepared = std::make_unique<PreparedSchema>();
  const HoxSchemaStore::SchemaObjectId& id = schema.GetId();
  Value embedded =
      HoxSchemaStore::detail::EmbeddedKeySchema(schema, id.component, id.group, id.key, prepared->embedded.GetAllocator());
  static_cast<Value&>(prepared->embedded).Swap(embedded);
  prepared->unions = ContainsUnionTag(schema.GetJsonSchema());
  rapidjson::Document stripped;
  if (prepared->unions) {
    stripped.CopyFrom(schema.GetJsonSchema(), stripped.GetAllocator());
    RemoveUnionVariants(stripped);
  }
  prepared->engine = std::make_unique<valijson::Schema>();
  valijson::SchemaParser parser(valijson::SchemaParser::kDraft4);
  const valijson::adapters::RapidJsonAdapter adapter(prepared->unions ? stripped : schema.GetJsonSchema());
  parser.populateSchema(adapter, *prepared->engine);
  return prepared;
}

}  // namespace detail

int Validate(const Value& schema, const Value& document, rapidjson::Document& result, const std::set<int>& ignored,
             const std::string& context) {
  const detail::ValidationBudget budget(detail::BudgetFor(document));
  std::vector<Finding> findings;
  ValidateValue(schema, document, context, 0, findings);
  return WriteFindings(findings, ignored, result);
}

int ValidateCMDocument(const Value& schema, const Value& document, rapidjson::Document& result,
                       const std::set<int>& ignored, const std::string& context) {
  const detail::ValidationBudget budget(detail::BudgetFor(document));
  std::vector<Finding> findings;
  if (const StoreGeneratedSchema generated(schema); generated.usable()) {
    generated.Validate(document, context, findings);
  } else {
    ValidateValue(schema, document, context, 0, findings);
  }
  for (Finding& f : findings) {
    // Members the host document schema does not know, down to key level,
    // are configuration keys without a schema.
    if (f.code == VALIDATION_ERR_ADDITIONAL_PROPERTIES && Depth(f.field, context) <= 3) {
      f.code = VALIDATION_ERR_UNKNOWN_KEY;
      f.text = DescribeFinding(f.code, f.args);
    }
  }
  return WriteFindings(findings, ignored, result);
}

}  // namespace JsonValidator
