// The two refreshes of the polling loop against a simulated controller that
// answers every request after a fixed real latency (virtual time off):
//
// - the full chain that an accepted repository info starts: reservation,
//   repository read, sensor discovery with first readings, thresholds and
//   hysteresis, entity list and tree;
// - the per-poll reading refresh of every sensor.
//
// Reported per run: exchanges, the floor that the latency sets (exchanges x
// latency) and wall time over that floor; CPU per exchange of the library,
// measured as the process CPU time of the run (CLOCK_PROCESS_CPUTIME_ID; the
// latency is slept, not spun) minus the CPU time of replaying the same
// requests through the simulator's fault layer and command table, so that
// the fake driver's ioctl and poll emulation stays in the library's share;
// and peak memory (ru_maxrss, which includes the simulator's request log).

#include <benchmark/benchmark.h>
#include <string.h>
#include <sys/resource.h>
#include <time.h>

#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "Bmc.h"
#include "GeneratedServer.h"
#include "IpmiIfcInternal.h"
#include "SdrLayout.h"
#include "Sim.h"

namespace {

using namespace Ipmi;
using Sim::generatedServer;

constexpr int64_t kLatencyUs = 1000;

Sim::Simulator& sim() { return Sim::Simulator::instance(); }

double processCpuSeconds() {
    timespec ts;
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

double wallSeconds() {
    return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

long peakRssKb() {
    struct rusage usage;
    getrusage(RUSAGE_SELF, &usage);
    return usage.ru_maxrss;
}

// ---- running the refreshes

void forgetEverything() {
    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcSdrCleanUpHeaders(0);
    IpmiIfcEntityCleanUpAll(0);
    memset(&g_IpmiNode[0].work.sdr, 0, sizeof g_IpmiNode[0].work.sdr);
}

bool prepare(benchmark::State& state, const std::shared_ptr<Sim::Bmc>& bmc) {
    sim().install(bmc, false);
    sim().clearFaults();
    sim().setLatencyUs(0);
    InitIpmiNode(0);
    g_IpmiNode[0].myAddress = 0x20;
    g_IpmiNode[0].stopRequested = false;
    if (IpmiIfcOpenIpmiOpen(0) < 0) {
        state.SkipWithError("cannot open the simulated device");
        return false;
    }
    return true;
}

void finishRun() {
    forgetEverything();
    IpmiIfcSensorInstantiateAll(0);  // no records left: drops the sensors
    IpmiIfcOpenIpmiClose(0);
    sim().setLatencyUs(0);
    sim().uninstall();
}

// CPU time the simulator itself needs for these requests, without latency.
double simulatorCpuSeconds(const std::vector<Sim::Request>& requests) {
    const double start = processCpuSeconds();
    for (const Sim::Request& r : requests) benchmark::DoNotOptimize(sim().exchange(r, nullptr));
    return processCpuSeconds() - start;
}

struct Totals {
    double exchanges = 0, wall = 0, cpu = 0, simCpu = 0;
    long runs = 0;
};

// Runs `refresh` once per iteration with the latency on and keeps the figures.
template <class Setup, class Refresh>
void measure(benchmark::State& state, Setup setup, Refresh refresh) {
    Totals t;
    for (auto _ : state) {
        state.PauseTiming();
        setup();
        sim().resetCounters();
        sim().setLatencyUs(kLatencyUs);
        const double cpu0 = processCpuSeconds();
        const double wall0 = wallSeconds();
        state.ResumeTiming();

        refresh();

        state.PauseTiming();
        const double wall = wallSeconds() - wall0;
        const double cpu = processCpuSeconds() - cpu0;
        sim().setLatencyUs(0);
        const std::vector<Sim::Request> requests = sim().requests();
        t.exchanges += static_cast<double>(requests.size());
        t.wall += wall;
        t.cpu += cpu;
        t.simCpu += simulatorCpuSeconds(requests);
        ++t.runs;
        sim().resetCounters();
        state.ResumeTiming();
    }
    if (t.runs == 0 || t.exchanges == 0) return;
    const double perRun = t.exchanges / static_cast<double>(t.runs);
    const double floor = t.exchanges * static_cast<double>(kLatencyUs) / 1e6;
    state.counters["exchanges"] = perRun;
    state.counters["floor_ms"] = floor / static_cast<double>(t.runs) * 1e3;
    state.counters["wall_over_floor"] = t.wall / floor;
    state.counters["lib_cpu_us_per_exchange"] = (t.cpu - t.simCpu) / t.exchanges * 1e6;
    state.counters["sim_cpu_us_per_exchange"] = t.simCpu / t.exchanges * 1e6;
    state.counters["sensors"] = static_cast<double>(IpmiIfc::getSensors(0).size());
    state.counters["peak_rss_kB"] = static_cast<double>(peakRssKb());
}

void fullChain(benchmark::State& state, const std::shared_ptr<Sim::Bmc>& bmc) {
    if (!prepare(state, bmc)) return;
    measure(state, forgetEverything, [&state] {
        if (IpmiIfcSdrGetInfo(0) != 0) state.SkipWithError("the repository info was refused");
    });
    finishRun();
}

void readingRefresh(benchmark::State& state, const std::shared_ptr<Sim::Bmc>& bmc) {
    if (!prepare(state, bmc)) return;
    if (IpmiIfcSdrGetInfo(0) != 0 || IpmiIfc::getSensors(0).empty()) {
        state.SkipWithError("no sensors discovered");
        finishRun();
        return;
    }
    measure(state, [] {}, [] { benchmark::DoNotOptimize(IpmiIfcSensorUpdateReading(0)); });
    finishRun();
}

void BM_RefreshChainDefaultProfile(benchmark::State& state) {
    fullChain(state, Sim::loadProfile(Sim::defaultProfilePath()));
}
void BM_RefreshChainThousandRecords(benchmark::State& state) { fullChain(state, generatedServer(1000)); }
void BM_ReadingRefreshDefaultProfile(benchmark::State& state) {
    readingRefresh(state, Sim::loadProfile(Sim::defaultProfilePath()));
}
void BM_ReadingRefreshThousandRecords(benchmark::State& state) { readingRefresh(state, generatedServer(1000)); }

BENCHMARK(BM_RefreshChainDefaultProfile)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_RefreshChainThousandRecords)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_ReadingRefreshDefaultProfile)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_ReadingRefreshThousandRecords)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace
