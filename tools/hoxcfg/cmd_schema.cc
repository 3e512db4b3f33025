#include "hoxcfg/commands.h"
#include "hoxcfg/common.h"

namespace hoxcfg {

void RegisterSchemaCommands(CLI::App&, GlobalOptions&) {}

}  // namespace hoxcfg
