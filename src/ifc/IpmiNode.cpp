#include "IpmiNode.h"

#include <string.h>
#include <sys/time.h>

#include "CmpiStatus.h"
#include "IpmiIfcInternal.h"

namespace Ipmi {

IpmiNode g_IpmiNode[IPMI_NODE_COUNT];

IpmiNode::IpmiNode()
    : node(0),
      msgCounter(0),
      state(0),
      signalCmdPipeFds{-1, -1},
      pollInterval(0),
      stopRequested(false),
      pollCount(0),
      pollType(0),
      deviceId{},
      selfTest{},
      work{},
      fd(-1),
      isOpen(0),
      myAddress(0),
      targetAddress(0),
      targetLun(0),
      targetChannel(0) {
    pthread_cond_init(&stateCond, nullptr);
    pthread_cond_init(&pollCond, nullptr);
    pthread_rwlock_init(&cacheLock, nullptr);
}

// Descriptors and the SDR, sensor and entity caches are stop's to release.
IpmiNode::~IpmiNode() {
    pthread_rwlock_destroy(&cacheLock);
    pthread_cond_destroy(&pollCond);
    pthread_cond_destroy(&stateCond);
}

void InitIpmiNode(int node) {
    IpmiNode& n = g_IpmiNode[node];
    n.node = node;
    n.msgCounter = 1445;
    n.state = IpmiIfc::IPMI_STATE_INIT;
    n.signalCmdPipeFds[FD_READ] = -1;
    n.signalCmdPipeFds[FD_WRITE] = -1;
    n.pollInterval = -1;
    memset(n.deviceId, 0, sizeof n.deviceId);
    memset(n.selfTest, 0, sizeof n.selfTest);
    memset(&n.work, 0, sizeof n.work);
}

void _setState(int, IpmiIfc::IPMI_STATE s) {
    IpmiNode& n = g_IpmiNode[0];
    TAV::MutexLock guard(n.stateMutex);
    n.state = s;
    pthread_cond_broadcast(&n.stateCond);
}

int _getState(int) {
    IpmiNode& n = g_IpmiNode[0];
    TAV::MutexLock guard(n.stateMutex);
    return n.state;
}

void _changeState(int, IpmiIfc::IPMI_STATE from, IpmiIfc::IPMI_STATE to) {
    IpmiNode& n = g_IpmiNode[0];
    TAV::MutexLock guard(n.stateMutex);
    if (n.state != from) {
        ipmiLog(LOG_ERR, "IpmiIfc unexpected state transition: (%d->%d), Current state %d", from, to,
                n.state);
        throw kelInt::CmpiStatus(CMPI_RC_ERROR, "IpmiIfc unexpected state transition");
    }
    ipmiLog(LOG_DEBUG, "IPMI Node %d: _changeState check passed", 0);
    n.state = to;
    pthread_cond_broadcast(&n.stateCond);
}

int IpmiIfc::getState(int) { return _getState(0); }
int IpmiIfc::getState() { return _getState(0); }

int IpmiIfc::waitState(int, int mask) {
    IpmiNode& n = g_IpmiNode[0];
    ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc::waitState (%d) called", 0, mask);
    TAV::MutexLock guard(n.stateMutex);
    while ((n.state & mask) == 0) pthread_cond_wait(&n.stateCond, n.stateMutex.native());
    return n.state;
}

int IpmiIfc::waitState(int mask) { return waitState(0, mask); }

// The time-out is only a re-check period: the call returns when a state in
// the mask is reached, never because time ran out.
int IpmiIfc::timedWaitState(int, int mask, long sec, long usec) {
    IpmiNode& n = g_IpmiNode[0];
    ipmiLog(LOG_DEBUG, "Node %d: IpmiIfc::timedWaitState (%d, %ld, %ld) called", 0, mask, sec, usec);
    TAV::MutexLock guard(n.stateMutex);
    while ((n.state & mask) == 0) {
        struct timeval now;
        gettimeofday(&now, nullptr);
        // Nanoseconds in 32-bit signed arithmetic, wrapping as the original did.
        int32_t nsec = static_cast<int32_t>(static_cast<uint32_t>(now.tv_usec + usec) * 1000u);
        struct timespec deadline;
        deadline.tv_sec = now.tv_sec + sec + nsec / 1000000000;
        nsec %= 1000000000;
        if (nsec < 0) {
            nsec += 1000000000;
            deadline.tv_sec -= 1;
        }
        deadline.tv_nsec = nsec;
        pthread_cond_timedwait(&n.stateCond, n.stateMutex.native(), &deadline);
    }
    return n.state;
}

int IpmiIfc::timedWaitState(int mask, long sec, long usec) { return timedWaitState(0, mask, sec, usec); }

}  // namespace Ipmi

namespace kelInt {

CmpiStatus::CmpiStatus() { status_ = {CMPI_RC_OK, nullptr}; }

CmpiStatus::CmpiStatus(CMPIrc rc) { status_ = {rc, nullptr}; }

CmpiStatus::CmpiStatus(CMPIrc rc, const char* text) {
    status_ = {rc, nullptr};
    Ipmi::ipmiLog(LOG_ERR, "CmpiStatus error %d %s", static_cast<int>(rc), text ? text : "(null)");
}

CmpiStatus::CmpiStatus(_CMPIStatus s) : status_(s) {}

CmpiStatus::~CmpiStatus() {}

const char* CmpiStatus::msg() const {
    if (status_.msg == nullptr || status_.msg->hdl == nullptr) return "(null)";
    return static_cast<const char*>(status_.msg->hdl);
}

}  // namespace kelInt
