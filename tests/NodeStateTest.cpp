#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::LogCapture;

namespace {

class NodeState : public TestSupport::SimTest {
protected:
    NodeState() { openDevice = false; }
};

TEST_F(NodeState, InitResetsTheRecordButKeepsTheDevice) {
    node().fd = 42;
    node().msgCounter = 7;
    node().deviceId[3] = 9;
    node().work.sdr.info[1] = 0x51;
    InitIpmiNode(0);
    EXPECT_EQ(node().msgCounter, 1445u);
    EXPECT_EQ(node().state, IpmiIfc::IPMI_STATE_INIT);
    EXPECT_EQ(node().pollInterval, -1);
    EXPECT_EQ(node().signalCmdPipeFds[FD_READ], -1);
    EXPECT_EQ(node().deviceId[3], 0);
    EXPECT_EQ(node().work.sdr.info[1], 0);
    EXPECT_EQ(node().fd, 42);  // the descriptor belongs to the transport
    node().fd = -1;
}

TEST_F(NodeState, EveryNodeNumberReadsSlotZero) {
    _setState(0, IpmiIfc::IPMI_STATE_RUNNING);
    EXPECT_EQ(IpmiIfc::getState(3), IpmiIfc::IPMI_STATE_RUNNING);
    EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_RUNNING);
}

TEST_F(NodeState, UnexpectedTransitionThrowsAndLogs) {
    _setState(0, IpmiIfc::IPMI_STATE_RUNNING);
    try {
        _changeState(0, IpmiIfc::IPMI_STATE_INIT, IpmiIfc::IPMI_STATE_STARTING);
        FAIL() << "no exception";
    } catch (const kelInt::CmpiStatus& s) {
        EXPECT_EQ(s.rc(), CMPI_RC_ERROR);
        EXPECT_STREQ(s.msg(), "(null)");
    }
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfc unexpected state transition: (1->2), Current state 4"));
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 200 IpmiIfc unexpected state transition"));
    EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_RUNNING);
}

TEST_F(NodeState, ExpectedTransitionLogsItsCheck) {
    _changeState(0, IpmiIfc::IPMI_STATE_INIT, IpmiIfc::IPMI_STATE_STARTING);
    EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_STARTING);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IPMI Node 0: _changeState check passed"));
}

TEST_F(NodeState, WaitStateReturnsTheStateThatMatched) {
    _setState(0, IpmiIfc::IPMI_STATE_STOPPED);
    EXPECT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_STOPPED);
    _setState(0, IpmiIfc::IPMI_STATE_RUNNING);
    EXPECT_EQ(IpmiIfc::waitState(2, 12), IpmiIfc::IPMI_STATE_RUNNING);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Node 0: IpmiIfc::waitState (12) called"));
}

TEST_F(NodeState, WaitStateBlocksUntilAChange) {
    _setState(0, IpmiIfc::IPMI_STATE_STARTING);
    std::atomic<int> result{0};
    std::thread waiter([&] { result = IpmiIfc::waitState(12); });
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(result.load(), 0);
    _setState(0, IpmiIfc::IPMI_STATE_RUNNING);
    waiter.join();
    EXPECT_EQ(result.load(), IpmiIfc::IPMI_STATE_RUNNING);
}

// The time-out only re-checks: many virtual seconds pass without a return.
TEST_F(NodeState, TimedWaitReturnsOnlyOnAStateInTheMask) {
    _setState(0, IpmiIfc::IPMI_STATE_STARTING);
    std::atomic<int> result{0};
    std::thread waiter([&] { result = IpmiIfc::timedWaitState(4, 1, 0); });
    while (virtualSecondsElapsed() < 5) std::this_thread::sleep_for(std::chrono::milliseconds(1));
    EXPECT_EQ(result.load(), 0);
    _setState(0, IpmiIfc::IPMI_STATE_STOPPED);  // not in the mask
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
    EXPECT_EQ(result.load(), 0);
    _setState(0, IpmiIfc::IPMI_STATE_RUNNING);
    waiter.join();
    EXPECT_EQ(result.load(), IpmiIfc::IPMI_STATE_RUNNING);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Node 0: IpmiIfc::timedWaitState (4, 1, 0) called"));
}

TEST(CmpiStatusTest, TextIsLoggedButNotCarried) {
    LogCapture log;
    kelInt::CmpiStatus s(CMPI_RC_ERR_ACCESS_DENIED, "Only root user allowed");
    EXPECT_EQ(s.rc(), CMPI_RC_ERR_ACCESS_DENIED);
    EXPECT_STREQ(s.msg(), "(null)");
    EXPECT_EQ(s.status().msg, nullptr);
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 2 Only root user allowed"));
    EXPECT_EQ(kelInt::CmpiStatus().rc(), CMPI_RC_OK);
    EXPECT_EQ(log.lines().size(), 1u);
}

TEST(CmpiStatusTest, StatusCopyKeepsItsMessage) {
    char text[] = "broker text";
    CMPIString str{text, nullptr};
    _CMPIStatus raw{CMPI_RC_ERR_FAILED, &str};
    kelInt::CmpiStatus s(raw);
    EXPECT_EQ(s.rc(), CMPI_RC_ERR_FAILED);
    EXPECT_STREQ(s.msg(), "broker text");
}

}  // namespace
