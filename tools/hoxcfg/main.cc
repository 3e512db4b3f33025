// hoxcfg: the administrator's and the boot scripts' command-line tool.
#include <CLI/CLI.hpp>

#include "hoxcfg/commands.h"
#include "hoxcfg/common.h"

int main(int argc, char** argv) {
  CLI::App app{"hoxcfg: keep this host's configuration in its desired state"};
  app.require_subcommand(1);
  hoxcfg::GlobalOptions options;
  app.add_option("--root", options.root, "Host root prefix (default: $HOX_ROOT, then /)")
      ->envname("HOX_ROOT");
  app.add_flag("--compact", options.compact, "Compact JSON output even on a terminal");

  hoxcfg::RegisterStoreCommands(app, options);
  hoxcfg::RegisterSchemaCommands(app, options);
  hoxcfg::RegisterPluginCommands(app, options);
  hoxcfg::RegisterDriftCommands(app, options);

  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& e) {
    // Usage errors share the error exit code of every other failure.
    const int rc = app.exit(e);
    return rc == 0 ? 0 : hoxcfg::kExitError;
  }
  return options.exitCode;
}
