// Child processes: how they ended, and that every way out of an owner's
// scope reaps them exactly once.
#include <errno.h>
#include <signal.h>
#include <sys/wait.h>

#include <stdexcept>

#include <gtest/gtest.h>

#include "platform/process/child_process.h"

namespace {

using HoxPlatform::ChildProcess;
using HoxPlatform::ExitStatus;

ChildProcess Shell(const std::string& script) {
  int error = 0;
  ChildProcess child = ChildProcess::Spawn("/bin/sh", {"sh", "-c", script}, &error);
  EXPECT_TRUE(child) << error;
  return child;
}

// True when `pid` is no child of ours any more: reaped, not a zombie.
bool Reaped(int pid) { return ::waitpid(pid, nullptr, WNOHANG) < 0 && errno == ECHILD; }

TEST(ChildProcessTest, WaitTellsAnExitCodeFromASignal) {
  const struct {
    const char* script;
    bool signalled;
    int code;
  } cases[] = {{"exit 0", false, 0}, {"exit 71", false, 71}, {"kill -9 $$", true, SIGKILL}, {"kill $$", true, SIGTERM}};
  for (const auto& c : cases) {
    ChildProcess child = Shell(c.script);
    const int pid = child.pid();
    ExitStatus status;
    ASSERT_EQ(child.Wait(&status), 0) << c.script;
    EXPECT_EQ(status.signalled, c.signalled) << c.script;
    EXPECT_EQ(status.code, c.code) << c.script;
    EXPECT_EQ(status.Succeeded(), c.code == 0) << c.script;
    EXPECT_FALSE(child);
    EXPECT_TRUE(Reaped(pid));
  }
}

TEST(ChildProcessTest, EveryWayOutOfScopeReapsTheChildOnce) {
  // A child still running when its owner goes away is waited for.
  int pid = 0;
  {
    ChildProcess child = Shell("sleep 0.2");
    pid = child.pid();
  }
  EXPECT_TRUE(Reaped(pid));

  // So is one whose owner is left by an exception.
  try {
    ChildProcess child = Shell("exit 3");
    pid = child.pid();
    throw std::runtime_error("unwound");
  } catch (const std::runtime_error&) {
  }
  EXPECT_TRUE(Reaped(pid));

  // Moving hands the child over: the moved-from object owns nothing, and
  // an owner that is assigned another child reaps its own first.
  ChildProcess first = Shell("exit 0");
  const int firstPid = first.pid();
  ChildProcess second = std::move(first);
  EXPECT_FALSE(first);
  EXPECT_EQ(second.pid(), firstPid);
  second = Shell("exit 0");
  EXPECT_TRUE(Reaped(firstPid));
  ExitStatus status;
  EXPECT_EQ(second.Wait(&status), 0);
  EXPECT_EQ(second.Wait(&status), ECHILD);
  EXPECT_EQ(second.Signal(SIGTERM), ESRCH);

  // A program that cannot be started gives an empty child and the reason.
  int error = 0;
  EXPECT_FALSE(ChildProcess::Spawn("/nonexistent/runner", {"runner"}, &error));
  EXPECT_EQ(error, ENOENT);
}

}  // namespace
