#include "drift/reported_schema.h"

#include <algorithm>
#include <string>
#include <string_view>
#include <vector>

#include "foundation/compare/value_compare.h"

namespace HoxConfigManager::detail {
namespace {

using compare::NameOf;
using compare::SchemaView;
using Samples = std::vector<const Value*>;

// Keywords whose values are schemas: rebuilt for the values present, never
// copied (they may hold references or hide secrets).
bool IsStructural(std::string_view keyword) {
  static constexpr std::string_view kKeywords[] = {
      "properties", "patternProperties", "additionalProperties", "items", "additionalItems", "dependencies",
      "allOf",      "anyOf",             "oneOf",                "not",   "$ref",            "definitions",
      "contains"};
  for (std::string_view k : kKeywords) {
    if (k == keyword) return true;
  }
  return false;
}

const char* JsonTypeName(const Value& value) {
  switch (value.GetType()) {
    case rapidjson::kObjectType: return "object";
    case rapidjson::kArrayType: return "array";
    case rapidjson::kStringType: return "string";
    case rapidjson::kNumberType: return value.IsInt64() || value.IsUint64() ? "integer" : "number";
    case rapidjson::kTrueType:
    case rapidjson::kFalseType: return "boolean";
    default: return "null";
  }
}

// The one type a handler reads: the declared one (the first that is not
// "null" of a list), else that of the first value present.
std::string TypeOf(const SchemaView& view, const Samples& samples) {
  if (const Value* type = view.Type()) {
    if (type->IsString()) return std::string(NameOf(*type));
    if (type->IsArray()) {
      for (const Value& t : type->GetArray()) {
        if (t.IsString() && NameOf(t) != "null") return std::string(NameOf(t));
      }
    }
  }
  for (const Value* sample : samples) {
    if (!sample->IsNull()) return JsonTypeName(*sample);
  }
  return "null";
}

Value Build(const SchemaView& view, const Value* fallback, const Samples& samples, Allocator& a) {
  Value out(rapidjson::kObjectType);
  const Value* own = view.Primary() != nullptr ? view.Primary() : fallback;
  if (own != nullptr && own->IsObject()) {
    for (const auto& m : own->GetObject()) {
      if (!IsStructural(NameOf(m.name)) && NameOf(m.name) != "type") {
        out.AddMember(Value(m.name, a), Value(m.value, a), a);
      }
    }
  }
  const std::string type = TypeOf(view, samples);
  out.AddMember("type", Value(type, a), a);
  if (view.Sensitive()) {
    out.EraseMember("sensitive");
    out.AddMember("sensitive", true, a);
  }
  Samples elements;
  bool secretElement = false;
  std::vector<std::string_view> names;
  for (const Value* sample : samples) {
    if (sample->IsArray()) {
      for (rapidjson::SizeType i = 0; i < sample->Size(); ++i) {
        elements.push_back(&(*sample)[i]);
        secretElement = secretElement || view.Element(i).Sensitive();
      }
    } else if (sample->IsObject()) {
      for (const auto& m : sample->GetObject()) {
        if (std::find(names.begin(), names.end(), NameOf(m.name)) == names.end()) names.push_back(NameOf(m.name));
      }
    }
  }
  if (type == "array" || !elements.empty()) {
    // Handlers read the element type of arrays; a secret at any index hides
    // every element.
    Value items = Build(view.Element(0), nullptr, elements, a);
    if (secretElement && !items.HasMember("sensitive")) items.AddMember("sensitive", true, a);
    out.AddMember("items", items, a);
  }
  if (view.Sensitive() || names.empty()) return out;
  Value properties(rapidjson::kObjectType);
  for (std::string_view name : names) {
    Samples values;
    for (const Value* sample : samples) {
      if (!sample->IsObject()) continue;
      if (const Value* v = compare::FindByName(*sample, name)) values.push_back(v);
    }
    properties.AddMember(Value(name.data(), static_cast<rapidjson::SizeType>(name.size()), a),
                         Build(view.Member(name), nullptr, values, a), a);
  }
  out.AddMember("properties", properties, a);
  return out;
}

}  // namespace

const Value& ReportedSchema(const SchemaView& view, const Value& node, const Value& desired, const Value& host,
                           Document& scratch) {
  scratch.SetNull();
  scratch.GetAllocator().Clear();
  Samples samples;
  for (const Value* v : {&desired, &host}) {
    if (!v->IsNull()) samples.push_back(v);
  }
  Value built = Build(view, &node, samples, scratch.GetAllocator());
  static_cast<Value&>(scratch) = built;
  return scratch;
}

}  // namespace HoxConfigManager::detail
