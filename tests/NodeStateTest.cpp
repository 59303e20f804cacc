#include <atomic>
#include <utility>

#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::waitUntil;

namespace {

class NodeState : public TestSupport::SimTest {
protected:
    NodeState() { openDevice = false; }
    std::atomic<int> result{0};
};

TEST_F(NodeState, InitResetsTheRecordButKeepsTheDevice) {
    node().fd = 42;
    node().msgCounter = 7;
    node().work.sdr.info[1] = 0x51;
    InitIpmiNode(0);
    EXPECT_EQ(node().msgCounter, 1445u);
    EXPECT_EQ(node().pollInterval, -1);
    EXPECT_EQ(node().work.sdr.info[1], 0);
    EXPECT_EQ(std::exchange(node().fd, -1), 42);  // the descriptor belongs to the transport
}

TEST_F(NodeState, UnexpectedTransitionThrowsAndKeepsTheState) {
    _changeState(0, IpmiIfc::IPMI_STATE_INIT, IpmiIfc::IPMI_STATE_STARTING);
    _setState(0, IpmiIfc::IPMI_STATE_RUNNING);
    try {
        _changeState(0, IpmiIfc::IPMI_STATE_INIT, IpmiIfc::IPMI_STATE_STARTING);
        ADD_FAILURE() << "no exception";
    } catch (const kelInt::CmpiStatus& s) {
        EXPECT_EQ(s.rc(), CMPI_RC_ERROR);
    }
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfc unexpected state transition: (1->2), Current state 4"));
    EXPECT_EQ(IpmiIfc::getState(3), IpmiIfc::IPMI_STATE_RUNNING);  // every node number reads slot 0
}

TEST_F(NodeState, WaitStateReturnsOnlyAStateInItsMask) {
    _setState(0, IpmiIfc::IPMI_STATE_STOPPED);
    EXPECT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_STOPPED);
    _setState(0, IpmiIfc::IPMI_STATE_STARTING);
    std::thread waiter([&] { result = IpmiIfc::waitState(2, 12); });
    waitUntil([&] { return log.count("Node 0: IpmiIfc::waitState (12) called") == 2; });
    EXPECT_EQ(result.load(), 0);
    _setState(0, IpmiIfc::IPMI_STATE_RUNNING);
    waiter.join();
    EXPECT_EQ(result.load(), IpmiIfc::IPMI_STATE_RUNNING);
}

// The time-out is a re-check period, not a limit. Only the waiter moves
// virtual time here, so three seconds passed means three time-outs.
TEST_F(NodeState, TimedWaitTimeOutOnlyRechecks) {
    _setState(0, IpmiIfc::IPMI_STATE_STARTING);
    std::thread waiter([&] { result = IpmiIfc::timedWaitState(4, 1, 0); });
    waitUntil([&] { return result.load() != 0 || virtualSecondsElapsed() >= 3; });
    _setState(0, IpmiIfc::IPMI_STATE_STOPPED);  // not in the mask
    EXPECT_EQ(result.load(), 0);
    _setState(0, IpmiIfc::IPMI_STATE_RUNNING);
    waiter.join();
    EXPECT_EQ(result.load(), IpmiIfc::IPMI_STATE_RUNNING);
}

TEST(CmpiStatusTest, TextIsLoggedButNotCarried) {
    TestSupport::LogCapture log;
    kelInt::CmpiStatus s(CMPI_RC_ERR_ACCESS_DENIED, "Only root user allowed");
    EXPECT_EQ(s.rc(), CMPI_RC_ERR_ACCESS_DENIED);
    EXPECT_STREQ(s.msg(), "(null)");
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 2 Only root user allowed"));
    char text[] = "broker text";
    CMPIString str{text, nullptr};
    EXPECT_STREQ(kelInt::CmpiStatus(_CMPIStatus{CMPI_RC_ERR_FAILED, &str}).msg(), "broker text");
}

}  // namespace
