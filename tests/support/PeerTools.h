#ifndef TAV_IPMI_TESTS_PEERTOOLS_H
#define TAV_IPMI_TESTS_PEERTOOLS_H

// Independent IPMI clients (ipmitool, FreeIPMI) run against the simulated
// controller through the preload library, and the text helpers that read
// what they print.

#include <string>
#include <vector>

#include "Text.h"

namespace TestSupport {

struct ToolRun {
    int exitCode = -1;
    std::string out;
    std::string err;
};

// Path of an installed program, or "" (FreeIPMI installs into sbin).
std::string toolPath(const std::string& name);

// Runs `tool args...` with the simulator behind its /dev/ipmi0, loaded from
// `profile` (a path, or "default"; empty: no simulator at all). Time is
// virtual, so requests the controller leaves unanswered cost nothing.
// `extraEnv` adds NAME=VALUE entries; the tool is killed (SIGALRM) after
// `seconds` of real time.
ToolRun runTool(const std::string& profile, const std::string& tool, const std::vector<std::string>& args,
                const std::vector<std::string>& extraEnv = {}, unsigned seconds = 60);

// `ipmi-sensors` on the simulator with a fresh SDR cache of its own.
ToolRun runIpmiSensors(const std::string& profile, const std::vector<std::string>& extraArgs = {});

// The captured repositories that have reference decodings beside them, as
// paths without their ".sdr", and the profile that serves each: the captured
// server's profile when there is one (the references were taken from ipmi_sim
// running it), else the bare SDR dump.
std::vector<std::string> referenceSets();
std::string referenceProfile(const std::string& set);

}  // namespace TestSupport

#define SKIP_WITHOUT_TOOL(name) \
    if (TestSupport::toolPath(name).empty()) GTEST_SKIP() << name << " is not installed"

#endif
