// The command-line tool on the simulated controller. It runs under the
// preload library directly, as the peer tools do: its own --simulate
// re-executes it with that library in front of any sanitizer runtime.

#include <gtest/gtest.h>

#include <fstream>
#include <sstream>

#include "PeerTools.h"
#include "TestSupport.h"

#ifdef TAV_IPMI_TOOL

namespace {

using TestSupport::ToolRun;

ToolRun tavipmi(const std::vector<std::string>& args) { return TestSupport::runTool("default", TAV_IPMI_TOOL, args); }

TEST(Tool, ViewsShowTheSimulatedServer) {
    const struct {
        const char* view;
        std::vector<std::string> lines;
    } views[] = {
        {"identity", {"  Manufacturer       : Dell Inc. (674)", "  Firmware version   : 2.10"}},
        {"lan", {"  IP address         : 192.168.1.10", "  MAC address        : 00:14:22:0a:1b:2c"}},
        {"sensors", {"  PS1 Input Power  | Other                    | 232 Watts                | ok      | OK"}},
        {"entities", {"  System Chassis (23.1)", "    Power Supply (10.2)"}},
        {"sel", {"  0006 | 2025-11-25 12:33:18 | DIMM A 3 #0x62       | Assert + Memory Correctable ECC                  | -"
                 "        | Correctable ECC"}},
        {"watch", {"Watching the system event log (Ctrl-C ends)",
                   " | Inlet Temp #0x01     | Deassert + Temperature Upper Non-critical going high | major    | Upper "
                   "Non-critical going high"}},
        {"fru", {"  FRU 1 PS1 (Power Supply 10.1)", "    PSU capacity (W)       550"}},
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
    EXPECT_NE(run.out.find("  FRU 0 System Board (System Board 7.1)\n    Product manufacturer   DELTA\n"),
              std::string::npos)
        << run.out;
}

TEST(Tool, AnUnknownViewIsRefusedWithTheUsage) {
    ToolRun run = tavipmi({"bogus"});
    EXPECT_EQ(run.exitCode, 2);
    EXPECT_EQ(run.err.rfind("tavipmi: unknown view 'bogus'\nusage: tavipmi", 0), 0u) << run.err;
}

// Every view and option that --help lists is described in the manual page.
TEST(Tool, TheManualPageListsWhatHelpLists) {
    ToolRun help = tavipmi({"--help"});
    ASSERT_EQ(help.exitCode, 0);
    std::ifstream in(std::string(TAV_IPMI_SOURCE_DIR) + "/tools/tavipmi.1");
    const std::string page((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::istringstream lines(help.out.substr(help.out.find("views:\n") + 7));
    for (std::string line; std::getline(lines, line);) {
        const std::string view = line.substr(2, line.find(' ', 2) - 2);
        EXPECT_NE(page.find("\n.B " + view + "\n"), std::string::npos) << view;
    }
    for (const char* option : {"simulate", "help", "version"})
        EXPECT_NE(page.find("\\-\\-" + std::string(option)), std::string::npos) << option;
}

}  // namespace

#endif
