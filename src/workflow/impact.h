// Impact with its plugin runner as a parameter: the production overload in
// <hoxcm/operations.h> runs plugins through PluginRunner::Default(); tests
// and the operations built on impact (apply, the single-item host API) may
// pass another runner, or one built on a host run lock they hold.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <hoxcm/operations.h>

#include "plugins/plugin_runner.h"

namespace HoxConfigManager {

// The message ids of the overall statements and of the impact runs.
inline constexpr const char* kImpactInfoReboot = "com.tarvik.settings.impact.info.reboot";
inline constexpr const char* kImpactInfoMaintenanceMode = "com.tarvik.settings.impact.info.maintenance-mode";

// Impact (operations.h) with its plugins run by `runner`.
void Impact(Document& desiredDocument, const std::string& taskId, ImpactResult& result,
            std::shared_ptr<TaskHandle> taskHandle, std::optional<Document> currentDocument, ImpactReasons* reasons,
            PluginRunner& runner);

// Impact as above whose walk also yields the apply tasks of the document into
// `applyTasks` (replaced): exactly what GenerateApplyTasks would return against
// the same host. Apply uses it to walk the document once, while it holds the
// host run lock, so that the host cannot change between the verdict and the
// remediation it allows.
void Impact(Document& desiredDocument, const std::string& taskId, ImpactResult& result,
            std::shared_ptr<TaskHandle> taskHandle, std::optional<Document> currentDocument, ImpactReasons* reasons,
            PluginRunner& runner, std::vector<DesiredConfigInput>& applyTasks);

}  // namespace HoxConfigManager
