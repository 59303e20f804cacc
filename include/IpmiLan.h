#ifndef TAV_IPMI_IPMILAN_H
#define TAV_IPMI_IPMILAN_H

#include <list>
#include <string>

#include "Mutex.h"
#include "TavIpmiExport.h"

namespace Ipmi {

// The controller's own LAN settings, refreshed by the polling loop. Getters
// return copies taken under the object's mutex; a refresh holds it across its
// exchanges, so a getter may wait for one refresh to finish.
class TAV_IPMI_API IpmiLan {
public:
    IpmiLan() : addressOrigin(0), enabled(false), channel(0) {}

    // Finds the LAN channel among channels 1 to 7 (1 when none is found).
    void initChannelNumber(int node);
    // Reads all settings; 0 when netmask and gateway were read, -1 otherwise.
    // A field whose read fails keeps its previous value.
    int IpmiIfcLanInstantiate(int node);
    // Appends the first static IPv6 address when the controller reports it.
    void load_v6_addresses(int node);

    bool isEnabled();
    std::string getMACAddress();
    std::string getIPv4Address();
    int getAddressOrigin();  // 0 unspecified, 1 static, 2 DHCP, 3 BIOS/system software, 4 other
    std::string getIPv4Netmask();
    std::string getIPv4DefaultGateway();
    std::list<std::string> getIPv6Addresses();
    int getChannel();  // 0 until the first refresh

private:
    int findLanChannel();
    void loadV6AddressesLocked();

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
