// Independent IPMI clients (ipmitool, FreeIPMI) run against the simulated
// controller through the preload library: they must see the simulator as a
// real BMC, and see the captured servers as the reference decodings show them.

#include <gtest/gtest.h>

#include <stdlib.h>
#include <unistd.h>

#include "Bmc.h"
#include "PeerTools.h"
#include "TestSupport.h"

namespace {

using namespace TestSupport;

// The Get Device ID answer as raw bytes, then as each tool decodes it.
TEST(PeerTools, BothToolsSeeTheDefaultIdentity) {
    SKIP_WITHOUT_TOOL("ipmitool");
    SKIP_WITHOUT_TOOL("bmc-info");
    // mc_add 0x20 0x20 no-device-sdrs 0x01 0x02 0x10 0xbf 0x0002a2 0x0100
    ToolRun raw = runTool("default", toolPath("ipmitool"), {"-I", "open", "raw", "0x06", "0x01"});
    ASSERT_EQ(raw.exitCode, 0) << raw.err;
    EXPECT_EQ(trim(raw.out), "20 01 02 10 02 bf a2 02 00 00 01 00 00 00 00");

    ToolRun info = runTool("default", toolPath("ipmitool"), {"-I", "open", "mc", "info"});
    auto f = fields(info.out);
    EXPECT_EQ(f["Firmware Revision"], "2.10");
    EXPECT_EQ(f["Manufacturer Name"], "Dell Inc.");
    EXPECT_EQ(f["Product ID"], "256 (0x0100)");
    EXPECT_EQ(f["Provides Device SDRs"], "no");
    for (const char* device : {"Sensor Device", "SDR Repository Device", "SEL Device", "FRU Inventory Device",
                               "IPMB Event Receiver", "IPMB Event Generator", "Chassis Device"})
        EXPECT_NE(info.out.find("    " + std::string(device) + "\n"), std::string::npos) << device;
    EXPECT_EQ(info.out.find("    Bridge\n"), std::string::npos);

    f = fields(runTool("default", toolPath("bmc-info"), {"--driver-type=OPENIPMI"}).out);
    EXPECT_EQ(f["Device Available"], "yes (normal operation)");
    EXPECT_EQ(f["Manufacturer ID"], "Dell Inc. (674)");
    EXPECT_EQ(f["Bridge"], "unsupported");
}

// ipmi_sim reads numbers without 0x as decimal: mc_add 0x20 33 no-device-sdrs 0x1 1 33 0xbf 0x157 0x6f.
TEST(PeerTools, IpmitoolSeesACapturedIdentity) {
    SKIP_WITHOUT_TOOL("ipmitool");
    std::string profile = realDataPath("sim/infrasim_s2600wtt.emu");
    SKIP_WITHOUT_REAL_DATA(profile);
    ToolRun raw = runTool(profile, toolPath("ipmitool"), {"-I", "open", "raw", "0x06", "0x01"});
    ASSERT_EQ(raw.exitCode, 0) << raw.err;
    EXPECT_EQ(trim(raw.out), "21 01 01 21 02 bf 57 01 00 6f 00 00 00 00 00");
}

std::string setName(const std::string& set) { return set.substr(set.rfind('/') + 1); }

class PeerToolsReference : public ::testing::TestWithParam<std::string> {
protected:
    void SetUp() override { profile_ = referenceProfile(GetParam()); }
    std::string reference(const char* tool) { return realDataPath("sdr/" + setName(GetParam()) + "." + tool + ".txt"); }
    std::string profile_;
};

TEST_P(PeerToolsReference, IpmitoolListsTheRepositoryAsTheReference) {
    SKIP_WITHOUT_TOOL("ipmitool");
    std::string expected = reference("ipmitool-sdr-elist");
    SKIP_WITHOUT_REAL_DATA(expected);
    ToolRun elist = runTool(profile_, toolPath("ipmitool"), {"-I", "open", "sdr", "elist", "all"});
    ASSERT_EQ(elist.exitCode, 0) << elist.err;
    EXPECT_EQ(elist.out, readFile(expected));
}

TEST_P(PeerToolsReference, FreeIpmiReadsTheSensorsAsTheReference) {
    SKIP_WITHOUT_TOOL("ipmi-sensors");
    std::string expected = reference("ipmi-sensors");
    SKIP_WITHOUT_REAL_DATA(expected);
    ToolRun sensors = runIpmiSensors(profile_);
    ASSERT_EQ(sensors.exitCode, 0) << sensors.err;

    // ipmi_sim renumbers the records 1..n in repository order, where a real
    // BMC (and this simulator) keeps the IDs the repository holds: the ID
    // column is compared by position in the repository.
    std::map<long, long> position;
    auto bmc = Sim::loadProfile(profile_);
    for (size_t i = 0; i < bmc->sdr.records.size(); ++i) {
        const auto& r = bmc->sdr.records[i];
        position.emplace(r[0] | (r[1] << 8), static_cast<long>(i + 1));
    }
    auto ours = lines(sensors.out);
    auto theirs = lines(readFile(expected));
    ASSERT_EQ(ours.size(), theirs.size()) << sensors.out;
    for (size_t i = 0; i < ours.size(); ++i) {
        auto a = split(ours[i], '|');
        auto b = split(theirs[i], '|');
        ASSERT_EQ(a.size(), b.size()) << ours[i];
        if (i == 0) {
            EXPECT_EQ(ours[i], theirs[i]);
            continue;
        }
        EXPECT_EQ(position[strtol(a[0].c_str(), nullptr, 10)], strtol(b[0].c_str(), nullptr, 10)) << ours[i];
        EXPECT_EQ(std::vector<std::string>(a.begin() + 1, a.end()), std::vector<std::string>(b.begin() + 1, b.end()))
            << ours[i];
    }
}

INSTANTIATE_TEST_SUITE_P(PeerTools, PeerToolsReference, ::testing::ValuesIn(referenceSets()), profileTestName);
GTEST_ALLOW_UNINSTANTIATED_PARAMETERIZED_TEST(PeerToolsReference);

TEST(PeerTools, IpmitoolDecodesTheDefaultServer) {
    SKIP_WITHOUT_TOOL("ipmitool");
    ToolRun elist = runTool("default", toolPath("ipmitool"), {"-I", "open", "sdr", "elist", "all"});
    ASSERT_EQ(elist.exitCode, 0) << elist.err;
    EXPECT_EQ(elist.err, "");
    // Every record but the three entity associations and two OEM records has a row.
    EXPECT_EQ(lines(elist.out).size(), 32u) << elist.out;
    for (const char* row : {
             "ME               | 00h | ok  | 46.1 | Dynamic MC @ 2Ch",
             "PS1              | 00h | ns  | 10.1 | Logical FRU @01h",
             // Two's complement with lower thresholds below 0 C. ipmi_sim compares
             // such readings as unsigned bytes and would show 22 C as 'lcr'.
             "Inlet Temp       | 01h | ok  | 55.1 | 22 degrees C",
             "Fan2             | 31h | ok  | 29.2 | 6060 RPM",
             "PS1 Input Power  | 40h | ok  | 10.1 | 232 Watts",
             "PS2 Input Power  | 41h | ns  | 10.2 | No Reading",
             "DIMM B           | 64h | ok  | 32.5 | Presence Detected",
             "Drive            | 70h | ok  |  4.1 | Drive Present",
             "OS Watchdog      | 92h | ns  |  7.1 | Event-Only",
         })
        EXPECT_NE(elist.out.find(std::string(row) + "\n"), std::string::npos) << row << "\n" << elist.out;

    ToolRun list = runTool("default", toolPath("ipmitool"), {"-I", "open", "sdr", "list"});
    ASSERT_EQ(list.exitCode, 0) << list.err;
    EXPECT_EQ(list.err, "");
    EXPECT_NE(list.out.find("12V              | 12.06 Volts       | ok\n"), std::string::npos) << list.out;
    EXPECT_NE(list.out.find("VBAT             | 3.04 Volts        | ok\n"), std::string::npos) << list.out;
}

TEST(PeerTools, FreeIpmiDecodesTheDefaultServer) {
    SKIP_WITHOUT_TOOL("ipmi-sensors");
    ToolRun sensors = runIpmiSensors("default");
    ASSERT_EQ(sensors.exitCode, 0) << sensors.err;
    EXPECT_EQ(sensors.err, "");
    std::map<std::string, std::string> rows;  // name -> the columns after it
    for (const auto& line : lines(sensors.out)) {
        auto f = split(line, '|');
        if (f.size() == 6 && trim(f[0]) != "ID") rows[trim(f[1])] = line.substr(line.find('|', line.find('|') + 1) + 1);
    }
    EXPECT_EQ(rows.size(), 25u) << sensors.out;  // every full and compact sensor record
    EXPECT_EQ(rows["Inlet Temp"], " Temperature              | 22.00      | C     | 'OK'");
    EXPECT_EQ(rows["Pwr Consumption"], " Current                  | 220.00     | W     | 'OK'");
    EXPECT_EQ(rows["PS2 Input Power"], " Other Units Based Sensor | N/A        | W     | N/A");
    EXPECT_EQ(rows["CPU"], " Processor                | N/A        | N/A   | 'Processor Presence detected'");
}

// ipmi_sim answers 0xCC for a sensor it does not have; a BMC answers 0xCB.
TEST(PeerTools, AnAbsentSensorIsNotPresent) {
    SKIP_WITHOUT_TOOL("ipmitool");
    ToolRun raw = runTool("default", toolPath("ipmitool"), {"-I", "open", "raw", "0x04", "0x2d", "0x41"});
    EXPECT_NE(raw.exitCode, 0);
    EXPECT_NE(raw.err.find("rsp=0xcb): Requested sensor, data, or record not found"), std::string::npos) << raw.err;
}

TEST(PeerTools, TheDefaultFruImagesPassFreeIpmiChecks) {
    SKIP_WITHOUT_TOOL("ipmi-fru");
    auto bmc = Sim::loadProfile(Sim::defaultProfilePath());
    const std::map<uint8_t, std::vector<std::string>> expected = {
        {0, {"FRU Chassis Type: Rack Mount Chassis", "FRU Board Product Name: PowerEdge TAV2",
             "FRU Product Serial Number: 7TAV2X2"}},
        {1, {"FRU Board Product Name: PWR SPLY,550W,RDNT", "FRU Power Supply Overall Capacity: 550 Watts"}},
    };
    for (const auto& device : expected) {
        SCOPED_TRACE(int(device.first));
        char name[] = "/tmp/tav-fru-XXXXXX";
        int fd = mkstemp(name);
        ASSERT_GE(fd, 0);
        const auto& image = bmc->fru.devices.at(device.first).data;
        ASSERT_EQ(write(fd, image.data(), image.size()), static_cast<ssize_t>(image.size()));
        close(fd);
        ToolRun fru = runTool("", toolPath("ipmi-fru"), {"-v", std::string("--fru-file=") + name});
        unlink(name);
        EXPECT_EQ(fru.exitCode, 0) << fru.err;
        EXPECT_EQ(fru.out.find("checksum"), std::string::npos) << fru.out;
        for (const auto& line : device.second) EXPECT_NE(fru.out.find("  " + line + "\n"), std::string::npos) << line;
    }
}

}  // namespace
