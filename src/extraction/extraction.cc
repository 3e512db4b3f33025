// Configuration extraction: the store's user, current, desired and SmartNIC
// configuration as host documents, and the exported host document.
#include <exception>
#include <set>
#include <string>

#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/extraction.h>
#include <hoxcm/host_documents.h>

#include "extraction/extraction_internal.h"

namespace HoxConfigManager {
namespace detail {

const HoxSchemaStore::SchemaObjectId& QuorletObjectId() {
  static const HoxSchemaStore::SchemaObjectId kQuorlet("quorlet", "system", "quorlet_daemon");
  return kQuorlet;
}

std::set<HoxSchemaStore::SchemaObjectId> DspExcludedObjects() {
  if (FeatureState_IsEnabled("dspIntegrated")) return {};
  return {QuorletObjectId()};
}

}  // namespace detail

namespace {

namespace RowColumn = HoxConfigStore::RowColumn;

using detail::Column;
using HoxConfigStore::ConfigMapList;
using HoxConfigStore::ConfigStoreDocument;
using HoxSchemaStore::SchemaObjectId;

std::shared_ptr<HoxSchemaStore::SchemaStore> SchemaStoreOrThrow() {
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);
  return store;
}

std::shared_ptr<HoxConfigStore::DBStore> DatabaseOrThrow() {
  auto db = HoxConfigStore::GetDBStore(0, true);
  if (!db) ThrowException<ConfigManagerException>(ConfigStoreConnectFailed);
  return db;
}

// Reports, for every key whose default may be changed but not deleted,
// whether the user configuration still equals the shipped default. The
// extraction itself keeps every item either way, so that an exported
// document states the whole configuration.
void ProcessMutableDefaultConfig(const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore,
                                 const std::shared_ptr<HoxConfigStore::DBStore>& db) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ProcessMutableDefaultConfig");
  for (const SchemaObjectId& id : schemaStore->GetMutableDefaultIds()) {
    const std::string name = id.toString();
    CSLogger::Log(CSLogger::kDetail, "Checking if mutableDefaultConfig schema %s has solution instances",
                  name.c_str());
    auto schema = schemaStore->Find(id.component, id.group, id.key);
    if (!schema) continue;
    const HoxConfigStore::ConfigStoreObjectId objectId(id.component, id.group, id.key);
    const ConfigMapList userRows = FilterSolutionUserInstances(
        HoxConfigStore::GetConfigMapList(db, HoxConfigStore::ConfigKind::User, objectId), schema);
    if (userRows.empty()) continue;  // the delete check reports this case
    CSLogger::Log(CSLogger::kError, "Configuration found for mutableDefaultConfig schema %s", name.c_str());

    Document user;
    CreateDocumentFromMap(userRows, schema, user);
    Document defaults;
    GetExternalDefaultUserConfig(objectId, db, schema, defaults);
    if (ConfigStoreDocument::IsEqualValue(user, defaults, schema->GetJsonSchema())) {
      CSLogger::Log(CSLogger::kInfo, "User configuration is same as default for mutableDefaultConfig schema %s ",
                    name.c_str());
    } else {
      CSLogger::Log(CSLogger::kInfo, "User configuration is not same as default for mutableDefaultConfig schema %s ",
                    name.c_str());
    }
  }
}

// The rows of `kind` as a document of `type`, read from the store one at a
// time.
void ProcessStoredRows(Document& result, const std::shared_ptr<HoxConfigStore::DBStore>& db,
                       HoxConfigStore::ConfigKind kind,
                       const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore, DocumentType type) {
  detail::RowProcessor rows(result, schemaStore, type);
  HoxConfigStore::ForEachConfigRow(db, kind, [&rows](const HoxConfigStore::ConfigRow& row) { rows.Add(row); });
}

// A key whose default may not be deleted but has no user configuration left
// was deleted behind the library's back: refuse to extract a current
// configuration that would silently lack it. The keys are ticked off while
// the rows are turned into the document, so the rows are read once.
void ProcessMutableDefaultDeletes(Document& result, const std::shared_ptr<HoxConfigStore::DBStore>& db,
                                  const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ProcessMutableDefaultDeletes");
  std::set<SchemaObjectId> missing = schemaStore->GetMutableDefaultIds();
  detail::RowProcessor rows(result, schemaStore, DOCUMENT_CURRENT);
  SchemaObjectId previous;
  HoxConfigStore::ForEachConfigRow(db, HoxConfigStore::ConfigKind::User, [&](const HoxConfigStore::ConfigRow& row) {
    if (!missing.empty() && (row.key != previous.key || row.group != previous.group ||
                             row.component != previous.component)) {
      previous = SchemaObjectId(row.component, row.group, row.key);
      missing.erase(previous);
    }
    rows.Add(row);
  });
  if (!missing.empty()) {
    std::string joined;
    for (const SchemaObjectId& id : missing) {
      if (!joined.empty()) joined += ",";
      joined += id.toString();
    }
    ThrowException<ConfigManagerException>(DeleteDefaultNotSupported, joined);
  }
}

