// PluginLauncher and the three kinds of run: write the request, start the
// runner, watch the caller's abort flag while it runs, reap it, read the
// result. Failures become error results, never exceptions.
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <condition_variable>
#include <mutex>
#include <thread>

#include <hoxcm/host.h>
#include <hoxcm/plugins.h>

#include "platform/process/process.h"

namespace HoxConfigManager {
namespace {

constexpr const char* kGroupArgument = "++group=host/qim/tarvisor/configManagerPlugin,stats";
constexpr auto kPollInterval = std::chrono::seconds(1);

[[noreturn]] void Fail(const char* format, ...) __attribute__((format(printf, 1, 2)));
void Fail(const char* format, ...) {
  va_list args;
  va_start(args, format);
  std::unique_ptr<char, detail::FreeDeleter> text(Str_Vasprintf(nullptr, format, args));
  va_end(args);
  throw ConfigManagerException(kPluginFailureCode, text.get());
}

// What every launcher does once its request is built: refuse a "cpp" plugin
// without a module before anything is written, then say what it launches.
void CheckAndAnnounce(const std::string& id, const std::string& operation, int version, const std::string& type,
                      const std::string& module) {
  if (type == "cpp" && module.empty()) {
    throw ConfigManagerException(kPluginFailureCode, "Cpp plugin must specify the shared object name.");
  }
  CSLogger::Log(CSLogger::kInfo, "Plugin Launcher created for id=%s, operation=%s, version=%d, type=%s", id.c_str(),
                operation.c_str(), version, type.c_str());
}

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

// Everything a run does with the fixed files, under the host-wide lock so
// that runs of different processes never interleave.
template <typename Result, typename Reader>
Result RunLocked(PluginLauncher& launcher, const std::string& clusterContext,
                 const std::shared_ptr<PluginMonitor>& monitor, Reader read) {
  HoxPlatform::HostRunLock lock(RunLockPath());
  const std::string resultPath = PluginResultPath();
  // A runner that writes nothing must not leave the previous run's result
  // to be read as its own.
  ::unlink(resultPath.c_str());
  launcher.GetRequest().Dump(PluginRequestPath(), monitor->GetTaskId(), clusterContext);
  launcher.ForkPlugin(monitor);
  return read(resultPath);
}

}  // namespace

PluginLauncher::PluginLauncher(const std::string& id, int version, const std::string& operation,
                               const std::vector<DesiredConfigInput>& inputs, const std::string& type,
                               std::string module)
    : request(id, operation, module, version, inputs),
      id(id),
      operation(operation),
      type(type),
      version(version),
      start_(std::chrono::steady_clock::now()) {
  result.SetObject();
  CheckAndAnnounce(id, operation, version, type, module);
}

PluginLauncher::PluginLauncher(const std::string& id, int version,
                               const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
                               const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references,
                               const std::string& type, std::string module)
    : request(id, "VALIDATE", module, version, data, references),
      id(id),
      operation("VALIDATE"),
      type(type),
      version(version),
      start_(std::chrono::steady_clock::now()) {
  result.SetObject();
  CheckAndAnnounce(id, operation, version, type, module);
}

PluginLauncher::~PluginLauncher() {
  const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start_).count();
  CSLogger::Log(CSLogger::kInfo, "Plugin %s completed operation %s in %lf seconds.", id.c_str(), operation.c_str(),
                seconds);
}

