#include <string>
#include <vector>

#include "TestSupport.h"

using namespace Ipmi;

namespace {

using Bytes = std::vector<uint8_t>;

Bytes concat(Bytes head, const std::string& tail) {
    head.insert(head.end(), tail.begin(), tail.end());
    return head;
}

class Identity : public TestSupport::SimTest {
protected:
    std::vector<Bytes> sent(uint8_t netfnValue, uint8_t command, int parameter = -1) {
        std::vector<Bytes> out;
        for (const auto& r : sim().requests())
            if (r.netfn == netfnValue && r.cmd == command && (parameter < 0 || r.data.at(1) == parameter))
                out.push_back(r.data);
        return out;
    }
    std::vector<Bytes> setBlocks() { return sent(netfn::app, cmd::setSystemInfoParameters); }
    bool setProp(const std::string& value, uint8_t parameter, unsigned char* code) {
        return set_bmc_prop(value.data(), static_cast<unsigned>(value.size()), parameter, code);
    }
};

TEST_F(Identity, StartupCommandsGoOutInOrderWithoutSelInfo) {
    IpmiIfcDataGet(7);
    std::vector<std::pair<int, int>> oneShot;
    for (const auto& r : sim().requests())
        if (r.netfn == netfn::app || (r.netfn == netfn::storage && (r.cmd == cmd::getSdrRepositoryInfo ||
                                                                    r.cmd == cmd::getSelAllocationInfo ||
                                                                    r.cmd == cmd::getSelInfo)))
            oneShot.emplace_back(r.cmd, r.data.size() > 1 ? r.data[1] : -1);
    EXPECT_EQ(oneShot, (std::vector<std::pair<int, int>>{{cmd::getDeviceId, -1},
                                                         {cmd::getSystemInfoParameters, sysInfoParam::osName},
                                                         {cmd::getSystemInfoParameters, sysInfoParam::osVersion},
                                                         {cmd::getSelfTestResults, -1},
                                                         {cmd::getSdrRepositoryInfo, -1},
                                                         {cmd::getSelAllocationInfo, -1}}));
    EXPECT_EQ(Bytes(node().selfTest, node().selfTest + 3), (Bytes{0x00, 0x55, 0x00}));
}

TEST_F(Identity, QueriesAnswerFromTheStoredDeviceId) {
    EXPECT_EQ(IpmiIfc::GetBmcFWVersion(), "0.0");  // nothing stored yet
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::completionCode(cc::nodeBusy));
    IpmiIfcDataGet(1);
    EXPECT_EQ(IpmiIfc::GetBmcManufacturer(), "Unknown");  // an error answer is not stored

    IpmiIfcDataGet(1);
    EXPECT_TRUE(log.contains(LOG_CRIT, "IpmiIfcRhGetDeviceId: BMC mfg is Dell Inc. FW: 2.10"));
    EXPECT_EQ(IpmiIfc::GetBmcManufacturer(), "Dell Inc.");
    EXPECT_FALSE(IpmiIfc::hpe_bmc);
    unsigned char id[3] = {0, 0, 0}, count = 0;
    ASSERT_EQ(IpmiIfc::getManufacturerId(id, count), 0);
    EXPECT_EQ(Bytes(id, id + 3), (Bytes{0xA2, 0x02, 0x00}));
    EXPECT_EQ(count, 1);  // one id, although three bytes

    bmc().identity.fwMajor = 0x45;  // bit 6 is masked away
    bmc().identity.fwMinor = 0x05;
    bmc().identity.ipmiVersion = 0x51;
    bmc().identity.manufacturerId = 11;
    IpmiIfcDataGet(1);
    EXPECT_EQ(IpmiIfc::GetBmcFWVersion(), "5.5");
    EXPECT_EQ(IpmiIfc::GetBmcIpmiVersion(), "1.5");
    EXPECT_EQ(IpmiIfc::GetBmcManufacturer(), "Hewlett-Packard");
    EXPECT_TRUE(IpmiIfc::hpe_bmc);
}

