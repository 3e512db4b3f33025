// What every hoxcfg command shares: the global options, the root, output of
// documents and the error convention (code and message on stderr, exit 2).
#pragma once

#include <functional>
#include <string>

#include <hoxcm/json.h>

namespace hoxcfg {

// Exit codes: 0 success (or compliant / valid), 1 a negative answer
// (non-compliant, invalid), 2 an error.
constexpr int kExitOk = 0;
constexpr int kExitNegative = 1;
constexpr int kExitError = 2;

struct GlobalOptions {
  std::string root;      // --root; empty: HOX_ROOT, then "/"
  bool compact = false;  // --compact: compact JSON even on a terminal
  int exitCode = 0;      // set by the command that ran
};

// Exported HOX_ROOT for the library, from --root when given.
void ApplyRoot(const GlobalOptions& options);

// Runs a command body: library and system errors become "hoxcfg: error
// <code>: <message>" on stderr and exit code 2. Nothing is written to stdout
// unless the body completes, since bodies print only at their end.
int RunCommand(const std::function<int()>& body);

// What a subcommand's callback does: applies the root, runs the body through
// RunCommand and records its exit code in `options`.
void Run(GlobalOptions& options, const std::function<int()>& body);

// Pretty JSON on a terminal, compact otherwise or with --compact.
std::string FormatJson(const rapidjson::Value& value, const GlobalOptions& options);
// Writes `text` to stdout, or atomically to `path` when it is not empty.
void WriteOutput(const std::string& text, const std::string& path);

// Thrown by commands for a usage or input error that has no library code.
struct CommandError {
  int code;
  std::string message;
};

}  // namespace hoxcfg
