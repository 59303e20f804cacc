#ifndef TAV_IPMI_IPMILAN_H
#define TAV_IPMI_IPMILAN_H

#include <list>
#include <string>

#include "Mutex.h"
#include "TavIpmiExport.h"

namespace Ipmi {

// The controller's own LAN settings, refreshed by the polling loop.
class TAV_IPMI_API IpmiLan {
public:
    IpmiLan() : addressOrigin(0), enabled(false), channel(0) {}

    void initChannelNumber(int node);
    int IpmiIfcLanInstantiate(int node);
    void load_v6_addresses(int node);

    bool isEnabled();
    std::string getMACAddress();
    std::string getIPv4Address();
    int getAddressOrigin();
    std::string getIPv4Netmask();
    std::string getIPv4DefaultGateway();
    std::list<std::string> getIPv6Addresses();
    int getChannel();

private:
    std::string macAddress;
    std::string ipv4Address;
    int addressOrigin;
    std::string ipv4Netmask;
    std::string ipv4DefaultGateway;
    std::list<std::string> ipv6Addresses;
    bool enabled;
    int channel;
    TAV::Mutex mutex;
};

}  // namespace Ipmi

#endif
