#include <stdio.h>

#include "IpmiIfc.h"
#include "IpmiLan.h"
#include "Views.h"

namespace {

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

int showLan(const std::vector<std::string>&) {
    Ipmi::IpmiLan& lan = *Ipmi::IpmiIfc::getLan(0);
    int rc = lan.IpmiIfcLanInstantiate(0);
    printf("LAN\n");
    printf("  Channel            : %d\n", lan.getChannel());
    printf("  IP address         : %s%s\n", lan.getIPv4Address().c_str(), lan.isEnabled() ? "" : " (not read)");
    printf("  Address origin     : %s (%d)\n", originText(lan.getAddressOrigin()), lan.getAddressOrigin());
    printf("  Netmask            : %s\n", lan.getIPv4Netmask().c_str());
    printf("  Default gateway    : %s\n", lan.getIPv4DefaultGateway().c_str());
    printf("  MAC address        : %s\n", lan.getMACAddress().c_str());
    auto v6 = lan.getIPv6Addresses();
    if (v6.empty()) printf("  IPv6 addresses     : none\n");
    for (const auto& a : v6) printf("  IPv6 address       : %s\n", a.c_str());
    if (rc != 0) {
        fprintf(stderr, "tavipmi: netmask or gateway could not be read\n");
        return 1;
    }
    return 0;
}

Tool::ViewRegistrar reg("lan", Tool::View{"the controller's LAN settings", showLan, 20, true});

}  // namespace
