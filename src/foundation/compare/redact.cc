// Serialisation of configuration values with sensitive properties masked.
#include <string_view>

#include <hoxcm/config_document.h>

#include "foundation/compare/value_compare.h"

namespace HoxConfigStore {

namespace {

namespace compare = HoxConfigManager::compare;
using rapidjson::Value;
using Writer = rapidjson::Writer<rapidjson::StringBuffer>;

constexpr const char* kMask = "******";
constexpr const char* kCombinators[] = {"allOf", "anyOf", "oneOf"};

const Value& EmptySchema() {
  static const Value empty(rapidjson::kObjectType);
  return empty;
}

bool IsSensitive(const Value& schema) {
  if (!schema.IsObject()) return false;
  auto it = schema.FindMember("sensitive");
  return it != schema.MemberEnd() && it->value.IsBool() && it->value.GetBool();
}

const Value* Member(const Value& object, const char* name) {
  if (!object.IsObject()) return nullptr;
  auto it = object.FindMember(name);
  return it == object.MemberEnd() ? nullptr : &it->value;
}

const Value* PropertySchema(const Value& schema, std::string_view name) {
  const Value* props = Member(schema, "properties");
  if (props != nullptr && props->IsObject()) {
    for (auto it = props->MemberBegin(); it != props->MemberEnd(); ++it) {
      if (compare::NameOf(it->name) == name) return &it->value;
    }
  }
  return nullptr;
}

// The schema of member `name`; a sensitive description in any branch of a
// combinator wins, so that no variant of a schema leaks a secret.
const Value& ChildSchema(const Value& schema, std::string_view name) {
  const Value* child = PropertySchema(schema, name);
  if (child != nullptr && IsSensitive(*child)) return *child;
  for (const char* combinator : kCombinators) {
    const Value* branches = Member(schema, combinator);
    if (branches == nullptr || !branches->IsArray()) continue;
    for (const Value& branch : branches->GetArray()) {
      const Value* candidate = PropertySchema(branch, name);
      if (candidate == nullptr) continue;
      if (IsSensitive(*candidate)) return *candidate;
      if (child == nullptr) child = candidate;
    }
  }
  if (const Value* pattern = compare::PatternPropertySchema(schema, name)) {
    if (IsSensitive(*pattern) || child == nullptr) return *pattern;
  }
  if (child != nullptr) return *child;
  const Value* extra = Member(schema, "additionalProperties");
  if (extra != nullptr && extra->IsObject()) return *extra;
  return EmptySchema();
}

const Value& ItemsSchema(const Value& schema) {
  const Value* items = Member(schema, "items");
  return items != nullptr && items->IsObject() ? *items : EmptySchema();
}

void WriteRedacted(const Value& value, const Value& schemaIn, Writer& writer) {
  const Value* schema = &schemaIn;
  if (IsSensitive(*schema)) {
    writer.String(kMask);
    return;
  }
  // An instance passed with its key's array schema is described by "items".
  if (!value.IsArray() && compare::SchemaType(*schema) == "array") {
    schema = &ItemsSchema(*schema);
    if (IsSensitive(*schema)) {
      writer.String(kMask);
      return;
    }
  }
  if (value.IsObject()) {
    writer.StartObject();
    for (auto it = value.MemberBegin(); it != value.MemberEnd(); ++it) {
      writer.Key(it->name.GetString(), it->name.GetStringLength());
      WriteRedacted(it->value, ChildSchema(*schema, compare::NameOf(it->name)), writer);
    }
    writer.EndObject();
  } else if (value.IsArray()) {
    const Value& items = ItemsSchema(*schema);
    writer.StartArray();
    for (const Value& element : value.GetArray()) WriteRedacted(element, items, writer);
    writer.EndArray();
  } else {
    value.Accept(writer);
  }
}

}  // namespace

std::string ConfigStoreDocument::RedactAndSerializeValue(const rapidjson::Value& schema,
                                                         const rapidjson::Value& value) {
  rapidjson::StringBuffer buffer;
  Writer writer(buffer);
  WriteRedacted(value, schema, writer);
  return std::string(buffer.GetString(), buffer.GetSize());
}

}  // namespace HoxConfigStore
