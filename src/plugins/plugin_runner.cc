// The three kinds of run: write the request, let PluginLauncher start, watch
// and reap the runner, read the result. Failures become error results, never
// exceptions. Plugin::Apply, Impact and Validate run through the default
// runner.
#include "plugins/plugin_runner.h"

#include <unistd.h>

#include <optional>

#include <hoxcm/host.h>

#include "plugins/plugin_request_writer.h"

namespace HoxConfigManager {
namespace {

std::string RunLockPath() { return HoxPlatform::HostPath(HoxPlatform::HostPaths::kRunLock); }

// Message ids of one kind of run.
struct RunIds {
  const char* aborted;
  const char* unexpected;
};
constexpr RunIds kApplyIds = {"com.tarvik.hox.settings.apply.plugin.aborted",
                              "com.tarvik.hox.settings.apply.plugin.unexpected.error"};
constexpr RunIds kImpactIds = {"com.tarvik.hox.settings.impact.plugin.aborted",
                               "com.tarvik.hox.settings.impact.plugin.unexpected.error"};
constexpr RunIds kValidateIds = {"com.tarvik.hox.settings.validation.plugin.aborted",
                                 "com.tarvik.hox.settings.validation.plugin.unexpected.error"};

ErrorInfo RunError(const RunIds& ids, const std::string& pluginId, PluginMonitor& monitor,
                   const std::string& what) {
  // Runs report failures as results: a monitor that cannot answer here
  // must not turn this one into an exception.
  bool aborted = false;
  try {
    aborted = monitor.IsAborted();
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Plugin monitor failed: %s", e.what());
  }
  return ErrorInfo(aborted ? ids.aborted : ids.unexpected, {pluginId}, what);
}

}  // namespace

PluginRunner::~PluginRunner() = default;

PluginRunner& PluginRunner::Default() {
  static LaunchingRunner runner;
  return runner;
}

HoxPlatform::HostRunLock LaunchingRunner::LockHost() { return HoxPlatform::HostRunLock(RunLockPath()); }

std::unique_ptr<HoxPlatform::HostRunLock> LaunchingRunner::LockHost(const HoxPlatform::HostRunLock::Waiting& waiting) {
  return HoxPlatform::HostRunLock::Acquire(RunLockPath(), waiting);
}

std::shared_ptr<void> HoldHostRunLock(const std::function<void()>& waiting) {
  return LaunchingRunner::LockHost(HoxPlatform::HostRunLock::Waiting{waiting, nullptr});
}

// Everything a run does with the fixed files, under the host-wide lock so
// that runs of different processes never interleave.
template <typename Result, typename Writer, typename Reader>
Result LaunchingRunner::Run(PluginLauncher& launcher, const std::shared_ptr<PluginMonitor>& monitor, Writer write,
                            Reader read) {
  std::optional<HoxPlatform::HostRunLock> lock;
  if (held_ == nullptr) lock.emplace(RunLockPath());
  const std::string resultPath = PluginResultPath();
  // A runner that writes nothing must not leave the previous run's result
  // to be read as its own.
  ::unlink(resultPath.c_str());
  write(PluginRequestPath(), monitor->GetTaskId());
  launcher.ForkPlugin(monitor);
  return read(resultPath);
}

// Apply and impact runs write their request straight from their inputs.
template <typename Result, typename Reader>
Result LaunchingRunner::RunInputs(const Plugin& plugin, const char* operation,
                                  const std::vector<DesiredConfigInput>& inputs, const std::string& clusterContext,
                                  const std::shared_ptr<PluginMonitor>& monitor, Reader read) {
  const int version = static_cast<int>(plugin.GetVersion());
  PluginLauncher launcher(plugin.GetId(), version, operation, plugin.GetType(), plugin.GetModule());
  return Run<Result>(
      launcher, monitor,
      [&](const std::string& path, const std::string& taskId) {
        WriteInputsRequest(path, plugin.GetId(), operation, plugin.GetModule(), version, inputs, taskId,
                           clusterContext);
      },
      read);
}

ErrorInfo LaunchingRunner::Apply(const Plugin& plugin, const std::vector<DesiredConfigInput>& inputs,
                                 const std::string& clusterContext, std::shared_ptr<PluginMonitor> monitor) {
  if (!monitor) monitor = PluginMonitor::Dummy();
  try {
    return RunInputs<ErrorInfo>(plugin, "APPLY", inputs, clusterContext, monitor,
                                [](const std::string& path) { return ErrorInfo::Load(path); });
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "%s", e.what());
    return RunError(kApplyIds, plugin.GetId(), *monitor, e.what());
  }
}

ImpactPluginResult LaunchingRunner::Impact(const Plugin& plugin, const std::vector<DesiredConfigInput>& inputs,
                                           const std::string& clusterContext,
                                           std::shared_ptr<PluginMonitor> monitor) {
  if (!monitor) monitor = PluginMonitor::Dummy();
  ImpactPluginResult result;
  try {
    result = RunInputs<ImpactPluginResult>(plugin, "IMPACT", inputs, clusterContext, monitor,
                                           [](const std::string& path) { return ImpactPluginResult::Load(path); });
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "%s", e.what());
    result = ImpactPluginResult();
    result.error = RunError(kImpactIds, plugin.GetId(), *monitor, e.what());
  }
  CSLogger::Log(CSLogger::kInfo, ">> Module result id=%s", plugin.GetId().c_str());
  return result;
}

ValidationPluginResult LaunchingRunner::Validate(
    const Plugin& plugin, const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
    const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references,
    const std::string& clusterContext, std::shared_ptr<PluginMonitor> monitor) {
  if (!monitor) monitor = PluginMonitor::Dummy();
  try {
    PluginLauncher launcher(plugin.GetId(), static_cast<int>(plugin.GetVersion()), data, references,
                            plugin.GetType(), plugin.GetModule());
    ValidationPluginResult result = Run<ValidationPluginResult>(
        launcher, monitor,
        [&](const std::string& path, const std::string& taskId) {
          launcher.GetRequest().Dump(path, taskId, clusterContext);
        },
        [](const std::string& path) { return ValidationPluginResult::Load(path); });
    // Callers recognise a failed validation run by its message text.
    if (!result.error.id.empty() && result.error.message.empty()) result.error.message = result.error.id;
    return result;
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Validation plugin %s failed", plugin.GetId().c_str());
    ValidationPluginResult result;
    result.error = RunError(kValidateIds, plugin.GetId(), *monitor, e.what());
    return result;
  }
}

ErrorInfo Plugin::Apply(const std::vector<DesiredConfigInput>& inputs, const std::string& clusterContext,
                        std::shared_ptr<PluginMonitor> monitor) const {
  return PluginRunner::Default().Apply(*this, inputs, clusterContext, std::move(monitor));
}

ImpactPluginResult Plugin::Impact(const std::vector<DesiredConfigInput>& inputs, const std::string& clusterContext,
                                  std::shared_ptr<PluginMonitor> monitor) const {
  return PluginRunner::Default().Impact(*this, inputs, clusterContext, std::move(monitor));
}

ValidationPluginResult Plugin::Validate(const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
                                        const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references,
                                        const std::string& clusterContext,
                                        std::shared_ptr<PluginMonitor> monitor) const {
  return PluginRunner::Default().Validate(*this, data, references, clusterContext, std::move(monitor));
}

}  // namespace HoxConfigManager
