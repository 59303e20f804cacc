// The sensor side of the polling loop against the simulated controller, each
// operation against the bare client's replay of its requests (BenchSupport.h):
//
// - the full chain that an accepted repository info starts: reservation,
//   repository read, sensor discovery with first readings, thresholds and
//   hysteresis, entity list and tree; and the heap the sensors it leaves cost;
// - the per-poll reading refresh of every sensor;
// - one pass of the loop that finds nothing new (seven passes in eight) and
//   one periodic pass (readings, handlers, LAN);
// - a caller's `getSensors` with every sensor's cached reading and state;
// - the chain at 100, 1,000 and 4,000 records, for how its cost grows.

#include <benchmark/benchmark.h>
#include <string.h>

#include <memory>
#include <string>
#include <vector>

#include "BenchSupport.h"
#include "Bmc.h"
#include "GeneratedServer.h"
#include "IpmiIfcInternal.h"
#include "IpmiSensor.h"
#include "Sim.h"

namespace {

using namespace Ipmi;
using Bench::sim;

void forgetEverything() {
    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcSdrCleanUpHeaders(0);
    IpmiIfcEntityCleanUpAll(0);
    memset(&g_IpmiNode[0].work.sdr, 0, sizeof g_IpmiNode[0].work.sdr);
}

std::shared_ptr<Sim::Bmc> server(benchmark::State& state) {
    if (state.range(0) == 0) return Sim::loadProfile(Sim::defaultProfilePath());
    return Sim::generatedServer(static_cast<size_t>(state.range(0)));
}

// The node open on `bmc` with its repository read, or false with the reason.
bool prepare(benchmark::State& state, const std::shared_ptr<Sim::Bmc>& bmc) {
    sim().install(bmc, true);
    sim().clearFaults();
    sim().setLatencyUs(0);
    InitIpmiNode(0);
    g_IpmiNode[0].myAddress = 0x20;
    g_IpmiNode[0].stopRequested = false;
    if (IpmiIfcOpenIpmiOpen(0) < 0 || IpmiIfcSdrGetInfo(0) != 0 || IpmiIfc::getSensors(0).empty()) {
        state.SkipWithError("no sensors discovered on the simulated controller");
        return false;
    }
    state.SetLabel(state.range(0) == 0 ? "default profile" : std::to_string(state.range(0)) + " records");
    return true;
}

void finishRun() {
    forgetEverything();
    IpmiIfcSensorInstantiateAll(0);  // no records left: drops the sensors
    IpmiIfcOpenIpmiClose(0);
    sim().setLatencyUs(0);
    sim().uninstall();
}

// Heap the sensors, records and entities of one chain hold, per sensor.
double heapPerSensor() {
    forgetEverything();
    IpmiIfcSensorInstantiateAll(0);
    sim().resetCounters();
    const long long before = Bench::liveHeapBytes();
    IpmiIfcSdrGetInfo(0);
    sim().resetCounters();  // the simulator's request log is not the library's
    const size_t sensors = IpmiIfc::getSensors(0).size();
    return sensors ? static_cast<double>(Bench::liveHeapBytes() - before) / static_cast<double>(sensors) : 0;
}

void BM_RefreshChain(benchmark::State& state) {
    if (!prepare(state, server(state))) return;
    Bench::Versus v(state.range(0) == 0 ? 25 : 3);
    for (auto _ : state)
        if (!v.add(state, forgetEverything, [] { IpmiIfcSdrGetInfo(0); })) break;
    v.report(state);
    state.counters["sensors"] = static_cast<double>(IpmiIfc::getSensors(0).size());
    state.counters["heap_bytes_per_sensor"] = heapPerSensor();
    finishRun();
}
BENCHMARK(BM_RefreshChain)->Arg(0)->Arg(1000)->Iterations(4)->Unit(benchmark::kMillisecond);

// The floor against itself: the chain's requests replayed twice by the bare
// client at the latency, in turns first. How far this ratio strays from 1 is
// how finely the machine resolves any wall ratio above.
void BM_BareAgainstItself(benchmark::State& state) {
    if (!prepare(state, server(state))) return;
    forgetEverything();
    sim().resetCounters();
    IpmiIfcSdrGetInfo(0);
    const std::vector<Sim::Request> requests = sim().requests();
    sim().resetCounters();
    double first = 0, second = 0;
    bool turn = false;
    for (auto _ : state) {
        state.PauseTiming();
        sim().setLatencyUs(Bench::kLatencyUs);
        const double a = Bench::replayBare(requests).wall;
        const double b = Bench::replayBare(requests).wall;
        sim().setLatencyUs(0);
        sim().resetCounters();
        first += turn ? b : a;  // "first" is always the same one of the two
        second += turn ? a : b;
        turn = !turn;
        state.ResumeTiming();
    }
    state.counters["exchanges"] = static_cast<double>(requests.size());
    state.counters["wall_ratio"] = first / second;
    finishRun();
}
BENCHMARK(BM_BareAgainstItself)->Arg(0)->Iterations(8)->Unit(benchmark::kMillisecond);

void BM_ReadingRefresh(benchmark::State& state) {
    if (!prepare(state, server(state))) return;
    Bench::Versus v(state.range(0) == 0 ? 50 : 5);
    for (auto _ : state)
        if (!v.add(state, [] {}, [] { IpmiIfcSensorUpdateReading(0); })) break;
    v.report(state);
    finishRun();
}
BENCHMARK(BM_ReadingRefresh)->Arg(0)->Iterations(20)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ReadingRefresh)->Arg(1000)->Iterations(4)->Unit(benchmark::kMillisecond);

