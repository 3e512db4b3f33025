#include "platform/schema/schema_file.h"

#include <algorithm>
#include <initializer_list>
#include <set>
#include <string_view>

#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/json.h>

#include "foundation/json_parse.h"
#include "foundation/pattern.h"
#include "foundation/schema_refs.h"
#include "platform/schema/prepared_schema.h"
#include "platform/schema/valijson.h"

namespace HoxSchemaStore::detail {
namespace {

namespace Shape = HoxConfigManager::DocumentShape;

// Room beyond the file's size in a key's pool: the wrapper of a
// multi-instance schema and the generated-identity property.
constexpr std::size_t kPoolSlack = 256;

// Thrown inside this file only, turned into the load error text.
struct SchemaFileError {
  std::string reason;
};

[[noreturn]] void Fail(std::string reason) { throw SchemaFileError{std::move(reason)}; }

// An oversized file (a log dropped into the tree by mistake) is refused
// by its size, without being loaded.
bool ReadFile(const std::string& path, std::string& content, std::string& error) {
  try {
    content = HoxPlatform::ReadFile(path, HoxPlatform::FileKind::Schema);
    return true;
  } catch (const HoxPlatform::FileError& e) {
    error = e.reason();
    return false;
  }
}

bool GetBool(const rapidjson::Value& root, const char* name) {
  auto it = root.FindMember(name);
  if (it == root.MemberEnd()) return false;
  if (!it->value.IsBool()) Fail(std::string("\"") + name + "\" must be true or false");
  return it->value.GetBool();
}

std::vector<std::string> GetStrings(const rapidjson::Value& root, const char* name) {
  std::vector<std::string> out;
  auto it = root.FindMember(name);
  if (it == root.MemberEnd()) return out;
  if (!it->value.IsArray()) Fail(std::string("\"") + name + "\" must be an array of strings");
  for (const auto& v : it->value.GetArray()) {
    if (!v.IsString() || v.GetStringLength() == 0) {
      Fail(std::string("\"") + name + "\" must be an array of non-empty strings");
    }
    out.emplace_back(v.GetString(), v.GetStringLength());
  }
  return out;
}

std::vector<std::string> GetOperations(const rapidjson::Value& root, const char* name) {
  std::vector<std::string> ops = GetStrings(root, name);
  std::set<std::string> seen;
  for (const auto& op : ops) {
    if (op != "SET" && op != "ADD" && op != "DELETE") {
      Fail(std::string("\"") + name + "\" may hold only \"SET\", \"ADD\" and \"DELETE\", not \"" + op + "\"");
    }
    if (!seen.insert(op).second) Fail(std::string("\"") + name + "\" lists \"" + op + "\" twice");
  }
  return ops;
}

// Where a subschema sits ("#/properties/a/items"). The text is built only
// for a message: building it for every node of every file cost more than
// the checks themselves.
class Location {
 public:
  Location() = default;  // the root, "#"
  Location(const Location& parent, std::string_view keyword, std::string_view name = {}, int index = -1)
      : parent_(&parent), keyword_(keyword), name_(name), index_(index) {}

  std::string Text() const {
    if (parent_ == nullptr) return "#";
    std::string text = parent_->Text() + "/" + std::string(keyword_);
    if (!name_.empty()) text += "/" + std::string(name_);
    if (index_ >= 0) text += "/" + std::to_string(index_);
    return text;
  }

