// The JSON schema of a whole host document, assembled from the key schemas
// of the schema store.
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/errors.h>
#include <hoxcm/host.h>
#include <hoxcm/json.h>
#include <hoxcm/schema_store.h>

namespace HoxSchemaStore {
namespace {

constexpr char kDraft4[] = "http://json-schema.org/draft-04/schema#";

// {"type": "object", "properties": {}, "additionalProperties": false}
rapidjson::Value ClosedObjectSchema(rapidjson::Document::AllocatorType& a) {
  rapidjson::Value node(rapidjson::kObjectType);
  node.AddMember("type", "object", a);
  node.AddMember("properties", rapidjson::Value(rapidjson::kObjectType), a);
  node.AddMember("additionalProperties", false, a);
  return node;
}

}  // namespace

void GenerateSchemaDocument(const rapidjson::Value& value, const std::shared_ptr<SchemaCache>& cache,
                            rapidjson::Document& out) {
  std::shared_ptr<SchemaStore> store = cache ? cache->GetStore() : nullptr;
  if (!store) {
    HoxConfigManager::ThrowException<HoxConfigManager::ConfigManagerException>(
        HoxConfigManager::SchemaStoreAccessFailed);
  }
  RAPIDJSON_ASSERT(value.IsObject());
  out.SetObject();
  auto& a = out.GetAllocator();
  out.AddMember("$schema", kDraft4, a);
  rapidjson::Value components = ClosedObjectSchema(a);
  for (const auto& component : value.GetObject()) {
    RAPIDJSON_ASSERT(component.value.IsObject());
    rapidjson::Value groups = ClosedObjectSchema(a);
    for (const auto& group : component.value.GetObject()) {
      RAPIDJSON_ASSERT(group.value.IsObject());
      rapidjson::Value keys = ClosedObjectSchema(a);
      for (const auto& key : group.value.GetObject()) {
        auto schema = store->Find(component.name.GetString(), group.name.GetString(), key.name.GetString());
        if (!schema) continue;
        rapidjson::Value keySchema(schema->GetJsonSchema(), a);
        // Host-specific keys are told apart when a document is split per host.
        if (schema->IsHostSpecific()) keySchema.AddMember("hostSpecific", true, a);
        keys["properties"].AddMember(rapidjson::Value(key.name, a), keySchema, a);
      }
      groups["properties"].AddMember(rapidjson::Value(group.name, a), keys, a);
    }
    components["properties"].AddMember(rapidjson::Value(component.name, a), groups, a);
  }
  for (auto& m : components.GetObject()) out.AddMember(m.name, m.value, a);
}

}  // namespace HoxSchemaStore

namespace HoxConfigManager {

bool GenerateHostDocumentSchema(const Value& document, Document& out) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "GenerateHostDocumentSchema");
  RAPIDJSON_ASSERT(document.IsObject());
  auto profile = document.FindMember("profile");
  const Value& root = profile != document.MemberEnd() ? profile->value : document;
  RAPIDJSON_ASSERT(root.IsObject());
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);

  out.SetArray();
  auto& a = out.GetAllocator();
  for (const auto& component : root.GetObject()) {
    RAPIDJSON_ASSERT(component.value.IsObject());
    for (const auto& group : component.value.GetObject()) {
      RAPIDJSON_ASSERT(group.value.IsObject());
      for (const auto& key : group.value.GetObject()) {
        const HoxSchemaStore::SchemaObjectId id(component.name.GetString(), group.name.GetString(),
                                                key.name.GetString());
        if (store->Find(id.component, id.group, id.key)) continue;
        CSLogger::Log(CSLogger::kError, "Schema not found for %s", id.toString().c_str());
        const std::string field = "/" + id.component + "/" + id.group + "/" + id.key;
        Value error(rapidjson::kObjectType);
        error.AddMember("field", Value(field, a), a);
        error.AddMember("errId", static_cast<int>(JsonValidator::VALIDATION_ERR_UNKNOWN_KEY), a);
        Value args(rapidjson::kArrayType);
        args.PushBack(Value(id.toString(), a), a);
        error.AddMember("errArgs", args, a);
        error.AddMember("error", Value("No schema for the key " + id.toString(), a), a);
        out.PushBack(error, a);
      }
    }
  }
  if (!out.Empty()) return false;
  HoxSchemaStore::GenerateSchemaDocument(root, HoxSchemaStore::SchemaStore::GetCache(), out);
  return true;
}

}  // namespace HoxConfigManager