void PluginLauncher::ForkPlugin(std::shared_ptr<PluginMonitor> monitor) {
  CSLogger::Log(CSLogger::kInfo, "Forking plugin for id=%s", id.c_str());
  const std::string runner = HoxPlatform::HostPath(type == "python" ? HoxPlatform::HostPaths::kPythonRunner
                                                                     : HoxPlatform::HostPaths::kCppRunner);
  int spawnError = 0;
  const pid_t pid = HoxPlatform::SpawnClean(runner, {runner, kGroupArgument}, &spawnError);
  if (pid < 0) {
    const std::string text = "Failed to fork plugin runner. " + HoxPlatform::ErrorText(spawnError);
    throw ConfigManagerException(kPluginFailureCode, text.c_str());
  }

  std::mutex mutex;
  std::condition_variable reaped;
  bool done = false;  // guarded by mutex
  // Watches the abort flag until the runner has ended.
  auto watch = [&mutex, &reaped, &done, pid, monitor] {
    CSLogger::Log(CSLogger::kInfo, "Starting plugin monitor thread");
    bool aborted = false;
    std::unique_lock<std::mutex> lock(mutex);
    while (!done) {
      lock.unlock();
      // An exception must not leave this thread: it would end the process.
      try {
        aborted = monitor->IsAborted();
      } catch (const std::exception& e) {
        CSLogger::Log(CSLogger::kError, "Plugin monitor failed: %s", e.what());
      }
      lock.lock();
      if (aborted) break;
      // Woken at once when the runner is reaped; otherwise the abort flag
      // is asked again after the poll interval.
      if (reaped.wait_for(lock, kPollInterval, [&done] { return done; })) break;
    }
    lock.unlock();
    if (aborted) {
      CSLogger::Log(CSLogger::kInfo, "Terminating plugin process: %d", static_cast<int>(pid));
      // The launching thread reaps the runner only after this thread has
      // ended, so the pid still names our runner (or its zombie).
      if (const int error = HoxPlatform::SendSignal(pid, SIGTERM)) {
        CSLogger::Log(CSLogger::kError, "Unable to terminate plugin process: %d -- %s", static_cast<int>(pid),
                      HoxPlatform::ErrorText(error).c_str());
      }
    }
    CSLogger::Log(CSLogger::kInfo, "Stopping plugin monitor thread");
  };
  std::thread watcher;
  try {
    watcher = std::thread(watch);
  } catch (...) {
    // Without a watcher the runner cannot be aborted; it is still reaped
    // before the failure is reported, so no child is left behind.
    int ignored = 0;
    HoxPlatform::WaitForExit(pid, &ignored);
    throw;
  }

  // The runner is reaped only after the watcher has stopped: until then its
  // pid stays taken, so a late SIGTERM cannot reach another process.
  int waitError = HoxPlatform::WaitUntilEnded(pid);
  {
    std::lock_guard<std::mutex> lock(mutex);
    done = true;
  }
  reaped.notify_all();
  watcher.join();
  int status = 0;
  const int reapError = HoxPlatform::WaitForExit(pid, &status);
  if (waitError == 0) waitError = reapError;

  if (waitError != 0) {
    Fail("waitpid failed on pid=%d, error=%s", static_cast<int>(pid), HoxPlatform::ErrorText(waitError).c_str());
  }
  if (monitor->IsAborted()) Fail("Config Manager plugin was aborted: %s", id.c_str());
  if (WIFEXITED(status) && WEXITSTATUS(status) != 0) {
    // The exit code is read as an error number on purpose: runners exit
    // with the errno of what failed.
    Fail("Config Manager plugin failed: %s, pid=%d, status=%s", id.c_str(), static_cast<int>(pid),
         HoxPlatform::ErrorText(WEXITSTATUS(status)).c_str());
  }
  if (WIFSIGNALED(status)) {
    Fail("Config Manager plugin failed: %s, pid=%d, terminated with signal=%d", id.c_str(), static_cast<int>(pid),
         WTERMSIG(status));
  }
  CSLogger::Log(CSLogger::kInfo, "Config Manager plugin=%s, finished successfully", id.c_str());
}

ErrorInfo Plugin::Apply(const std::vector<DesiredConfigInput>& inputs, const std::string& clusterContext,
                        std::shared_ptr<PluginMonitor> monitor) const {
  if (!monitor) monitor = PluginMonitor::Dummy();
  try {
    PluginLauncher launcher(id, static_cast<int>(version), "APPLY", inputs, type, module);
    return RunLocked<ErrorInfo>(launcher, clusterContext, monitor,
                                [](const std::string& path) { return ErrorInfo::Load(path); });
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "%s", e.what());
    return RunError(kApplyIds, id, *monitor, e.what());
  }
}

ImpactPluginResult Plugin::Impact(const std::vector<DesiredConfigInput>& inputs, const std::string& clusterContext,
                                  std::shared_ptr<PluginMonitor> monitor) const {
  if (!monitor) monitor = PluginMonitor::Dummy();
  ImpactPluginResult result;
  try {
    PluginLauncher launcher(id, static_cast<int>(version), "IMPACT", inputs, type, module);
    result = RunLocked<ImpactPluginResult>(launcher, clusterContext, monitor,
                                           [](const std::string& path) { return ImpactPluginResult::Load(path); });
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "%s", e.what());
    result = ImpactPluginResult();
    result.error = RunError(kImpactIds, id, *monitor, e.what());
  }
  CSLogger::Log(CSLogger::kInfo, ">> Module result id=%s", id.c_str());
  return result;
}

ValidationPluginResult Plugin::Validate(const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& data,
                                        const std::vector<std::shared_ptr<HoxConfigStore::ConfigStoreObject>>& references,
                                        const std::string& clusterContext,
                                        std::shared_ptr<PluginMonitor> monitor) const {
  if (!monitor) monitor = PluginMonitor::Dummy();
  try {
    PluginLauncher launcher(id, static_cast<int>(version), data, references, type, module);
    ValidationPluginResult result = RunLocked<ValidationPluginResult>(
        launcher, clusterContext, monitor, [](const std::string& path) { return ValidationPluginResult::Load(path); });
    // Callers recognise a failed validation run by its message text.
    if (!result.error.id.empty() && result.error.message.empty()) result.error.message = result.error.id;
    return result;
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Validation plugin %s failed", id.c_str());
    ValidationPluginResult result;
    result.error = RunError(kValidateIds, id, *monitor, e.what());
    return result;
  }
}

}  // namespace HoxConfigManager
