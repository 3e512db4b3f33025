#include <hoxcm/documents.h>
#include <hoxcm/drift.h>
#include <hoxcm/host.h>

namespace HoxConfigManager {

ApplyTaskGenerator::ApplyTaskGenerator() : DriftHandler(true, true, false) {}

void ApplyTaskGenerator::Add(const Value& desired, const HoxConfigStore::ConfigStoreObjectId& id,
                             const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string&) {
  createTask(id, desired, schema, ADD, nullptr);
}

void ApplyTaskGenerator::Set(const Value& desired, const Value&, const HoxConfigStore::ConfigStoreObjectId& id,
                             const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string&,
                             const Value& drift) {
  // The record lives in the walk's allocator; the drift object keeps a copy.
  auto driftObject = std::make_shared<HoxConfigStore::DriftObject>(id, ActionName(SET), drift);
  createTask(id, desired, schema, SET, std::move(driftObject));
}

void ApplyTaskGenerator::Delete(const Value& current, const HoxConfigStore::ConfigStoreObjectId& id,
                                const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, const std::string&) {
  createTask(id, current, schema, DELETE, nullptr);
}

void ApplyTaskGenerator::createTask(const HoxConfigStore::ConfigStoreObjectId& id, const Value& value,
                                    const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, ACTION action,
                                    std::shared_ptr<HoxConfigStore::DriftObject> drift) {
  tasks_.push_back(DesiredConfigInput{HoxConfigStore::CreateObject(id, value, schema), std::move(drift),
                                      ActionName(action)});
}

std::vector<DesiredConfigInput> ApplyTaskGenerator::getTasks() const { return tasks_; }

std::vector<DesiredConfigInput> ApplyTaskGenerator::takeTasks() {
  std::vector<DesiredConfigInput> tasks;
  tasks.swap(tasks_);
  return tasks;
}

std::vector<DesiredConfigInput> GenerateApplyTasks(Document& desired) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "GenerateApplyTasks");
  ApplyTaskGenerator generator;
  // The walk unwraps a "profile" wrapper itself.
  ComputeDrift(desired, desired.GetAllocator(), generator, std::nullopt);
  return generator.takeTasks();
}

std::vector<DesiredConfigInput> GenerateBootTimeTasks(const Document& desired) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "GenerateBootTimeTasks");
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);
  const Value& root = DocumentShape::Unwrap(desired);
  // Built completely before anything is returned: a malformed document
  // yields no list at all.
  std::vector<DesiredConfigInput> tasks;
  DocumentShape::ForEachItem(root, [&](const DocumentShape::Item<const Value>& item) {
    HoxConfigStore::ConfigStoreObjectId id(std::string(item.component.GetString(), item.component.GetStringLength()),
                                           std::string(item.group.GetString(), item.group.GetStringLength()),
                                           std::string(item.key.GetString(), item.key.GetStringLength()));
    auto schema = HoxSchemaStore::GetSchema(id.component, id.group, id.key, store);
    if (!schema) {
      CSLogger::Log(CSLogger::kError, "Schema not found for %s:%s:%s", id.component.c_str(), id.group.c_str(),
                    id.key.c_str());
      HoxSchemaStore::ThrowSchemaNotFound(store.get(), {id.component, id.group, id.key}, item.Path());
    }
    CSLogger::Log(CSLogger::kInfo, "Remediating configuration for %s", id.toString().c_str());
    if (!schema->IsMultiInstance()) {
      RAPIDJSON_ASSERT(item.value.IsObject());
      tasks.push_back({HoxConfigStore::CreateObject(id, item.value, schema), nullptr, ActionName(SET)});
      return;
    }
    RAPIDJSON_ASSERT(item.value.IsArray());
    const std::string& identity = schema->GetIdentityMember();
    const bool generated = identity.empty() || identity == DocumentShape::kGeneratedId;
    const Value identityName(generated ? DocumentShape::Ref(DocumentShape::kGeneratedId)
                                       : DocumentShape::Ref(identity));
    for (const Value& instance : item.value.GetArray()) {
      RAPIDJSON_ASSERT(instance.IsObject());
      HoxConfigStore::ConfigStoreObjectId instanceId = id;
      auto member = instance.FindMember(identityName);
      if (member != instance.MemberEnd()) {
        RAPIDJSON_ASSERT(member->value.IsString());
        instanceId.instanceId.assign(member->value.GetString(), member->value.GetStringLength());
      } else {
        RAPIDJSON_ASSERT(generated);  // a named instance needs its identity
        instanceId.instanceId = HoxConfigStore::GenerateInstanceId();
      }
      tasks.push_back({HoxConfigStore::CreateObject(instanceId, instance, schema), nullptr, ActionName(ADD)});
    }
  });
  return tasks;
}

}  // namespace HoxConfigManager
