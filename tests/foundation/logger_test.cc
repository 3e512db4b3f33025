#include <gtest/gtest.h>

#include <cstdlib>

#include <hoxcm/host.h>

namespace {

std::string LoggedAt(const char* level, int priority) {
  ::setenv("HOX_LOG_LEVEL", level, 1);
  ::unsetenv("HOX_LOG_SYSLOG");
  testing::internal::CaptureStderr();
  CSLogger::Log(priority, "value=%d text=%s", 42, "x");
  std::string out = testing::internal::GetCapturedStderr();
  ::unsetenv("HOX_LOG_LEVEL");
  return out;
}

}  // namespace

TEST(LoggerTest, WritesFormattedLinesUpToTheThreshold) {
  // Given a threshold, lines at or above it are written whole, the rest not;
  // without one, an embedding process hears warnings and errors only.
  struct Case {
    const char* level;
    int priority;
    bool written;
  } cases[] = {
      {"", CSLogger::kWarning, true},     {"", CSLogger::kInfo, false},
      {"error", CSLogger::kError, true},  {"error", CSLogger::kWarning, false},
      {"3", CSLogger::kDetail, true},     {"-1", CSLogger::kError, false},
      {"bogus", CSLogger::kInfo, false},  {"detail", CSLogger::kDetail, true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.level) + "/" + std::to_string(c.priority));
    const std::string out = LoggedAt(c.level, c.priority);
    if (c.written) {
      EXPECT_NE(out.find("value=42 text=x\n"), std::string::npos) << out;
    } else {
      EXPECT_EQ(out, "");
    }
  }
}
