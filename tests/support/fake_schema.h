// A SchemaObject whose every answer the test sets; for unit tests that must
// not depend on schema files.
#pragma once

#include <string>
#include <vector>

#include <hoxcm/schema_store.h>

namespace hoxcm_test {

class FakeSchemaObject final : public HoxSchemaStore::SchemaObject {
 public:
  FakeSchemaObject() { schema.SetObject(); }

  const HoxSchemaStore::SchemaObjectId& GetId() const override { return id; }
  bool IsMultiInstance() const override { return multiInstance; }
  const std::string& GetIdentityMember() const override { return identity; }
  bool HasDefaultUserConfig() const override { return hasDefault; }
  bool IsMutableDefault() const override { return mutableDefault; }
  const std::vector<std::string>& GetSolutionUserNames() const override { return solutionUsers; }
  const std::vector<std::string>& GetSolutionInstanceIds() const override { return solutionInstances; }
  int GetRebootOperations(std::vector<std::string>& ops, bool& propertyLevel) const override {
    ops = rebootOps;
    propertyLevel = rebootPropertyLevel;
    return 0;
  }
  int GetMaintenanceModeOperations(std::vector<std::string>& ops, bool& propertyLevel) const override {
    ops = maintenanceOps;
    propertyLevel = maintenancePropertyLevel;
    return 0;
  }
  const rapidjson::Value& GetJsonSchema() const override { return schema; }
  const rapidjson::Value& GetInstanceSchema() const override {
    return multiInstance && schema.IsObject() && schema.HasMember("items") ? schema["items"] : schema;
  }

  HoxSchemaStore::SchemaObjectId id;
  bool multiInstance = false;
  std::string identity;
  bool hasDefault = false;
  bool mutableDefault = false;
  std::vector<std::string> solutionUsers;
  std::vector<std::string> solutionInstances;
  std::vector<std::string> rebootOps;
  bool rebootPropertyLevel = false;
  std::vector<std::string> maintenanceOps;
  bool maintenancePropertyLevel = false;
  rapidjson::Document schema;
};

}  // namespace hoxcm_test