TEST(IdentityNames, ManufacturersAndGeneratorIds) {
    EXPECT_STREQ(IpmiIfc::getManufacturerName(12345), "Unknown");
    EXPECT_STREQ(IpmiIfc::getManufacturerName(20974), "American Megatrends, Inc");
    EXPECT_EQ(IpmiIfc::convertToGeneratorId(0x20, 1, 2), 0x1220);
    EXPECT_EQ(IpmiIfc::convertToGeneratorId(0x1FF, 0x1F, 7), 0xF3FF);
}

// The name keeps every byte read: fill bytes and each later block's set
// selector come out as spaces, like any byte that is not printable.
TEST_F(Identity, OsStringsAreReadInAsManyBlocksAsTheyNeed) {
    const struct {
        uint8_t parameter;
        std::string value;
        uint8_t encoding;
        size_t blocks;  // blocks read
        std::string read;
    } cases[] = {
        {sysInfoParam::osName, "Ubuntu 22.04.3", 0, 1, "Ubuntu 22.04.3"},
        {sysInfoParam::osName, "Ubuntu 22.04.3X", 0, 2, "Ubuntu 22.04.3 X" + std::string(15, ' ')},
        {sysInfoParam::osName, "Linux", 1, 4, "Linux" + std::string(9 + 3 * 17, ' ')},
        {sysInfoParam::osVersion, "6.1\t\x01\x80x", 0, 1, "6.1   x" + std::string(7, ' ')},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.value);
        sim().resetCounters();
        bmc().setSystemInfoString(c.parameter, c.value, c.encoding);
        IpmiIfcDataGet(3);
        auto reads = sent(netfn::app, cmd::getSystemInfoParameters, c.parameter);
        ASSERT_EQ(reads.size(), c.blocks);
        EXPECT_EQ(reads.back(), (Bytes{0, c.parameter, static_cast<uint8_t>(c.blocks - 1), 0}));
        EXPECT_EQ(c.parameter == sysInfoParam::osName ? IpmiIfc::GetBmcReportedOSName()
                                                      : IpmiIfc::GetBmcReportedOSVersion(),
                  c.read);
    }
}

TEST_F(Identity, OsStringFailuresLeaveTheStringsAsTheyWere) {
    IpmiIfcDataGet(3);  // the plain controller has neither parameter
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcRhGetOS_Name: BMC does not support OS Names retrieval"));
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcRhGetOS_Version: BMC does not support OS Versions retrieval"));
    bmc().setSystemInfoString(sysInfoParam::osName, "Debian");
    bmc().setSystemInfoString(sysInfoParam::osVersion, "6.1");
    IpmiIfcDataGet(3);
    const std::string name = IpmiIfc::GetBmcReportedOSName(), version = IpmiIfc::GetBmcReportedOSVersion();
    ASSERT_EQ(name, "Debian" + std::string(8, ' '));

    bmc().setSystemInfoString(sysInfoParam::osName, "Debian GNU/Linux 12 (bookworm)");
    sim().addFault(netfn::app, cmd::getSystemInfoParameters, Sim::Fault::completionCode(cc::invalidCommand));
    sim().addFault(netfn::app, cmd::getSystemInfoParameters, Sim::Fault::answerLength(Sim::FaultKind::CutAnswer, 5));
    IpmiIfcDataGet(3);
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSName(), name);
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSVersion(), version);  // a short answer is refused
    uint8_t request[4] = {0, sysInfoParam::osName, 0, 0};
    RespHolder first(IpmiIfcSendCmd(0, cmd::getSystemInfoParameters, netfn::app, 0, 4, request, 0));
    ASSERT_TRUE(first);
    sim().addFault(netfn::app, cmd::getSystemInfoParameters, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    EXPECT_EQ(IpmiIfcRhGetOS_Name(first.get()), -1);  // a later block is missing
    EXPECT_EQ(IpmiIfc::GetBmcReportedOSName(), name);
}

