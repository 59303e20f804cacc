#include <dlfcn.h>
#include <pthread.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include <atomic>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "IpmiIfc.h"
#include "IpmiSel.h"
#include "IpmiSelData.h"
#include "IpmiSensor.h"
#include "Views.h"

namespace {

// Record types up to here carry a time stamp.
constexpr uint8_t kLastTimestampedType = 0xDF;
constexpr uint8_t kFirstGenericType = 0x01;
constexpr uint8_t kLastGenericType = 0x0C;
constexpr uint8_t kOffsetMask = 0x0F;

std::string timeText(const Ipmi::IpmiSelData& r) {
    const uint32_t stamp = r.messageTimeStamp();
    if (r.recordType() > kLastTimestampedType) return "-";
    const time_t t = static_cast<time_t>(stamp);
    struct tm tm;
    char text[32];
    if (gmtime_r(&t, &tm) == nullptr || strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &tm) == 0) return "?";
    return text;
}

std::string severityText(int severity) {
    switch (severity) {
    case 5: return "major";
    case 6: return "critical";
    case 7: return "fatal";
    default: return "-";
    }
}

// The sensor's name when the SDRs know its number, and its number.
std::string sensorText(const Ipmi::IpmiSelData& r, const std::vector<std::shared_ptr<Ipmi::IpmiSensor>>& sensors) {
    if (!r.isSelEventRecord()) return "-";
    const uint8_t number = r.record().sensor_number;
    std::string name;
    for (const auto& s : sensors)
        if (s && s->getSensorNumber() == number) name = s->getSensorIdString();
    char text[64];
    snprintf(text, sizeof text, "%s #0x%02x", name.empty() ? "sensor" : name.c_str(), number);
    return text;
}

std::string descriptionText(const Ipmi::IpmiSelData& r) {
    if (!r.isSelEventRecord()) {
        char text[32];
        snprintf(text, sizeof text, "OEM record type 0x%02x", r.recordType());
        return text;
    }
    // Event data 1 of a generic event may carry flags above the offset,
    // which the exact text lookup does not expect: look up the offset alone.
    Ipmi::Event_log record = r.record();
    const uint8_t type = record.event_dir_type & Ipmi::SEL_EVENT_TYPE_MASK;
    if (type >= kFirstGenericType && type <= kLastGenericType) record.event_data[0] &= kOffsetMask;
    return Ipmi::GetMessage(record);
}

void printHeader() {
    printf("  %-4s | %-19s | %-20s | %-48s | %-8s | %s\n", "ID", "Time (UTC)", "Sensor", "Caption", "Severity",
           "Description");
}

void printRecord(const Ipmi::IpmiSelData& r, const std::vector<std::shared_ptr<Ipmi::IpmiSensor>>& sensors) {
    printf("  %-4s | %-19s | %-20s | %-48s | %-8s | %s\n", r.recordId(r.recordId()).c_str(), timeText(r).c_str(),
           sensorText(r, sensors).c_str(), r.caption().c_str(), severityText(r.severity()).c_str(),
           descriptionText(r).c_str());
}

// The controller's event log, oldest record first.
int showSel(const std::vector<std::string>&) {
    Ipmi::IpmiIfcSdrGetInfo(0);  // sensor names
    printf("System event log\n");
    if (Ipmi::IpmiIfcSelGetInfo(0, nullptr) != 0) {
        printf("  (unavailable)\n");
        return 1;
    }
    const auto records = Ipmi::IpmiIfc::getSelData(0);
    if (records.empty()) {
        printf("  (empty)\n");
        return 0;
    }
    const auto sensors = Ipmi::IpmiIfc::getSensors(0);
    printHeader();
    for (const auto& r : records) printRecord(*r, sensors);
    return 0;
}

// ---- watch -------------------------------------------------------------------

struct Watch {
    std::atomic<int> printed{0};
    int limit = 0;  // 0: until interrupted
};

