#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>

#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::LoopThread;
using TestSupport::waitUntil;

namespace {

class Lifecycle : public TestSupport::SimTest {
protected:
    Lifecycle() { openDevice = false; }
    void waitRunning() { ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING); }
    // A hung exchange waits in real time: only the wake-up through the pipe
    // ends it before the 30-second time-out.
    void hang(uint8_t netfnValue, uint8_t command) {
        sim().addFault(netfnValue, command, Sim::Fault::of(Sim::FaultKind::Hang));
    }
    void expectStoppedWithoutTimeOut() {
        EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_STOPPED);
        for (const auto& line : log.lines()) EXPECT_EQ(line.text.find("timeout with no reply"), std::string::npos);
    }
};

TEST_F(Lifecycle, NonRootCallerIsRefused) {
    pid_t child = fork();
    ASSERT_NE(child, -1);
    if (child == 0) {
        if (setgid(65534) != 0 || setuid(65534) != 0) _exit(10);
        int rc = -1;
        try {
            IpmiIfc::start(0, 1);
        } catch (const kelInt::CmpiStatus& s) {
            rc = s.rc();
        }
        if (rc != CMPI_RC_ERR_ACCESS_DENIED) _exit(11);
        if (IpmiIfc::getState() != IpmiIfc::IPMI_STATE_STOPPED) _exit(12);
        _exit(sim().totalExchanges() == 0 ? 0 : 13);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 0) << "10 setuid, 11 rc, 12 state, 13 device used";
}

TEST_F(Lifecycle, MissingDeviceStopsWithoutLoop) {
    sim().failOpen(ENOENT);
    IpmiIfc::start(0, 1);  // returns: there is no loop to run
    EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_STOPPED);
    EXPECT_TRUE(log.contains(LOG_INFO, "Node 0: Unable to open node, Error(2):No such file or directory"));
    EXPECT_EQ(log.count("Node 0: IpmiIfc::poll called"), 0u);
    EXPECT_EQ(sim().totalExchanges(), 0u);
    IpmiIfc::stop();  // stopped already: stop only cleans up
    EXPECT_EQ(node().signalCmdPipeFds[FD_READ], -1);
}

TEST_F(Lifecycle, StartRunsTheLoopUntilStop) {
    {
        LoopThread loop(0);
        waitRunning();
        // A transport wait blocks on the pipe's read end; stop never blocks on its write end.
        EXPECT_EQ(fcntl(node().signalCmdPipeFds[FD_READ], F_GETFL) & O_NONBLOCK, 0);
        EXPECT_NE(fcntl(node().signalCmdPipeFds[FD_WRITE], F_GETFL) & O_NONBLOCK, 0);
        ASSERT_EQ(IpmiIfc::registerSelEventHandler([](void*, IpmiSelData*) {}, nullptr), 0);

        loop.stop();
        EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_STOPPED);  // the loop has ended
    }
    EXPECT_EQ(node().fd, -1);
    EXPECT_EQ(node().signalCmdPipeFds[FD_READ], -1);
    EXPECT_EQ(node().signalCmdPipeFds[FD_WRITE], -1);
    EXPECT_EQ(node().work.sel_handlers, nullptr);
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u) << log.dump();
    try {
        IpmiIfc::stop();
        ADD_FAILURE() << "no exception";
    } catch (const kelInt::CmpiStatus& s) {
        EXPECT_EQ(s.rc(), CMPI_RC_ERROR);
    }
}

TEST_F(Lifecycle, StopEndsTheLoopsHungExchange) {
    LoopThread loop(0);
    waitRunning();
    bool shutdown = false;
    IpmiIfc::pollAll(1, true, IPMI_POLL_NORMAL, &shutdown);  // the loop is past its first reads
    const unsigned before = sim().exchanges(netfn::storage, cmd::getSelInfo);
    hang(netfn::storage, cmd::getSelInfo);
    waitUntil([&] {
        IpmiIfc::doPoll();  // repeated: a wake-up while the loop is busy is lost
        return sim().exchanges(netfn::storage, cmd::getSelInfo) > before;
    });
    loop.stop();
    expectStoppedWithoutTimeOut();
}

TEST_F(Lifecycle, StopEndsACallersHungExchange) {
    LoopThread loop(0);
    waitRunning();
    const unsigned before = sim().exchanges(netfn::app, cmd::getDeviceId);
    hang(netfn::app, cmd::getDeviceId);
    std::atomic<int> result{-1};
    std::thread caller([&] {
        uint8_t answer[20];
        uint16_t length = sizeof answer;
        result = IpmiIfc::sendCmd(cmd::getDeviceId, netfn::app, 0, nullptr, &length, answer);
    });
    waitUntil([&] { return sim().exchanges(netfn::app, cmd::getDeviceId) > before; });
    loop.stop();
    caller.join();
    EXPECT_EQ(result.load(), 255);
    expectStoppedWithoutTimeOut();
}

TEST_F(Lifecycle, CommandLineModeNeedsNoLoop) {
    ASSERT_GE(IpmiIfcOpenIpmiOpen(0), 0);
    ASSERT_EQ(IpmiIfcInitForCLI(0), 0);
    EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_CLI);
    uint8_t answer[20];
    uint16_t length = sizeof answer;
    EXPECT_EQ(IpmiIfc::sendCmd(cmd::getDeviceId, netfn::app, 0, nullptr, &length, answer), 0);
    IpmiIfcCloseForCLI(0);
    EXPECT_EQ(node().signalCmdPipeFds[FD_READ], -1);
    EXPECT_EQ(node().signalCmdPipeFds[FD_WRITE], -1);
    EXPECT_NE(node().fd, -1);  // the caller closes the device
}

}  // namespace
