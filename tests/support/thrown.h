// What a call throws, as a value tests can compare: the library's error
// code and message. Header-only; thread-safe.
#pragma once

#include <exception>
#include <functional>
#include <string>

#include <hoxcm/errors.h>

namespace hoxcm_test {

struct Thrown {
  int code = 0;  // the library's code; -1 for any other exception; 0 when nothing was thrown
  std::string message;
};

inline Thrown ThrownBy(const std::function<void()>& f) {
  try {
    f();
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    return {e.GetErrorCode(), e.what()};
  } catch (const std::exception& e) {
    return {-1, e.what()};
  }
  return {};
}

// Where the document fault thrown by `f` was found ("/network/dns"); empty
// when the exception says no place, or nothing was thrown.
inline std::string FaultPlace(const std::function<void()>& f) {
  try {
    f();
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    return e.GetLocation() != nullptr ? e.GetLocation()->documentPath : "";
  } catch (const std::exception&) {
  }
  return "";
}

// The same as one text, "code message" ("0 " when nothing was thrown).
inline std::string Failure(const std::function<void()>& f) {
  const Thrown thrown = ThrownBy(f);
  return std::to_string(thrown.code) + " " + thrown.message;
}

}  // namespace hoxcm_test
