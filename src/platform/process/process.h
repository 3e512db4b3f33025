// Process primitives of the plugin framework: spawning a runner with a clean
// slate, waiting for it, signalling it, and the host-wide run lock. The one
// place where the framework talks to the kernel about processes.
//
// Thread safety: every function is safe to call from any thread; a
// HostRunLock object is owned by one thread.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace HoxPlatform {

// Starts `program` with the argument vector `argv` (argv[0] included), an
// empty environment and only descriptors 0, 1 and 2 of the caller: every
// other descriptor is closed in the child whether or not it is marked
// close-on-exec. Returns the child's pid; on failure returns -1 and sets
// `error` to the errno value.
pid_t SpawnClean(const std::string& program, const std::vector<std::string>& argv, int* error);

// Waits until the child has ended without reaping it, so that its pid
// cannot be reused while another thread may still signal it. Retried while
// a signal interrupts it. Returns 0, or the errno value of the failure.
int WaitUntilEnded(pid_t pid);

// waitpid(pid, status, 0), retried while a signal interrupts it. Returns 0,
// or the errno value of the failure.
int WaitForExit(pid_t pid, int* status);

// kill(pid, signal); 0 or the errno value.
int SendSignal(pid_t pid, int signal);

// strerror as a std::string, thread-safe.
std::string ErrorText(int error);

// Exclusive, host-wide lock held by a plugin run, so that runs of several
// processes never overlap on the fixed request and result files. Blocks in
// the constructor until the lock is free; released by the destructor (and
// by the kernel when the holder dies). Throws std::system_error when the
// lock file cannot be opened.
class HostRunLock {
 public:
  explicit HostRunLock(const std::string& path);
  ~HostRunLock();
  HostRunLock(const HostRunLock&) = delete;
  HostRunLock& operator=(const HostRunLock&) = delete;

 private:
  int fd_;
};

}  // namespace HoxPlatform
