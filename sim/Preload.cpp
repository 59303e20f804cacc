// LD_PRELOAD entry: other programs (ipmitool, FreeIPMI, the tool, client
// programs) see the simulated controller named by TAV_IPMI_SIM_PROFILE:
// "default" for the project's own, a profile file (see loadProfile), or
// "generated:N" for a generated large server of N SDR records. A raw FRU
// image (a name ending in ".bin") is served as FRU device 0 of the default
// controller. A profile that cannot be had stops the program with the reason.
//
// TAV_IPMI_SIM_LATENCY_US=N makes every answer take N microseconds of real
// time, as a controller behind a slow interface does.
// TAV_IPMI_SIM_VIRTUAL_TIME=1 makes the program's sleeps and time-outs
// virtual instead.
// TAV_IPMI_SIM_COUNTS=FILE writes, at exit, how many requests of each command
// the controller answered ("netfn cmd count" lines, hexadecimal netfn and
// cmd), then "total N". A program can read the total between its own
// operations through tavIpmiSimTotalExchanges (dlsym(RTLD_DEFAULT, ...)).
// TAV_IPMI_SIM_SEL_FILE=FILE keeps the controller's SEL in FILE (16-byte
// records): read at start when present, written after every event the program
// logs, so the log outlives the program as a real controller's does.
// TAV_IPMI_SIM_CONTROL=1 lets a test steer a running program's simulator by
// signals: SIGUSR1 adds an event to the SEL, SIGUSR2 prints the exchanges so
// far per command on stderr, SIGRTMIN takes the inlet temperature past its
// upper critical threshold (and logs the event, as a controller does),
// SIGRTMIN+1 makes the controller silent (every request ends in the driver's
// time-out code) and SIGRTMIN+2 makes it answer again.

#include <errno.h>
#include <pthread.h>
#include <signal.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
#include <unistd.h>

#include <exception>
#include <fstream>

#include "Bmc.h"
#include "Sim.h"

// Tells the interposer that it lives in the preload library.
extern "C" const int tavIpmiSimPreloaded = 1;

namespace {

// Writes the log whole under another name and renames it, so a program
// killed meanwhile leaves the last complete log.
void keepSel(const Sim::Bmc& b) {
    const char* path = getenv("TAV_IPMI_SIM_SEL_FILE");
    if (path == nullptr || *path == '\0') return;
    const std::string temporary = std::string(path) + ".tmp";
    {
        std::ofstream out(temporary, std::ios::binary | std::ios::trunc);
        for (const auto& r : b.sel.records) out.write(reinterpret_cast<const char*>(r.data()), long(r.size()));
        if (!out) return;
    }
    rename(temporary.c_str(), path);
}

}  // namespace

// Lets a program running on the simulator (the tool's watch demo) log a SEL
// record as the controller's own sensors would. Returns the record ID, 0 when
// the log is full or no controller is installed.
extern "C" __attribute__((visibility("default"))) int tavIpmiSimAddSelEvent(const unsigned char* record) {
    int id = 0;
    Sim::Simulator::instance().withBmc([&](Sim::Bmc& b) {
        id = Sim::addSelRecord(b, record);
        keepSel(b);
    });
    return id;
}

// Requests the controller has answered since the program started.
extern "C" __attribute__((visibility("default"))) unsigned tavIpmiSimTotalExchanges() {
    return Sim::Simulator::instance().totalExchanges();
}

