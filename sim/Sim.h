#ifndef TAV_IPMI_SIM_SIM_H
#define TAV_IPMI_SIM_SIM_H

// The simulated BMC behind a fake /dev/ipmi0: shared types, the fault layer,
// counters, and the virtual clock that makes sleeps and time-outs instant.

#include <stdint.h>

#include <atomic>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace Sim {

// One request as the controller sees it.
struct Request {
    uint8_t netfn = 0;
    uint8_t cmd = 0;
    uint8_t lun = 0;
    uint8_t channel = 0;     // IPMB channel; 15 (BMC channel) for the system interface
    uint8_t address = 0x20;  // responder: 0x20 for the local system interface
    bool viaIpmb = false;
    std::vector<uint8_t> data;
};

// An answer: byte 0 is the completion code.
using Response = std::vector<uint8_t>;

class Bmc;

enum class FaultKind {
    CompletionCode,   // answer with just this completion code
    NoAnswer,         // no answer ever arrives: the caller's wait times out
    Hang,             // like NoAnswer, but the wait runs in real time (for wake-up tests)
    LongAnswer,       // the real answer padded to `length` bytes (over 32: cut by the driver)
    CutAnswer,        // the real answer cut to `length` bytes
    AsyncEventFirst,  // an asynchronous event message is queued before the answer
    SendError,        // IPMICTL_SEND_COMMAND fails with errno `error`
    ReceiveError,     // IPMICTL_RECEIVE_MSG(_TRUNC) fails with errno `error`
    DuplicateAnswer,  // the answer is queued twice: the copy is stale for the next request
    PollError         // no answer; a wait on the descriptor reports POLLERR without POLLIN
};

struct Fault {
    FaultKind kind = FaultKind::CompletionCode;
    uint8_t cc = 0;
    size_t length = 0;
    int error = 0;
    int times = 1;  // how many matching requests it hits; -1: always

    static Fault completionCode(uint8_t cc, int times = 1) {
        Fault f;
        f.kind = FaultKind::CompletionCode;
        f.cc = cc;
        f.times = times;
        return f;
    }
    static Fault of(FaultKind k, int times = 1) {
        Fault f;
        f.kind = k;
        f.times = times;
        return f;
    }
    static Fault answerLength(FaultKind k, size_t len, int times = 1) {
        Fault f = of(k, times);
        f.length = len;
        return f;
    }
    static Fault errnoFault(FaultKind k, int err, int times = 1) {
        Fault f = of(k, times);
        f.error = err;
        return f;
    }
};

constexpr int kAnyCommand = -1;

// Sleeps and time-outs in virtual time: the clock jumps instead of waiting.
class VirtualClock {
public:
    bool enabled() const { return enabled_.load(); }
    void enable(bool on) { enabled_.store(on); }
    int64_t offsetNs() const { return offset_.load(); }
    // Back to real time of day (a fuzz target between inputs).
    void reset() { offset_.store(0); }
    void advanceNs(int64_t ns) {
        if (ns > 0) offset_.fetch_add(ns);
    }
    // Moves the clock forward so that virtual now is at least `targetNs`.
    void advanceToNs(int64_t targetNs, int64_t realNowNs);
    int64_t nowNs(int64_t realNowNs) const { return realNowNs + offset_.load(); }
    // Real time a virtual wait is shrunk to: 1 ms of real time per virtual second.
    static constexpr int64_t kScale = 1000;

private:
    std::atomic<bool> enabled_{false};
    std::atomic<int64_t> offset_{0};
};

// One queued message of the fake driver.
struct DeviceMessage {
    int recvType = 1;  // IPMI_RESPONSE_RECV_TYPE
    std::vector<uint8_t> addr;
    long msgid = 0;
    uint8_t netfn = 0;
    uint8_t cmd = 0;
    std::vector<uint8_t> data;
};

// State of one open descriptor of the fake device.
struct DeviceHandle {
    int eventFd = -1;
    std::vector<DeviceMessage> queue;
    int getsEvents = 0;
    unsigned int myAddress = 0x20;
    unsigned int myLun = 2;
    int retries = -1;
    unsigned int retryTimeMs = 0;
    bool awaitingNothing = false;  // the last request will never be answered
    bool hang = false;             // ... and the wait runs in real time
    bool pollError = false;        // a wait reports POLLERR until the next request
};

class Simulator {
public:
    static Simulator& instance();

    // Puts a controller behind /dev/ipmi0 (virtual time on) or removes it.
    void install(std::shared_ptr<Bmc> bmc, bool virtualTime = true);
    void uninstall();
    bool installed() const;
    std::shared_ptr<Bmc> bmc() const;
    VirtualClock& clock() { return clock_; }
    // Runs `change` on the controller under the lock that answers take, so
    // another thread may change the model while the library talks to it.
    void withBmc(const std::function<void(Bmc&)>& change);

    // Faults, in front of the controller's command table.
    void addFault(int netfn, int cmd, const Fault& fault);
    void clearFaults();
    void failOpen(int err) { openError_.store(err); }  // 0: open works

    // Counters and request log.
    unsigned exchanges(uint8_t netfn, uint8_t cmd) const;
    unsigned totalExchanges() const;
    std::vector<Request> requests() const;
    // Exchanges per command, keyed by netfn << 8 | cmd.
    std::map<uint16_t, unsigned> counters() const;
    void resetCounters();

    // Real time each answer takes (benchmarks); 0 answers at once.
    void setLatencyUs(int64_t us) { latencyUs_.store(us); }

    // Fake driver entry points, called by the interposed C-library functions.
    bool isDevicePath(const char* path) const;
    int openDevice();
    bool isDevice(int fd) const;
    int closeDevice(int fd);
    int ioctlDevice(int fd, unsigned long request, void* arg);
    // True when a wait on these descriptors should time out at once in virtual time.
    bool waitTimesOutVirtually(const int* fds, size_t count) const;
    // True when the device behind `fd` reports an error to a wait.
    bool reportsPollError(int fd) const;
    // Waits on a device descriptor that reported an error (PollError).
    unsigned pollErrorsReported() const { return pollErrors_.load(); }
    void countPollError() { pollErrors_.fetch_add(1); }

    // Answers one request: faults first, then the controller.
    Response exchange(const Request& req, Fault* applied);

private:
    Simulator() = default;
    int sendCommand(DeviceHandle& h, void* arg);
    int receive(DeviceHandle& h, void* arg, bool truncate);
    const Fault* takeFault(uint8_t netfn, uint8_t cmd, Fault* copy);

    mutable std::mutex mutex_;
    std::shared_ptr<Bmc> bmc_;
    std::map<int, DeviceHandle> handles_;
    struct FaultRule {
        int netfn;
        int cmd;
        Fault fault;
    };
    std::vector<FaultRule> faults_;
    std::map<uint16_t, unsigned> counters_;
    std::vector<Request> log_;
    VirtualClock clock_;
    std::atomic<int> openError_{0};
    std::atomic<int64_t> latencyUs_{0};
    std::atomic<unsigned> pollErrors_{0};
};

// Real C-library functions, past the interposer (and past sanitizer interceptors).
int64_t realNowNs();
void realSleepNs(int64_t ns);

}  // namespace Sim

#endif
