#include <gtest/gtest.h>

#include <errno.h>
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <thread>

#include "TestSupport.h"

using namespace Ipmi;

namespace {

// The interface started on a thread of the test, as a host process does.
class LoopThread {
public:
    explicit LoopThread(int interval)
        : thread_([this, interval] {
              try {
                  IpmiIfc::start(0, interval);
              } catch (const kelInt::CmpiStatus& s) {
                  failure_ = s.rc();
              }
          }) {}
    ~LoopThread() {
        if (!stopped_) stop();
        thread_.join();
    }
    void stop() {
        stopped_ = true;
        IpmiIfc::stop();
    }
    int failure() const { return failure_; }

private:
    std::atomic<int> failure_{0};
    bool stopped_ = false;
    std::thread thread_;
};

class Lifecycle : public TestSupport::SimTest {
protected:
    Lifecycle() { openDevice = false; }

    // One normal pass of the loop, waited for.
    void pass() {
        bool shutdown = false;
        IpmiIfc::pollAll(1, true, IPMI_POLL_NORMAL, &shutdown);
    }
    template <typename Pred>
    void waitUntil(Pred done) {
        while (!done()) std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    static double realSecondsSince(std::chrono::steady_clock::time_point t) {
        return std::chrono::duration<double>(std::chrono::steady_clock::now() - t).count();
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
        if (!log.contains(LOG_ERR, "CmpiStatus error 2 Only root user allowed")) _exit(13);
        if (!log.contains(LOG_DEBUG, "Node 0: IpmiIfc polling thread stopped.")) _exit(14);
        if (sim().totalExchanges() != 0) _exit(15);
        _exit(0);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 0) << "10 setuid, 11 rc, 12 state, 13/14 log, 15 device used";
}

TEST_F(Lifecycle, MissingDeviceStopsWithoutLoop) {
    sim().failOpen(ENOENT);
    IpmiIfc::start(0, 1);  // returns: there is no loop to run
    EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_STOPPED);
    EXPECT_TRUE(log.contains(LOG_INFO, "Node 0: Unable to open node, Error(2):No such file or directory"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Node 0: IpmiIfc polling thread stopped."));
    EXPECT_EQ(log.count("Node 0: IpmiIfc::poll called"), 0u);
    EXPECT_EQ(sim().totalExchanges(), 0u);

    IpmiIfc::stop();  // the interface is stopped already: stop only cleans up
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 1u) << log.dump();  // the failed open itself
    EXPECT_EQ(node().signalCmdPipeFds[FD_READ], -1);
}

TEST_F(Lifecycle, StartRunsTheLoopUntilStop) {
    {
        LoopThread loop(1);
        ASSERT_EQ(IpmiIfc::waitState(IpmiIfc::IPMI_STATE_RUNNING | IpmiIfc::IPMI_STATE_STOPPED),
                  IpmiIfc::IPMI_STATE_RUNNING);
        EXPECT_EQ(sim().requests().front().cmd, cmd::getDeviceId);

        // A transport wait blocks on the pipe's read end; stop never blocks on its write end.
        EXPECT_EQ(fcntl(node().signalCmdPipeFds[FD_READ], F_GETFL) & O_NONBLOCK, 0);
        EXPECT_NE(fcntl(node().signalCmdPipeFds[FD_WRITE], F_GETFL) & O_NONBLOCK, 0);

        // Passes every 16 virtual seconds (real time counts towards each): the preamble's read plus three.
        waitUntil([&] { return sim().exchanges(netfn::storage, cmd::getSelInfo) >= 4; });
        EXPECT_GE(virtualSecondsElapsed(), 47.0);

        loop.stop();  // returns once the loop has ended
        EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_STOPPED);
        EXPECT_TRUE(log.contains(LOG_DEBUG, "Poll loop ended, shutting down"));
    }
    EXPECT_TRUE(log.contains(LOG_DEBUG, "start: Node 0: IpmiIfc initialization complete"));
    for (const char* line : {"Node 0: IpmiIfc shutting down", "Poll loop ended, shutting down",
                             "Node 0: IpmiIfc poll thread exiting", "Node 0: IpmiIfc polling thread stopped."})
        EXPECT_TRUE(log.contains(LOG_DEBUG, line)) << line;
    EXPECT_EQ(node().fd, -1);
    EXPECT_EQ(node().signalCmdPipeFds[FD_READ], -1);
    EXPECT_EQ(node().signalCmdPipeFds[FD_WRITE], -1);
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u) << log.dump();
}

