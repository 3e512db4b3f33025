// hoxcfg: the administrator's and the boot scripts' command-line tool.
#include "hoxcfg/cli.h"
#include "hoxcfg/commands.h"

int main(int argc, char** argv) {
  return hoxcfg::RunTool(argc, argv,
                         {hoxcfg::RegisterStoreCommands, hoxcfg::RegisterSchemaCommands,
                          hoxcfg::RegisterPluginCommands, hoxcfg::RegisterDriftCommands,
                          hoxcfg::RegisterVerdictCommands, hoxcfg::RegisterApplyCommands,
                          hoxcfg::RegisterBootCommands,
                          hoxcfg::RegisterItemCommands});
}
