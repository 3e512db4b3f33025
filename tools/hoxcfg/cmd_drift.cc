#include "hoxcfg/commands.h"
#include "hoxcfg/common.h"

namespace hoxcfg {

void RegisterDriftCommands(CLI::App&, GlobalOptions&) {}

}  // namespace hoxcfg
