// The places of a JSON schema (draft 4) where subschemas sit, and the local
// references between them ("$ref": "#/definitions/address").
//
// One reading of references for every user: the validator's guard, the
// union-tag walk, the redaction of sensitive values and the generation of
// schemas that embed other schemas. A reference is usable only in the form
// "#" or "#/token/token...": every token non-empty, "~0" and "~1" for "~" and
// "/", then "%XX" for any byte, array elements by their decimal index. Any
// other spelling ("x", "/abs", "http://...", "#name", "#/", "#//a") names
// a document that is never fetched, or means different things to different
// readers, and is refused.
//
// Stateless and thread-safe.
#pragma once

#include <functional>
#include <string>
#include <string_view>

#include <hoxcm/documents.h>

namespace HoxConfigManager::detail {

// A chain of references ("a" refers to "b", which refers to "c") is
// followed this far at most.
constexpr int kMaxReferenceHops = 32;

// What the reference text `ref` designates in `root`; null, with the reason
// in `why` when given, when it is not a usable local reference or leads
// nowhere.
const Value* ResolveReference(const Value& root, std::string_view ref, std::string* why = nullptr);

// `node` with its chain of references into `root` followed; `node` itself
// when it is not a reference. Null when a reference on the way is not
// usable or the chain is longer than kMaxReferenceHops.
const Value* FollowReferences(const Value& root, const Value* node);

// Calls `visit` once for every subschema of `root` that a validator reads:
// the root, the schemas below the draft-4 keywords (properties,
// patternProperties, additionalProperties, items, additionalItems,
// dependencies, allOf, anyOf, oneOf, not, contains, definitions) and the
// targets of usable references, at any depth. Values that are not objects are
// skipped.
void ForEachSubschema(const Value& root, const std::function<void(const Value& node)>& visit);

// Empty when every "$ref" among the subschemas of `schema` is a string, a
// usable local reference and leads to a schema object, and no chain of
// references returns to where it started ({"$ref": "#"}); otherwise the
// reason, naming the reference.
std::string CheckReferences(const Value& schema);

// Rewrites the local references of `schema` for a copy of it placed at
// `fragment` inside another schema ("#/definitions/a" becomes
// "#<fragment>/definitions/a"). `fragment` is built with
// AppendReferenceToken.
void RebaseReferences(Value& schema, std::string_view fragment, Allocator& allocator);

// Appends "/" and `name` as a token of a reference ("~" as "~0", "/" as
// "~1", "%" as "%25").
void AppendReferenceToken(std::string& fragment, std::string_view name);

// Appends "/" and `name` as a JSON pointer token (RFC 6901: "~" as "~0", "/"
// as "~1"), the form of the paths in validation findings.
void AppendPointerToken(std::string& pointer, std::string_view name);
// The member name a JSON pointer token stands for ("~1dev~1sda" is
// "/dev/sda").
std::string PointerTokenName(std::string_view token);

}  // namespace HoxConfigManager::detail
