// Child processes: how they ended, and that every way out of an owner's
// scope reaps them exactly once.
#include <errno.h>
#include <signal.h>
#include <sys/wait.h>

#include <stdexcept>
#include <tuple>

#include <gtest/gtest.h>

#include "platform/process/child_process.h"

namespace {

using HoxPlatform::ChildProcess;
using HoxPlatform::ExitStatus;

ChildProcess Shell(const std::string& script) {
  int error = 0;
  return ChildProcess::Spawn("/bin/sh", {"sh", "-c", script}, &error);
}

// No child of ours any more: reaped, not a zombie.
bool Reaped(int pid) { return ::waitpid(pid, nullptr, WNOHANG) < 0 && errno == ECHILD; }

TEST(ChildProcessTest, WaitTellsAnExitCodeFromASignal) {
  const std::tuple<const char*, bool, int> cases[] = {
      {"exit 0", false, 0}, {"exit 71", false, 71}, {"kill -9 $$", true, SIGKILL}, {"kill $$", true, SIGTERM}};
  for (const auto& [script, signalled, code] : cases) {
    ChildProcess child = Shell(script);
    const int pid = child.pid();
    ExitStatus status;
    ASSERT_EQ(child.Wait(&status), 0) << script;
    EXPECT_EQ(status.signalled, signalled) << script;
    EXPECT_EQ(status.code, code) << script;
    EXPECT_EQ(status.Succeeded(), code == 0) << script;
    EXPECT_TRUE(!child && Reaped(pid)) << script;
  }
}

TEST(ChildProcessTest, EveryWayOutOfScopeReapsTheChildOnce) {
  int running = 0, unwound = 0;
  {
    ChildProcess child = Shell("sleep 0.2");  // still running when its owner goes
    running = child.pid();
  }
  try {
    ChildProcess child = Shell("exit 3");
    unwound = child.pid();
    throw std::runtime_error("unwound");
  } catch (const std::runtime_error&) {
  }
  EXPECT_TRUE(Reaped(running) && Reaped(unwound));

  // Moving hands the child over; an owner assigned another child reaps its
  // own first; a reaped child cannot be waited for or signalled again.
  ChildProcess first = Shell("exit 0");
  const int firstPid = first.pid();
  ChildProcess second = std::move(first);
  EXPECT_TRUE(!first && second.pid() == firstPid);
  second = Shell("exit 0");
  EXPECT_TRUE(Reaped(firstPid));
  ExitStatus status;
  EXPECT_EQ(second.Wait(&status), 0);
  EXPECT_EQ(second.Wait(&status), ECHILD);
  EXPECT_EQ(second.Signal(SIGTERM), ESRCH);

  int error = 0;
  EXPECT_FALSE(ChildProcess::Spawn("/nonexistent/runner", {"runner"}, &error));
  EXPECT_EQ(error, ENOENT);
}

}  // namespace
