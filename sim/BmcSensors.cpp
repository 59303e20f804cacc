#include "Bmc.h"
#include "IpmiCommands.h"

namespace Sim {

void registerSensorHandlers(Bmc&) {}

}  // namespace Sim
