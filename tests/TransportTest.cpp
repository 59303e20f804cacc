#include <errno.h>
#include <stdlib.h>
#include <unistd.h>

#include <thread>

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
    std::string timeoutLine() const {
        return "Node 0: poll(fd=" + std::to_string(node().fd) + ") timeout with no reply.";
    }
    const IpmiNode& node() const { return g_IpmiNode[0]; }
};

TEST_F(Transport, AnswerCarriesCompletionCodeAndData) {
    RespHolder r(deviceId());
    ASSERT_TRUE(r);
    EXPECT_EQ(r->cc, 0);
    EXPECT_EQ(r->data_len, 16u);
    EXPECT_EQ(r->data[1], bmc().identity.deviceId);
    EXPECT_EQ(r->node, 0);
    EXPECT_EQ(r->req_data, nullptr);  // no echo unless asked
    EXPECT_EQ(sim().exchanges(netfn::app, cmd::getDeviceId), 1u);
}

TEST_F(Transport, MessageIdsComeFromTheNodeCounter) {
    bmc().setSystemInfoString(4, "Linux");
    uint8_t data[4] = {0, 4, 0, 0};
    RespHolder a(IpmiIfcSendCmd(0, cmd::getSystemInfoParameters, netfn::app, 0, 4, data, IPMIIFC_FLAG_ECHO_REQUEST));
    RespHolder b(IpmiIfcSendCmd(0, cmd::getDeviceId, netfn::app, 0, 0, nullptr, IPMIIFC_FLAG_ECHO_REQUEST));
    ASSERT_TRUE(a && b);
    EXPECT_EQ(a->req_msgid, 1445);
    EXPECT_EQ(b->req_msgid, 1446);
    ASSERT_NE(a->req_data, nullptr);
    EXPECT_EQ(a->req_data[1], 4);
    EXPECT_EQ(a->req_addr_len, 8u);
    EXPECT_EQ(b->req_data, nullptr);  // no request data, no copy
    EXPECT_EQ(node().msgCounter, 1447u);
}

// The request echo is kept only for a successful answer.
TEST_F(Transport, NoEchoForAnErrorAnswer) {
    uint8_t data[4] = {0, 4, 0, 0};  // parameter 4 not supported by this controller
    RespHolder r(IpmiIfcSendCmd(0, cmd::getSystemInfoParameters, netfn::app, 0, 4, data, IPMIIFC_FLAG_ECHO_REQUEST));
    ASSERT_TRUE(r);
    EXPECT_EQ(r->cc, cc::parameterNotSupported);
    EXPECT_EQ(r->req_data, nullptr);
}

TEST_F(Transport, ErrorAnswerIsReturnedAsIs) {
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::completionCode(cc::nodeBusy));
    RespHolder r(deviceId());
    ASSERT_TRUE(r);
    EXPECT_EQ(r->cc, cc::nodeBusy);
    EXPECT_EQ(r->data_len, 1u);
}

TEST_F(Transport, TimeOutReopensTheDeviceAndReturnsNothing) {
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    std::string line = timeoutLine();
    EXPECT_EQ(deviceId(), nullptr);
    EXPECT_TRUE(log.contains(LOG_WARNING, line)) << log.dump();
    EXPECT_GE(virtualSecondsElapsed(), 30.0);
    EXPECT_EQ(node().isOpen, 1);
    RespHolder next(deviceId());  // the reopened device works
    ASSERT_TRUE(next);
    EXPECT_EQ(next->cc, 0);
}

TEST_F(Transport, TimeOutWithCallerRecordMarksIt255) {
    ipmiifc_resp* mine = nullptr;
    ASSERT_EQ(IpmiIfcRespNew(&mine), 0);
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    ipmiifc_resp* r = deviceId(mine);
    EXPECT_EQ(r, mine);
    EXPECT_EQ(r->cc, 0xFF);
    IpmiIfcRespDel(&mine);
}

TEST_F(Transport, SendFailureLogsAndReopens) {
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::errnoFault(Sim::FaultKind::SendError, EIO));
    std::string line =
        "Node 0: ioctl IPMICTL_SEND_COMMAND(fd=" + std::to_string(node().fd) + "), errno(5):Input/output error";
    EXPECT_EQ(deviceId(), nullptr);
    EXPECT_TRUE(log.contains(LOG_ERR, line)) << log.dump();
    EXPECT_EQ(sim().exchanges(netfn::app, cmd::getDeviceId), 0u);  // never reached the controller
    EXPECT_EQ(node().isOpen, 1);
}

