// The yardstick of a plugin run: posix_spawn of a runner with the run's
// argument and an empty environment, then waitpid, nothing else.
#pragma once

#include <spawn.h>
#include <sys/wait.h>

#include <cstdlib>
#include <string>

namespace hoxcm_bench {

inline void BareSpawnAndWait(const std::string& runner) {
  char* argv[] = {const_cast<char*>(runner.c_str()), const_cast<char*>("++group=x"), nullptr};
  char* env[] = {nullptr};
  pid_t pid;
  if (posix_spawn(&pid, runner.c_str(), nullptr, nullptr, argv, env) != 0) std::abort();
  int status;
  while (waitpid(pid, &status, 0) < 0) {
  }
}

}  // namespace hoxcm_bench
