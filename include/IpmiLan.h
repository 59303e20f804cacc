#ifndef TAV_IPMI_IPMILAN_H
#define TAV_IPMI_IPMILAN_H

#include <list>
#include <string>

#include "Mutex.h"
#include "TavIpmiExport.h"

namespace Ipmi {

/// @file
/// The controller's LAN settings.

/// The controller's own LAN settings, refreshed by the polling loop on every
/// periodic pass (IpmiIfc::getLan hands out the process-wide object).
/// Getters return copies taken under the object's mutex and send nothing; a
/// refresh holds the mutex across its exchanges, so a getter may wait for
/// one refresh to finish (six exchanges, see @ref contract-blocking
/// "blocking"). Any thread; nothing throws.
class TAV_IPMI_API IpmiLan {
public:
    /// Empty settings; the node table holds the objects.
    IpmiLan() : addressOrigin(0), enabled(false), channel(0) {}

    /// Finds the LAN channel among channels 1 to 7 (1 when none is found):
    /// one Get Channel Info exchange per channel until the first LAN one.
    void initChannelNumber(int node);
    /// Reads all settings: IPv4 address, its origin, MAC address, netmask,
    /// default gateway and IPv6 address, one exchange each (and the channel
    /// search first while the channel is unknown). 0 when netmask and gateway
    /// were read, -1 otherwise; a field whose read fails keeps its previous
    /// value. The polling loop calls it.
    int IpmiIfcLanInstantiate(int node);
    /// Asks for the first static IPv6 address (one exchange) and appends it
    /// when the controller reports it active.
    void load_v6_addresses(int node);

    bool isEnabled();                          ///< the last IPv4 address read succeeded
    std::string getMACAddress();               ///< "00:11:22:33:44:55"; empty before one was read
    std::string getIPv4Address();              ///< dotted quad; empty before one was read
    /// 0 unspecified, 1 static, 2 DHCP, 3 BIOS/system software, 4 other.
    int getAddressOrigin();
    std::string getIPv4Netmask();              ///< dotted quad; empty before one was read
    std::string getIPv4DefaultGateway();       ///< dotted quad; empty before one was read
    /// The IPv6 addresses read, as text of their first eight bytes. The list
    /// is never emptied: each refresh that finds an active address appends
    /// it again, as callers have always seen.
    std::list<std::string> getIPv6Addresses();
    int getChannel();                          ///< the LAN channel; 0 until the first refresh

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
