// Scrapes of the metrics endpoint against a repository of 1,000 sensors, with
// the polling loop running beside them on a thread of its own, as `tavipmi
// serve` runs it. Each iteration builds the whole /metrics text from the
// caches (the HTTP layer is left out).
//
// - Beside an idle loop (real time: the loop sleeps 16 s between passes), the
//   simulator's exchange count over the run divided by the scrapes gives the
//   exchanges per scrape, which must be 0.
// - Beside a busy loop (virtual time: the loop's sleeps take no time, so it
//   reads the SEL info and refreshes all readings back to back), the latency
//   and CPU time of a scrape while the loop writes the caches it reads.
//
// The CPU column is the scraping thread's own CPU time per scrape.

#ifdef TAV_IPMI_BENCH_TOOL

#include <benchmark/benchmark.h>

#include <chrono>
#include <thread>

#include "GeneratedServer.h"
#include "IpmiIfc.h"
#include "IpmiIfcInternal.h"
#include "BenchSupport.h"
#include "Metrics.h"
#include "Sim.h"

namespace {

using namespace Ipmi;

// 1,250 records: 1,000 sensors and 250 FRU locators.
constexpr size_t kRecords = 1250;

using Bench::sim;

void scrapeBesideLoop(benchmark::State& state, bool busyLoop) {
    sim().install(Sim::generatedServer(kRecords), busyLoop);
    sim().clearFaults();
    sim().setLatencyUs(0);
    InitIpmiNode(0);
    g_IpmiNode[0].stopRequested = false;
    std::thread loop([] { IpmiIfc::start(0, 1); });
    if (IpmiIfc::waitState(0, IpmiIfc::IPMI_STATE_RUNNING | IpmiIfc::IPMI_STATE_STOPPED) !=
        IpmiIfc::IPMI_STATE_RUNNING) {
        state.SkipWithError("the polling loop did not start");
        loop.join();
        sim().uninstall();
        return;
    }
    // The loop's preamble (SEL, LAN, FRU discovery) runs once the loop is
    // running: in real time, wait until the controller falls quiet.
    if (!busyLoop) {
        unsigned seen = sim().totalExchanges();
        for (int i = 0; i < 50; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(200));
            const unsigned now = sim().totalExchanges();
            if (now == seen) break;
            seen = now;
        }
    }
    const unsigned exchangesBefore = sim().totalExchanges();
    size_t bytes = 0;
    for (auto _ : state) {
        const std::string text = Tool::metricsText();
        bytes = text.size();
        benchmark::DoNotOptimize(text.data());
    }
    const unsigned exchanges = sim().totalExchanges() - exchangesBefore;
    const auto scrapes = static_cast<double>(state.iterations());
    state.counters["sensors"] = static_cast<double>(IpmiIfc::getSensors(0).size());
    state.counters["bytes"] = static_cast<double>(bytes);
    if (busyLoop)
        state.counters["loop_exchanges"] = exchanges;
    else
        state.counters["exchanges_per_scrape"] = scrapes > 0 ? exchanges / scrapes : 0;
    IpmiIfc::stop(0);
    loop.join();
    sim().uninstall();
}

void BM_ScrapeBesideIdleLoop(benchmark::State& state) { scrapeBesideLoop(state, false); }
void BM_ScrapeBesideBusyLoop(benchmark::State& state) { scrapeBesideLoop(state, true); }

BENCHMARK(BM_ScrapeBesideIdleLoop)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_ScrapeBesideBusyLoop)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace

#endif