// A failed receive frees the caller's record too: it must not be used again.
TEST_F(Transport, ReceiveFailureFreesTheCallersRecord) {
    ipmiifc_resp* mine = nullptr;
    ASSERT_EQ(IpmiIfcRespNew(&mine), 0);
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::errnoFault(Sim::FaultKind::ReceiveError, EIO));
    int fd = node().fd;
    EXPECT_EQ(deviceId(mine), nullptr);
    EXPECT_TRUE(log.contains(LOG_ERR, "Node 0: ioctl IPMICTL_RECEIVE_MSG_TRUNC(fd=" + std::to_string(fd) +
                                          "), errno(5):Input/output error"))
        << log.dump();
}

TEST_F(Transport, ReceiveWouldBlockIsNotLogged) {
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::errnoFault(Sim::FaultKind::ReceiveError, EAGAIN));
    EXPECT_EQ(deviceId(), nullptr);
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u) << log.dump();
}

TEST_F(Transport, OverlongAnswerIsCutTo32Bytes) {
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::answerLength(Sim::FaultKind::LongAnswer, 40));
    RespHolder r(deviceId());
    ASSERT_TRUE(r);
    EXPECT_EQ(r->cc, 0);
    EXPECT_EQ(r->data_len, 32u);
}

TEST_F(Transport, AsynchronousEventEndsTheExchange) {
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::of(Sim::FaultKind::AsyncEventFirst));
    EXPECT_EQ(deviceId(), nullptr);
}

TEST_F(Transport, StopRequestedSendsNothing) {
    g_IpmiNode[0].stopRequested = true;
    EXPECT_EQ(deviceId(), nullptr);
    EXPECT_EQ(sim().totalExchanges(), 0u);
}

TEST_F(Transport, ClosedDeviceSendsNothing) {
    IpmiIfcOpenIpmiClose(0);
    EXPECT_EQ(deviceId(), nullptr);
    EXPECT_EQ(sim().totalExchanges(), 0u);
}

TEST_F(Transport, RemoteTargetIsAddressedOverIpmb) {
    g_IpmiNode[0].targetAddress = 0x2C;
    g_IpmiNode[0].targetChannel = 0x16;  // only the low four bits are a channel
    g_IpmiNode[0].targetLun = 1;
    RespHolder r(deviceId());
    auto reqs = sim().requests();
    ASSERT_EQ(reqs.size(), 1u);
    EXPECT_TRUE(reqs[0].viaIpmb);
    EXPECT_EQ(reqs[0].address, 0x2C);
    EXPECT_EQ(reqs[0].channel, 6);
    EXPECT_EQ(reqs[0].lun, 1);

    g_IpmiNode[0].targetAddress = 0x20;  // our own address: the system interface
    RespHolder local(deviceId());
    EXPECT_FALSE(sim().requests()[1].viaIpmb);
}

// A wake-up through the pipe ends the wait at once, without an answer.
TEST_F(Transport, PipeWakeUpEndsAWaitWithoutAnswer) {
    int fds[2];
    ASSERT_EQ(pipe(fds), 0);
    g_IpmiNode[0].signalCmdPipeFds[FD_READ] = fds[0];
    g_IpmiNode[0].signalCmdPipeFds[FD_WRITE] = fds[1];
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::of(Sim::FaultKind::Hang));
    ipmiifc_resp* mine = nullptr;
    ASSERT_EQ(IpmiIfcRespNew(&mine), 0);
    std::thread waker([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        unsigned char byte = 255;
        ASSERT_EQ(write(fds[1], &byte, 1), 1);
    });
    ipmiifc_resp* r = deviceId(mine);
    waker.join();
    EXPECT_EQ(r, mine);
    EXPECT_EQ(r->cc, 0xFF);
    IpmiIfcRespDel(&mine);
    close(fds[0]);
    close(fds[1]);
}

TEST_F(Transport, RespRecordsRejectNull) {
    EXPECT_EQ(IpmiIfcRespNew(nullptr), -1);
    EXPECT_EQ(IpmiIfcRespReuse(nullptr), -1);
    ipmiifc_resp* none = nullptr;
    EXPECT_EQ(IpmiIfcRespDel(&none), -1);
}

class RawCommand : public Transport {};

TEST_F(RawCommand, ShortBufferReturns16AndCopiesWhatFits) {
    uint8_t buf[4] = {0xAA, 0xAA, 0xAA, 0xAA};
    uint16_t len = sizeof buf;
    EXPECT_EQ(IpmiIfc::sendCmd(cmd::getDeviceId, netfn::app, 0, nullptr, &len, buf), 0x10);
    EXPECT_EQ(len, 4);
    EXPECT_EQ(buf[0], 0);  // the completion code comes first
    EXPECT_EQ(buf[1], bmc().identity.deviceId);
}

