// The validator's findings: turning the schema engine's error reports into
// our error kinds (VALIDATION_ERR_CODES), fields and arguments. Stateless and
// thread-safe.
#pragma once

#include <string>
#include <vector>

namespace JsonValidator::detail {

struct Finding {
  std::string field;              // "/a/b/0", below the caller's context; a JSON pointer (RFC 6901)
  int code = 0;                   // VALIDATION_ERR_CODES
  std::vector<std::string> args;  // first: the name of the faulty member
  std::string text;               // human text; never holds a value of the document
};

// Classifies one engine report. `path` is the location of the value the
// report is about. False when the report only says that a child failed: the
// child's own report carries the finding.
bool ClassifyEngineError(const std::string& path, const std::string& description, Finding& out);

// The member name that the last token of a field stands for ("" for the
// root).
std::string LastSegment(const std::string& field);

}  // namespace JsonValidator::detail
