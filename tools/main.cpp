// tavipmi: one-shot views of the host's BMC through tav-ipmi.

#include <errno.h>
#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <initializer_list>
#include <map>
#include <string>
#include <vector>

#include "IpmiIfc.h"
#include "IpmiMapper.h"
#include "Views.h"

namespace Tool {
std::map<std::string, View>& views() {
    static std::map<std::string, View> all;
    return all;
}
}  // namespace Tool

namespace {

void usage(FILE* out) {
    fprintf(out,
            "usage: tavipmi [--simulate[=PROFILE]] [VIEW [ARGS...]]\n"
            "       tavipmi --help | --version\n"
            "  --simulate[=PROFILE]  talk to the simulated BMC (default profile, or an ipmi_sim .emu file)\n"
            "  --simulate=IMAGE.bin  the default simulated BMC serving a raw FRU image as FRU device 0\n"
            "views:\n");
    for (const auto& v : Tool::views()) fprintf(out, "  %-10s %s\n", v.first.c_str(), v.second.help.c_str());
}

// The running tool's own file, or "" when the system does not say.
std::string ownPath() {
    char self[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", self, sizeof self - 1);
    if (n <= 0) return "";
    self[n] = '\0';
    return self;
}

// The directory the running tool lies in, with a trailing slash.
std::string ownDirectory() {
    std::string path = ownPath();
    return path.empty() ? "./" : path.substr(0, path.rfind('/') + 1);
}

// The first of the places (relative to the tool) that holds a readable file.
std::string findBesideTool(std::initializer_list<const char*> relatives) {
    const std::string dir = ownDirectory();
    for (const char* r : relatives)
        if (access((dir + r).c_str(), R_OK) == 0) return dir + r;
    return "";
}

// Simulation is chosen at run time: the tool runs itself again with the
// simulator's preload library, so the binary never carries the interposer.
int reexecSimulated(char** argv, const std::string& profile) {
#ifdef TAV_IPMI_PRELOAD_FROM_BIN
    const char* preload = getenv("TAVIPMI_SIM_PRELOAD");
    std::string lib = preload ? preload : findBesideTool({TAV_IPMI_PRELOAD_FROM_BIN, "../sim/libtav-ipmi-sim-preload.so"});
    if (lib.empty() || access(lib.c_str(), R_OK) != 0) {
        fprintf(stderr, "tavipmi: simulator library libtav-ipmi-sim-preload.so not found\n");
        return 2;
    }
    setenv("LD_PRELOAD", lib.c_str(), 1);
    setenv("TAV_IPMI_SIM_PROFILE", profile.c_str(), 1);
    setenv("TAVIPMI_SIMULATED", "1", 1);
    const std::string self = ownPath();
    if (self.empty()) {
        perror("tavipmi: readlink");
        return 2;
    }
    execv(self.c_str(), argv);
    perror("tavipmi: execv");
    return 2;
#else
    (void)argv;
    (void)profile;
    fprintf(stderr, "tavipmi: built without the simulator\n");
    return 2;
#endif
}

// The rules normally live in /etc. A tool installed under another prefix, or
// run from its build tree, uses the copy that came with it.
void loadHealthRules() {
    if (access("/etc/sfcb/tav/sensor_health", R_OK) == 0) return;
    std::string rules = findBesideTool({TAV_IPMI_RULES_FROM_BIN, "../etc/sfcb/tav/sensor_health"});
    if (!rules.empty()) Ipmi::LoadSensorHealthDataFile(rules.c_str());
}

}  // namespace

int main(int argc, char** argv) {
    std::vector<std::string> args;
    std::string profile;
    bool simulate = false;
    for (int i = 1; i < argc; ++i) {
        std::string a = argv[i];
        if (a == "--simulate") {
            simulate = true;
            profile = "default";
        } else if (a.rfind("--simulate=", 0) == 0) {
            simulate = true;
            profile = a.substr(strlen("--simulate="));
        } else if (a == "--version") {
            printf("tavipmi (tav-ipmi) %s\n", TAV_IPMI_VERSION);
            return 0;
        } else if (a == "-h" || a == "--help") {
            usage(stdout);
            return 0;
        } else {
            args.push_back(a);
        }
    }
    if (simulate && getenv("TAVIPMI_SIMULATED") == nullptr) return reexecSimulated(argv, profile);

    std::vector<std::string> selected;
    std::vector<std::string> viewArgs;
    if (!args.empty()) {
        if (Tool::views().count(args[0]) == 0) {
            fprintf(stderr, "tavipmi: unknown view '%s'\n", args[0].c_str());
            usage(stderr);
            return 2;
        }
        selected.push_back(args[0]);
        viewArgs.assign(args.begin() + 1, args.end());
    } else {
        std::vector<std::pair<int, std::string>> order;
        for (const auto& v : Tool::views())
            if (v.second.inDefault) order.emplace_back(v.second.order, v.first);
        std::sort(order.begin(), order.end());
        for (const auto& o : order) selected.push_back(o.second);
    }

    if (Ipmi::IpmiIfcOpenIpmiOpen(0) < 0) {
        fprintf(stderr, "tavipmi: cannot open /dev/ipmi0: %s\n", strerror(errno));
        return 1;
    }
    loadHealthRules();
    if (Ipmi::IpmiIfcInitForCLI(0) < 0) {
        fprintf(stderr, "tavipmi: cannot prepare the IPMI interface\n");
        Ipmi::IpmiIfcOpenIpmiClose(0);
        return 1;
    }
    int rc = 0;
    for (const auto& name : selected) {
        int r = Tool::views()[name].run(viewArgs);
        if (r != 0) rc = r;
    }
    Ipmi::IpmiIfcCloseForCLI(0);
    Ipmi::IpmiIfcOpenIpmiClose(0);
    return rc;
}
