// Log records for the journal, in its native protocol: one datagram of
// fields per record, sent to the journal's socket under the root (else the
// machine's). Fields carry the record's priority, the identifier and the
// thread's log context.
#include "platform/journal.h"

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include <hoxcm/host.h>

#include "platform/local_socket.h"

namespace HoxPlatform {
namespace {

// Longer messages are cut: one record must fit one datagram.
constexpr std::size_t kMaxMessage = 48 * 1024;

// "NAME=value\n", or for a value with a newline the protocol's binary form:
// "NAME\n", the value's length as 64-bit little endian, the value, "\n".
void AppendField(std::string& record, std::string_view name, std::string_view value) {
  record += name;
  if (value.find('\n') == std::string_view::npos) {
    record += '=';
    record += value;
  } else {
    record += '\n';
    std::uint64_t size = value.size();
    for (int i = 0; i < 8; ++i) record += static_cast<char>((size >> (8 * i)) & 0xff);
    record += value;
  }
  record += '\n';
}

// Each thread's log context, changed only by the LogContext objects of that
// thread, so no lock is needed.
thread_local std::string contextFields[3];

std::string& ContextValue(LogContext::Field field) { return contextFields[static_cast<int>(field)]; }

}  // namespace

int JournalPriority(int priority) {
  switch (priority) {
    case CSLogger::kError: return LOG_ERR;
    case CSLogger::kWarning: return LOG_WARNING;
    case CSLogger::kInfo: return LOG_INFO;
    default: return LOG_DEBUG;
  }
}

std::string JournalRecord(int priority, std::string_view message) {
  std::string record;
  AppendField(record, "PRIORITY", std::to_string(JournalPriority(priority)));
  AppendField(record, "SYSLOG_IDENTIFIER", "hoxcm");
  if (message.size() > kMaxMessage) {
    AppendField(record, "MESSAGE", std::string(message.substr(0, kMaxMessage)) + "...");
  } else {
    AppendField(record, "MESSAGE", message);
  }
  static constexpr struct {
    LogContext::Field field;
    std::string_view name;
  } kFields[] = {{LogContext::Field::kOperation, "HOXCM_OPERATION"},
                 {LogContext::Field::kPlugin, "HOXCM_PLUGIN"},
                 {LogContext::Field::kObject, "HOXCM_OBJECT"}};
  for (const auto& f : kFields) {
    const std::string& value = LogContext::Current(f.field);
    if (!value.empty()) AppendField(record, f.name, value);
  }
  return record;
}

// Waits a little for a journal that is behind, but not for one that is
// stuck: the logging thread may be in the middle of a host change. The
// caller writes a record the journal did not take to stderr.
constexpr int kJournalWaitMillis = 500;

bool SendToJournal(std::string_view record) {
  if (SendLocalDatagram(HostPath(HostPaths::kJournalSocket), record, kJournalWaitMillis)) return true;
  return HostRoot() != "/" && SendLocalDatagram(std::string(HostPaths::kJournalSocket), record, kJournalWaitMillis);
}

bool StderrIsJournal() {
  const char* stream = std::getenv("JOURNAL_STREAM");
  if (stream == nullptr) return false;
  unsigned long long device = 0, inode = 0;
  if (std::sscanf(stream, "%llu:%llu", &device, &inode) != 2) return false;
  struct stat info {};
  return ::fstat(STDERR_FILENO, &info) == 0 && info.st_dev == device && info.st_ino == inode;
}

LogContext::LogContext(Field field, std::string value) : field_(field), previous_(std::move(value)) {
  ContextValue(field_).swap(previous_);
}

LogContext::~LogContext() { ContextValue(field_).swap(previous_); }

const std::string& LogContext::Current(Field field) { return ContextValue(field); }

}  // namespace HoxPlatform
