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

}  // namespace HoxConfigManager::detail
