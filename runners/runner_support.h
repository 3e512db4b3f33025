// What both runners share on the C++ side: finding the host root from the
// runner's own path, the exit codes of runner failures, and committing an
// applied request to the configuration store.
//
// Runners are single-threaded short-lived processes; nothing here is meant
// for concurrent use.
#pragma once

#include <cerrno>
#include <string>

#include <hoxcm/plugins.h>

namespace hoxcm_runner {

// Exit codes of runner failures. They are errno values because the library
// reports a failed runner with the system text of its exit code.
constexpr int kExitBadRequest = EINVAL;          // request missing or malformed
constexpr int kExitModuleLoad = ELIBACC;         // shared object cannot be loaded
constexpr int kExitNoEntry = ENOSYS;             // describe symbol missing
constexpr int kExitAbiMismatch = EPROTO;         // wrong interface version
constexpr int kExitUnsupported = EOPNOTSUPP;     // plugin lacks the operation
constexpr int kExitBadResult = EBADMSG;          // no result, or a malformed one
constexpr int kExitPluginCrashed = ENOTRECOVERABLE;  // exception out of the plugin
constexpr int kExitStoreCommit = EIO;            // store update after apply failed

// The root a runner was installed under: `programPath` (argv[0], not
// resolved, since installations may link the runner in) with the fixed
// runner directory and file name removed; "/" when it is not below such a
// directory.
std::string RootFromProgramPath(const std::string& programPath);

// Makes the user configuration match an applied request: every "data"
// element becomes an ADD, SET or DELETE of its object, all in one
// transaction. Throws on failure, leaving the store unchanged.
void CommitAppliedRequest(const HoxConfigManager::PluginRequest& request);

}  // namespace hoxcm_runner
