// Stand-ins for the refresh and clean-up operations of the SDR, sensor, entity,
// FRU and health-file subsystems. The start-up, the polling loop and stop call
// each of them from one place; these weak definitions let that code link and
// run before a subsystem exists. A subsystem's own (strong) definition
// replaces its stand-in at link time. Each one reports success and does nothing.

#include "IpmiIfcInternal.h"

namespace Ipmi {

bool LoadSensorHealthDataFile();

#define TAV_IPMI_STAND_IN __attribute__((weak))

// SDR repository: the periodic reload and the one-shot answer at start.
TAV_IPMI_STAND_IN uint32_t IpmiIfcSdrGetInfo(int) { return 0; }
TAV_IPMI_STAND_IN uint32_t IpmiIfcRhGetSdrInfo(ipmiifc_resp*) { return 0; }

// Sensor readings between SDR reloads.
TAV_IPMI_STAND_IN int IpmiIfcSensorUpdateReading(int) { return 0; }

// FRU discovery: no FRU objects until the FRU inventory pass exists.
TAV_IPMI_STAND_IN int IpmiIfcFruInstantiateAll(int) { return 0; }

// Caches freed by stop and by the command-line clean-up.
TAV_IPMI_STAND_IN void IpmiIfcSdrCleanUpHeaders(int) {}
TAV_IPMI_STAND_IN void IpmiIfcSdrCleanUpAll(int) {}
TAV_IPMI_STAND_IN void IpmiIfcEntityCleanUpAll(int) {}

// The sensor health rules, loaded by the command-line preparation.
TAV_IPMI_STAND_IN bool LoadSensorHealthDataFile() { return true; }

#undef TAV_IPMI_STAND_IN

}  // namespace Ipmi
