#include <errno.h>
#include <stdlib.h>
#include <unistd.h>

#include "TestSupport.h"

using namespace Ipmi;

namespace {

class Transport : public TestSupport::SimTest {
protected:
    ipmiifc_resp* deviceId(ipmiifc_resp* reuse = nullptr) {
        ipmiifc_req req{};
        req.netfn = netfn::app;
        req.cmd = cmd::getDeviceId;
        return reuse ? IpmiIfcSendWresponse(0, &req, 0, reuse) : IpmiIfcSend(0, &req, 0);
    }
    void fault(Sim::Fault f) { sim().addFault(netfn::app, cmd::getDeviceId, f); }
    std::string fd() { return std::to_string(node().fd); }
    uint8_t raw(uint16_t& len, uint8_t* buf) {
        return IpmiIfc::sendCmd(cmd::getDeviceId, netfn::app, 0, nullptr, &len, buf);
    }
    ipmiifc_resp* callersRecord() {
        ipmiifc_resp* r = nullptr;
        EXPECT_EQ(IpmiIfcRespNew(&r), 0);
        return r;
    }
};

TEST_F(Transport, AnswersAndTheirRequestEcho) {
    bmc().setSystemInfoString(sysInfoParam::osName, "Linux");
    uint8_t data[4] = {0, sysInfoParam::osName, 0, 0};
    RespHolder a(IpmiIfcSendCmd(0, cmd::getSystemInfoParameters, netfn::app, 0, 4, data, IPMIIFC_FLAG_ECHO_REQUEST));
    RespHolder b(IpmiIfcSendCmd(0, cmd::getDeviceId, netfn::app, 0, 0, nullptr, IPMIIFC_FLAG_ECHO_REQUEST));
    ASSERT_TRUE(a && b);
    EXPECT_EQ(a->req_msgid, 1445);  // ids come from the node's counter
    EXPECT_EQ(b->req_msgid, 1446);
    ASSERT_NE(a->req_data, nullptr);
    EXPECT_EQ(a->req_data[1], sysInfoParam::osName);
    EXPECT_EQ(b->req_data, nullptr);  // no request data, no copy
    EXPECT_EQ(b->data[1], bmc().identity.deviceId);

    data[1] = sysInfoParam::osVersion;  // unsupported: the error answer as it is, without echo
    RespHolder c(IpmiIfcSendCmd(0, cmd::getSystemInfoParameters, netfn::app, 0, 4, data, IPMIIFC_FLAG_ECHO_REQUEST));
    ASSERT_TRUE(c);
    EXPECT_EQ(c->cc, cc::parameterNotSupported);
    EXPECT_EQ(c->req_data, nullptr);

    fault(Sim::Fault::answerLength(Sim::FaultKind::LongAnswer, 40));
    RespHolder cut(deviceId());  // cut by the driver (EMSGSIZE), still an answer
    ASSERT_TRUE(cut);
    EXPECT_EQ(cut->data_len, 32u);
}

TEST_F(Transport, TimeOutReopensTheDevice) {
    const std::string line = "Node 0: poll(fd=" + fd() + ") timeout with no reply.";
    fault(Sim::Fault::of(Sim::FaultKind::NoAnswer));
    EXPECT_EQ(deviceId(), nullptr);
    EXPECT_TRUE(log.contains(LOG_WARNING, line)) << log.dump();
    EXPECT_GE(virtualSecondsElapsed(), 30.0);
    EXPECT_TRUE(RespHolder(deviceId()));

    // A caller's record comes back marked 255; a failed reopen shows the reopen is tried.
    ipmiifc_resp* mine = callersRecord();
    fault(Sim::Fault::of(Sim::FaultKind::NoAnswer));
    sim().failOpen(ENOENT);
    EXPECT_EQ(deviceId(mine), mine);
    EXPECT_EQ(mine->cc, 0xFF);
    IpmiIfcRespDel(&mine);
    EXPECT_TRUE(log.contains(LOG_INFO, "Node 0: Unable to open node No such file or directory"));
}

TEST_F(Transport, SendAndReceiveFailures) {
    const std::string device = fd();
    fault(Sim::Fault::errnoFault(Sim::FaultKind::SendError, EIO));
    EXPECT_EQ(deviceId(), nullptr);
    EXPECT_TRUE(log.contains(LOG_ERR, "Node 0: ioctl IPMICTL_SEND_COMMAND(fd=" + device +
                                          "), errno(5):Input/output error"));
    EXPECT_EQ(sim().totalExchanges(), 0u);

    // A failed receive frees the caller's record too (a leak would show under the sanitizer).
    fault(Sim::Fault::errnoFault(Sim::FaultKind::ReceiveError, EIO));
    EXPECT_EQ(deviceId(callersRecord()), nullptr);
    EXPECT_TRUE(log.contains(LOG_ERR, "Node 0: ioctl IPMICTL_RECEIVE_MSG_TRUNC(fd=" + device +
                                          "), errno(5):Input/output error"));

    log.clear();
    fault(Sim::Fault::errnoFault(Sim::FaultKind::ReceiveError, EAGAIN));
    EXPECT_EQ(deviceId(), nullptr);
    fault(Sim::Fault::of(Sim::FaultKind::AsyncEventFirst));
    EXPECT_EQ(deviceId(), nullptr);  // an event before the answer ends the exchange
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u) << log.dump();  // nor is a would-block logged
}

