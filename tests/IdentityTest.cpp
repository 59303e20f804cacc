#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "TestSupport.h"

using namespace Ipmi;

namespace {

using Bytes = std::vector<uint8_t>;

class Identity : public TestSupport::SimTest {
protected:
    std::vector<Sim::Request> requestsOf(uint8_t netfnValue, uint8_t cmdValue) {
        std::vector<Sim::Request> out;
        for (const auto& r : sim().requests())
            if (r.netfn == netfnValue && r.cmd == cmdValue) out.push_back(r);
        return out;
    }
    std::vector<Sim::Request> osNameReads() {
        std::vector<Sim::Request> out;
        for (const auto& r : requestsOf(netfn::app, cmd::getSystemInfoParameters))
            if (r.data.size() == 4 && r.data[1] == sysInfoParam::osName) out.push_back(r);
        return out;
    }
    std::vector<Sim::Request> setBlocks() { return requestsOf(netfn::app, cmd::setSystemInfoParameters); }
};

// Calls that open the device themselves start with it closed.
class IdentityOwnDevice : public Identity {
protected:
    IdentityOwnDevice() { openDevice = false; }
};

TEST_F(Identity, StartupCommandsGoOutInOrderWithoutSelInfo) {
    IpmiIfcDataGet(7);
    auto all = sim().requests();
    auto firstIndex = [&](uint8_t nf, uint8_t c, const Bytes& data) {
        for (size_t i = 0; i < all.size(); ++i)
            if (all[i].netfn == nf && all[i].cmd == c && all[i].data == data) return static_cast<int>(i);
        return -1;
    };
    std::vector<int> order = {
        firstIndex(netfn::app, cmd::getDeviceId, {}),
        firstIndex(netfn::app, cmd::getSystemInfoParameters, {0, 4, 0, 0}),
        firstIndex(netfn::app, cmd::getSystemInfoParameters, {0, 5, 0, 0}),
        firstIndex(netfn::app, cmd::getSelfTestResults, {}),
        firstIndex(netfn::storage, cmd::getSdrRepositoryInfo, {}),
        firstIndex(netfn::storage, cmd::getSelAllocationInfo, {}),
    };
    EXPECT_EQ(order.front(), 0);
    EXPECT_TRUE(std::is_sorted(order.begin(), order.end())) << ::testing::PrintToString(order);
    EXPECT_EQ(std::count(order.begin(), order.end(), -1), 0);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSelInfo), 0u);
    EXPECT_EQ(Bytes(node().selfTest, node().selfTest + 3), (Bytes{0x00, 0x55, 0x00}));
}

TEST_F(Identity, DeviceIdAnswerIsKeptAndAnnounced) {
    IpmiIfcDataGet(1);
    EXPECT_TRUE(log.contains(LOG_CRIT, "IpmiIfcRhGetDeviceId: BMC mfg is Dell Inc. FW: 2.10"));
    EXPECT_EQ(IpmiIfc::GetBmcManufacturer(), "Dell Inc.");
    EXPECT_EQ(IpmiIfc::GetBmcFWVersion(), "2.10");
    EXPECT_EQ(IpmiIfc::GetBmcIpmiVersion(), "2.0");
    EXPECT_FALSE(IpmiIfc::hpe_bmc);

    unsigned char id[3] = {0, 0, 0};
    unsigned char count = 0;
    ASSERT_EQ(IpmiIfc::getManufacturerId(id, count), 0);
    EXPECT_EQ(Bytes(id, id + 3), (Bytes{0xA2, 0x02, 0x00}));
    EXPECT_EQ(count, 1);

    ipmiifc_device_id info;
    ASSERT_EQ(IpmiIfc::getManagementControllerInfo(3, info), 0);
    EXPECT_EQ(info.device_id, 0x20);
    EXPECT_EQ(info.product_id[0] | (info.product_id[1] << 8), 0x0100);
}

TEST_F(Identity, VersionStringsFollowTheirOwnRules) {
    bmc().identity.fwMajor = 0x45;  // bit 6 is masked away
    bmc().identity.fwMinor = 0x05;
    bmc().identity.ipmiVersion = 0x51;
    IpmiIfcDataGet(1);
    EXPECT_EQ(IpmiIfc::GetBmcFWVersion(), "5.5");
    EXPECT_EQ(IpmiIfc::GetBmcIpmiVersion(), "1.5");
}

