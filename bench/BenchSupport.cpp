#include "BenchSupport.h"

#include <fcntl.h>
#include <linux/ipmi.h>
#include <malloc.h>
#include <poll.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <new>

#include "IpmiCommands.h"

// Live heap bytes, as malloc accounts them. GCC cannot see that these new and
// delete pair malloc with free.
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

namespace Bench {

namespace {
// As a production host runs the library: debug lines masked.
const int kHostLogMask = setlogmask(LOG_UPTO(LOG_INFO));
}  // namespace

Sim::Simulator& sim() { return Sim::Simulator::instance(); }

namespace {

double seconds(clockid_t clock) {
    timespec ts;
    clock_gettime(clock, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

// Requests that carry a reservation in their first two bytes, by the Reserve
// command that hands it out (netfn << 8 | cmd).
uint16_t reserverOf(const Sim::Request& r) {
    using namespace Ipmi;
    if (r.netfn == netfn::storage && (r.cmd == cmd::getSdr || r.cmd == cmd::getSelEntry))
        return static_cast<uint16_t>(netfn::storage << 8 | (r.cmd == cmd::getSdr ? cmd::reserveSdrRepository : cmd::reserveSel));
    if (r.netfn == netfn::sensorEvent && r.cmd == cmd::getDeviceSdr)
        return static_cast<uint16_t>(netfn::sensorEvent << 8 | cmd::reserveDeviceSdrRepository);
    return 0;
}

bool isReserve(const Sim::Request& r) {
    using namespace Ipmi;
    return (r.netfn == netfn::storage && (r.cmd == cmd::reserveSdrRepository || r.cmd == cmd::reserveSel)) ||
           (r.netfn == netfn::sensorEvent && r.cmd == cmd::reserveDeviceSdrRepository);
}

}  // namespace

double cpuSeconds() { return seconds(CLOCK_PROCESS_CPUTIME_ID); }
double wallSeconds() { return seconds(CLOCK_MONOTONIC); }
long long liveHeapBytes() { return g_liveBytes.load(); }

Run replayBare(const std::vector<Sim::Request>& requests) {
    // Prepared before the clock starts: a request as the bare client holds it.
    struct Prepared {
        struct ipmi_addr addr;
        unsigned int addrLen;
        std::vector<uint8_t> data;
        uint16_t reserver;
        uint16_t reserves;
        uint8_t netfn, cmd;
    };
    std::vector<Prepared> todo(requests.size());
    for (size_t i = 0; i < requests.size(); ++i) {
        const Sim::Request& r = requests[i];
        Prepared& p = todo[i];
        memset(&p.addr, 0, sizeof p.addr);
        if (r.viaIpmb) {
            auto* ipmb = reinterpret_cast<struct ipmi_ipmb_addr*>(&p.addr);
            ipmb->addr_type = IPMI_IPMB_ADDR_TYPE;
            ipmb->channel = r.channel;
            ipmb->slave_addr = r.address;
            ipmb->lun = r.lun;
            p.addrLen = sizeof(struct ipmi_ipmb_addr);
        } else {
            auto* si = reinterpret_cast<struct ipmi_system_interface_addr*>(&p.addr);
            si->addr_type = IPMI_SYSTEM_INTERFACE_ADDR_TYPE;
            si->channel = IPMI_BMC_CHANNEL;
            si->lun = r.lun;
            p.addrLen = sizeof(struct ipmi_system_interface_addr);
        }
        p.data = r.data;
        p.netfn = r.netfn;
        p.cmd = r.cmd;
        // A reservation of 0 means a whole read that needs none.
        p.reserver = r.data.size() >= 2 && (r.data[0] | r.data[1]) != 0 ? reserverOf(r) : 0;
        p.reserves = isReserve(r) ? static_cast<uint16_t>(r.netfn << 8 | r.cmd) : 0;
    }

    Run run;
    const int fd = open("/dev/ipmi0", O_RDWR);
    if (fd < 0) return run;
    std::vector<std::pair<uint16_t, uint16_t>> held;  // Reserve command, its reservation
    uint8_t answer[IPMI_MAX_MSG_LENGTH];
    const double cpu0 = cpuSeconds(), wall0 = wallSeconds();
    long msgid = 0;
    for (Prepared& p : todo) {
        if (p.reserver != 0) {
            for (const auto& h : held)
                if (h.first == p.reserver) {
                    p.data[0] = static_cast<uint8_t>(h.second & 0xFF);
                    p.data[1] = static_cast<uint8_t>(h.second >> 8);
                }
        }
        struct ipmi_req req;
        memset(&req, 0, sizeof req);
        req.addr = reinterpret_cast<unsigned char*>(&p.addr);
        req.addr_len = p.addrLen;
        req.msgid = ++msgid;
        req.msg.netfn = p.netfn;
        req.msg.cmd = p.cmd;
        req.msg.data_len = static_cast<unsigned short>(p.data.size());
        req.msg.data = p.data.data();
        if (ioctl(fd, IPMICTL_SEND_COMMAND, &req) < 0) break;
        struct pollfd pfd = {fd, POLLIN, 0};
        if (poll(&pfd, 1, 5000) != 1) break;
        unsigned char addr[sizeof(struct ipmi_addr)];
        struct ipmi_recv recv;
        memset(&recv, 0, sizeof recv);
        recv.addr = addr;
        recv.addr_len = sizeof addr;
        recv.msg.data = answer;
        recv.msg.data_len = sizeof answer;
        if (ioctl(fd, IPMICTL_RECEIVE_MSG_TRUNC, &recv) < 0 && errno != EMSGSIZE) break;
        if (recv.msgid != req.msgid) break;
        ++run.exchanges;
        if (p.reserves != 0 && recv.msg.data_len >= 3 && answer[0] == 0) {
            const auto reservation = static_cast<uint16_t>(answer[1] | answer[2] << 8);
            bool known = false;
            for (auto& h : held)
                if (h.first == p.reserves) {
                    h.second = reservation;
                    known = true;
                }
            if (!known) held.emplace_back(p.reserves, reservation);
        }
    }
    run.cpu = cpuSeconds() - cpu0;
    run.wall = wallSeconds() - wall0;
    close(fd);
    return run;
}

bool Versus::add(benchmark::State& state, const std::function<void()>& setup, const std::function<void()>& op) {
    state.PauseTiming();
    bool ok = true;
    // The library's run, which also records what the bare client replays.
    auto libRun = [&](int64_t latencyUs, Run& into) {
        setup();
        sim().setLatencyUs(latencyUs);
        sim().resetCounters();
        const double cpu0 = cpuSeconds(), wall0 = wallSeconds();
        op();
        into.cpu += cpuSeconds() - cpu0;
        into.wall += wallSeconds() - wall0;
        sim().setLatencyUs(0);
        std::vector<Sim::Request> done = sim().requests();
        sim().resetCounters();
        into.exchanges += done.size();
        ok = ok && (requests_.empty() || done.size() == requests_.size());
        requests_.swap(done);
    };
    auto bareRun = [&](int64_t latencyUs, Run& into) {
        sim().setLatencyUs(latencyUs);
        const Run replay = replayBare(requests_);
        sim().setLatencyUs(0);
        sim().resetCounters();
        into.cpu += replay.cpu;
        into.wall += replay.wall;
        into.exchanges += replay.exchanges;
        ok = ok && replay.exchanges == requests_.size();
    };
    if (requests_.empty()) {
        Run warmUp;
        libRun(0, warmUp);
    }
    // In turns first, so that neither run always meets caches and the
    // machine as the other left them. Without latency nothing sleeps and the
    // CPU time is all work; with it, the wall time is what a caller waits.
    auto pair = [&](int64_t latency, Run& lib, Run& bare, bool libFirst) {
        if (libFirst) {
            libRun(latency, lib);
            bareRun(latency, bare);
        } else {
            bareRun(latency, bare);
            libRun(latency, lib);
        }
    };
    for (int i = 0; i < cpuRepeats_; ++i) pair(0, lib_, bare_, (cpuRuns_ + i) % 2 == 0);
    cpuRuns_ += cpuRepeats_;
    pair(kLatencyUs, libSlow_, bareSlow_, runs_ % 2 == 0);
    last_ = requests_.size();
    ++runs_;
    state.ResumeTiming();
    if (!ok) state.SkipWithError("the library's runs differ in their exchanges, or the replay lost an answer");
    return ok;
}

void Versus::report(benchmark::State& state) const {
    if (runs_ == 0 || lib_.exchanges == 0) return;
    const double runs = static_cast<double>(runs_);
    const double cpuRuns = static_cast<double>(cpuRuns_);
    const double exchanges = static_cast<double>(lib_.exchanges);
    state.counters["exchanges"] = exchanges / cpuRuns;
    state.counters["lib_wall_ms"] = libSlow_.wall / runs * 1e3;
    state.counters["bare_wall_ms"] = bareSlow_.wall / runs * 1e3;
    state.counters["wall_ratio"] = libSlow_.wall / bareSlow_.wall;
    state.counters["lib_cpu_us_per_exchange"] = (lib_.cpu - bare_.cpu) / exchanges * 1e6;
    state.counters["lib_cpu_us_per_run"] = (lib_.cpu - bare_.cpu) / cpuRuns * 1e6;
    state.counters["bare_cpu_us_per_exchange"] = bare_.cpu / exchanges * 1e6;
    // The same with the latency's sleep between exchanges: what the library
    // costs when every exchange finds its caches as the sleep left them.
    state.counters["lib_cpu_us_per_exchange_at_latency"] =
        (libSlow_.cpu - bareSlow_.cpu) / static_cast<double>(libSlow_.exchanges) * 1e6;
}

void cpuOnly(benchmark::State& state, const std::function<void()>& setup, const std::function<void()>& op) {
    double cpu = 0, bareCpu = 0, exchanges = 0;
    for (auto _ : state) {
        state.PauseTiming();
        setup();
        sim().resetCounters();
        const double cpu0 = cpuSeconds();
        op();
        cpu += cpuSeconds() - cpu0;
        const auto requests = sim().requests();
        sim().resetCounters();
        bareCpu += replayBare(requests).cpu;
        exchanges = static_cast<double>(requests.size());
        state.ResumeTiming();
    }
    const double runs = static_cast<double>(state.iterations());
    if (runs == 0 || exchanges == 0) return;
    state.counters["exchanges"] = exchanges;
    state.counters["lib_cpu_ms_per_run"] = (cpu - bareCpu) / runs * 1e3;
    state.counters["lib_cpu_us_per_exchange"] = (cpu - bareCpu) / runs / exchanges * 1e6;
}

}  // namespace Bench
