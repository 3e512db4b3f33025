// The SSH synchronisation that precedes every extraction of the user or
// current configuration.
#include <exception>

#include <hoxcm/host.h>

#include "extraction/extraction_internal.h"

namespace HoxConfigManager::detail {
namespace {

// Runs one synchronisation; its failure is logged and swallowed, since an
// unreadable SSH file must not stop the extraction of everything else.
template <typename Config>
void Sync(const char* success, const char* failure) {
  try {
    Config().UpgradeConfigToConfigStore();
    CSLogger::Log(CSLogger::kInfo, "%s", success);
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, failure, e.what());
  } catch (...) {
    CSLogger::Log(CSLogger::kError, failure, "unknown error");
  }
}

}  // namespace

void SyncSshConfiguration() {
  try {
    FeatureState_InitDeltaMode();
    Sync<QmkCtl::System::SshAuthKeysConfig>("SSH auth keys configuration synced to config store successfully.",
                                           "SSH auth keys configuration failed to sync to config store error=%s.");
    if (FeatureState_IsEnabled("Qmkapps_BlockSshFileEdits")) {
      CSLogger::Log(CSLogger::kInfo,
                    "Qmkapps_BlockSshFileEdits FSS is enabled, skip syncing sshd_config and ssh_config files.");
      return;
    }
    Sync<QmkCtl::System::SshClientConfig>("SSH client configuration synced to config store successfully.",
                                         "SSH client configuration failed to sync to config store error=%s.");
    Sync<QmkCtl::System::SshServerConfig>("SSH server configuration synced to config store successfully",
                                         "SSH server configuration failed to sync to config store error=%s.");
    CSLogger::Log(CSLogger::kInfo, "SSH configurations synced.");
  } catch (const std::exception& e) {
    // The feature switches themselves could not be read.
    CSLogger::Log(CSLogger::kError, "SSH configuration sync skipped: %s", e.what());
  } catch (...) {
    CSLogger::Log(CSLogger::kError, "SSH configuration sync skipped: unknown error");
  }
}

}  // namespace HoxConfigManager::detail
