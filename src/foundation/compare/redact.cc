// Serialisation of configuration values with sensitive values masked.
#include <hoxcm/config_document.h>

#include "foundation/compare/schema_view.h"
#include "foundation/compare/value_compare.h"

namespace HoxConfigStore {

namespace {

namespace compare = HoxConfigManager::compare;

using rapidjson::Value;
using Writer = rapidjson::Writer<rapidjson::StringBuffer>;

constexpr const char* kMask = "******";

void WriteRedacted(const Value& value, const compare::SchemaView& view, Writer& writer) {
  if (view.Sensitive()) {
    writer.String(kMask);
  } else if (value.IsObject()) {
    writer.StartObject();
    for (auto it = value.MemberBegin(); it != value.MemberEnd(); ++it) {
      writer.Key(it->name.GetString(), it->name.GetStringLength());
      WriteRedacted(it->value, view.Member(compare::NameOf(it->name)), writer);
    }
    writer.EndObject();
  } else if (value.IsArray()) {
    writer.StartArray();
    for (rapidjson::SizeType i = 0; i < value.Size(); ++i) WriteRedacted(value[i], view.Element(i), writer);
    writer.EndArray();
  } else {
    value.Accept(writer);
  }
}

}  // namespace

std::string ConfigStoreDocument::RedactAndSerializeValue(const rapidjson::Value& schema,
                                                         const rapidjson::Value& value) {
  compare::SchemaView view(schema, schema);
  // An instance passed with its key's array schema is described by "items".
  const Value* type = view.Type();
  if (!value.IsArray() && type != nullptr && type->IsString() && compare::NameOf(*type) == "array") {
    view = view.Element(0);
  }
  rapidjson::StringBuffer buffer;
  Writer writer(buffer);
  WriteRedacted(value, view, writer);
  return std::string(buffer.GetString(), buffer.GetSize());
}

}  // namespace HoxConfigStore
