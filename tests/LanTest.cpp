#include <list>
#include <string>
#include <vector>

#include "IpmiLan.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

using Bytes = std::vector<uint8_t>;
using Sim::LanChannelModel;

class Lan : public TestSupport::SimTest {
protected:
    IpmiLan& lan() { return *IpmiIfc::getLan(0); }
    unsigned channelProbes() { return sim().exchanges(netfn::app, cmd::getChannelInfo); }
    unsigned parameterReads() { return sim().exchanges(netfn::transport, cmd::getLanConfigParameters); }
};

TEST_F(Lan, PlainControllerSettings) {
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    EXPECT_EQ(lan().getChannel(), 1);
    EXPECT_TRUE(lan().isEnabled());
    EXPECT_EQ(lan().getIPv4Address(), "192.168.1.10");
    EXPECT_EQ(lan().getAddressOrigin(), 1);
    EXPECT_EQ(lan().getIPv4Netmask(), "255.255.255.0");
    EXPECT_EQ(lan().getIPv4DefaultGateway(), "192.168.1.1");
    EXPECT_EQ(lan().getMACAddress(), "00:14:22:0a:1b:2c");
    EXPECT_TRUE(lan().getIPv6Addresses().empty());
    std::vector<Bytes> reads;
    for (const auto& r : sim().requests())
        if (r.cmd == cmd::getLanConfigParameters) reads.push_back(r.data);
    EXPECT_EQ(reads, (std::vector<Bytes>{{1, 3, 0, 0}, {1, 4, 0, 0}, {1, 5, 0, 0}, {1, 6, 0, 0}, {1, 12, 0, 0},
                                         {0, 0x38, 0, 0}}));
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u);
    lan().IpmiIfcLanInstantiate(0);
    EXPECT_EQ(channelProbes(), 1u);  // the channel is found once
}

// 0xCC is how a controller says a channel does not exist: not an error.
TEST_F(Lan, ChannelIsTheFirstLanMedium) {
    bmc().lan.channels = {LanChannelModel{2, channelMedium::lan8023, 1, 0x80}};
    lan().initChannelNumber(0);
    EXPECT_EQ(lan().getChannel(), 2);
    EXPECT_EQ(channelProbes(), 2u);
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), 0);  // read on channel 2
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u) << log.dump();

    const LanChannelModel serial{3, channelMedium::asyncSerial, 1, 0x80};
    bmc().lan.channels = {serial, LanChannelModel{5, channelMedium::otherLan, 1, 0x80}};
    lan().initChannelNumber(0);
    EXPECT_EQ(lan().getChannel(), 5);
    bmc().lan.channels = {serial};
    sim().addFault(netfn::app, cmd::getChannelInfo, Sim::Fault::completionCode(cc::nodeBusy));
    lan().initChannelNumber(0);
    EXPECT_EQ(lan().getChannel(), 1);  // no LAN channel
    EXPECT_TRUE(log.contains(LOG_ERR, "initChannelNumber: Get Channel 1 Info failed: cc=0xc0"));
}

// A failed read keeps the value read before; a missing netmask or gateway ends the refresh.
TEST_F(Lan, FailedReadsKeepTheValuesReadBefore) {
    ASSERT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    bmc().lan.parameters[lanParam::ipAddress] = {10, 0, 0, 5};
    bmc().lan.parameters[lanParam::defaultGatewayAddress] = {10, 0, 0, 1};
    sim().addFault(netfn::transport, cmd::getLanConfigParameters, Sim::Fault::completionCode(cc::nodeBusy));
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    EXPECT_EQ(lan().getIPv4Address(), "192.168.1.10");
    EXPECT_FALSE(lan().isEnabled());  // follows the last address read
    EXPECT_EQ(lan().getIPv4DefaultGateway(), "10.0.0.1");

    bmc().lan.parameters[lanParam::defaultGatewayAddress] = {10, 0, 0, 254};
    sim().addFault(netfn::transport, cmd::getLanConfigParameters, Sim::Fault::completionCode(cc::nodeBusy, 4));
    sim().resetCounters();
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), -1);
    EXPECT_EQ(parameterReads(), 4u);  // stops at the netmask
    EXPECT_EQ(lan().getIPv4DefaultGateway(), "10.0.0.1");
    EXPECT_EQ(lan().getIPv4Netmask(), "255.255.255.0");
}

// The list is never emptied: every refresh appends the address again. Byte
// 20 (the prefix length on the wire) is read as the address state.
TEST_F(Lan, Ipv6AddressesAreAppendedOnEveryRefresh) {
    Sim::LanIpv6StaticAddress a;
    const uint8_t address[16] = {0x20, 0x01, 0x0d, 0xb8, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0x10};
    std::copy(address, address + 16, a.address);
    a.prefixLength = 0;  // read as state 0: active
    bmc().lan.ipv6StaticAddresses = {a};
    bmc().lan.answersOnChannelZero = true;
    for (int i = 0; i < 3; ++i) ASSERT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    const std::string expected = "00:80:20:01:0d:b8:00:00";  // set selector and source come first
    EXPECT_EQ(lan().getIPv6Addresses(), (std::list<std::string>{expected, expected, expected}));

    bmc().lan.ipv6StaticAddresses[0].prefixLength = 64;
    lan().IpmiIfcLanInstantiate(0);
    EXPECT_EQ(lan().getIPv6Addresses().size(), 3u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "load_v6_addresses: Ignore BMC V6 IP addr, not active, state=64"));
}

// The error of a failed IPv6 read sits behind a rate limiter that never fires.
TEST_F(Lan, ControllerWithoutIpv6NeverLogsAboutIt) {
    bmc().lan.answersOnChannelZero = true;  // answers 0x80: no IPv6 parameters
    for (int i = 0; i < 600; ++i) lan().load_v6_addresses(0);
    EXPECT_EQ(parameterReads(), 600u);
    EXPECT_EQ(log.lines().size(), 0u) << log.dump();
}

}  // namespace
