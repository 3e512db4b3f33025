#include <hoxcm/errors.h>
#include <hoxcm/json.h>

#include <string_view>

namespace HostCtl::Lib {

HostCtlException::HostCtlException(const char* message) : message_(message ? message : "") {}
HostCtlException::HostCtlException(std::string message) : message_(std::move(message)) {}
const char* HostCtlException::what() const noexcept { return message_.c_str(); }
void HostCtlException::SetLocation(ErrorLocation location) {
  location_ = std::make_shared<const ErrorLocation>(std::move(location));
}

}  // namespace HostCtl::Lib

namespace HoxConfigStore {

ConfigStoreException::ConfigStoreException(int code, const char* message)
    : HostCtlException(message), code_(code) {}
ConfigStoreException::ConfigStoreException(const char* message)
    : HostCtlException(message), code_(kConfigStoreError) {}
int ConfigStoreException::GetErrorCode() const { return code_; }

}  // namespace HoxConfigStore

namespace HoxConfigManager {
namespace {
constexpr std::string_view kInvalidJsonText = "Invalid JSON";
}  // namespace

const std::unordered_map<CMErrorCodes, const char*>& ErrorMessageTable() {
  static const std::unordered_map<CMErrorCodes, const char*> table = {
      {ConfigStoreConnectFailed, "Failed to connect to ConfigStore"},
      {SchemaObjectNotFound, "Schema object not found: %s"},
      {NotSingletonObject, "Not a Singleton object: %s"},
      {EmptyDesiredDocument, "The desired configuration document is empty."},
      {InvalidApplyInput, "The Apply API was invoked without valid input."},
      {ImpactResultNotApplicable, "The impact result is not applicable anymore."},
      {HostNotInMaintenanceMode, "The host must be in maintenance mode for apply to proceed."},
      {DeleteDefaultNotSupported, "Deleting default configuration for %s is not supported."},
      {NotNonSingletonObject, "Not a Non-Singleton object: %s"},
      {PendingDesiredConfiguration,
       "The host has other pending desired configurations, please reboot the host."},
      {JsonParseFailed, "Failed to parse JSON String"},
      {SchemaStoreAccessFailed, "Failed to access SchemaStore"},
      {PluginSchemaInvalid, "The plugin JSON does not validate against schema: %s"},
      {PluginVersionNotSupported, "The plugin JSON version is not supported: %s"},
      {PluginDependencyGraphFailed, "Failed to create dependency graph from plugin JSON files."},
      {InvalidKeyValue, "Invalid value for key %s"},
      {NotUserConfiguration, "Cannot use HostAPIs as Configuration is not user configuration"},
  };
  return table;
}

namespace detail {
void ThrowInvalidJson() { throw HoxConfigStore::ConfigStoreException(2000, kInvalidJsonText.data()); }
void ThrowInvalidJsonAt(std::string documentPath) {
  HoxConfigStore::ConfigStoreException error(2000, kInvalidJsonText.data());
  ErrorLocation location;
  location.documentPath = std::move(documentPath);
  error.SetLocation(std::move(location));
  throw error;
}
}  // namespace detail

void LocateStructuralFault(HoxConfigStore::ConfigStoreException& error, std::string documentPath) {
  const bool structural = error.GetErrorCode() == InvalidKeyValue ||
                          (error.GetErrorCode() == HoxConfigStore::ConfigStoreException::kConfigStoreError &&
                           std::string_view(error.what()) == kInvalidJsonText);
  if (!structural) return;
  const ErrorLocation* known = error.GetLocation();
  if (known != nullptr && !known->documentPath.empty()) return;  // a deeper level knew better
  ErrorLocation location = known != nullptr ? *known : ErrorLocation{};
  location.documentPath = std::move(documentPath);
  error.SetLocation(std::move(location));
}

}  // namespace HoxConfigManager
