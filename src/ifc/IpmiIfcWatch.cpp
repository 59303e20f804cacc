// Observation of the polling loop: atomics written by the loop's thread and
// the transport, read by monitoring from any thread.

#include "IpmiIfcWatch.h"

#include <time.h>

#include <atomic>

namespace Ipmi {

namespace {

std::atomic<uint64_t> exchangeCounts[IpmiIfc::IPMI_EXCHANGE_RESULT_COUNT];
thread_local IpmiThreadExchanges threadCounts{};

// Times in microseconds of the time of day; 0: never.
std::atomic<int64_t> cacheRefreshUs[IpmiIfc::IPMI_CACHE_COUNT];
std::atomic<int64_t> lastPassUs{0};
std::atomic<int64_t> lastSuccessfulPassUs{0};
std::atomic<int64_t> lastPassDurationUs{0};
std::atomic<bool> lastPassReached{false};

int64_t nowUs(clockid_t clock) {
    struct timespec ts;
    clock_gettime(clock, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1000000 + ts.tv_nsec / 1000;
}

double seconds(int64_t us) { return static_cast<double>(us) / 1e6; }

bool validCache(IpmiIfc::IPMI_CACHE cache) { return cache >= 0 && cache < IpmiIfc::IPMI_CACHE_COUNT; }

}  // namespace

void IpmiIfcWatchExchange(IpmiIfc::IPMI_EXCHANGE_RESULT result) {
    if (result < 0 || result >= IpmiIfc::IPMI_EXCHANGE_RESULT_COUNT) return;
    exchangeCounts[result].fetch_add(1, std::memory_order_relaxed);
    ++threadCounts.count[result];
}

IpmiThreadExchanges IpmiIfcWatchThreadExchanges() { return threadCounts; }

IpmiRefreshWatch::IpmiRefreshWatch() : before_(threadCounts) {}

bool IpmiRefreshWatch::answered() const {
    return threadCounts.count[IpmiIfc::IPMI_EXCHANGE_OK] > before_.count[IpmiIfc::IPMI_EXCHANGE_OK] ||
           threadCounts.count[IpmiIfc::IPMI_EXCHANGE_COMPLETION_CODE] >
               before_.count[IpmiIfc::IPMI_EXCHANGE_COMPLETION_CODE];
}

void IpmiRefreshWatch::finish(IpmiIfc::IPMI_CACHE cache, bool succeeded) const {
    if (!validCache(cache) || !succeeded || !answered()) return;
    if (threadCounts.count[IpmiIfc::IPMI_EXCHANGE_TIMEOUT] != before_.count[IpmiIfc::IPMI_EXCHANGE_TIMEOUT] ||
        threadCounts.count[IpmiIfc::IPMI_EXCHANGE_ERROR] != before_.count[IpmiIfc::IPMI_EXCHANGE_ERROR])
        return;
    cacheRefreshUs[cache].store(nowUs(CLOCK_REALTIME), std::memory_order_relaxed);
}

IpmiPassWatch::IpmiPassWatch() : startedUs_(nowUs(CLOCK_MONOTONIC)) {}

// Also on the way out of an exception: a pass that threw still ended.
IpmiPassWatch::~IpmiPassWatch() {
    const int64_t endedUs = nowUs(CLOCK_REALTIME);
    const int64_t took = nowUs(CLOCK_MONOTONIC) - startedUs_;
    const bool reached = exchanges_.answered();
    lastPassDurationUs.store(took > 0 ? took : 0, std::memory_order_relaxed);
    lastPassReached.store(reached, std::memory_order_relaxed);
    if (reached) lastSuccessfulPassUs.store(endedUs, std::memory_order_relaxed);
    lastPassUs.store(endedUs, std::memory_order_release);
}

double IpmiIfc::getLastPassTime(int) { return seconds(lastPassUs.load(std::memory_order_acquire)); }
double IpmiIfc::getLastPassTime() { return getLastPassTime(0); }
bool IpmiIfc::lastPassReachedController(int) { return lastPassReached.load(std::memory_order_relaxed); }
bool IpmiIfc::lastPassReachedController() { return lastPassReachedController(0); }
double IpmiIfc::getLastSuccessfulPassTime(int) { return seconds(lastSuccessfulPassUs.load(std::memory_order_relaxed)); }
double IpmiIfc::getLastSuccessfulPassTime() { return getLastSuccessfulPassTime(0); }
double IpmiIfc::getLastPassDuration(int) { return seconds(lastPassDurationUs.load(std::memory_order_relaxed)); }
double IpmiIfc::getLastPassDuration() { return getLastPassDuration(0); }

double IpmiIfc::getCacheRefreshTime(int, IPMI_CACHE cache) {
    return validCache(cache) ? seconds(cacheRefreshUs[cache].load(std::memory_order_relaxed)) : 0;
}
double IpmiIfc::getCacheRefreshTime(IPMI_CACHE cache) { return getCacheRefreshTime(0, cache); }

uint64_t IpmiIfc::getExchangeCount(int, IPMI_EXCHANGE_RESULT result) {
    if (result < 0 || result >= IPMI_EXCHANGE_RESULT_COUNT) return 0;
    return exchangeCounts[result].load(std::memory_order_relaxed);
}
uint64_t IpmiIfc::getExchangeCount(IPMI_EXCHANGE_RESULT result) { return getExchangeCount(0, result); }

}  // namespace Ipmi
