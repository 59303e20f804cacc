// LD_PRELOAD entry: other programs (ipmitool, FreeIPMI) see the simulated
// controller named by TAV_IPMI_SIM_PROFILE ("default" for the project's own).
// TAV_IPMI_SIM_VIRTUAL_TIME=1 makes their sleeps and time-outs virtual.
// TAV_IPMI_SIM_CONTROL=1 lets a test steer a running program's simulator by
// signals: SIGUSR1 adds an event to the SEL, SIGUSR2 prints the exchanges so
// far per command on stderr.

#include <pthread.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
#include <unistd.h>

#include <exception>

#include "Bmc.h"
#include "Sim.h"

// Tells the interposer that it lives in the preload library.
extern "C" const int tavIpmiSimPreloaded = 1;

namespace {

// A temperature sensor's upper critical threshold crossed going high.
void addSelEvent(Sim::Bmc& b) {
    const uint16_t id = static_cast<uint16_t>(b.sel.records.size() + 1);
    const uint32_t now = static_cast<uint32_t>(time(nullptr));
    std::vector<uint8_t> r = {static_cast<uint8_t>(id & 0xFF),
                              static_cast<uint8_t>(id >> 8),
                              0x02,  // system event record
                              static_cast<uint8_t>(now),
                              static_cast<uint8_t>(now >> 8),
                              static_cast<uint8_t>(now >> 16),
                              static_cast<uint8_t>(now >> 24),
                              0x20,
                              0x00,  // generator: the BMC
                              0x04,  // event message revision
                              0x01,  // temperature
                              0x01,  // sensor number
                              0x01,  // threshold, assertion
                              0x59,  // upper critical going high, with trigger reading and threshold
                              0x30,
                              0x2F};
    b.sel.records.push_back(r);
    b.sel.additionTimestamp = now;
}

void printCounters() {
    unsigned total = 0;
    for (const auto& c : Sim::Simulator::instance().counters()) {
        fprintf(stderr, "tav-ipmi simulator: exchanges netfn 0x%02x cmd 0x%02x: %u\n", c.first >> 8, c.first & 0xFF,
                c.second);
        total += c.second;
    }
    fprintf(stderr, "tav-ipmi simulator: exchanges total: %u\n", total);
}

void* controlThread(void* arg) {
    const sigset_t* signals = static_cast<const sigset_t*>(arg);
    for (;;) {
        int sig = 0;
        if (sigwait(signals, &sig) != 0) continue;
        if (sig == SIGUSR1) Sim::Simulator::instance().withBmc(addSelEvent);
        if (sig == SIGUSR2) printCounters();
    }
    return nullptr;
}

// The signals are blocked before the program starts any thread of its own, so
// every thread inherits the block and only the control thread takes them.
void startControl() {
    static sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGUSR1);
    sigaddset(&signals, SIGUSR2);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    pthread_t thread;
    if (pthread_create(&thread, nullptr, controlThread, &signals) == 0) pthread_detach(thread);
}

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
    const char* control = getenv("TAV_IPMI_SIM_CONTROL");
    if (control != nullptr && strcmp(control, "1") == 0) startControl();
}

}  // namespace
