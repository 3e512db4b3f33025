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

HOXCM_API Document ExtractDesiredConfiguration();
HOXCM_API Document ExtractUserConfiguration(bool withProfile);
HOXCM_API Document ExtractCurrentConfiguration();
HOXCM_API Document ExtractSmartnicConfiguration();
HOXCM_API Document ExportDocument();

HOXCM_API void ProcessAutoConfig(Value& value, const Value& schema, const std::string& autoConfValue,
                                 Allocator& allocator);
HOXCM_API void ProcessConfigMapList(Document& result, const HoxConfigStore::ConfigMapList& contents,
                                    const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore,
                                    DocumentType type);

}  // namespace HoxConfigManager
