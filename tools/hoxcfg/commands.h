// Command registration of hoxcfg. Each area of the tool lives in its own
// file and adds its subcommands to the application here.
#pragma once

#include <CLI/CLI.hpp>

namespace hoxcfg {

struct GlobalOptions;

// Defined in the command files; an area that is not built yet registers
// nothing.
void RegisterStoreCommands(CLI::App& app, GlobalOptions& options);    // init, export, show, maintenance
void RegisterSchemaCommands(CLI::App& app, GlobalOptions& options);   // schema-check
void RegisterPluginCommands(CLI::App& app, GlobalOptions& options);   // plugins list|check
void RegisterDriftCommands(CLI::App& app, GlobalOptions& options);    // compliance, drift

}  // namespace hoxcfg
