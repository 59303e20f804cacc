#include <gtest/gtest.h>

#include <list>
#include <string>
#include <vector>

#include "IpmiLan.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

using Bytes = std::vector<uint8_t>;
using Sim::LanChannelModel;
using Sim::LanIpv6StaticAddress;

class Lan : public TestSupport::SimTest {
protected:
    IpmiLan& lan() { return *IpmiIfc::getLan(0); }

    // The channel probes and parameter reads, in the order sent.
    std::vector<Bytes> lanRequests() {
        std::vector<Bytes> out;
        for (const auto& r : sim().requests()) {
            if (r.netfn == netfn::app && r.cmd == cmd::getChannelInfo) out.push_back(Bytes{0xC1, r.data.at(0)});
            if (r.netfn == netfn::transport && r.cmd == cmd::getLanConfigParameters) out.push_back(r.data);
        }
        return out;
    }
    size_t linesWith(const std::string& part) const {
        size_t n = 0;
        for (const auto& l : log.lines())
            if (l.text.find(part) != std::string::npos) ++n;
        return n;
    }
    void giveIpv6Address(uint8_t prefixLength) {
        LanIpv6StaticAddress a;
        const uint8_t address[16] = {0x20, 0x01, 0x0d, 0xb8, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0x10};
        std::copy(address, address + 16, a.address);
        a.prefixLength = prefixLength;
        bmc().lan.ipv6StaticAddresses = {a};
        bmc().lan.answersOnChannelZero = true;
    }
};

TEST_F(Lan, PlainControllerSettings) {
    EXPECT_EQ(lan().getChannel(), 0);
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    EXPECT_EQ(lan().getChannel(), 1);
    EXPECT_TRUE(lan().isEnabled());
    EXPECT_EQ(lan().getIPv4Address(), "192.168.1.10");
    EXPECT_EQ(lan().getAddressOrigin(), 1);
    EXPECT_EQ(lan().getIPv4Netmask(), "255.255.255.0");
    EXPECT_EQ(lan().getIPv4DefaultGateway(), "192.168.1.1");
    EXPECT_EQ(lan().getMACAddress(), "00:14:22:0a:1b:2c");
    EXPECT_TRUE(lan().getIPv6Addresses().empty());

    EXPECT_EQ(lanRequests(), (std::vector<Bytes>{{0xC1, 1},
                                                 {1, 3, 0, 0},
                                                 {1, 4, 0, 0},
                                                 {1, 5, 0, 0},
                                                 {1, 6, 0, 0},
                                                 {1, 12, 0, 0},
                                                 {0, 0x38, 0, 0}}));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "initChannelNumber: BMC Channel 1, Medium: 4"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcLanInstantiate: BMC IP Address 192.168.1.10"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcLanInstantiate: BMC MAC address 00:14:22:0a:1b:2c"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcLanInstantiate: BMC Netmask 255.255.255.0"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcLanInstantiate: BMC Netmask 192.168.1.1"));  // the gateway
    EXPECT_EQ(linesWith("load_v6_addresses"), 0u);
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u);

    // The channel is found once.
    sim().resetCounters();
    lan().IpmiIfcLanInstantiate(0);
    EXPECT_EQ(sim().exchanges(netfn::app, cmd::getChannelInfo), 0u);
}

TEST_F(Lan, ChannelIsFoundBehindMissingOnes) {
    bmc().lan.channels = {LanChannelModel{2, channelMedium::lan8023, 1, 0x80}};
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    EXPECT_EQ(lan().getChannel(), 2);
    EXPECT_EQ(sim().exchanges(netfn::app, cmd::getChannelInfo), 2u);
    EXPECT_EQ(lanRequests().at(2), (Bytes{2, 3, 0, 0}));
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u) << log.dump();
}

TEST_F(Lan, OtherLanMediumCounts) {
    bmc().lan.channels = {LanChannelModel{3, channelMedium::asyncSerial, 1, 0x80},
                          LanChannelModel{5, channelMedium::otherLan, 1, 0x80}};
    lan().initChannelNumber(0);
    EXPECT_EQ(lan().getChannel(), 5);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "initChannelNumber: BMC Channel 3, Medium: 5"));
}

