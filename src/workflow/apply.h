// CheckApply and Apply (operations.h) with their plugin runner as a
// parameter: the public ones run plugins through a LaunchingRunner on the
// host run lock they take; tests pass a scripted runner. Both still take the
// host run lock, so that waiting for another apply is the same in either.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include <hoxcm/host.h>
#include <hoxcm/operations.h>

#include "plugins/plugin_runner.h"

namespace HoxConfigManager {

// The runner of an operation that changes the host, once the host is its
// own: takes the host run lock for `task` (saying so when it must wait for
// another apply, and giving up when the task is aborted: null) and hands out
// `runner`, or a LaunchingRunner on that lock when `runner` is null. The lock
// is held as long as the source lives. Apply and the host API's changes use
// it.
class LockingSource {
 public:
  explicit LockingSource(PluginRunner* runner) : given_(runner) {}
  PluginRunner* operator()(TaskHandle& task) {
    lock_ = LaunchingRunner::LockHost({[&task] {
                                         CSLogger::Log(CSLogger::kInfo, "Waiting for another apply to finish.");
                                         task.AddNotification()->PluginInfo(kApplyWaitingForHost, {});
                                       },
                                       [&task] { return task.IsAborted(); }});
    if (!lock_) return nullptr;
    if (given_ != nullptr) return given_;
    return &launching_.emplace(*lock_);
  }

 private:
  PluginRunner* const given_;
  std::unique_ptr<HoxPlatform::HostRunLock> lock_;
  std::optional<LaunchingRunner> launching_;  // runs under lock_, so declared after it
};

std::shared_ptr<CheckApplyResult> CheckApply(Document& desired, const std::string& operationContext,
                                             std::shared_ptr<TaskHandle> taskHandle, ImpactReasons* reasons,
                                             PluginRunner& runner);

ApplyResult Apply(const std::shared_ptr<CheckApplyResult>& checkResult, std::shared_ptr<TaskHandle> taskHandle,
                  PluginRunner& runner);

}  // namespace HoxConfigManager
