// The controller's LAN configuration: channel, IPv4 settings, MAC and IPv6.

#include "IpmiLan.h"

#include <stdio.h>

#include "IpmiIfcInternal.h"

namespace Ipmi {

namespace {

constexpr int kFirstChannel = 1;
constexpr int kLastChannel = 7;
constexpr int kFallbackChannel = 1;

// Get Channel Info answer.
namespace channelInfoByte {
constexpr size_t medium = 2;  // bits 6:0
}

// Get LAN Configuration Parameters answer: completion code, revision, data.
constexpr size_t kParameterData = 2;

// The IPv6 static address answer as this library reads it: the eight bytes
// from kParameterData on (set selector, address source and the first six
// address bytes) form the text, and byte 20 is taken as the address state.
namespace ipv6Byte {
constexpr size_t first = kParameterData;
constexpr size_t count = 8;
constexpr size_t state = 20;
}  // namespace ipv6Byte

std::string dotted(const uint8_t* b) {
    char text[16];
    snprintf(text, sizeof text, "%u.%u.%u.%u", b[0], b[1], b[2], b[3]);
    return text;
}

ipmiifc_resp* getLanParameter(uint8_t channel, uint8_t parameter) {
    uint8_t request[4] = {channel, parameter, 0, 0};
    return IpmiIfcSendCmd(0, cmd::getLanConfigParameters, netfn::transport, 0, sizeof request, request, 0);
}

// A successful answer that is too short for its field is taken as failed.
bool answered(const RespHolder& r, size_t dataBytes) { return r->cc == 0 && r->data_len >= kParameterData + dataBytes; }

const char* const kInstantiate = "IpmiIfcLanInstantiate";

// Reads one parameter into `r` and returns its data, at least `dataBytes`
// long, or null after logging the missing answer (`missing`) or the failure.
const uint8_t* readParameter(RespHolder& r, uint8_t channel, uint8_t parameter, size_t dataBytes, const char* name,
                             const char* missing) {
    r.reset(getLanParameter(channel, parameter));
    if (!r) {
        ipmiLog(LOG_DEBUG, "%s: %s", kInstantiate, missing);
        return nullptr;
    }
    if (!answered(r, dataBytes)) {
        ipmiLog(LOG_ERR, "%s: Get %s failed: cc=0x%x", kInstantiate, name, r->cc);
        return nullptr;
    }
    return r->data + kParameterData;
}

}  // namespace

int IpmiLan::findLanChannel() {
    for (int number = kFirstChannel; number <= kLastChannel; ++number) {
        uint8_t request = static_cast<uint8_t>(number);
        IpmiIfcNextMsgId(0);  // one id here, one more in IpmiIfcSendCmd
        RespHolder r(IpmiIfcSendCmd(0, cmd::getChannelInfo, netfn::app, 0, 1, &request, 0));
        if (!r) {
            ipmiLog(LOG_DEBUG, "%s: Get Channel %d Info - NULL response", "initChannelNumber", number);
            continue;
        }
        if (r->cc != 0) {
            // Invalid data field is how a controller says the channel does not exist.
            if (r->cc != cc::invalidDataField)
                ipmiLog(LOG_ERR, "%s: Get Channel %d Info failed: cc=0x%x", "initChannelNumber", number, r->cc);
            continue;
        }
        if (r->data_len <= channelInfoByte::medium) continue;
        int medium = r->data[channelInfoByte::medium] & 0x7F;
        ipmiLog(LOG_DEBUG, "%s: BMC Channel %d, Medium: %d", "initChannelNumber", number, medium);
        if (medium == channelMedium::lan8023 || medium == channelMedium::otherLan) return number;
    }
    return kFallbackChannel;
}

void IpmiLan::initChannelNumber(int) {
    TAV::MutexLock guard(mutex);
    channel = 0;
    channel = findLanChannel();
}

int IpmiLan::IpmiIfcLanInstantiate(int) {
    TAV::MutexLock guard(mutex);
    if (channel == 0) channel = findLanChannel();
    const uint8_t ch = static_cast<uint8_t>(channel);

    RespHolder r;
    if (const uint8_t* d = readParameter(r, ch, lanParam::ipAddress, 4, "IP addr", "Get IP addr - NULL response")) {
        ipv4Address = dotted(d);
        ipmiLog(LOG_DEBUG, "%s: BMC IP Address %s", kInstantiate, ipv4Address.c_str());
        enabled = true;
    } else {
        enabled = false;
    }
    // The missing blank before the dash is how log readers know this line.
    if (const uint8_t* d =
            readParameter(r, ch, lanParam::ipAddressSource, 1, "IP addr Source", "Get IP addr Source- NULL response"))
        addressOrigin = d[0];
    if (const uint8_t* d =
            readParameter(r, ch, lanParam::macAddress, 6, "MAC address", "Get MAC address - NULL response")) {
        char text[18];
        snprintf(text, sizeof text, "%02x:%02x:%02x:%02x:%02x:%02x", d[0], d[1], d[2], d[3], d[4], d[5]);
        macAddress = text;
        ipmiLog(LOG_DEBUG, "%s: BMC MAC address %s", kInstantiate, macAddress.c_str());
    }
    // A netmask or gateway that cannot be read ends the refresh.
    const uint8_t* d = readParameter(r, ch, lanParam::subnetMask, 4, "netmask", "Get netmask - NULL response");
    if (!d) return -1;
    ipv4Netmask = dotted(d);
    ipmiLog(LOG_DEBUG, "%s: BMC Netmask %s", kInstantiate, ipv4Netmask.c_str());
    d = readParameter(r, ch, lanParam::defaultGatewayAddress, 4, "default gateway",
                      "Get default gateway - NULL response");
    if (!d) return -1;
    ipv4DefaultGateway = dotted(d);
    // Logged with the netmask's wording, as log readers know it.
    ipmiLog(LOG_DEBUG, "%s: BMC Netmask %s", kInstantiate, ipv4DefaultGateway.c_str());
    loadV6AddressesLocked();
    return 0;
}

void IpmiLan::load_v6_addresses(int) {
    TAV::MutexLock guard(mutex);
    loadV6AddressesLocked();
}

// Asks channel 0 and set selector 0 only, so at most the first static address
// is considered; the list is never emptied, so each refresh appends again.
void IpmiLan::loadV6AddressesLocked() {
    static int32_t cnt = 0;  // guarded by the mutex of node 0's object, the only one refreshed
    RespHolder r(getLanParameter(0, lanParam::ipv6StaticAddresses));
    if (!r) {
        ipmiLog(LOG_DEBUG, "%s: Get V6 Manual address - NULL response", "load_v6_addresses");
        return;
    }
    if (r->cc != 0 || r->data_len <= ipv6Byte::state) {
        // This limiter never fires (cnt stays even), so a controller without
        // IPv6 adds nothing to the log: kept that way on purpose.
        int32_t old = cnt;
        cnt += 2;
        if ((old + 1) % 1000 == 0)
            ipmiLog(LOG_ERR, "%s: Get V6 Manual address failed: cc=0x%x", "load_v6_addresses", r->cc);
        return;
    }
    const int state = r->data[ipv6Byte::state];
    if (state != 0) {
        ipmiLog(LOG_WARNING, "%s: Ignore BMC V6 IP addr, not active, state=%d", "load_v6_addresses", state);
    } else {
        const uint8_t* a = r->data + ipv6Byte::first;
        char text[ipv6Byte::count * 3];
        snprintf(text, sizeof text, "%02x:%02x:%02x:%02x:%02x:%02x:%02x:%02x", a[0], a[1], a[2], a[3], a[4], a[5], a[6],
                 a[7]);
        ipv6Addresses.push_back(text);
    }
    ipmiLog(LOG_DEBUG, "%s: loaded %zu ipv6 addresses", "load_v6_addresses", ipv6Addresses.size());
}

bool IpmiLan::isEnabled() {
    TAV::MutexLock guard(mutex);
    return enabled;
}

std::string IpmiLan::getMACAddress() {
    TAV::MutexLock guard(mutex);
    return macAddress;
}

std::string IpmiLan::getIPv4Address() {
    TAV::MutexLock guard(mutex);
    return ipv4Address;
}

int IpmiLan::getAddressOrigin() {
    TAV::MutexLock guard(mutex);
    return addressOrigin;
}

std::string IpmiLan::getIPv4Netmask() {
    TAV::MutexLock guard(mutex);
    return ipv4Netmask;
}

std::string IpmiLan::getIPv4DefaultGateway() {
    TAV::MutexLock guard(mutex);
    return ipv4DefaultGateway;
}

std::list<std::string> IpmiLan::getIPv6Addresses() {
    TAV::MutexLock guard(mutex);
    return ipv6Addresses;
}

int IpmiLan::getChannel() {
    TAV::MutexLock guard(mutex);
    return channel;
}

// Node numbers outside the table get slot 0, like every other node-0 call.
IpmiLan* IpmiIfc::getLan(int node) {
    if (node < 0 || node >= IPMI_NODE_COUNT) node = 0;
    return &g_IpmiNode[node].lan;
}

IpmiLan* IpmiIfc::getLan() { return getLan(0); }

}  // namespace Ipmi
