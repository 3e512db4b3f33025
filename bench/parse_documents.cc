// The baseline of the end-to-end benchmark: a whole process that parses
// the given documents with the library's parser and keeps them all until
// it exits, as a compliance check holds the desired and the host document.
//
//   parse_documents FILE...
#include <cstdio>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host_documents.h>

int main(int argc, char** argv) {
  std::vector<HoxConfigManager::Document> documents(argc > 1 ? argc - 1 : 0);
  try {
    for (int i = 1; i < argc; ++i) HoxConfigManager::CreateDocumentFromFile(argv[i], documents[i - 1]);
  } catch (const std::exception& e) {
    std::fprintf(stderr, "parse_documents: %s\n", e.what());
    return 2;
  }
  std::size_t members = 0;
  for (const auto& doc : documents) members += doc.IsObject() ? doc.MemberCount() : 0;
  std::printf("%zu documents, %zu components\n", documents.size(), members);
  return 0;
}
