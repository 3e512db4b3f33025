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

std::vector<DesiredConfigInput> GenerateApplyTasks(Document& desired) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "GenerateApplyTasks");
  ApplyTaskGenerator generator;
  RAPIDJSON_ASSERT(desired.IsObject());
  auto profile = desired.FindMember("profile");
  Value& root = profile != desired.MemberEnd() ? profile->value : desired;
  ComputeDrift(root, desired.GetAllocator(), generator, std::nullopt);
  return generator.getTasks();
}

std::vector<DesiredConfigInput> GenerateBootTimeTasks(const Document& desired) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "GenerateBootTimeTasks");
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);
  RAPIDJSON_ASSERT(desired.IsObject());
  auto profile = desired.FindMember("profile");
  const Value& root = profile != desired.MemberEnd() ? profile->value : desired;
  RAPIDJSON_ASSERT(root.IsObject());
  // Built completely before anything is returned: a malformed document
  // yields no list at all.
  std::vector<DesiredConfigInput> tasks;
  for (auto c = root.MemberBegin(); c != root.MemberEnd(); ++c) {
    RAPIDJSON_ASSERT(c->value.IsObject());
    for (auto g = c->value.MemberBegin(); g != c->value.MemberEnd(); ++g) {
      RAPIDJSON_ASSERT(g->value.IsObject());
      for (auto k = g->value.MemberBegin(); k != g->value.MemberEnd(); ++k) {
        HoxConfigStore::ConfigStoreObjectId id(
            std::string(c->name.GetString(), c->name.GetStringLength()),
            std::string(g->name.GetString(), g->name.GetStringLength()),
            std::string(k->name.GetString(), k->name.GetStringLength()));
        auto schema = HoxSchemaStore::GetSchema(id.component, id.group, id.key, store);
        if (!schema) {
          CSLogger::Log(CSLogger::kError, "Schema not found for %s:%s:%s", id.component.c_str(), id.group.c_str(),
                        id.key.c_str());
          ThrowException<SchemaNotFound>(SchemaObjectNotFound, "/" + id.component + "/" + id.group + "/" + id.key);
        }
        CSLogger::Log(CSLogger::kInfo, "Remediating configuration for %s", id.toString().c_str());
        if (!schema->IsMultiInstance()) {
          RAPIDJSON_ASSERT(k->value.IsObject());
          tasks.push_back({HoxConfigStore::CreateObject(id, k->value, schema), nullptr, ActionName(SET)});
          continue;
        }
        RAPIDJSON_ASSERT(k->value.IsArray());
        const std::string& identity = schema->GetIdentityMember();
        for (const Value& instance : k->value.GetArray()) {
          RAPIDJSON_ASSERT(instance.IsObject());
          HoxConfigStore::ConfigStoreObjectId instanceId = id;
          auto member = instance.FindMember(identity.empty() ? "cs_generated_id" : identity.c_str());
          if (member != instance.MemberEnd()) {
            RAPIDJSON_ASSERT(member->value.IsString());
            instanceId.instanceId.assign(member->value.GetString(), member->value.GetStringLength());
          } else if (identity.empty() || identity == "cs_generated_id") {
            instanceId.instanceId = HoxConfigStore::GenerateInstanceId();
          } else {
            RAPIDJSON_ASSERT(false);  // a named instance needs its identity
          }
          tasks.push_back({HoxConfigStore::CreateObject(instanceId, instance, schema), nullptr, ActionName(ADD)});
        }
      }
    }
  }
  return tasks;
}

}  // namespace HoxConfigManager
