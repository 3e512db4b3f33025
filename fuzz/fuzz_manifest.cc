// Plugin manifests and their check against the manifest schema of their
// version: every manifest is refused with the library's exceptions or gives
// a plugin whose every accessor works.
#include <hoxcm/plugins.h>

#include "fuzz/fuzz_support.h"

using namespace HoxConfigManager;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = hoxcm_fuzz::WriteInput("manifest.json", hoxcm_fuzz::Text(data, size));
  hoxcm_fuzz::Refusable([&] {
    Plugin plugin(path.c_str());
    plugin.validateFile(path.c_str());
    plugin.GetId();
    plugin.GetCSOIdList();
    plugin.GetReferences();
    plugin.GetOperations();
    plugin.GetApplyGroup();
    PluginApplyOperation remediate;
    plugin.GetRemediateOperation(remediate);
    for (PluginType type : {APPLY, APPLY_BOOT, IMPACT, VALIDATE}) plugin.CheckType(type);
    plugin.HasApplySupport();
    plugin.HasApplyBootSupport();
    plugin.HasImpactSupport();
    plugin.HasValidateSupport();
  });
  return 0;
}
