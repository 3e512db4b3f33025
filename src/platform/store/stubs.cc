// Temporary definitions so that the library links while the store is built.
#include <stdexcept>

#include <hoxcm/config_store.h>
#include <hoxcm/schema_store.h>

namespace HoxConfigStore {

namespace {
[[noreturn]] void NotImplemented() { throw std::logic_error("not implemented"); }
}  // namespace

ConfigStoreObjectId::ConfigStoreObjectId(std::string c, std::string g, std::string k, std::string i)
    : component(std::move(c)), group(std::move(g)), key(std::move(k)), instanceId(std::move(i)) {}
std::string ConfigStoreObjectId::toString() const {
  std::string s = "comp " + component + " grp " + group + " key " + key;
  if (!instanceId.empty()) s += " id " + instanceId;
  return s;
}
DBStore::~DBStore() = default;
std::shared_ptr<DBStore> GetDBStore(int, bool) { NotImplemented(); }
ConfigMapList GetUserConfigContents(const std::shared_ptr<DBStore>&) { NotImplemented(); }
ConfigMapList GetDesiredUserConfigContents(const std::shared_ptr<DBStore>&) { NotImplemented(); }
ConfigMapList GetDefaultUserConfigContents(const std::shared_ptr<DBStore>&) { NotImplemented(); }
ConfigMapList GetSmartnicConfiguration(const std::shared_ptr<DBStore>&) { NotImplemented(); }
ConfigMapList GetDefaultUserConfigMapList(const ConfigStoreObjectId&, const std::shared_ptr<DBStore>&) {
  NotImplemented();
}
void SetDesiredUserConfig(rapidjson::Document&) { NotImplemented(); }
void SetDesiredSmartnicConfiguration(rapidjson::Document&) { NotImplemented(); }
void ImportConfiguration(ConfigKind, const rapidjson::Value&) { NotImplemented(); }
void ApplyUserConfigChanges(const std::vector<UserConfigChange>&) { NotImplemented(); }
BOOTMODE GetBootMode() { NotImplemented(); }
void SetBootMode(BOOTMODE) { NotImplemented(); }
rapidjson::Document getBootApplyRecord() { NotImplemented(); }
void setBootApplyRecord(const std::string&) { NotImplemented(); }
void SetBootComplete(bool) { NotImplemented(); }
std::vector<FailureRecord> GetBootTimeRestoreFailures() { NotImplemented(); }
void AddBootTimeRestoreFailure(const FailureRecord&) { NotImplemented(); }
void ClearBootTimeRestoreFailures() { NotImplemented(); }
bool GetMaintenanceMode() { NotImplemented(); }
void SetMaintenanceMode(bool) { NotImplemented(); }
std::string GenerateInstanceId() { NotImplemented(); }

StoreObject::StoreObject(ConfigStoreObjectId id) : id_(std::move(id)) {}
StoreObject::~StoreObject() = default;
const ConfigStoreObjectId& StoreObject::GetConfigStoreObjectId() const { return id_; }
bool StoreObject::GetValue(const std::string&, std::string*) const { NotImplemented(); }
void StoreObject::SetValue(const std::string&, const std::string&) { NotImplemented(); }
const std::map<std::string, std::string>& StoreObject::GetValues() const { return values_; }
ConfigStoreObject::ConfigStoreObject(ConfigStoreObjectId id) : StoreObject(std::move(id)) {}
ConfigStoreObject::ConfigStoreObject(ConfigStoreObjectId id, const rapidjson::Value&) : StoreObject(std::move(id)) {}
const rapidjson::Value& ConfigStoreObject::GetData() const { NotImplemented(); }
std::string ConfigStoreObject::Serialize() const { NotImplemented(); }
DriftObject::DriftObject(ConfigStoreObjectId id, std::string action, const rapidjson::Value&)
    : StoreObject(std::move(id)), action_(std::move(action)) {}
const std::string& DriftObject::GetAction() const { return action_; }
const rapidjson::Value& DriftObject::GetDrift() const { NotImplemented(); }
std::string DriftObject::Serialize() const { NotImplemented(); }
std::shared_ptr<ConfigStoreObject> CreateObject(const ConfigStoreObjectId&, const rapidjson::Value&,
                                                const std::shared_ptr<HoxSchemaStore::SchemaObject>&,
                                                std::optional<int64_t>) {
  NotImplemented();
}
const char* const sGlobalNamespace = "global";
ConfigStore::~ConfigStore() = default;
std::shared_ptr<ConfigStore> ConfigStore::GetStore(const std::string&) { NotImplemented(); }
ConfigStoreTransaction::ConfigStoreTransaction(const std::shared_ptr<ConfigStore>&) : open_(false) {
  NotImplemented();
}
ConfigStoreTransaction::~ConfigStoreTransaction() = default;
void ConfigStoreTransaction::Commit() { NotImplemented(); }
void ProcessDesiredObject(rapidjson::MemoryPoolAllocator<>&, const std::shared_ptr<DBStore>&, const std::string&,
                          const std::string&, const std::string&,
                          const std::shared_ptr<HoxSchemaStore::SchemaObject>&, const rapidjson::Value&) {
  NotImplemented();
}
rapidjson::Document GetCurrentConfigInternal(const std::shared_ptr<DBStore>&, const std::string&,
                                             const std::string&, const std::string&) {
  NotImplemented();
}
rapidjson::Document GetDefaultUserConfigInternal(const std::shared_ptr<DBStore>&, const std::string&,
                                                 const std::string&, const std::string&) {
  NotImplemented();
}
rapidjson::Document GetDefaultUserConfigInstancesInternal(const std::shared_ptr<DBStore>&, const std::string&,
                                                          const std::string&, const std::string&) {
  NotImplemented();
}

std::string ConfigStoreDocument::NormalizeHostId(const std::string&) { NotImplemented(); }
void ConfigStoreDocument::GetDocumentForHost(const rapidjson::Value&, rapidjson::Document&, const std::string&) {
  NotImplemented();
}
void ConfigStoreDocument::AddObject(rapidjson::Document&, const std::string&, const std::string&,
                                    const std::string&, const std::string&, rapidjson::Value&,
                                    rapidjson::MemoryPoolAllocator<>&) {
  NotImplemented();
}
void ConfigStoreDocument::AddProfile(rapidjson::Document&) { NotImplemented(); }
void ConfigStoreDocument::CleanupObject(rapidjson::Value&, const rapidjson::Value&,
                                        const std::vector<CLEANUP_ACTIONS>&, rapidjson::MemoryPoolAllocator<>&) {
  NotImplemented();
}
void ConfigStoreDocument::NormalizeValue(rapidjson::Value&, rapidjson::MemoryPoolAllocator<>&) { NotImplemented(); }
void ConfigStoreDocument::SplitDocument(const rapidjson::Value&, const rapidjson::Value&, const std::string&,
                                        rapidjson::Document&) {
  NotImplemented();
}
void ConfigStoreDocument::PatchRequiredProperty(rapidjson::Value&, const std::string&, const rapidjson::Value&,
                                                rapidjson::MemoryPoolAllocator<>&) {
  NotImplemented();
}
void ConfigStoreDocument::PatchUnionTagProperty(rapidjson::Value&, const std::string&, const rapidjson::Value&,
                                                rapidjson::MemoryPoolAllocator<>&) {
  NotImplemented();
}
rapidjson::Document ConfigStoreDocument::CreateDocument(const std::string&) { NotImplemented(); }
void ConfigStoreDocument::SerializeValue(const rapidjson::Value&, std::string&) { NotImplemented(); }

}  // namespace HoxConfigStore