// range(1): 1 for the pass the loop makes seven times in eight (the SEL count
// read, nothing new), 8 for the periodic one.
void BM_PollPass(benchmark::State& state) {
    if (!prepare(state, server(state))) return;
    const int every = static_cast<int>(state.range(1));
    IpmiNode& n = g_IpmiNode[0];
    IpmiLoopState s;
    IpmiIfcSelGetInfo(0, &s.entryCount);
    s.lastEntryCount = s.entryCount;
    s.sdrCycle = 1;  // neither repository nor FRU due: a steady periodic pass
    IpmiIfc::getLan(0)->IpmiIfcLanInstantiate(0);
    TAV::MutexLock passLock(n.pollMutex);
    Bench::Versus v(every == 8 ? 20 : 10);
    for (auto _ : state) {
        auto setup = [&] {
            n.pollType = IPMI_POLL_NORMAL;
            n.pollCount = every == 8 ? 8 : 9;
            s.sdrCycle = 1;
        };
        if (!v.add(state, setup, [&] { IpmiIfcPollPass(0, s); })) break;
    }
    v.report(state);
    state.SetLabel(std::string(every == 8 ? "periodic pass, " : "steady pass, ") +
                   (state.range(0) == 0 ? "default profile" : std::to_string(state.range(0)) + " records"));
    finishRun();
}
BENCHMARK(BM_PollPass)->Args({0, 1})->Args({1000, 1})->Iterations(1000)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_PollPass)->Args({0, 8})->Iterations(20)->Unit(benchmark::kMicrosecond);

// What a provider does to show the sensor list: no exchange at all.
void BM_CachedSensorsWithReadings(benchmark::State& state) {
    if (!prepare(state, server(state))) return;
    sim().resetCounters();
    for (auto _ : state) {
        for (const auto& sensor : IpmiIfc::getSensors(0)) benchmark::DoNotOptimize(sensor->getCachedState());
    }
    state.counters["exchanges"] = static_cast<double>(sim().totalExchanges());
    state.counters["sensors"] = static_cast<double>(IpmiIfc::getSensors(0).size());
    finishRun();
}
BENCHMARK(BM_CachedSensorsWithReadings)->Arg(0)->Arg(1000)->Unit(benchmark::kMicrosecond);

// Without latency only: how the chain's exchanges, CPU and heap grow.
void BM_RefreshChainScaling(benchmark::State& state) {
    if (!prepare(state, server(state))) return;
    Bench::cpuOnly(state, forgetEverything, [] { IpmiIfcSdrGetInfo(0); });
    state.counters["sensors"] = static_cast<double>(IpmiIfc::getSensors(0).size());
    state.counters["heap_bytes_per_sensor"] = heapPerSensor();
    finishRun();
}
// About the same number of exchanges at every size, so that the small one
// stands above the noise too.
BENCHMARK(BM_RefreshChainScaling)->Arg(100)->Iterations(100)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_RefreshChainScaling)->Arg(1000)->Iterations(10)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_RefreshChainScaling)->Arg(4000)->Iterations(3)->Unit(benchmark::kMillisecond);

}  // namespace
