#include "Bmc.h"
#include "IpmiCommands.h"

namespace Sim {

void registerSelHandlers(Bmc&) {}

}  // namespace Sim
