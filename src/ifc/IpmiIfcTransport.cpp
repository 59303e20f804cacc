// Driver transport: one request and one answer at a time through /dev/ipmi0.

#include <errno.h>
#include <fcntl.h>
#include <linux/ipmi.h>
#include <poll.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <time.h>
#include <unistd.h>

#include <new>

#include "IpmiIfcInternal.h"
#include "IpmiIfcWatch.h"

namespace Ipmi {

namespace {

constexpr int kAnswerWaitMs = 30000;
constexpr uint32_t kEmptyReceiveMarker = 0xDEADBEEF;

void devicePath(char* out, size_t size) { snprintf(out, size, "/dev/ipmi%d", 0); }

// Parses a timing variable; leading text that is not a number gives 0.
int timingValue(const char* name) {
    const char* text = getenv(name);
    if (text == nullptr) return 0;
    return atoi(text);
}

}  // namespace

int IpmiIfcOpenIpmiOpen(int) {
    IpmiNode& n = g_IpmiNode[0];
    char path[32];
    devicePath(path, sizeof path);
    n.fd = open(path, O_RDWR);
    if (n.fd < 0) {
        n.fd = -1;
        ipmiLog(LOG_ERR, "%s: open(%s, RDWR) failed %d %m", "IpmiIfcOpenIpmiOpen", path, errno);
        return -1;
    }
    n.isOpen = 1;
    return n.fd;
}

void IpmiIfcOpenIpmiClose(int) {
    IpmiNode& n = g_IpmiNode[0];
    if (n.fd != -1) {
        close(n.fd);
        n.fd = -1;
    }
    n.isOpen = 0;
}

void ReopenPort(int node) {
    IpmiIfcOpenIpmiClose(node);
    if (IpmiIfcOpenIpmiOpen(node) < 0) {
        ipmiLog(LOG_INFO, "Node %d: Unable to open node %s", 0, strerror(errno));
    }
}

void IpmiIfcSetTimingParms(int) {
    IpmiNode& n = g_IpmiNode[0];
    int retries = timingValue("CIM_IPMI_RETRIES");
    int retryTimeMs = timingValue("CIM_IPMI_RETRY_TIME");
    if (retries <= 0 && retryTimeMs <= 0) return;

    struct ipmi_timing_parms parms;
    memset(&parms, 0, sizeof parms);
    if (ioctl(n.fd, IPMICTL_GET_TIMING_PARMS_CMD, &parms) < 0) {
        ipmiLog(LOG_WARNING, "Can not get IPMI default timing parms, they will not be changed.");
        return;
    }
    ipmiLog(LOG_INFO, "IPMI default timing parms: retries=%d, retry_time=%d(ms)", parms.retries,
            parms.retry_time_ms);
    if (retries > 0) parms.retries = retries;
    if (retryTimeMs > 0) parms.retry_time_ms = static_cast<unsigned int>(retryTimeMs);
    if (ioctl(n.fd, IPMICTL_SET_TIMING_PARMS_CMD, &parms) < 0) {
        ipmiLog(LOG_WARNING, "Can not set IPMI timing parms.");
    } else {
        ipmiLog(LOG_INFO, "IPMI timing parms have been set to: retries=%d, retry_time=%d(ms).",
                parms.retries, parms.retry_time_ms);
    }
}

int IpmiIfcOpenIpmiEventEnable(int, int* flag) {
    IpmiNode& n = g_IpmiNode[0];
    int rc = ioctl(n.fd, IPMICTL_SET_GETS_EVENTS_CMD, flag);
    if (rc < 0) {
        ipmiLog(LOG_ERR, "%s: ioctl(GETS_EVENTS) failed, %d %m", "IpmiIfcOpenIpmiEventEnable", rc);
        return -1;
    }
    return rc;
}

int IpmiIfcOpenIpmiAddressSet(int) {
    IpmiNode& n = g_IpmiNode[0];
    if (n.myAddress == 0) return 0;
    unsigned int address = n.myAddress;
    if (ioctl(n.fd, IPMICTL_SET_MY_ADDRESS_CMD, &address) < 0) {
        ipmiLog(LOG_ERR, "Node %d: IpmiIfcOpenIpmiAddressSet failed ioctl call returning -1", 0);
        return -1;
    }
    return 0;
}

int IpmiIfcRespNew(ipmiifc_resp** out) {
    if (out == nullptr) return -1;
    *out = static_cast<ipmiifc_resp*>(calloc(1, sizeof(ipmiifc_resp)));
    return *out ? 0 : -1;
}

int IpmiIfcRespReuse(ipmiifc_resp* r) {
    if (r == nullptr) return -1;
    free(r->req_addr);
    r->req_addr = nullptr;
    free(r->req_data);
    r->req_data = nullptr;
    return 0;
}

int IpmiIfcRespDel(ipmiifc_resp** r) {
    if (r == nullptr || *r == nullptr) return -1;
    free((*r)->req_addr);
    free((*r)->req_data);
    free(*r);
    *r = nullptr;
    return 0;
}

namespace {

// Fills the driver address for the node's current target and returns its length.
void buildAddress(const IpmiNode& n, struct ipmi_addr* addr) {
    memset(addr, 0, sizeof *addr);
    if (n.targetAddress == 0 || n.targetAddress == n.myAddress) {
        auto* si = reinterpret_cast<struct ipmi_system_interface_addr*>(addr);
        si->addr_type = IPMI_SYSTEM_INTERFACE_ADDR_TYPE;
        si->channel = IPMI_BMC_CHANNEL;
        si->lun = 0;
    } else {
        auto* ipmb = reinterpret_cast<struct ipmi_ipmb_addr*>(addr);
        ipmb->addr_type = IPMI_IPMB_ADDR_TYPE;
        ipmb->channel = n.targetChannel & 0x0F;
        ipmb->slave_addr = static_cast<unsigned char>(n.targetAddress);
        ipmb->lun = n.targetLun;
    }
}

int64_t monotonicMs() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

// Whether a received message is the answer to the request just sent: the
// driver hands back the message id, and an answer carries the request's
// command with the response bit of its network function set.
bool answers(const struct ipmi_recv& recv, const struct ipmi_req& sent) {
    return recv.msgid == sent.msgid && (recv.msg.netfn & ~1u) == (sent.msg.netfn & ~1u) &&
           recv.msg.cmd == sent.msg.cmd;
}

// Failure tail of a send or poll failure: the descriptor may be wedged.
ipmiifc_resp* failExchange(int node, ipmiifc_resp* reuse) {
    ReopenPort(node);
    if (reuse) {
        reuse->cc = 0xFF;
        return reuse;
    }
    return nullptr;
}

// How an exchange ended, for monitoring; Stopped ones are not counted.
enum class Outcome { Answered, TimedOut, Failed, Stopped };

ipmiifc_resp* exchangeOnce(int node, ipmiifc_req* req, int flags, ipmiifc_resp* reuse, Outcome& outcome) {
    IpmiNode& n = g_IpmiNode[0];
    TAV::MutexLock exchange(n.transportMutex);
    outcome = Outcome::Stopped;
    // The flag first: once it is set, stop closes the device without this mutex.
    if (n.stopRequested) return nullptr;
    outcome = Outcome::Failed;
    if (n.fd < 1) return nullptr;

    struct ipmi_addr addr;
    buildAddress(n, &addr);
    const unsigned int addrLen = 8;  // both address forms fit the driver's 8 bytes

    struct ipmi_req dreq;
    memset(&dreq, 0, sizeof dreq);
    dreq.addr = reinterpret_cast<unsigned char*>(&addr);
    dreq.addr_len = addrLen;
    dreq.msgid = req->msgid;
    dreq.msg.netfn = req->netfn;
    dreq.msg.cmd = req->cmd;
    dreq.msg.data_len = req->data_len;
    dreq.msg.data = req->data;

    if (ioctl(n.fd, IPMICTL_SEND_COMMAND, &dreq) < 0) {
        int err = errno;
        ipmiLog(LOG_ERR, "Node %d: ioctl IPMICTL_SEND_COMMAND(fd=%d), errno(%d):%s", 0, n.fd, err,
                strerror(err));
        return failExchange(node, reuse);
    }

    // An answer that is not to this request (one left behind when an event
    // ended an earlier exchange, or sent twice) is dropped and the wait goes
    // on within the same time limit: a late answer must never satisfy a
    // later request.
    const int64_t deadlineMs = monotonicMs() + kAnswerWaitMs;
    ipmiifc_resp* resp = nullptr;
    for (;;) {
        const int64_t leftMs = deadlineMs - monotonicMs();
        struct pollfd fds[2];
        fds[0].fd = n.fd;
        fds[0].events = POLLIN;
        fds[0].revents = 0;
        fds[1].fd = n.signalCmdPipeFds[FD_READ];
        fds[1].events = POLLIN;
        fds[1].revents = 0;
        int ready = leftMs > 0 ? ::poll(fds, 2, static_cast<int>(leftMs)) : 0;
        if (ready == 0) {
            outcome = Outcome::TimedOut;
            ipmiLog(LOG_WARNING, "Node %d: poll(fd=%d) timeout with no reply.", 0, n.fd);
            if (resp != reuse) IpmiIfcRespDel(&resp);
            return failExchange(node, reuse);
        }
        if (ready < 0) {
            int err = errno;
            ipmiLog(LOG_ERR, "Node %d: poll(fd=%d), errno=%d %s", 0, n.fd, err, strerror(err));
            if (resp != reuse) IpmiIfcRespDel(&resp);
            return failExchange(node, reuse);
        }
        if (n.stopRequested) {
            outcome = Outcome::Stopped;
            if (resp != reuse) IpmiIfcRespDel(&resp);
            return nullptr;
        }
        if (fds[0].revents != POLLIN) {
            // Woken by the pipe, or the device reports an error: no answer to read.
            if (resp != reuse) IpmiIfcRespDel(&resp);
            if (reuse) {
                reuse->cc = 0xFF;
                return reuse;
            }
            return nullptr;
        }

        if (resp == nullptr) {
            resp = reuse;
            int prepared = reuse ? IpmiIfcRespReuse(reuse) : IpmiIfcRespNew(&resp);
            if (prepared != 0 || resp == nullptr) {
                ipmiLog(LOG_ERR, "Node %d: alloc failed - not enough memory.", 0);
                return nullptr;
            }
        }
        memcpy(resp->data, &kEmptyReceiveMarker, sizeof kEmptyReceiveMarker);

        unsigned char recvAddr[40];
        memset(recvAddr, 0, sizeof recvAddr);
        struct ipmi_recv recv;
        memset(&recv, 0, sizeof recv);
        recv.addr = recvAddr;
        recv.addr_len = sizeof recvAddr;
        recv.msg.data = resp->data;
        recv.msg.data_len = IPMIIFC_RESP_MAX;
        if (ioctl(n.fd, IPMICTL_RECEIVE_MSG_TRUNC, &recv) < 0 && errno != EMSGSIZE) {
            int err = errno;
            ReopenPort(node);
            IpmiIfcRespDel(&resp);
            if (err != EAGAIN) {
                ipmiLog(LOG_ERR, "Node %d: ioctl IPMICTL_RECEIVE_MSG_TRUNC(fd=%d), errno(%d):%s", 0, n.fd,
                        err, strerror(err));
            }
            return nullptr;
        }
        // The driver never reports more than the buffer; guard against one that does.
        const uint32_t capacity = IPMIIFC_RESP_MAX;
        resp->data_len = recv.msg.data_len > capacity ? capacity : recv.msg.data_len;
        resp->cc = resp->data[0];
        if (recv.recv_type == IPMI_ASYNC_EVENT_RECV_TYPE) {
            IpmiIfcRespDel(&resp);
            return nullptr;
        }
        if (answers(recv, dreq)) break;
        ipmiLog(LOG_DEBUG, "Node %d: dropped a stale answer (msgid %ld, netfn 0x%02x, cmd 0x%02x)", 0, recv.msgid,
                recv.msg.netfn, recv.msg.cmd);
    }
    if (resp->data_len > 0) outcome = Outcome::Answered;
    if (resp->cc != 0 || resp->data_len == 0) return resp;

    resp->node = 0;
    if (flags & IPMIIFC_FLAG_ECHO_REQUEST) {
        resp->req_addr = static_cast<uint8_t*>(malloc(addrLen));
        if (resp->req_addr) {
            memcpy(resp->req_addr, &addr, addrLen);
            resp->req_addr_len = addrLen;
        }
        resp->req_msgid = req->msgid;
        if (req->data_len > 0 && req->data) {
            resp->req_data = static_cast<uint8_t*>(malloc(req->data_len));
            if (resp->req_data) memcpy(resp->req_data, req->data, req->data_len);
        }
    }
    return resp;
}

}  // namespace

ipmiifc_resp* IpmiIfcSendWresponse(int node, ipmiifc_req* req, int flags, ipmiifc_resp* reuse) {
    Outcome outcome = Outcome::Failed;
    ipmiifc_resp* resp = exchangeOnce(node, req, flags, reuse, outcome);
    switch (outcome) {
    case Outcome::Answered:
        IpmiIfcWatchExchange(resp->cc == cc::ok        ? IpmiIfc::IPMI_EXCHANGE_OK
                             : resp->cc == cc::timeout ? IpmiIfc::IPMI_EXCHANGE_TIMEOUT
                                                       : IpmiIfc::IPMI_EXCHANGE_COMPLETION_CODE);
        break;
    case Outcome::TimedOut: IpmiIfcWatchExchange(IpmiIfc::IPMI_EXCHANGE_TIMEOUT); break;
    case Outcome::Failed: IpmiIfcWatchExchange(IpmiIfc::IPMI_EXCHANGE_ERROR); break;
    case Outcome::Stopped: break;
    }
    return resp;
}

ipmiifc_resp* IpmiIfcSend(int, ipmiifc_req* req, int flags) {
    TAV::MutexLock senders(g_IpmiNode[0].devInfoMutex);
    return IpmiIfcSendWresponse(0, req, flags, nullptr);
}

namespace {
ipmiifc_req stampedRequest(uint8_t cmd, uint8_t netfn, uint16_t data_len, uint8_t* data) {
    ipmiifc_req req;
    memset(&req, 0, sizeof req);
    req.netfn = netfn;
    req.cmd = cmd;
    req.data_len = data_len;
    req.data = data;
    req.msgid = IpmiIfcNextMsgId(0);
    return req;
}
}  // namespace

ipmiifc_resp* IpmiIfcSendCmd(int node, uint8_t cmd, uint8_t netfn, long, uint16_t data_len, uint8_t* data,
                             int flags) {
    ipmiifc_req req = stampedRequest(cmd, netfn, data_len, data);
    return IpmiIfcSend(node, &req, flags);
}

ipmiifc_resp* IpmiIfcSendToOwner(int node, uint8_t command, uint8_t sensorNumber, uint8_t owner, uint8_t channel,
                                 uint8_t lun) {
    ipmiifc_req req;
    memset(&req, 0, sizeof req);
    req.netfn = netfn::sensorEvent;
    req.cmd = command;
    req.data_len = 1;
    req.data = &sensorNumber;
    IpmiNode& bmc = g_IpmiNode[0];
    TAV::MutexLock senders(bmc.devInfoMutex);
    req.msgid = IpmiIfcNextMsgId(node);
    const uint32_t savedAddress = bmc.targetAddress;
    bmc.targetAddress = owner;
    bmc.targetChannel = channel;
    bmc.targetLun = lun;
    ipmiifc_resp* resp = IpmiIfcSendWresponse(node, &req, 0, nullptr);
    // Channel and LUN matter only next to an IPMB address, and every request
    // to an IPMB address sets all three.
    bmc.targetAddress = savedAddress;
    return resp;
}

uint8_t IpmiIfcCopyAnswer(const ipmiifc_resp* resp, uint16_t* resp_len, uint8_t* resp_buf) {
    if (!resp) return 0xFF;
    if (resp->cc != 0) return resp->cc;
    uint16_t count = *resp_len < resp->data_len ? *resp_len : static_cast<uint16_t>(resp->data_len);
    memcpy(resp_buf, resp->data, count);
    bool shortBuffer = *resp_len < resp->data_len;
    *resp_len = count;
    return shortBuffer ? 0x10 : 0;
}

uint8_t IpmiIfc::sendCmd(int node, uint8_t cmd, uint8_t netfn, uint16_t data_len, uint8_t* data,
                         uint16_t* resp_len, uint8_t* resp_buf) {
    ipmiifc_req req = stampedRequest(cmd, netfn, data_len, data);
    RespHolder resp(IpmiIfcSend(node, &req, 0));
    return IpmiIfcCopyAnswer(resp.get(), resp_len, resp_buf);
}

uint8_t IpmiIfc::sendCmd(uint8_t cmd, uint8_t netfn, uint16_t data_len, uint8_t* data, uint16_t* resp_len,
                         uint8_t* resp_buf) {
    return sendCmd(0, cmd, netfn, data_len, data, resp_len, resp_buf);
}

}  // namespace Ipmi
