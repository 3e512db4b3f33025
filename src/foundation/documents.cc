#include <hoxcm/documents.h>

#include <vector>

#include "foundation/json_parse.h"

namespace HoxConfigManager {

std::shared_ptr<Document> CreateDocument() { return std::make_shared<Document>(); }

void AddMember(Document* doc, Value* object, const std::string& name, Value* value) {
  RAPIDJSON_ASSERT(doc != nullptr && object != nullptr && value != nullptr);
  RAPIDJSON_ASSERT(object->IsObject());
  Value key(name.c_str(), static_cast<rapidjson::SizeType>(name.size()), doc->GetAllocator());
  object->AddMember(key, *value, doc->GetAllocator());
}

bool IsEqualArray(const Value& a, const Value& b) {
  RAPIDJSON_ASSERT(a.IsArray() && b.IsArray());
  if (a.Size() != b.Size()) return false;
  // Each element of `b` may be matched once: [1,2,2] and [1,1,2] differ.
  std::vector<bool> matched(b.Size(), false);
  for (const Value& x : a.GetArray()) {
    bool found = false;
    for (rapidjson::SizeType j = 0; j < b.Size(); ++j) {
      if (matched[j] || b[j].GetType() != x.GetType() || !(b[j] == x)) continue;
      matched[j] = true;
      found = true;
      break;
    }
    if (!found) return false;
  }
  return true;
}

void SerializeValue(const Value& value, std::string& out) {
  rapidjson::StringBuffer buffer;
  rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
  value.Accept(writer);
  out.assign(buffer.GetString(), buffer.GetSize());
}

std::string JsonToString(const Value& value) {
  std::string out;
  SerializeValue(value, out);
  return out;
}

void ParseDocument(const std::string& text, Document& doc) {
  ErrorLocation where;
  if (!detail::ParseJson(text.data(), text.size(), doc, &where)) {
    ThrowExceptionAt<InvalidArgumentException>(std::move(where), JsonParseFailed);
  }
}

std::shared_ptr<Document> CreateDocumentFromString(const std::string& text) {
  auto doc = CreateDocument();
  ParseDocument(text, *doc);
  return doc;
}

}  // namespace HoxConfigManager

namespace HoxConfigManager::DocumentShape::detail {

std::string LevelPath(const Value& component, const Value* group, const Value* key) {
  std::string path;
  for (const Value* name : {&component, group, key}) {
    if (name == nullptr) break;
    path.append("/").append(name->GetString(), name->GetStringLength());
  }
  return path;
}

}  // namespace HoxConfigManager::DocumentShape::detail