 private:
  const Location* parent_ = nullptr;
  std::string_view keyword_;
  std::string_view name_;
  int index_ = -1;
};

std::string_view NameOf(const rapidjson::Value& name) { return {name.GetString(), name.GetStringLength()}; }

void CheckRegex(const std::string& pattern, const Location& where) {
  std::string why;
  if (!HoxConfigManager::detail::SchemaPattern::Get(pattern, &why)) {
    Fail("regular expression at " + where.Text() + ": " + why);
  }
}

// Applies `visit` to every subschema of `node` reachable through the draft-4
// keywords, depth first; `where` is a readable location for messages.
template <typename Visit>
void ForEachSubschema(const rapidjson::Value& node, const Location& where, bool propertyNode, Visit& visit) {
  if (!node.IsObject()) Fail("schema at " + where.Text() + " is not an object");
  visit(node, where, propertyNode);
  auto members = [&](const char* keyword, bool properties) {
    auto it = node.FindMember(keyword);
    if (it == node.MemberEnd()) return;
    if (!it->value.IsObject()) Fail("\"" + std::string(keyword) + "\" at " + where.Text() + " is not an object");
    for (const auto& m : it->value.GetObject()) {
      ForEachSubschema(m.value, Location(where, keyword, NameOf(m.name)), properties, visit);
    }
  };
  auto elements = [&](const char* keyword) {
    auto it = node.FindMember(keyword);
    if (it == node.MemberEnd() || !it->value.IsArray()) return;
    for (rapidjson::SizeType i = 0; i < it->value.Size(); ++i) {
      ForEachSubschema(it->value[i], Location(where, keyword, {}, static_cast<int>(i)), propertyNode, visit);
    }
  };
  members("properties", true);
  members("patternProperties", true);
  members("definitions", false);
  for (const char* keyword : {"additionalProperties", "additionalItems", "not"}) {
    auto it = node.FindMember(keyword);
    if (it != node.MemberEnd() && it->value.IsObject()) {
      ForEachSubschema(it->value, Location(where, keyword), keyword != std::string("not"), visit);
    }
  }
  auto items = node.FindMember("items");
  if (items != node.MemberEnd() && items->value.IsObject()) {
    ForEachSubschema(items->value, Location(where, "items"), propertyNode, visit);
  }
  elements("items");
  elements("allOf");
  elements("anyOf");
  elements("oneOf");
}

// The valijson compilation and the regular expressions of a JSON schema.
void CheckCompiles(const rapidjson::Value& schema) {
  auto visit = [](const rapidjson::Value& node, const Location& where, bool) {
    auto pattern = node.FindMember("pattern");
    if (pattern != node.MemberEnd() && pattern->value.IsString()) CheckRegex(pattern->value.GetString(), where);
    auto pp = node.FindMember("patternProperties");
    if (pp != node.MemberEnd() && pp->value.IsObject()) {
      for (const auto& m : pp->value.GetObject()) CheckRegex(m.name.GetString(), Location(where, "patternProperties"));
    }
  };
  ForEachSubschema(schema, Location(), false, visit);
  if (std::string unusable = HoxConfigManager::detail::CheckReferences(schema); !unusable.empty()) Fail(unusable);
  try {
    valijson::Schema compiled;
    valijson::SchemaParser parser(valijson::SchemaParser::kDraft4);
    valijson::adapters::RapidJsonAdapter adapter(schema);
    parser.populateSchema(adapter, compiled);
  } catch (const HoxConfigStore::ConfigStoreException&) {
    throw;
  } catch (const std::exception& e) {
    Fail(std::string("the JSON schema is not usable: ") + e.what());
  }
}

// Trigger values are compared with a changed value by the property's single
// "type"; each one must be of that type.
void CheckTriggers(const rapidjson::Value& property, const rapidjson::Value& triggers, const char* keyword,
                   const Location& where) {
  auto type = property.FindMember("type");
  if (type == property.MemberEnd() || !type->value.IsString()) {
    Fail(std::string(keyword) + " at " + where.Text() + ": a property with trigger values needs a single \"type\"");
  }
  const std::string kind = type->value.GetString();
  // Triggers are matched against a changed scalar: on any other kind of
  // property they would never fire.
  if (kind != "integer" && kind != "number" && kind != "boolean" && kind != "string") {
    Fail(std::string(keyword) + " at " + where.Text() +
         ": trigger values need a property of type integer, number, boolean or string, not \"" + kind + "\"");
  }
  for (const auto& v : triggers.GetArray()) {
    const bool ok = (kind == "integer" && v.IsInt64()) || (kind == "number" && v.IsNumber()) ||
                    (kind == "boolean" && v.IsBool()) || (kind == "string" && v.IsString());
    if (!ok) {
      Fail(std::string(keyword) + " at " + where.Text() + ": trigger values must be of the property's type \"" + kind +
           "\"");
    }
  }
}

// Checks the impact and sensitivity annotations of the instance schema and
// tells whether any property declares reboot / maintenance-mode triggers.
void CheckAnnotations(const rapidjson::Value& instance, KeySchema::Definition& def) {
  auto visit = [&def](const rapidjson::Value& node, const Location& where, bool propertyNode) {
    for (const char* keyword : {"rebootRequired", "maintenanceModeRequired"}) {
      auto it = node.FindMember(keyword);
      if (it == node.MemberEnd()) continue;
      if (!propertyNode) Fail("\"" + std::string(keyword) + "\" at " + where.Text() + " is not on a property");
      const rapidjson::Value& v = it->value;
      auto set = v.IsObject() ? v.FindMember("SET") : rapidjson::Value::ConstMemberIterator();
      if (!v.IsObject() || set == v.MemberEnd() || !set->value.IsArray() || v.MemberCount() != 1) {
        Fail("\"" + std::string(keyword) + "\" at " + where.Text() + " must be {\"SET\": [trigger values]}");
      }
      CheckTriggers(node, set->value, keyword, where);
      (keyword == std::string("rebootRequired") ? def.rebootPropertyLevel : def.maintenanceModePropertyLevel) = true;
    }
    auto sensitive = node.FindMember("sensitive");
    if (sensitive != node.MemberEnd() && !sensitive->value.IsBool()) {
      Fail("\"sensitive\" at " + where.Text() + " must be true or false");
    }
  };
  ForEachSubschema(instance, Location(), false, visit);
}

bool ListsString(const rapidjson::Value& array, const std::string& s) {
  if (!array.IsArray()) return false;
  for (const auto& v : array.GetArray()) {
    if (v.IsString() && s == v.GetString()) return true;
  }
  return false;
}

void CheckIdentity(rapidjson::Value& instance, const std::string& identity, rapidjson::Document::AllocatorType& a) {
  auto props = instance.FindMember("properties");
  if (props == instance.MemberEnd()) {
    instance.AddMember("properties", rapidjson::Value(rapidjson::kObjectType), a);
    props = instance.FindMember("properties");
  }
  if (!props->value.IsObject()) Fail("\"properties\" of the schema is not an object");
  if (identity == Shape::kGeneratedId) {
    // Instances carry the store's generated identity; declare it so that
    // schemas may forbid additional properties.
    if (!props->value.HasMember(rapidjson::Value(Shape::Ref(Shape::kGeneratedId)))) {
      rapidjson::Value type(rapidjson::kObjectType);
      type.AddMember("type", "string", a);
      props->value.AddMember(Shape::Ref(Shape::kGeneratedId), type, a);
    }
    return;
  }
  auto member = props->value.FindMember(identity.c_str());
  auto required = instance.FindMember("required");
  if (member == props->value.MemberEnd() || !member->value.IsObject() || !member->value.HasMember("type") ||
      member->value["type"] != "string" || required == instance.MemberEnd() ||
      !ListsString(required->value, identity)) {
    Fail("identity member \"" + identity + "\" must be a required property of type \"string\"");
  }
  // An instance's identity is shown wherever the instance is named (paths,
  // logs, reports): it cannot be a secret.
  auto sensitive = member->value.FindMember("sensitive");
  if (sensitive != member->value.MemberEnd() && sensitive->value.IsTrue()) {
    Fail("identity member \"" + identity + "\" cannot be sensitive");
  }
}

KeySchema::Definition ReadDefinition(const rapidjson::Value& root, const SchemaObjectId& id) {
  static const std::set<std::string> kMembers = {"formatVersion",
                                                 "description",
                                                 "multiInstance",
                                                 "identity",
                                                 "defaultUserConfig",
                                                 "mutableDefault",
                                                 "hostSpecific",
                                                 "solutionUsers",
                                                 "solutionInstanceIds",
                                                 "rebootRequired",
                                                 "maintenanceModeRequired",
                                                 "schema"};
  if (!root.IsObject()) Fail("the file is not a JSON object");
  for (const auto& m : root.GetObject()) {
    if (!kMembers.count(m.name.GetString())) Fail("unknown member \"" + std::string(m.name.GetString()) + "\"");
  }
  auto version = root.FindMember("formatVersion");
  if (version != root.MemberEnd() && !(version->value.IsInt() && version->value.GetInt() == 1)) {
    Fail("\"formatVersion\" must be 1");
  }
  auto description = root.FindMember("description");
  if (description != root.MemberEnd() && !description->value.IsString()) Fail("\"description\" must be a string");
  auto multi = root.FindMember("multiInstance");
  if (multi == root.MemberEnd() || !multi->value.IsBool()) Fail("\"multiInstance\" must be true or false");

  KeySchema::Definition def;
  def.id = id;
  def.multiInstance = multi->value.GetBool();
  auto identity = root.FindMember("identity");
  if (def.multiInstance) {
    if (identity == root.MemberEnd() || !identity->value.IsString() || identity->value.GetStringLength() == 0) {
      Fail("a multi-instance key needs \"identity\": a property name or \"cs_generated_id\"");
    }
    def.identity = identity->value.GetString();
  } else if (identity != root.MemberEnd()) {
    Fail("a singleton key has no \"identity\"");
  }
  def.defaultUserConfig = GetBool(root, "defaultUserConfig");
  def.mutableDefault = GetBool(root, "mutableDefault");
  if (def.mutableDefault && !def.defaultUserConfig) Fail("\"mutableDefault\" needs \"defaultUserConfig\"");
  def.hostSpecific = GetBool(root, "hostSpecific");
  def.solutionUsers = GetStrings(root, "solutionUsers");
  def.solutionInstanceIds = GetStrings(root, "solutionInstanceIds");
  if (!def.multiInstance && (!def.solutionUsers.empty() || !def.solutionInstanceIds.empty())) {
    Fail("only a multi-instance key has solution users or solution instances");
  }
  def.rebootOperations = GetOperations(root, "rebootRequired");
  def.maintenanceModeOperations = GetOperations(root, "maintenanceModeRequired");
  return def;
}

}  // namespace

KeySchema::KeySchema(Definition definition, std::unique_ptr<Pool> pool, rapidjson::Value& instanceSchema)
    : def_(std::move(definition)), pool_(std::move(pool)) {
  if (def_.multiInstance) {
    schema_.SetObject();
    schema_.AddMember("type", "array", *pool_);
    schema_.AddMember("items", instanceSchema, *pool_);
    rapidjson::Value& items = schema_.FindMember("items")->value;
    // References in the instance schema name places in it; they resolve
    // against the key's schema, where it sits below "items".
    HoxConfigManager::detail::RebaseReferences(items, "/items", *pool_);
    instance_ = &items;
  } else {
    schema_ = instanceSchema;
    instance_ = &schema_;
  }
}

KeySchema::~KeySchema() = default;

const JsonValidator::detail::PreparedSchema& KeySchema::Prepared() const {
  std::call_once(preparedOnce_, [this] { prepared_ = JsonValidator::detail::PrepareKeySchema(*this); });
  return *prepared_;
}

int KeySchema::GetRebootOperations(std::vector<std::string>& operations, bool& propertyLevel) const {
  operations = def_.rebootOperations;
  propertyLevel = def_.rebootPropertyLevel;
  return 0;
}

int KeySchema::GetMaintenanceModeOperations(std::vector<std::string>& operations, bool& propertyLevel) const {
  operations = def_.maintenanceModeOperations;
  propertyLevel = def_.maintenanceModePropertyLevel;
  return 0;
}

std::shared_ptr<KeySchema> LoadSchemaFile(const std::string& path, const SchemaObjectId& id, std::string& error) {
  std::string content;
  if (!ReadFile(path, content, error)) return nullptr;
  // The parsed file is what the key keeps. Its text is mostly names and
  // indentation, so a pool of the file's size usually holds it in one chunk
  // (a default pool would set 64 KB aside for every key).
  auto pool = std::make_unique<KeySchema::Pool>(content.size() + kPoolSlack);
  rapidjson::Document root(pool.get());
  std::string parseError;
  if (!HoxConfigManager::detail::ParseJson(content.data(), content.size(), root, &parseError)) {
    error = "not valid JSON: " + parseError;
    return nullptr;
  }
  try {
    KeySchema::Definition def = ReadDefinition(root, id);
    auto schema = root.FindMember("schema");
    if (schema == root.MemberEnd() || !schema->value.IsObject()) Fail("\"schema\" must be a JSON schema object");
    rapidjson::Value& instance = schema->value;
    auto type = instance.FindMember("type");
    if (type == instance.MemberEnd() || type->value != "object") {
      Fail("the schema of " + std::string(def.multiInstance ? "an instance" : "the key") +
           " must have \"type\": \"object\"");
    }
    if (def.multiInstance) CheckIdentity(instance, def.identity, root.GetAllocator());
    CheckAnnotations(instance, def);
    auto key = std::make_shared<KeySchema>(std::move(def), std::move(pool), instance);
    CheckCompiles(key->GetJsonSchema());
    return key;
  } catch (const SchemaFileError& e) {
    error = e.reason;
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    error = e.what();
  }
  return nullptr;
}

std::string CheckJsonSchema(const rapidjson::Value& schema) {
  try {
    CheckCompiles(schema);
  } catch (const SchemaFileError& e) {
    return e.reason;
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    return e.what();
  }
  return std::string();
}

}  // namespace HoxSchemaStore::detail
