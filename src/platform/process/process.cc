#include "platform/process/process.h"

#include <errno.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <memory>
#include <stdexcept>
#include <system_error>

#include "platform/file_descriptor.h"

namespace HoxPlatform {
namespace {

[[noreturn]] void ThrowErrno(int error, const std::string& what) {
  throw std::system_error(error, std::generic_category(), what);
}


struct SpawnActions {
  posix_spawn_file_actions_t actions;
  SpawnActions() { posix_spawn_file_actions_init(&actions); }
  ~SpawnActions() { posix_spawn_file_actions_destroy(&actions); }
};

struct SpawnAttributes {
  posix_spawnattr_t attributes;
  SpawnAttributes() { posix_spawnattr_init(&attributes); }
  ~SpawnAttributes() { posix_spawnattr_destroy(&attributes); }
};

}  // namespace

pid_t SpawnClean(const std::string& program, const std::vector<std::string>& argv, int* error) {
  SpawnActions actions;
  // Descriptors of other threads and libraries may lack close-on-exec; the
  // runner gets 0, 1 and 2 and nothing else.
  int rc = posix_spawn_file_actions_addclosefrom_np(&actions.actions, 3);
  if (rc != 0) {
    *error = rc;
    return -1;
  }
  SpawnAttributes attributes;
  // The runner starts with default signal dispositions and an empty mask,
  // whatever the caller has blocked, so SIGTERM reaches it.
  sigset_t empty, all;
  sigemptyset(&empty);
  sigfillset(&all);
  posix_spawnattr_setsigmask(&attributes.attributes, &empty);
  posix_spawnattr_setsigdefault(&attributes.attributes, &all);
  posix_spawnattr_setflags(&attributes.attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);

  std::vector<char*> args;
  args.reserve(argv.size() + 1);
  for (const std::string& a : argv) args.push_back(const_cast<char*>(a.c_str()));
  args.push_back(nullptr);
  char* environment[] = {nullptr};
  pid_t pid = -1;
  rc = posix_spawn(&pid, program.c_str(), &actions.actions, &attributes.attributes, args.data(), environment);
  if (rc != 0) {
    *error = rc;
    return -1;
  }
  return pid;
}

int WaitUntilEnded(pid_t pid) {
  for (;;) {
    siginfo_t info;
    if (::waitid(P_PID, static_cast<id_t>(pid), &info, WEXITED | WNOWAIT) == 0) return 0;
    if (errno != EINTR) return errno;
  }
}

int WaitForExit(pid_t pid, int* status) {
  for (;;) {
    if (::waitpid(pid, status, 0) >= 0) return 0;
    if (errno != EINTR) return errno;
  }
}

int SendSignal(pid_t pid, int signal) { return ::kill(pid, signal) == 0 ? 0 : errno; }

std::string ErrorText(int error) {
  char buffer[256];
  // GNU strerror_r returns the text, which may not be `buffer`.
  return ::strerror_r(error, buffer, sizeof buffer);
}

HostRunLock::HostRunLock(const std::string& path) : fd_(-1) {
  std::error_code ec;
  std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ec);
  fd_ = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  if (fd_ < 0) ThrowErrno(errno, "cannot open the plugin run lock " + path);
  // A signal may interrupt the wait for another process's run.
  while (::flock(fd_, LOCK_EX) != 0) {
    if (errno != EINTR) {
      const int saved = errno;
      ::close(fd_);
      ThrowErrno(saved, "cannot lock " + path);
    }
  }
}

HostRunLock::~HostRunLock() {
  // Closing the descriptor releases the lock.
  ::close(fd_);
}

}  // namespace HoxPlatform
