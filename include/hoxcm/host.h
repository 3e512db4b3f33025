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

// The host's fixed paths, the one table of them: the library, hoxcfg, both
// runners and the tests take their paths from here (the script runner keeps a
// copy, which a test compares with this table). Each is a path on the host,
// resolved under the root with HostPath(). Directories have no trailing "/".
namespace HostPaths {
inline constexpr std::string_view kSchemaDirectory = "/usr/lib/tarvik/configmanager/schemas";
inline constexpr std::string_view kManifestDirectory = "/usr/lib/tarvik/configmanager/apply_modules";
inline constexpr std::string_view kManifestSchemaDirectory = "/usr/lib/tarvik/configmanager/plugin_schemas";
inline constexpr std::string_view kRunnerDirectory = "/usr/lib/tarvik/configmanager/bin";
inline constexpr std::string_view kPythonRunner = "/usr/lib/tarvik/configmanager/bin/py_plugin_runner";
inline constexpr std::string_view kCppRunner = "/usr/lib/tarvik/configmanager/bin/cpp_plugin_runner";
inline constexpr std::string_view kLifecycleDirectory = "/var/tarvik/lifecycle";
inline constexpr std::string_view kRequestFile = "/var/tarvik/lifecycle/cm-plugin-input.json";
inline constexpr std::string_view kResultFile = "/var/tarvik/lifecycle/cm-plugin-output.json";
inline constexpr std::string_view kRunLock = "/var/tarvik/lifecycle/cm-plugin.lock";
inline constexpr std::string_view kStoreDirectory = "/var/lib/tarvik/configstore";
inline constexpr std::string_view kStore = "/var/lib/tarvik/configstore/configstore.db";
inline constexpr std::string_view kHostFacts = "/etc/tarvik/host-facts.json";
inline constexpr std::string_view kProductUuid = "/sys/class/dmi/id/product_uuid";
inline constexpr std::string_view kSystemVendor = "/sys/class/dmi/id/sys_vendor";
inline constexpr std::string_view kProductName = "/sys/class/dmi/id/product_name";
inline constexpr std::string_view kMachineId = "/etc/machine-id";
inline constexpr std::string_view kSshClientConfig = "/etc/ssh/ssh_config";
inline constexpr std::string_view kSshServerConfig = "/etc/ssh/sshd_config";
inline constexpr std::string_view kSshAuthorizedKeys = "/root/.ssh/authorized_keys";
inline constexpr std::string_view kAutodeployWaiterNotify = "/etc/tarvik/autodeploy/waiterNotify.json";
inline constexpr std::string_view kAutodeployFirewall = "/etc/tarvik/firewall/autodeploy.xml";
// The system log's datagram socket: audit lines of changes to the host.
inline constexpr std::string_view kSystemLog = "/dev/log";
// The journal's socket for its native protocol: log records with fields.
inline constexpr std::string_view kJournalSocket = "/run/systemd/journal/socket";

// Every entry by a name of its own (the names of the script runner's copy).
struct Entry {
  std::string_view name;
  std::string_view path;
};
inline constexpr Entry kTable[] = {
    {"schema_directory", kSchemaDirectory},
    {"manifest_directory", kManifestDirectory},
    {"manifest_schema_directory", kManifestSchemaDirectory},
    {"runner_directory", kRunnerDirectory},
    {"python_runner", kPythonRunner},
    {"cpp_runner", kCppRunner},
    {"lifecycle_directory", kLifecycleDirectory},
    {"request_file", kRequestFile},
    {"result_file", kResultFile},
    {"run_lock", kRunLock},
    {"store_directory", kStoreDirectory},
    {"store", kStore},
    {"host_facts", kHostFacts},
    {"product_uuid", kProductUuid},
    {"system_vendor", kSystemVendor},
    {"product_name", kProductName},
    {"machine_id", kMachineId},
    {"ssh_client_config", kSshClientConfig},
    {"ssh_server_config", kSshServerConfig},
    {"ssh_authorized_keys", kSshAuthorizedKeys},
    {"autodeploy_waiter_notify", kAutodeployWaiterNotify},
    {"autodeploy_firewall", kAutodeployFirewall},
    {"system_log", kSystemLog},
    {"journal_socket", kJournalSocket},
};
}  // namespace HostPaths

}  // namespace HoxPlatform

// The library's log. An embedding process hears only warnings and errors on
// stderr unless it asks for more: the threshold and the destination come
// from SetThreshold/SetDestination when called, else from HOX_LOG_LEVEL (-1
// for none, 0 to 3 or error|warning|info|detail; default warning),
// HOX_LOG_JOURNAL (1 the journal, 0 never) and HOX_LOG_SYSLOG (1 the system
// log instead of stderr, 2 both), read on every call. A process that systemd
// started with its stderr connected to the journal (JOURNAL_STREAM) writes
// to the journal unless HOX_LOG_JOURNAL=0. Journal records carry their
// priority, the identifier "hoxcm" (journalctl -t hoxcm) and the fields of
// the thread's HoxPlatform::LogContext; a record the journal does not take
// is written to stderr. The settings are process-wide; every function is
// thread-safe.
class HOXCM_API CSLogger {
 public:
  enum log_priority : int { kError = 0, kWarning = 1, kInfo = 2, kDetail = 3 };
  enum class Destination { kStderr, kSyslog, kBoth, kJournal };
  // printf-style; one write per line.
  static void Log(int priority, const char* format, ...) __attribute__((format(printf, 2, 3)));
  static bool IsEnabled(int priority);
  // Lines up to `priority` are written (-1: none); overrides HOX_LOG_LEVEL.
  static void SetThreshold(int priority);
  // Overrides HOX_LOG_JOURNAL, HOX_LOG_SYSLOG and JOURNAL_STREAM.
  static void SetDestination(Destination destination);
  // Whether records go to the journal now.
  static bool WritesToJournal();
};

namespace HoxPlatform {

// A structured field of the log records that this thread writes while the
// context lives: the operation, the plugin or the configuration object being
// worked on (journal fields HOXCM_OPERATION, HOXCM_PLUGIN, HOXCM_OBJECT).
// Contexts nest: each restores the value it replaced when it ends. Values
// name things (an operation, a plugin id, "component:group:key"), never
// configuration values, so no secret reaches a field.
class HOXCM_API LogContext final {
 public:
  enum class Field { kOperation, kPlugin, kObject };
  LogContext(Field field, std::string value);
  ~LogContext();
  LogContext(const LogContext&) = delete;
  LogContext& operator=(const LogContext&) = delete;
  // This thread's current value of `field`; empty when none is set.
  static const std::string& Current(Field field);

 private:
  const Field field_;
  std::string previous_;
};

}  // namespace HoxPlatform

namespace HoxPlatform {

// Writes "EVENT by USER" to the host's system log (the datagram socket
// /dev/log under the root, else the machine's), facility authpriv, as
// `program`: the audit trail of changes made to the host. USER names the
// real user and, under sudo, the user who ran sudo. True when the line was
// delivered; a host without a system log loses it, as syslog(3) would.
HOXCM_API bool AuditLog(std::string_view program, std::string_view event);

}  // namespace HoxPlatform

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
