// How far the standard library's regular expressions may be trusted. The
// compiler recurses once per element of a pattern and the backtracking
// matcher once per character of the subject: past these limits either may
// exhaust a thread's stack. Shared by the value comparison (patterned member
// names) and the schema validator.
#pragma once

#include <cstddef>

namespace HoxConfigManager::detail {

// A longer pattern is not compiled: a schema that has one is not usable.
constexpr std::size_t kMaxPatternLength = 4096;
// Subjects up to this length are matched safely on any thread's stack.
constexpr std::size_t kSmallSubject = 256;

}  // namespace HoxConfigManager::detail
