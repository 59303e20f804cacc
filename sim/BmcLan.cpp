#include "Bmc.h"
#include "IpmiCommands.h"

namespace Sim {

void registerLanHandlers(Bmc&) {}

}  // namespace Sim
