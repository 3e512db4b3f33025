// Sending one datagram to a local (AF_UNIX) socket: how the audit trail
// reaches the system log and log records reach the journal. Thread-safe.
#pragma once

#include <string>
#include <string_view>

namespace HoxPlatform {

// Sends `message` as one datagram to the socket at `socketPath`. False when
// there is no such socket or it did not take the whole message; errno tells
// why (EMSGSIZE: too long for one datagram). A full socket queue makes the
// call wait, for at most `waitMillis` when it is positive (then EAGAIN).
bool SendLocalDatagram(const std::string& socketPath, std::string_view message, int waitMillis = -1);

}  // namespace HoxPlatform
