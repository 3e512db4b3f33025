// The document functions that depend on the host: its identity, its
// maintenance-mode state, and instance identities by the key's schema.
#include <hoxcm/host_documents.h>

#include <hoxcm/config_store.h>
#include <hoxcm/host.h>
#include <hoxcm/schema_store.h>

namespace HoxConfigManager {

std::string GetBIOSUUID() {
  return HoxConfigStore::ConfigStoreDocument::NormalizeHostId(HostCtl::Host::GetHardwareInfo().biosUuid);
}

void CreateMergedDocument(const Document& source, Document& result) {
  HoxConfigStore::ConfigStoreDocument::GetDocumentForHost(source, result, GetBIOSUUID());
}

void CreateMergedDocument(Document&& source, Document& result) {
  RAPIDJSON_ASSERT(source.IsObject());
  HoxConfigStore::ConfigStoreDocument::ReduceToHost(source, GetBIOSUUID());
  result.Swap(source);
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

std::string GetInstanceIdFromValue(const Value& instance,
                                   const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema) {
  RAPIDJSON_ASSERT(schema != nullptr);
  const std::string& member = schema->GetIdentityMember();
  if (member.empty() || !HoxConfigStore::ConfigStoreDocument::ValueExists(instance, member.c_str())) {
    return {};
  }
  const Value& id = instance[member.c_str()];
  if (!id.IsString()) ThrowException<ConfigManagerException>(InvalidKeyValue, member);
  return std::string(id.GetString(), id.GetStringLength());
}

}  // namespace HoxConfigManager
