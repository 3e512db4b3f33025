// Documents built from configuration-store rows, and the boot document
// reduced to this host.
#include <hoxcm/documents.h>
#include <hoxcm/extraction.h>
#include <hoxcm/host_documents.h>

#include <algorithm>
#include <string>
#include <vector>

#include <hoxcm/host.h>
#include <hoxcm/schema_store.h>

#include "extraction/extraction_internal.h"

namespace HoxConfigManager {
namespace {

namespace RowColumn = HoxConfigStore::RowColumn;

using detail::Column;
using HoxConfigStore::ConfigMap;
using HoxConfigStore::ConfigMapList;

// Parses one row's "Value" into a value allocated in `doc`.
Value ParseRowValue(const ConfigMap& row, Document& doc) {
  Document parsed(&doc.GetAllocator());
  ParseDocument(Column(row, RowColumn::kValue), parsed);
  Value value;
  value.Swap(parsed);
  return value;
}

}  // namespace

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
  if (rows.empty() || !schema->IsMultiInstance() || schema->GetIdentityMember() == DocumentShape::kGeneratedId) {
    return rows;
  }
  const std::vector<std::string>& solutionUsers = schema->GetSolutionUserNames();
  if (solutionUsers.empty()) return rows;
  ConfigMapList kept;
  kept.reserve(rows.size());
  for (const auto& row : rows) {
    RAPIDJSON_ASSERT(row != nullptr);
    const std::string& id = Column(*row, RowColumn::kIdentifier);
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
