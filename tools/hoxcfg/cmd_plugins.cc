#include "hoxcfg/commands.h"
#include "hoxcfg/common.h"

namespace hoxcfg {

void RegisterPluginCommands(CLI::App&, GlobalOptions&) {}

}  // namespace hoxcfg
