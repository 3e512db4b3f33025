// Shared by the fuzz targets: one temporary host root per fuzzing process
// (sample schemas and manifest schemas installed, HOX_ROOT set), a way to
// hand an input to readers that take a path, and the rule every target
// checks: the library refuses bad input with one of its own exceptions, and
// anything else escaping it is a finding.
//
// Not thread-safe: libFuzzer runs one input at a time per process.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <string>
#include <string_view>

#include <hoxcm/errors.h>

namespace hoxcm_fuzz {

// The root, created at the first call (LLVMFuzzerInitialize, defined with
// it, makes the call); it lives until the process exits.
const std::string& Root();

// Writes `data` to a file below the root named `name` and returns its path.
std::string WriteInput(const std::string& name, std::string_view data);

// The input as text.
inline std::string_view Text(const std::uint8_t* data, std::size_t size) {
  return {reinterpret_cast<const char*>(data), size};
}

// Runs `body`; the library's refusals (HostCtlException and its family) are
// expected and swallowed, any other exception aborts with its text so that
// libFuzzer records the input.
template <typename Body>
void Refusable(Body&& body) {
  try {
    body();
  } catch (const HostCtl::Lib::HostCtlException&) {
    // A refusal with the library's code and text: what bad input must get.
  } catch (const std::exception& e) {
    std::fprintf(stderr, "unexpected exception escaped the library: %s\n", e.what());
    std::abort();
  }
}

// Aborts with `what` when `condition` does not hold.
void Check(bool condition, const char* what);

}  // namespace hoxcm_fuzz
