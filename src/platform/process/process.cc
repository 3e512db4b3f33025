#include "platform/process/process.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/file.h>

#include <chrono>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <thread>

namespace HoxPlatform {
namespace {

[[noreturn]] void ThrowErrno(int error, const std::string& what) {
  throw std::system_error(error, std::generic_category(), what);
}

int OpenLockFile(const std::string& path) {
  std::error_code ec;
  std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ec);
  const int fd = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  if (fd < 0) ThrowErrno(errno, "cannot open the plugin run lock " + path);
  return fd;
}

// How often a waiting caller is asked whether it still wants the lock: flock
// has no timeout, so the wait is a series of attempts.
constexpr std::chrono::milliseconds kWaitPoll{100};

}  // namespace

std::string ErrorText(int error) {
  char buffer[256];
  // GNU strerror_r returns the text, which may not be `buffer`.
  return ::strerror_r(error, buffer, sizeof buffer);
}

HostRunLock::HostRunLock(const std::string& path) : fd_(OpenLockFile(path)) {
  // Retried: a signal may interrupt the wait for another run.
  while (::flock(fd_.get(), LOCK_EX) != 0) {
    if (errno != EINTR) ThrowErrno(errno, "cannot lock " + path);
  }
}

std::unique_ptr<HostRunLock> HostRunLock::Acquire(const std::string& path, const Waiting& waiting) {
  FileDescriptor fd(OpenLockFile(path));
  for (bool told = false;;) {
    if (::flock(fd.get(), LOCK_EX | LOCK_NB) == 0) {
      std::unique_ptr<HostRunLock> lock(new HostRunLock(Locked{}, fd.get()));
      // The lock owns the descriptor now.
      (void)fd.Release();
      return lock;
    }
    if (errno == EINTR) continue;  // a signal interrupted the attempt
    if (errno != EWOULDBLOCK) ThrowErrno(errno, "cannot lock " + path);
    if (!told) {
      told = true;
      if (waiting.started) waiting.started();
    }
    if (waiting.giveUp && waiting.giveUp()) return nullptr;
    std::this_thread::sleep_for(kWaitPoll);
  }
}

}  // namespace HoxPlatform
