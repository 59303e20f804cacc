// Life cycle of node 0: start (set-up, then the polling loop on the caller's
// thread), stop from another thread, wake-ups, pollAll and the command-line mode.
//
// Lock order: pollMutex (held by the loop for a whole pass) -> a refresh's own
// locks -> devInfoMutex -> transportMutex. SEL handlers run with pollMutex
// held and the handler-list mutex released.

#include <cxxabi.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <string.h>
#include <sys/time.h>
#include <unistd.h>

#include <atomic>
#include <vector>

#include "IpmiIfcInternal.h"
#include "IpmiIfcSel.h"
#include "IpmiIfcWatch.h"
#include "IpmiLan.h"
#include "IpmiMapper.h"

namespace Ipmi {

int SKIP_SDR_STEP = 30;
int SKIP_FRU_STEP = 30;

namespace {

constexpr unsigned int kOwnAddress = 0x20;
constexpr int kSecondsPerIntervalUnit = 16;
constexpr int kSelInfoTries = 10;
constexpr int kPeriodicMask = 7;  // one pass in eight does the periodic work
constexpr int kSlowStartTries = 59;
constexpr int kStillWaitingEvery = 500;
constexpr int kNodesPerFullPoll = 8;
constexpr unsigned char kWakeByte = 255;

// stop() sets the flag from another thread without a lock.
bool stopping(IpmiNode& n) { return n.stopRequested.load(std::memory_order_acquire); }

int intervalOf(IpmiNode& n) { return __atomic_load_n(&n.pollInterval, __ATOMIC_RELAXED); }

int skipStep(int* step) {
    int v = __atomic_load_n(step, __ATOMIC_RELAXED);
    return v < 1 ? 1 : v;  // a step below 1 counts as 1
}

// Creates the wake-up pipe: a blocking read end (waited on beside the device)
// and a non-blocking write end (stop never blocks on it). Returns the text of
// the failure, or null.
const char* openWakeupPipe(IpmiNode& n) {
    int* fds = n.signalCmdPipeFds;
    if (pipe(fds) != 0) return "UnnamedPipe::UnnamedPipe: pipe failed";
    int flags = fcntl(fds[FD_READ], F_GETFL, 0);
    if (flags < 0) return "UnnamedPipe::UnnamedPipe: fcntl(g_IpmiNode[NodeNum].signalCmdPipeFds[FD_READ], F_GETFL, 0) failed";
    if (fcntl(fds[FD_READ], F_SETFL, flags & ~O_NONBLOCK) < 0)
        return "UnnamedPipe::UnnamedPipe: fcntl(g_IpmiNode[NodeNum].signalCmdPipeFds[FD_READ], F_SETFL, fdflags) failed";
    flags = fcntl(fds[FD_WRITE], F_GETFL, 0);
    if (flags < 0) return "UnnamedPipe::UnnamedPipe: fcntl(g_IpmiNode[NodeNum].signalCmdPipeFds[FD_WRITE], F_GETFL, 0) failed";
    if (fcntl(fds[FD_WRITE], F_SETFL, flags | O_NONBLOCK) < 0)
        return "UnnamedPipe::UnnamedPipe: fcntl(g_IpmiNode[NodeNum].signalCmdPipeFds[FD_WRITE], F_SETFL, fdflags) failed";
    return nullptr;
}

void closeWakeupPipe(IpmiNode& n) {
    for (int end : {FD_READ, FD_WRITE}) {
        if (n.signalCmdPipeFds[end] != -1) {
            close(n.signalCmdPipeFds[end]);
            n.signalCmdPipeFds[end] = -1;
        }
    }
}

// One byte into the pipe ends any transport wait at once; it is never read.
void wakeTransport(IpmiNode& n) {
    const int fd = n.signalCmdPipeFds[FD_WRITE];
    const unsigned char byte = kWakeByte;
    if (write(fd, &byte, 1) != 1) {
        ipmiLog(LOG_ERR, "%s: ignoring, write(fd=%d 1 byte) failed errno=%d %m", "stop", fd, errno);
    }
}

// Called inside catch (...): lets thread cancellation pass on.
void rethrowIfUnwinding() {
    try {
        throw;
    } catch (abi::__forced_unwind&) {
        throw;
    } catch (...) {
    }
}

// Calls every registered handler once without a record, on the live list
// (see IpmiIfcSelCallHandlers). A handler that throws ends the walk for this pass.
void callHandlersWithoutRecord() {
    try {
        IpmiIfcSelCallHandlers(nullptr);
    } catch (const kelInt::CmpiStatus& s) {
        ipmiLog(LOG_DEBUG, "Event handler ran into issues: %s(%d)", s.msg(), static_cast<int>(s.rc()));
    } catch (...) {
        rethrowIfUnwinding();
        ipmiLog(LOG_DEBUG, "Event handler ran into issues");
    }
}

// Waits for a wake-up or the end of the period; pollMutex is released only here.
void sleepUntilWoken(IpmiNode& n) {
    const int interval = intervalOf(n);
    if (interval <= 0) {
        pthread_cond_wait(&n.pollCond, n.pollMutex.native());
        return;
    }
    long long span = static_cast<long long>(interval) * kSecondsPerIntervalUnit;
    const int seconds = span > INT_MAX ? INT_MAX : static_cast<int>(span);
    ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc::poll sleeping for %d second(s)", 0, seconds);
    struct timeval now;
    gettimeofday(&now, nullptr);
    struct timespec deadline;
    deadline.tv_sec = now.tv_sec + seconds;
    deadline.tv_nsec = now.tv_usec * 1000L;
    pthread_cond_timedwait(&n.pollCond, n.pollMutex.native(), &deadline);  // time-out or signal: both a pass
    ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc::poll woke up.", 0);
}

enum class PassEnd { Continue, Stop };

// Reads the SEL entry count, up to ten times a second apart.
void readSelCount(IpmiNode& n, IpmiLoopState& s) {
    int tries = 0;
    while (tries < kSelInfoTries) {
        IpmiRefreshWatch watch;
        const bool read = IpmiIfcSelGetInfo(0, &s.entryCount) == 0;
        watch.finish(IpmiIfc::IPMI_CACHE_SEL, read);
        if (read) return;
        if (tries == 0) ipmiLog(LOG_DEBUG, "Retrying IpmiIfcSelGetInfo");
        ++tries;
        if (stopping(n)) return;
        sleep(1);
    }
    ipmiLog(LOG_WARNING, "Could not get SEL info for node %d after %d tries", 0, kSelInfoTries);
}

void refreshFru() {
    ipmiLog(LOG_DEBUG, "IpmiIfc::poll - Refreshing FRU");
    IpmiRefreshWatch watch;
    watch.finish(IpmiIfc::IPMI_CACHE_FRU, IpmiIfcFruInstantiateAll(0) == 0);
}

// The refreshes below stamp their cache for monitoring; the calls and their
// order are the loop's own.
void updateReadings() {
    IpmiRefreshWatch watch;
    watch.finish(IpmiIfc::IPMI_CACHE_SENSORS, IpmiIfcSensorUpdateReading(0) == 0);
}

// An accepted Get SDR Repository Info answer reads the records and rebuilds
// the sensors from them, readings included.
void readSdr() {
    IpmiRefreshWatch watch;
    const bool read = IpmiIfcSdrGetInfo(0) == 0;
    watch.finish(IpmiIfc::IPMI_CACHE_SDR, read);
    watch.finish(IpmiIfc::IPMI_CACHE_SENSORS, read);
}

void refreshLan() {
    IpmiRefreshWatch watch;
    watch.finish(IpmiIfc::IPMI_CACHE_LAN, IpmiIfc::getLan(0)->IpmiIfcLanInstantiate(0) == 0);
}

// One pass after a wake-up (pollCount already advanced).
PassEnd runPass(IpmiNode& n, IpmiLoopState& s) {
    readSelCount(n, s);

    const int skip = n.pollCount & kPeriodicMask;
    // A log cleared down to its one clear-event record is not news.
    const bool noNews = s.entryCount == s.lastEntryCount || (s.lastEntryCount != 0 && s.entryCount == 1);
    if (noNews && n.pollType != IPMI_POLL_FULL) {
        if (skip != 0) {
            if (n.pollType == IPMI_POLL_SENSORS) updateReadings();
            return PassEnd::Continue;
        }
        if (n.pollType == IPMI_POLL_SEL) {
            n.pollCount += kPeriodicMask;  // the periodic work moves to the next pass
            return PassEnd::Continue;
        }
        if (n.pollType == IPMI_POLL_SENSORS) {
            n.pollCount += kPeriodicMask;
            updateReadings();
            return PassEnd::Continue;
        }
        s.fullRefresh = false;
    } else {
        n.pollCount += kPeriodicMask + 1 - skip;  // the periodic phase restarts here
        s.fullRefresh = true;
        s.sdrCycle = 0;
    }

    ipmiLog(LOG_DEBUG,
            "IpmiIfc::poll - new events detected or skip count exceeded (skipRemaining = %d, entryCount = %d, "
            "lastEntryCount = %d)",
            (-skip) & kPeriodicMask, s.entryCount, s.lastEntryCount);
    s.lastEntryCount = s.entryCount;
    if (stopping(n)) return PassEnd::Stop;

    if (s.fullRefresh || s.sdrCycle % skipStep(&SKIP_SDR_STEP) == 0) {
        readSdr();
        if (stopping(n)) return PassEnd::Stop;
    } else {
        updateReadings();
    }

    callHandlersWithoutRecord();

    if (s.fullRefresh) {
        refreshFru();
        if (stopping(n)) return PassEnd::Stop;
    } else if (++s.sdrCycle % skipStep(&SKIP_FRU_STEP) == 1) {
        refreshFru();
        if (stopping(n)) return PassEnd::Stop;
    }

    if (stopping(n)) return PassEnd::Stop;
    refreshLan();
    return stopping(n) ? PassEnd::Stop : PassEnd::Continue;
}

}  // namespace

bool IpmiIfcPollPass(int, IpmiLoopState& s) { return runPass(g_IpmiNode[0], s) == PassEnd::Continue; }

void IpmiIfc::poll(int) {
    IpmiNode& n = g_IpmiNode[0];
    ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc::poll called", 0);
    TAV::MutexLock passLock(n.pollMutex);

    // Not guarded: a failure here ends the loop and start.
    IpmiLoopState s;
    {
        IpmiPassWatch pass;
        IpmiRefreshWatch sel;
        sel.finish(IPMI_CACHE_SEL, IpmiIfcSelGetInfo(0, &s.entryCount) == 0);
        s.lastEntryCount = s.entryCount;
        refreshLan();
        IpmiRefreshWatch fru;
        fru.finish(IPMI_CACHE_FRU, IpmiIfcFruInstantiateAll(0) == 0);
    }

    for (;;) {
        if (stopping(n)) break;
        if (n.pollCount == 0) n.pollCount = 1;
        n.pollType = IPMI_POLL_NORMAL;
        sleepUntilWoken(n);
        if (n.pollType == IPMI_POLL_NONE) {
            ipmiLog(LOG_DEBUG, "Poll signaled for Node %d with poll type NONE. No poll performed", 0);
            continue;
        }
        if (stopping(n)) break;
        n.pollCount += 1;
        try {
            IpmiPassWatch pass;
            if (!IpmiIfcPollPass(0, s)) break;
        } catch (...) {
            rethrowIfUnwinding();
            ipmiLog(LOG_ERR, "IPMI polling thread caught exception while polling node %d", 0);
        }
    }
    ipmiLog(LOG_DEBUG, "Poll loop ended, shutting down");
}

void IpmiIfc::start(int node, int interval) {
    IpmiNode& n = g_IpmiNode[0];
    ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc::start(%d)", node, interval);
    {
        // Under stateMutex so that threads already waiting for a state see a
        // consistent record.
        TAV::MutexLock guard(n.stateMutex);
        InitIpmiNode(0);
    }
    _changeState(0, IPMI_STATE_INIT, IPMI_STATE_STARTING);
    __atomic_store_n(&n.pollInterval, interval, __ATOMIC_RELAXED);
    {
        TAV::MutexLock guard(n.pollMutex);
        n.pollCount = 0;
    }

    try {
        ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc starting initialization", 0);
        if (getuid() != 0) throw kelInt::CmpiStatus(CMPI_RC_ERR_ACCESS_DENIED, "Only root user allowed");
        if (const char* failure = openWakeupPipe(n)) throw kelInt::CmpiStatus(CMPI_RC_ERROR_SYSTEM, failure);

        n.myAddress = kOwnAddress;
        if (IpmiIfcOpenIpmiOpen(0) < 0) {
            const int err = errno;
            ipmiLog(LOG_INFO, "Node %d: Unable to open node, Error(%d):%s", 0, err, strerror(err));
            _changeState(0, IPMI_STATE_STARTING, IPMI_STATE_STOPPED);
        } else {
            IpmiIfcSetTimingParms(0);
            int getsEvents = 0;  // events are learnt from the SEL, not from the driver
            IpmiIfcOpenIpmiEventEnable(0, &getsEvents);
            IpmiIfcOpenIpmiAddressSet(0);
            IpmiRefreshWatch identity;
            IpmiIfcDataGet(7);
            // Get SDR Repository Info is among the one-shot commands; the
            // stored answer stays zero (version 0) until one is accepted.
            const ipmiifc_sdr_info sdr = getSdr(0);
            const bool sdrRead = sdr.cc == cc::ok && sdr.version != 0;
            identity.finish(IPMI_CACHE_SDR, sdrRead);
            identity.finish(IPMI_CACHE_SENSORS, sdrRead);
            _changeState(0, IPMI_STATE_STARTING, IPMI_STATE_RUNNING);
            ipmiLog(LOG_DEBUG, "%s: Node %d: IpmiIfc initialization complete", "start", 0);
            poll(0);
            ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc poll thread exiting", 0);
        }
    } catch (...) {
        _setState(0, IPMI_STATE_STOPPED);
        ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc polling thread stopped.", 0);
        throw;
    }
    _setState(0, IPMI_STATE_STOPPED);
    ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc polling thread stopped.", 0);
}

void IpmiIfc::start(int interval) { start(0, interval); }

// Returns only after the polling loop has ended; blocks while the interface
// was never started. The flag stays set: the interface does not start again.
void IpmiIfc::stop(int) {
    IpmiNode& n = g_IpmiNode[0];
    if (stopping(n)) throw kelInt::CmpiStatus(CMPI_RC_ERROR, "IpmiIfc::stop called twice");
    ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc shutting down", 0);
    n.stopRequested.store(true, std::memory_order_release);

    if (waitState(0, IPMI_STATE_RUNNING | IPMI_STATE_STOPPED) == IPMI_STATE_RUNNING) {
        // Wake the loop's own exchange first, so that its pass ends at once;
        // the wake-up is sent under pollMutex so that it cannot fall between
        // the loop's test of the flag and its wait.
        wakeTransport(n);
        {
            TAV::MutexLock guard(n.pollMutex);
            pthread_cond_broadcast(&n.pollCond);
        }
        waitState(0, IPMI_STATE_STOPPED);
    } else {
        wakeTransport(n);
    }
    { TAV::MutexLock exchangeDone(n.transportMutex); }

    closeWakeupPipe(n);
    IpmiIfcOpenIpmiClose(0);
    IpmiIfcSdrCleanUpHeaders(0);
    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcEntityCleanUpAll(0);
    IpmiIfcSelCleanUpEventHandlers(0);
}

void IpmiIfc::stop() { stop(0); }

// Not under pollMutex: a wake-up while the loop is busy is lost, and the loop
// sleeps its full period next.
void IpmiIfc::doPoll(int) { pthread_cond_broadcast(&g_IpmiNode[0].pollCond); }

void IpmiIfc::doPoll() { doPoll(0); }

void IpmiIfc::setPollingInterval(int, int interval) {
    __atomic_store_n(&g_IpmiNode[0].pollInterval, interval, __ATOMIC_RELAXED);
    pthread_cond_broadcast(&g_IpmiNode[0].pollCond);
}

void IpmiIfc::setPollingInterval(int interval) { setPollingInterval(0, interval); }

int IpmiIfc::getPollingInterval(int) { return intervalOf(g_IpmiNode[0]); }

int IpmiIfc::getPollingInterval() { return getPollingInterval(0); }

namespace {

bool shutdownRequested(bool* shutdown) { return shutdown != nullptr && __atomic_load_n(shutdown, __ATOMIC_ACQUIRE); }

void logShutdown() { ipmiLog(LOG_DEBUG, "Shutdown signal received. Returning from IpmiIfc::pollAll()"); }

void scaleStep(int* step, int nodeCount) {
    long long scaled = static_cast<long long>(__atomic_load_n(step, __ATOMIC_RELAXED)) * nodeCount;
    if (scaled > INT_MAX) scaled = INT_MAX;
    if (scaled < INT_MIN) scaled = INT_MIN;
    __atomic_store_n(step, static_cast<int>(scaled), __ATOMIC_RELAXED);
}

// True when the node's pass triggered at `remembered` is over (or it stops).
bool passDone(IpmiNode& n, int remembered) {
    TAV::MutexLock guard(n.pollMutex);
    return n.pollCount != remembered || stopping(n);
}

}  // namespace

void IpmiIfc::pollAll(int nodeCount, bool serial, IPMI_POLL_TYPE type, bool* shutdown) {
    static bool done = false;
    {
        PlainMutexLock guard(manNameInitMut);
        if (!done) {
            scaleStep(&SKIP_FRU_STEP, nodeCount);
            scaleStep(&SKIP_SDR_STEP, nodeCount);
            done = true;
        }
    }
    int fullBudget = nodeCount <= kNodesPerFullPoll ? 1 : nodeCount / kNodesPerFullPoll + 1;
    const int nodes = nodeCount < IPMI_NODE_COUNT ? nodeCount : IPMI_NODE_COUNT;
    std::vector<int> remembered(nodes > 0 ? nodes : 0, 0);

    for (int i = 0; i < nodes; ++i) {
        IpmiNode& n = g_IpmiNode[i];
        int tries = 0;
        bool triggered = false;
        while (!triggered) {
            {
                TAV::MutexLock guard(n.pollMutex);
                if (shutdownRequested(shutdown)) {
                    logShutdown();
                    return;
                }
                if (n.pollCount != 0) {
                    if (tries > kSlowStartTries)
                        ipmiLog(LOG_WARNING, "Poll thread for node %d started, but it took %d tries", i, tries);
                    else
                        ipmiLog(LOG_DEBUG, "Poll thread for node %d started", i);
                    if (((n.pollCount + 1) & kPeriodicMask) == 0) {
                        // At most fullBudget nodes do their periodic pass together.
                        if (fullBudget > 0) {
                            ipmiLog(LOG_DEBUG, "Going to do FULL POLL for node %d", i);
                            --fullBudget;
                        } else {
                            --n.pollCount;
                        }
                    }
                    remembered[i] = n.pollCount;
                    ipmiLog(LOG_DEBUG, "Triggering poll for node %d, poll count = %d", i, n.pollCount);
                    n.pollType = type;
                    doPoll(i);
                    triggered = true;
                } else {
                    ++tries;
                    if (tries == 1)
                        ipmiLog(LOG_INFO, "Waiting for poll thread for node %d to start", i);
                    else if (tries % kStillWaitingEvery == 0)
                        ipmiLog(LOG_WARNING, "Still waiting for poll thread for node %d to start (%d tries", i, tries);
                    else
                        ipmiLog(LOG_DEBUG, "Waiting for poll thread for node %d to start", i);
                }
            }
            if (!triggered) sleep(1);
        }

        if (serial) {
            ipmiLog(LOG_DEBUG, "Running threads serially, waiting for node %d to complete", i);
            while (!passDone(n, remembered[i])) {
                if (shutdownRequested(shutdown)) {
                    logShutdown();
                    return;
                }
                sleep(1);
            }
            if (i == nodes - 1) {
                ipmiLog(LOG_DEBUG, "%s: Nodes done polling", "pollAll");
                return;
            }
            sleep(1);
        }
    }

    if (!serial && nodes > 0) {
        ipmiLog(LOG_DEBUG, "Running threads in parallel. Waiting for nodes to poll");
        int unfinished;
        do {
            sleep(2);
            if (shutdownRequested(shutdown)) {
                logShutdown();
                return;
            }
            unfinished = 0;
            for (int i = 0; i < nodes; ++i) {
                if (passDone(g_IpmiNode[i], remembered[i])) continue;
                ipmiLog(LOG_DEBUG, "Poll not finished for node %d", i);
                ++unfinished;
            }
        } while (unfinished != 0);
    }
    ipmiLog(LOG_DEBUG, "%s: Nodes done polling", "pollAll");
}

int IpmiIfcInitForCLI(int) {
    IpmiNode& n = g_IpmiNode[0];
    InitIpmiNode(0);
    n.myAddress = kOwnAddress;
    if (openWakeupPipe(n) != nullptr) return -1;
    if (IpmiIfcOpenIpmiAddressSet(0) != 0) return -2;
    IpmiIfcSetTimingParms(0);
    {
        TAV::MutexLock guard(n.stateMutex);
        n.state = IpmiIfc::IPMI_STATE_CLI;  // set without waking waiters
    }
    if (!LoadSensorHealthDataFile())
        ipmiLog(LOG_WARNING, "%s: Unable to translate discrete sensor state, see prior errors", "IpmiIfcInitForCLI");
    return 0;
}

void IpmiIfcCloseForCLI(int) {
    IpmiNode& n = g_IpmiNode[0];
    closeWakeupPipe(n);
    IpmiIfcSdrCleanUpHeaders(0);
    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcEntityCleanUpAll(0);
}

}  // namespace Ipmi
