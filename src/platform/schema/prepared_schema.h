// A key's schema made ready for validating a whole host document: compiled
// for the engine once and kept with the key schema it comes from.
//
// A host document schema (GenerateSchemaDocument) embeds each key's schema
// three levels down. Compiling that whole schema on every validation cost
// far more than the validation itself, so ValidateCMDocument validates each
// key's item against its key's compiled schema instead, whenever the host
// document schema it was given is exactly what the store would generate:
// every level closed, every key node equal to `embedded`. Anything else (a
// schema edited by a caller, generated from another root, or from a schema
// file since replaced) is compiled as given, so what is validated is always
// the schema the caller passed, never a cached one that differs from it.
//
// A PreparedSchema is immutable once built and shared between threads; it
// lives as long as its KeySchema, which the store keeps for its own life.
#pragma once

#include <memory>
#include <string_view>

#include <hoxcm/json.h>
#include <hoxcm/schema_store.h>

namespace valijson {
class Schema;
}

namespace HoxSchemaStore::detail {

// The key schema of `schema` as a host document schema holds it for the key
// component/group/key: its references rebased below the three levels, and
// "hostSpecific" for a host-specific key.
rapidjson::Value EmbeddedKeySchema(const SchemaObject& schema, std::string_view component, std::string_view group,
                                   std::string_view key, rapidjson::Document::AllocatorType& allocator);

}  // namespace HoxSchemaStore::detail

namespace JsonValidator::detail {

struct PreparedSchema {
  PreparedSchema();
  ~PreparedSchema();
  PreparedSchema(const PreparedSchema&) = delete;
  PreparedSchema& operator=(const PreparedSchema&) = delete;

  // The node a store-generated host document schema holds for the key.
  rapidjson::Document embedded;
  // The engine's form of the key's schema, without the variant lists of
  // union nodes (the union walk checks those).
  std::unique_ptr<valijson::Schema> engine;
  // Whether the key's schema has union nodes at all.
  bool unions = false;
};

// Whether ValidateCMDocument validates against `schema`, a host document
// schema, with the compiled schemas of the current root's keys (that is,
// `schema` is exactly what the store generates); otherwise it compiles
// `schema` as given.
bool UsesKeySchemas(const rapidjson::Value& schema);

// Compiles the key schema `schema`; throws std::exception when the engine
// refuses it (a key the store loaded has passed the same compilation).
std::unique_ptr<const PreparedSchema> PrepareKeySchema(const HoxSchemaStore::SchemaObject& schema);

}  // namespace JsonValidator::detail