void printNewRecord(void* context, Ipmi::IpmiSelData* record) {
    if (record == nullptr) return;  // the loop's periodic call
    auto* w = static_cast<Watch*>(context);
    printRecord(*record, Ipmi::IpmiIfc::getSensors(0));
    fflush(stdout);
    ++w->printed;
}

// In a simulated run the preload library offers a way to log events, so the
// watch has something to show.
using AddSelEvent = int (*)(const unsigned char*);
AddSelEvent simulatorEventSource() { return reinterpret_cast<AddSelEvent>(dlsym(RTLD_DEFAULT, "tavIpmiSimAddSelEvent")); }

void injectDemoEvent(AddSelEvent add, unsigned n) {
    // Inlet temperature above its upper non-critical threshold, then back.
    const bool deassert = n % 2;
    const unsigned char record[16] = {0, 0, 0x02, 0, 0, 0, 0, 0x20, 0x00, 0x04, 0x01, 0x01,
                                      static_cast<unsigned char>(deassert ? 0x81 : 0x01), 0x57, 0x2b, 0x2a};
    add(record);
}

// Prints each new SEL record as the polling loop finds it, until SIGINT or
// SIGTERM (or `--count N` records). `--demo` logs an event a second on a
// simulated controller.
int watchSel(const std::vector<std::string>& args) {
    Watch w;
    bool demo = false;
    for (size_t i = 0; i < args.size(); ++i) {
        if (args[i] == "--demo") {
            demo = true;
        } else if (args[i] == "--count" && i + 1 < args.size()) {
            w.limit = atoi(args[++i].c_str());
        } else {
            fprintf(stderr, "usage: tavipmi watch [--demo] [--count N]\n");
            return 2;
        }
    }
    AddSelEvent add = demo ? simulatorEventSource() : nullptr;
    if (demo && add == nullptr) {
        fprintf(stderr, "tavipmi: --demo needs the simulated BMC (--simulate)\n");
        return 2;
    }
    // The polling loop opens the device itself.
    Ipmi::IpmiIfcCloseForCLI(0);
    Ipmi::IpmiIfcOpenIpmiClose(0);

    sigset_t stopSignals;
    sigemptyset(&stopSignals);
    sigaddset(&stopSignals, SIGINT);
    sigaddset(&stopSignals, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &stopSignals, nullptr);  // only the waiter below takes them

    printf("Watching the system event log (Ctrl-C ends)\n");
    printHeader();
    fflush(stdout);
    // A pass a second: the loop's own period is counted in 16-second units.
    // start() clears the node record, handlers included: register once it runs.
    std::atomic<bool> loopEnded{false};
    std::thread waiter([&] {
        const struct timespec tick = {1, 0};
        unsigned injected = 0;
        bool registered = false;
        while (!loopEnded) {
            if (sigtimedwait(&stopSignals, nullptr, &tick) > 0) break;
            if (w.limit > 0 && w.printed >= w.limit) break;
            if (Ipmi::IpmiIfc::getState(0) != Ipmi::IpmiIfc::IPMI_STATE_RUNNING) continue;
            if (!registered) registered = Ipmi::IpmiIfc::registerSelEventHandler(printNewRecord, &w) == 0;
            if (add) injectDemoEvent(add, injected++);
            Ipmi::IpmiIfc::doPoll(0);
        }
        if (!loopEnded) Ipmi::IpmiIfc::stop(0);
    });
    int rc = 0;
    try {
        Ipmi::IpmiIfc::start(0, 0);
    } catch (const kelInt::CmpiStatus& s) {
        fprintf(stderr, "tavipmi: cannot start the interface: %s\n", s.msg());
        rc = 1;
    }
    loopEnded = true;
    waiter.join();
    Ipmi::IpmiIfc::unRegisterSelEventHandler(printNewRecord);
    return rc;
}

Tool::ViewRegistrar reg("sel", Tool::View{"system event log records, oldest first", showSel, 50, true});
Tool::ViewRegistrar regWatch("watch", Tool::View{"print new SEL records as they are logged, until Ctrl-C", watchSel, 100, false});

}  // namespace
