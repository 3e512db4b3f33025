// The library's one JSON parser: RapidJSON's iterative reader (no recursion,
// so nesting cannot exhaust the stack), UTF-8 validated, with a nesting limit
// of kMaxJsonDepth. Thread-safe.
#pragma once

#include <cstddef>
#include <string>

#include <hoxcm/documents.h>

namespace HoxConfigManager::detail {

// Parses `size` bytes at `text` into `doc`. False on any error (syntax,
// encoding, trailing content, nesting deeper than kMaxJsonDepth); `error`, when
// given, receives a short description with the offset.
bool ParseJson(const char* text, std::size_t size, Document& doc, std::string* error = nullptr);
// The same; on failure `where` (when given) receives the offset, the line and
// column (in characters) and the reason ("nesting deeper than 512 levels",
// "invalid encoding in string", ...). Its file is left as it was.
bool ParseJson(const char* text, std::size_t size, Document& doc, ErrorLocation* where);

}  // namespace HoxConfigManager::detail
