#ifndef TAV_IPMI_TESTS_PEERTOOLS_H
#define TAV_IPMI_TESTS_PEERTOOLS_H

// Independent IPMI clients (ipmitool, FreeIPMI) run against the simulated
// controller through the preload library, and the text helpers that read
// what they print.

#include <map>
#include <string>
#include <vector>

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
ToolRun runTool(const std::string& profile, const std::string& tool, const std::vector<std::string>& args);

// A FreeIPMI program (e.g. "ipmi-sel") on the simulator with a fresh SDR cache of its own.
ToolRun runFreeIpmi(const std::string& profile, const std::string& program, const std::vector<std::string>& extraArgs);
// `ipmi-sensors` on the simulator with a fresh SDR cache of its own.
ToolRun runIpmiSensors(const std::string& profile, const std::vector<std::string>& extraArgs = {});

// The captured repositories that have reference decodings beside them, as
// paths without their ".sdr", and the profile that serves each: the captured
// server's profile when there is one (the references were taken from ipmi_sim
// running it), else the bare SDR dump.
std::vector<std::string> referenceSets();
std::string referenceProfile(const std::string& set);

std::string readFile(const std::string& path);
std::string trim(const std::string& s);
std::vector<std::string> lines(const std::string& text);
// Splits at `sep`; the last field takes the rest once `maxFields` are reached.
std::vector<std::string> split(const std::string& s, char sep, size_t maxFields = static_cast<size_t>(-1));
// "Name : value" lines, names and values trimmed; the first of each name.
std::map<std::string, std::string> fields(const std::string& text);

}  // namespace TestSupport

#define SKIP_WITHOUT_TOOL(name) \
    if (TestSupport::toolPath(name).empty()) GTEST_SKIP() << name << " is not installed"

#endif
