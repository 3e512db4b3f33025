// Command registration of hoxcfg. Each area of the tool lives in its own
// file and adds its commands to the application with the framework of
// cli.h; main() lists the areas in the order of the help.
#pragma once

#include <CLI/CLI.hpp>

#include "hoxcfg/cli.h"

namespace hoxcfg {

void RegisterStoreCommands(CLI::App& app, GlobalOptions& options);    // init, export, show, maintenance
void RegisterSchemaCommands(CLI::App& app, GlobalOptions& options);   // schema-check, schemas
void RegisterPluginCommands(CLI::App& app, GlobalOptions& options);   // plugins list|check
void RegisterDriftCommands(CLI::App& app, GlobalOptions& options);    // compliance, drift
void RegisterVerdictCommands(CLI::App& app, GlobalOptions& options);  // validate, impact
void RegisterApplyCommands(CLI::App& app, GlobalOptions& options);    // plan, apply, history
void RegisterBootCommands(CLI::App& app, GlobalOptions& options);     // bootstrap, boot, smartnic
void RegisterItemCommands(CLI::App& app, GlobalOptions& options);     // get, set, delete

}  // namespace hoxcfg
