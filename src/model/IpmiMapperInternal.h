#ifndef TAV_IPMI_IPMIMAPPERINTERNAL_H
#define TAV_IPMI_IPMIMAPPERINTERNAL_H

// Health rules loading for the library's own code and its tests; not installed, not exported.

#include "IpmiMapper.h"

namespace Ipmi {

// Empties healthList and sensorHealthMap so that the next load reads a file again.
void ResetSensorHealthData();

}  // namespace Ipmi

#endif
