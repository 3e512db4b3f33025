// The regular expressions of JSON schemas ("pattern" values and
// "patternProperties" names), compiled and matched by RE2: in time linear in
// the length of the subject, without recursion, whatever the pattern. The
// constructs that only a backtracking matcher offers (back-references,
// lookahead and lookbehind) are refused, as are counted repetitions above
// 1000 and patterns longer than kMaxPatternLength bytes. "\uXXXX" is read as
// the character it names. docs/validator.md shows how schema authors see it.
//
// Compiled patterns are immutable and shared; Get() may be called from any
// thread.
#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>

namespace re2 {
class RE2;
}

namespace HoxConfigManager::detail {

constexpr std::size_t kMaxPatternLength = 4096;

class SchemaPattern {
 public:
  // The compiled form of `source`, shared with every other user of the same
  // text in the process; null, with the reason in `why` when given, when the
  // pattern is refused.
  static std::shared_ptr<const SchemaPattern> Get(std::string_view source, std::string* why = nullptr);

  explicit SchemaPattern(std::unique_ptr<re2::RE2> compiled);
  ~SchemaPattern();
  SchemaPattern(const SchemaPattern&) = delete;
  SchemaPattern& operator=(const SchemaPattern&) = delete;

  // True when the pattern matches anywhere in `subject` (JSON schema
  // patterns are not anchored).
  bool Search(std::string_view subject) const;

 private:
  const std::unique_ptr<re2::RE2> compiled_;
};

}  // namespace HoxConfigManager::detail
