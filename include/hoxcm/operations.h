// Host operations: the workflow operations built on the drift engine and the
// plugin framework. Extraction turns the configuration store's contents into
// host configuration documents.
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

}  // namespace HoxConfigManager
