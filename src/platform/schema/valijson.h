// The schema engine's headers, included after <hoxcm/json.h> so that it
// shares our RapidJSON configuration and its throwing assertion (the
// engine's own assertion hook, which would only repeat ours, stays unused).
#pragma once

#include <hoxcm/json.h>

#pragma push_macro("RAPIDJSON_ASSERT")
#undef RAPIDJSON_ASSERT
#include <valijson/adapters/rapidjson_adapter.hpp>
#undef RAPIDJSON_ASSERT
#pragma pop_macro("RAPIDJSON_ASSERT")
#include <valijson/schema.hpp>
#include <valijson/schema_parser.hpp>
#include <valijson/validation_results.hpp>
#include <valijson/validator.hpp>

// The engine's regular-expression checks and its constraint callback,
// replaced for the adapter the library uses (platform/schema/patterns.h).
// Declared here, before any use, so that no translation unit instantiates
// the engine's own versions.
namespace valijson {

template <>
bool ValidationVisitor<adapters::RapidJsonAdapter>::validationCallback(
    const constraints::Constraint& constraint, ValidationVisitor<adapters::RapidJsonAdapter>& visitor);
template <>
bool ValidationVisitor<adapters::RapidJsonAdapter>::visit(const constraints::PatternConstraint& constraint);
template <>
bool ValidationVisitor<adapters::RapidJsonAdapter>::visit(const constraints::FormatConstraint& constraint);
template <>
template <>
bool ValidationVisitor<adapters::RapidJsonAdapter>::ValidatePatternPropertySubschemas::operator()(
    const constraints::PropertiesConstraint::String& pattern, const Subschema* subschema) const;

}  // namespace valijson
