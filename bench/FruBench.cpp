// FRU discovery of every device of the real server profile with the most FRU
// data, against the bare client's replay of its requests (BenchSupport.h):
// exchanges per pass (checked against the algorithm's own count), wall time
// at the latency and CPU beyond the bare client's.

#include <benchmark/benchmark.h>
#include <dirent.h>

#include <memory>
#include <set>
#include <string>

#include "BenchSupport.h"
#include "Bmc.h"
#include "FruLayout.h"
#include "IpmiIfcInternal.h"
#include "SdrLayout.h"
#include "Sim.h"

namespace {

using namespace Ipmi;

using Bench::sim;

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

bool prepare(benchmark::State& state, std::shared_ptr<Sim::Bmc>& bmc) {
    const std::string profile = largestProfile();
    if (profile.empty()) {
        state.SkipWithError("real server profiles not present");
        return false;
    }
    bmc = Sim::loadProfile(profile);
    sim().install(bmc, true);
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

void BM_FruDiscovery(benchmark::State& state) {
    std::shared_ptr<Sim::Bmc> bmc;
    if (!prepare(state, bmc)) return;
    const size_t expected = algorithmExchanges(*bmc);
    Bench::Versus v(20);
    for (auto _ : state) {
        if (!v.add(state, [] {}, [] { IpmiIfcFruInstantiateAll(0); })) break;
        if (v.lastExchanges() != expected) {
            state.SkipWithError(("exchanges " + std::to_string(v.lastExchanges()) + ", the algorithm needs " +
                                 std::to_string(expected)).c_str());
            break;
        }
    }
    v.report(state);
    state.counters["devices"] = static_cast<double>(IpmiIfc::getFrus(0).size());
    finish();
}
BENCHMARK(BM_FruDiscovery)->Iterations(20)->Unit(benchmark::kMillisecond);

}  // namespace
