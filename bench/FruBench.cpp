// FRU discovery of every device of the real server profile with the most FRU
// data: exchanges per pass (checked against the algorithm's own count), CPU
// per exchange in virtual time, wall time against exchanges x latency with a
// controller that answers at a fixed latency, and ipmitool's `fru print` on
// the same simulated controller for comparison.

#include <benchmark/benchmark.h>
#include <dirent.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <fstream>
#include <memory>
#include <set>
#include <string>

#include "Bmc.h"
#include "FruLayout.h"
#include "IpmiIfcInternal.h"
#include "SdrLayout.h"
#include "Sim.h"

namespace {

using namespace Ipmi;

Sim::Simulator& sim() { return Sim::Simulator::instance(); }

size_t fruBytes(const Sim::Bmc& bmc) {
    size_t n = 0;
    for (const auto& d : bmc.fru.devices) n += d.second.data.size();
    return n;
}

// The real profile with the most FRU data, or empty.
std::string largestProfile() {
    static const std::string chosen = [] {
        const std::string dir = std::string(TAV_IPMI_REAL_DATA_DIR) + "/sim";
        std::string best;
        size_t bestBytes = 0;
        DIR* d = opendir(dir.c_str());
        if (d == nullptr) return best;
        while (dirent* e = readdir(d)) {
            const std::string name = e->d_name;
            if (name.size() < 4 || name.compare(name.size() - 4, 4, ".emu") != 0) continue;
            try {
                const size_t bytes = fruBytes(*Sim::loadProfile(dir + "/" + name));
                if (bytes > bestBytes) {
                    bestBytes = bytes;
                    best = dir + "/" + name;
                }
            } catch (const std::exception&) {
                // Profiles in dialects the simulator does not read hold no FRU data for us.
            }
        }
        closedir(d);
        return best;
    }();
    return chosen;
}

size_t chunks(size_t bytes) { return (bytes + 22) / 23; }

// What a discovery pass asks, by the algorithm: per local logical device the
// area info and the header; per info area its length and its 23-byte chunks;
// per multi-record area one read per record header and its chunks.
size_t algorithmExchanges(const Sim::Bmc& bmc) {
    size_t n = 0;
    std::set<uint8_t> seen;
    for (const auto& r : bmc.sdr.records) {
        const fru::LocatorView loc(r.data(), r.size());
        if (sdr::SdrView(r.data(), r.size()).recordType() != sdr::type::fruDeviceLocator || !loc.logical() ||
            loc.accessAddress() != 0x20 || loc.channel() != 0 || loc.accessLun() != 0 ||
            !seen.insert(loc.deviceId()).second)
            continue;
        ++n;
        const auto it = bmc.fru.devices.find(loc.deviceId());
        if (it == bmc.fru.devices.end() || it->second.data.size() < fru::header::length) continue;
        const fru::Bytes image(it->second.data.data(), it->second.data.size());
        ++n;
        if (image.byteAt(fru::header::version) != fru::kFormatVersion) continue;
        for (size_t slot : {fru::header::chassisOffset, fru::header::boardOffset, fru::header::productOffset}) {
            const size_t at = image.byteAt(slot) * fru::kUnit;
            if (at == 0 || !image.has(at, 2)) continue;
            ++n;
            const size_t length = image.byteAt(at + fru::infoArea::length) * fru::kUnit;
            if (length > 0 && image.has(at, length)) n += chunks(length);
        }
        const size_t multi = image.byteAt(fru::header::multiRecordOffset) * fru::kUnit;
        if (multi == 0) continue;
        size_t total = 0;
        for (;;) {
            if (!image.has(multi + total, fru::multi::headerLength)) break;
            ++n;
            const fru::MultiRecordHeaderView h(image.from(multi + total));
            total += h.dataLength() == 0 ? fru::multi::headerLength : h.recordLength();
            if (h.dataLength() == 0 || h.endOfList()) break;
        }
        if (total > 0 && image.has(multi, total)) n += chunks(total);
    }
    return n;
}

bool prepare(benchmark::State& state, std::shared_ptr<Sim::Bmc>& bmc, bool virtualTime) {
    const std::string profile = largestProfile();
    if (profile.empty()) {
        state.SkipWithError("real server profiles not present");
        return false;
    }
    bmc = Sim::loadProfile(profile);
    sim().install(bmc, virtualTime);
    sim().clearFaults();
    InitIpmiNode(0);
    g_IpmiNode[0].myAddress = 0x20;
    g_IpmiNode[0].stopRequested = false;
    if (IpmiIfcOpenIpmiOpen(0) < 0 || IpmiIfcSdrGetInfo(0) != 0) {
        state.SkipWithError("cannot read the simulated repository");
        return false;
    }
    state.SetLabel(profile.substr(profile.rfind('/') + 1));
    return true;
}

void finish() {
    sim().setLatencyUs(0);
    g_IpmiNode[0].frus.clear();
    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcSdrCleanUpHeaders(0);
    IpmiIfcEntityCleanUpAll(0);
    IpmiIfcOpenIpmiClose(0);
    sim().uninstall();
}

// One pass per iteration; `latencyUs` 0 runs in virtual time.
void discovery(benchmark::State& state, int64_t latencyUs) {
    std::shared_ptr<Sim::Bmc> bmc;
    if (!prepare(state, bmc, latencyUs == 0)) return;
    sim().setLatencyUs(latencyUs);
    const size_t expected = algorithmExchanges(*bmc);
    size_t exchanges = 0, devices = 0, reads = 0;
    for (auto _ : state) {
        state.PauseTiming();
        sim().resetCounters();
        state.ResumeTiming();
        IpmiIfcFruInstantiateAll(0);
        state.PauseTiming();
        exchanges = sim().totalExchanges();
        reads = sim().exchanges(netfn::storage, cmd::readFruData);
        devices = IpmiIfc::getFrus(0).size();
        state.ResumeTiming();
    }
    if (exchanges != expected)
        state.SkipWithError(("exchanges " + std::to_string(exchanges) + ", the algorithm needs " +
                             std::to_string(expected)).c_str());
    state.counters["devices"] = static_cast<double>(devices);
    state.counters["exchanges"] = static_cast<double>(exchanges);
    state.counters["read_fru_data"] = static_cast<double>(reads);
    if (latencyUs == 0) {
        state.counters["per_exchange"] = benchmark::Counter(
            static_cast<double>(exchanges), benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
    } else {
        // Wall time of a pass over what the exchanges alone must take.
        state.counters["floor_ms"] = static_cast<double>(exchanges) * static_cast<double>(latencyUs) / 1000.0;
    }
    finish();
}

void BM_FruDiscoveryCpu(benchmark::State& state) { discovery(state, 0); }
BENCHMARK(BM_FruDiscoveryCpu)->Unit(benchmark::kMillisecond);

void BM_FruDiscoveryAtLatency(benchmark::State& state) { discovery(state, state.range(0)); }
BENCHMARK(BM_FruDiscoveryAtLatency)->Arg(200)->Arg(1000)->Iterations(3)->UseRealTime()->Unit(benchmark::kMillisecond);

// ipmitool `fru print` on the same controller: what it asks, counted by the
// simulator inside its process.
void BM_IpmitoolFruPrint(benchmark::State& state) {
    const std::string profile = largestProfile();
    if (profile.empty() || system("command -v ipmitool >/dev/null 2>&1") != 0) {
        state.SkipWithError("ipmitool or the real server profiles not present");
        return;
    }
    const std::string counts = "/tmp/tav-fru-bench-counts-" + std::to_string(getpid());
    const std::string command = "TAV_IPMI_SIM_PROFILE='" + profile + "' TAV_IPMI_SIM_VIRTUAL_TIME=1 TAV_IPMI_SIM_COUNTS='" +
                                counts + "' LD_PRELOAD='" TAV_IPMI_PRELOAD_LIB "' ipmitool -I open fru print >/dev/null 2>&1";
    for (auto _ : state) {
        if (system(command.c_str()) == -1) state.SkipWithError("cannot run ipmitool");
    }
    unsigned total = 0, reads = 0, info = 0;
    std::ifstream in(counts);
    unsigned netfn = 0, cmd = 0, n = 0;
    while (in >> std::hex >> netfn >> cmd >> std::dec >> n) {
        total += n;
        if (netfn == netfn::storage && cmd == cmd::readFruData) reads = n;
        if (netfn == netfn::storage && cmd == cmd::getFruInventoryAreaInfo) info = n;
    }
    unlink(counts.c_str());
    state.SetLabel(profile.substr(profile.rfind('/') + 1));
    state.counters["exchanges"] = total;
    state.counters["read_fru_data"] = reads;
    state.counters["area_info"] = info;
}
BENCHMARK(BM_IpmitoolFruPrint)->Iterations(1)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace
