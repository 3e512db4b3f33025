// Boot-time apply: bootstrapping a freshly installed host from a document
// file (ApplyBootDocument), applying the configuration staged for the next
// boot while the host boots (ExecuteBootPlugins), the boot-apply record that
// run leaves in the store and its reading by management clients
// (GetBootApplyInfo), and the desired configuration of the network-offload
// device (SetSmartnicConfiguration). docs/boot.md describes the whole cycle:
// what a reboot-requiring bootstrap keeps in the store, what the next boot
// regenerates and applies, who marks the boot complete, the systemd units.
//
// The two boot entry points never throw: they log what went wrong and return
// their failure value, since a boot script has nobody to catch for it. Both
// hold the host run lock for their whole run (waiting for another apply to
// finish), so they must not be called by a caller that holds it.
//
// Every function runs on the caller's thread; the store serialises its own
// use, so they may be called from several threads.
#pragma once

#include <cstdint>
#include <ctime>
#include <string>
#include <utility>
#include <vector>

#include <hoxcm/errors.h>
#include <hoxcm/export.h>

namespace HoxConfigManager {

// The message id of a key whose staged configuration a boot did not put in
// effect; its arguments are component, group and key.
inline constexpr const char* kBootRestoreFailed = "com.tarvik.hox.settings.boot-restore.failed";
// The message id recorded when a boot-time run could not complete at all (its
// one argument is the reason).
inline constexpr const char* kBootApplyFailed = "com.tarvik.hox.settings.boot-apply.failed";

// One recorded outcome: when, and the error (an empty id: the run succeeded).
class HOXCM_API BootApplyErrorInfo {
 public:
  BootApplyErrorInfo() = default;
  BootApplyErrorInfo(std::time_t time, ErrorInfo errorInfo) : time(time), errorInfo(std::move(errorInfo)) {}

  // {"errorInfo": <ErrorInfo::Serialize() as a string>, "time": "DD-MM-YYYY HH-MM-SS"}, the time in local time.
  std::string Serialize() const;
  // Fills both fields from Serialize()'s text. Malformed text, a missing
  // member, a member of the wrong type or a time that does not read back:
  // ConfigStoreException 2000 ("Invalid JSON").
  void Deserialize(std::string text);

  std::time_t time = 0;  // seconds since the epoch
  ErrorInfo errorInfo;
};

enum BootApplyStatus : int32_t {
  BOOT_APPLY_SUCCEEDED = 0,
  BOOT_APPLY_FAILED = 1,
  BOOT_APPLY_IN_PROGRESS = 3,  // the boot is not marked complete yet
};

struct HOXCM_API BootApplyInfo {
  BootApplyStatus status = BOOT_APPLY_SUCCEEDED;
  // The failed run first (with the time it was recorded), then one entry per
  // key the boot did not put in effect (kBootRestoreFailed, stamped with the
  // time of the call).
  std::vector<BootApplyErrorInfo> errors;
};

// Bootstraps the host from the document at `path`: checks that every key has
// a schema, validates the document (schema and plugins) and computes its
// impact. A document that needs a reboot is staged for the next boot, and the
// two auto-deployment files are moved into the store (both must exist), all
// in one store transaction; any other document is applied at once, without a
// maintenance-mode check. Returns 0 on success, 1 on any failure (logged).
HOXCM_API int32_t ApplyBootDocument(const std::string& path);

// The boot-time run: regenerates the auto-deployment files a bootstrap
// preserved (once), applies the staged configuration with the boot-capable
// plugins, and records the outcome: the boot-apply record, the keys not put
// in effect (restore failures), the staged configuration cleared and boot
// mode back to normal, in one store transaction; one apply history record.
// Returns true when the run failed (logged).
HOXCM_API bool ExecuteBootPlugins();

// The outcome of the last boot-time run, once the boot is marked complete.
// Throws ConfigStoreException 2000 ("Invalid JSON") for a damaged record.
HOXCM_API BootApplyInfo GetBootApplyInfo();

// Replaces the desired SmartNIC configuration by the document `jsonText`.
// Throws InvalidArgumentException 2080 for text that is not JSON, and what
// the store's writer throws for a document it cannot store.
HOXCM_API void SetSmartnicConfiguration(const std::string& jsonText);

}  // namespace HoxConfigManager
