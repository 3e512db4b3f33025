#include <hoxcm/host.h>

#include <algorithm>
#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <mutex>
#include <string>
#include <syslog.h>
#include <unistd.h>

#include "platform/journal.h"

namespace {

// Settings made through the API; kUnset defers to the environment.
constexpr int kUnset = -2;
std::atomic<int>& ThresholdSetting() {
  static std::atomic<int> threshold{kUnset};
  return threshold;
}
std::atomic<int>& DestinationSetting() {
  static std::atomic<int> destination{kUnset};
  return destination;
}

int ParseLevel(const char* text) {
  if (text == nullptr || *text == '\0') return CSLogger::kWarning;
  if (std::strcmp(text, "error") == 0) return CSLogger::kError;
  if (std::strcmp(text, "warning") == 0) return CSLogger::kWarning;
  if (std::strcmp(text, "info") == 0) return CSLogger::kInfo;
  if (std::strcmp(text, "detail") == 0 || std::strcmp(text, "debug") == 0) return CSLogger::kDetail;
  char* end = nullptr;
  const long n = std::strtol(text, &end, 10);
  if (end != text && *end == '\0' && n >= -1 && n <= 3) return static_cast<int>(n);
  return CSLogger::kWarning;
}

const char* PriorityName(int priority) {
  switch (priority) {
    case CSLogger::kError: return "error";
    case CSLogger::kWarning: return "warning";
    case CSLogger::kInfo: return "info";
    default: return "detail";
  }
}

// Where records go: HOX_LOG_JOURNAL, HOX_LOG_SYSLOG and JOURNAL_STREAM
// unless set through the API.
CSLogger::Destination CurrentDestination() {
  const int set = DestinationSetting().load(std::memory_order_relaxed);
  if (set != kUnset) return static_cast<CSLogger::Destination>(set);
  const char* journal = std::getenv("HOX_LOG_JOURNAL");
  if (journal != nullptr && std::strcmp(journal, "1") == 0) return CSLogger::Destination::kJournal;
  const char* s = std::getenv("HOX_LOG_SYSLOG");
  if (s != nullptr && std::strcmp(s, "1") == 0) return CSLogger::Destination::kSyslog;
  if (s != nullptr && std::strcmp(s, "2") == 0) return CSLogger::Destination::kBoth;
  const bool journalOff = journal != nullptr && std::strcmp(journal, "0") == 0;
  if (!journalOff && HoxPlatform::StderrIsJournal()) return CSLogger::Destination::kJournal;
  return CSLogger::Destination::kStderr;
}

}  // namespace

bool CSLogger::IsEnabled(int priority) {
  const int set = ThresholdSetting().load(std::memory_order_relaxed);
  return priority <= (set != kUnset ? set : ParseLevel(std::getenv("HOX_LOG_LEVEL")));
}

void CSLogger::SetThreshold(int priority) {
  ThresholdSetting().store(std::clamp(priority, -1, static_cast<int>(kDetail)), std::memory_order_relaxed);
}

void CSLogger::SetDestination(Destination destination) {
  DestinationSetting().store(static_cast<int>(destination), std::memory_order_relaxed);
}

bool CSLogger::WritesToJournal() { return CurrentDestination() == Destination::kJournal; }

void CSLogger::Log(int priority, const char* format, ...) {
  if (format == nullptr || !IsEnabled(priority)) return;
  va_list args;
  va_start(args, format);
  char* text = nullptr;
  const int n = ::vasprintf(&text, format, args);
  va_end(args);
  if (n < 0) return;  // out of memory: the line is lost, the caller goes on
  // One write per line, so that lines of concurrent threads do not interleave.
  std::string line = "hoxcm[";
  line += std::to_string(::getpid());
  line += "] ";
  line += PriorityName(priority);
  line += ": ";
  line += text;
  line += '\n';
  const Destination destination = CurrentDestination();
  bool toStderr = destination == Destination::kStderr || destination == Destination::kBoth;
  if (destination == Destination::kSyslog || destination == Destination::kBoth) {
    ::syslog(LOG_USER | HoxPlatform::JournalPriority(priority), "%s", text);
  }
  // A record the journal does not take is not lost: it goes to stderr.
  if (destination == Destination::kJournal) {
    toStderr = !HoxPlatform::SendToJournal(HoxPlatform::JournalRecord(priority, text));
  }
  if (toStderr) {
    const ssize_t written = ::write(STDERR_FILENO, line.data(), line.size());
    (void)written;
  }
  std::free(text);
}