TEST_F(Identity, BeforeAnyAnswerQueriesReportZeros) {
    EXPECT_EQ(IpmiIfc::GetBmcFWVersion(), "0.0");
    EXPECT_EQ(IpmiIfc::GetBmcIpmiVersion(), "0.0");
    EXPECT_EQ(IpmiIfc::GetBmcManufacturer(), "Unknown");
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::completionCode(cc::nodeBusy));
    IpmiIfcDataGet(1);
    EXPECT_EQ(IpmiIfc::GetBmcManufacturer(), "Unknown");
    EXPECT_EQ(log.countAtPriority(LOG_CRIT), 0u);
}

TEST_F(Identity, HewlettControllerIsFlagged) {
    bmc().identity.manufacturerId = 11;
    IpmiIfcDataGet(1);
    EXPECT_EQ(IpmiIfc::GetBmcManufacturer(), "Hewlett-Packard");
    EXPECT_TRUE(IpmiIfc::hpe_bmc);
}

TEST(IdentityNames, ManufacturerTable) {
    EXPECT_STREQ(IpmiIfc::getManufacturerName(674), "Dell Inc.");
    EXPECT_STREQ(IpmiIfc::getManufacturerName(12345), "Unknown");
    EXPECT_STREQ(IpmiIfc::getManufacturerName(0), "Unknown");
    EXPECT_STREQ(IpmiIfc::getManufacturerName(20974), "American Megatrends, Inc");
    EXPECT_STREQ(IpmiIfc::getManufacturerName(19046), "Lenovo Group");
    EXPECT_STREQ(IpmiIfc::getManufacturerName(10876), "Super Micro Computer Inc.");
}

TEST(IdentityNames, GeneratorIdPacksAddressLunAndChannel) {
    EXPECT_EQ(IpmiIfc::convertToGeneratorId(0x20, 0, 0), 0x0020);
    EXPECT_EQ(IpmiIfc::convertToGeneratorId(0x20, 1, 2), 0x1220);
    EXPECT_EQ(IpmiIfc::convertToGeneratorId(0x1FF, 0x1F, 7), 0xF3FF);
}

TEST_F(Identity, OsNameOfFourteenBytesIsOneBlock) {
    bmc().setSystemInfoString(sysInfoParam::osName, "Ubuntu 22.04.3");
    IpmiIfcDataGet(2);
    EXPECT_EQ(osNameReads().size(), 1u);
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSName(), "Ubuntu 22.04.3");
}

// The string keeps the block's fill bytes and the later block's set selector,
// both as spaces.
TEST_F(Identity, OsNameOfFifteenBytesIsTwoBlocks) {
    bmc().setSystemInfoString(sysInfoParam::osName, "Ubuntu 22.04.3X");
    IpmiIfcDataGet(2);
    auto reads = osNameReads();
    ASSERT_EQ(reads.size(), 2u);
    EXPECT_EQ(reads[1].data, (Bytes{0, 4, 1, 0}));
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSName(), "Ubuntu 22.04.3 X" + std::string(15, ' '));
}

TEST_F(Identity, OtherEncodingsAlwaysReadFourBlocks) {
    bmc().setSystemInfoString(sysInfoParam::osName, "Linux", 1);
    IpmiIfcDataGet(2);
    EXPECT_EQ(osNameReads().size(), 4u);
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSName(), "Linux" + std::string(9 + 3 * 17, ' '));
}

TEST_F(Identity, NonPrintableBytesBecomeSpaces) {
    bmc().setSystemInfoString(sysInfoParam::osVersion, "6.1\t\x01\x80x");
    IpmiIfcDataGet(3);
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSVersion(), "6.1   x" + std::string(7, ' '));
}

