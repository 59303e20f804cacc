// LD_PRELOAD entry: other programs (ipmitool, FreeIPMI) see the simulated
// controller named by TAV_IPMI_SIM_PROFILE ("default" for the project's own).
// A raw FRU image (a name ending in ".bin") is served as FRU device 0 of
// the default controller. TAV_IPMI_SIM_COUNTS=FILE writes, at exit, how many
// requests of each command the controller answered ("netfn cmd count" lines,
// hexadecimal netfn and cmd). TAV_IPMI_SIM_VIRTUAL_TIME=1 makes their sleeps and time-outs virtual.

#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <exception>
#include <map>
#include <utility>

#include "Bmc.h"
#include "Sim.h"

// Tells the interposer that it lives in the preload library.
extern "C" const int tavIpmiSimPreloaded = 1;

// Lets a program running on the simulator (the tool's watch demo) log a SEL
// record as the controller's own sensors would. Returns the record ID, 0 when
// the log is full or no controller is installed.
extern "C" __attribute__((visibility("default"))) int tavIpmiSimAddSelEvent(const unsigned char* record) {
    int id = 0;
    Sim::Simulator::instance().withBmc([&](Sim::Bmc& b) { id = Sim::addSelRecord(b, record); });
    return id;
}

namespace {

__attribute__((constructor)) void installFromEnvironment() {
    const char* profile = getenv("TAV_IPMI_SIM_PROFILE");
    if (profile == nullptr || *profile == '\0') return;
    const std::string name(profile);
    const bool fruImage = name.size() > 4 && name.compare(name.size() - 4, 4, ".bin") == 0;
    std::string path = name == "default" || fruImage ? Sim::defaultProfilePath() : name;
    try {
        const char* vt = getenv("TAV_IPMI_SIM_VIRTUAL_TIME");
        auto bmc = Sim::loadProfile(path);
        if (fruImage) Sim::loadFruImage(*bmc, 0, name);
        Sim::Simulator::instance().install(bmc, vt != nullptr && strcmp(vt, "1") == 0);
    } catch (const std::exception& e) {
        fprintf(stderr, "tav-ipmi simulator: %s\n", e.what());
    }
}

__attribute__((destructor)) void reportCounts() {
    const char* path = getenv("TAV_IPMI_SIM_COUNTS");
    if (path == nullptr || *path == '\0' || !Sim::Simulator::instance().installed()) return;
    std::map<std::pair<int, int>, unsigned> counts;
    for (const auto& r : Sim::Simulator::instance().requests()) ++counts[{r.netfn, r.cmd}];
    FILE* out = fopen(path, "w");
    if (out == nullptr) return;
    for (const auto& c : counts) fprintf(out, "%02x %02x %u\n", c.first.first, c.first.second, c.second);
    fclose(out);
}

}  // namespace
