#include "foundation/compare/value_compare.h"

#include <bit>
#include <functional>
#include <regex>
#include <string>
#include <vector>

#include <hoxcm/config_document.h>

#include "foundation/pattern.h"

namespace HoxConfigManager::compare {

namespace {

using rapidjson::SizeType;
using rapidjson::Value;

constexpr std::uint64_t kUnsetHash = 0x5bd1e9955bd1e995ULL;
// Arrays up to this size are matched pairwise; longer ones through hashes.
constexpr SizeType kSmallArray = 8;

// The schemas handed out for values that no schema describes.
struct FallbackSchemas {
  rapidjson::Document null, boolean, number, string, object, objectArray, scalarArray, nestedArray;
  FallbackSchemas() {
    auto make = [](rapidjson::Document& doc, const char* type, const char* items) {
      doc.SetObject();
      doc.AddMember("type", rapidjson::StringRef(type), doc.GetAllocator());
      if (items != nullptr) {
        Value itemSchema(rapidjson::kObjectType);
        itemSchema.AddMember("type", rapidjson::StringRef(items), doc.GetAllocator());
        doc.AddMember("items", itemSchema, doc.GetAllocator());
      }
    };
    make(null, "null", nullptr);
    make(boolean, "boolean", nullptr);
    make(number, "number", nullptr);
    make(string, "string", nullptr);
    make(object, "object", nullptr);
    make(objectArray, "array", "object");
    make(scalarArray, "array", "string");
    make(nestedArray, "array", "array");
  }
};

const FallbackSchemas& Fallbacks() {
  static const FallbackSchemas schemas;
  return schemas;
}

std::uint64_t NumberHash(const Value& v) {
  double d = v.GetDouble();
  if (d == 0) d = 0;  // -0.0 and 0 are equal
  return Mix(std::bit_cast<std::uint64_t>(d));
}

std::uint64_t StringHash(const Value& v) { return HashBytes(NameOf(v)); }

// Hash of an element of a scalar array, agreeing with SameScalar.
std::uint64_t ScalarHash(const Value& v) {
  if (v.IsNumber()) return NumberHash(v);
  if (v.IsString()) return Mix(StringHash(v));
  return Mix(static_cast<std::uint64_t>(v.GetType()) + 1);
}

}  // namespace

void MemberIndex::BuildIndex() {
  index_.reserve(count_);
  SizeType i = 0;
  for (auto it = object_.MemberBegin(); it != object_.MemberEnd(); ++it, ++i) index_.emplace(NameOf(it->name), i);
}

const Value* MemberIndex::FindSlow(std::string_view name) {
  if (!index_.empty()) {
    auto it = index_.find(name);
    return it == index_.end() ? nullptr : &(object_.MemberBegin() + it->second)->value;
  }
  const SizeType n = count_;
  auto members = object_.MemberBegin();
  for (SizeType k = 0; k < n; ++k) {
    SizeType i = next_ + k;
    if (i >= n) i -= n;
    const auto& m = members[i];
    if (!SameBytes(NameOf(m.name), name)) continue;
    next_ = i + 1;
    return &m.value;
  }
  return nullptr;
}

namespace {

bool IsTrueMember(const Value& object, std::string_view name) {
  const Value* member = FindByName(object, name);
  return member != nullptr && member->IsTrue();
}

}  // namespace

const Value* PatternPropertySchema(const Value& schema, std::string_view name, PatternCache* cache) {
  if (!schema.IsObject()) return nullptr;
  const Value* patterns = FindByName(schema, "patternProperties");
  if (patterns == nullptr || !patterns->IsObject()) return nullptr;
  const Value* found = nullptr;
  for (auto it = patterns->MemberBegin(); it != patterns->MemberEnd(); ++it) {
    if (!it->value.IsObject()) continue;
    const bool sensitive = IsTrueMember(it->value, "sensitive");
    if (!sensitive && found != nullptr) continue;
    std::shared_ptr<const HoxConfigManager::detail::SchemaPattern> local;
    const std::shared_ptr<const HoxConfigManager::detail::SchemaPattern>* compiled = &local;
    if (cache != nullptr) {
      auto [slot, inserted] = cache->try_emplace(NameOf(it->name));
      if (inserted) slot->second = HoxConfigManager::detail::SchemaPattern::Get(NameOf(it->name));
      compiled = &slot->second;
    } else {
      local = HoxConfigManager::detail::SchemaPattern::Get(NameOf(it->name));
    }
    // A pattern that cannot be used is taken to match when it is sensitive,
    // so that a secret is never shown for want of it, and not otherwise.
    const bool matches = *compiled ? (*compiled)->Search(name) : sensitive;
    if (!matches) continue;
    if (sensitive) return &it->value;
    found = &it->value;
  }
  return found;
}

const Value& SchemaForValue(const Value& value) {
  const FallbackSchemas& f = Fallbacks();
  switch (value.GetType()) {
    case rapidjson::kNullType: return f.null;
    case rapidjson::kFalseType:
    case rapidjson::kTrueType: return f.boolean;
    case rapidjson::kNumberType: return f.number;
    case rapidjson::kStringType: return f.string;
    case rapidjson::kObjectType: return f.object;
    case rapidjson::kArrayType:
      if (value.Empty() || value[0].IsString() || value[0].IsNumber() || value[0].IsBool()) return f.scalarArray;
      return value[0].IsArray() ? f.nestedArray : f.objectArray;
  }
  return f.null;
}

std::string_view SchemaType(const Value& schema) {
  if (!schema.IsObject()) return {};
  const Value* type = FindByName(schema, "type");
  if (type == nullptr) return {};
  if (type->IsString()) return NameOf(*type);
  if (type->IsArray()) {
    for (const Value& t : type->GetArray()) {
      if (t.IsString() && NameOf(t) != "null") return NameOf(t);
    }
  }
  return {};
}

const ValueComparer::SchemaInfo& ValueComparer::Info(const Value& schema) {
  SchemaInfo& info = info_[(reinterpret_cast<std::uintptr_t>(&schema) >> 4) % kInfoSlots];
  if (info.schema == &schema) return info;
  info = SchemaInfo{};
  info.schema = &schema;
  if (!schema.IsObject()) return info;
  // One pass over the node's members instead of one search per keyword.
  const Value* props = nullptr;
  const Value* extra = nullptr;
  for (auto it = schema.MemberBegin(); it != schema.MemberEnd(); ++it) {
    const std::string_view name = NameOf(it->name);
    if (props == nullptr && name == "properties") props = &it->value;
    else if (extra == nullptr && name == "additionalProperties") extra = &it->value;
    else if (info.defaultValue == nullptr && name == "default") info.defaultValue = &it->value;
    else if (name == "patternProperties") info.patterns = it->value.IsObject();
  }
  if (props != nullptr && props->IsObject()) {
    info.properties = props;
    if (props->MemberCount() > kWideObject) {
      auto& index = wideIndexes_[props];
      if (!index) index = std::make_unique<MemberIndex>(*props);
      info.wide = index.get();
    }
  }
  if (extra != nullptr && extra->IsObject()) info.additional = extra;
  return info;
}

const Value& ValueComparer::Child(const Value& schema, std::string_view name, const Value& value) {
  Children children(*this, schema);
  return children.Of(name, value);
}

ValueComparer::Children::Children(ValueComparer& comparer, const Value& schema) {
  const SchemaInfo& info = comparer.Info(schema);
  extra_ = info.additional;
  if (info.patterns) {
    patterns_ = &schema;
    compiled_ = &comparer.patterns_;
  }
  if (info.wide != nullptr) {
    wide_ = info.wide;
  } else if (info.properties != nullptr) {
    narrow_.emplace(*info.properties);
  }
}

const Value& ValueComparer::Children::Of(std::string_view name, const Value& value) {
  const Value* child = nullptr;
  if (narrow_) {
    child = narrow_->Find(name);
  } else if (wide_ != nullptr) {
    child = wide_->Find(name);
  }
  if (child != nullptr && !child->IsObject()) child = nullptr;
  // A matching sensitive pattern marks even a listed property sensitive.
  if (patterns_ != nullptr) {
    const Value* pattern = PatternPropertySchema(*patterns_, name, compiled_);
    if (pattern != nullptr && (child == nullptr || IsTrueMember(*pattern, "sensitive"))) return *pattern;
  }
  if (child != nullptr) return *child;
  if (extra_ != nullptr) return *extra_;
  return SchemaForValue(value);
}

const Value& ValueComparer::Items(const Value& schema, const Value& element) {
  if (schema.IsObject()) {
    const Value* items = FindByName(schema, "items");
    if (items != nullptr && items->IsObject()) return *items;
  }
  return SchemaForValue(element);
}

bool ValueComparer::HoldsObjects(const Value& schema, const Value& a, const Value& b) {
  if (schema.IsObject()) {
    const Value* items = FindByName(schema, "items");
    if (items != nullptr && SchemaType(*items) == "object") return true;
  }
  for (const Value* array : {&a, &b}) {
    for (const Value& e : array->GetArray()) {
      if (e.IsObject() || e.IsArray()) return true;
    }
  }
  return false;
}

bool ValueComparer::IsUnset(const Value& value, const Value& schema) {
  switch (value.GetType()) {
    case rapidjson::kNullType: return true;
    case rapidjson::kObjectType: {
      Children children(*this, schema);
      for (auto it = value.MemberBegin(); it != value.MemberEnd(); ++it) {
        if (IsGeneratedId(it->name)) continue;
        if (!IsUnset(it->value, children.Of(NameOf(it->name), it->value))) return false;
      }
      return true;
    }
    case rapidjson::kArrayType: {
      const Value* def = Info(schema).defaultValue;
      if (def == nullptr || !def->IsArray() || def->Size() != value.Size()) return false;
      return HoldsObjects(schema, value, *def) ? EqualObjectArrays(value, *def, schema)
                                               : EqualPrimitiveArrays(value, *def);
    }
    case rapidjson::kStringType:
      if (value.GetStringLength() == 0) return true;
      [[fallthrough]];
    default: {
      const Value* def = Info(schema).defaultValue;
      return def != nullptr && SameScalar(*def, value);
    }
  }
}

bool ValueComparer::Equal(const Value& d, const Value& h, const Value& schema) {
  if (Same(d, h, schema)) return true;
  // Values that differ as written are still equal when both are unset.
  return IsUnset(d, schema) && IsUnset(h, schema);
}

bool ValueComparer::Same(const Value& d, const Value& h, const Value& schema) {
  if (d.IsObject() && h.IsObject()) return EqualObjects(d, h, schema);
  if (d.IsArray() && h.IsArray()) {
    if (d.Size() != h.Size()) return false;
    return HoldsObjects(schema, d, h) ? EqualObjectArrays(d, h, schema) : EqualPrimitiveArrays(d, h);
  }
  return !IsContainer(d) && !IsContainer(h) && SameScalar(d, h);
}

bool ValueComparer::EqualObjects(const Value& d, const Value& h, const Value& schema) {
  return Members(
      d, h, schema,
      [this](std::string_view, const Value& dv, const Value* hv, const Value& memberSchema) {
        return hv != nullptr ? Equal(dv, *hv, memberSchema) : IsUnset(dv, memberSchema);
      },
      // A set member only the host holds is a difference.
      [](std::string_view, const Value&, const Value&) { return false; });
}

bool ValueComparer::EqualObjectArrays(const Value& d, const Value& h, const Value& schema) {
  const SizeType n = h.Size();
  std::vector<bool> matched(n, false);
  if (n <= kSmallArray) {
    for (const Value& x : d.GetArray()) {
      const Value& itemSchema = Items(schema, x);
      bool found = false;
      for (SizeType j = 0; j < n && !found; ++j) {
        if (!matched[j] && Equal(x, h[j], itemSchema)) matched[j] = found = true;
      }
      if (!found) return false;
    }
    return true;
  }
  std::unordered_map<std::uint64_t, std::vector<SizeType>> buckets;
  buckets.reserve(n);
  for (SizeType j = 0; j < n; ++j) buckets[Hash(h[j], Items(schema, h[j]))].push_back(j);
  for (const Value& x : d.GetArray()) {
    const Value& itemSchema = Items(schema, x);
    auto bucket = buckets.find(Hash(x, itemSchema));
    if (bucket == buckets.end()) return false;
    bool found = false;
    for (SizeType j : bucket->second) {
      if (!matched[j] && Equal(x, h[j], itemSchema)) {
        matched[j] = found = true;
        break;
      }
    }
    if (!found) return false;
  }
  return true;
}

std::size_t ValueComparer::Hash(const Value& value, const Value& schema) {
  switch (value.GetType()) {
    case rapidjson::kObjectType: {
      // A sum, so that member order does not matter; unset members add
      // nothing, as they do not count for equality. An object whose members
      // all are unset is unset itself.
      std::uint64_t sum = 0;
      bool any = false;
      Children children(*this, schema);
      for (auto it = value.MemberBegin(); it != value.MemberEnd(); ++it) {
        if (IsGeneratedId(it->name)) continue;
        const std::uint64_t child = Hash(it->value, children.Of(NameOf(it->name), it->value));
        if (child == kUnsetHash) continue;
        any = true;
        sum += Mix(StringHash(it->name) ^ Mix(child));
      }
      return any ? Mix(sum ^ 0x6f626a) : kUnsetHash;
    }
    case rapidjson::kArrayType: {
      if (IsUnset(value, schema)) return kUnsetHash;
      std::uint64_t sum = 0;
      for (const Value& e : value.GetArray()) sum += Mix(Hash(e, Items(schema, e)));
      return Mix(sum + value.Size() * 0x9e3779b97f4a7c15ULL);
    }
    default:
      if (IsUnset(value, schema)) return kUnsetHash;
      return ScalarHash(value);
  }
}

bool EqualPrimitiveArrays(const Value& a, const Value& b) {
  RAPIDJSON_ASSERT(a.IsArray() && b.IsArray());
  const SizeType n = b.Size();
  if (a.Size() != n) return false;
  std::vector<bool> matched(n, false);
  if (n <= 2 * kSmallArray) {
    for (const Value& x : a.GetArray()) {
      bool found = false;
      for (SizeType j = 0; j < n && !found; ++j) {
        if (!matched[j] && SameScalar(x, b[j])) matched[j] = found = true;
      }
      if (!found) return false;
    }
    return true;
  }
  std::unordered_map<std::uint64_t, std::vector<SizeType>> buckets;
  buckets.reserve(n);
  for (SizeType j = 0; j < n; ++j) buckets[ScalarHash(b[j])].push_back(j);
  for (const Value& x : a.GetArray()) {
    auto bucket = buckets.find(ScalarHash(x));
    if (bucket == buckets.end()) return false;
    bool found = false;
    for (SizeType j : bucket->second) {
      if (!matched[j] && SameScalar(x, b[j])) {
        matched[j] = found = true;
        break;
      }
    }
    if (!found) return false;
  }
  return true;
}

}  // namespace HoxConfigManager::compare

namespace HoxConfigStore {

bool ConfigStoreDocument::IsEqualValue(const rapidjson::Value& desired, const rapidjson::Value& host,
                                       const rapidjson::Value& schema) {
  HoxConfigManager::compare::ValueComparer comparer;
  return comparer.Equal(desired, host, schema);
}

std::size_t ConfigStoreDocument::HashValue(const rapidjson::Value& value, const rapidjson::Value& schema) {
  HoxConfigManager::compare::ValueComparer comparer;
  return comparer.Hash(value, schema);
}

bool ConfigStoreDocument::IsEqualPrimitiveArray(const rapidjson::Value& a, const rapidjson::Value& b) {
  return HoxConfigManager::compare::EqualPrimitiveArrays(a, b);
}

}  // namespace HoxConfigStore