TEST_F(Identity, OsStringFailuresAreLoggedAndLeaveTheStringsEmpty) {
    IpmiIfcDataGet(3);  // the plain controller has neither parameter
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcRhGetOS_Name: BMC does not support OS Names retrieval"));
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcRhGetOS_Version: BMC does not support OS Versions retrieval"));
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSName(), "");

    bmc().setSystemInfoString(sysInfoParam::osName, "Linux");
    bmc().setSystemInfoString(sysInfoParam::osVersion, "6.1");
    sim().addFault(netfn::app, cmd::getSystemInfoParameters, Sim::Fault::completionCode(cc::invalidCommand));
    sim().addFault(netfn::app, cmd::getSystemInfoParameters,
                   Sim::Fault::answerLength(Sim::FaultKind::CutAnswer, 5));
    IpmiIfcDataGet(3);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcRhGetOS_Name: retrieve os_name failed cc=0xc1"));
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcRhGetOS_Version: retrieve os_version failed short buffer read (5)"));
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSName(), "");
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSVersion(), "");
}

TEST_F(Identity, MissingLaterBlockKeepsThePreviousName) {
    bmc().setSystemInfoString(sysInfoParam::osName, "Debian");
    IpmiIfcDataGet(2);
    ASSERT_EQ(IpmiIfc::GetBmcReportedOSName(), "Debian" + std::string(8, ' '));

    bmc().setSystemInfoString(sysInfoParam::osName, "Debian GNU/Linux 12 (bookworm)");
    uint8_t request[4] = {0, sysInfoParam::osName, 0, 0};
    RespHolder first(IpmiIfcSendCmd(0, cmd::getSystemInfoParameters, netfn::app, 0, 4, request, 0));
    ASSERT_TRUE(first);
    sim().addFault(netfn::app, cmd::getSystemInfoParameters, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    EXPECT_EQ(IpmiIfcRhGetOS_Name(first.get()), -1);
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSName(), "Debian" + std::string(8, ' '));
}

const std::string kThirtyOne = "abcdefghijklmnopqrstuvwxyz01234";

TEST_F(Identity, ThirtyBytesAreTwoFullBlocks) {
    const std::string value = kThirtyOne.substr(0, 30);
    const uint32_t idsBefore = node().msgCounter;
    unsigned char code = 0;
    EXPECT_TRUE(set_bmc_prop(value.data(), 30, sysInfoParam::osName, &code));
    auto blocks = setBlocks();
    ASSERT_EQ(blocks.size(), 2u);
    Bytes first{4, 0, 0, 30};
    first.insert(first.end(), value.begin(), value.begin() + 14);
    Bytes second{4, 1};
    second.insert(second.end(), value.begin() + 14, value.end());
    EXPECT_EQ(blocks[0].data, first);
    EXPECT_EQ(blocks[1].data, second);
    EXPECT_EQ(node().msgCounter - idsBefore, 4u);  // two message ids per block
    EXPECT_EQ(bmc().systemInfoString(sysInfoParam::osName), value);
}

// The last block is sent whole: behind its one new byte come 15 bytes left
// over from the block before.
TEST_F(Identity, ThirtyOneBytesSendALeftoverThirdBlock) {
    unsigned char code = 0;
    EXPECT_TRUE(set_bmc_prop(kThirtyOne.data(), 31, sysInfoParam::osName, &code));
    auto blocks = setBlocks();
    ASSERT_EQ(blocks.size(), 3u);
    Bytes third{4, 2, '4'};
    third.insert(third.end(), kThirtyOne.begin() + 15, kThirtyOne.begin() + 30);
    EXPECT_EQ(blocks[2].data, third);
    EXPECT_EQ(bmc().systemInfoString(sysInfoParam::osName), kThirtyOne);
}

TEST_F(Identity, EmptyPropertyIsNotSent) {
    unsigned char code = 0;
    EXPECT_TRUE(set_bmc_prop("", 0, sysInfoParam::osName, &code));
    EXPECT_TRUE(setBlocks().empty());
}

TEST_F(Identity, FailedBlockDoesNotStopTheRest) {
    sim().addFault(netfn::app, cmd::setSystemInfoParameters, Sim::Fault::completionCode(cc::invalidCommand));
    sim().addFault(netfn::app, cmd::setSystemInfoParameters, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    unsigned char code = 0;
    EXPECT_FALSE(set_bmc_prop(kThirtyOne.data(), 31, sysInfoParam::osVersion, &code));
    EXPECT_EQ(setBlocks().size(), 3u);
    EXPECT_EQ(code, cc::invalidCommand);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "set_bmc_prop: set bmc prop=5/" + kThirtyOne + " failed cc=0xc1"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "set_bmc_prop: No response to prop=5, val='" + kThirtyOne + "'"));
}

