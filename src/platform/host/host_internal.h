// Host facts internals: the parsers behind the host-control functions,
// separated from the file and system calls so that they can be tested on
// their own. Stateless and thread-safe.
#pragma once

#include <map>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <hoxcm/host.h>

namespace HoxPlatform::detail {

// Kernel release and version strings (uname) as a QmkVersion.
QmkCtl::System::QmkVersion ParseKernelRelease(std::string_view release, std::string_view version);

// The host facts file: quick-boot support and feature switches. Anything
// missing is false.
struct HostFacts {
  bool stmSupported = false;
  bool quickBootSupported = false;
  std::map<std::string, bool> features;
};
// Parses the facts file's text; `problems` receives one line per ignored
// or malformed entry. A text that is not a JSON object yields no facts.
HostFacts ParseHostFacts(const std::string& text, std::vector<std::string>& problems);
// The facts of the current root, re-read when the file changed.
HostFacts CurrentHostFacts();

// Reads a whole file. Returns false when it does not exist; throws
// HostCtl::Lib::HostCtlException when it exists but cannot be read or is
// larger than 16 MiB.
bool ReadHostFile(const std::string& path, std::string& out);

struct AuthorizedKey {
  std::string type;
  std::string key;
  std::string comment;
};
// The keys of an authorized_keys file in file order; lines that hold no key
// are reported by number in `skipped` (comments and blank lines are not).
// Bytes of a comment that are not UTF-8 become U+FFFD.
std::vector<AuthorizedKey> ParseAuthorizedKeys(std::string_view text, std::vector<int>& skipped);

// The options of an ssh_config (`client`) or sshd_config file: keyword to
// value, the first value of a keyword winning. Only options that apply to
// every host / connection are read: those before the first "Match" block
// and, for the client, those of "Host *" blocks. A line whose value is not
// UTF-8 is skipped.
std::vector<std::pair<std::string, std::string>> ParseSshOptions(std::string_view text, bool client,
                                                                  std::vector<int>& skipped);

}  // namespace HoxPlatform::detail
