// The command-line tool on the simulated controller. It runs under the
// preload library directly, as the peer tools do: its own --simulate
// re-executes it with that library in front of any sanitizer runtime.

#include <gtest/gtest.h>

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
        {"fru", {"  FRU 1 PS1 (Power Supply 10.1)", "    PSU capacity (W)       550"}},
    };
    for (const auto& v : views) {
        SCOPED_TRACE(v.view);
        ToolRun run = tavipmi({v.view});
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

}  // namespace

#endif