TEST_F(Lifecycle, StopFreesTheHandlerList) {
    LoopThread loop(0);
    ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING);
    int context = 0;
    ASSERT_EQ(IpmiIfc::registerSelEventHandler([](void*, IpmiSelData*) {}, &context), 0);
    loop.stop();
    EXPECT_EQ(node().work.sel_handlers, nullptr);
}

TEST_F(Lifecycle, SecondStopIsMisuse) {
    LoopThread loop(0);
    ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING);
    loop.stop();
    try {
        IpmiIfc::stop();
        FAIL() << "no exception";
    } catch (const kelInt::CmpiStatus& s) {
        EXPECT_EQ(s.rc(), CMPI_RC_ERROR);
    }
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 200 IpmiIfc::stop called twice"));
}

// The exchange waits in real time; stop must end it at once, not after 30 seconds.
TEST_F(Lifecycle, StopEndsTheLoopsHungExchange) {
    LoopThread loop(0);
    ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING);
    pass();
    const unsigned before = sim().exchanges(netfn::storage, cmd::getSelInfo);
    sim().addFault(netfn::storage, cmd::getSelInfo, Sim::Fault::of(Sim::FaultKind::Hang));
    waitUntil([&] {
        IpmiIfc::doPoll();  // repeated: a wake-up while the loop is busy is lost
        return sim().exchanges(netfn::storage, cmd::getSelInfo) > before;
    });

    auto t0 = std::chrono::steady_clock::now();
    loop.stop();
    EXPECT_LT(realSecondsSince(t0), 5.0);
    EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_STOPPED);
    for (const auto& line : log.lines()) EXPECT_EQ(line.text.find("timeout with no reply"), std::string::npos);
    EXPECT_EQ(log.count("Could not get SEL info for node 0 after 10 tries"), 0u);
}

TEST_F(Lifecycle, StopEndsACallersHungExchange) {
    LoopThread loop(0);
    ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING);
    pass();
    sim().addFault(netfn::app, cmd::getDeviceId, Sim::Fault::of(Sim::FaultKind::Hang));
    const unsigned before = sim().exchanges(netfn::app, cmd::getDeviceId);
    std::atomic<int> result{-1};
    std::thread caller([&] {
        uint8_t answer[20];
        uint16_t length = sizeof answer;
        result = IpmiIfc::sendCmd(cmd::getDeviceId, netfn::app, 0, nullptr, &length, answer);
    });
    waitUntil([&] { return sim().exchanges(netfn::app, cmd::getDeviceId) > before; });

    auto t0 = std::chrono::steady_clock::now();
    loop.stop();
    caller.join();
    EXPECT_LT(realSecondsSince(t0), 5.0);
    EXPECT_EQ(result.load(), 255);
    EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_STOPPED);
}

TEST_F(Lifecycle, CommandLineModeNeedsNoLoop) {
    ASSERT_GE(IpmiIfcOpenIpmiOpen(0), 0);
    ASSERT_EQ(IpmiIfcInitForCLI(0), 0);
    EXPECT_EQ(IpmiIfc::getState(), IpmiIfc::IPMI_STATE_CLI);
    EXPECT_NE(node().signalCmdPipeFds[FD_READ], -1);
    EXPECT_EQ(node().myAddress, 0x20u);

    uint8_t answer[20];
    uint16_t length = sizeof answer;
    EXPECT_EQ(IpmiIfc::sendCmd(cmd::getDeviceId, netfn::app, 0, nullptr, &length, answer), 0);

    IpmiIfcCloseForCLI(0);
    EXPECT_EQ(node().signalCmdPipeFds[FD_READ], -1);
    EXPECT_EQ(node().signalCmdPipeFds[FD_WRITE], -1);
    EXPECT_NE(node().fd, -1);  // the caller closes the device
}

}  // namespace
