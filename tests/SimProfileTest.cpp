// Profiles of simulated servers: what a controller loaded from an ipmi_sim
// emulator file answers, how a bad file is reported, and that the profiles
// published for real servers load whole.

#include <gtest/gtest.h>

#include <stdlib.h>
#include <unistd.h>

#include <fstream>
#include <iterator>
#include <stdexcept>
#include <string>
#include <vector>

#include "Bmc.h"
#include "IpmiCommands.h"
#include "TestSupport.h"

using namespace Ipmi;
using Bytes = std::vector<uint8_t>;

namespace {

// A scratch directory for profile files, removed with everything in it.
class ProfileDir {
public:
    ProfileDir() {
        char pattern[] = "/tmp/tav-profile-XXXXXX";
        const char* made = mkdtemp(pattern);
        if (made != nullptr) dir_ = made;
    }
    ~ProfileDir() {
        for (auto it = files_.rbegin(); it != files_.rend(); ++it) unlink(it->c_str());
        for (auto it = dirs_.rbegin(); it != dirs_.rend(); ++it) rmdir(it->c_str());
        if (!dir_.empty()) rmdir(dir_.c_str());
    }
    std::string write(const std::string& name, const std::string& text) {
        std::string path = dir_ + "/" + name;
        size_t slash = name.rfind('/');
        if (slash != std::string::npos) {
            std::string sub = dir_ + "/" + name.substr(0, slash);
            if (mkdir(sub.c_str(), 0700) == 0) dirs_.push_back(sub);
        }
        std::ofstream(path, std::ios::binary) << text;
        files_.push_back(path);
        return path;
    }

private:
    std::string dir_;
    std::vector<std::string> files_;
    std::vector<std::string> dirs_;
};

Sim::Response ask(Sim::Bmc& bmc, uint8_t netfn, uint8_t cmd, Bytes data = {}) {
    Sim::Request r;
    r.netfn = netfn;
    r.cmd = cmd;
    r.data = std::move(data);
    return bmc.handle(r);
}

Sim::Response reading(Sim::Bmc& bmc, uint8_t sensor) {
    return ask(bmc, netfn::sensorEvent, cmd::getSensorReading, {sensor});
}

Bytes fileBytes(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return Bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
}

// The error a profile fails to load with, or "" when it loads.
std::string loadError(const std::string& path) {
    try {
        Sim::loadProfile(path);
    } catch (const std::runtime_error& e) {
        return e.what();
    }
    return "";
}

const char* kBmc =
    "mc_setbmc 0x20\n"
    "mc_add 0x20 0x20 no-device-sdrs 0x01 0x02 0x10 0xbf 0x0002a2 0x0100\n"
    "mc_enable 0x20\n";

// A full threshold sensor record for sensor `number`: two's complement
// readings when `signedReadings`, thresholds LNC/LC/UNC/UC readable.
std::string fullRecordLine(uint8_t number, bool signedReadings) {
    char line[512];
    snprintf(line, sizeof line,
             "main_sdr_add 0x20 \\\n"
             "  0x%02x 0x00 0x51 0x01 0x2c 0x20 0x00 0x%02x 0x07 0x01 0x7f 0x68 0x01 0x01 0x85 0x32 0x85 0x32\\\n"
             "  0x1b 0x1b 0x%02x 0x01 0x00 0x00 0x01 0x00 0x00 0x00 0x00 0x00 0x00 0x00 0x00 0x00 0x00 0x00\\\n"
             "  0x00 0x00 0x00 0x00 0x00 0x00 0x01 0x01 0x00 0x00 0x00 0xc1 0x54\n",
             number, number, signedReadings ? 0x80 : 0x00);
    return line;
}

TEST(SimProfile, IdentityNumbersAreReadInCNotation) {
    ProfileDir dir;
    // 32 is decimal and 020 octal, as ipmi_sim reads them.
    auto bmc = Sim::loadProfile(dir.write("id.emu",
                                          "mc_setbmc 0x20\n"
                                          "mc_add 0x20 32 has-device-sdrs 0x1 2 020 0xdf 0x2a2 0x100 dynsens\n"
                                          "mc_enable 0x20\n"));
    EXPECT_EQ(ask(*bmc, netfn::app, cmd::getDeviceId),
              (Sim::Response{0x00, 0x20, 0x81, 0x02, 0x10, 0x02, 0xdf, 0xa2, 0x02, 0x00, 0x00, 0x01, 0, 0, 0, 0}));
}

TEST(SimProfile, OtherControllersJoinOnceEnabled) {
    ProfileDir dir;
    auto bmc = Sim::loadProfile(dir.write("mcs.emu", std::string(kBmc) +
                                                         "mc_add 0x2c 0x50 no-device-sdrs 1 4 1 0x21 343 0x0b\n"
                                                         "mc_enable 0x2c\n"
                                                         "mc_add 0xb1 1 no-device-sdrs 1 0 0 159 0 0 dynsens\n"));
    ASSERT_EQ(bmc->satellites.size(), 1u);
    const Sim::Identity& me = bmc->satellites.at(0x2c);
    EXPECT_EQ(me.deviceId, 0x50);
    EXPECT_EQ(me.fwMajor, 4);
    EXPECT_EQ(me.additionalSupport, 0x21);
    EXPECT_EQ(me.manufacturerId, 343u);
    EXPECT_EQ(me.productId, 0x0b);
    EXPECT_EQ(bmc->identity.manufacturerId, 674u);
}

TEST(SimProfile, ContinuationsCommentsQuotesNamesAndIncludes) {
    ProfileDir dir;
    dir.write("parts/eeprom1.bin", std::string("\xAA\xBB\x01\x02\x03", 5));
    dir.write("parts/sdrs.emu",
              "# records of the board\n"
              "main_sdr_add 0x20 \\\n"
              "# a comment inside a continued command\n"
              "  0x07 0x00 0x51 0x12 0x0b \\\n"
              "  0x20 0x00 0x00 0x00 0x00 0x00 0x00 0x07 0x01 0x00 0xc0\n"
              "mc_add_fru_data 0x20 $DEV 8 file 2 \"eeprom\"$DEV\".bin\"\n");
    auto bmc = Sim::loadProfile(dir.write("main.emu", std::string(kBmc) +
                                                          "define DEV \"1\"\n"
                                                          "include \"parts/sdrs.emu\"\n"
                                                          "mc_add_fru_data 0x20 0 4 data 0x01 0x02\n"));
    ASSERT_EQ(bmc->sdr.records.size(), 1u);
    EXPECT_EQ(bmc->sdr.records[0],
              (Bytes{0x07, 0x00, 0x51, 0x12, 0x0b, 0x20, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x07, 0x01, 0x00, 0xc0}));
    // A FRU image is as long as its device: what the file or the data do not fill reads 0.
    EXPECT_EQ(bmc->fru.devices.at(1).data, (Bytes{0x01, 0x02, 0x03, 0, 0, 0, 0, 0}));
    EXPECT_EQ(bmc->fru.devices.at(0).data, (Bytes{0x01, 0x02, 0, 0}));
}

TEST(SimProfile, SensorsAnswerAsTheProfileSetsThem) {
    ProfileDir dir;
    auto bmc = Sim::loadProfile(dir.write(
        "sensors.emu",
        std::string(kBmc) + fullRecordLine(0x0e, false) +
            "sensor_add 0x20 0 0x0e 0x01 0x01\n"
            "sensor_set_threshold 0x20 0 0x0e settable 011011 0x00 0xda 0xd5 0x00 0x83 0x88\n"
            "sensor_set_hysteresis 0x20 0 0x0e settable 2 3\n"
            "sensor_set_event_support 0x20 0 0x0e enable scanning per-state \\\n"
            "  000001010000101 000001010000101 000001010000001 111111111111111\n"
            "sensor_set_value 0x20 0 0x0e 0xa8 1\n"
            "sensor_add 0x20 0 0x60 0x07 0x6f\n"
            "sensor_set_event_support 0x20 0 0x60 disable no-scanning per-state \\\n"
            "  000000010000011 000000000000000 000000010000011 000000000000000\n"
            "sensor_set_bit 0x20 0 0x60 7 1 0\n"
            "sensor_set_bit 0x20 0 0x60 8 1\n"
            "sensor_add 0x20 0 0x61 0x07 0x6f\n"
            "sensor_set_bit 0x20 0 0x61 1 1 0\n"
            "sensor_set_bit_clr_rest 0x20 0 0x61 9 1 0\n"));
    EXPECT_EQ(reading(*bmc, 0x0e), (Sim::Response{0x00, 0xa8, 0xc0, 0x00}));
    EXPECT_EQ(ask(*bmc, netfn::sensorEvent, cmd::getSensorThresholds, {0x0e}),
              (Sim::Response{0x00, 0x1b, 0x88, 0x83, 0x00, 0xd5, 0xda, 0x00}));
    EXPECT_EQ(ask(*bmc, netfn::sensorEvent, cmd::getSensorHysteresis, {0x0e, 0xff}), (Sim::Response{0x00, 2, 3}));
    // Enables beyond what the sensor supports are not kept.
    EXPECT_EQ(ask(*bmc, netfn::sensorEvent, cmd::getSensorEventEnable, {0x0e}),
              (Sim::Response{0x00, 0xc0, 0x81, 0x02, 0x85, 0x02}));

    EXPECT_EQ(reading(*bmc, 0x60), (Sim::Response{0x00, 0x00, 0x00, 0x80, 0x01}));
    EXPECT_EQ(reading(*bmc, 0x61), (Sim::Response{0x00, 0x00, 0x00, 0x00, 0x02}));
}

TEST(SimProfile, SensorsStayQuietUntilTheProfileEnablesThem) {
    ProfileDir dir;
    auto bmc = Sim::loadProfile(
        dir.write("quiet.emu", std::string(kBmc) + "sensor_add 0x20 0 5 0x01 0x01\nsensor_set_value 0x20 0 5 40 0\n"));
    EXPECT_EQ(reading(*bmc, 5), (Sim::Response{0x00, 40, 0x00, 0x00}));
}

TEST(SimProfile, AValueIsComparedAgainstTheThresholdsSetBeforeIt) {
    ProfileDir dir;
    auto bmc = Sim::loadProfile(dir.write(
        "compare.emu",
        std::string(kBmc) + fullRecordLine(1, true) + fullRecordLine(2, true) + fullRecordLine(3, false) +
            // Two's complement: LC -7, LNC -2, UNC 42, UC 47.
            "sensor_add 0x20 0 1 0x01 0x01\n"
            "sensor_set_threshold 0x20 0 1 settable 011011 0 47 42 0 0xf9 0xfe\n"
            "sensor_set_value 0x20 0 1 22\n"
            "sensor_add 0x20 0 2 0x01 0x01\n"
            "sensor_set_threshold 0x20 0 2 settable 011011 0 47 42 0 0xf9 0xfe\n"
            "sensor_set_value 0x20 0 2 0xf8\n"
            // Set after the value, thresholds leave the state as it was.
            "sensor_add 0x20 0 3 0x01 0x01\n"
            "sensor_set_value 0x20 0 3 0\n"
            "sensor_set_threshold 0x20 0 3 readable 000011 0 0 0 0 5 7\n"));
    // 22 C is above -2 C; compared as unsigned bytes it would be below 0xfe.
    EXPECT_EQ(reading(*bmc, 1)[3], 0x00);
    // -8 C is at or below both lower thresholds, and not above 42 C.
    EXPECT_EQ(reading(*bmc, 2)[3], 0x03);
    EXPECT_EQ(reading(*bmc, 3)[3], 0x00);
}

TEST(SimProfile, TheSelExistsOnlyWhenEnabled) {
    ProfileDir dir;
    auto without = Sim::loadProfile(dir.write("nosel.emu", kBmc));
    EXPECT_EQ(ask(*without, netfn::storage, cmd::getSelInfo), Sim::Response{cc::invalidCommand});
    auto with = Sim::loadProfile(dir.write("sel.emu", std::string(kBmc) + "sel_enable 0x20 1000 0x0b\n"));
    Sim::Response info = ask(*with, netfn::storage, cmd::getSelInfo);
    ASSERT_EQ(info.size(), 15u);
    EXPECT_EQ(info[0], cc::ok);
    EXPECT_EQ(info[14], 0x0b);
}

TEST(SimProfile, CommandsWithoutAModelAreSkipped) {
    ProfileDir dir;
    EXPECT_EQ(loadError(dir.write("skip.emu", std::string(kBmc) +
                                                  "atca_enable\n"
                                                  "atca_set_site 0x10 3 1\n"
                                                  "device_sdr_add 0x20 0 0x01 0x00 0x51 0x12 0x00\n"
                                                  "sel_add 0x20 2 1 2 3 4 5 6 7 8 9 10 11 12 13\n"
                                                  "mc_set_guid 0x20 \"0123456789abcdef\"\n"
                                                  "sleep 1\n")),
              "");
}

TEST(SimProfile, SyntaxErrorsNameTheFileAndLine) {
    ProfileDir dir;
    const std::string head = std::string(kBmc);  // lines 1-3
    const struct {
        std::string text;
        std::string error;  // after "<path>:"
    } cases[] = {
        {"mc_reboot 0x20\n", "4: unknown command 'mc_reboot'"},
        {"mc_add 0x22 1 no-device-sdrs 1 2 3 4\n", "4: missing arguments, expected: mc_add address device-id "
                                                   "has-device-sdrs revision fw-major fw-minor support manufacturer "
                                                   "product"},
        {"mc_add 0x22 1 no-device-sdrs 1 0 0 1f 0 0\n", "4: bad number '1f' for device support"},
        {"mc_add 0x22 1 no-device-sdrs 1 0 0 09 0 0\n", "4: bad number '09' for device support"},
        {"mc_add 0x22 1 no-device-sdrs 1 0 0 0x 0 0\n", "4: bad number '0x' for device support"},
        {"mc_add 0x22 256 no-device-sdrs 1 0 0 0 0 0\n", "4: device ID 256 is out of range"},
        {"mc_add 0x22 1 no-device-sdrs 1 0 0 0 0 0 # note\n", "4: unknown controller option '#'"},
        {"\nmain_sdr_add 0x20 \\\n  0x01 0x00 0x51 0x12 0x02 \\\n  0x20\n",
         "5: record length byte says 2 bytes follow the header, but 1 do"},
        {"sensor_set_value 0x20 0 9 1 0\n", "4: no sensor 0x9 on LUN 0 of controller 0x20 (sensor_add it first)"},
        {"sensor_add 0x30 0 1 1 1\n", "4: no controller at 0x30 (mc_add it first)"},
        {"sensor_add 0x20 0 1 1 1\nsensor_set_threshold 0x20 0 1 settable 11100 1 2 3\n",
         "5: bad threshold mask '11100': expected 6 digits 0 or 1"},
        {"sensor_add 0x20 0 1 1 1 poll\n", "4: missing arguments, expected: poll rate type [options]"},
        {"mc_set_guid 0x20 \"0123\n", "4: unterminated quote"},
        {"mc_enable $BMC\n", "4: undefined name $BMC"},
        {"include \"absent.emu\"\n", "4: cannot open include file " + std::string("@/absent.emu")},
    };
    int n = 0;
    for (const auto& c : cases) {
        std::string path = dir.write("bad" + std::to_string(n++) + ".emu", head + c.text);
        std::string expected = c.error;
        size_t at = expected.find('@');
        if (at != std::string::npos) expected.replace(at, 1, path.substr(0, path.rfind('/')));
        EXPECT_EQ(loadError(path), path + ":" + expected) << c.text;
    }
}

TEST(SimProfile, AnIncludeLoopEndsWithAnError) {
    ProfileDir dir;
    std::string path = dir.write("loop.emu", "include \"loop.emu\"\n");
    EXPECT_EQ(loadError(path), path + ":1: includes nested more than 8 deep");
}

// Profiles InfraSIM captured from servers, with the SDR repositories and FRU
// images that were converted from them.
const char* const kCapturedServers[] = {
    "infrasim_dell_c6320", "infrasim_dell_r630", "infrasim_dell_r640",   "infrasim_dell_r730",
    "infrasim_dell_r730xd", "infrasim_dell_r740xd", "infrasim_quanta_d51", "infrasim_quanta_t41",
    "infrasim_s2600kp",    "infrasim_s2600tp",   "infrasim_s2600wtt",    "infrasim_vnode"};

TEST(SimProfile, CapturedServersLoadWithTheirRepositoriesAndFruImages) {
    std::string dir = TestSupport::realDataPath("sim");
    SKIP_WITHOUT_REAL_DATA(dir);
    for (const char* server : kCapturedServers) {
        SCOPED_TRACE(server);
        std::shared_ptr<Sim::Bmc> bmc;
        ASSERT_NO_THROW(bmc = Sim::loadProfile(dir + "/" + server + ".emu"));
        Bytes repository;
        for (const auto& r : bmc->sdr.records) repository.insert(repository.end(), r.begin(), r.end());
        EXPECT_EQ(repository, fileBytes(TestSupport::realDataPath(std::string("sdr/") + server + ".sdr")));
        EXPECT_FALSE(bmc->sensors.empty());
        for (int device = 0; device < 256; ++device) {
            std::string image =
                TestSupport::realDataPath("fru/" + std::string(server) + "_fru" + std::to_string(device) + ".bin");
            if (image.empty()) continue;
            ASSERT_TRUE(bmc->fru.devices.count(static_cast<uint8_t>(device))) << device;
            Bytes expected = fileBytes(image);
            Bytes held = bmc->fru.devices.at(static_cast<uint8_t>(device)).data;
            ASSERT_GE(held.size(), expected.size());
            EXPECT_EQ(Bytes(held.begin(), held.begin() + static_cast<long>(expected.size())), expected) << device;
        }
    }
}

// OpenIPMI's own examples do not load in ipmi_sim 2.0 either: the ATCA one is
// written for an older all-hexadecimal dialect, ipmisim1 gives FRU data to a
// controller before adding it, and the Marvell pair lost their file names.
TEST(SimProfile, OpenIpmiExamplesFailWhereIpmiSimFails) {
    std::string dir = TestSupport::realDataPath("sim");
    SKIP_WITHOUT_REAL_DATA(dir);
    const std::pair<std::string, std::string> cases[] = {
        {"openipmi_atca.emu", ":6: bad number '1f' for device support"},
        {"openipmi_ipmisim1.emu", ":39: no controller at 0x30 (mc_add it first)"},
        {"openipmi_marvell_marvell.emu", ":63: cannot open include file " + dir + "/marvell_node.emu"},
        {"openipmi_marvell_marvell_node.emu", ":2: undefined name $MCNUM"},
    };
    for (const auto& c : cases) {
        std::string path = dir + "/" + c.first;
        EXPECT_EQ(loadError(path), path + c.second);
    }
}

TEST(SimProfile, AnSdrDumpStandsInForAProfile) {
    std::string path = TestSupport::realDataPath("sdr/openipmi_marvell_axp_sdrcomp.sdr");
    SKIP_WITHOUT_REAL_DATA(path);
    auto bmc = Sim::loadProfile(path);
    EXPECT_EQ(bmc->sdr.records.size(), 119u);
    Bytes repository;
    for (const auto& r : bmc->sdr.records) repository.insert(repository.end(), r.begin(), r.end());
    EXPECT_EQ(repository, fileBytes(path));
    EXPECT_TRUE(bmc->sensors.empty());
}

TEST(SimProfile, TheDefaultServerLoads) {
    auto bmc = Sim::loadProfile(Sim::defaultProfilePath());
    EXPECT_EQ(bmc->identity.manufacturerId, 674u);
    EXPECT_EQ(bmc->sdr.records.size(), 37u);
    EXPECT_EQ(bmc->fru.devices.size(), 2u);
    EXPECT_EQ(bmc->satellites.count(0x2c), 1u);
    // Inlet Temp reads 22 C against lower thresholds below 0 C: no threshold crossed.
    EXPECT_EQ(reading(*bmc, 0x01), (Sim::Response{0x00, 22, 0xc0, 0x00}));
    // The second power supply slot is empty.
    EXPECT_EQ(reading(*bmc, 0x41), Sim::Response{cc::requestedSensorNotPresent});
}

}  // namespace
