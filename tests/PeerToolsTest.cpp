// Independent IPMI clients (ipmitool, FreeIPMI) run against the simulated
// controller through the preload library: they must see the simulator as a
// real BMC, and see the captured servers as the reference decodings show them.

#include <gtest/gtest.h>

#include <fcntl.h>
#include <ftw.h>
#include <link.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "Bmc.h"
#include "TestSupport.h"

extern char** environ;

namespace {

struct ToolRun {
    int exitCode = -1;
    std::string out;
    std::string err;
};

// Path of an installed program, or "" (FreeIPMI installs into sbin).
std::string toolPath(const std::string& name) {
    std::string dirs = getenv("PATH") ? getenv("PATH") : "";
    dirs += ":/usr/sbin:/sbin:/usr/bin:/bin";
    std::stringstream list(dirs);
    std::string dir;
    while (std::getline(list, dir, ':')) {
        std::string path = dir + "/" + name;
        if (!dir.empty() && access(path.c_str(), X_OK) == 0) return path;
    }
    return "";
}

// A sanitizer runtime this test runs under: a preload library built with the
// same flags needs it loaded first in the tool's process.
std::string sanitizerRuntime() {
    std::string found;
    dl_iterate_phdr(
        [](struct dl_phdr_info* info, size_t, void* data) {
            const char* name = info->dlpi_name;
            if (name && (strstr(name, "/libasan.so") || strstr(name, "/libtsan.so"))) {
                *static_cast<std::string*>(data) = name;
                return 1;
            }
            return 0;
        },
        &found);
    return found;
}

std::string readAll(int fd) {
    std::string text;
    char buffer[4096];
    ssize_t n;
    while ((n = read(fd, buffer, sizeof buffer)) > 0) text.append(buffer, static_cast<size_t>(n));
    return text;
}

// Runs `tool args...` with the simulator behind its /dev/ipmi0, loaded from
// `profile` (a path, or "default"; empty: no simulator at all).
ToolRun run(const std::string& profile, const std::string& tool, const std::vector<std::string>& args) {
    ToolRun result;
    std::vector<std::string> env;
    for (char** e = environ; *e; ++e)
        if (strncmp(*e, "LD_PRELOAD=", 11) != 0 && strncmp(*e, "TAV_IPMI_SIM_", 13) != 0 &&
            strncmp(*e, "ASAN_OPTIONS=", 13) != 0)
            env.push_back(*e);
    if (!profile.empty()) {
        std::string runtime = sanitizerRuntime();
        env.push_back("LD_PRELOAD=" + (runtime.empty() ? "" : runtime + ":") + TAV_IPMI_PRELOAD_LIB);
        env.push_back("TAV_IPMI_SIM_PROFILE=" + profile);
        // The tools free little before they exit; their leaks are not ours to report.
        env.push_back("ASAN_OPTIONS=detect_leaks=0");
    }
    std::vector<char*> envp;
    for (auto& e : env) envp.push_back(&e[0]);
    envp.push_back(nullptr);
    std::vector<std::string> argStrings{tool};
    argStrings.insert(argStrings.end(), args.begin(), args.end());
    std::vector<char*> argv;
    for (auto& a : argStrings) argv.push_back(&a[0]);
    argv.push_back(nullptr);

    char errName[] = "/tmp/tav-peer-err-XXXXXX";
    int errFd = mkstemp(errName);
    int out[2];
    if (errFd < 0 || pipe(out) != 0) return result;
    pid_t pid = fork();
    if (pid == 0) {
        dup2(out[1], 1);
        dup2(errFd, 2);
        close(out[0]);
        alarm(60);  // a hung tool ends the test instead of stalling it
        execve(argv[0], argv.data(), envp.data());
        _exit(127);
    }
    close(out[1]);
    result.out = readAll(out[0]);
    close(out[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    result.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    lseek(errFd, 0, SEEK_SET);
    result.err = readAll(errFd);
    close(errFd);
    unlink(errName);
    return result;
}

std::string trim(const std::string& s) {
    size_t b = s.find_first_not_of(" \t\r\n");
    size_t e = s.find_last_not_of(" \t\r\n");
    return b == std::string::npos ? std::string() : s.substr(b, e - b + 1);
}

std::vector<std::string> lines(const std::string& text) {
    std::vector<std::string> out;
    std::stringstream in(text);
    std::string line;
    while (std::getline(in, line)) out.push_back(line);
    return out;
}

std::vector<std::string> split(const std::string& line, char sep) {
    std::vector<std::string> out;
    std::stringstream in(line);
    std::string part;
    while (std::getline(in, part, sep)) out.push_back(part);
    return out;
}

// "Name : value" lines; the first of each name.
std::map<std::string, std::string> fields(const std::string& text) {
    std::map<std::string, std::string> out;
    for (const auto& line : lines(text)) {
        size_t colon = line.find(" : ");
        if (colon == std::string::npos) continue;
        std::string name = trim(line.substr(0, colon));
        if (!name.empty() && !out.count(name)) out[name] = trim(line.substr(colon + 3));
    }
    return out;
}

std::string fileText(const std::string& path) {
    std::ifstream in(path);
    std::stringstream s;
    s << in.rdbuf();
    return s.str();
}

// A fresh FreeIPMI SDR cache directory per run, so no run reads another's cache.
class CacheDir {
public:
    CacheDir() {
        char pattern[] = "/tmp/tav-sdr-cache-XXXXXX";
        if (mkdtemp(pattern)) path_ = pattern;
    }
    ~CacheDir() {
        if (path_.empty()) return;
        nftw(
            path_.c_str(), [](const char* p, const struct stat*, int, struct FTW*) { return remove(p); }, 16,
            FTW_DEPTH | FTW_PHYS);
    }
    const std::string& path() const { return path_; }

private:
    std::string path_;
};

ToolRun ipmiSensors(const std::string& profile) {
    CacheDir cache;
    return run(profile, toolPath("ipmi-sensors"),
               {"--driver-type=OPENIPMI", "--sdr-cache-directory=" + cache.path(), "--quiet-cache"});
}

#define SKIP_WITHOUT_TOOL(name) \
    if (toolPath(name).empty()) GTEST_SKIP() << name << " is not installed"

TEST(PeerTools, IpmitoolShowsTheDefaultIdentity) {
    SKIP_WITHOUT_TOOL("ipmitool");
    // mc_add 0x20 0x20 no-device-sdrs 0x01 0x02 0x10 0xbf 0x0002a2 0x0100
    ToolRun info = run("default", toolPath("ipmitool"), {"-I", "open", "mc", "info"});
    ASSERT_EQ(info.exitCode, 0) << info.err;
    auto f = fields(info.out);
    EXPECT_EQ(f["Device ID"], "32");
    EXPECT_EQ(f["Device Revision"], "1");
    EXPECT_EQ(f["Firmware Revision"], "2.10");
    EXPECT_EQ(f["IPMI Version"], "2.0");
    EXPECT_EQ(f["Manufacturer ID"], "674");
    EXPECT_EQ(f["Manufacturer Name"], "Dell Inc.");
    EXPECT_EQ(f["Product ID"], "256 (0x0100)");
    EXPECT_EQ(f["Device Available"], "yes");
    EXPECT_EQ(f["Provides Device SDRs"], "no");
    for (const char* device : {"Sensor Device", "SDR Repository Device", "SEL Device", "FRU Inventory Device",
                               "IPMB Event Receiver", "IPMB Event Generator", "Chassis Device"})
        EXPECT_NE(info.out.find("    " + std::string(device) + "\n"), std::string::npos) << device;
    EXPECT_EQ(info.out.find("    Bridge\n"), std::string::npos);

    ToolRun raw = run("default", toolPath("ipmitool"), {"-I", "open", "raw", "0x06", "0x01"});
    ASSERT_EQ(raw.exitCode, 0) << raw.err;
    EXPECT_EQ(trim(raw.out), "20 01 02 10 02 bf a2 02 00 00 01 00 00 00 00");
}

TEST(PeerTools, IpmitoolShowsACapturedIdentity) {
    SKIP_WITHOUT_TOOL("ipmitool");
    std::string profile = TestSupport::realDataPath("sim/infrasim_s2600wtt.emu");
    SKIP_WITHOUT_REAL_DATA(profile);
    // mc_add 0x20 33 no-device-sdrs 0x1 1 33 0xbf 0x157 0x6f: decimal where no 0x is written.
    ToolRun raw = run(profile, toolPath("ipmitool"), {"-I", "open", "raw", "0x06", "0x01"});
    ASSERT_EQ(raw.exitCode, 0) << raw.err;
    EXPECT_EQ(trim(raw.out), "21 01 01 21 02 bf 57 01 00 6f 00 00 00 00 00");
    auto f = fields(run(profile, toolPath("ipmitool"), {"-I", "open", "mc", "info"}).out);
    EXPECT_EQ(f["Firmware Revision"], "1.21");
    EXPECT_EQ(f["Manufacturer Name"], "Intel Corporation");
}

TEST(PeerTools, FreeIpmiBmcInfoShowsTheDefaultIdentity) {
    SKIP_WITHOUT_TOOL("bmc-info");
    ToolRun info = run("default", toolPath("bmc-info"), {"--driver-type=OPENIPMI"});
    ASSERT_EQ(info.exitCode, 0) << info.err;
    auto f = fields(info.out);
    EXPECT_EQ(f["Device ID"], "32");
    EXPECT_EQ(f["Device Revision"], "1");
    EXPECT_EQ(f["Device SDRs"], "unsupported");
    EXPECT_EQ(f["Firmware Revision"], "2.10");
    EXPECT_EQ(f["Device Available"], "yes (normal operation)");
    EXPECT_EQ(f["IPMI Version"], "2.0");
    EXPECT_EQ(f["Manufacturer ID"], "Dell Inc. (674)");
    EXPECT_EQ(f["Product ID"], "256");
    EXPECT_EQ(f["Bridge"], "unsupported");
    EXPECT_EQ(f["Chassis Device"], "supported");
}

// The SDR sets with reference decodings, and the profile that serves each.
struct ReferenceSet {
    const char* name;
    const char* profile;  // under the real data directory
};

void PrintTo(const ReferenceSet& set, std::ostream* os) { *os << set.name; }

const ReferenceSet kReferenceSets[] = {
    {"infrasim_dell_c6320", "sim/infrasim_dell_c6320.emu"},
    {"infrasim_dell_r630", "sim/infrasim_dell_r630.emu"},
    {"infrasim_dell_r640", "sim/infrasim_dell_r640.emu"},
    {"infrasim_dell_r730", "sim/infrasim_dell_r730.emu"},
    {"infrasim_dell_r730xd", "sim/infrasim_dell_r730xd.emu"},
    {"infrasim_dell_r740xd", "sim/infrasim_dell_r740xd.emu"},
    {"infrasim_quanta_d51", "sim/infrasim_quanta_d51.emu"},
    {"infrasim_quanta_t41", "sim/infrasim_quanta_t41.emu"},
    {"infrasim_s2600kp", "sim/infrasim_s2600kp.emu"},
    {"infrasim_s2600tp", "sim/infrasim_s2600tp.emu"},
    {"infrasim_s2600wtt", "sim/infrasim_s2600wtt.emu"},
    {"infrasim_vnode", "sim/infrasim_vnode.emu"},
    {"openipmi_marvell_axp_sdrcomp", "sdr/openipmi_marvell_axp_sdrcomp.sdr"},
    {"rawsel_ast2500_intel2s", "sdr/rawsel_ast2500_intel2s.sdr"},
};

class PeerToolsReference : public ::testing::TestWithParam<ReferenceSet> {
protected:
    void SetUp() override {
        profile_ = TestSupport::realDataPath(GetParam().profile);
        SKIP_WITHOUT_REAL_DATA(profile_);
    }
    std::string reference(const char* tool) {
        return TestSupport::realDataPath(std::string("sdr/") + GetParam().name + "." + tool + ".txt");
    }
    std::string profile_;
};

TEST_P(PeerToolsReference, IpmitoolListsTheRepositoryAsTheReference) {
    SKIP_WITHOUT_TOOL("ipmitool");
    std::string expected = reference("ipmitool-sdr-elist");
    SKIP_WITHOUT_REAL_DATA(expected);
    ToolRun elist = run(profile_, toolPath("ipmitool"), {"-I", "open", "sdr", "elist", "all"});
    ASSERT_EQ(elist.exitCode, 0) << elist.err;
    EXPECT_EQ(elist.out, fileText(expected));
}

TEST_P(PeerToolsReference, FreeIpmiReadsTheSensorsAsTheReference) {
    SKIP_WITHOUT_TOOL("ipmi-sensors");
    std::string expected = reference("ipmi-sensors");
    SKIP_WITHOUT_REAL_DATA(expected);
    ToolRun sensors = ipmiSensors(profile_);
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
    auto theirs = lines(fileText(expected));
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

INSTANTIATE_TEST_SUITE_P(PeerTools, PeerToolsReference, ::testing::ValuesIn(kReferenceSets),
                         [](const ::testing::TestParamInfo<ReferenceSet>& p) { return std::string(p.param.name); });

TEST(PeerTools, IpmitoolDecodesTheDefaultServer) {
    SKIP_WITHOUT_TOOL("ipmitool");
    ToolRun elist = run("default", toolPath("ipmitool"), {"-I", "open", "sdr", "elist", "all"});
    ASSERT_EQ(elist.exitCode, 0) << elist.err;
    EXPECT_EQ(elist.err, "");
    // Every record but the three entity associations and two OEM records has a row.
    EXPECT_EQ(lines(elist.out).size(), 32u) << elist.out;
    for (const char* row : {
             "BMC              | 00h | ok  |  7.1 | Dynamic MC @ 20h",
             "ME               | 00h | ok  | 46.1 | Dynamic MC @ 2Ch",
             "PS1              | 00h | ns  | 10.1 | Logical FRU @01h",
             // Two's complement with lower thresholds below 0 C. ipmi_sim compares
             // such readings as unsigned bytes and would show 22 C as 'lcr'.
             "Inlet Temp       | 01h | ok  | 55.1 | 22 degrees C",
             "CPU1 VCORE       | 13h | ok  |  3.1 | 1.15 Volts",
             "Fan2             | 31h | ok  | 29.2 | 6060 RPM",
             "PS1 Input Power  | 40h | ok  | 10.1 | 232 Watts",
             "PS2 Input Power  | 41h | ns  | 10.2 | No Reading",
             "PS1 Current      | 42h | ok  | 10.1 | 1 Amps",
             "PS1 Status       | 50h | ok  | 10.1 | Presence detected",
             "DIMM B           | 64h | ok  | 32.5 | Presence Detected",
             "Drive            | 70h | ok  |  4.1 | Drive Present",
             "OS Watchdog      | 92h | ns  |  7.1 | Event-Only",
         })
        EXPECT_NE(elist.out.find(std::string(row) + "\n"), std::string::npos) << row << "\n" << elist.out;

    ToolRun list = run("default", toolPath("ipmitool"), {"-I", "open", "sdr", "list"});
    ASSERT_EQ(list.exitCode, 0) << list.err;
    EXPECT_EQ(list.err, "");
    EXPECT_NE(list.out.find("12V              | 12.06 Volts       | ok\n"), std::string::npos) << list.out;
    EXPECT_NE(list.out.find("VBAT             | 3.04 Volts        | ok\n"), std::string::npos) << list.out;
}

TEST(PeerTools, FreeIpmiDecodesTheDefaultServer) {
    SKIP_WITHOUT_TOOL("ipmi-sensors");
    ToolRun sensors = ipmiSensors("default");
    ASSERT_EQ(sensors.exitCode, 0) << sensors.err;
    EXPECT_EQ(sensors.err, "");
    std::map<std::string, std::string> rows;  // name -> the columns after it
    for (const auto& line : lines(sensors.out)) {
        auto f = split(line, '|');
        if (f.size() == 6 && trim(f[0]) != "ID") rows[trim(f[1])] = line.substr(line.find('|', line.find('|') + 1) + 1);
    }
    EXPECT_EQ(rows.size(), 25u) << sensors.out;  // every full and compact sensor record
    EXPECT_EQ(rows["Inlet Temp"], " Temperature              | 22.00      | C     | 'OK'");
    EXPECT_EQ(rows["Exhaust Temp"], " Temperature              | 34.00      | C     | 'OK'");
    EXPECT_EQ(rows["CPU2 VCORE"], " Voltage                  | 1.14       | V     | 'OK'");
    EXPECT_EQ(rows["Pwr Consumption"], " Current                  | 220.00     | W     | 'OK'");
    EXPECT_EQ(rows["PS2 Input Power"], " Other Units Based Sensor | N/A        | W     | N/A");
    EXPECT_EQ(rows["CPU"], " Processor                | N/A        | N/A   | 'Processor Presence detected'");
    EXPECT_EQ(rows["Intrusion"], " Physical Security        | N/A        | N/A   | 'OK'");
}

// ipmi_sim answers 0xCC for a sensor it does not have; a BMC answers 0xCB.
TEST(PeerTools, AnAbsentSensorIsNotPresent) {
    SKIP_WITHOUT_TOOL("ipmitool");
    ToolRun raw = run("default", toolPath("ipmitool"), {"-I", "open", "raw", "0x04", "0x2d", "0x41"});
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
        ToolRun fru = run("", toolPath("ipmi-fru"), {"-v", std::string("--fru-file=") + name});
        unlink(name);
        EXPECT_EQ(fru.exitCode, 0) << fru.err;
        EXPECT_EQ(fru.out.find("checksum"), std::string::npos) << fru.out;
        for (const auto& line : device.second) EXPECT_NE(fru.out.find("  " + line + "\n"), std::string::npos) << line;
    }
}

}  // namespace
