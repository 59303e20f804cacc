#include <stdio.h>

#include "IpmiCommands.h"
#include "IpmiIfc.h"
#include "Views.h"

namespace {

const char* selfTestText(unsigned result) {
    switch (result) {
    case 0x55: return "passed";
    case 0x56: return "not implemented";
    case 0x57: return "corrupted or inaccessible data or devices";
    case 0x58: return "fatal hardware error";
    default: return "device-specific failure";
    }
}

void showSelfTest() {
    uint8_t answer[3] = {0, 0, 0};
    uint16_t length = sizeof answer;
    uint8_t rc = Ipmi::IpmiIfc::sendCmd(Ipmi::cmd::getSelfTestResults, Ipmi::netfn::app, 0, nullptr, &length, answer);
    if (rc != 0 || length < 3) {
        printf("  Self test          : unavailable (0x%02x)\n", rc);
        return;
    }
    printf("  Self test          : %s (0x%02x 0x%02x)\n", selfTestText(answer[1]), answer[1], answer[2]);
}

int showIdentity(const std::vector<std::string>&) {
    // The networking query opens and closes the device itself, and reads the
    // device id, OS name and OS version on the way.
    Ipmi::IpmiIfcOpenIpmiClose(0);
    Ipmi::IpmiIfc::GetBMCNetworking();
    if (Ipmi::IpmiIfcOpenIpmiOpen(0) < 0) return 1;
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
    printf("  Aux firmware rev   : %02x %02x %02x %02x\n", id.aux_fw_rev[0], id.aux_fw_rev[1], id.aux_fw_rev[2],
           id.aux_fw_rev[3]);
    showSelfTest();
    printf("  Host OS name       : %s\n", Ipmi::IpmiIfc::GetBmcReportedOSName().c_str());
    printf("  Host OS version    : %s\n", Ipmi::IpmiIfc::GetBmcReportedOSVersion().c_str());
    return 0;
}

Tool::ViewRegistrar reg("identity", Tool::View{"controller identity and host OS", showIdentity, 10, true});

}  // namespace
