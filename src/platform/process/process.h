// Process primitives of the plugin framework besides the child processes
// themselves (child_process.h): the host-wide run lock and errno texts.
//
// Thread safety: every function is safe to call from any thread; a
// HostRunLock object is owned by one thread.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/file_descriptor.h"

namespace HoxPlatform {

// strerror as a std::string, thread-safe.
std::string ErrorText(int error);

// Exclusive, host-wide lock held by a plugin run, so that runs of several
// processes (or threads) never overlap on the fixed request and result
// files. Blocks in the constructor until the lock is free; released when the
// object goes away (and by the kernel when the holder dies). Throws
// std::system_error when the lock file cannot be opened or locked.
//
// Not re-entrant: a second lock of the same path blocks, even in the thread
// that holds the first. A caller that must keep the host to itself across
// several runs (an apply, from its impact check to its last plugin) holds
// one lock and passes it down to the runs, which then do not lock again
// (see LaunchingRunner).
class HostRunLock final {
 public:
  explicit HostRunLock(const std::string& path);
  HostRunLock(const HostRunLock&) = delete;
  HostRunLock& operator=(const HostRunLock&) = delete;

  // What a caller does while another holder keeps the lock.
  struct Waiting {
    std::function<void()> started;  // called once, when the lock is first found held
    std::function<bool()> giveUp;   // asked about every 100 ms while waiting; true ends the wait
  };
  // Takes the lock like the constructor, but tells `waiting` when it must
  // wait and lets it end the wait: null when `giveUp` answered true first.
  static std::unique_ptr<HostRunLock> Acquire(const std::string& path, const Waiting& waiting);

 private:
  struct Locked {};
  HostRunLock(Locked, int fd) : fd_(fd) {}

  // Closing the descriptor releases the lock.
  const FileDescriptor fd_;
};

}  // namespace HoxPlatform