TEST_F(RawCommand, FullBufferReturnsZeroAndTheLength) {
    uint8_t buf[32];
    uint16_t len = sizeof buf;
    EXPECT_EQ(IpmiIfc::sendCmd(2, cmd::getSelfTestResults, netfn::app, 0, nullptr, &len, buf), 0);
    EXPECT_EQ(len, 3);
    EXPECT_EQ(buf[1], 0x55);
}

TEST_F(RawCommand, ErrorCodeCopiesNothing) {
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::completionCode(cc::invalidCommand));
    uint8_t buf[8] = {0x77};
    uint16_t len = sizeof buf;
    EXPECT_EQ(IpmiIfc::sendCmd(cmd::getDeviceId, netfn::app, 0, nullptr, &len, buf), cc::invalidCommand);
    EXPECT_EQ(len, 8);
    EXPECT_EQ(buf[0], 0x77);
}

TEST_F(RawCommand, NoAnswerIs255) {
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    uint8_t buf[8];
    uint16_t len = sizeof buf;
    EXPECT_EQ(IpmiIfc::sendCmd(cmd::getDeviceId, netfn::app, 0, nullptr, &len, buf), 0xFF);
}

class DeviceSetup : public TestSupport::SimTest {
protected:
    void TearDown() override {
        unsetenv("CIM_IPMI_RETRIES");
        unsetenv("CIM_IPMI_RETRY_TIME");
        SimTest::TearDown();
    }
};

TEST_F(DeviceSetup, OpenFailureIsLoggedWithThePath) {
    IpmiIfcOpenIpmiClose(0);
    sim().failOpen(EACCES);
    EXPECT_EQ(IpmiIfcOpenIpmiOpen(0), -1);
    EXPECT_EQ(g_IpmiNode[0].fd, -1);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcOpenIpmiOpen: open(/dev/ipmi0, RDWR) failed 13 Permission denied"))
        << log.dump();
}

TEST_F(DeviceSetup, NoSimulatedControllerMeansNoDevice) {
    IpmiIfcOpenIpmiClose(0);
    sim().uninstall();
    EXPECT_EQ(IpmiIfcOpenIpmiOpen(0), -1);
    EXPECT_EQ(errno, ENOENT);
}

TEST_F(DeviceSetup, TimingUntouchedWithoutUsableValues) {
    for (const char* retries : {"0", "abc", "-3"}) {
        setenv("CIM_IPMI_RETRIES", retries, 1);
        IpmiIfcSetTimingParms(0);
    }
    EXPECT_TRUE(log.lines().empty()) << log.dump();
}

TEST_F(DeviceSetup, OneTimingValueKeepsTheDriversOther) {
    setenv("CIM_IPMI_RETRIES", "3", 1);
    IpmiIfcSetTimingParms(0);
    setenv("CIM_IPMI_RETRY_TIME", "250x", 1);
    IpmiIfcSetTimingParms(0);
    EXPECT_TRUE(log.contains(LOG_INFO, "IPMI default timing parms: retries=-1, retry_time=0(ms)")) << log.dump();
    EXPECT_TRUE(log.contains(LOG_INFO, "IPMI timing parms have been set to: retries=3, retry_time=0(ms)."));
    EXPECT_TRUE(log.contains(LOG_INFO, "IPMI default timing parms: retries=3, retry_time=0(ms)"));
    EXPECT_TRUE(log.contains(LOG_INFO, "IPMI timing parms have been set to: retries=3, retry_time=250(ms)."));
}

TEST_F(DeviceSetup, EventsAndAddressReachTheDriver) {
    int off = 0;
    EXPECT_EQ(IpmiIfcOpenIpmiEventEnable(0, &off), 0);
    g_IpmiNode[0].myAddress = 0;
    EXPECT_EQ(IpmiIfcOpenIpmiAddressSet(0), 0);
    g_IpmiNode[0].myAddress = 0x20;
    EXPECT_EQ(IpmiIfcOpenIpmiAddressSet(0), 0);
    IpmiIfcOpenIpmiClose(0);
    g_IpmiNode[0].fd = 1000;  // not a device: the ioctls fail
    EXPECT_EQ(IpmiIfcOpenIpmiAddressSet(0), -1);
    EXPECT_TRUE(log.contains(LOG_ERR, "Node 0: IpmiIfcOpenIpmiAddressSet failed ioctl call returning -1"));
    EXPECT_EQ(IpmiIfcOpenIpmiEventEnable(0, &off), -1);
    g_IpmiNode[0].fd = -1;
}

}  // namespace
