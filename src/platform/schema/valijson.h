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
