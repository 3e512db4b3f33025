// The host API's reading side: the item and its schema, its current and
// default configuration (GetConfig), the check of a new value
// (ValidateInput) and the documents a change is judged and applied with
// (GenerateSetDocuments).
#include <algorithm>
#include <cctype>
#include <map>
#include <unordered_map>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/extraction.h>
#include <hoxcm/host.h>

#include "extraction/extraction_internal.h"
#include "foundation/compare/value_compare.h"
#include "workflow/host_api.h"
#include "workflow/validation.h"

namespace HoxConfigManager {
namespace {

using HoxConfigStore::ConfigStoreDocument;
using compare::FindByName;
using compare::NameOf;


ErrorLocation At(const std::string& documentPath) {
  ErrorLocation location;
  location.documentPath = documentPath;
  return location;
}

// The refusals that the value's shape alone decides: the deleted-default
// marker, an array for a singleton, an object for a multi-instance key, an
// instance a solution created. With `strict`, anything else that is not the
// key's shape (a scalar, an instance that is not an object) is refused too;
// otherwise it is left to the schema's findings.
void CheckShape(const HostItem& item, const Value& value, bool strict) {
  const std::string path = item.Path();
  const std::string key = item.schema->GetId().toString();
  if (DocumentShape::IsDeleteDefault(value)) {
    ThrowExceptionAt<InvalidArgumentException>(At(path), DeleteDefaultNotSupported, key);
  }
  const bool multi = item.schema->IsMultiInstance();
  if (!multi && value.IsArray()) ThrowExceptionAt<InvalidArgumentException>(At(path), NotNonSingletonObject, path);
  if (multi && value.IsObject()) ThrowExceptionAt<InvalidArgumentException>(At(path), NotSingletonObject, path);
  if (!(multi ? value.IsArray() : value.IsObject())) {
    if (strict) ThrowExceptionAt<InvalidArgumentException>(At(path), InvalidKeyValue, path);
    return;
  }
  if (!multi) return;
  const std::string& identity = item.schema->GetIdentityMember();
  const std::vector<std::string>& solutionIds = item.schema->GetSolutionInstanceIds();
  for (rapidjson::SizeType i = 0; i < value.Size(); ++i) {
    const Value& instance = value[i];
    const std::string at = path + "/" + std::to_string(i);
    if (DocumentShape::IsDeleteDefault(instance)) {
      ThrowExceptionAt<InvalidArgumentException>(At(at), DeleteDefaultNotSupported, key);
    }
    if (!instance.IsObject()) {
      if (strict) ThrowExceptionAt<InvalidArgumentException>(At(at), InvalidKeyValue, at);
      continue;
    }
    // Instances a solution created are not extracted as user configuration:
    // the API must not create or change one.
    const Value* id = identity == DocumentShape::kGeneratedId ? nullptr : FindByName(instance, identity);
    if (id != nullptr && id->IsString() &&
        std::find(solutionIds.begin(), solutionIds.end(), NameOf(*id)) != solutionIds.end()) {
      CSLogger::Log(CSLogger::kError, "Instance %s of %s was created by a solution", id->GetString(), path.c_str());
      ThrowExceptionAt<ConfigManagerException>(At(at), NotUserConfiguration);
    }
  }
}

void DropGeneratedIds(Value& instances) {
  const Value name(DocumentShape::Ref(DocumentShape::kGeneratedId));
  for (Value& instance : instances.GetArray()) {
    if (instance.IsObject()) instance.RemoveMember(name);
  }
}

// Instances of a key with store-generated identities are matched with the
// host's by content, as the drift walk matches them: each takes the
// identity of the first equal host instance not taken yet, in host order;
// the others lose theirs and become new instances. A changed instance can
// therefore never carry the identity of the one it replaces (which its
// removal would then delete).
void ResolveGeneratedIds(const HostItem& item, Value& instances, const Value* host, Allocator& allocator) {
  DropGeneratedIds(instances);
  const Value name(DocumentShape::Ref(DocumentShape::kGeneratedId));
  if (host == nullptr || !host->IsArray()) return;
  const Value& schema = item.schema->GetInstanceSchema();
  std::unordered_map<std::size_t, std::vector<rapidjson::SizeType>> byHash;
  for (rapidjson::SizeType j = 0; j < host->Size(); ++j) {
    byHash[ConfigStoreDocument::HashValue((*host)[j], schema)].push_back(j);
  }
  std::vector<bool> taken(host->Size(), false);
  for (Value& instance : instances.GetArray()) {
    const auto bucket = byHash.find(ConfigStoreDocument::HashValue(instance, schema));
    if (bucket == byHash.end()) continue;
    for (const rapidjson::SizeType j : bucket->second) {
      if (taken[j] || !ConfigStoreDocument::IsEqualValue(instance, (*host)[j], schema)) continue;
      taken[j] = true;
      const Value* id = FindByName((*host)[j], DocumentShape::kGeneratedId);
      if (id != nullptr && id->IsString()) instance.AddMember(Value(name, allocator), Value(*id, allocator), allocator);
      break;
    }
  }
}

bool IsBlank(const std::string& text) {
  return std::all_of(text.begin(), text.end(), [](unsigned char c) { return std::isspace(c) != 0; });
}

}  // namespace

std::string HostItem::Path() const { return DocumentShape::ItemPath(component, group, key); }

HostItem ResolveItem(const std::string& component, const std::string& group, const std::string& key) {
  const auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);
  auto schema = store->Find(component, group, key);
  if (!schema) {
    const std::string id = HoxSchemaStore::SchemaObjectId(component, group, key).toString();
    CSLogger::Log(CSLogger::kError, "Schema not found for %s", id.c_str());
    ThrowException<InvalidArgumentException>(SchemaObjectNotFound, id);
  }
  return {component, group, key, std::move(schema)};
}

