// Document functions that need the host: documents read from and written to
// files (through <hoxcm/files.h>), the host's identity and maintenance-mode
// state that documents depend on, instance identities by the key's schema,
// and the schema of a whole host document.
//
// All functions are thread-safe.
#pragma once

#include <memory>
#include <string>

#include <hoxcm/export.h>
#include <hoxcm/json.h>

namespace HoxSchemaStore {
class SchemaObject;
}

namespace HoxConfigManager {

// True only for a regular file; a status failure is logged and answered false.
HOXCM_API bool fileExists(const std::string& path);

// Reads and parses a document file (at most 128 MiB, a regular file). An
// unreadable file or a parse error: ConfigManagerException 2080, whose text
// names the file and the reason.
HOXCM_API void CreateDocumentFromFile(const char* path, Document& doc);
// Writes `doc` compactly to `path`, replaced atomically and durably, mode
// 0600 (documents carry passwords). Throws HoxPlatform::FileError.
HOXCM_API void CreateFileFromDocument(const char* path, const Document& doc);

HOXCM_API std::string GetBIOSUUID();
// The part of `source` that applies to this host.
HOXCM_API void CreateMergedDocument(const Document& source, Document& result);
// The same, taking `source` over instead of copying it (a large desired
// document is then held once).
HOXCM_API void CreateMergedDocument(Document&& source, Document& result);
HOXCM_API bool IsMaintenanceModeEnabled();

// The value of the identity member the key's schema names; empty when it
// names none or the instance lacks it; 2084 when it is not a string.
HOXCM_API std::string GetInstanceIdFromValue(const Value& instance,
                                             const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema);

// Either a JSON schema covering every key of `document` (true), or an array
// of validation errors naming the keys without schema (false), in `out`.
HOXCM_API bool GenerateHostDocumentSchema(const Value& document, Document& out);

}  // namespace HoxConfigManager