namespace {

// A temperature sensor's upper critical threshold crossed going high.
void addSelEvent(Sim::Bmc& b) {
    const uint8_t record[16] = {0, 0,  // record ID: the log assigns it
                                0x02,  // system event record
                                0, 0, 0, 0,  // time stamp: the log's clock
                                0x20, 0x00,  // generator: the BMC
                                0x04,        // event message revision
                                0x01,        // temperature
                                0x01,        // sensor number
                                0x01,        // threshold, assertion
                                0x59,        // upper critical going high, with trigger reading and threshold
                                0x30, 0x2F};
    Sim::addSelRecord(b, record);
}

// Sensor 1 of the default profile, the inlet temperature: upper critical 47 C.
constexpr uint8_t kInletSensor = 0x01;
constexpr uint8_t kPastUpperCritical = 49;
constexpr uint16_t kUpperNonCriticalAndCritical = 0x18;  // comparison bits 3 and 4

void crossUpperCritical(Sim::Bmc& b) {
    Sim::SensorModel* s = b.findSensor(0x20, 0, kInletSensor);
    if (s == nullptr) return;
    s->reading = kPastUpperCritical;
    s->states = kUpperNonCriticalAndCritical;
    const uint8_t record[16] = {0, 0, 0x02, 0, 0, 0, 0, 0x20, 0x00, 0x04,
                                0x01,  // temperature
                                kInletSensor,
                                0x01,  // threshold, assertion
                                0x59,  // upper critical going high, with trigger reading and threshold
                                kPastUpperCritical, 0x2F};
    Sim::addSelRecord(b, record);
}

// What the Linux driver answers for a controller that stopped answering: its
// own time-out code, after its retries.
void silence(bool on) {
    auto& sim = Sim::Simulator::instance();
    sim.clearFaults();
    if (on) sim.addFault(Sim::kAnyCommand, Sim::kAnyCommand, Sim::Fault::completionCode(0xC3, -1));
}

void printCounters(FILE* out, const char* format) {
    for (const auto& c : Sim::Simulator::instance().counters()) fprintf(out, format, c.first >> 8, c.first & 0xFF, c.second);
}

void* controlThread(void* arg) {
    const sigset_t* signals = static_cast<const sigset_t*>(arg);
    for (;;) {
        int sig = 0;
        if (sigwait(signals, &sig) != 0) continue;
        if (sig == SIGUSR1)
            Sim::Simulator::instance().withBmc([](Sim::Bmc& b) {
                addSelEvent(b);
                keepSel(b);
            });
        if (sig == SIGRTMIN)
            Sim::Simulator::instance().withBmc([](Sim::Bmc& b) {
                crossUpperCritical(b);
                keepSel(b);
            });
        if (sig == SIGRTMIN + 1) silence(true);
        if (sig == SIGRTMIN + 2) silence(false);
        if (sig == SIGUSR2) {
            printCounters(stderr, "tav-ipmi simulator: exchanges netfn 0x%02x cmd 0x%02x: %u\n");
            fprintf(stderr, "tav-ipmi simulator: exchanges total: %u\n", Sim::Simulator::instance().totalExchanges());
        }
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
    for (int rt = 0; rt < 3; ++rt) sigaddset(&signals, SIGRTMIN + rt);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    pthread_t thread;
    if (pthread_create(&thread, nullptr, controlThread, &signals) == 0) pthread_detach(thread);
}

// The latency from the environment: none when unset; a bad value stops the
// program, since its timings would mean nothing.
int64_t latencyFromEnvironment() {
    const char* text = getenv("TAV_IPMI_SIM_LATENCY_US");
    if (text == nullptr || *text == '\0') return 0;
    char* end = nullptr;
    errno = 0;
    const long long us = strtoll(text, &end, 10);
    constexpr long long kMaxUs = 10 * 1000 * 1000;  // ten seconds an answer: past any driver's time-out
    if (errno != 0 || *end != '\0' || us < 0 || us > kMaxUs) {
        fprintf(stderr, "tav-ipmi simulator: TAV_IPMI_SIM_LATENCY_US=%s: not a latency of 0 to %lld microseconds\n",
                text, kMaxUs);
        _exit(2);
    }
    return us;
}

__attribute__((constructor)) void installFromEnvironment() {
    const char* profile = getenv("TAV_IPMI_SIM_PROFILE");
    if (profile == nullptr || *profile == '\0') return;
    Sim::Simulator::instance().setLatencyUs(latencyFromEnvironment());
    const std::string name(profile);
    const bool fruImage = name.size() > 4 && name.compare(name.size() - 4, 4, ".bin") == 0;
    std::string path = name == "default" || fruImage ? Sim::defaultProfilePath() : name;
    try {
        const char* vt = getenv("TAV_IPMI_SIM_VIRTUAL_TIME");
        auto bmc = Sim::loadProfile(path);
        if (fruImage) Sim::loadFruImage(*bmc, 0, name);
        const char* selFile = getenv("TAV_IPMI_SIM_SEL_FILE");
        if (selFile != nullptr && access(selFile, R_OK) == 0) {
            bmc->sel.records.clear();
            bmc->sel.nextRecordId = 1;
            Sim::loadSelDump(*bmc, selFile);
        }
        Sim::Simulator::instance().install(bmc, vt != nullptr && strcmp(vt, "1") == 0);
    } catch (const std::exception& e) {
        // Without its controller the program would reach for the real
        // device and report that instead: stop here with the one reason.
        fprintf(stderr, "tav-ipmi simulator: %s\n", e.what());
        _exit(2);
    }
    const char* control = getenv("TAV_IPMI_SIM_CONTROL");
    if (control != nullptr && strcmp(control, "1") == 0) startControl();
}

__attribute__((destructor)) void reportCounts() {
    const char* path = getenv("TAV_IPMI_SIM_COUNTS");
    if (path == nullptr || *path == '\0' || !Sim::Simulator::instance().installed()) return;
    FILE* out = fopen(path, "w");
    if (out == nullptr) return;
    printCounters(out, "%02x %02x %u\n");
    fprintf(out, "total %u\n", Sim::Simulator::instance().totalExchanges());
    fclose(out);
}

}  // namespace