void RequireUserConfiguration(const HostItem& item) {
  if (detail::DspExcludedObjects().count({item.component, item.group, item.key}) == 0) return;
  CSLogger::Log(CSLogger::kError, "Configuration for {%s/%s/%s} is not user configuration, since dspIntegrated=False",
                item.component.c_str(), item.group.c_str(), item.key.c_str());
  ThrowExceptionAt<ConfigManagerException>(At(item.Path()), NotUserConfiguration);
}

std::shared_ptr<HoxConfigStore::DBStore> OpenStore() {
  ErrorLocation location;
  try {
    if (auto db = HoxConfigStore::GetDBStore(0, true)) return db;
  } catch (const std::exception& e) {
    location.reason = e.what();
  }
  CSLogger::Log(CSLogger::kError, "Failed to open the configuration store: %s", location.reason.c_str());
  ThrowExceptionAt<ConfigManagerException>(std::move(location), ConfigStoreConnectFailed);
}

Document CurrentDocumentOf(const HostItem& item, const std::shared_ptr<HoxConfigStore::DBStore>& db) {
  detail::SyncSshConfiguration();
  Document document(rapidjson::kObjectType);
  ProcessConfigMapList(document, HoxConfigStore::GetConfigMapList(db, HoxConfigStore::ConfigKind::User, item.Id()),
                       HoxSchemaStore::SchemaStore::GetStore(), DOCUMENT_CURRENT);
  return document;
}

void GetConfig(const std::string& component, const std::string& group, const std::string& key,
               std::string& currentConfig, std::string& defaultConfig, std::string& userConfig) {
  CSLogger::Log(CSLogger::kInfo, "Running GetConfig in HostAPI");
  CSLogger::Log(CSLogger::kInfo, "Running CheckSchemaExists in HostAPI");
  const HostItem item = ResolveItem(component, group, key);
  RequireUserConfiguration(item);
  const auto db = OpenStore();

  CSLogger::Log(CSLogger::kInfo, "Running GetDefaultConfig in HostAPI");
  Document defaults;
  if (item.schema->HasDefaultUserConfig()) GetExternalDefaultUserConfig(item.Id(), db, item.schema, defaults);

  CSLogger::Log(CSLogger::kInfo, "Running GetCurrentConfig in HostAPI");
  const Document current = CurrentDocumentOf(item, db);
  const Value* now = ItemOf(current, item.Id());

  currentConfig = now != nullptr ? JsonToString(*now) : "null";
  defaultConfig = JsonToString(defaults);
  const bool user = now != nullptr &&
                    (defaults.IsNull() || !ConfigStoreDocument::IsEqualValue(*now, defaults, item.schema->GetJsonSchema()));
  userConfig = user ? "true" : "false";
}

