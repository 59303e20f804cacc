#include <stdio.h>

#include "IpmiIfc.h"
#include "IpmiLan.h"
#include "Views.h"

namespace {

using Tool::Json;

const char* originText(int origin) {
    switch (origin) {
    case 0: return "unspecified";
    case 1: return "static";
    case 2: return "DHCP";
    case 3: return "BIOS or system software";
    case 4: return "other";
    default: return "unknown";
    }
}

int lan(std::vector<Tool::Section>& out) {
    Ipmi::IpmiLan& lan = *Ipmi::IpmiIfc::getLan(0);
    int rc = lan.IpmiIfcLanInstantiate(0);
    Json r;
    r["channel"] = lan.getChannel();
    if (lan.isEnabled()) r["ip_address"] = lan.getIPv4Address();
    r["address_origin"] = originText(lan.getAddressOrigin());
    r["netmask"] = lan.getIPv4Netmask();
    r["default_gateway"] = lan.getIPv4DefaultGateway();
    r["mac_address"] = lan.getMACAddress();
    r["ipv6_addresses"] = lan.getIPv6Addresses();

    Tool::Section s;
    s.name = "lan";
    s.title = "LAN";
    s.layout = Tool::Section::Fields;
    s.single = true;
    s.columns = {{"channel", "Channel"},
                 {"ip_address", "IP address"},
                 {"address_origin", "Address origin"},
                 {"netmask", "Netmask"},
                 {"default_gateway", "Default gateway"},
                 {"mac_address", "MAC address"},
                 {"ipv6_addresses", "IPv6 addresses"}};
    s.records.push_back(std::move(r));
    out.push_back(std::move(s));
    if (rc != 0) {
        fprintf(stderr, "tavipmi: netmask or gateway could not be read\n");
        return 1;
    }
    return 0;
}

Tool::ViewRegistrar reg("lan", Tool::View{"the controller's LAN settings", nullptr, lan, 20, true});

}  // namespace
