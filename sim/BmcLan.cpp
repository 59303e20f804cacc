// LAN area of the simulated controller: Get Channel Info and Get LAN
// Configuration Parameters over the LanModel.

#include "Bmc.h"
#include "IpmiCommands.h"

namespace Sim {

using namespace Ipmi;

namespace {

constexpr uint8_t kParameterRevision = 0x11;
constexpr uint8_t kRevisionOnly = 0x80;     // request byte 0, bit 7
constexpr uint8_t kCurrentChannel = 0x0E;   // the channel the request came in on
constexpr uint8_t kSystemInterface = 0x0F;
constexpr uint8_t kProtocolKcs = 0x05;
constexpr uint8_t kIpmiEnterprise[3] = {0xF2, 0x1B, 0x00};  // 7154, least significant byte first

Response ccOnly(uint8_t code) { return Response{code}; }

const LanChannelModel* findChannel(const Bmc& b, uint8_t number) {
    for (const auto& c : b.lan.channels)
        if (c.number == number) return &c;
    return nullptr;
}

bool isLanMedium(uint8_t medium) { return medium == channelMedium::lan8023 || medium == channelMedium::otherLan; }

Response channelInfo(uint8_t number, uint8_t medium, uint8_t protocol, uint8_t sessions) {
    return Response{cc::ok,
                    number,
                    static_cast<uint8_t>(medium & 0x7F),
                    static_cast<uint8_t>(protocol & 0x1F),
                    sessions,
                    kIpmiEnterprise[0],
                    kIpmiEnterprise[1],
                    kIpmiEnterprise[2],
                    0x00,
                    0x00};
}

Response getChannelInfo(Bmc& b, const Request& r) {
    if (r.data.size() != 1) return ccOnly(cc::requestDataLengthInvalid);
    uint8_t number = r.data[0] & 0x0F;
    if (number == kCurrentChannel || number == kSystemInterface)
        return channelInfo(kSystemInterface, channelMedium::systemInterface, kProtocolKcs, 0x00);
    const LanChannelModel* c = findChannel(b, number);
    if (c == nullptr) return ccOnly(cc::invalidDataField);
    return channelInfo(c->number, c->medium, c->protocol, c->sessionSupport);
}

bool answersLan(const Bmc& b, uint8_t number) {
    if (number == 0 && b.lan.answersOnChannelZero) return true;
    const LanChannelModel* c = findChannel(b, number);
    return c != nullptr && isLanMedium(c->medium);
}

Response ipv6StaticAddress(const Bmc& b, uint8_t selector) {
    const auto& list = b.lan.ipv6StaticAddresses;
    if (selector >= list.size()) return ccOnly(cc::parameterOutOfRange);
    const LanIpv6StaticAddress& a = list[selector];
    Response out{cc::ok, kParameterRevision, selector, a.source};
    out.insert(out.end(), a.address, a.address + sizeof a.address);
    out.push_back(a.prefixLength);
    out.push_back(a.status);
    return out;
}

Response getLanConfigParameters(Bmc& b, const Request& r) {
    if (r.data.size() != 4) return ccOnly(cc::requestDataLengthInvalid);
    const uint8_t channel = r.data[0] & 0x0F;
    const uint8_t parameter = r.data[1];
    const uint8_t selector = r.data[2];
    if (!answersLan(b, channel)) return ccOnly(cc::invalidDataField);
    if (parameter == lanParam::ipv6StaticAddresses) {
        if (b.lan.ipv6StaticAddresses.empty()) return ccOnly(cc::parameterNotSupported);
        if (r.data[0] & kRevisionOnly) return Response{cc::ok, kParameterRevision};
        return ipv6StaticAddress(b, selector);
    }
    auto p = b.lan.parameters.find(parameter);
    if (p == b.lan.parameters.end()) return ccOnly(cc::parameterNotSupported);
    Response out{cc::ok, kParameterRevision};
    if (r.data[0] & kRevisionOnly) return out;
    out.insert(out.end(), p->second.begin(), p->second.end());
    return out;
}

}  // namespace

std::map<uint8_t, std::vector<uint8_t>> defaultLanParameters() {
    std::vector<uint8_t> community(18, 0);
    const char name[] = "public";
    for (size_t i = 0; i + 1 < sizeof name; ++i) community[i] = static_cast<uint8_t>(name[i]);
    return {
        {lanParam::setInProgress, {0x00}},
        {lanParam::authTypeSupport, {0x15}},  // none, MD5, password
        {lanParam::authTypeEnables, {0x14, 0x14, 0x14, 0x14, 0x00}},
        {lanParam::ipAddress, {192, 168, 1, 10}},
        {lanParam::ipAddressSource, {ipSource::staticAddress}},
        {lanParam::macAddress, {0x00, 0x14, 0x22, 0x0a, 0x1b, 0x2c}},
        {lanParam::subnetMask, {255, 255, 255, 0}},
        {lanParam::ipv4HeaderParameters, {0x40, 0x40, 0x10}},  // TTL 64, don't fragment, TOS
        {lanParam::bmcArpControl, {0x02}},                     // ARP responses on, gratuitous ARP off
        {lanParam::gratuitousArpInterval, {0x04}},             // 2 seconds
        {lanParam::defaultGatewayAddress, {192, 168, 1, 1}},
        {lanParam::defaultGatewayMac, {0x00, 0x00, 0x5e, 0x00, 0x01, 0x01}},
        {lanParam::backupGatewayAddress, {0, 0, 0, 0}},
        {lanParam::backupGatewayMac, {0, 0, 0, 0, 0, 0}},
        {lanParam::communityString, community},
        {lanParam::vlanId, {0x00, 0x00}},  // disabled
        {lanParam::vlanPriority, {0x00}},
        {lanParam::cipherSuiteEntrySupport, {0x05}},
        {lanParam::cipherSuiteEntries, {0x00, 0x00, 0x01, 0x02, 0x03, 0x11}},
        {lanParam::cipherSuitePrivilegeLevels, {0x00, 0x44, 0x44, 0x04, 0x00, 0x00, 0x00, 0x00, 0x00}},
        {lanParam::badPasswordThreshold, {0x00, 0x00, 0x00, 0x00, 0x00, 0x00}},
    };
}

void registerLanHandlers(Bmc& bmc) {
    bmc.on(netfn::app, cmd::getChannelInfo, getChannelInfo);
    bmc.on(netfn::transport, cmd::getLanConfigParameters, getLanConfigParameters);
}

}  // namespace Sim
