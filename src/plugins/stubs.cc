// Temporary definitions so that other areas link while the framework is
// written.
#include <stdexcept>

#include <hoxcm/plugins.h>

namespace HoxConfigManager {
namespace {
[[noreturn]] void NotYet() { throw std::logic_error("not implemented"); }
}  // namespace

long GetPluginVersion(const Value&) { NotYet(); }
ImpactPluginResult ImpactPluginResult::Load(const std::string&) { NotYet(); }
ValidationPluginResult ValidationPluginResult::Load(const std::string&) { NotYet(); }
Plugin::Plugin(const char*) { NotYet(); }
bool Plugin::CheckType(PluginType) const { NotYet(); }
bool Plugin::HasApplySupport() const { NotYet(); }
bool Plugin::HasApplyBootSupport() const { NotYet(); }
bool Plugin::HasImpactSupport() const { NotYet(); }
bool Plugin::HasValidateSupport() const { NotYet(); }
std::string Plugin::GetApplyGroup() const { NotYet(); }
std::vector<PluginApplyOperation> Plugin::GetOperations() const { NotYet(); }
void Plugin::GetRemediateOperation(PluginApplyOperation&) const { NotYet(); }
std::vector<HoxConfigStore::ConfigStoreObjectId> Plugin::GetReferences() const { NotYet(); }
void Plugin::validateFile(const char*) const { NotYet(); }
ErrorInfo Plugin::Apply(const std::vector<DesiredConfigInput>&, const std::string&,
                        std::shared_ptr<PluginMonitor>) const { NotYet(); }
ImpactPluginResult Plugin::Impact(const std::vector<DesiredConfigInput>&, const std::string&,
                                  std::shared_ptr<PluginMonitor>) const { NotYet(); }
ValidationPluginResult Plugin::Validate(const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>&,
                                        const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>&,
                                        const std::string&, std::shared_ptr<PluginMonitor>) const { NotYet(); }
PluginManager::PluginManager(PluginType) { NotYet(); }
void PluginManager::Load(PluginType) { NotYet(); }
void PluginManager::ProcessJson(const char*, PluginType) { NotYet(); }
std::vector<std::shared_ptr<Plugin>> PluginManager::Find(const HoxConfigStore::ConfigStoreObjectId&) { NotYet(); }
std::vector<std::string> PluginManager::List() { NotYet(); }
std::vector<std::shared_ptr<Plugin>> PluginManager::GetPlugins() { NotYet(); }
std::vector<std::string> PluginManager::GetDependencies() { NotYet(); }
void PluginManager::BuildDependencies() { NotYet(); }
void PluginManager::ProcessOperation(const PluginApplyOperation&, const std::string&,
                                     std::unordered_map<std::string, std::vector<std::string>>&) { NotYet(); }
std::string PluginDirectory() { NotYet(); }
std::string PluginSchemaDirectory() { NotYet(); }
std::string PluginRequestPath() { NotYet(); }
std::string PluginResultPath() { NotYet(); }
long CreatePluginSchemaFromFile(const std::string&, Document&, std::string&) { NotYet(); }
std::unordered_map<long, Document> CreatePluginSchemas(std::string_view, std::string&) { NotYet(); }
void ValidateAllPlugins(std::string_view, std::string_view, Document&) { NotYet(); }
void AddValidationError(Document&, std::string_view, Value&) { NotYet(); }
std::string ErrorInfo::Serialize() const { NotYet(); }
void ErrorInfo::Deserialize(const std::string&) { NotYet(); }
ErrorInfo ErrorInfo::Load(const std::string&) { NotYet(); }
}  // namespace HoxConfigManager
