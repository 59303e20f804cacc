// tavipmi: one-shot views of the host's BMC through tav-ipmi.

#include <errno.h>
#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
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
            "  --simulate[=PROFILE]  talk to the simulated BMC (default profile, or an ipmi_sim .emu file)\n"
            "  --simulate=IMAGE.bin  the default simulated BMC serving a raw FRU image as FRU device 0\n"
            "views:\n");
    for (const auto& v : Tool::views()) fprintf(out, "  %-10s %s\n", v.first.c_str(), v.second.help.c_str());
}

// Simulation is chosen at run time: the tool runs itself again with the
// simulator's preload library, so the binary never carries the interposer.
int reexecSimulated(char** argv, const std::string& profile) {
#ifdef TAV_IPMI_SIM_PRELOAD
    const char* preload = getenv("TAVIPMI_SIM_PRELOAD");
    std::string lib = preload ? preload : TAV_IPMI_SIM_PRELOAD;
    if (access(lib.c_str(), R_OK) != 0) {
        fprintf(stderr, "tavipmi: simulator library %s not found\n", lib.c_str());
        return 2;
    }
    setenv("LD_PRELOAD", lib.c_str(), 1);
    setenv("TAV_IPMI_SIM_PROFILE", profile.c_str(), 1);
    setenv("TAVIPMI_SIMULATED", "1", 1);
    char self[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", self, sizeof self - 1);
    if (n <= 0) {
        perror("tavipmi: readlink");
        return 2;
    }
    self[n] = '\0';
    execv(self, argv);
    perror("tavipmi: execv");
    return 2;
#else
    (void)argv;
    (void)profile;
    fprintf(stderr, "tavipmi: built without the simulator\n");
    return 2;
#endif
}

// The rules normally live in /etc; a tool run from its build tree, before
// installation, uses the copy in the source tree.
void loadHealthRules() {
#ifdef TAV_IPMI_SOURCE_HEALTH_FILE
    if (access("/etc/sfcb/tav/sensor_health", R_OK) != 0 && access(TAV_IPMI_SOURCE_HEALTH_FILE, R_OK) == 0)
        Ipmi::LoadSensorHealthDataFile(TAV_IPMI_SOURCE_HEALTH_FILE);
#endif
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
