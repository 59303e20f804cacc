#include <errno.h>
#include <linux/ipmi.h>
#include <string.h>
#include <sys/eventfd.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include "Bmc.h"
#include "IpmiCommands.h"
#include "Sim.h"

namespace Sim {

namespace {
constexpr uint8_t kResponseBit = 0x01;
constexpr size_t kMaxRequestData = IPMI_MAX_MSG_LENGTH;

uint16_t counterKey(uint8_t netfn, uint8_t cmd) { return static_cast<uint16_t>(((netfn & 0xFE) << 8) | cmd); }

// The 16-byte system event the fault layer slips in ahead of an answer.
DeviceMessage asyncEvent() {
    DeviceMessage m;
    m.recvType = IPMI_ASYNC_EVENT_RECV_TYPE;
    struct ipmi_system_interface_addr si;
    memset(&si, 0, sizeof si);
    si.addr_type = IPMI_SYSTEM_INTERFACE_ADDR_TYPE;
    si.channel = IPMI_BMC_CHANNEL;
    m.addr.assign(reinterpret_cast<uint8_t*>(&si), reinterpret_cast<uint8_t*>(&si) + sizeof si);
    m.netfn = Ipmi::netfn::app | kResponseBit;
    m.cmd = 0x35;  // Read Event Message Buffer
    m.data = {0x00, 0x01, 0x00, 0x02, 0x00, 0x00, 0x00, 0x00, 0x20, 0x00, 0x04, 0x01, 0x30, 0x01, 0x57, 0x00, 0x00};
    return m;
}
}  // namespace

void VirtualClock::advanceToNs(int64_t targetNs, int64_t realNowNs) {
    int64_t want = targetNs - realNowNs;
    int64_t cur = offset_.load();
    while (want > cur && !offset_.compare_exchange_weak(cur, want)) {
    }
}

Simulator& Simulator::instance() {
    static Simulator* sim = new Simulator();  // never destroyed: interposed calls may come late
    return *sim;
}

void Simulator::install(std::shared_ptr<Bmc> bmc, bool virtualTime) {
    std::lock_guard<std::mutex> guard(mutex_);
    bmc_ = std::move(bmc);
    clock_.enable(virtualTime);
}

void Simulator::uninstall() {
    std::lock_guard<std::mutex> guard(mutex_);
    bmc_.reset();
    faults_.clear();
    clock_.enable(false);
}

bool Simulator::installed() const {
    std::lock_guard<std::mutex> guard(mutex_);
    return bmc_ != nullptr;
}

std::shared_ptr<Bmc> Simulator::bmc() const {
    std::lock_guard<std::mutex> guard(mutex_);
    return bmc_;
}

void Simulator::withBmc(const std::function<void(Bmc&)>& change) {
    std::lock_guard<std::mutex> guard(mutex_);
    if (bmc_) change(*bmc_);
}

void Simulator::addFault(int netfn, int cmd, const Fault& fault) {
    std::lock_guard<std::mutex> guard(mutex_);
    faults_.push_back(FaultRule{netfn, cmd, fault});
}

void Simulator::clearFaults() {
    std::lock_guard<std::mutex> guard(mutex_);
    faults_.clear();
    openError_.store(0);
}

unsigned Simulator::exchanges(uint8_t netfn, uint8_t cmd) const {
    std::lock_guard<std::mutex> guard(mutex_);
    auto it = counters_.find(counterKey(netfn, cmd));
    return it == counters_.end() ? 0 : it->second;
}

unsigned Simulator::totalExchanges() const {
    std::lock_guard<std::mutex> guard(mutex_);
    unsigned total = 0;
    for (const auto& c : counters_) total += c.second;
    return total;
}

std::vector<Request> Simulator::requests() const {
    std::lock_guard<std::mutex> guard(mutex_);
    return log_;
}

std::map<uint16_t, unsigned> Simulator::counters() const {
    std::lock_guard<std::mutex> guard(mutex_);
    return counters_;
}

void Simulator::resetCounters() {
    std::lock_guard<std::mutex> guard(mutex_);
    counters_.clear();
    log_.clear();
}

bool Simulator::isDevicePath(const char* path) const {
    return path != nullptr && (strcmp(path, "/dev/ipmi0") == 0 || strcmp(path, "/dev/ipmi/0") == 0 ||
                               strcmp(path, "/dev/ipmidev/0") == 0);
}

int Simulator::openDevice() {
    std::lock_guard<std::mutex> guard(mutex_);
    if (!bmc_) {
        errno = ENOENT;
        return -1;
    }
    if (int err = openError_.load()) {
        errno = err;
        return -1;
    }
    int fd = eventfd(0, EFD_SEMAPHORE | EFD_NONBLOCK | EFD_CLOEXEC);
    if (fd < 0) return -1;
    DeviceHandle h;
    h.eventFd = fd;
    handles_[fd] = h;
    return fd;
}

bool Simulator::isDevice(int fd) const {
    std::lock_guard<std::mutex> guard(mutex_);
    return handles_.count(fd) != 0;
}

int Simulator::closeDevice(int fd) {
    std::lock_guard<std::mutex> guard(mutex_);
    handles_.erase(fd);
    return 0;
}

const Fault* Simulator::takeFault(uint8_t netfn, uint8_t cmd, Fault* copy) {
    for (auto it = faults_.begin(); it != faults_.end(); ++it) {
        bool netfnMatches = it->netfn == kAnyCommand || (it->netfn & 0xFE) == (netfn & 0xFE);
        bool cmdMatches = it->cmd == kAnyCommand || it->cmd == cmd;
        if (!netfnMatches || !cmdMatches) continue;
        *copy = it->fault;
        if (it->fault.times > 0 && --it->fault.times == 0) faults_.erase(it);
        return copy;
    }
    return nullptr;
}

Response Simulator::exchange(const Request& req, Fault* applied) {
    counters_[counterKey(req.netfn, req.cmd)]++;
    // A long-running program keeps only the recent requests.
    constexpr size_t kLogLimit = 1u << 16;
    if (log_.size() >= kLogLimit) log_.erase(log_.begin(), log_.begin() + kLogLimit / 2);
    log_.push_back(req);
    Fault fault;
    const Fault* f = takeFault(req.netfn, req.cmd, &fault);
    if (applied) *applied = f ? *f : Fault::of(FaultKind::CompletionCode, 0);
    if (f && f->kind == FaultKind::CompletionCode) return Response{f->cc};
    Response answer = bmc_ ? bmc_->handle(req) : Response{Ipmi::cc::responseNotProvided};
    if (f && f->kind == FaultKind::LongAnswer && answer.size() < f->length) answer.resize(f->length, 0xA5);
    if (f && f->kind == FaultKind::CutAnswer && answer.size() > f->length) answer.resize(f->length);
    return answer;
}

int Simulator::ioctlDevice(int fd, unsigned long request, void* arg) {
    std::lock_guard<std::mutex> guard(mutex_);
    auto it = handles_.find(fd);
    if (it == handles_.end()) {
        errno = EBADF;
        return -1;
    }
    DeviceHandle& h = it->second;
    if (arg == nullptr) {
        errno = EFAULT;
        return -1;
    }
    switch (request) {
    case IPMICTL_SEND_COMMAND:
        return sendCommand(h, arg);
    case IPMICTL_RECEIVE_MSG_TRUNC:
        return receive(h, arg, true);
    case IPMICTL_RECEIVE_MSG:
        return receive(h, arg, false);
    case IPMICTL_SET_GETS_EVENTS_CMD:
        h.getsEvents = *static_cast<int*>(arg);
        return 0;
    case IPMICTL_SET_MY_ADDRESS_CMD:
        h.myAddress = *static_cast<unsigned int*>(arg);
        return 0;
    case IPMICTL_GET_MY_ADDRESS_CMD:
        *static_cast<unsigned int*>(arg) = h.myAddress;
        return 0;
    case IPMICTL_SET_MY_LUN_CMD:
        h.myLun = *static_cast<unsigned int*>(arg) & 3;
        return 0;
    case IPMICTL_GET_MY_LUN_CMD:
        *static_cast<unsigned int*>(arg) = h.myLun;
        return 0;
    case IPMICTL_GET_TIMING_PARMS_CMD: {
        auto* p = static_cast<struct ipmi_timing_parms*>(arg);
        p->retries = h.retries;
        p->retry_time_ms = h.retryTimeMs;
        return 0;
    }
    case IPMICTL_SET_TIMING_PARMS_CMD: {
        auto* p = static_cast<struct ipmi_timing_parms*>(arg);
        h.retries = p->retries;
        h.retryTimeMs = p->retry_time_ms;
        return 0;
    }
    default:
        errno = ENOTTY;
        return -1;
    }
}

int Simulator::sendCommand(DeviceHandle& h, void* arg) {
    auto* req = static_cast<struct ipmi_req*>(arg);
    if (req->addr == nullptr || req->addr_len < sizeof(int) || req->addr_len > sizeof(struct ipmi_addr)) {
        errno = EINVAL;
        return -1;
    }
    struct ipmi_addr addr;
    memset(&addr, 0, sizeof addr);
    memcpy(&addr, req->addr, req->addr_len);
    if (req->msg.data_len > kMaxRequestData) {
        errno = EMSGSIZE;
        return -1;
    }
    if (req->msg.data_len > 0 && req->msg.data == nullptr) {
        errno = EFAULT;
        return -1;
    }
    Request r;
    r.netfn = req->msg.netfn;
    r.cmd = req->msg.cmd;
    r.data.assign(req->msg.data, req->msg.data + req->msg.data_len);
    size_t addrSize;
    if (addr.addr_type == IPMI_SYSTEM_INTERFACE_ADDR_TYPE) {
        auto* si = reinterpret_cast<struct ipmi_system_interface_addr*>(&addr);
        if (si->channel != IPMI_BMC_CHANNEL || si->lun > 3) {
            errno = EINVAL;
            return -1;
        }
        r.lun = si->lun;
        r.channel = IPMI_BMC_CHANNEL;
        r.address = 0x20;
        addrSize = sizeof(struct ipmi_system_interface_addr);
    } else if (addr.addr_type == IPMI_IPMB_ADDR_TYPE || addr.addr_type == IPMI_IPMB_BROADCAST_ADDR_TYPE) {
        auto* ipmb = reinterpret_cast<struct ipmi_ipmb_addr*>(&addr);
        if (req->addr_len < sizeof(struct ipmi_ipmb_addr) || ipmb->lun > 3) {
            errno = EINVAL;
            return -1;
        }
        r.lun = ipmb->lun;
        r.channel = static_cast<uint8_t>(ipmb->channel);
        r.address = ipmb->slave_addr;
        r.viaIpmb = true;
        addrSize = sizeof(struct ipmi_ipmb_addr);
    } else {
        errno = EINVAL;
        return -1;
    }

    // Send and receive faults act in the driver, before the controller sees anything.
    for (auto it = faults_.begin(); it != faults_.end(); ++it) {
        if (it->fault.kind != FaultKind::SendError) continue;
        bool matches = (it->netfn == kAnyCommand || (it->netfn & 0xFE) == (r.netfn & 0xFE)) &&
                       (it->cmd == kAnyCommand || it->cmd == r.cmd);
        if (!matches) continue;
        int err = it->fault.error;
        if (it->fault.times > 0 && --it->fault.times == 0) faults_.erase(it);
        errno = err;
        return -1;
    }

    int64_t latency = latencyUs_.load();
    if (latency > 0) realSleepNs(latency * 1000);

    Fault applied;
    Response answer = exchange(r, &applied);
    h.awaitingNothing = false;
    h.hang = false;
    h.pollError = applied.times != 0 && applied.kind == FaultKind::PollError;
    if (h.pollError) return 0;
    if (applied.times != 0 && (applied.kind == FaultKind::NoAnswer || applied.kind == FaultKind::Hang)) {
        h.awaitingNothing = true;
        h.hang = applied.kind == FaultKind::Hang;
        return 0;
    }
    if (applied.times != 0 && applied.kind == FaultKind::AsyncEventFirst) {
        h.queue.push_back(asyncEvent());
        uint64_t one = 1;
        (void)!write(h.eventFd, &one, sizeof one);
    }
    if (applied.times != 0 && applied.kind == FaultKind::ReceiveError) {
        // Remembered on the message: its receive fails.
        DeviceMessage m;
        m.recvType = -applied.error;
        h.queue.push_back(m);
        uint64_t one = 1;
        (void)!write(h.eventFd, &one, sizeof one);
        return 0;
    }
    DeviceMessage m;
    m.recvType = IPMI_RESPONSE_RECV_TYPE;
    m.addr.assign(reinterpret_cast<uint8_t*>(&addr), reinterpret_cast<uint8_t*>(&addr) + addrSize);
    m.msgid = req->msgid;
    m.netfn = static_cast<uint8_t>(r.netfn | kResponseBit);
    m.cmd = r.cmd;
    m.data = answer;
    const int copies = applied.times != 0 && applied.kind == FaultKind::DuplicateAnswer ? 2 : 1;
    for (int i = 0; i < copies; ++i) {
        h.queue.push_back(m);
        uint64_t one = 1;
        (void)!write(h.eventFd, &one, sizeof one);
    }
    return 0;
}

int Simulator::receive(DeviceHandle& h, void* arg, bool truncate) {
    auto* recv = static_cast<struct ipmi_recv*>(arg);
    if (h.queue.empty()) {
        errno = EAGAIN;
        return -1;
    }
    DeviceMessage& m = h.queue.front();
    auto consume = [&h]() {
        uint64_t value;
        (void)!read(h.eventFd, &value, sizeof value);
        h.queue.erase(h.queue.begin());
    };
    if (m.recvType < 0) {
        int err = -m.recvType;
        consume();
        errno = err;
        return -1;
    }
    if (recv->addr == nullptr || recv->addr_len < m.addr.size()) {
        errno = EINVAL;  // the message stays queued, as in the driver
        return -1;
    }
    int result = 0;
    size_t len = m.data.size();
    if (len > recv->msg.data_len) {
        if (!truncate) {
            errno = EMSGSIZE;
            return -1;
        }
        len = recv->msg.data_len;
        result = EMSGSIZE;
    }
    if (len > 0 && recv->msg.data == nullptr) {
        errno = EFAULT;
        return -1;
    }
    memcpy(recv->addr, m.addr.data(), m.addr.size());
    recv->addr_len = static_cast<unsigned int>(m.addr.size());
    recv->recv_type = m.recvType;
    recv->msgid = m.msgid;
    recv->msg.netfn = m.netfn;
    recv->msg.cmd = m.cmd;
    if (len > 0) memcpy(recv->msg.data, m.data.data(), len);
    recv->msg.data_len = static_cast<unsigned short>(len);
    consume();
    if (result) {
        errno = result;
        return -1;
    }
    return 0;
}

bool Simulator::waitTimesOutVirtually(const int* fds, size_t count) const {
    std::lock_guard<std::mutex> guard(mutex_);
    if (!clock_.enabled()) return false;
    for (size_t i = 0; i < count; ++i) {
        auto it = handles_.find(fds[i]);
        if (it != handles_.end() && it->second.awaitingNothing && !it->second.hang && it->second.queue.empty())
            return true;
    }
    return false;
}

bool Simulator::reportsPollError(int fd) const {
    std::lock_guard<std::mutex> guard(mutex_);
    auto it = handles_.find(fd);
    return it != handles_.end() && it->second.pollError && it->second.queue.empty();
}

}  // namespace Sim
