#include "Identity.h"

#include <stdio.h>

#include "IpmiIfc.h"

namespace Tool {

// Firmware revision as ipmitool and FreeIPMI print it: the minor revision is
// two BCD digits, so 3 and 0x0f read "3.0f".
std::string firmwareRevision(const Ipmi::ipmiifc_device_id& id) {
    char text[16];
    snprintf(text, sizeof text, "%u.%02x", id.fw_rev1 & 0x3Fu, id.fw_rev2);
    return text;
}

bool readIdentity() {
    // The networking query opens and closes the device itself, and reads the
    // device id, OS name and OS version on the way.
    Ipmi::IpmiIfcOpenIpmiClose(0);
    Ipmi::IpmiIfc::GetBMCNetworking();
    return Ipmi::IpmiIfcOpenIpmiOpen(0) >= 0;
}

unsigned manufacturerId(const Ipmi::ipmiifc_device_id& id) {
    return id.manufacturer_id[0] | (id.manufacturer_id[1] << 8) | (id.manufacturer_id[2] << 16);
}

}  // namespace Tool
