// CheckApply and Apply (operations.h) with their plugin runner as a
// parameter: the public ones run plugins through a LaunchingRunner on the
// host run lock they take; tests pass a scripted runner. Both still take the
// host run lock, so that waiting for another apply is the same in either.
#pragma once

#include <memory>
#include <string>

#include <hoxcm/operations.h>

#include "plugins/plugin_runner.h"

namespace HoxConfigManager {

std::shared_ptr<CheckApplyResult> CheckApply(Document& desired, const std::string& operationContext,
                                             std::shared_ptr<TaskHandle> taskHandle, ImpactReasons* reasons,
                                             PluginRunner& runner);

ApplyResult Apply(const std::shared_ptr<CheckApplyResult>& checkResult, std::shared_ptr<TaskHandle> taskHandle,
                  PluginRunner& runner);

}  // namespace HoxConfigManager
