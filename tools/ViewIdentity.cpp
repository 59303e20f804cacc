#include <stdio.h>

#include "IpmiIfc.h"
#include "Views.h"

namespace {

int showIdentity(const std::vector<std::string>&) {
    // Reads device id, OS name and OS version (and the LAN settings).
    Ipmi::IpmiIfc::GetBMCNetworking();
    Ipmi::IpmiIfcOpenIpmiOpen(0);  // GetBMCNetworking closes the device behind it
    Ipmi::ipmiifc_device_id id;
    if (Ipmi::IpmiIfc::getManagementControllerInfo(0, id) != 0) {
        fprintf(stderr, "tavipmi: no device id from the controller\n");
        return 1;
    }
    unsigned manufacturer = id.manufacturer_id[0] | (id.manufacturer_id[1] << 8) | (id.manufacturer_id[2] << 16);
    printf("Controller\n");
    printf("  Manufacturer       : %s (%u)\n", Ipmi::IpmiIfc::GetBmcManufacturer().c_str(), manufacturer);
    printf("  Device ID          : %u\n", id.device_id);
    printf("  Device revision    : %u\n", id.device_revision & 0x0F);
    printf("  Firmware version   : %s\n", Ipmi::IpmiIfc::GetBmcFWVersion().c_str());
    printf("  IPMI version       : %s\n", Ipmi::IpmiIfc::GetBmcIpmiVersion().c_str());
    printf("  Product ID         : %u\n", id.product_id[0] | (id.product_id[1] << 8));
    printf("  Host OS name       : %s\n", Ipmi::IpmiIfc::GetBmcReportedOSName().c_str());
    printf("  Host OS version    : %s\n", Ipmi::IpmiIfc::GetBmcReportedOSVersion().c_str());
    return 0;
}

Tool::ViewRegistrar reg("identity", Tool::View{"controller identity and host OS", showIdentity, 10, true});

}  // namespace
