// The configuration store's document functions: building, comparing,
// redacting and serialising configuration values (docs/platform.md,
// docs/drift.md for the comparison). They need nothing of the store itself,
// only JSON, so they belong to the foundation, where every layer may use
// them; <hoxcm/config_store.h> includes this header.
//
// Stateless; every function is thread-safe.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include <hoxcm/export.h>
#include <hoxcm/json.h>

namespace HoxConfigStore {

// Clean-up actions applied to extracted values (docs/platform.md).
enum CLEANUP_ACTIONS : int {
  CLEANUP_REMOVE_GENERATED_ID = 1,   // drop "cs_generated_id"
  CLEANUP_REMOVE_NULLS = 2,          // drop members whose value is null
  CLEANUP_REMOVE_EMPTY_OBJECTS = 3,  // drop members that are empty objects
  CLEANUP_REMOVE_DEFAULTS = 4,       // drop members equal to their schema default
  CLEANUP_REMOVE_UNKNOWN = 5,        // drop members the schema does not describe
};

// Document building, comparison, redaction and serialisation of
// configuration values. Stateless; every function is thread-safe.
class HOXCM_API ConfigStoreDocument {
 public:
  // Lower-case, hyphenated 8-4-4-4-12 form of a host UUID.
  static std::string NormalizeHostId(const std::string& hostId);
  // `source` with the host-specific sections reduced to the host `hostId`
  // (format: docs/platform.md).
  static void GetDocumentForHost(const rapidjson::Value& source, rapidjson::Document& result,
                                 const std::string& hostId);
  // The same in place: `document` loses its host-specific sections and
  // takes in the items of `hostId`'s. Nothing else is copied.
  static void ReduceToHost(rapidjson::Document& document, const std::string& hostId);
  static bool ValueExists(const rapidjson::Value& object, const char* member);
  // Schema-aware equality of a desired and a host value (docs/drift.md).
  static bool IsEqualValue(const rapidjson::Value& desired, const rapidjson::Value& host,
                           const rapidjson::Value& schema);
  // A hash that agrees with IsEqualValue under the same schema.
  static std::size_t HashValue(const rapidjson::Value& value, const rapidjson::Value& schema);
  // Order-insensitive equality of two arrays of primitive values.
  static bool IsEqualPrimitiveArray(const rapidjson::Value& a, const rapidjson::Value& b);
  // Compact JSON of `value` with every value that `schema` makes sensitive
  // replaced by "******", at any depth: marked "sensitive" itself, inside a
  // sensitive object or array, or through any combinator branch, reference
  // ("#..." against `schema`), pattern property or additional schema.
  static std::string RedactAndSerializeValue(const rapidjson::Value& schema, const rapidjson::Value& value);
  // Adds an item: a singleton (empty identifier) as doc[C][G][K], an instance
  // appended to the array doc[C][G][K]. Under "profile" when it exists.
  static void AddObject(rapidjson::Document& doc, const std::string& component, const std::string& group,
                        const std::string& key, const std::string& identifier, rapidjson::Value& value,
                        rapidjson::MemoryPoolAllocator<>& allocator);
  // The same into `items`, the component tree of a document (the document
  // itself or its "profile") that the caller found once: a document built
  // row by row would otherwise search every component for every row.
  static void AddItem(rapidjson::Value& items, const std::string& component, const std::string& group,
                      const std::string& key, const std::string& identifier, rapidjson::Value& value,
                      rapidjson::MemoryPoolAllocator<>& allocator);
  // Adds an empty "profile" object to the document (an object).
  static void AddProfile(rapidjson::Document& doc);
  static void CleanupObject(rapidjson::Value& value, const rapidjson::Value& schema,
                            const std::vector<CLEANUP_ACTIONS>& actions,
                            rapidjson::MemoryPoolAllocator<>& allocator);
  // Sorts object members by name, recursively, so that equal documents
  // serialise identically.
  static void NormalizeValue(rapidjson::Value& value, rapidjson::MemoryPoolAllocator<>& allocator);
  // Splits a profile document into host-independent and host-specific
  // sections by the schema document (docs/platform.md); result into `out`.
  static void SplitDocument(const rapidjson::Value& profile, const rapidjson::Value& schemaDocument,
                            const std::string& hostId, rapidjson::Document& out);
  // Fill the property `field` of `value` (a validator field) from the
  // auto-configuration values `autoConf`. False when `autoConf` holds no
  // value for the field (nothing is changed).
  static bool PatchRequiredProperty(rapidjson::Value& value, const std::string& field,
                                    const rapidjson::Value& autoConf,
                                    rapidjson::MemoryPoolAllocator<>& allocator);
  static bool PatchUnionTagProperty(rapidjson::Value& value, const std::string& field,
                                    const rapidjson::Value& autoConf,
                                    rapidjson::MemoryPoolAllocator<>& allocator);
  // Parses JSON text; throws InvalidArgumentException 2080 when malformed.
  static rapidjson::Document CreateDocument(const std::string& text);
  static void SerializeValue(const rapidjson::Value& value, std::string& out);
};

}  // namespace HoxConfigStore
