#include "Bmc.h"
#include "IpmiCommands.h"

namespace Sim {

void registerFruHandlers(Bmc&) {}

}  // namespace Sim