TEST_F(IdentityOwnDevice, SetOsInfoWritesVersionThenName) {
    EXPECT_TRUE(IpmiIfc::SetOSInfo("Ubuntu", "22.04"));
    EXPECT_TRUE(log.contains(LOG_INFO, "SetOSInfo: seting bmc osname='Ubuntu', version='22.04'"));
    auto blocks = setBlocks();
    ASSERT_EQ(blocks.size(), 2u);
    EXPECT_EQ(blocks[0].data[0], sysInfoParam::osVersion);
    EXPECT_EQ(blocks[1].data[0], sysInfoParam::osName);
    EXPECT_EQ(bmc().systemInfoString(sysInfoParam::osName), "Ubuntu");
    EXPECT_EQ(bmc().systemInfoString(sysInfoParam::osVersion), "22.04");
    EXPECT_NE(node().fd, -1);  // left open
}

TEST_F(IdentityOwnDevice, VersionGoesBehindTheNameWhenTheControllerHasNoVersionParameter) {
    sim().addFault(netfn::app, cmd::setSystemInfoParameters, Sim::Fault::completionCode(cc::parameterNotSupported));
    EXPECT_TRUE(IpmiIfc::SetOSInfo("Ubuntu", "22.04"));
    EXPECT_EQ(bmc().systemInfoString(sysInfoParam::osName), "Ubuntu 22.04");
}

TEST_F(IdentityOwnDevice, FailedVersionWithoutNameFails) {
    sim().addFault(netfn::app, cmd::setSystemInfoParameters, Sim::Fault::completionCode(cc::parameterNotSupported));
    EXPECT_FALSE(IpmiIfc::SetOSInfo("", "22.04"));
}

TEST_F(IdentityOwnDevice, NetworkingQueryOpensAndClosesTheDevice) {
    bmc().setSystemInfoString(sysInfoParam::osName, "Linux");
    IpmiLan* lan = IpmiIfc::GetBMCNetworking();
    EXPECT_EQ(lan, IpmiIfc::getLan(0));
    EXPECT_EQ(lan->getIPv4Address(), "192.168.1.10");
    EXPECT_EQ(IpmiIfc::GetBmcManufacturer(), "Dell Inc.");
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSName(), "Linux" + std::string(9, ' '));
    EXPECT_EQ(sim().exchanges(netfn::app, cmd::getSelfTestResults), 0u);
    EXPECT_EQ(node().fd, -1);
}

TEST_F(Identity, ChassisIdentifyRequests) {
    EXPECT_EQ(IpmiIfc::identifyChassis(0, 0, 1), 0);
    EXPECT_EQ(IpmiIfc::identifyChassis(15, 0), 0);
    auto sent = requestsOf(netfn::chassis, cmd::chassisIdentify);
    ASSERT_EQ(sent.size(), 2u);
    EXPECT_EQ(sent[0].data, (Bytes{0x00, 0x01}));
    EXPECT_EQ(sent[1].data, (Bytes{0x0F, 0x00}));
    EXPECT_EQ(bmc().identifyInterval, 15);
}

TEST_F(Identity, ChassisIdentifyResults) {
    sim().addFault(netfn::chassis, cmd::chassisIdentify, Sim::Fault::completionCode(cc::invalidCommand));
    EXPECT_EQ(IpmiIfc::identifyChassis(0, 5, 0), 1);
    sim().addFault(netfn::chassis, cmd::chassisIdentify, Sim::Fault::completionCode(cc::illegalForSensorType));
    EXPECT_EQ(IpmiIfc::identifyChassis(0, 5, 0), 1);
    sim().addFault(netfn::chassis, cmd::chassisIdentify, Sim::Fault::completionCode(cc::nodeBusy));
    EXPECT_EQ(IpmiIfc::identifyChassis(0, 5, 0), cc::nodeBusy);
    sim().addFault(netfn::chassis, cmd::chassisIdentify, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    EXPECT_EQ(IpmiIfc::identifyChassis(0, 5, 0), 255);
}

}  // namespace
