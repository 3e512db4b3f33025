// The JSON schema of a whole host document, assembled from the key schemas
// of the schema store.
#include <string>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/errors.h>
#include <hoxcm/host.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/json.h>
#include <hoxcm/schema_store.h>

#include "foundation/compare/value_compare.h"
#include "foundation/schema_refs.h"
#include "platform/schema/prepared_schema.h"

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

rapidjson::Value detail::EmbeddedKeySchema(const SchemaObject& schema, std::string_view component,
                                           std::string_view group, std::string_view key,
                                           rapidjson::Document::AllocatorType& allocator) {
  rapidjson::Value out(schema.GetJsonSchema(), allocator);
  // The key's references name places in its own schema, which now sits
  // three levels down.
  std::string fragment;
  for (const std::string_view name : {component, group, key}) {
    fragment += "/properties";
    HoxConfigManager::detail::AppendReferenceToken(fragment, name);
  }
  HoxConfigManager::detail::RebaseReferences(out, fragment, allocator);
  // Host-specific keys are told apart when a document is split per host.
  if (schema.IsHostSpecific()) out.AddMember("hostSpecific", true, allocator);
  return out;
}

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
  // One closed object schema per level; every component and group of the
  // document gets one, even without keys.
  struct Builder : HoxConfigManager::DocumentShape::LevelVisitor {
    Builder(const SchemaStore& store, rapidjson::Document::AllocatorType& a)
        : store(store), a(a), components(ClosedObjectSchema(a)) {}
    void EnterComponent(const rapidjson::Value& name, const rapidjson::Value&) {
      auto& properties = components["properties"];
      properties.AddMember(rapidjson::Value(name, a), ClosedObjectSchema(a), a);
      groups = &(properties.MemberEnd() - 1)->value["properties"];
    }
    void EnterGroup(const rapidjson::Value&, const rapidjson::Value& name, const rapidjson::Value&) {
      groups->AddMember(rapidjson::Value(name, a), ClosedObjectSchema(a), a);
      keys = &(groups->MemberEnd() - 1)->value["properties"];
    }
    void Item(const HoxConfigManager::DocumentShape::Item<const rapidjson::Value>& item) {
      auto schema = store.Find(item.component.GetString(), item.group.GetString(), item.key.GetString());
      if (!schema) return;
      rapidjson::Value keySchema =
          detail::EmbeddedKeySchema(*schema, HoxConfigManager::compare::NameOf(item.component),
                                    HoxConfigManager::compare::NameOf(item.group),
                                    HoxConfigManager::compare::NameOf(item.key), a);
      keys->AddMember(rapidjson::Value(item.key, a), keySchema, a);
    }
    const SchemaStore& store;
    rapidjson::Document::AllocatorType& a;
    rapidjson::Value components;
    rapidjson::Value* groups = nullptr;
    rapidjson::Value* keys = nullptr;
  } builder(*store, a);
  HoxConfigManager::DocumentShape::Walk(value, builder);
  for (auto& m : builder.components.GetObject()) out.AddMember(m.name, m.value, a);
}

}  // namespace HoxSchemaStore

namespace HoxConfigManager {

bool GenerateHostDocumentSchema(const Value& document, Document& out) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "GenerateHostDocumentSchema");
  const Value& root = DocumentShape::Unwrap(document);
  RAPIDJSON_ASSERT(root.IsObject());
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);

  out.SetArray();
  auto& a = out.GetAllocator();
  DocumentShape::ForEachItem(root, [&](const DocumentShape::Item<const Value>& item) {
    const HoxSchemaStore::SchemaObjectId id(item.component.GetString(), item.group.GetString(),
                                            item.key.GetString());
    if (store->Find(id.component, id.group, id.key)) return;
    CSLogger::Log(CSLogger::kError, "Schema not found for %s", id.toString().c_str());
    Value error(rapidjson::kObjectType);
    std::string field;
    for (const Value* name : {&item.component, &item.group, &item.key}) {
      detail::AppendPointerToken(field, {name->GetString(), name->GetStringLength()});
    }
    error.AddMember("field", Value(field, a), a);
    error.AddMember("errId", static_cast<int>(JsonValidator::VALIDATION_ERR_UNKNOWN_KEY), a);
    Value args(rapidjson::kArrayType);
    args.PushBack(Value(id.toString(), a), a);
    error.AddMember("errArgs", args, a);
    error.AddMember("error", Value(JsonValidator::DescribeFinding(JsonValidator::VALIDATION_ERR_UNKNOWN_KEY, {}), a), a);
    out.PushBack(error, a);
  });
  if (!out.Empty()) return false;
  HoxSchemaStore::GenerateSchemaDocument(root, HoxSchemaStore::SchemaStore::GetCache(), out);
  return true;
}

}  // namespace HoxConfigManager
