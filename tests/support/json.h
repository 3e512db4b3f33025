// Parsing JSON in tests: the library's own parser, so a malformed literal in
// a test fails the way the library fails; and editing JSON text.
#pragma once

#include <string>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>

#include "support/temp_root.h"

namespace hoxcm_test {

inline HoxConfigManager::Document Parse(const std::string& text) {
  HoxConfigManager::Document doc;
  HoxConfigManager::ParseDocument(text, doc);
  return doc;
}

// `text` with its first `from` replaced by `to`.
inline std::string Replaced(std::string text, const std::string& from, const std::string& to) {
  return text.replace(text.find(from), from.size(), to);
}

// A file of the sample host ("user-config.json", ...), parsed.
inline HoxConfigManager::Document SampleDocument(const std::string& name) {
  HoxConfigManager::Document doc;
  HoxConfigManager::CreateDocumentFromFile(SourcePath("data/sample-host/" + name).c_str(), doc);
  return doc;
}

}  // namespace hoxcm_test
