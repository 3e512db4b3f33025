// Plugin runs against real runner processes: stand-in runners (small
// scripts installed at the runner paths) exercise each way a run can end.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include <hoxcm/host.h>

#include "plugins/plugin_fixture.h"
#include "plugins/plugin_runner.h"

namespace hoxcm_test {
namespace {

using namespace HoxConfigManager;
using Clock = std::chrono::steady_clock;

constexpr const char* kApplyUnexpected = "com.tarvik.hox.settings.apply.plugin.unexpected.error";
constexpr const char* kApplyAborted = "com.tarvik.hox.settings.apply.plugin.aborted";
constexpr const char* kSuccess = R"(echo '{"id":"","args":[],"message":""}' > "$out")";

// A monitor whose abort is decided by `aborted`.
class Monitor final : public PluginMonitor {
 public:
  explicit Monitor(std::function<bool()> aborted = [] { return false; }, std::string taskId = "task-1")
      : aborted_(std::move(aborted)), taskId_(std::move(taskId)) {}
  bool IsAborted() override { return aborted_(); }
  std::string GetTaskId() override { return taskId_; }

 private:
  const std::function<bool()> aborted_;
  const std::string taskId_;
};

class PluginRunTest : public PluginTest {
 protected:
  PluginRunTest() {
    plugin_ = std::make_shared<Plugin>(
        Manifest("t/plugin.json",
                 V3Manifest("python", {"network:dns:config"}, "network", "REMEDIATE:t", {},
                            R"(,"impact":{"supports":true},"validation":{"supports":true})"))
            .c_str());
    inputs_.push_back({Object({"network", "dns", "config"}, R"({"servers":["10.0.0.1"]})"), nullptr, "SET"});
  }

  // Installs a shell script as the script runner. `body` runs with $root
  // set to the root and $out to the result file.
  void Runner(const std::string& body) {
    const std::string path(HoxPlatform::HostPaths::kPythonRunner);
    root.WriteFile(path, "#!/bin/sh\nroot=\"${0%/usr/lib/tarvik/configmanager/bin/*}\"\n"
                         "out=\"$root/var/tarvik/lifecycle/cm-plugin-output.json\"\n" +
                             body + "\n");
    ::chmod(root.Path(path).c_str(), 0755);
  }
  ErrorInfo Apply(std::shared_ptr<PluginMonitor> monitor = std::make_shared<Monitor>()) {
    return plugin_->Apply(inputs_, "ctx", monitor);
  }

