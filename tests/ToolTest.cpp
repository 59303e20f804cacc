// The command-line tool on the simulated controller. It runs under the
// preload library directly, as the peer tools do: its own --simulate
// re-executes it with that library in front of any sanitizer runtime.

#include <gtest/gtest.h>
#include <signal.h>
#include <stdlib.h>
#include <unistd.h>

#include <fstream>
#include <sstream>

#include <nlohmann/json.hpp>

#include "PeerTools.h"
#include "TestSupport.h"

#ifdef TAV_IPMI_TOOL

namespace {

using TestSupport::ToolRun;
using Json = nlohmann::json;

ToolRun tavipmi(const std::vector<std::string>& args, const std::string& profile = "default") {
    return TestSupport::runTool(profile, TAV_IPMI_TOOL, args);
}

std::string defaultProfile() { return TestSupport::readFile(std::string(TAV_IPMI_SOURCE_DIR) + "/sim/profiles/default.emu"); }

// The record IDs a JSON watch printed, in order.
std::vector<unsigned> watched(const std::string& out) {
    std::vector<unsigned> ids;
    std::istringstream in(out);
    for (std::string line; std::getline(in, line);)
        if (!line.empty() && line[0] == '{') ids.push_back(Json::parse(line).at("record_id").get<unsigned>());
    return ids;
}

// watch keeps where delivery stands: killed while events arrive and started
// again, it hands over the records logged meanwhile once, then goes on; a
// damaged state file starts afresh with one warning.
TEST(Tool, WatchResumesAfterAKillWithNothingLostOrRepeated) {
    char dir[] = "/tmp/tav-watch-XXXXXX";
    ASSERT_NE(mkdtemp(dir), nullptr);
    const std::string sel = std::string(dir) + "/sel", state = std::string(dir) + "/state";
    const std::vector<std::string> env{"TAV_IPMI_SIM_SEL_FILE=" + sel};
    auto watch = [&](std::vector<std::string> more, unsigned seconds) {
        std::vector<std::string> args{"--format", "json", "watch", "--demo", "--state", state};
        args.insert(args.end(), more.begin(), more.end());
        return TestSupport::runTool("default", TAV_IPMI_TOOL, args, env, seconds);
    };
    const ToolRun first = watch({}, 4);  // killed by the alarm after about three records
    EXPECT_EQ(first.exitCode, 128 + SIGALRM);
    EXPECT_NE(first.err.find("tavipmi: no SEL delivery state in " + state +
                             " yet: delivering the records logged from now on"),
              std::string::npos);
    // While it is down the controller logs two more events.
    std::string log = TestSupport::readFile(sel);
    ASSERT_GE(log.size(), 16u * 9);
    for (int i = 0; i < 2; ++i) {
        std::string record = log.substr(log.size() - 16);
        const unsigned id = uint8_t(record[0]) + 1u;
        record[0] = char(id & 0xFF), record[1] = char(id >> 8), record[15] = char(0x40 + i);
        log += record;
    }
    { std::ofstream(sel, std::ios::binary | std::ios::trunc) << log; }
    const ToolRun second = watch({"--count", "4"}, 30);
    EXPECT_EQ(second.exitCode, 0) << second.err;
    std::vector<unsigned> printed = watched(first.out), more = watched(second.out);
    printed.insert(printed.end(), more.begin(), more.end());
    std::vector<unsigned> logged;  // after the eight records the profile starts with
    log = TestSupport::readFile(sel);
    for (size_t at = 16 * 8; at + 16 <= log.size() && logged.size() < printed.size(); at += 16)
        logged.push_back(uint8_t(log[at]) | uint8_t(log[at + 1]) << 8);
    EXPECT_GE(watched(first.out).size(), 2u);
    EXPECT_EQ(printed, logged);

    { std::ofstream(state) << "{\"format\": 1, \"record_id\": "; }
    const ToolRun damaged = watch({"--count", "1"}, 30);
    EXPECT_NE(damaged.err.find("tavipmi: SEL delivery state in " + state +
                               " is damaged (not JSON): delivering the records logged from now on"),
              std::string::npos)
        << damaged.err;
    for (const std::string& f : {sel, state}) remove(f.c_str());
    rmdir(dir);
}

TEST(Tool, ViewsShowTheSimulatedServer) {
    const struct {
        const char* view;
        std::vector<std::string> lines;
    } views[] = {
        {"identity", {"  Manufacturer          : Dell Inc.", "  Firmware revision     : 2.10"}},
        {"lan", {"  IP address      : 192.168.1.10", "  MAC address     : 00:14:22:0a:1b:2c"}},
        {"sensors", {"  PS1 Input Power | 64  | 10.1   | Other                  | 232 Watts    | ok                | na  "
                     "| na     | na     | 600    | 660    | na  | OK"}},
        {"entities", {"  System Chassis (23.1)", "    Power Supply (10.2)"}},
        {"sel", {"  6  | 2025-11-25 12:33:18 | DIMM A 3 #0x62      | Assert + Memory Correctable ECC                        "
                 "| none     | Correctable ECC"}},
        {"watch", {"Watching the system event log (Ctrl-C ends)",
                   " | Inlet Temp #0x01     | Deassert + Temperature Upper Non-critical going high | major    | Upper "
                   "Non-critical going high"}},
        {"fru", {"  Name                  : PS1", "  PSU capacity (W)      : 550"}},
    };
    for (const auto& v : views) {
        SCOPED_TRACE(v.view);
        // The watch ends after two records that its demo logs on the simulator.
        ToolRun run = v.view == std::string("watch") ? tavipmi({"watch", "--demo", "--count", "2"}) : tavipmi({v.view});
        EXPECT_EQ(run.exitCode, 0) << run.err;
        for (const auto& line : v.lines) EXPECT_NE(run.out.find(line + "\n"), std::string::npos) << run.out;
    }
}

TEST(Tool, AFruImageFileIsServedAsDeviceZero) {
    const std::string image = TestSupport::realDataPath("fru/infrasim_s2600wtt_fru2.bin");
    if (image.empty()) GTEST_SKIP() << "real server data not present";
    ToolRun run = TestSupport::runTool(image, TAV_IPMI_TOOL, {"fru"});
    EXPECT_EQ(run.exitCode, 0) << run.err;
    EXPECT_NE(run.out.find("  Device ID             : 0\n  Name                  : System Board\n"), std::string::npos)
        << run.out;
    EXPECT_NE(run.out.find("  Product manufacturer  : DELTA\n"), std::string::npos) << run.out;
}

// JSON carries numbers and nulls; CSV the same records under a header row.
TEST(Tool, SensorsInJsonAndCsvAgree) {
    ToolRun json = tavipmi({"sensors", "--format", "json"});
    ASSERT_EQ(json.exitCode, 0) << json.err;
    const Json sensors = Json::parse(json.out)["sensors"];
    std::map<std::string, Json> byName;
    for (const auto& s : sensors) byName[s["name"]] = s;
    EXPECT_EQ(byName["PS1 Input Power"]["reading"], 232.0);
    EXPECT_EQ(byName["PS1 Input Power"]["unit"], "Watts");
    EXPECT_EQ(byName["PS1 Input Power"]["ucr"], 660.0);
    EXPECT_EQ(byName["PS1 Input Power"]["health_state"], 5);
    EXPECT_TRUE(byName["PS1 Input Power"]["lnr"].is_null());
    EXPECT_TRUE(byName["PS2 Input Power"]["reading"].is_null());
    EXPECT_EQ(byName["PS2 Input Power"]["state"], "not present");
    EXPECT_EQ(byName["Inlet Temp"]["entity"], "55.1");

    ToolRun csv = tavipmi({"--format", "csv", "sensors"});
    ASSERT_EQ(csv.exitCode, 0) << csv.err;
    const auto lines = TestSupport::lines(csv.out);
    ASSERT_EQ(lines.size(), sensors.size() + 1);
    EXPECT_EQ(lines[0], "name,number,entity,entity_name,type,reading,unit,state,lnr,lcr,lnc,unc,ucr,unr,health,health_state");
    EXPECT_EQ(lines[1].rfind("Inlet Temp,1,55.1,", 0), 0u) << lines[1];

    ToolRun fans = tavipmi({"sensors", "-t", "fan", "--format", "json"});
    EXPECT_EQ(Json::parse(fans.out)["sensors"].size(), 4u) << fans.out;
}

TEST(Tool, MetricsCarryTheSameReadings) {
    ToolRun run = tavipmi({"metrics"});
    ASSERT_EQ(run.exitCode, 0) << run.err;
    for (const char* line :
         {"tavipmi_sensor_watts{name=\"PS1 Input Power\",number=\"64\",entity=\"10.1\",type=\"Other\"} 232\n",
          "tavipmi_sensor_threshold_watts{name=\"PS1 Input Power\",number=\"64\",entity=\"10.1\",type=\"Other\","
          "threshold=\"ucr\"} 660\n",
          "# TYPE tavipmi_sensor_health_state gauge\n",
          "firmware_revision=\"2.10\""})
        EXPECT_NE(run.out.find(line), std::string::npos) << line;
}

// Firmware minor revisions are two BCD digits, as the peer tools print them.
TEST(Tool, FirmwareRevisionKeepsItsLeadingZero) {
    std::string profile = defaultProfile();
    const std::string controller = "mc_add 0x20 0x20 no-device-sdrs 0x01 0x02 0x10";
    ASSERT_NE(profile.find(controller), std::string::npos);
    profile.replace(profile.find(controller), controller.size(), "mc_add 0x20 0x20 no-device-sdrs 0x01 0x03 0x0f");
    char dir[] = "/tmp/tav-tool-XXXXXX";
    ASSERT_NE(mkdtemp(dir), nullptr);
    const std::string path = std::string(dir) + "/fw.emu";
    std::ofstream(path) << profile;
    ToolRun run = tavipmi({"identity", "--format", "json"}, path);
    EXPECT_EQ(Json::parse(run.out)["identity"]["firmware_revision"], "3.0f") << run.out << run.err;
    unlink(path.c_str());
    rmdir(dir);
}

TEST(Tool, MisuseIsRefusedWithTheUsage) {
    for (const auto& args : std::vector<std::vector<std::string>>{
             {"bogus"}, {"--bogus"}, {"sensors", "extra"}, {"--format", "xml", "sensors"}, {"setos", "only-name"}}) {
        SCOPED_TRACE(args[0] + " " + args.back());
        ToolRun run = tavipmi(args);
        EXPECT_EQ(run.exitCode, 2);
        EXPECT_EQ(run.err.rfind("tavipmi: ", 0), 0u) << run.err;
        EXPECT_NE(run.err.find("\nUsage: tavipmi"), std::string::npos) << run.err;
    }
}

// A profile that cannot be loaded is reported once, with the system's reason.
TEST(Tool, AnUnloadableProfileIsOneMessage) {
    const struct {
        std::string profile, message;
    } cases[] = {
        {"/tmp", "tav-ipmi simulator: /tmp: Is a directory\n"},
        {"/nonexistent.emu", "tav-ipmi simulator: /nonexistent.emu: No such file or directory\n"},
    };
    for (const auto& c : cases) {
        ToolRun run = tavipmi({"sensors"}, c.profile);
        EXPECT_EQ(run.exitCode, 2);
        EXPECT_EQ(run.err, c.message);
    }
}

// Every view and option that --help lists is described in the manual page.
TEST(Tool, TheManualPageListsWhatHelpLists) {
    ToolRun help = tavipmi({"--help"});
    ASSERT_EQ(help.exitCode, 0);
    std::ifstream in(std::string(TAV_IPMI_SOURCE_DIR) + "/tools/tavipmi.1");
    const std::string page((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::istringstream lines(help.out.substr(help.out.find("Subcommands:\n") + 13));
    std::vector<std::string> views;
    for (std::string line; std::getline(lines, line) && line.size() > 2;) {
        views.push_back(line.substr(2, line.find(' ', 2) - 2));
        EXPECT_NE(page.find("\n.B " + views.back() + "\n"), std::string::npos) << views.back();
    }
    EXPECT_GE(views.size(), 8u);
    for (const auto& view : views) {
        ToolRun viewHelp = tavipmi({view, "--help"});
        std::istringstream options(viewHelp.out);
        for (std::string line; std::getline(options, line);) {
            const size_t dash = line.find("--");
            if (dash == std::string::npos || line.find("--help") != std::string::npos) continue;
            const std::string option = line.substr(dash + 2, line.find_first_of(" =", dash) - dash - 2);
            EXPECT_NE(page.find("\\-\\-" + option), std::string::npos) << view << " --" << option;
        }
    }
    for (const char* option : {"simulate", "format", "help", "version"})
        EXPECT_NE(page.find("\\-\\-" + std::string(option)), std::string::npos) << option;
}

}  // namespace

#endif
