#include <stdio.h>

#include <CLI/CLI.hpp>

#include "IpmiCommands.h"
#include "IpmiIfc.h"
#include "Identity.h"
#include "Views.h"

namespace {

using Tool::Json;

const char* selfTestText(unsigned result) {
    switch (result) {
    case 0x55: return "passed";
    case 0x56: return "not implemented";
    case 0x57: return "corrupted or inaccessible data or devices";
    case 0x58: return "fatal hardware error";
    default: return "device-specific failure";
    }
}

void addSelfTest(Json& r) {
    uint8_t answer[3] = {0, 0, 0};
    uint16_t length = sizeof answer;
    uint8_t rc = Ipmi::IpmiIfc::sendCmd(Ipmi::cmd::getSelfTestResults, Ipmi::netfn::app, 0, nullptr, &length, answer);
    if (rc != 0 || length < 3) return;
    char code[16];
    snprintf(code, sizeof code, "0x%02x 0x%02x", answer[1], answer[2]);
    r["self_test"] = selfTestText(answer[1]);
    r["self_test_code"] = code;
}

// The controller keeps the fill bytes of its blocks; they read as spaces.
std::string trimmed(std::string s) {
    s.erase(s.find_last_not_of(' ') + 1);
    return s;
}

int identity(std::vector<Tool::Section>& out) {
    if (!Tool::readIdentity()) return 1;
    Ipmi::ipmiifc_device_id id;
    if (Ipmi::IpmiIfc::getManagementControllerInfo(0, id) != 0) {
        fprintf(stderr, "tavipmi: no device id from the controller\n");
        return 1;
    }
    Json r;
    r["manufacturer"] = Ipmi::IpmiIfc::GetBmcManufacturer();
    r["manufacturer_id"] = Tool::manufacturerId(id);
    r["device_id"] = id.device_id;
    r["device_revision"] = id.device_revision & 0x0F;
    r["firmware_revision"] = Tool::firmwareRevision(id);
    r["ipmi_version"] = Ipmi::IpmiIfc::GetBmcIpmiVersion();
    r["product_id"] = id.product_id[0] | (id.product_id[1] << 8);
    char aux[24];
    snprintf(aux, sizeof aux, "%02x %02x %02x %02x", id.aux_fw_rev[0], id.aux_fw_rev[1], id.aux_fw_rev[2],
             id.aux_fw_rev[3]);
    r["aux_firmware_revision"] = aux;
    addSelfTest(r);
    const std::string osName = trimmed(Ipmi::IpmiIfc::GetBmcReportedOSName());
    const std::string osVersion = trimmed(Ipmi::IpmiIfc::GetBmcReportedOSVersion());
    if (!osName.empty()) r["os_name"] = osName;
    if (!osVersion.empty()) r["os_version"] = osVersion;

    Tool::Section s;
    s.name = "identity";
    s.title = "Controller";
    s.layout = Tool::Section::Fields;
    s.single = true;
    s.columns = {{"manufacturer", "Manufacturer"},
                 {"manufacturer_id", "Manufacturer ID"},
                 {"device_id", "Device ID"},
                 {"device_revision", "Device revision"},
                 {"firmware_revision", "Firmware revision"},
                 {"ipmi_version", "IPMI version"},
                 {"product_id", "Product ID"},
                 {"aux_firmware_revision", "Aux firmware revision"},
                 {"self_test", "Self test"},
                 {"self_test_code", "Self test code"},
                 {"os_name", "Host OS name"},
                 {"os_version", "Host OS version"}};
    s.records.push_back(std::move(r));
    out.push_back(std::move(s));
    return 0;
}

Tool::ViewRegistrar reg("identity", Tool::View{"controller identity and host OS", nullptr, identity, 10, true});

}  // namespace
