#ifndef TAV_IPMI_TOOLS_IDENTITY_H
#define TAV_IPMI_TOOLS_IDENTITY_H

#include <string>

#include "IpmiIfc.h"

namespace Tool {

// Firmware revision as the peer tools print it ("3.0f").
std::string firmwareRevision(const Ipmi::ipmiifc_device_id& id);
// One-shot use: asks the controller for its device id and host OS strings;
// false when the device cannot be opened again afterwards.
bool readIdentity();
unsigned manufacturerId(const Ipmi::ipmiifc_device_id& id);

}  // namespace Tool

#endif