// Every block goes out whole: behind the one new byte of the third come 15
// bytes left over from the second. Each block takes two message ids.
TEST_F(Identity, PropertiesAreWrittenInWholeBlocks) {
    const std::string value = "abcdefghijklmnopqrstuvwxyz01234";
    unsigned char code = 0;
    const uint32_t idsBefore = node().msgCounter;
    EXPECT_TRUE(setProp(value.substr(0, 30), sysInfoParam::osName, &code));
    EXPECT_EQ(node().msgCounter - idsBefore, 4u);
    EXPECT_TRUE(setProp(value, sysInfoParam::osName, &code));
    EXPECT_TRUE(setProp("", sysInfoParam::osName, &code));  // sends nothing
    auto blocks = setBlocks();
    ASSERT_EQ(blocks.size(), 5u);
    EXPECT_EQ(blocks[0], concat({4, 0, 0, 30}, value.substr(0, 14)));
    EXPECT_EQ(blocks[1], concat({4, 1}, value.substr(14, 16)));
    EXPECT_EQ(blocks[4], concat({4, 2, '4'}, value.substr(15, 15)));
    EXPECT_EQ(bmc().systemInfoString(sysInfoParam::osName), value);

    sim().addFault(netfn::app, cmd::setSystemInfoParameters, Sim::Fault::completionCode(cc::invalidCommand));
    sim().addFault(netfn::app, cmd::setSystemInfoParameters, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    EXPECT_FALSE(setProp(value, sysInfoParam::osVersion, &code));
    EXPECT_EQ(setBlocks().size(), 8u);  // a failed block does not stop the rest
    EXPECT_EQ(code, cc::invalidCommand);
}

class IdentityOwnDevice : public Identity {
protected:
    IdentityOwnDevice() { openDevice = false; }  // these calls open the device themselves
};

TEST_F(IdentityOwnDevice, SetOsInfoWritesVersionThenName) {
    EXPECT_TRUE(IpmiIfc::SetOSInfo("Ubuntu", "22.04"));
    EXPECT_EQ(setBlocks().front()[0], sysInfoParam::osVersion);
    EXPECT_EQ(bmc().systemInfoString(sysInfoParam::osName), "Ubuntu");
    EXPECT_EQ(bmc().systemInfoString(sysInfoParam::osVersion), "22.04");
    EXPECT_NE(node().fd, -1);  // left open

    for (const char* name : {"Debian", ""}) {  // no version parameter: the version goes behind the name
        IpmiIfcOpenIpmiClose(0);
        sim().addFault(netfn::app, cmd::setSystemInfoParameters, Sim::Fault::completionCode(cc::parameterNotSupported));
        EXPECT_EQ(IpmiIfc::SetOSInfo(name, "12"), *name != 0);
    }
    EXPECT_EQ(bmc().systemInfoString(sysInfoParam::osName), "Debian 12");
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

TEST_F(Identity, ChassisIdentify) {
    EXPECT_EQ(IpmiIfc::identifyChassis(0, 0, 1), 0);
    EXPECT_EQ(IpmiIfc::identifyChassis(15, 0), 0);
    EXPECT_EQ(sent(netfn::chassis, cmd::chassisIdentify), (std::vector<Bytes>{{0x00, 0x01}, {0x0F, 0x00}}));
    for (uint8_t code : {cc::invalidCommand, cc::illegalForSensorType, cc::nodeBusy}) {
        sim().addFault(netfn::chassis, cmd::chassisIdentify, Sim::Fault::completionCode(code));
        EXPECT_EQ(IpmiIfc::identifyChassis(0, 5, 0), code == cc::nodeBusy ? code : 1);  // 1: not supported
    }
    sim().addFault(netfn::chassis, cmd::chassisIdentify, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    EXPECT_EQ(IpmiIfc::identifyChassis(0, 5, 0), 255);
}

}  // namespace
