// Runs the built hoxcfg as a real process against a temporary root, for the
// command-line tests of every area. Not thread-safe (the captured output
// lives in fixed files under the root).
#pragma once

#include <fcntl.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <functional>
#include <string>

#include "support/temp_root.h"

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
  int status = 0;
  ::waitpid(pid, &status, 0);
  ::close(master);
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, shown, ""};
}

}  // namespace hoxcm_test