Document EmptyDocument() {
  Document doc;
  doc.SetObject();
  return doc;
}

}  // namespace

Document ExtractDesiredConfiguration() {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ExtractDesiredConfiguration");
  auto db = DatabaseOrThrow();
  Document result = EmptyDocument();
  ProcessStoredRows(result, db, HoxConfigStore::ConfigKind::Desired, SchemaStoreOrThrow(), DOCUMENT_DESIRED);
  return result;
}

Document ExtractUserConfiguration(bool withProfile) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ExtractUserConfiguration");
  detail::SyncSshConfiguration();
  auto db = DatabaseOrThrow();
  auto schemaStore = SchemaStoreOrThrow();
  ProcessMutableDefaultConfig(schemaStore, db);
  Document result = EmptyDocument();
  ProcessStoredRows(result, db, HoxConfigStore::ConfigKind::User, schemaStore,
                    withProfile ? DOCUMENT_PROFILE : DOCUMENT_CURRENT);
  return result;
}

Document ExtractCurrentConfiguration() {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ExtractCurrentConfiguration");
  detail::SyncSshConfiguration();
  auto db = DatabaseOrThrow();
  auto schemaStore = SchemaStoreOrThrow();
  Document result = EmptyDocument();
  ProcessMutableDefaultDeletes(result, db, schemaStore);
  return result;
}

Document ExtractSmartnicConfiguration() {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ExtractSmartnicConfiguration");
  auto db = DatabaseOrThrow();
  const ConfigMapList contents = HoxConfigStore::GetSmartnicConfiguration(db);
  Document result = EmptyDocument();
  Allocator& allocator = result.GetAllocator();
  Document parsed(&allocator);
  for (const auto& row : contents) {
    RAPIDJSON_ASSERT(row != nullptr);
    const std::string& key = Column(*row, RowColumn::kKey);
    const std::string& component = Column(*row, RowColumn::kComponent);
    const std::string& group = Column(*row, RowColumn::kGroup);
    const std::string& identifier = Column(*row, RowColumn::kIdentifier);
    const std::string& text = Column(*row, RowColumn::kValue);
    if (text == DocumentShape::kDeleteDefault) {
      ThrowException<ConfigManagerException>(DeleteDefaultNotSupported,
                                             SchemaObjectId(component, group, key).toString());
    }
    ParseDocument(text, parsed);
    Value value;
    value.Swap(parsed);
    RAPIDJSON_ASSERT(value.IsObject());
    ConfigStoreDocument::NormalizeValue(value, allocator);
    ConfigStoreDocument::AddObject(result, component, group, key, identifier, value, allocator);
  }
  return result;
}

Document ExportDocument() {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ExportDocument");
  try {
    Document user = ExtractUserConfiguration(true);
    RAPIDJSON_ASSERT(user.IsObject() && user.HasMember(Value(DocumentShape::Ref(DocumentShape::kProfile))));
    const Value& profile = DocumentShape::Unwrap(user);

    Document schemaDocument;
    HoxSchemaStore::GenerateSchemaDocument(profile, HoxSchemaStore::SchemaStore::GetCache(), schemaDocument);
    const std::string uuid = GetBIOSUUID();
    Document result;
    ConfigStoreDocument::SplitDocument(profile, schemaDocument, uuid, result);

    const QmkCtl::System::QmkVersion version = QmkCtl::System::SystemInfoImpl::GetQmkVersion();
    Allocator& allocator = result.GetAllocator();
    Value& host = rapidjson::Pointer("/metadata/reference_host").Create(result, allocator);
    host.SetObject();
    host.AddMember("uuid", Value(uuid, allocator), allocator);
    host.AddMember("build", Value(version.build, allocator), allocator);
    host.AddMember("version", Value(version.version, allocator), allocator);
    host.AddMember("patch", Value(version.patch, allocator), allocator);
    host.AddMember("update", Value(version.update, allocator), allocator);

    ConfigStoreDocument::NormalizeValue(result, allocator);
    return result;
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "ExportDocument failed: %s", e.what());
    throw;
  }
}

}  // namespace HoxConfigManager
