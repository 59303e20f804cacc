#include <dlfcn.h>
#include <pthread.h>
#include <signal.h>
#include <stdio.h>
#include <time.h>

#include <algorithm>
#include <atomic>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <CLI/CLI.hpp>

#include "IpmiIfc.h"
#include "IpmiSel.h"
#include "IpmiSelData.h"
#include "IpmiSensor.h"
#include "SelCursorFile.h"
#include "SelFacts.h"
#include "Views.h"

namespace {

// The controller's event log, oldest record first.
int showSel(std::vector<Tool::Section>& out) {
    Ipmi::IpmiIfcSdrGetInfo(0);  // sensor names
    Tool::Section s;
    s.name = "sel";
    s.title = "System event log";
    s.columns = Tool::selColumns();
    const bool read = Ipmi::IpmiIfcSelGetInfo(0, nullptr) == 0;
    if (read) {
        const auto sensors = Ipmi::IpmiIfc::getSensors(0);
        for (const auto& r : Ipmi::IpmiIfc::getSelData(0)) s.records.push_back(Tool::selRecord(*r, sensors));
    }
    out.push_back(std::move(s));
    if (!read) {
        fprintf(stderr, "tavipmi: the system event log could not be read\n");
        return 1;
    }
    return 0;
}

// ---- watch -------------------------------------------------------------------

// A stream cannot size its columns from content: the table keeps fixed
// widths, JSON gives one object per line, CSV one row per record.
const int kWidths[] = {4, 19, 20, 48, 8};

void printHeader() {
    if (Tool::outputFormat() == Tool::Format::Csv) printf("%s\n", Tool::csvHeader(Tool::selColumns()).c_str());
    if (Tool::outputFormat() != Tool::Format::Table) return;
    printf("  %-4s | %-19s | %-20s | %-48s | %-8s | %s\n", "ID", "Time (UTC)", "Sensor", "Caption", "Severity",
           "Description");
}

void printRecord(const Tool::Json& r) {
    const auto cols = Tool::selColumns();
    if (Tool::outputFormat() != Tool::Format::Table) {
        const std::string line = Tool::outputFormat() == Tool::Format::Json ? r.dump() : Tool::csvRow(cols, r);
        printf("%s\n", line.c_str());
        return;
    }
    std::string line = " ";
    size_t w = 0;
    for (const auto& c : cols) {
        if (c.use == Tool::Column::DataOnly) continue;
        std::string text = Tool::cellText(r.contains(c.key) ? r[c.key] : Tool::Json());
        if (w < sizeof kWidths / sizeof kWidths[0]) text.resize(std::max(text.size(), size_t(kWidths[w])), ' ');
        line += (w ? " | " : " ") + text;
        ++w;
    }
    printf("%s\n", line.c_str());
}

struct Watch {
    std::atomic<int> printed{0};
    int limit = 0;  // 0: until interrupted
    bool demo = false;
    Tool::SelCursorFile state;
};
Watch watch;

void watchOptions(CLI::App& sub) {
    sub.add_flag("--demo", watch.demo, "on the simulated BMC, log an event a second");
    sub.add_option("--count", watch.limit, "end after N records")->check(CLI::NonNegativeNumber);
    watch.state.addOption(sub, "watch.state");
}

void printNewRecord(void* context, Ipmi::IpmiSelData* record) {
    if (record == nullptr) return;  // the loop's periodic call
    auto* w = static_cast<Watch*>(context);
    if (w->limit > 0 && w->printed >= w->limit) return;  // ending: the rest waits for the next run
    printRecord(Tool::selRecord(*record, Ipmi::IpmiIfc::getSensors(0)));
    fflush(stdout);
    w->state.save(*record);
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
int watchSel(std::vector<Tool::Section>&) {
    Watch& w = watch;
    AddSelEvent add = w.demo ? simulatorEventSource() : nullptr;
    if (w.demo && add == nullptr) {
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

    if (Tool::outputFormat() == Tool::Format::Table) printf("Watching the system event log (Ctrl-C ends)\n");
    printHeader();
    fflush(stdout);
    // A pass a second: the loop's own period is counted in 16-second units.
    // start() clears the node record, handlers included: register once it runs.
    w.state.resume();
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

Tool::ViewRegistrar reg("sel", Tool::View{"system event log records, oldest first", nullptr, showSel, 50, true});
Tool::ViewRegistrar regWatch("watch", Tool::View{"print new SEL records as they are logged, until Ctrl-C",
                                                 watchOptions, watchSel, 100, false});

}  // namespace
