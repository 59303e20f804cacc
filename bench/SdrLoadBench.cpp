// A full SDR repository load (the info answer, then IpmiIfcSdrGetAll) against
// the simulated controller in virtual time: exchanges per load, CPU time per
// exchange (library and simulated controller together) and peak memory.

#include <benchmark/benchmark.h>
#include <string.h>
#include <sys/resource.h>

#include <memory>
#include <string>

#include "Bmc.h"
#include "IpmiIfcInternal.h"
#include "Sim.h"

namespace {

using namespace Ipmi;

Sim::Simulator& sim() { return Sim::Simulator::instance(); }

// What a load has to ask: one info, one reservation, one header read per
// record, and one Get SDR per 16 bytes of every record.
size_t exchangesRequired(const Sim::Bmc& bmc) {
    size_t n = 2;
    for (const auto& r : bmc.sdr.records) n += 1 + (r.size() + 15) / 16;
    return n;
}

std::vector<uint8_t> generatedRecord(uint16_t id) {
    // Full, compact and event-only sensors and FRU locators, as a large server has them.
    static const struct {
        uint8_t type;
        size_t size;
    } kinds[] = {{0x01, 64}, {0x02, 48}, {0x02, 40}, {0x03, 28}, {0x11, 28}};
    const auto& k = kinds[id % (sizeof kinds / sizeof kinds[0])];
    std::vector<uint8_t> r(k.size);
    r[0] = static_cast<uint8_t>(id & 0xFF);
    r[1] = static_cast<uint8_t>(id >> 8);
    r[2] = 0x51;
    r[3] = k.type;
    r[4] = static_cast<uint8_t>(k.size - 5);
    for (size_t i = 5; i < k.size; ++i) r[i] = static_cast<uint8_t>(id + i);
    r[7] = static_cast<uint8_t>(id);
    if (k.type == 0x02) r[23] = 0x01;  // one sensor per record
    if (k.type == 0x03) r[12] = 0x01;
    return r;
}

std::shared_ptr<Sim::Bmc> generatedRepository(size_t records) {
    auto bmc = std::make_shared<Sim::Bmc>();
    for (size_t i = 1; i <= records; ++i) bmc->sdr.records.push_back(generatedRecord(static_cast<uint16_t>(i)));
    return bmc;
}

void forgetRepository() {
    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcSdrCleanUpHeaders(0);
    memset(&g_IpmiNode[0].work.sdr, 0, sizeof g_IpmiNode[0].work.sdr);
}

// Fetches and stores the repository info as the info handler would, without
// the sensor and entity rebuilds that it also starts.
bool storeInfo() {
    RespHolder info(IpmiIfcSendCmd(0, cmd::getSdrRepositoryInfo, netfn::storage, 0, 0, nullptr, 0));
    if (!info || info->cc != 0 || info->data_len != sizeof g_IpmiNode[0].work.sdr.info) return false;
    CacheWriteLock guard(g_IpmiNode[0].cacheLock);
    memcpy(g_IpmiNode[0].work.sdr.info, info->data, sizeof g_IpmiNode[0].work.sdr.info);
    return true;
}

long peakRssKb() {
    struct rusage usage;
    getrusage(RUSAGE_SELF, &usage);
    return usage.ru_maxrss;
}

void fullLoad(benchmark::State& state, std::shared_ptr<Sim::Bmc> bmc) {
    sim().install(bmc, true);
    sim().clearFaults();
    InitIpmiNode(0);
    g_IpmiNode[0].myAddress = 0x20;
    g_IpmiNode[0].stopRequested = false;
    if (IpmiIfcOpenIpmiOpen(0) < 0) {
        state.SkipWithError("cannot open the simulated device");
        return;
    }
    const size_t required = exchangesRequired(*bmc);
    size_t exchanges = 0;
    for (auto _ : state) {
        state.PauseTiming();
        forgetRepository();
        sim().resetCounters();
        state.ResumeTiming();

        bool ok = storeInfo();
        uint32_t rc = IpmiIfcSdrGetAll(0);
        benchmark::DoNotOptimize(rc);

        state.PauseTiming();
        exchanges = sim().totalExchanges();
        if (!ok || (rc != 0 && !bmc->sdr.records.empty())) {
            state.SkipWithError("the load failed");
            break;
        }
        if (exchanges != required) {
            state.SkipWithError(("exchanges " + std::to_string(exchanges) + ", the walk needs " +
                                 std::to_string(required)).c_str());
            break;
        }
        state.ResumeTiming();
    }
    state.counters["records"] = static_cast<double>(bmc->sdr.records.size());
    state.counters["exchanges"] = static_cast<double>(exchanges);
    state.counters["per_exchange"] = benchmark::Counter(static_cast<double>(exchanges),
                                                        benchmark::Counter::kIsIterationInvariantRate |
                                                            benchmark::Counter::kInvert);
    state.counters["peak_rss_kB"] = static_cast<double>(peakRssKb());
    forgetRepository();
    IpmiIfcOpenIpmiClose(0);
    sim().uninstall();
}

void BM_SdrLoadDefaultProfile(benchmark::State& state) {
    fullLoad(state, Sim::loadProfile(Sim::defaultProfilePath()));
}

void BM_SdrLoadThousandRecords(benchmark::State& state) { fullLoad(state, generatedRepository(1000)); }

BENCHMARK(BM_SdrLoadDefaultProfile)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_SdrLoadThousandRecords)->Unit(benchmark::kMillisecond);

}  // namespace
