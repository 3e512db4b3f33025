#include "platform/process/child_process.h"

#include <errno.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>

#include <utility>

namespace HoxPlatform {
namespace {

struct SpawnActions {
  posix_spawn_file_actions_t actions;
  SpawnActions() { posix_spawn_file_actions_init(&actions); }
  ~SpawnActions() { posix_spawn_file_actions_destroy(&actions); }
  SpawnActions(const SpawnActions&) = delete;
  SpawnActions& operator=(const SpawnActions&) = delete;
};

struct SpawnAttributes {
  posix_spawnattr_t attributes;
  SpawnAttributes() { posix_spawnattr_init(&attributes); }
  ~SpawnAttributes() { posix_spawnattr_destroy(&attributes); }
  SpawnAttributes(const SpawnAttributes&) = delete;
  SpawnAttributes& operator=(const SpawnAttributes&) = delete;
};

}  // namespace

ExitStatus DecodeWaitStatus(int status) {
  ExitStatus result;
  if (WIFSIGNALED(status)) {
    result.signalled = true;
    result.code = WTERMSIG(status);
  } else if (WIFEXITED(status)) {
    result.code = WEXITSTATUS(status);
  }
  return result;
}

ChildProcess ChildProcess::Spawn(const std::string& program, const std::vector<std::string>& argv, int* error) {
  SpawnActions actions;
  // Descriptors of other threads and libraries may lack close-on-exec; the
  // child gets 0, 1 and 2 and nothing else.
  int rc = posix_spawn_file_actions_addclosefrom_np(&actions.actions, 3);
  if (rc != 0) {
    *error = rc;
    return ChildProcess();
  }
  SpawnAttributes attributes;
  // The child starts with default signal dispositions and an empty mask,
  // whatever the caller has blocked, so SIGTERM reaches it.
  sigset_t empty, all;
  sigemptyset(&empty);
  sigfillset(&all);
  posix_spawnattr_setsigmask(&attributes.attributes, &empty);
  posix_spawnattr_setsigdefault(&attributes.attributes, &all);
  // The child leads a process group of its own: a Ctrl-C at the caller's
  // terminal reaches the caller, which stops the run through its abort (and
  // the watcher's SIGTERM), not the runner in the middle of a change.
  posix_spawnattr_setpgroup(&attributes.attributes, 0);
  posix_spawnattr_setflags(&attributes.attributes,
                           POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETPGROUP);

  std::vector<char*> args;
  args.reserve(argv.size() + 1);
  for (const std::string& a : argv) args.push_back(const_cast<char*>(a.c_str()));
  args.push_back(nullptr);
  char* environment[] = {nullptr};
  pid_t pid = -1;
  rc = posix_spawn(&pid, program.c_str(), &actions.actions, &attributes.attributes, args.data(), environment);
  if (rc != 0) {
    *error = rc;
    return ChildProcess();
  }
  return ChildProcess(pid);
}

ChildProcess::~ChildProcess() {
  ExitStatus ignored;
  if (*this) Wait(&ignored);
}

ChildProcess::ChildProcess(ChildProcess&& other) noexcept : pid_(std::exchange(other.pid_, -1)) {}

ChildProcess& ChildProcess::operator=(ChildProcess&& other) noexcept {
  if (this != &other) {
    ExitStatus ignored;
    if (*this) Wait(&ignored);
    pid_ = std::exchange(other.pid_, -1);
  }
  return *this;
}

int ChildProcess::WaitUntilEnded() const {
  if (!*this) return ECHILD;
  for (;;) {
    siginfo_t info;
    if (::waitid(P_PID, static_cast<id_t>(pid_), &info, WEXITED | WNOWAIT) == 0) return 0;
    // Retried: a signal may interrupt the wait.
    if (errno != EINTR) return errno;
  }
}

int ChildProcess::Wait(ExitStatus* status) {
  if (!*this) return ECHILD;
  int word = 0;
  int error = 0;
  while (::waitpid(pid_, &word, 0) < 0) {
    // Retried: a signal may interrupt the wait. Any other failure means
    // there is nothing left to reap.
    if (errno != EINTR) {
      error = errno;
      break;
    }
  }
  pid_ = -1;
  if (error == 0) *status = DecodeWaitStatus(word);
  return error;
}

int ChildProcess::Signal(int signal) const {
  if (!*this) return ESRCH;
  return ::kill(pid_, signal) == 0 ? 0 : errno;
}

}  // namespace HoxPlatform
