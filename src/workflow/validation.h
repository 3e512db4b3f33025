// Validate with its plugin runner as a parameter: the production overload
// in <hoxcm/operations.h> runs plugins through PluginRunner::Default();
// tests and the operations built on validation (boot-time apply, the
// single-item host API) may pass another runner.
#pragma once

#include <memory>
#include <string>

#include <hoxcm/operations.h>

#include "plugins/plugin_runner.h"

namespace HoxConfigManager {

// Validate (operations.h) with its plugins run by `runner`.
void Validate(const Document& desiredDocument, const Document& schemaDocument, const std::string& taskId,
              ValidationResult& result, bool checkSchema, std::shared_ptr<TaskHandle> taskHandle,
              PluginRunner& runner);

}  // namespace HoxConfigManager
