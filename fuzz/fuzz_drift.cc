// The drift walk with the compliance report and the apply tasks, on a pair
// of documents against the sample host's schemas: the desired document and
// the host's configuration, separated by the first NUL byte of the input.
// Malformed documents must be refused with the library's exceptions.
#include <cstring>

#include <hoxcm/documents.h>
#include <hoxcm/drift.h>

#include "fuzz/fuzz_support.h"

using namespace HoxConfigManager;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view input = hoxcm_fuzz::Text(data, size);
  const std::size_t nul = input.find('\0');
  if (nul == std::string_view::npos) return 0;
  Document desired;
  Document current;
  try {
    ParseDocument(std::string(input.substr(0, nul)), desired);
    ParseDocument(std::string(input.substr(nul + 1)), current);
  } catch (const InvalidArgumentException&) {
    return 0;  // the parser has a target of its own
  }
  hoxcm_fuzz::Refusable([&] {
    Document walked;
    walked.CopyFrom(desired, walked.GetAllocator());
    Document host;
    host.CopyFrom(current, host.GetAllocator());
    ComplianceResult result;
    CheckComplianceHandler handler(&result);
    ComputeDrift(walked, walked.GetAllocator(), handler, std::move(host));
    hoxcm_fuzz::Check(result.document.IsObject(), "the compliance report is not an object");
    JsonToString(result.document);
  });
  hoxcm_fuzz::Refusable([&] {
    ApplyTaskGenerator generator;
    ComputeDrift(desired, desired.GetAllocator(), generator, std::move(current));
  });
  return 0;
}
