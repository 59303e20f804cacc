// Profiles of simulated servers: what a controller loaded from an ipmi_sim
// emulator file answers, how a bad file is reported, and that the profiles
// published for real servers load as ipmi_sim loads them.

#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <stdexcept>

#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;
using Bytes = std::vector<uint8_t>;

namespace {

// A scratch directory for profile files, removed with everything in it.
class ProfileDir {
public:
    ProfileDir() : dir_(mkdtemp(pattern_) ? pattern_ : "/nonexistent") {}
    ~ProfileDir() {
        std::error_code ignored;
        std::filesystem::remove_all(dir_, ignored);
    }
    std::string write(const std::string& name, const std::string& text) {
        const std::string path = dir_ + "/" + name;
        std::filesystem::create_directories(std::filesystem::path(path).parent_path());
        std::ofstream(path, std::ios::binary) << text;
        return path;
    }
    std::shared_ptr<Sim::Bmc> load(const std::string& text) { return Sim::loadProfile(write("p.emu", text)); }

private:
    char pattern_[32] = "/tmp/tav-profile-XXXXXX";
    std::string dir_;
};

using TestSupport::ask;
Sim::Response reading(Sim::Bmc& bmc, uint8_t sensor) { return ask(bmc, netfn::sensorEvent, cmd::getSensorReading, {sensor}); }

Bytes fileBytes(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return Bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
}

Bytes repository(const Sim::Bmc& bmc) {
    Bytes all;
    for (const auto& r : bmc.sdr.records) all.insert(all.end(), r.begin(), r.end());
    return all;
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

const std::string kBmc =
    "mc_setbmc 0x20\n"
    "mc_add 0x20 0x20 no-device-sdrs 0x01 0x02 0x10 0xbf 0x0002a2 0x0100\n"
    "mc_enable 0x20\n";

// A full threshold sensor record for sensor `number`, with two's complement
// readings when `signedReadings`.
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

// Numbers are read as ipmi_sim reads them: 32 is decimal, 020 octal. Other
// controllers on IPMB join once enabled. The SEL exists only when enabled.
TEST(SimProfile, ControllersTheirIdentityAndSel) {
    ProfileDir dir;
    auto bmc = dir.load(
        "mc_setbmc 0x20\n"
        "mc_add 0x20 32 has-device-sdrs 0x1 2 020 0xdf 0x2a2 0x100 dynsens\n"
        "mc_enable 0x20\n"
        "sel_enable 0x20 1000 0x0b\n"
        "mc_add 0x2c 0x50 no-device-sdrs 1 4 1 0x21 343 0x0b\n"
        "mc_enable 0x2c\n"
        "mc_add 0xb1 1 no-device-sdrs 1 0 0 159 0 0 dynsens\n");
    EXPECT_EQ(ask(*bmc, netfn::app, cmd::getDeviceId),
              (Sim::Response{0x00, 0x20, 0x81, 0x02, 0x10, 0x02, 0xdf, 0xa2, 0x02, 0x00, 0x00, 0x01, 0, 0, 0, 0}));
    ASSERT_EQ(bmc->satellites.size(), 1u);
    EXPECT_EQ(bmc->satellites.at(0x2c).deviceId, 0x50);
    EXPECT_EQ(bmc->satellites.at(0x2c).manufacturerId, 343u);
    const Sim::Response sel = ask(*bmc, netfn::storage, cmd::getSelInfo);
    ASSERT_EQ(sel.size(), 15u);
    EXPECT_EQ(sel[14], 0x0b);
    EXPECT_EQ(ask(*dir.load(kBmc), netfn::storage, cmd::getSelInfo), Sim::Response{cc::invalidCommand});
}

// Commands the model has no place for (ATCA, device SDRs, SEL entries, GUID, sleep) are skipped.
TEST(SimProfile, ContinuationsCommentsQuotesNamesIncludesAndSkippedCommands) {
    ProfileDir dir;
    dir.write("parts/eeprom1.bin", std::string("\xAA\xBB\x01\x02\x03", 5));
    dir.write("parts/sdrs.emu",
              "# records of the board\n"
              "main_sdr_add 0x20 \\\n"
              "# a comment inside a continued command\n"
              "  0x07 0x00 0x51 0x12 0x0b \\\n"
              "  0x20 0x00 0x00 0x00 0x00 0x00 0x00 0x07 0x01 0x00 0xc0\n"
              "mc_add_fru_data 0x20 $DEV 8 file 2 \"eeprom\"$DEV\".bin\"\n");
    auto bmc = dir.load(kBmc + "define DEV \"1\"\ninclude \"parts/sdrs.emu\"\nmc_add_fru_data 0x20 0 4 data 0x01 0x02\n" +
                        "atca_enable\ndevice_sdr_add 0x20 0 0x01 0x00 0x51 0x12 0x00\n"
                        "sel_add 0x20 2 1 2 3 4 5 6 7 8 9 10 11 12 13\nmc_set_guid 0x20 \"0123456789abcdef\"\nsleep 1\n");
    EXPECT_EQ(repository(*bmc),
              (Bytes{0x07, 0x00, 0x51, 0x12, 0x0b, 0x20, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x07, 0x01, 0x00, 0xc0}));
    // A FRU image is as long as its device: what the file or the data do not fill reads 0.
    EXPECT_EQ(bmc->fru.devices.at(1).data, (Bytes{0x01, 0x02, 0x03, 0, 0, 0, 0, 0}));
    EXPECT_EQ(bmc->fru.devices.at(0).data, (Bytes{0x01, 0x02, 0, 0}));
}

TEST(SimProfile, SensorsAnswerAsTheProfileSetsThem) {
    ProfileDir dir;
    auto bmc = dir.load(kBmc + fullRecordLine(0x0e, false) + fullRecordLine(1, true) + fullRecordLine(2, true) +
                        "sensor_add 0x20 0 0x0e 0x01 0x01\n"
                        "sensor_set_threshold 0x20 0 0x0e settable 011011 0x00 0xda 0xd5 0x00 0x83 0x88\n"
                        "sensor_set_hysteresis 0x20 0 0x0e settable 2 3\n"
                        "sensor_set_event_support 0x20 0 0x0e enable scanning per-state \\\n"
                        "  000001010000101 000001010000101 000001010000001 111111111111111\n"
                        "sensor_set_value 0x20 0 0x0e 0xa8 1\n"
                        "sensor_add 0x20 0 0x60 0x07 0x6f\n"
                        "sensor_set_bit 0x20 0 0x60 7 1 0\n"
                        "sensor_set_bit_clr_rest 0x20 0 0x60 9 1 0\n"
                        // Two's complement thresholds: LC -7, LNC -2, UNC 42, UC 47.
                        "sensor_add 0x20 0 1 0x01 0x01\n"
                        "sensor_set_threshold 0x20 0 1 settable 011011 0 47 42 0 0xf9 0xfe\n"
                        "sensor_set_value 0x20 0 1 22\n"
                        "sensor_add 0x20 0 2 0x01 0x01\n"
                        "sensor_set_threshold 0x20 0 2 settable 011011 0 47 42 0 0xf9 0xfe\n"
                        "sensor_set_value 0x20 0 2 0xf8\n");
    EXPECT_EQ(reading(*bmc, 0x0e), (Sim::Response{0x00, 0xa8, 0xc0, 0x00}));
    EXPECT_EQ(ask(*bmc, netfn::sensorEvent, cmd::getSensorThresholds, {0x0e}),
              (Sim::Response{0x00, 0x1b, 0x88, 0x83, 0x00, 0xd5, 0xda, 0x00}));
    EXPECT_EQ(ask(*bmc, netfn::sensorEvent, cmd::getSensorHysteresis, {0x0e, 0xff}), (Sim::Response{0x00, 2, 3}));
    // Enables beyond what the sensor supports are not kept.
    EXPECT_EQ(ask(*bmc, netfn::sensorEvent, cmd::getSensorEventEnable, {0x0e}),
              (Sim::Response{0x00, 0xc0, 0x81, 0x02, 0x85, 0x02}));
    EXPECT_EQ(reading(*bmc, 0x60), (Sim::Response{0x00, 0x00, 0x00, 0x00, 0x02}));  // bit 7 cleared by bit 9
    // 22 C is above -2 C (as unsigned bytes it would be below 0xfe); -8 C is at or below both lower ones.
    EXPECT_EQ(reading(*bmc, 1)[3], 0x00);
    EXPECT_EQ(reading(*bmc, 2)[3], 0x03);
}

TEST(SimProfile, SyntaxErrorsNameTheFileAndLine) {
    ProfileDir dir;
    const std::pair<std::string, std::string> cases[] = {  // text after the 3 lines of kBmc, error after "<path>:"
        {"mc_reboot 0x20\n", "4: unknown command 'mc_reboot'"},
        {"mc_add 0x22 1 no-device-sdrs 1 2 3 4\n",
         "4: missing arguments, expected: mc_add address device-id has-device-sdrs revision fw-major fw-minor "
         "support manufacturer product"},
        {"mc_add 0x22 1 no-device-sdrs 1 0 0 1f 0 0\n", "4: bad number '1f' for device support"},
        {"mc_add 0x22 256 no-device-sdrs 1 0 0 0 0 0\n", "4: device ID 256 is out of range"},
        {"\nmain_sdr_add 0x20 \\\n  0x01 0x00 0x51 0x12 0x02 \\\n  0x20\n",
         "5: record length byte says 2 bytes follow the header, but 1 do"},
        {"sensor_add 0x30 0 1 1 1\n", "4: no controller at 0x30 (mc_add it first)"},
        {"mc_set_guid 0x20 \"0123\n", "4: unterminated quote"},
        {"mc_enable $BMC\n", "4: undefined name $BMC"},
        {"include \"absent.emu\"\n", "4: cannot open include file @/absent.emu"},
        {"", "4: includes nested more than 8 deep"},  // the file includes itself
    };
    int n = 0;
    for (const auto& c : cases) {
        const std::string name = "bad" + std::to_string(n++) + ".emu";
        const std::string path = dir.write(name, kBmc + (c.first.empty() ? "include \"" + name + "\"\n" : c.first));
        std::string expected = c.second;
        if (size_t at = expected.find('@'); at != std::string::npos)
            expected.replace(at, 1, path.substr(0, path.rfind('/')));
        EXPECT_EQ(loadError(path), path + ":" + expected) << c.first;
    }
}

// Profiles InfraSIM captured from servers load whole, with the SDR
// repositories and FRU images converted from them; OpenIPMI's own examples
// fail where ipmi_sim 2.0 fails too; an SDR dump stands in for a profile.
TEST(SimProfile, RealProfilesLoadAsIpmiSimLoadsThem) {
    const std::string dir = TestSupport::realDataPath("sim");
    SKIP_WITHOUT_REAL_DATA(dir);
    for (const char* server : {"infrasim_dell_c6320", "infrasim_dell_r630", "infrasim_dell_r640", "infrasim_dell_r730",
                               "infrasim_dell_r730xd", "infrasim_dell_r740xd", "infrasim_quanta_d51",
                               "infrasim_quanta_t41", "infrasim_s2600kp", "infrasim_s2600tp", "infrasim_s2600wtt",
                               "infrasim_vnode"}) {
        SCOPED_TRACE(server);
        std::shared_ptr<Sim::Bmc> bmc;
        ASSERT_NO_THROW(bmc = Sim::loadProfile(dir + "/" + server + ".emu"));
        EXPECT_EQ(repository(*bmc), fileBytes(TestSupport::realDataPath(std::string("sdr/") + server + ".sdr")));
        EXPECT_FALSE(bmc->sensors.empty());
        for (int device = 0; device < 256; ++device) {
            const std::string image =
                TestSupport::realDataPath("fru/" + std::string(server) + "_fru" + std::to_string(device) + ".bin");
            if (image.empty()) continue;
            ASSERT_TRUE(bmc->fru.devices.count(static_cast<uint8_t>(device))) << device;
            const Bytes expected = fileBytes(image), held = bmc->fru.devices.at(static_cast<uint8_t>(device)).data;
            ASSERT_GE(held.size(), expected.size());
            EXPECT_TRUE(std::equal(expected.begin(), expected.end(), held.begin())) << device;
        }
    }
    // ATCA is written for an older all-hexadecimal dialect, ipmisim1 gives FRU data to a
    // controller before adding it, and the Marvell pair lost their file names.
    for (const auto& c : std::vector<std::pair<std::string, std::string>>{
             {"openipmi_atca.emu", ":6: bad number '1f' for device support"},
             {"openipmi_ipmisim1.emu", ":39: no controller at 0x30 (mc_add it first)"},
             {"openipmi_marvell_marvell.emu", ":63: cannot open include file " + dir + "/marvell_node.emu"},
             {"openipmi_marvell_marvell_node.emu", ":2: undefined name $MCNUM"}})
        EXPECT_EQ(loadError(dir + "/" + c.first), dir + "/" + c.first + c.second);
    if (const std::string dump = TestSupport::realDataPath("sdr/openipmi_marvell_axp_sdrcomp.sdr"); !dump.empty()) {
        auto bmc = Sim::loadProfile(dump);
        EXPECT_EQ(repository(*bmc), fileBytes(dump));
        EXPECT_TRUE(bmc->sensors.empty());
    }
}

// A large server by name: every sensor record has a key of its own (the
// controllers past the BMC answer on IPMB), a SEL of half as many events up
// to the log's size, and the default server's FRU devices.
TEST(SimProfile, GeneratedServersByName) {
    auto bmc = Sim::loadProfile("generated:4000");
    ASSERT_EQ(bmc->sdr.records.size(), 4000u);
    std::set<std::pair<uint8_t, uint8_t>> keys;
    size_t sensorRecords = 0;
    for (const auto& r : bmc->sdr.records) {
        if (r[3] == sdr::type::fruDeviceLocator) continue;
        ++sensorRecords;
        keys.emplace(r[sdr::key::ownerId], r[sdr::key::sensorNumber]);
    }
    EXPECT_EQ(keys.size(), sensorRecords);
    EXPECT_EQ(keys.rbegin()->first, 0x2C + 2 * 14);
    Sim::Request viaIpmb{netfn::sensorEvent, cmd::getSensorReading, 0, 0, 0x2E, true, {0}};
    EXPECT_EQ(bmc->handle(viaIpmb)[0], cc::ok);
    EXPECT_EQ(bmc->sel.records.size(), 1024u);
    EXPECT_EQ(Sim::loadProfile("generated:9")->sel.records.size(), 4u);
    EXPECT_EQ(bmc->fru.devices.size(), 2u);

    EXPECT_EQ(loadError("generated:0"), "generated:0: a generated server has 1 to 8000 SDR records");
    EXPECT_EQ(loadError("generated:8001"), "generated:8001: a generated server has 1 to 8000 SDR records");
    EXPECT_EQ(loadError("generated:1k"), "generated:1k: a generated server has 1 to 8000 SDR records");
    EXPECT_EQ(Sim::loadProfile("generated:8000")->sdr.records.size(), 8000u);
}

}  // namespace
