#include "hoxcfg/commands.h"
#include "hoxcfg/common.h"

namespace hoxcfg {

void RegisterStoreCommands(CLI::App&, GlobalOptions&) {}

}  // namespace hoxcfg
