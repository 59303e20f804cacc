#include "Bmc.h"
#include "IpmiCommands.h"

namespace Sim {

void registerSdrHandlers(Bmc&) {}

}  // namespace Sim
