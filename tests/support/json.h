// Parsing JSON text in tests: the library's own parser, so a malformed
// literal in a test fails the way the library fails.
#pragma once

#include <string>

#include <hoxcm/documents.h>

namespace hoxcm_test {

inline HoxConfigManager::Document Parse(const std::string& text) {
  HoxConfigManager::Document doc;
  HoxConfigManager::ParseDocument(text, doc);
  return doc;
}

}  // namespace hoxcm_test
