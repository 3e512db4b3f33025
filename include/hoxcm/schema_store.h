// The schema store: the description of every configuration key of the host,
// read from one schema file per key below <root>/usr/lib/tarvik/configmanager/schemas/
// (format: docs/schema-store.md), and the JSON schema validator.
//
// A root's store lists its schema files once per process; each key's file is
// read and checked when the key is first looked up, and its schema is
// immutable afterwards: SchemaStore, SchemaObject and the cache may be shared
// between threads freely.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include <hoxcm/export.h>
#include <hoxcm/json.h>

namespace HoxSchemaStore {

// Identity of one key's schema: component, group, key.
struct HOXCM_API SchemaObjectId {
  std::string component;
  std::string group;
  std::string key;

  SchemaObjectId() = default;
  SchemaObjectId(std::string component, std::string group, std::string key);
  // "component:group:key"
  std::string toString() const;
  bool operator==(const SchemaObjectId& o) const {
    return component == o.component && group == o.group && key == o.key;
  }
  bool operator!=(const SchemaObjectId& o) const { return !(*this == o); }
  bool operator<(const SchemaObjectId& other) const;
};

struct HOXCM_API SchemaObjectIdHash {
  std::size_t operator()(const SchemaObjectId& id) const;
};

// Everything the configuration manager knows about one key.
class HOXCM_API SchemaObject {
 public:
  virtual ~SchemaObject();

  virtual const SchemaObjectId& GetId() const = 0;
  // True when the key holds an array of instances, false for a singleton.
  virtual bool IsMultiInstance() const = 0;
  // Name of the member that identifies an instance: a property name, or
  // "cs_generated_id" when the store generates identities. Empty for a
  // singleton.
  virtual const std::string& GetIdentityMember() const = 0;
  // The key ships a default user configuration (rows in the store's default
  // table) that the host falls back to when the user configuration is removed.
  virtual bool HasDefaultUserConfig() const = 0;
  // The default configuration may be changed by the user but never deleted.
  virtual bool IsMutableDefault() const = 0;
  // Solution users whose instances are hidden from the default
  // configuration, and instance identifiers that solutions created.
  virtual const std::vector<std::string>& GetSolutionUserNames() const = 0;
  virtual const std::vector<std::string>& GetSolutionInstanceIds() const = 0;
  // Operations ("SET", "ADD", "DELETE") that require a reboot / maintenance
  // mode; `propertyLevel` tells whether properties of the key's JSON schema
  // also declare "rebootRequired" / "maintenanceModeRequired". Return 0.
  virtual int GetRebootOperations(std::vector<std::string>& operations, bool& propertyLevel) const = 0;
  virtual int GetMaintenanceModeOperations(std::vector<std::string>& operations,
                                           bool& propertyLevel) const = 0;
  // The key's JSON schema: an "object" schema for a singleton, an "array"
  // schema whose "items" describe one instance for a multi-instance key.
  // Properties may carry "sensitive": true. Local references ("$ref":
  // "#/definitions/...") anywhere in the key's schemas resolve against it.
  virtual const rapidjson::Value& GetJsonSchema() const = 0;
  // The schema of one instance (the "items" of a multi-instance key, the
  // whole schema of a singleton), a part of GetJsonSchema().
  virtual const rapidjson::Value& GetInstanceSchema() const = 0;
  // The key's configuration differs from host to host (addresses, names):
  // it belongs to a host's own section when a document is split per host.
  virtual bool IsHostSpecific() const;
};

class SchemaCache;

// The set of schemas of one host root.
class HOXCM_API SchemaStore {
 public:
  virtual ~SchemaStore();

  // The store of the current root (HOX_ROOT), loaded on first use; null when
  // the schema directory cannot be read.
  static std::shared_ptr<SchemaStore> GetStore();
  // The cache of generated schema documents of the current root's store.
  static std::shared_ptr<SchemaCache> GetCache();

