// The seam between orchestration and the processes that do a plugin's work.
// A PluginRunner performs one run of a plugin per call (apply, impact or
// validate); orchestration (remediation, impact, validation) decides what
// runs in which order and takes its runner as a parameter, so that its
// scheduling, progress and abort cases are tested with a scripted fake and
// no process. The production runner, LaunchingRunner, is the default: it
// writes the request file, starts, watches and reaps the runner program and
// reads the result file (docs/plugin-protocol.md).
//
// Every run reports failures and aborts inside its result, never by throwing.
// A null monitor is taken as PluginMonitor::Dummy().
//
// Thread safety: LaunchingRunner holds no mutable state; its runs on one
// host are serialised by the host run lock.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include <hoxcm/plugins.h>

#include "platform/process/process.h"

namespace HoxConfigManager {

class PluginRunner {
 public:
  PluginRunner() = default;
  virtual ~PluginRunner();
  PluginRunner(const PluginRunner&) = delete;
  PluginRunner& operator=(const PluginRunner&) = delete;

  virtual ErrorInfo Apply(const Plugin& plugin, const std::vector<DesiredConfigInput>& inputs,
                          const std::string& clusterContext, std::shared_ptr<PluginMonitor> monitor) = 0;
  virtual ImpactPluginResult Impact(const Plugin& plugin, const std::vector<DesiredConfigInput>& inputs,
                                    const std::string& clusterContext, std::shared_ptr<PluginMonitor> monitor) = 0;
  virtual ValidationPluginResult Validate(
      const Plugin& plugin, const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
      const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references,
      const std::string& clusterContext, std::shared_ptr<PluginMonitor> monitor) = 0;

  // The production runner, taking the host run lock for each run.
  static PluginRunner& Default();
};

// Runs plugins in runner processes through PluginLauncher.
class LaunchingRunner final : public PluginRunner {
 public:
  // Each run takes the host run lock for itself.
  LaunchingRunner() = default;
  // Runs under `held`, a host run lock the caller already holds and keeps
  // for longer than this runner, so that nothing of another process's runs
  // comes between these runs (the lock is not re-entrant: a run taking it
  // again would wait for ever).
  explicit LaunchingRunner(const HoxPlatform::HostRunLock& held) : held_(&held) {}

  // The host run lock that serialises every plugin run on the host.
  static HoxPlatform::HostRunLock LockHost();
  // The same for a caller that says when it must wait and may stop waiting
  // (HostRunLock::Acquire): null when it gave up.
  static std::unique_ptr<HoxPlatform::HostRunLock> LockHost(const HoxPlatform::HostRunLock::Waiting& waiting);

  ErrorInfo Apply(const Plugin& plugin, const std::vector<DesiredConfigInput>& inputs,
                  const std::string& clusterContext, std::shared_ptr<PluginMonitor> monitor) override;
  ImpactPluginResult Impact(const Plugin& plugin, const std::vector<DesiredConfigInput>& inputs,
                            const std::string& clusterContext, std::shared_ptr<PluginMonitor> monitor) override;
  ValidationPluginResult Validate(const Plugin& plugin,
                                  const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
                                  const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references,
                                  const std::string& clusterContext, std::shared_ptr<PluginMonitor> monitor) override;

 private:
  // `write(path, taskId)` writes the run's request to `path`.
  template <typename Result, typename Writer, typename Reader>
  Result Run(PluginLauncher& launcher, const std::shared_ptr<PluginMonitor>& monitor, Writer write, Reader read);
  template <typename Result, typename Reader>
  Result RunInputs(const Plugin& plugin, const char* operation, const std::vector<DesiredConfigInput>& inputs,
                   const std::string& clusterContext, const std::shared_ptr<PluginMonitor>& monitor, Reader read);

  const HoxPlatform::HostRunLock* const held_ = nullptr;
};

}  // namespace HoxConfigManager
