// The SEL against the simulated controller in virtual time, no latency:
//
// - loading a 3,000-record log at start (the first Get SEL Info answer);
// - one poll pass that finds one new record;
// - the direct synchroniser reading the same log.
//
// Reported: exchanges (checked against what the algorithm must ask), CPU per
// exchange of the library (process CPU time minus the CPU time of replaying
// the same requests through the simulator's fault layer and command table),
// and the heap each record held costs, counted by the operator new below.

#include <benchmark/benchmark.h>
#include <malloc.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include <atomic>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include "Bmc.h"
#include "IpmiIfcInternal.h"
#include "IpmiSel.h"
#include "IpmiSelData.h"
#include "Sim.h"

// Live heap bytes of the process, as malloc accounts them. GCC cannot see
// that these new and delete pair malloc with free.
#pragma GCC diagnostic ignored "-Wmismatched-new-delete"
static std::atomic<long long> g_liveBytes{0};

void* operator new(size_t size) {
    void* p = malloc(size ? size : 1);
    if (p == nullptr) throw std::bad_alloc();
    g_liveBytes += static_cast<long long>(malloc_usable_size(p));
    return p;
}
void operator delete(void* p) noexcept {
    if (p == nullptr) return;
    g_liveBytes -= static_cast<long long>(malloc_usable_size(p));
    free(p);
}
void operator delete(void* p, size_t) noexcept { operator delete(p); }

namespace {

using namespace Ipmi;

constexpr size_t kRecords = 3000;
constexpr size_t kRecordBytes = 16;

Sim::Simulator& sim() { return Sim::Simulator::instance(); }

double processCpuSeconds() {
    timespec ts;
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

double simulatorCpuSeconds(const std::vector<Sim::Request>& requests) {
    const double start = processCpuSeconds();
    for (const Sim::Request& r : requests) benchmark::DoNotOptimize(sim().exchange(r, nullptr));
    return processCpuSeconds() - start;
}

void logEvent(Sim::Bmc& bmc, uint16_t serial) {
    const uint8_t record[kRecordBytes] = {0,    0,    0x02, 0, 0, 0, 0, 0x20, 0x00, 0x04, 0x01, 0x30, 0x01, 0x07,
                                          uint8_t(serial), uint8_t(serial >> 8)};
    Sim::addSelRecord(bmc, record);
}

std::shared_ptr<Sim::Bmc> generatedLog() {
    auto bmc = std::make_shared<Sim::Bmc>();
    bmc->sel.allocationUnits = 0xFFFF;
    bmc->sel.eraseTimestamp = 1;  // erased once: the first answer reloads
    for (size_t i = 0; i < kRecords; ++i) logEvent(*bmc, static_cast<uint16_t>(i));
    return bmc;
}

void openNode(const std::shared_ptr<Sim::Bmc>& bmc) {
    sim().install(bmc, true);
    sim().clearFaults();
    InitIpmiNode(0);
    g_IpmiNode[0].myAddress = 0x20;
    g_IpmiNode[0].stopRequested = false;
    IpmiIfcOpenIpmiOpen(0);
}

void forgetSel() {
    InitIpmiNode(0);
    std::vector<std::shared_ptr<IpmiSelData>> gone;
    TAV::MutexLock guard(g_IpmiNode[0].selMutex);
    gone.swap(g_IpmiNode[0].selRecords);
}

struct Figures {
    double exchanges = 0, cpu = 0, simCpu = 0;
    long runs = 0;
    void report(benchmark::State& state) const {
        if (runs == 0) return;
        state.counters["exchanges"] = exchanges / static_cast<double>(runs);
        state.counters["lib_cpu_us_per_exchange"] = (cpu - simCpu) / exchanges * 1e6;
    }
};

// Runs `work` timed; `expected` exchanges or the benchmark stops with an error.
template <class Work>
bool measured(benchmark::State& state, Figures& f, size_t expected, Work work) {
    sim().resetCounters();
    const double cpu0 = processCpuSeconds();
    state.ResumeTiming();
    work();
    state.PauseTiming();
    f.cpu += processCpuSeconds() - cpu0;
    const std::vector<Sim::Request> requests = sim().requests();
    f.simCpu += simulatorCpuSeconds(requests);
    f.exchanges += static_cast<double>(requests.size());
    ++f.runs;
    if (requests.size() != expected) {
        state.SkipWithError(("exchanges " + std::to_string(requests.size()) + ", the algorithm needs " +
                             std::to_string(expected)).c_str());
        return false;
    }
    return true;
}

// Get SEL Info, Reserve SEL, one Get SEL Entry per record.
void BM_SelLoadAtStart(benchmark::State& state) {
    auto bmc = generatedLog();
    openNode(bmc);
    Figures f;
    long long perRecord = 0;
    for (auto _ : state) {
        state.PauseTiming();
        forgetSel();
        const long long before = g_liveBytes.load();
        if (!measured(state, f, 2 + kRecords, [] { IpmiIfcSelGetInfo(0, nullptr); })) break;
        if (IpmiIfc::getSelData().size() != kRecords) {
            state.SkipWithError("the log did not load");
            break;
        }
        perRecord = (g_liveBytes.load() - before) / static_cast<long long>(kRecords);
        state.ResumeTiming();
    }
    f.report(state);
    state.counters["heap_bytes_per_record"] = static_cast<double>(perRecord);
    forgetSel();
    IpmiIfcOpenIpmiClose(0);
    sim().uninstall();
}

// Get SEL Info, Reserve SEL, the last record held again, the new one.
void BM_SelPollFindsOneRecord(benchmark::State& state) {
    auto bmc = generatedLog();
    openNode(bmc);
    IpmiIfcSelGetInfo(0, nullptr);
    Figures f;
    uint16_t serial = 0;
    for (auto _ : state) {
        state.PauseTiming();
        bmc->sel.clockOffset += 1;
        logEvent(*bmc, ++serial);
        if (!measured(state, f, 4, [] { IpmiIfcSelGetInfo(0, nullptr); })) break;
        state.ResumeTiming();
    }
    f.report(state);
    forgetSel();
    IpmiIfcOpenIpmiClose(0);
    sim().uninstall();
}

// Get SEL Info, Reserve SEL, one Get SEL Entry per record (the greeting
// comes once per process, before the first run).
void BM_SelSyncDeviceEventlog(benchmark::State& state) {
    auto bmc = generatedLog();
    sim().install(bmc, true);
    sim().clearFaults();
    sel_state warm = {};
    Event_log* records = nullptr;
    int n = 0;
    sync_device_eventlog(&records, &n, &warm);  // greets the controller
    free(records);
    Figures f;
    for (auto _ : state) {
        state.PauseTiming();
        sel_state fresh = {};
        n = 0;
        if (!measured(state, f, 2 + kRecords, [&] { sync_device_eventlog(&records, &n, &fresh); })) break;
        free(records);
        if (static_cast<size_t>(n) != kRecords) {
            state.SkipWithError("the log did not load");
            break;
        }
        state.ResumeTiming();
    }
    f.report(state);
    sim().uninstall();
}

BENCHMARK(BM_SelLoadAtStart)->Unit(benchmark::kMillisecond)->Iterations(20);
BENCHMARK(BM_SelPollFindsOneRecord)->Unit(benchmark::kMicrosecond)->Iterations(2000);
BENCHMARK(BM_SelSyncDeviceEventlog)->Unit(benchmark::kMillisecond)->Iterations(20);

}  // namespace
