// The library's log lines written while a piece of code runs.
#pragma once

#include <cstdlib>
#include <string>

#include <gtest/gtest.h>

namespace hoxcm_test {

// Runs `run` with the log threshold at `level` ("0" to "3") and returns what
// was logged ("hoxcm[pid] <priority>: <text>" lines).
template <typename Run>
std::string LogOf(const char* level, Run run) {
  ::setenv("HOX_LOG_LEVEL", level, 1);
  testing::internal::CaptureStderr();
  run();
  ::unsetenv("HOX_LOG_LEVEL");
  return testing::internal::GetCapturedStderr();
}

}  // namespace hoxcm_test
