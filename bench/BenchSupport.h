#ifndef TAV_IPMI_BENCH_BENCHSUPPORT_H
#define TAV_IPMI_BENCH_BENCHSUPPORT_H

// What every benchmark here measures with: clocks, the live heap, and the
// bare client that sets the floor an operation is compared against.
//
// The floor is measured, not computed: the requests the library sent are
// replayed by a client that does nothing but IPMICTL_SEND_COMMAND, poll and
// IPMICTL_RECEIVE_MSG_TRUNC on the same simulated device at the same latency.
// Whatever the simulator, the interposed C library and the latency's sleep
// cost is then in both runs, and the difference is the library's own.

#include <benchmark/benchmark.h>
#include <stddef.h>
#include <stdint.h>

#include <functional>
#include <memory>
#include <vector>

#include "Sim.h"

namespace Bench {

Sim::Simulator& sim();

double cpuSeconds();   // CPU time of the process
double wallSeconds();  // monotonic
// Bytes held through operator new (allocations of the library's objects).
long long liveHeapBytes();

// The latency of a real KCS controller at its quick end.
constexpr int64_t kLatencyUs = 1000;

struct Run {
    double wall = 0;
    double cpu = 0;
    size_t exchanges = 0;
};

// Replays `requests` on a descriptor of its own with bare ioctl and poll
// calls; reservations are taken from the replay's own Reserve answers.
Run replayBare(const std::vector<Sim::Request>& requests);

// One operation, run by the library and replayed by the bare client, twice:
// without latency for CPU time (nothing sleeps, so all of it is work) and
// with kLatencyUs per answer for wall time.
class Versus {
public:
    // `cpuRepeats` runs without latency per run with it: a short operation
    // needs many for its CPU time to settle.
    explicit Versus(int cpuRepeats = 1) : cpuRepeats_(cpuRepeats) {}
    // `setup` brings the library back to where `op` starts; it runs untimed
    // before each of the two runs.
    bool add(benchmark::State& state, const std::function<void()>& setup, const std::function<void()>& op);
    // Counters: exchanges per run, library and bare wall at the latency and
    // their ratio, library CPU per exchange and per run beyond the bare
    // client's, and the bare client's own CPU per exchange.
    void report(benchmark::State& state) const;
    size_t lastExchanges() const { return last_; }

private:
    Run lib_, bare_, libSlow_, bareSlow_;
    std::vector<Sim::Request> requests_;  // of the library's last run
    int cpuRepeats_;
    long runs_ = 0, cpuRuns_ = 0;
    size_t last_ = 0;
};

// Without latency only, for how cost grows with size: runs `op` after
// `setup` once an iteration and reports exchanges per run and the library's
// CPU beyond the bare client's, per run and per exchange.
void cpuOnly(benchmark::State& state, const std::function<void()>& setup, const std::function<void()>& op);

}  // namespace Bench

#endif