// An answer left queued behind an event, or sent twice, is dropped: the next
// request gets its own answer (a reservation, not a Device ID).
TEST_F(Transport, StaleAnswersNeverAnswerALaterRequest) {
    for (Sim::FaultKind kind : {Sim::FaultKind::AsyncEventFirst, Sim::FaultKind::DuplicateAnswer}) {
        fault(Sim::Fault::of(kind));
        RespHolder first(deviceId());
        log.clear();
        RespHolder next(IpmiIfcSendCmd(0, cmd::reserveSdrRepository, netfn::storage, 0, 0, nullptr, 0));
        ASSERT_TRUE(next);
        EXPECT_EQ(next->data_len, 3u);
        EXPECT_EQ(next->data[1] | next->data[2] << 8, bmc().sdr.reservation);
        EXPECT_TRUE(log.contains(LOG_DEBUG, "Node 0: dropped a stale answer (msgid 0, netfn 0x07, cmd 0x01)"))
            << log.dump();
    }
}

TEST_F(Transport, NothingIsSentWhileStoppingOrClosed) {
    node().stopRequested = true;
    EXPECT_EQ(deviceId(), nullptr);
    node().stopRequested = false;
    IpmiIfcOpenIpmiClose(0);
    EXPECT_EQ(deviceId(), nullptr);
    EXPECT_EQ(sim().totalExchanges(), 0u);
}

// A byte in the wake-up pipe ends the wait for an answer that never comes.
TEST_F(Transport, PipeWakeUpEndsTheWait) {
    int fds[2];
    ASSERT_EQ(pipe(fds), 0);
    const unsigned char byte = 255;
    ASSERT_EQ(write(fds[1], &byte, 1), 1);
    node().signalCmdPipeFds[FD_READ] = fds[0];
    fault(Sim::Fault::of(Sim::FaultKind::Hang));
    ipmiifc_resp* mine = callersRecord();
    EXPECT_EQ(deviceId(mine), mine);
    EXPECT_EQ(mine->cc, 0xFF);
    IpmiIfcRespDel(&mine);
    close(fds[0]);
    close(fds[1]);
}

TEST_F(Transport, RemoteTargetIsAddressedOverIpmb) {
    node().targetAddress = 0x2C;
    node().targetChannel = 0x16;  // only the low four bits are a channel
    node().targetLun = 1;
    RespHolder remote(deviceId());
    node().targetAddress = 0x20;  // our own address: the system interface
    RespHolder local(deviceId());
    auto reqs = sim().requests();
    ASSERT_EQ(reqs.size(), 2u);
    EXPECT_TRUE(reqs[0].viaIpmb);
    EXPECT_EQ(reqs[0].address, 0x2C);
    EXPECT_EQ(reqs[0].channel, 6);
    EXPECT_EQ(reqs[0].lun, 1);
    EXPECT_FALSE(reqs[1].viaIpmb);
}

TEST_F(Transport, RawCommandCopyRules) {
    uint8_t buf[32];
    uint16_t len = 4;
    EXPECT_EQ(raw(len, buf), 0x10);  // short buffer: what fits, completion code first
    EXPECT_EQ(len, 4);
    EXPECT_EQ(buf[0], 0);
    EXPECT_EQ(buf[1], bmc().identity.deviceId);
    len = sizeof buf;
    EXPECT_EQ(IpmiIfc::sendCmd(2, cmd::getSelfTestResults, netfn::app, 0, nullptr, &len, buf), 0);
    EXPECT_EQ(len, 3);
    EXPECT_EQ(buf[1], 0x55);

    fault(Sim::Fault::completionCode(cc::invalidCommand));
    buf[0] = 0x77;
    EXPECT_EQ(raw(len, buf), cc::invalidCommand);  // nothing copied
    EXPECT_EQ(len, 3);
    EXPECT_EQ(buf[0], 0x77);
    fault(Sim::Fault::of(Sim::FaultKind::NoAnswer));
    EXPECT_EQ(raw(len, buf), 0xFF);
}

TEST_F(Transport, OpenFailures) {
    IpmiIfcOpenIpmiClose(0);
    sim().failOpen(EACCES);
    EXPECT_EQ(IpmiIfcOpenIpmiOpen(0), -1);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcOpenIpmiOpen: open(/dev/ipmi0, RDWR) failed 13 Permission denied"));
    sim().uninstall();  // without a simulated controller there is no device
    EXPECT_EQ(IpmiIfcOpenIpmiOpen(0), -1);
    EXPECT_EQ(errno, ENOENT);
}

TEST_F(Transport, TimingVariables) {
    IpmiIfcSetTimingParms(0);
    for (const char* retries : {"0", "abc", "-3"}) {
        setenv("CIM_IPMI_RETRIES", retries, 1);
        IpmiIfcSetTimingParms(0);
    }
    EXPECT_TRUE(log.lines().empty()) << log.dump();  // no usable value: the driver is not asked
    setenv("CIM_IPMI_RETRIES", "3", 1);
    IpmiIfcSetTimingParms(0);
    EXPECT_TRUE(log.contains(LOG_INFO, "IPMI timing parms have been set to: retries=3, retry_time=0(ms)."));
    setenv("CIM_IPMI_RETRY_TIME", "250x", 1);
    IpmiIfcSetTimingParms(0);
    EXPECT_TRUE(log.contains(LOG_INFO, "IPMI default timing parms: retries=3, retry_time=0(ms)"));
    EXPECT_TRUE(log.contains(LOG_INFO, "IPMI timing parms have been set to: retries=3, retry_time=250(ms)."));
    unsetenv("CIM_IPMI_RETRIES");
    unsetenv("CIM_IPMI_RETRY_TIME");
}

}  // namespace
