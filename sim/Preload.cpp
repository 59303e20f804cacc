// LD_PRELOAD entry: other programs (ipmitool, FreeIPMI) see the simulated
// controller named by TAV_IPMI_SIM_PROFILE ("default" for the project's own).
// TAV_IPMI_SIM_VIRTUAL_TIME=1 makes their sleeps and time-outs virtual.

#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <exception>

#include "Bmc.h"
#include "Sim.h"

// Tells the interposer that it lives in the preload library.
extern "C" const int tavIpmiSimPreloaded = 1;

namespace {

__attribute__((constructor)) void installFromEnvironment() {
    const char* profile = getenv("TAV_IPMI_SIM_PROFILE");
    if (profile == nullptr || *profile == '\0') return;
    std::string path = strcmp(profile, "default") == 0 ? Sim::defaultProfilePath() : std::string(profile);
    try {
        const char* vt = getenv("TAV_IPMI_SIM_VIRTUAL_TIME");
        Sim::Simulator::instance().install(Sim::loadProfile(path), vt != nullptr && strcmp(vt, "1") == 0);
    } catch (const std::exception& e) {
        // Without its controller the program would reach for the real
        // device and report that instead: stop here with the one reason.
        fprintf(stderr, "tav-ipmi simulator: %s\n", e.what());
        _exit(2);
    }
}

}  // namespace
