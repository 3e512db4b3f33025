#include "platform/process/process.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/file.h>

#include <cstring>
#include <filesystem>
#include <system_error>

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

}  // namespace HoxPlatform
