// A child process as an object: it owns the pid of a process started with a
// clean slate (empty environment, only descriptors 0 to 2, default signal
// handling) and guarantees that the process is reaped exactly once, by
// Wait() or at the latest by its destructor, so no path (an early return, an
// exception) ever leaves a zombie behind. DecodeWaitStatus is the one place
// where a wait status is read.
//
// Thread safety: a ChildProcess is owned by one thread. While it is not being
// reaped, another thread may Signal() it: the pid stays taken by the child
// (or its zombie) until Wait() or the destructor reaps it, so a signal never
// reaches a process that reused the pid.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace HoxPlatform {

// How a child ended.
struct ExitStatus {
  bool signalled = false;  // ended by a signal rather than by exiting
  int code = 0;            // the exit code, or the signal's number when `signalled`
  bool Succeeded() const { return !signalled && code == 0; }
};

// The exit status encoded in a status word of waitpid().
ExitStatus DecodeWaitStatus(int status);

class ChildProcess final {
 public:
  // Owns no process.
  ChildProcess() = default;
  // Starts `program` with the argument vector `argv` (argv[0] included), an
  // empty environment, an empty signal mask and default signal dispositions,
  // and only descriptors 0, 1 and 2 of the caller: every other descriptor is
  // closed in the child whether or not it is marked close-on-exec. On failure
  // the result owns no process and `error` holds the errno value.
  static ChildProcess Spawn(const std::string& program, const std::vector<std::string>& argv, int* error);

  // A child still running when its owner goes away is waited for, without
  // a signal: ending a plugin's runner in the middle of a change is the
  // caller's decision, never a side effect of cleanup.
  ~ChildProcess();
  ChildProcess(ChildProcess&& other) noexcept;
  // Reaps the child this object owned before taking over `other`'s.
  ChildProcess& operator=(ChildProcess&& other) noexcept;
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  // True while the object owns a process not yet reaped.
  explicit operator bool() const { return pid_ > 0; }
  // For messages; -1 when the object owns no process.
  int pid() const { return static_cast<int>(pid_); }

  // Blocks until the child has ended without reaping it, so that its pid
  // stays taken while another thread may still signal it. Retried while a
  // signal interrupts it. Returns 0, or the errno value of the failure.
  int WaitUntilEnded() const;
  // Reaps the child (blocking until it ends) and decodes how it ended.
  // Returns 0, or the errno value of the failure; either way the object
  // owns no process afterwards.
  int Wait(ExitStatus* status);
  // kill(2); 0 or the errno value.
  int Signal(int signal) const;

 private:
  explicit ChildProcess(pid_t pid) : pid_(pid) {}

  pid_t pid_ = -1;
};

}  // namespace HoxPlatform
