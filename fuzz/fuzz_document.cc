// The document parser. Every input is either refused with 2080 and a
// location inside the text, or parsed into a document whose compact text
// reads back as the same document.
#include <hoxcm/documents.h>

#include "fuzz/fuzz_support.h"

using namespace HoxConfigManager;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string text(hoxcm_fuzz::Text(data, size));
  Document document;
  try {
    ParseDocument(text, document);
  } catch (const InvalidArgumentException& e) {
    hoxcm_fuzz::Check(e.GetErrorCode() == JsonParseFailed, "a parse failure is not 2080");
    const ErrorLocation* where = e.GetLocation();
    hoxcm_fuzz::Check(where != nullptr, "a parse failure without location");
    hoxcm_fuzz::Check(where->offset <= size, "a parse failure located past the end");
    hoxcm_fuzz::Check(where->line >= 1 && where->column >= 1, "a parse failure without line and column");
    hoxcm_fuzz::Check(!where->reason.empty(), "a parse failure without reason");
    return 0;
  }
  // Compared as text: members with the same name (which JSON allows) make
  // RapidJSON's equality of values unreliable.
  const std::string compact = JsonToString(document);
  Document again;
  hoxcm_fuzz::Refusable([&] { ParseDocument(compact, again); });
  hoxcm_fuzz::Check(!again.IsNull() || document.IsNull(), "the compact text of a parsed document does not parse");
  hoxcm_fuzz::Check(JsonToString(again) == compact, "a document's text reads back as another document");
  return 0;
}
