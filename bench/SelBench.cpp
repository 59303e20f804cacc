// The SEL against the simulated controller, each operation against the bare
// client's replay of its requests (BenchSupport.h):
//
// - loading a 3,000-record log at start (the first Get SEL Info answer), and
//   the heap each record held costs;
// - one poll pass that finds one new record and hands it to a handler;
// - the direct synchroniser reading the same log;
// - the load at 100, 1,000 and 4,000 records, for how its cost grows.
//
// Exchange counts are checked against what the algorithm must ask.

#include <benchmark/benchmark.h>
#include <stdlib.h>

#include <memory>
#include <string>
#include <vector>

#include "BenchSupport.h"
#include "Bmc.h"
#include "IpmiIfcInternal.h"
#include "IpmiSel.h"
#include "IpmiSelData.h"
#include "Sim.h"

namespace {

using namespace Ipmi;
using Bench::sim;

constexpr size_t kRecords = 3000;
constexpr size_t kRecordBytes = 16;

void logEvent(Sim::Bmc& bmc, uint16_t serial) {
    const uint8_t record[kRecordBytes] = {0,    0,    0x02, 0, 0, 0, 0, 0x20, 0x00, 0x04, 0x01, 0x30, 0x01, 0x07,
                                          uint8_t(serial), uint8_t(serial >> 8)};
    Sim::addSelRecord(bmc, record);
}

std::shared_ptr<Sim::Bmc> generatedLog(size_t records) {
    auto bmc = std::make_shared<Sim::Bmc>();
    bmc->sel.allocationUnits = 0xFFFF;
    bmc->sel.eraseTimestamp = 1;  // erased once: the first answer reloads
    for (size_t i = 0; i < records; ++i) logEvent(*bmc, static_cast<uint16_t>(i));
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
    IpmiIfcSelDropRecords(0);
}

void closeNode() {
    forgetSel();
    IpmiIfcOpenIpmiClose(0);
    sim().uninstall();
}

bool expect(benchmark::State& state, size_t exchanges, size_t needed) {
    if (exchanges == needed) return true;
    state.SkipWithError(
        ("exchanges " + std::to_string(exchanges) + ", the algorithm needs " + std::to_string(needed)).c_str());
    return false;
}

// Heap the records of one load hold, per record beyond its 16 bytes.
double heapPerRecord(size_t records) {
    forgetSel();
    sim().resetCounters();
    const long long before = Bench::liveHeapBytes();
    IpmiIfcSelGetInfo(0, nullptr);
    sim().resetCounters();  // the simulator's request log is not the library's
    const size_t held = IpmiIfc::getSelData().size();
    return held == records ? static_cast<double>(Bench::liveHeapBytes() - before) / static_cast<double>(records) -
                                 static_cast<double>(kRecordBytes)
                           : -1;
}

// Get SEL Info, Reserve SEL, one Get SEL Entry per record.
void BM_SelLoadAtStart(benchmark::State& state) {
    openNode(generatedLog(kRecords));
    Bench::Versus v(2);
    for (auto _ : state)
        if (!v.add(state, forgetSel, [] { IpmiIfcSelGetInfo(0, nullptr); }) ||
            !expect(state, v.lastExchanges(), 2 + kRecords))
            break;
    v.report(state);
    state.counters["heap_bytes_per_record_beyond_16"] = heapPerRecord(kRecords);
    closeNode();
}
BENCHMARK(BM_SelLoadAtStart)->Unit(benchmark::kMillisecond)->Iterations(4);

void countRecord(void* context, IpmiSelData* record) {
    if (record != nullptr) ++*static_cast<size_t*>(context);
}

// Get SEL Info, Reserve SEL, the last record held again, the new one, which a
// registered handler receives; in a log of range(0) records, since delivery
// looks at every record held for those stamped after the last addition.
void BM_SelRecordDelivered(benchmark::State& state) {
    auto bmc = generatedLog(static_cast<size_t>(state.range(0)));
    openNode(bmc);
    IpmiIfcSelGetInfo(0, nullptr);
    size_t delivered = 0;
    IpmiIfc::registerSelEventHandler(0, countRecord, &delivered);
    Bench::Versus v(10);
    uint16_t serial = 0;
    auto logOne = [&] {
        sim().withBmc([&](Sim::Bmc& b) {
            b.sel.clockOffset += 1;
            logEvent(b, ++serial);
        });
    };
    for (auto _ : state)
        if (!v.add(state, logOne, [] { IpmiIfcSelGetInfo(0, nullptr); }) || !expect(state, v.lastExchanges(), 4))
            break;
    v.report(state);
    // Every run of the library, warm-up included, finds its one record.
    state.counters["delivered_per_pass"] =
        static_cast<double>(delivered) / static_cast<double>(1 + 11 * state.iterations());
    IpmiIfc::unRegisterSelEventHandler(0, countRecord);
    closeNode();
}
BENCHMARK(BM_SelRecordDelivered)->Arg(100)->Arg(kRecords)->Unit(benchmark::kMicrosecond)->Iterations(300);

// Get SEL Info, Reserve SEL, one Get SEL Entry per record (the greeting
// comes once per process, before the first run).
void BM_SelSyncDeviceEventlog(benchmark::State& state) {
    sim().install(generatedLog(kRecords), true);
    sim().clearFaults();
    sel_state warm = {};
    Event_log* records = nullptr;
    int n = 0;
    sync_device_eventlog(&records, &n, &warm);  // greets the controller
    free(records);
    Bench::Versus v(2);
    auto sync = [&] {
        sel_state fresh = {};
        n = 0;
        sync_device_eventlog(&records, &n, &fresh);
        free(records);
    };
    for (auto _ : state)
        if (!v.add(state, [] {}, sync) || !expect(state, v.lastExchanges(), 2 + kRecords)) break;
    v.report(state);
    sim().uninstall();
}
BENCHMARK(BM_SelSyncDeviceEventlog)->Unit(benchmark::kMillisecond)->Iterations(2);

// Without latency only: how the load's exchanges, CPU and heap grow.
void BM_SelLoadScaling(benchmark::State& state) {
    const auto records = static_cast<size_t>(state.range(0));
    openNode(generatedLog(records));
    Bench::cpuOnly(state, forgetSel, [] { IpmiIfcSelGetInfo(0, nullptr); });
    state.counters["heap_bytes_per_record_beyond_16"] = heapPerRecord(records);
    closeNode();
}
// About the same number of exchanges at every size, so that the small one
// stands above the noise too.
BENCHMARK(BM_SelLoadScaling)->Arg(100)->Iterations(100)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_SelLoadScaling)->Arg(1000)->Iterations(10)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_SelLoadScaling)->Arg(4000)->Iterations(3)->Unit(benchmark::kMillisecond);

}  // namespace
