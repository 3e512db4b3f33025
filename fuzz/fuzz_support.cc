#include "fuzz/fuzz_support.h"

#include <fstream>

#include "support/temp_root.h"

namespace hoxcm_fuzz {

const std::string& Root() {
  // Removed when the fuzzer exits normally; a crash leaves it for study.
  static const hoxcm_test::TempRoot root;
  static const bool installed = [] {
    root.InstallSampleSchemas();
    root.InstallPluginSchemas();
    return true;
  }();
  static_cast<void>(installed);
  return root.path();
}

std::string WriteInput(const std::string& name, std::string_view data) {
  const std::string path = Root() + "/" + name;
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out.write(data.data(), static_cast<std::streamsize>(data.size()));
  out.close();
  Check(out.good(), "cannot write the input file");
  return path;
}

void Check(bool condition, const char* what) {
  if (condition) return;
  std::fprintf(stderr, "check failed: %s\n", what);
  std::abort();
}

}  // namespace hoxcm_fuzz

// The root is made before the first input, so that its cost is not counted
// against an input's time limit.
extern "C" int LLVMFuzzerInitialize(int*, char***) {
  hoxcm_fuzz::Root();
  return 0;
}
