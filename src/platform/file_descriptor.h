// An owned file descriptor: closed once, when the owner goes out of scope or
// through Close(). Not thread-safe; move-only in spirit, so copies are deleted.
#pragma once

#include <unistd.h>

namespace HoxPlatform {

class FileDescriptor {
 public:
  explicit FileDescriptor(int fd) : fd_(fd) {}
  ~FileDescriptor() {
    if (fd_ >= 0) ::close(fd_);
  }
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;
  int get() const { return fd_; }
  // Closes now and reports the result: a failing close may be the first
  // sign of a lost write.
  int Close() {
    const int rc = ::close(fd_);
    fd_ = -1;
    return rc;
  }
  // Gives the descriptor up without closing it (to a new owner).
  int Release() {
    const int fd = fd_;
    fd_ = -1;
    return fd;
  }

 private:
  int fd_;
};

}  // namespace HoxPlatform
