// Only this file sees HOXCM_FAILPOINTS (CMakeLists.txt), so that turning the
// points on or off rebuilds nothing else.
#include "platform/failpoint.h"

#include <csignal>
#include <cstdlib>
#include <string>

namespace HoxPlatform {

#ifndef HOXCM_FAILPOINTS

bool Failpoint(std::string_view, std::string_view) { return false; }

#else

bool Failpoint(std::string_view point, std::string_view file) {
  const char* armed = std::getenv("HOX_FAILPOINTS");
  if (armed == nullptr || *armed == '\0') return false;
  std::string name(point);
  if (!file.empty()) {
    const std::size_t slash = file.rfind('/');
    name += file.substr(slash == std::string_view::npos ? 0 : slash + 1);
  }
  // "name=action" entries separated by commas.
  std::string_view rest = armed;
  while (!rest.empty()) {
    const std::size_t comma = rest.find(',');
    const std::string_view entry = rest.substr(0, comma);
    rest = comma == std::string_view::npos ? std::string_view() : rest.substr(comma + 1);
    const std::size_t equals = entry.rfind('=');
    if (equals == std::string_view::npos || entry.substr(0, equals) != name) continue;
    const std::string_view action = entry.substr(equals + 1);
    if (action == "kill") {
      std::raise(SIGKILL);
      std::abort();  // not reached: SIGKILL cannot be caught
    }
    return action == "error";
  }
  return false;
}

#endif

}  // namespace HoxPlatform