  // Null when the key has no (valid) schema.
  virtual std::shared_ptr<SchemaObject> Find(const std::string& component, const std::string& group,
                                             const std::string& key) const = 0;
  // A short text describing the key's schema (its file and identity); throws
  // HoxConfigStore::ConfigStoreException when the key is unknown.
  virtual std::string GetSchemaInfo(const std::string& component, const std::string& group,
                                    const std::string& key) const = 0;
  // Keys whose default configuration is mutable.
  virtual std::set<SchemaObjectId> GetMutableDefaultIds() const = 0;
  // Every key with a valid schema, sorted.
  virtual std::vector<SchemaObjectId> ListKeys() const = 0;
  // Schema files that failed to load: "path: reason", one per file.
  virtual std::vector<std::string> GetLoadErrors() const = 0;
  // True, with the file and the reason, when the key's schema file was
  // refused (when the key was looked up); false otherwise.
  virtual bool GetLoadError(const SchemaObjectId& id, std::string& file, std::string& reason) const;
};

// Per-store cache used by GenerateSchemaDocument.
class HOXCM_API SchemaCache {
 public:
  virtual ~SchemaCache();
  virtual std::shared_ptr<SchemaStore> GetStore() const = 0;
};

// Whether the key's list of `query` (SchemaObject::GetRebootOperations or
// GetMaintenanceModeOperations) names `operation` ("SET", "ADD", "DELETE").
HOXCM_API bool ListsOperation(const SchemaObject& schema,
                              int (SchemaObject::*query)(std::vector<std::string>&, bool&) const,
                              std::string_view operation);

// Schema of (component, group, key) in `store`; null when missing.
HOXCM_API std::shared_ptr<SchemaObject> GetSchema(const std::string& component, const std::string& group,
                                                  const std::string& key,
                                                  const std::shared_ptr<SchemaStore>& store);

// Throws SchemaNotFound 2021 naming `what` (the item path, or "c:g:k") for
// the key `id`, which has no schema in `store`. When the key's file was
// refused, the exception's location names the file and the reason.
[[noreturn]] HOXCM_API void ThrowSchemaNotFound(const SchemaStore* store, const SchemaObjectId& id,
                                                const std::string& what);

// Builds into `out` the JSON schema of a host document shaped like `value`
// (components, groups, keys): an object schema whose properties follow the
// document's keys. Keys without schema are left out.
HOXCM_API void GenerateSchemaDocument(const rapidjson::Value& value, const std::shared_ptr<SchemaCache>& cache,
                                      rapidjson::Document& out);

}  // namespace HoxSchemaStore

namespace JsonValidator {

// Error kinds reported by the validator; docs/validator.md lists them with
// their message identifiers.
enum VALIDATION_ERR_CODES : int {
  VALIDATION_OK = 0,
  VALIDATION_ERR_GENERIC = 1,
  VALIDATION_ERR_TYPE = 2,
  VALIDATION_ERR_ENUM = 3,
  VALIDATION_ERR_MINIMUM = 4,
  VALIDATION_ERR_MAXIMUM = 5,
  VALIDATION_ERR_MIN_LENGTH = 6,
  VALIDATION_ERR_MAX_LENGTH = 7,
  VALIDATION_ERR_PATTERN = 8,
  VALIDATION_ERR_REQUIRED = 9,
  VALIDATION_ERR_ADDITIONAL_PROPERTIES = 10,
  VALIDATION_ERR_MIN_ITEMS = 11,
  VALIDATION_ERR_MAX_ITEMS = 12,
  VALIDATION_ERR_UNIQUE_ITEMS = 13,
  VALIDATION_ERR_FORMAT = 14,
  VALIDATION_ERR_ONE_OF = 15,
  VALIDATION_ERR_ANY_OF = 16,
  VALIDATION_ERR_ALL_OF = 17,
  VALIDATION_ERR_NOT = 18,
  VALIDATION_ERR_MULTIPLE_OF = 19,
  VALIDATION_ERR_DEPENDENCIES = 20,
  VALIDATION_ERR_MIN_PROPERTIES = 21,
  VALIDATION_ERR_MAX_PROPERTIES = 22,
  VALIDATION_ERR_ADDITIONAL_ITEMS = 23,
  VALIDATION_ERR_UNKNOWN_KEY = 30,
  VALIDATION_ERR_SCHEMA_INVALID = 31,
  VALIDATION_ERR_UNION_TAG = 32,
};

// Validates `document` against `schema` and leaves in `result` an array of
// errors, each {"field", "errId", "errArgs", "error"} (empty when valid).
// "error" says what is wrong with the value at "field" ("must be at least
// 1280"); a type error's second argument is the expected type.
// Error kinds in `ignored` are dropped. Returns the number of errors kept.
// `context` prefixes every "field".
HOXCM_API int Validate(const rapidjson::Value& schema, const rapidjson::Value& document,
                       rapidjson::Document& result, const std::set<int>& ignored,
                       const std::string& context);

// Validates a whole host document (components, groups, keys) against a host
// document schema and reports every faulty item, not only the first.
HOXCM_API int ValidateCMDocument(const rapidjson::Value& schema, const rapidjson::Value& document,
                                 rapidjson::Document& result, const std::set<int>& ignored,
                                 const std::string& context);

// Message identifier of a validator error code, and back (VALIDATION_ERR_GENERIC
// for an identifier that names no code).
HOXCM_API std::string ConvertErrorCodeToMsgId(int code);
HOXCM_API int ConvertMsgIdToErrorCode(const std::string& messageId);

// What a finding says about its field, as the validator's "error" text:
// "must be a string", "must be at least 1280", "is required but missing".
// `args` are the finding's arguments; `engineText`, when known, refines
// exclusive bounds and formats.
HOXCM_API std::string DescribeFinding(int code, const std::vector<std::string>& args,
                                      const std::string& engineText = "");

}  // namespace JsonValidator
