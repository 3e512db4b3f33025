// The journal's native protocol, for the logger (include/hoxcm/host.h says
// when records go there). Thread-safe.
#pragma once

#include <string>
#include <string_view>

namespace HoxPlatform {

// The syslog priority of a logger priority (LOG_ERR ... LOG_DEBUG).
int JournalPriority(int priority);
// One record: PRIORITY, SYSLOG_IDENTIFIER=hoxcm, MESSAGE (cut to 48 KiB) and
// the fields of this thread's LogContext.
std::string JournalRecord(int priority, std::string_view message);
// Sends a record to the journal's socket under the root, else the
// machine's, waiting at most half a second at each for a journal that is
// behind; false when neither took it.
bool SendToJournal(std::string_view record);
// Whether systemd connected this process's stderr to the journal
// (JOURNAL_STREAM names stderr's device and inode).
bool StderrIsJournal();

}  // namespace HoxPlatform
