// JSON document utilities of the configuration manager: create, parse,
// compare, serialise and store RapidJSON documents, read instance
// identities, and the host facts that documents depend on.
//
// Configuration documents have three levels, component → group → key, whose
// value is the item: an object for a singleton key, an array of instance
// objects for a multi-instance key. A desired document may wrap this shape
// in a top-level "profile" member.
//
// All functions are stateless and thread-safe. Parsers accept at most
// kMaxJsonDepth levels of nesting and only valid UTF-8.
#pragma once

#include <memory>
#include <string>

#include <hoxcm/config_store.h>
#include <hoxcm/export.h>
#include <hoxcm/json.h>

namespace HoxSchemaStore {
class SchemaObject;
}

namespace HoxConfigManager {

// Deeper documents are refused as malformed: no configuration comes close,
// and the recursive walks over documents must not exhaust the stack.
constexpr unsigned kMaxJsonDepth = 512;

// True only for a regular file; a status failure is logged and answered false.
HOXCM_API bool fileExists(const std::string& path);

HOXCM_API std::string GetBIOSUUID();
// The part of `source` that applies to this host.
HOXCM_API void CreateMergedDocument(const Document& source, Document& result);
HOXCM_API bool IsMaintenanceModeEnabled();

HOXCM_API std::shared_ptr<Document> CreateDocument();
HOXCM_API void AddMember(Document* doc, Value* object, const std::string& name, Value* value);
HOXCM_API std::string GetInstanceIdFromValue(const Value& instance,
                                             const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema);
HOXCM_API bool IsEqualArray(const Value& a, const Value& b);

HOXCM_API void CreateFileFromDocument(const char* path, const Document& doc);
HOXCM_API void SerializeValue(const Value& value, std::string& out);
// Compact JSON text of a value, for messages and logs.
HOXCM_API std::string JsonToString(const Value& value);

// Parse errors: InvalidArgumentException 2080.
HOXCM_API void ParseDocument(const std::string& text, Document& doc);
HOXCM_API std::shared_ptr<Document> CreateDocumentFromString(const std::string& text);
// Unreadable file or parse error: ConfigManagerException 2080.
HOXCM_API void CreateDocumentFromFile(const char* path, Document& doc);

// Builds from configuration rows the item they describe: for a multi-instance
// key (per `schema`) an array of the rows' values, else the value of the
// single row (null when there is none). Each "Value" is parsed with
// ParseDocument; values are allocated in `doc`.
HOXCM_API void CreateDocumentFromMap(const HoxConfigStore::ConfigMapList& rows,
                                     const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                                     Document& doc);
// Drops rows of instances owned by the key's solution users (matched on the
// "Identifier" column); other keys are returned unchanged.
HOXCM_API HoxConfigStore::ConfigMapList FilterSolutionUserInstances(
    const HoxConfigStore::ConfigMapList& rows, const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema);
// The default user configuration of an object, as a document.
HOXCM_API void GetExternalDefaultUserConfig(const HoxConfigStore::ConfigStoreObjectId& id,
                                            const std::shared_ptr<HoxConfigStore::DBStore>& connection,
                                            const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                                            Document& doc);

// Either a JSON schema covering every key of `document` (true), or an array
// of validation errors naming the keys without schema (false), in `out`.
HOXCM_API bool GenerateHostDocumentSchema(const Value& document, Document& out);
// Reads the desired document at `inputPath`, reduces it to this host, checks
// that every key has a schema and writes the result to `outputPath`.
HOXCM_API void CreateMergedBootDocument(const std::string& inputPath, const std::string& outputPath);

}  // namespace HoxConfigManager