void ValidateInput(const std::string& component, const std::string& group, const std::string& key,
                   const std::string& input, Document& value, std::vector<ValidationErrorInfo>& findings) {
  CSLogger::Log(CSLogger::kInfo, "Validating user input configuration.");
  const HostItem item = ResolveItem(component, group, key);
  RequireUserConfiguration(item);
  if (IsBlank(input)) {
    CSLogger::Log(CSLogger::kError, "Cannot set empty configuration");
    ThrowException<InvalidArgumentException>(EmptyDesiredDocument);
  }
  try {
    ParseDocument(input, value);
  } catch (const InvalidArgumentException&) {
    CSLogger::Log(CSLogger::kError, "Invalid Json");
    throw;
  }
  CheckShape(item, value, false);
  // The store's identities are its own: matched by content later, and not
  // part of what the key's schema describes.
  if (value.IsArray() && item.schema->GetIdentityMember() == DocumentShape::kGeneratedId) DropGeneratedIds(value);

  findings.clear();
  // One entry per field, in the order the validator reports them.
  std::map<std::string, std::size_t> entries;
  const auto add = [&findings, &entries](std::string field, ErrorInfo error) {
    const auto [at, added] = entries.emplace(field, findings.size());
    if (added) findings.push_back({std::move(field), {}});
    findings[at->second].errors.push_back(std::move(error));
  };
  Document output;
  JsonValidator::Validate(item.schema->GetJsonSchema(), value, output, {}, item.Path());
  RAPIDJSON_ASSERT(output.IsArray());
  for (const Value& finding : output.GetArray()) {
    auto [field, error] = SchemaFinding(finding);
    add(std::move(field), std::move(error));
  }

  // Two instances with one identity would be one row of the store.
  const std::string& identity = item.schema->GetIdentityMember();
  if (value.IsArray() && !identity.empty() && identity != DocumentShape::kGeneratedId) {
    std::map<std::string_view, bool> seen;
    for (const Value& instance : value.GetArray()) {
      const Value* id = instance.IsObject() ? FindByName(instance, identity) : nullptr;
      if (id == nullptr || !id->IsString() || seen.emplace(NameOf(*id), true).second) continue;
      add(item.Path(), ErrorInfo(JsonValidator::ConvertErrorCodeToMsgId(JsonValidator::VALIDATION_ERR_UNIQUE_ITEMS),
                                 {item.key, std::string(NameOf(*id))}, ""));
    }
  }
  CSLogger::Log(CSLogger::kInfo, findings.empty()
                                     ? "User input configuration validation successful."
                                     : "User input configuration validation successful. Invalid configuration provided.");
}

void GenerateSetDocuments(const std::string& component, const std::string& group, const std::string& key,
                          Document& currentDocument, Document& desiredDocument, Document& stagedValue,
                          const Document& value) {
  CSLogger::Log(CSLogger::kInfo, "Generating current and desired configuration documents");
  const HostItem item = ResolveItem(component, group, key);
  RequireUserConfiguration(item);
  CheckShape(item, value, true);
  const auto db = OpenStore();
  currentDocument = CurrentDocumentOf(item, db);

  stagedValue.CopyFrom(value, stagedValue.GetAllocator());
  if (item.schema->GetIdentityMember() == DocumentShape::kGeneratedId) {
    ResolveGeneratedIds(item, stagedValue, ItemOf(currentDocument, item.Id()), stagedValue.GetAllocator());
  }

  desiredDocument.SetObject();
  Allocator& a = desiredDocument.GetAllocator();
  Value keys(rapidjson::kObjectType), groups(rapidjson::kObjectType);
  keys.AddMember(Value(key, a), Value(stagedValue, a), a);
  groups.AddMember(Value(group, a), keys, a);
  desiredDocument.AddMember(Value(component, a), groups, a);
}

}  // namespace HoxConfigManager
