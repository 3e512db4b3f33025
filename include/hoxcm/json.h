// The one way into RapidJSON for the library and its clients.
//
// RapidJSON is configured once: std::string support, and assertions that
// throw HoxConfigStore::ConfigStoreException(2000, "Invalid JSON") instead of
// ending the process. Every translation unit must see the same configuration,
// so including a RapidJSON header before this one is an error.
#pragma once

#if defined(RAPIDJSON_RAPIDJSON_H_) && !defined(HOXCM_JSON_CONFIGURED)
#error "include <hoxcm/json.h> before any RapidJSON header"
#endif
#define HOXCM_JSON_CONFIGURED 1

#include <hoxcm/errors.h>

#ifndef RAPIDJSON_HAS_STDSTRING
#define RAPIDJSON_HAS_STDSTRING 1
#endif
// Assertions throw, so no RapidJSON function may be declared noexcept.
#ifndef RAPIDJSON_HAS_CXX11_NOEXCEPT
#define RAPIDJSON_HAS_CXX11_NOEXCEPT 0
#endif

namespace HoxConfigManager::detail {
[[noreturn]] HOXCM_API void ThrowInvalidJson();
// The same fault, found at `documentPath` ("/network/interfaces/vnic/3").
[[noreturn]] HOXCM_API void ThrowInvalidJsonAt(std::string documentPath);
}  // namespace HoxConfigManager::detail

#undef RAPIDJSON_ASSERT
#define RAPIDJSON_ASSERT(x) \
  ((x) ? static_cast<void>(0) : ::HoxConfigManager::detail::ThrowInvalidJson())

#include <rapidjson/document.h>
#include <rapidjson/error/en.h>
#include <rapidjson/pointer.h>
#include <rapidjson/prettywriter.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

namespace HoxConfigManager {
using Document = rapidjson::Document;
using Value = rapidjson::Value;
using Allocator = rapidjson::MemoryPoolAllocator<>;
}  // namespace HoxConfigManager
