#include "foundation/pattern.h"

#include <mutex>
#include <unordered_map>

#include <re2/re2.h>

namespace HoxConfigManager::detail {
namespace {

// Schemas share their patterns (names, addresses); past this many distinct
// texts the cache starts over rather than grow without end.
constexpr std::size_t kMaxCachedPatterns = 4096;

bool IsHex(char c) { return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F'); }

// JSON schema patterns are written for ECMAScript, whose "\uXXXX" RE2
// spells "\x{XXXX}"; everything else is handed over as written.
std::string ToRe2Syntax(std::string_view source) {
  std::string out;
  out.reserve(source.size());
  for (std::size_t i = 0; i < source.size(); ++i) {
    if (source[i] != '\\' || i + 1 == source.size()) {
      out.push_back(source[i]);
      continue;
    }
    if (source[i + 1] == 'u' && i + 5 < source.size() && IsHex(source[i + 2]) && IsHex(source[i + 3]) &&
        IsHex(source[i + 4]) && IsHex(source[i + 5])) {
      out += "\\x{";
      out.append(source.substr(i + 2, 4));
      out.push_back('}');
      i += 5;
      continue;
    }
    // An escaped character stays escaped ("\\u" is a backslash and a u).
    out.push_back(source[i]);
    out.push_back(source[++i]);
  }
  return out;
}

struct Compiled {
  std::shared_ptr<const SchemaPattern> pattern;
  std::string why;
};

Compiled Compile(std::string_view source) {
  if (source.size() > kMaxPatternLength) {
    return {nullptr, "a regular expression is longer than " + std::to_string(kMaxPatternLength) + " bytes"};
  }
  RE2::Options options;
  options.set_log_errors(false);
  options.set_never_capture(true);
  auto re = std::make_unique<RE2>(ToRe2Syntax(source), options);
  if (!re->ok()) return {nullptr, "the regular expression cannot be used: " + re->error()};
  return {std::make_shared<const SchemaPattern>(std::move(re)), std::string()};
}

}  // namespace

SchemaPattern::SchemaPattern(std::unique_ptr<re2::RE2> compiled) : compiled_(std::move(compiled)) {}
SchemaPattern::~SchemaPattern() = default;

bool SchemaPattern::Search(std::string_view subject) const {
  return RE2::PartialMatch(re2::StringPiece(subject.data(), subject.size()), *compiled_);
}

std::shared_ptr<const SchemaPattern> SchemaPattern::Get(std::string_view source, std::string* why) {
  // Every pattern met in the process, compiled or refused.
  struct Cache {
    std::mutex mutex;  // guards `entries`
    std::unordered_map<std::string, Compiled> entries;
  };
  static Cache cache;
  {
    std::lock_guard<std::mutex> lock(cache.mutex);
    auto it = cache.entries.find(std::string(source));
    if (it != cache.entries.end()) {
      if (why != nullptr) *why = it->second.why;
      return it->second.pattern;
    }
  }
  // Compiled outside the lock: other threads' lookups need not wait.
  Compiled compiled = Compile(source);
  if (why != nullptr) *why = compiled.why;
  std::lock_guard<std::mutex> lock(cache.mutex);
  if (cache.entries.size() >= kMaxCachedPatterns) cache.entries.clear();
  return cache.entries.try_emplace(std::string(source), std::move(compiled)).first->second.pattern;
}

}  // namespace HoxConfigManager::detail
