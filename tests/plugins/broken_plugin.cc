// Shared objects that the C++ runner must refuse: built once with an
// interface version from the future (BROKEN_ABI) and once without the
// describe function (BROKEN_NO_DESCRIBE).
#include <cstdlib>

#include <hoxcm/plugin_sdk.h>

namespace {
char* Never(const char*, const char*) { std::abort(); }
void Free(char*) {}
const hoxcm_plugin_table kTable = {HOXCM_PLUGIN_ABI_VERSION + 1, "broken", Never, Never, Never, Free};
}  // namespace

#ifdef BROKEN_NO_DESCRIBE
extern "C" __attribute__((visibility("default"))) const hoxcm_plugin_table* other_name(void) { return &kTable; }
#else
extern "C" const hoxcm_plugin_table* hoxcm_plugin_describe(void) { return &kTable; }
#endif
