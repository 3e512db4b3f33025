// Document utilities that depend on the host: its identity, its
// maintenance-mode state, and documents built from configuration-store rows.
#include <hoxcm/documents.h>

#include <algorithm>
#include <string>
#include <vector>

#include <hoxcm/host.h>
#include <hoxcm/schema_store.h>

namespace HoxConfigManager {
namespace {

using HoxConfigStore::ConfigMap;
using HoxConfigStore::ConfigMapList;

constexpr const char* kGeneratedIdMember = "cs_generated_id";

// The column of a row, empty when the row lacks it.
const std::string& Column(const ConfigMap& row, const char* name) {
  static const std::string kEmpty;
  auto it = row.find(name);
  return it == row.end() ? kEmpty : it->second;
}

// Parses one row's "Value" into a value allocated in `doc`.
Value ParseRowValue(const ConfigMap& row, Document& doc) {
  Document parsed(&doc.GetAllocator());
  ParseDocument(Column(row, "Value"), parsed);
  Value value;
  value.Swap(parsed);
  return value;
}

}  // namespace

std::string GetBIOSUUID() {
  return HoxConfigStore::ConfigStoreDocument::NormalizeHostId(HostCtl::Host::GetHardwareInfo().biosUuid);
}

void CreateMergedDocument(const Document& source, Document& result) {
  HoxConfigStore::ConfigStoreDocument::GetDocumentForHost(source, result, GetBIOSUUID());
}

bool IsMaintenanceModeEnabled() {
  CSLogger::Log(CSLogger::kInfo, "Checking if host is in maintenanceMode");
  // A host whose state cannot be read is treated as not in maintenance mode:
  // callers then refuse the changes that need it instead of applying them.
  if (VSI_CheckSig() != 0) {
    CSLogger::Log(CSLogger::kError, "Kernel interface signature check failed; assuming no maintenance mode");
    return false;
  }
  bool enabled = false;
  if (const int rc = VSI_Get("maintenanceMode", &enabled); rc != 0) {
    CSLogger::Log(CSLogger::kError, "Failed to read the maintenance mode state, error=%d", rc);
    return false;
  }
  return enabled;
}

void CreateDocumentFromMap(const ConfigMapList& rows, const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                           Document& doc) {
  RAPIDJSON_ASSERT(schema != nullptr);
  if (schema->IsMultiInstance()) {
    doc.SetArray();
    for (const auto& row : rows) {
      RAPIDJSON_ASSERT(row != nullptr);
      Value value = ParseRowValue(*row, doc);
      doc.PushBack(value, doc.GetAllocator());
    }
    return;
  }
  doc.SetNull();
  if (rows.empty()) return;
  RAPIDJSON_ASSERT(rows.front() != nullptr);
  Value value = ParseRowValue(*rows.front(), doc);
  static_cast<Value&>(doc).Swap(value);
}

ConfigMapList FilterSolutionUserInstances(const ConfigMapList& rows,
                                          const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema) {
  RAPIDJSON_ASSERT(schema != nullptr);
  if (rows.empty() || !schema->IsMultiInstance() || schema->GetIdentityMember() == kGeneratedIdMember) {
    return rows;
  }
  const std::vector<std::string>& solutionUsers = schema->GetSolutionUserNames();
  if (solutionUsers.empty()) return rows;
  ConfigMapList kept;
  kept.reserve(rows.size());
  for (const auto& row : rows) {
    RAPIDJSON_ASSERT(row != nullptr);
    const std::string& id = Column(*row, "Identifier");
    if (std::find(solutionUsers.begin(), solutionUsers.end(), id) == solutionUsers.end()) kept.push_back(row);
  }
  return kept;
}

void GetExternalDefaultUserConfig(const HoxConfigStore::ConfigStoreObjectId& id,
                                  const std::shared_ptr<HoxConfigStore::DBStore>& connection,
                                  const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema, Document& doc) {
  const ConfigMapList rows = HoxConfigStore::GetDefaultUserConfigMapList(id, connection);
  CreateDocumentFromMap(FilterSolutionUserInstances(rows, schema), schema, doc);
}

void CreateMergedBootDocument(const std::string& inputPath, const std::string& outputPath) {
  Document source;
  CreateDocumentFromFile(inputPath.c_str(), source);
  Document merged;
  CreateMergedDocument(source, merged);

  Document schemaOrErrors;
  if (!GenerateHostDocumentSchema(merged, schemaOrErrors)) {
    CSLogger::Log(CSLogger::kError, "Schema not found for some key(s).");
    // The errors name the keys ("field"); the message lists them.
    std::string keys;
    if (schemaOrErrors.IsArray()) {
      for (const Value& error : schemaOrErrors.GetArray()) {
        if (!error.IsObject() || !error.HasMember("field") || !error["field"].IsString()) continue;
        if (!keys.empty()) keys += ",";
        keys += error["field"].GetString();
      }
    }
    ThrowException<SchemaNotFound>(SchemaObjectNotFound, keys);
  }
  CreateFileFromDocument(outputPath.c_str(), merged);
}

}  // namespace HoxConfigManager
