// Documents read from and written to files, through the file module. Used by
// the document functions of the public API and by readers that bound their
// documents more tightly (plugin manifests). Thread-safe.
#pragma once

#include <string>

#include <hoxcm/files.h>
#include <hoxcm/json.h>

namespace HoxPlatform::detail {

// Reads and parses the file at `path`, at most MaxFileSize(kind) bytes.
// Throws ConfigManagerException 2080 "Failed to parse JSON String" whose
// location names the file and the reason (unreadable, not a regular file, too
// large, a syntax error with its line and column).
void ReadDocumentFile(const std::string& path, FileKind kind, HoxConfigManager::Document& doc);

}  // namespace HoxPlatform::detail
