// Runs the built hoxcfg as a real process against a temporary root, for the
// command-line tests of every area. Not thread-safe (the captured output
// lives in fixed files under the root).
#pragma once

#include <fcntl.h>
#include <spawn.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>

#include "support/temp_root.h"

extern char** environ;

namespace hoxcm_test {

struct HoxcfgOutcome {
  int exitCode;  // -1 when hoxcfg did not exit normally
  std::string out;
  std::string err;
};

// Runs hoxcfg with `args` (shell words); HOX_ROOT is the root's.
inline HoxcfgOutcome RunHoxcfg(const TempRoot& root, const std::string& args) {
  const std::string out = root.Path("/tmp/stdout"), err = root.Path("/tmp/stderr");
  root.WriteFile("/tmp/stdout", "");
  const int status = std::system((BuildPath("tools/hoxcfg") + " " + args + " >" + out + " 2>" + err).c_str());
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, root.ReadFile("/tmp/stdout"), root.ReadFile("/tmp/stderr")};
}

// Starts hoxcfg with `args` in the background (exec'd by the shell, so a
// signal reaches hoxcfg itself), its output in the files "/NAME.out" and
// "/NAME.err" under the root.
inline pid_t StartHoxcfg(const TempRoot& root, const std::string& args, const std::string& name) {
  const std::string command = "HOX_ROOT=" + root.path() + " exec " + BuildPath("tools/hoxcfg") + " " + args + " >" +
                              root.Path("/" + name + ".out") + " 2>" + root.Path("/" + name + ".err");
  const char* argv[] = {"/bin/sh", "-c", command.c_str(), nullptr};
  pid_t pid = -1;
  EXPECT_EQ(::posix_spawn(&pid, "/bin/sh", nullptr, nullptr, const_cast<char**>(argv), environ), 0);
  return pid;
}
// Reaps `pid`: its exit status, or -1 when it did not exit normally.
inline int ExitStatusOf(pid_t pid) {
  int status = 0;
  ::waitpid(pid, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}
// Waits (at most 20 s) until the file under the root holds `text`.
inline bool WaitFor(const TempRoot& root, const std::string& file, const std::string& text) {
  for (int i = 0; i < 2000; ++i) {
    if (std::filesystem::exists(root.Path(file)) && root.ReadFile(file).find(text) != std::string::npos) return true;
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  return false;
}

inline bool Has(const std::string& text, const std::string& part) { return text.find(part) != std::string::npos; }
// The lines of `text`, without their "\n" (an unfinished last line left out).
inline std::vector<std::string> Lines(const std::string& text) {
  std::vector<std::string> lines;
  for (std::size_t at = 0, end; (end = text.find('\n', at)) != std::string::npos; at = end + 1) {
    lines.push_back(text.substr(at, end - at));
  }
  return lines;
}

// One step of a command-line script: hoxcfg `args`, the exit status it must
// end with, and a text its stdout or stderr must hold.
struct Step {
  std::string args;
  int exitCode;
  std::string says;
};

// Runs `steps` in order on `root`; a failure names the step.
inline void RunSteps(const TempRoot& root, const std::vector<Step>& steps) {
  for (const Step& step : steps) {
    const HoxcfgOutcome o = RunHoxcfg(root, step.args);
    EXPECT_EQ(o.exitCode, step.exitCode) << step.args << "\n" << o.out << o.err;
    EXPECT_TRUE(Has(o.out + o.err, step.says)) << step.args << " should say: " << step.says << "\n" << o.out << o.err;
  }
}

// The host's export with the values at JSON pointers below "/profile" (or
// from "/hostSpecific") replaced (a pointer ending in "/-" appends; an empty
// value removes),
// written to `name` under the root; its full path.
inline std::string ExportWith(const TempRoot& root, const std::string& name,
                              const std::vector<std::pair<std::string, std::string>>& changes = {}) {
  EXPECT_EQ(RunHoxcfg(root, "export -o " + root.Path("/" + name)).exitCode, 0);
  HoxConfigManager::Document doc;
  HoxConfigManager::ParseDocument(root.ReadFile("/" + name), doc);
  for (const auto& [pointer, json] : changes) {
    const rapidjson::Pointer at(((pointer.rfind("/hostSpecific", 0) == 0 ? "" : "/profile") + pointer).c_str());
    if (json.empty()) {
      EXPECT_TRUE(at.Erase(doc)) << pointer;
      continue;
    }
    HoxConfigManager::Document value;
    HoxConfigManager::ParseDocument(json, value);
    at.Set(doc, rapidjson::Value(value, doc.GetAllocator()));
  }
  root.WriteFile("/" + name, HoxConfigManager::JsonToString(doc));
  return root.Path("/" + name);
}

// A command-line test on its own sandbox root.
class HoxcfgTest : public ::testing::Test {
 protected:
  HoxcfgOutcome Run(const std::string& args) { return RunHoxcfg(root_, args); }
  void InitSample() { ASSERT_EQ(Run("init --sample").exitCode, 0); }
  TempRoot root_;
};

// Runs hoxcfg with its standard streams on a new terminal, typing `input`,
// then calling `whileRunning` with the terminal (to type more while it
// runs). `out` holds what the terminal showed (stdout and stderr, "\r\n"
// line ends).
inline HoxcfgOutcome RunHoxcfgOnTerminal(const TempRoot& root, const std::string& args,
                                         const std::string& input = "",
                                         const std::function<void(int terminal)>& whileRunning = {}) {
  const int master = ::posix_openpt(O_RDWR | O_NOCTTY);
  if (master < 0 || ::grantpt(master) != 0 || ::unlockpt(master) != 0) return {-1, "", "no terminal"};
  const std::string terminal = ::ptsname(master);
  // exec: a Ctrl-C typed on the terminal must reach hoxcfg, not a shell.
  const std::string command = "HOX_ROOT=" + root.path() + " exec " + BuildPath("tools/hoxcfg") + " " + args;
  const pid_t pid = ::fork();
  if (pid == 0) {
    ::setsid();  // the terminal opened next becomes the controlling one
    const int fd = ::open(terminal.c_str(), O_RDWR);
    ::dup2(fd, 0);
    ::dup2(fd, 1);
    ::dup2(fd, 2);
    ::execl("/bin/sh", "sh", "-c", command.c_str(), static_cast<char*>(nullptr));
    ::_exit(127);
  }
  [[maybe_unused]] const ssize_t typed = ::write(master, input.data(), input.size());
  if (whileRunning) whileRunning(master);
  std::string shown;
  char buffer[4096];
  for (;;) {  // until the terminal's last user has gone (EIO)
    const ssize_t n = ::read(master, buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) break;
    shown.append(buffer, static_cast<std::size_t>(n));
  }
  ::close(master);
  return {ExitStatusOf(pid), shown, ""};
}

}  // namespace hoxcm_test
