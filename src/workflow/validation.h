// Validate with its plugin runner as a parameter: the production overload
// in <hoxcm/operations.h> runs plugins through PluginRunner::Default();
// tests and the operations built on validation (boot-time apply, the
// single-item host API) may pass another runner. The host API also reads
// the validator's findings as Validate does (SchemaFinding).
#pragma once

#include <memory>
#include <string>
#include <utility>

#include <hoxcm/operations.h>

#include "plugins/plugin_runner.h"

namespace HoxConfigManager {

// Validate (operations.h) with its plugins run by `runner`.
void Validate(const Document& desiredDocument, const Document& schemaDocument, const std::string& taskId,
              ValidationResult& result, bool checkSchema, std::shared_ptr<TaskHandle> taskHandle,
              PluginRunner& runner);

// The item of `key` (its component, group and key) among a document's
// components; null when there is none, also when a level above it is not an
// object (the schema stage reports that).
const Value* ItemOf(const Value& root, const HoxConfigStore::ConfigStoreObjectId& key);

// One finding of the JSON validator's output ({"field", "errId", "errArgs"})
// as Validate reports it: the field, and an ErrorInfo with the message id of
// the finding's kind, its arguments and no message text.
std::pair<std::string, ErrorInfo> SchemaFinding(const Value& finding);

}  // namespace HoxConfigManager