TEST_F(Lan, WithoutLanChannelChannelOneIsAssumed) {
    bmc().lan.channels = {LanChannelModel{3, channelMedium::asyncSerial, 1, 0x80}};
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), -1);
    EXPECT_EQ(lan().getChannel(), 1);
    EXPECT_EQ(sim().exchanges(netfn::app, cmd::getChannelInfo), 7u);
    EXPECT_FALSE(lan().isEnabled());
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcLanInstantiate: Get IP addr failed: cc=0xcc"));
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcLanInstantiate: Get IP addr Source failed: cc=0xcc"));
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcLanInstantiate: Get MAC address failed: cc=0xcc"));
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcLanInstantiate: Get netmask failed: cc=0xcc"));
    EXPECT_EQ(sim().exchanges(netfn::transport, cmd::getLanConfigParameters), 4u);  // stops at the netmask
}

TEST_F(Lan, ChannelProbeFailuresOtherThanMissingAreLogged) {
    sim().addFault(netfn::app, cmd::getChannelInfo, Sim::Fault::completionCode(cc::nodeBusy));
    sim().addFault(netfn::app, cmd::getChannelInfo, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    bmc().lan.channels = {LanChannelModel{3, channelMedium::lan8023, 1, 0x80}};
    lan().initChannelNumber(0);
    EXPECT_EQ(lan().getChannel(), 3);
    EXPECT_TRUE(log.contains(LOG_ERR, "initChannelNumber: Get Channel 1 Info failed: cc=0xc0"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "initChannelNumber: Get Channel 2 Info - NULL response"));
}

TEST_F(Lan, FailedReadsKeepTheValuesReadBefore) {
    ASSERT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    bmc().lan.parameters[lanParam::ipAddress] = {10, 0, 0, 5};
    bmc().lan.parameters[lanParam::defaultGatewayAddress] = {10, 0, 0, 1};

    sim().addFault(netfn::transport, cmd::getLanConfigParameters, Sim::Fault::completionCode(cc::nodeBusy));
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    EXPECT_EQ(lan().getIPv4Address(), "192.168.1.10");
    EXPECT_FALSE(lan().isEnabled());  // follows the last address read
    EXPECT_EQ(lan().getIPv4DefaultGateway(), "10.0.0.1");
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcLanInstantiate: Get IP addr failed: cc=0xc0"));

    // A missing netmask ends the refresh: the gateway is not read.
    bmc().lan.parameters[lanParam::defaultGatewayAddress] = {10, 0, 0, 254};
    sim().addFault(netfn::transport, cmd::getLanConfigParameters, Sim::Fault::completionCode(cc::nodeBusy, 4));
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), -1);
    EXPECT_EQ(lan().getIPv4DefaultGateway(), "10.0.0.1");
    EXPECT_EQ(lan().getIPv4Netmask(), "255.255.255.0");

    ASSERT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    EXPECT_TRUE(lan().isEnabled());
    EXPECT_EQ(lan().getIPv4Address(), "10.0.0.5");
    EXPECT_EQ(lan().getIPv4DefaultGateway(), "10.0.0.254");
}

TEST_F(Lan, UnansweredAddressReadIsOnlyDebugged) {
    sim().addFault(netfn::transport, cmd::getLanConfigParameters, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    EXPECT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    EXPECT_FALSE(lan().isEnabled());
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcLanInstantiate: Get IP addr - NULL response"));
}

// The list is never emptied: every refresh appends the address again.
TEST_F(Lan, EachRefreshAppendsTheIpv6AddressAgain) {
    giveIpv6Address(0);
    for (int i = 0; i < 3; ++i) ASSERT_EQ(lan().IpmiIfcLanInstantiate(0), 0);
    // Set selector and address source come first, then six address bytes.
    const std::string expected = "00:80:20:01:0d:b8:00:00";
    EXPECT_EQ(lan().getIPv6Addresses(), (std::list<std::string>{expected, expected, expected}));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "load_v6_addresses: loaded 3 ipv6 addresses"));
}

// Byte 20 is the prefix length on the wire; it is read as the address state.
TEST_F(Lan, Ipv6AddressWithNonZeroStateByteIsIgnored) {
    giveIpv6Address(64);
    lan().IpmiIfcLanInstantiate(0);
    EXPECT_TRUE(lan().getIPv6Addresses().empty());
    EXPECT_TRUE(log.contains(LOG_WARNING, "load_v6_addresses: Ignore BMC V6 IP addr, not active, state=64"));
}

TEST_F(Lan, ControllerWithoutIpv6NeverLogsAboutIt) {
    bmc().lan.answersOnChannelZero = true;  // answers 0x80: no IPv6 parameters
    for (int i = 0; i < 600; ++i) lan().load_v6_addresses(0);
    EXPECT_EQ(sim().exchanges(netfn::transport, cmd::getLanConfigParameters), 600u);
    EXPECT_EQ(log.lines().size(), 0u) << log.dump();
}

}  // namespace
