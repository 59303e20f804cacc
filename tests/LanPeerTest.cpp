// ipmitool, run against the same simulated controller through the preload
// library, must show the LAN settings that the library reads.

#include <gtest/gtest.h>

#include <map>
#include <string>

#include "IpmiLan.h"
#include "PeerTools.h"
#include "TestSupport.h"

using namespace Ipmi;
using namespace TestSupport;

namespace {

class LanPeer : public SimTest {
protected:
    void SetUp() override {
        SKIP_WITHOUT_TOOL("ipmitool");
        SimTest::SetUp();
        useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
    }
    std::map<std::string, std::string> ipmitool(std::vector<std::string> args) {
        args.insert(args.begin(), {"-I", "open"});
        return fields(runTool("default", toolPath("ipmitool"), args).out);
    }
};

TEST_F(LanPeer, IpmitoolShowsTheSettingsTheLibraryReads) {
    IpmiLan& lan = *IpmiIfc::getLan(0);
    ASSERT_EQ(lan.IpmiIfcLanInstantiate(0), 0);
    auto f = ipmitool({"lan", "print", std::to_string(lan.getChannel())});
    ASSERT_TRUE(f.count("IP Address"));
    EXPECT_EQ(f["IP Address"], lan.getIPv4Address());
    EXPECT_EQ(f["Subnet Mask"], lan.getIPv4Netmask());
    EXPECT_EQ(f["Default Gateway IP"], lan.getIPv4DefaultGateway());
    EXPECT_EQ(f["MAC Address"], lan.getMACAddress());
    const std::map<int, std::string> sources = {
        {0, "Unspecified"}, {1, "Static Address"}, {2, "DHCP Address"}, {3, "BIOS Assigned Address"}, {4, "Other"}};
    ASSERT_TRUE(sources.count(lan.getAddressOrigin()));
    EXPECT_EQ(f["IP Address Source"], sources.at(lan.getAddressOrigin()));

    // The channel the library found is the controller's LAN channel.
    auto channel = ipmitool({"channel", "info", std::to_string(lan.getChannel())});
    EXPECT_EQ(channel["Channel Medium Type"], "802.3 LAN");
    EXPECT_EQ(channel["Channel Protocol Type"], "IPMB-1.0");
}

}  // namespace
