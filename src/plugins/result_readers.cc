// The result files a runner leaves behind (formats: docs/plugin-protocol.md).
// Anything short of a well-formed record of the expected shape is refused:
// a truncated or mistyped result must never read as success.
#include <limits>
#include <stdexcept>

#include <hoxcm/plugins.h>

#include <hoxcm/files.h>

#include "foundation/json_parse.h"

namespace HoxConfigManager {
namespace {

void Expect(bool condition) {
  if (!condition) detail::ThrowInvalidJson();
}

Document ParseText(const std::string& text) {
  Document doc;
  Expect(detail::ParseJson(text.data(), text.size(), doc));
  Expect(doc.IsObject());
  return doc;
}

std::string StringMember(const Value& object, const char* name, bool required) {
  const auto it = object.FindMember(name);
  if (it == object.MemberEnd()) {
    Expect(!required);
    return {};
  }
  Expect(it->value.IsString());
  return std::string(it->value.GetString(), it->value.GetStringLength());
}

const Value* ArrayMember(const Value& object, const char* name) {
  const auto it = object.FindMember(name);
  if (it == object.MemberEnd()) return nullptr;
  Expect(it->value.IsArray());
  return &it->value;
}

ErrorInfo ErrorFromValue(const Value& value) {
  Expect(value.IsObject());
  ErrorInfo info;
  info.id = StringMember(value, "id", true);
  info.message = StringMember(value, "message", false);
  if (const Value* args = ArrayMember(value, "args")) {
    for (const Value& a : args->GetArray()) {
      Expect(a.IsString());
      info.args.emplace_back(a.GetString(), a.GetStringLength());
    }
  }
  return info;
}

ErrorInfo OptionalError(const Value& root) {
  const auto it = root.FindMember("error");
  return it == root.MemberEnd() ? ErrorInfo() : ErrorFromValue(it->value);
}

}  // namespace

std::string ErrorInfo::Serialize() const {
  Document doc(rapidjson::kObjectType);
  Allocator& a = doc.GetAllocator();
  doc.AddMember("id", Value(id, a), a);
  Value list(rapidjson::kArrayType);
  for (const std::string& arg : args) list.PushBack(Value(arg, a), a);
  doc.AddMember("args", list, a);
  doc.AddMember("message", Value(message, a), a);
  return JsonToString(doc);
}

void ErrorInfo::Deserialize(const std::string& text) { *this = ErrorFromValue(ParseText(text)); }

ErrorInfo ErrorInfo::Load(const std::string& path) {
  ErrorInfo info;
  info.Deserialize(HoxPlatform::ReadFile(path, HoxPlatform::FileKind::PluginExchange));
  return info;
}

ImpactPluginResult ImpactPluginResult::Load(const std::string& path) {
  const Document doc = ParseText(HoxPlatform::ReadFile(path, HoxPlatform::FileKind::PluginExchange));
  ImpactPluginResult result;
  result.error = OptionalError(doc);
  const Value* impacts = ArrayMember(doc, "impacts");
  // A successful run must say what it found, even if that is nothing.
  Expect(impacts != nullptr || !result.error.id.empty());
  if (impacts == nullptr) return result;
  for (const Value& item : impacts->GetArray()) {
    Expect(item.IsObject());
    ImpactPluginInfo info;
    const auto impact = item.FindMember("impact");
    Expect(impact != item.MemberEnd() && impact->value.IsInt());
    info.impact = impact->value.GetInt();
    Expect(info.impact >= 0 && info.impact <= 2);
    info.component = StringMember(item, "component", false);
    info.group = StringMember(item, "group", false);
    info.key = StringMember(item, "key", false);
    info.reason = StringMember(item, "reason", false);
    result.impacts.push_back(std::move(info));
  }
  return result;
}

ValidationPluginResult ValidationPluginResult::Load(const std::string& path) {
  const Document doc = ParseText(HoxPlatform::ReadFile(path, HoxPlatform::FileKind::PluginExchange));
  ValidationPluginResult result;
  result.error = OptionalError(doc);
  const Value* errors = ArrayMember(doc, "errors");
  Expect(errors != nullptr || !result.error.id.empty());
  if (errors == nullptr) return result;
  for (const Value& item : errors->GetArray()) {
    Expect(item.IsObject());
    ValidationErrorInfo info;
    info.field = StringMember(item, "field", true);
    const Value* list = ArrayMember(item, "errors");
    Expect(list != nullptr);
    for (const Value& e : list->GetArray()) info.errors.push_back(ErrorFromValue(e));
    result.errors.push_back(std::move(info));
  }
  return result;
}

}  // namespace HoxConfigManager
