// Configuration extraction: host configuration documents built from the
// configuration store's contents (user, current, desired, SmartNIC, the
// exported document), and the documents built from store rows that the drift
// walk and the boot path need. docs/extraction.md has the details.
//
// Every operation runs on the caller's thread. Operations that touch the
// store serialise through its connection; they may be called from several
// threads.
#pragma once

#include <memory>
#include <string>

#include <hoxcm/config_store.h>
#include <hoxcm/export.h>
#include <hoxcm/json.h>
#include <hoxcm/schema_store.h>

namespace HoxConfigManager {

// What ProcessConfigMapList builds: 0 user/current configuration, 1 the same
// under a "profile" wrapper, 2 desired configuration.
enum DocumentType : int { DOCUMENT_CURRENT = 0, DOCUMENT_PROFILE = 1, DOCUMENT_DESIRED = 2 };

// Every extraction returns a host document (components, groups, keys) built
// from the store's rows in store order, and throws when a row cannot become
// part of it: "DELETE_DEFAULT" as a value (ConfigManagerException 2027), a
// value that is not JSON (InvalidArgumentException 2080) or not an object
// (ConfigStoreException 2000), a key without schema (SchemaNotFound 2021), an
// instance identifier that contradicts the key's shape (2084). A failed
// extraction leaves the store as it was. docs/extraction.md has the details.

// The desired configuration staged for the next boot.
HOXCM_API Document ExtractDesiredConfiguration();
// The user configuration, after the host's SSH files have been synchronised
// into the store; with `withProfile` under "profile" and cleaned into a
// portable form (no store-generated identities, no schema defaults).
HOXCM_API Document ExtractUserConfiguration(bool withProfile);
// The configuration the drift walk compares desired documents with: the user
// configuration after SSH synchronisation. Throws 2027 naming every key whose
// default may be changed but not deleted and that has no item.
HOXCM_API Document ExtractCurrentConfiguration();
// The SmartNIC configuration, each item's members sorted.
HOXCM_API Document ExtractSmartnicConfiguration();
// The exported host document: the profile split into host-independent and
// host-specific sections, with "/metadata/reference_host" describing this
// host; members sorted. Carries sensitive values in clear.
HOXCM_API Document ExportDocument();

// Fills the required and union-tag properties that `value` lacks under
// `schema` from the auto-configuration values `autoConfValue` (JSON text; an
// empty text means none). Values are allocated with `allocator`.
HOXCM_API void ProcessAutoConfig(Value& value, const Value& schema, const std::string& autoConfValue,
                                 Allocator& allocator);
// Adds to `result` (an object) the items of the rows `contents`, processed as
// `type` says; the shared step of every extraction.
HOXCM_API void ProcessConfigMapList(Document& result, const HoxConfigStore::ConfigMapList& contents,
                                    const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore,
                                    DocumentType type);

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

// Reads the desired document at `inputPath`, reduces it to this host, checks
// that every key has a schema (SchemaNotFound 2021 naming the keys that have
// none) and writes the result to `outputPath`.
HOXCM_API void CreateMergedBootDocument(const std::string& inputPath, const std::string& outputPath);

}  // namespace HoxConfigManager
