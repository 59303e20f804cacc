// ipmitool, run against the same simulated controller through the preload
// library, must show the LAN settings that the library reads.

#include <gtest/gtest.h>

#include <stdio.h>
#include <stdlib.h>
#include <sys/wait.h>

#include <map>
#include <string>

#include "IpmiLan.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

bool ipmitoolInstalled() { return system("command -v ipmitool >/dev/null 2>&1") == 0; }

// Runs ipmitool with the simulator's default profile behind its /dev/ipmi0.
std::string ipmitool(const std::string& args) {
    std::string command = "env LD_PRELOAD=" + std::string(TAV_IPMI_PRELOAD_LIB) +
                          " TAV_IPMI_SIM_PROFILE=default ipmitool -I open " + args + " 2>&1";
    std::string out;
    FILE* p = popen(command.c_str(), "r");
    if (p == nullptr) return out;
    char buffer[256];
    while (fgets(buffer, sizeof buffer, p)) out += buffer;
    pclose(p);
    return out;
}

// "Name      : value" lines of ipmitool's output; the first of each name.
std::map<std::string, std::string> fields(const std::string& text) {
    std::map<std::string, std::string> out;
    size_t start = 0;
    while (start < text.size()) {
        size_t end = text.find('\n', start);
        if (end == std::string::npos) end = text.size();
        std::string line = text.substr(start, end - start);
        start = end + 1;
        size_t colon = line.find(" : ");
        if (colon == std::string::npos) continue;
        auto trim = [](std::string s) {
            size_t b = s.find_first_not_of(' ');
            size_t e = s.find_last_not_of(' ');
            return b == std::string::npos ? std::string() : s.substr(b, e - b + 1);
        };
        std::string name = trim(line.substr(0, colon));
        if (!name.empty() && out.count(name) == 0) out[name] = trim(line.substr(colon + 3));
    }
    return out;
}

class LanPeer : public TestSupport::SimTest {
protected:
    void SetUp() override {
        if (!ipmitoolInstalled()) GTEST_SKIP() << "ipmitool is not installed";
        SimTest::SetUp();
        useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
    }
};

TEST_F(LanPeer, IpmitoolShowsTheSettingsTheLibraryReads) {
    IpmiLan& lan = *IpmiIfc::getLan(0);
    ASSERT_EQ(lan.IpmiIfcLanInstantiate(0), 0);
    const std::string output = ipmitool("lan print " + std::to_string(lan.getChannel()));
    auto f = fields(output);
    ASSERT_TRUE(f.count("IP Address")) << output;
    EXPECT_EQ(f["IP Address"], lan.getIPv4Address());
    EXPECT_EQ(f["Subnet Mask"], lan.getIPv4Netmask());
    EXPECT_EQ(f["Default Gateway IP"], lan.getIPv4DefaultGateway());
    EXPECT_EQ(f["MAC Address"], lan.getMACAddress());
    const std::map<int, std::string> sources = {
        {0, "Unspecified"}, {1, "Static Address"}, {2, "DHCP Address"}, {3, "BIOS Assigned Address"}, {4, "Other"}};
    ASSERT_TRUE(sources.count(lan.getAddressOrigin()));
    EXPECT_EQ(f["IP Address Source"], sources.at(lan.getAddressOrigin()));
}

TEST_F(LanPeer, IpmitoolReadsTheChannelTheLibraryFound) {
    IpmiLan& lan = *IpmiIfc::getLan(0);
    lan.initChannelNumber(0);
    const std::string output = ipmitool("channel info " + std::to_string(lan.getChannel()));
    auto f = fields(output);
    EXPECT_EQ(f["Channel Medium Type"], "802.3 LAN") << output;
    EXPECT_EQ(f["Channel Protocol Type"], "IPMB-1.0");
    EXPECT_EQ(f["Session Support"], "multi-session");
    EXPECT_EQ(f["Protocol Vendor ID"].substr(0, 4), "7154");
}

}  // namespace
