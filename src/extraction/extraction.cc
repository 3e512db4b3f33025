// Configuration extraction: the store's user, current, desired and SmartNIC
// configuration as host documents, and the exported host document.
#include <algorithm>
#include <exception>
#include <set>
#include <string>
#include <tuple>

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

using KeyColumns = std::tuple<const std::string&, const std::string&, const std::string&>;

KeyColumns KeyOf(const HoxConfigStore::ConfigMap& row) {
  return {Column(row, RowColumn::kComponent), Column(row, RowColumn::kGroup), Column(row, RowColumn::kKey)};
}

// The rows of one key. The store returns rows ordered by component, group
// and key, so a binary search finds them; when it finds none, a full scan
// confirms, since a wrong "no rows" verdict would refuse a whole extraction.
ConfigMapList RowsOfKey(const ConfigMapList& contents, const SchemaObjectId& id) {
  const KeyColumns wanted{id.component, id.group, id.key};
  auto before = [](const auto& row, const KeyColumns& key) { return row && KeyOf(*row) < key; };
  auto after = [](const KeyColumns& key, const auto& row) { return !row || key < KeyOf(*row); };
  auto first = std::lower_bound(contents.begin(), contents.end(), wanted, before);
  auto last = std::upper_bound(first, contents.end(), wanted, after);
  ConfigMapList rows;
  for (auto it = first; it != last; ++it) {
    if (*it && KeyOf(**it) == wanted) rows.push_back(*it);
  }
  if (!rows.empty()) return rows;
  for (const auto& row : contents) {
    if (row && KeyOf(*row) == wanted) rows.push_back(row);
  }
  return rows;
}

// Reports, for every key whose default may be changed but not deleted,
// whether the user configuration still equals the shipped default. The
// extraction itself keeps every item either way, so that an exported
// document states the whole configuration.
void ProcessMutableDefaultConfig(const ConfigMapList& contents,
                                 const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore,
                                 const std::shared_ptr<HoxConfigStore::DBStore>& db) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ProcessMutableDefaultConfig");
  for (const SchemaObjectId& id : schemaStore->GetMutableDefaultIds()) {
    const std::string name = id.toString();
    CSLogger::Log(CSLogger::kDetail, "Checking if mutableDefaultConfig schema %s has solution instances",
                  name.c_str());
    auto schema = schemaStore->Find(id.component, id.group, id.key);
    if (!schema) continue;
    const ConfigMapList userRows = FilterSolutionUserInstances(RowsOfKey(contents, id), schema);
    if (userRows.empty()) continue;  // the delete check reports this case
    CSLogger::Log(CSLogger::kError, "Configuration found for mutableDefaultConfig schema %s", name.c_str());

    Document user;
    CreateDocumentFromMap(userRows, schema, user);
    Document defaults;
    GetExternalDefaultUserConfig(HoxConfigStore::ConfigStoreObjectId(id.component, id.group, id.key), db, schema,
                                 defaults);
    if (ConfigStoreDocument::IsEqualValue(user, defaults, schema->GetJsonSchema())) {
      CSLogger::Log(CSLogger::kInfo, "User configuration is same as default for mutableDefaultConfig schema %s ",
                    name.c_str());
    } else {
      CSLogger::Log(CSLogger::kInfo, "User configuration is not same as default for mutableDefaultConfig schema %s ",
                    name.c_str());
    }
  }
}

// A key whose default may not be deleted but has no user configuration left
// was deleted behind the library's back: refuse to extract a current
// configuration that would silently lack it.
void ProcessMutableDefaultDeletes(Document& result, const ConfigMapList& contents,
                                  const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ProcessMutableDefaultDeletes");
  std::set<SchemaObjectId> missing;
  for (const SchemaObjectId& id : schemaStore->GetMutableDefaultIds()) {
    if (RowsOfKey(contents, id).empty()) missing.insert(id);
  }
  if (!missing.empty()) {
    std::string joined;
    for (const SchemaObjectId& id : missing) {
      if (!joined.empty()) joined += ",";
      joined += id.toString();
    }
    ThrowException<ConfigManagerException>(DeleteDefaultNotSupported, joined);
  }
  ProcessConfigMapList(result, contents, schemaStore, DOCUMENT_CURRENT);
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
  const ConfigMapList contents = HoxConfigStore::GetDesiredUserConfigContents(db);
  Document result = EmptyDocument();
  ProcessConfigMapList(result, contents, SchemaStoreOrThrow(), DOCUMENT_DESIRED);
  return result;
}

Document ExtractUserConfiguration(bool withProfile) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ExtractUserConfiguration");
  detail::SyncSshConfiguration();
  auto db = DatabaseOrThrow();
  auto schemaStore = SchemaStoreOrThrow();
  const ConfigMapList contents = HoxConfigStore::GetUserConfigContents(db);
  ProcessMutableDefaultConfig(contents, schemaStore, db);
  Document result = EmptyDocument();
  ProcessConfigMapList(result, contents, schemaStore, withProfile ? DOCUMENT_PROFILE : DOCUMENT_CURRENT);
  return result;
}

Document ExtractCurrentConfiguration() {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "ExtractCurrentConfiguration");
  detail::SyncSshConfiguration();
  auto db = DatabaseOrThrow();
  auto schemaStore = SchemaStoreOrThrow();
  const ConfigMapList contents = HoxConfigStore::GetUserConfigContents(db);
  Document result = EmptyDocument();
  ProcessMutableDefaultDeletes(result, contents, schemaStore);
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
