// References inside a schema that lead nowhere but to themselves
// ({"$ref": "#"}, or "a" -> "b" -> "a" in "definitions") would send the
// schema engine into endless recursion, so they are found before the engine
// sees the schema. Stateless and thread-safe.
#pragma once

#include <string>

#include <hoxcm/json.h>

namespace JsonValidator::detail {

// Empty when no chain of local references ("#...") in `schema` returns to
// where it started; otherwise the reason, naming the reference.
std::string FindReferenceLoop(const rapidjson::Value& schema);

}  // namespace JsonValidator::detail
