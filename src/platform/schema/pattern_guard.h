// Keeps the schema engine's regular expressions safe. Patterns themselves
// are limited to kMaxPatternLength bytes. The engine matches
// "pattern" and "patternProperties" with a backtracking matcher whose
// recursion grows with the length of the subject: a long enough string would
// exhaust the stack. So strings that a pattern may be applied to are limited
// to kMaxPatternSubject bytes, and the engine runs on a thread with a stack
// large enough for that limit. Stateless and thread-safe.
#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

#include <hoxcm/json.h>

#include "foundation/regex_limits.h"
#include "platform/schema/validator_errors.h"

namespace JsonValidator::detail {

constexpr std::size_t kMaxPatternSubject = 4096;
// The limits of foundation/regex_limits.h, under the names the validator uses.
using HoxConfigManager::detail::kMaxPatternLength;
using HoxConfigManager::detail::kSmallSubject;

// Empty when every regular expression of `schema` ("pattern" values and
// "patternProperties" names) is at most kMaxPatternLength bytes long;
// otherwise the reason.
std::string FindOverlongPattern(const rapidjson::Value& schema);

// When `document` holds strings (values or member names) longer than the
// limit that a pattern of `schema` may be applied to, reports each one as a
// pattern finding, fills `guarded` with a copy in which they are cut to the
// limit and returns true. Returns false when the document may be given to the
// engine as it is.
bool GuardPatternSubjects(const rapidjson::Value& schema, const rapidjson::Value& document, const std::string& path,
                          rapidjson::Document& guarded, std::vector<Finding>& out);

// True when `document` holds a string value or member name longer than
// `limit` bytes.
bool HasStringsLongerThan(const rapidjson::Value& document, std::size_t limit);

// Runs `work` on a thread with a large stack and waits for it; rethrows what
// `work` throws.
void RunOnLargeStack(const std::function<void()>& work);

}  // namespace JsonValidator::detail
