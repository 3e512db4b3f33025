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

// The schema that `node` stands for once its local references into `root`
// are followed; null for a reference that is not local or leads nowhere. A
// chain is followed for at most 32 references (loops are refused earlier by
// FindReferenceLoop).
const rapidjson::Value* ResolveLocalReference(const rapidjson::Value& root, const rapidjson::Value* node);

}  // namespace JsonValidator::detail