  std::shared_ptr<Plugin> plugin_;
  std::vector<DesiredConfigInput> inputs_;
};

TEST_F(PluginRunTest, ASuccessfulRunIsQuickPrivateAndLeaksNothingToTheRunner) {
  // Given a descriptor the caller forgot to mark close-on-exec.
  const int leaked = ::open("/dev/null", O_RDONLY);
  ASSERT_GE(leaked, 3);
  Runner("/bin/ls /proc/$$/fd > \"$root/fds\"; /usr/bin/env > \"$root/env\"; " + std::string(kSuccess));
  // Three runs that each waited out the monitor's poll interval would take
  // three seconds; the monitor must be woken when the runner is reaped.
  const auto start = Clock::now();
  for (int i = 0; i < 3; ++i) EXPECT_EQ(Apply(), ErrorInfo());
  EXPECT_LT(Clock::now() - start, std::chrono::milliseconds(2500));
  ::close(leaked);
  // The shell may keep its script open on a descriptor of its own; none
  // of ours may appear, nor our environment.
  const std::string fds = "\n" + root.ReadFile("/fds");
  EXPECT_EQ(fds.find("\n" + std::to_string(leaked) + "\n"), std::string::npos) << fds;
  EXPECT_EQ(root.ReadFile("/env").find("HOX_ROOT"), std::string::npos);
  // The request carried the task and the context and was private.
  PluginRequest request;
  request.Load(PluginRequestPath());
  EXPECT_EQ(request.GetTaskId() + " " + request.GetClusterContext() + " " + request.GetType(), "task-1 ctx APPLY");
  struct stat st;
  ASSERT_EQ(::stat(PluginRequestPath().c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 0777, 0600u);
}

TEST_F(PluginRunTest, RunnerFailuresBecomeUnexpectedErrors) {
  const std::pair<const char*, std::string> cases[] = {
      // The runner's body, and a part of the error's message.
      {"exit 2", "Config Manager plugin failed: t, pid="},
      {"exit 2", ", status=No such file or directory"},
      {"kill -9 $$", "terminated with signal=9"},
      {"exit 0", "cannot read"},  // no result file
      {R"(printf '{"id":' > "$out")", "Invalid JSON"},
      {R"(printf '' > "$out")", "Invalid JSON"},
      {R"(echo '{"id":5}' > "$out")", "Invalid JSON"},
      {R"(echo '[]' > "$out")", "Invalid JSON"},
  };
  for (const auto& [body, message] : cases) {
    // A result left by an earlier run must never be taken for this run's.
    root.WriteFile(std::string(HoxPlatform::HostPaths::kResultFile), R"({"id":"","args":[],"message":""})");
    Runner(body);
    const ErrorInfo error = Apply();
    EXPECT_EQ(error.id, kApplyUnexpected) << body;
    EXPECT_EQ(error.args, std::vector<std::string>{"t"}) << body;
    EXPECT_NE(error.message.find(message), std::string::npos) << body << ": " << error.message;
  }
  // A monitor that cannot answer fails the run; it does not escape as an exception.
  Runner(kSuccess);
  ErrorInfo unanswered;
  EXPECT_NO_THROW(unanswered = Apply(std::make_shared<Monitor>([]() -> bool {
                    throw std::runtime_error("task store gone");
                  })));
  EXPECT_EQ(unanswered.id, kApplyUnexpected);

  std::filesystem::remove(root.Path(std::string(HoxPlatform::HostPaths::kPythonRunner)));
  EXPECT_EQ(Apply().message, "Failed to fork plugin runner. No such file or directory");

  // Impact and validation results are checked just as strictly.
  Runner(R"(echo '{}' > "$out")");
  EXPECT_EQ(plugin_->Impact(inputs_, "", PluginMonitor::Dummy()).error.id,
            "com.tarvik.hox.settings.impact.plugin.unexpected.error");
  const auto validation = plugin_->Validate({}, {}, "", PluginMonitor::Dummy());
  EXPECT_EQ(validation.error.id, "com.tarvik.hox.settings.validation.plugin.unexpected.error");
  EXPECT_FALSE(validation.error.message.empty());
}

TEST_F(PluginRunTest, AnAbortEndsTheRunWhetherTheRunnerSleepsOrHasExited) {
  // A sleeping runner is terminated within about a second of the abort.
  Runner("touch \"$root/started\"; exec /bin/sleep 30");
  const auto start = Clock::now();
  const ErrorInfo error = Apply(std::make_shared<Monitor>([deadline = start + std::chrono::milliseconds(200)] {
    return Clock::now() >= deadline;
  }));
  EXPECT_LT(Clock::now() - start, std::chrono::milliseconds(2500));
  EXPECT_EQ(error.id, kApplyAborted);
  EXPECT_EQ(error.args, std::vector<std::string>{"t"});
  EXPECT_TRUE(std::filesystem::exists(root.Path("/started")));

  // A runner that ignores SIGTERM is waited for until it ends by itself:
  // killing it could leave the host half-configured.
  Runner("trap '' TERM; /bin/sleep 1.5; touch \"$root/outlived\"");
  EXPECT_EQ(Apply(std::make_shared<Monitor>([deadline = Clock::now() + std::chrono::milliseconds(200)] {
              return Clock::now() >= deadline;
            })).id,
            kApplyAborted);
  EXPECT_TRUE(std::filesystem::exists(root.Path("/outlived")));

  // An abort said only to the calling thread: the run's monitor thread never
  // sees it and the runner succeeds; the judgement after reaping does.
  Runner("touch \"$root/finished\"; " + std::string(kSuccess));
  EXPECT_EQ(Apply(std::make_shared<Monitor>([owner = std::this_thread::get_id()] {
              return std::this_thread::get_id() == owner;
            })).id,
            kApplyAborted);
  EXPECT_TRUE(std::filesystem::exists(root.Path("/finished")));
}

TEST_F(PluginRunTest, ACppPluginWithoutModuleFailsBeforeAnythingIsWritten) {
  Plugin cpp(Manifest("c/plugin.json", V3Manifest("cpp", {"network:dns:config"}, "network", "REMEDIATE:c", {})).c_str());
  Runner("touch \"$root/ran\"");
  const ErrorInfo error = cpp.Apply(inputs_, "", PluginMonitor::Dummy());
  EXPECT_EQ(error.id, kApplyUnexpected);
  EXPECT_EQ(error.message, "Cpp plugin must specify the shared object name.");
  EXPECT_FALSE(std::filesystem::exists(PluginRequestPath()));
  EXPECT_FALSE(std::filesystem::exists(root.Path("/ran")));
}

TEST_F(PluginRunTest, RunsOfTwoProcessesNeverOverlap) {
  // Each runner logs its request's task id on entry and exit, with a pause
  // in between; the host lock must keep the two pairs apart.
  Runner(R"sh(id=$(/bin/sed -n 's/.*"taskId":"\([^"]*\)".*/\1/p' "$root/var/tarvik/lifecycle/cm-plugin-input.json")
echo "start $id" >> "$root/log"; /bin/sleep 0.3; echo "end $id" >> "$root/log")sh"
         "\n" + std::string(kSuccess));
  const auto never = [] { return false; };
  const pid_t child = ::fork();
  ASSERT_GE(child, 0);
  if (child == 0) ::_exit(plugin_->Apply(inputs_, "", std::make_shared<Monitor>(never, "child")).id.empty() ? 0 : 1);
  const ErrorInfo error = plugin_->Apply(inputs_, "", std::make_shared<Monitor>(never, "parent"));
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(error, ErrorInfo());
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
  const std::string log = root.ReadFile("/log");
  EXPECT_TRUE(log == "start child\nend child\nstart parent\nend parent\n" ||
              log == "start parent\nend parent\nstart child\nend child\n")
      << log;

  // A caller holding the host lock runs its plugins under it: they do not
  // wait for the lock they are given.
  const HoxPlatform::HostRunLock held = LaunchingRunner::LockHost();
  LaunchingRunner underLock(held);
  EXPECT_EQ(underLock.Apply(*plugin_, inputs_, "", std::make_shared<Monitor>()), ErrorInfo());
}

}  // namespace
}  // namespace hoxcm_test
