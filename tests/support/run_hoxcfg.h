// Runs the built hoxcfg as a real process against a temporary root, for the
// command-line tests of every area. Not thread-safe (the captured output
// lives in fixed files under the root).
#pragma once

#include <sys/wait.h>

#include <cstdlib>
#include <string>

#include "support/temp_root.h"

namespace hoxcm_test {

struct HoxcfgOutcome {
  int exitCode;  // -1 when hoxcfg did not exit normally
  std::string out;
  std::string err;
};

// Runs hoxcfg with `args` (shell words); HOX_ROOT is the root's.
inline HoxcfgOutcome RunHoxcfg(const TempRoot& root, const std::string& args) {
  const std::string out = root.Path("/tmp/stdout"), err = root.Path("/tmp/stderr");
  root.WriteFile("/tmp/stdout", "");
  const int status = std::system((BuildPath("tools/hoxcfg") + " " + args + " >" + out + " 2>" + err).c_str());
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, root.ReadFile("/tmp/stdout"), root.ReadFile("/tmp/stderr")};
}

}  // namespace hoxcm_test
