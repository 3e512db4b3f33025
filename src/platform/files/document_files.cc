// The document functions that touch files: status, reading, writing.
#include "platform/files/document_files.h"

#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/host_documents.h>

#include "foundation/json_parse.h"

namespace HoxPlatform::detail {

void ReadDocumentFile(const std::string& path, FileKind kind, HoxConfigManager::Document& doc) {
  using HoxConfigManager::ConfigManagerException;
  // The code's fixed text; what went wrong where travels as its location.
  HoxConfigManager::ErrorLocation where;
  where.file = path;
  std::string text;
  try {
    text = ReadFile(path, kind);
  } catch (const FileError& e) {
    where.reason = e.reason();
    HoxConfigManager::ThrowExceptionAt<ConfigManagerException>(std::move(where), HoxConfigManager::JsonParseFailed);
  }
  if (!HoxConfigManager::detail::ParseJson(text.data(), text.size(), doc, &where)) {
    HoxConfigManager::ThrowExceptionAt<ConfigManagerException>(std::move(where), HoxConfigManager::JsonParseFailed);
  }
}

}  // namespace HoxPlatform::detail

namespace HoxConfigManager {

bool fileExists(const std::string& path) {
  std::optional<HoxPlatform::FileError> problem;
  if (HoxPlatform::IsRegularFile(path, &problem)) return true;
  if (problem) {
    // Every failure is logged, a missing file included: callers that probe
    // for optional files see the reason in the log.
    CSLogger::Log(CSLogger::kError, "Failed to query the status of \"%s\", error code: %d, error message: \"%s\"",
                  path.c_str(), problem->error(), problem->reason().c_str());
  }
  return false;
}

void CreateFileFromDocument(const char* path, const Document& doc) {
  RAPIDJSON_ASSERT(path != nullptr);
  std::string text;
  SerializeValue(doc, text);
  // Documents carry configuration values, passwords among them: only the
  // owner may read the file. They are written for the next boot, so they
  // must be on disk when this returns.
  HoxPlatform::WriteFileAtomically(path, text, 0600, HoxPlatform::Durability::kDurable);
}

void CreateDocumentFromFile(const char* path, Document& doc) {
  if (path == nullptr) ThrowException<ConfigManagerException>(JsonParseFailed);
  HoxPlatform::detail::ReadDocumentFile(path, HoxPlatform::FileKind::Document, doc);
}

}  // namespace HoxConfigManager
