// PluginLauncher: start the runner program of one run, watch the caller's
// abort flag while it works, reap it and judge how it ended.
#include <signal.h>

#include <cstdarg>

#include <hoxcm/host.h>
#include <hoxcm/plugins.h>

#include "platform/process/child_process.h"
#include "platform/process/process.h"
#include "plugins/abort_watcher.h"

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

// Ends a runner whose run was aborted. The runner is reaped only after its
// watcher has stopped, so the pid still names our runner (or its zombie).
void Terminate(const HoxPlatform::ChildProcess& child) {
  CSLogger::Log(CSLogger::kInfo, "Terminating plugin process: %d", child.pid());
  if (const int error = child.Signal(SIGTERM)) {
    CSLogger::Log(CSLogger::kError, "Unable to terminate plugin process: %d -- %s", child.pid(),
                  HoxPlatform::ErrorText(error).c_str());
  }
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
  CheckAndAnnounce(id, operation, version, type, module);
}

PluginLauncher::PluginLauncher(const std::string& id, int version, const std::string& operation,
                               const std::string& type, std::string module)
    : id(id), operation(operation), type(type), version(version), start_(std::chrono::steady_clock::now()) {
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
  CheckAndAnnounce(id, operation, version, type, module);
}

PluginLauncher::~PluginLauncher() {
  const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start_).count();
  CSLogger::Log(CSLogger::kInfo, "Plugin %s completed operation %s in %lf seconds.", id.c_str(), operation.c_str(),
                seconds);
}

void PluginLauncher::ForkPlugin(std::shared_ptr<PluginMonitor> monitor) {
  const HoxPlatform::LogContext plugin(HoxPlatform::LogContext::Field::kPlugin, id);
  CSLogger::Log(CSLogger::kInfo, "Forking plugin for id=%s", id.c_str());
  const std::string program = HoxPlatform::HostPath(type == "python" ? HoxPlatform::HostPaths::kPythonRunner
                                                                      : HoxPlatform::HostPaths::kCppRunner);
  int spawnError = 0;
  // Reaped on every path out of this function: by Wait() below, or by its
  // destructor when something throws first.
  HoxPlatform::ChildProcess child = HoxPlatform::ChildProcess::Spawn(program, {program, kGroupArgument}, &spawnError);
  if (!child) {
    const std::string text = "Failed to fork plugin runner. " + HoxPlatform::ErrorText(spawnError);
    throw ConfigManagerException(kPluginFailureCode, text.c_str());
  }
  const int pid = child.pid();
  int waitError = 0;
  {
    // Declared after the child, so it is stopped and joined before the
    // child is reaped, even when its own start fails.
    AbortWatcher watcher(monitor, [&child] { Terminate(child); }, kPollInterval);
    waitError = child.WaitUntilEnded();
  }
  HoxPlatform::ExitStatus status;
  const int reapError = child.Wait(&status);
  if (waitError == 0) waitError = reapError;

  if (waitError != 0) Fail("waitpid failed on pid=%d, error=%s", pid, HoxPlatform::ErrorText(waitError).c_str());
  if (monitor->IsAborted()) Fail("Config Manager plugin was aborted: %s", id.c_str());
  if (status.signalled) {
    Fail("Config Manager plugin failed: %s, pid=%d, terminated with signal=%d", id.c_str(), pid, status.code);
  }
  if (status.code != 0) {
    // The exit code is read as an error number on purpose: runners exit
    // with the errno of what failed.
    Fail("Config Manager plugin failed: %s, pid=%d, status=%s", id.c_str(), pid,
         HoxPlatform::ErrorText(status.code).c_str());
  }
  CSLogger::Log(CSLogger::kInfo, "Config Manager plugin=%s, finished successfully", id.c_str());
}

}  // namespace HoxConfigManager
