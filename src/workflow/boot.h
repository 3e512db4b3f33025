// The two boot entry points (<hoxcm/boot.h>) with their plugin runner as a
// parameter: the public ones run plugins through a LaunchingRunner on the
// host run lock they take; tests pass a scripted runner (the lock is taken
// all the same). Also the store object that keeps the auto-deployment files
// across the reboot a bootstrap may need.
#pragma once

#include <cstdint>
#include <string>

#include <hoxcm/boot.h>
#include <hoxcm/config_store.h>

#include "plugins/plugin_runner.h"

namespace HoxConfigManager {

// The object of the global namespace holding the preserved files, and the
// names of its two values (the files' contents).
HoxConfigStore::ConfigStoreObjectId AutodeployObjectId();
inline constexpr const char* kWaiterNotifyValue = "waiter_notify";
inline constexpr const char* kFirewallValue = "firewall";

int32_t ApplyBootDocument(const std::string& path, PluginRunner& runner);
bool ExecuteBootPlugins(PluginRunner& runner);

}  // namespace HoxConfigManager
