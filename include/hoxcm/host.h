// Host facts and process-wide services of the platform: the root prefix that
// every fixed path goes through, the logger, hardware and kernel facts,
// feature switches, quick-boot support and the SSH configuration
// synchronisation. All functions are thread-safe.
#pragma once

#include <string>
#include <string_view>

#include <hoxcm/export.h>

namespace HoxPlatform {

// The root prefix of every fixed path: HOX_ROOT, "/" when unset or empty.
// Read on every call, so that a process may change it (tests, runners).
HOXCM_API std::string HostRoot();
// `path` (an absolute host path such as "/var/tarvik/lifecycle/x") resolved
// under HostRoot(). A trailing "/" is kept.
HOXCM_API std::string HostPath(std::string_view path);
// The part of `path` below HostRoot(): the inverse of HostPath (`path`
// unchanged when it is not below the root).
HOXCM_API std::string StripHostRoot(std::string_view path);

}  // namespace HoxPlatform

class HOXCM_API CSLogger {
 public:
  enum log_priority : int { kError = 0, kWarning = 1, kInfo = 2, kDetail = 3 };
  // printf-style. Lines at or above the threshold (HOX_LOG_LEVEL: -1 for
  // none, 0 to 3 or error|warning|info|detail, default info) go to stderr;
  // HOX_LOG_SYSLOG=1 sends them to syslog instead, 2 to both.
  static void Log(int priority, const char* format, ...) __attribute__((format(printf, 2, 3)));
  static bool IsEnabled(int priority);
};

namespace HostCtl {
namespace Host {
struct HOXCM_API HardwareInfo {
  // DMI product UUID (<root>/sys/class/dmi/id/product_uuid), or the machine id
  // (<root>/etc/machine-id) when the host has none.
  std::string biosUuid;
  std::string vendor;
  std::string product;
};
HOXCM_API HardwareInfo GetHardwareInfo();
}  // namespace Host
namespace System::LoadHox {
// Quick-boot facts from the host facts file (docs/platform.md).
HOXCM_API bool IsSTMSupported();
HOXCM_API bool IsSupported();
}  // namespace System::LoadHox
}  // namespace HostCtl

namespace QmkCtl::System {
struct HOXCM_API QmkVersion {
  std::string build;
  std::string version;
  std::string patch;
  std::string update;
};
class HOXCM_API SystemInfoImpl {
 public:
  // From uname(2): release "6.1.0-13-amd64" gives version "6.1.0", patch
  // "13", update "amd64"; build from the kernel version string.
  static QmkVersion GetQmkVersion();
};
// Each reads its configuration file under the root into its store object
// and throws HostCtl::Lib::HostCtlException on failure.
class HOXCM_API SshAuthKeysConfig {
 public:
  void UpgradeConfigToConfigStore();
};
class HOXCM_API SshClientConfig {
 public:
  void UpgradeConfigToConfigStore();
};
class HOXCM_API SshServerConfig {
 public:
  void UpgradeConfigToConfigStore();
};
}  // namespace QmkCtl::System

// Kernel system-information interface: the maintenance-mode node.
HOXCM_API int VSI_CheckSig();  // 0 when the interface is usable
HOXCM_API int VSI_Get(const char* node, bool* value);  // 0 on success

// Feature switches, from the host facts file.
HOXCM_API void FeatureState_InitSilentMode();
HOXCM_API void FeatureState_InitDeltaMode();
HOXCM_API bool FeatureState_IsEnabled(const char* feature);
