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
#include "IpmiIfcInternal.h"
#include "SdrLayout.h"
#include "Sim.h"

namespace {

using namespace Ipmi;

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

// ---- a generated repository of a large server

// Sensors sit on four controllers (the BMC and three behind it on IPMB), 250
// records each, since a controller numbers at most 256 sensors. Every fifth
// record is a full threshold sensor, then a compact sensor-specific and a
// compact generic discrete sensor, an event-only record and a FRU locator.
constexpr uint8_t kOwners[] = {0x20, 0x2C, 0x2E, 0x30};
constexpr size_t kRecordsPerOwner = 250;

void putName(std::vector<uint8_t>& r, size_t codeAt, const std::string& name) {
    r[codeAt] = static_cast<uint8_t>(0xC0 | name.size());
    r.insert(r.end(), name.begin(), name.end());
}

std::vector<uint8_t> header(uint16_t id, uint8_t type, size_t bodyEnd) {
    std::vector<uint8_t> r(bodyEnd, 0);
    r[sdr::header::recordId] = static_cast<uint8_t>(id & 0xFF);
    r[sdr::header::recordId + 1] = static_cast<uint8_t>(id >> 8);
    r[sdr::header::version] = 0x51;
    r[sdr::header::recordType] = type;
    return r;
}

void finish(std::vector<uint8_t>& r) {
    r[sdr::header::remainingLength] = static_cast<uint8_t>(r.size() - sdr::header::length);
}

void putKey(std::vector<uint8_t>& r, uint8_t owner, uint8_t number, uint8_t entity, uint8_t instance) {
    r[sdr::key::ownerId] = owner;
    r[sdr::key::sensorNumber] = number;
    r[sdr::key::entityId] = entity;
    r[sdr::key::entityInstance] = instance;
}

std::shared_ptr<Sim::Bmc> generatedServer(size_t records) {
    auto bmc = std::make_shared<Sim::Bmc>();
    static const uint8_t kEntities[] = {0x03, 0x07, 0x0A, 0x1D, 0x20};  // processor, board, PSU, fan, memory
    for (size_t i = 0; i < records; ++i) {
        const auto id = static_cast<uint16_t>(i + 1);
        const uint8_t owner = kOwners[(i / kRecordsPerOwner) % (sizeof kOwners)];
        const auto number = static_cast<uint8_t>(i % kRecordsPerOwner);
        const uint8_t entity = kEntities[(i / 5) % sizeof kEntities];
        const auto instance = static_cast<uint8_t>(1 + (i / 25) % 8);
        const std::string name = "Sensor " + std::to_string(id);
        std::vector<uint8_t> r;
        Sim::SensorModel m;
        m.owner = owner;
        m.number = number;
        switch (i % 5) {
        case 0:  // full threshold: a temperature, hysteresis readable
            r = header(id, sdr::type::fullSensor, sdr::full::idString);
            putKey(r, owner, number, entity, instance);
            r[sdr::sensor::capabilities] = 0x18;
            r[sdr::sensor::sensorType] = 0x01;
            r[sdr::sensor::eventReadingType] = sdr::eventReadingTypeThreshold;
            r[sdr::sensor::readableThresholds] = sdr::bits::allThresholds;
            r[sdr::sensor::baseUnit] = 1;
            r[sdr::full::mLow] = 1;
            putName(r, sdr::full::idStringTypeLength, name);
            m.type = 0x01;
            m.eventReadingType = sdr::eventReadingTypeThreshold;
            m.reading = static_cast<uint8_t>(30 + i % 20);
            m.readableMask = sdr::bits::allThresholds;
            m.thresholds[1] = 5;
            m.thresholds[4] = 90;
            m.hysteresisSupport = 1;
            break;
        case 1:  // compact sensor-specific (processor)
        case 2:  // compact generic discrete
            r = header(id, sdr::type::compactSensor, sdr::compact::idString);
            putKey(r, owner, number, entity, instance);
            r[sdr::sensor::sensorType] = i % 5 == 1 ? 0x07 : 0x08;
            r[sdr::sensor::eventReadingType] = i % 5 == 1 ? 0x6F : 0x03;
            r[sdr::compact::sharing] = 0x01;
            putName(r, sdr::compact::idStringTypeLength, name);
            m.type = r[sdr::sensor::sensorType];
            m.eventReadingType = r[sdr::sensor::eventReadingType];
            m.states = 0x0001;
            break;
        case 3:  // event-only
            r = header(id, sdr::type::eventOnly, sdr::eventOnly::idString);
            putKey(r, owner, number, entity, instance);
            r[sdr::eventOnly::sensorType] = 0x0F;
            r[sdr::eventOnly::eventReadingType] = 0x6F;
            r[sdr::eventOnly::sharing] = 0x01;
            putName(r, sdr::eventOnly::idStringTypeLength, name);
            m.eventOnly = true;
            break;
        default: {  // FRU device locator: no sensor behind it
            constexpr size_t kFruDeviceId = 6, kFruEntityId = 12, kFruEntityInstance = 13, kFruIdStringCode = 15;
            r = header(id, sdr::type::fruDeviceLocator, kFruIdStringCode + 1);
            r[sdr::key::ownerId] = 0x20;
            r[kFruDeviceId] = static_cast<uint8_t>(id & 0xFF);
            r[kFruEntityId] = entity;
            r[kFruEntityInstance] = instance;
            putName(r, kFruIdStringCode, "FRU " + std::to_string(id));
            finish(r);
            bmc->sdr.records.push_back(r);
            continue;
        }
        }
        finish(r);
        bmc->sdr.records.push_back(r);
        bmc->sensors.push_back(m);
    }
    return bmc;
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
