// A local datagram socket bound under a temporary root, standing in for the
// host's system log (/dev/log) or its journal: it takes every datagram sent
// to it while it lives, so that a sender never waits on a full queue.
// Thread-safe.
#pragma once

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cstring>
#include <filesystem>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "support/temp_root.h"

namespace hoxcm_test {

class DatagramSocket {
 public:
  DatagramSocket(const TempRoot& root, const std::string& hostPath) : fd_(::socket(AF_UNIX, SOCK_DGRAM, 0)) {
    std::filesystem::create_directories(std::filesystem::path(root.Path(hostPath)).parent_path());
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, root.Path(hostPath).c_str(), sizeof address.sun_path - 1);
    bound_ = ::bind(fd_, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
    reader_ = std::thread([this] {
      while (!stop_) {
        pollfd ready{fd_, POLLIN, 0};
        if (::poll(&ready, 1, 20) > 0) Drain();
      }
    });
  }
  ~DatagramSocket() {
    stop_ = true;
    reader_.join();
    ::close(fd_);
  }
  DatagramSocket(const DatagramSocket&) = delete;
  DatagramSocket& operator=(const DatagramSocket&) = delete;

  bool bound() const { return bound_; }
  // The datagrams received since the last call, in order.
  std::vector<std::string> Received() {
    Drain();
    std::lock_guard<std::mutex> lock(mutex_);
    return std::exchange(received_, {});
  }

 private:
  void Drain() {
    std::lock_guard<std::mutex> lock(mutex_);
    std::vector<char> buffer(1 << 17);
    for (ssize_t n; (n = ::recv(fd_, buffer.data(), buffer.size(), MSG_DONTWAIT)) > 0;) {
      received_.emplace_back(buffer.data(), static_cast<std::size_t>(n));
    }
  }

  const int fd_;
  bool bound_ = false;
  std::atomic<bool> stop_{false};
  std::mutex mutex_;
  std::vector<std::string> received_;  // guarded by mutex_
  std::thread reader_;
};

}  // namespace hoxcm_test
