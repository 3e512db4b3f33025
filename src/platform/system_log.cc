// The audit trail: one line per change of host state, sent to the host's
// system log socket. syslog(3) always writes to the machine's /dev/log; a
// sandbox host under HOX_ROOT has its own socket path, hence this small
// client of the local syslog datagram protocol.
#include <hoxcm/host.h>

#include <pwd.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <string>
#include <vector>

#include "platform/file_descriptor.h"
#include "platform/local_socket.h"

namespace HoxPlatform {
namespace {

std::string UserName(uid_t uid) {
  long size = ::sysconf(_SC_GETPW_R_SIZE_MAX);
  std::vector<char> buffer(size > 0 ? static_cast<std::size_t>(size) : 16384);
  struct passwd entry {};
  struct passwd* found = nullptr;
  if (::getpwuid_r(uid, &entry, buffer.data(), buffer.size(), &found) == 0 && found != nullptr) {
    return found->pw_name;
  }
  return "?";
}

// "user alice (uid 1000)", and under sudo "... through sudo by bob": the
// real user runs the change, the sudo user asked for it.
std::string Who() {
  const uid_t uid = ::getuid();
  std::string who = "user " + UserName(uid) + " (uid " + std::to_string(uid) + ")";
  const char* sudoUser = std::getenv("SUDO_USER");
  if (sudoUser != nullptr && *sudoUser != '\0') who += " through sudo by " + std::string(sudoUser);
  return who;
}

// A log line is one line: control characters a caller let through become '?'.
std::string OneLine(std::string_view text) {
  std::string line(text);
  for (char& c : line) {
    if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) c = '?';
  }
  return line;
}

}  // namespace

bool SendLocalDatagram(const std::string& socketPath, std::string_view message, int waitMillis) {
  struct sockaddr_un address {};
  if (socketPath.size() >= sizeof address.sun_path) return false;
  FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  if (socket.get() < 0) return false;
  if (waitMillis > 0) {
    const struct timeval limit {waitMillis / 1000, (waitMillis % 1000) * 1000};
    ::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
  }
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, socketPath.c_str(), socketPath.size() + 1);
  ssize_t sent;
  do {  // retried on EINTR: a signal may interrupt the send
    sent = ::sendto(socket.get(), message.data(), message.size(), MSG_NOSIGNAL,
                    reinterpret_cast<const struct sockaddr*>(&address), sizeof address);
  } while (sent < 0 && errno == EINTR);
  return sent == static_cast<ssize_t>(message.size());
}

bool AuditLog(std::string_view program, std::string_view event) {
  char stamp[32] = "";
  const std::time_t now = std::time(nullptr);
  struct tm local {};
  if (::localtime_r(&now, &local) != nullptr) std::strftime(stamp, sizeof stamp, "%b %e %T", &local);
  // The local syslog format: "<PRI>Mmm dd hh:mm:ss program[pid]: text".
  const std::string message = "<" + std::to_string(LOG_AUTHPRIV | LOG_NOTICE) + ">" + stamp + " " +
                              OneLine(program) + "[" + std::to_string(::getpid()) + "]: " + OneLine(event) +
                              " by " + OneLine(Who());
  if (SendLocalDatagram(HostPath(HostPaths::kSystemLog), message)) return true;
  return HostRoot() != "/" && SendLocalDatagram(std::string(HostPaths::kSystemLog), message);
}

}  // namespace HoxPlatform
