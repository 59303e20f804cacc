#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <stdexcept>
#include <thread>
#include <vector>

#include "TestSupport.h"

using namespace Ipmi;

namespace {

// The interface started on a thread of the test, as a host process does.
class LoopThread {
public:
    explicit LoopThread(int interval)
        : thread_([interval] {
              try {
                  IpmiIfc::start(0, interval);
              } catch (const kelInt::CmpiStatus&) {
              }
          }) {}
    ~LoopThread() {
        IpmiIfc::stop();
        thread_.join();
    }

private:
    std::thread thread_;
};

// What one pass of the loop did, as the controller and the log show it.
struct PassWork {
    bool periodic;  // the "new events detected or skip count exceeded" pass
    bool sdr;       // Get SDR Repository Info sent
    bool fru;       // FRU reload
    bool lan;       // LAN settings read
};

class PollLoop : public TestSupport::SimTest {
protected:
    PollLoop() { openDevice = false; }

    // Returns once the loop's preamble has read the LAN settings (six
    // parameters of the plain controller), its last exchange before it waits.
    void startLoop(int interval) {
        loop_.reset(new LoopThread(interval));
        ASSERT_EQ(IpmiIfc::waitState(IpmiIfc::IPMI_STATE_RUNNING | IpmiIfc::IPMI_STATE_STOPPED),
                  IpmiIfc::IPMI_STATE_RUNNING);
        waitUntil([] { return Sim::Simulator::instance().exchanges(netfn::transport, cmd::getLanConfigParameters) >= 6; });
    }
    void TearDown() override {
        loop_.reset();
        SimTest::TearDown();
    }

    size_t linesStartingWith(const std::string& prefix) const {
        size_t n = 0;
        for (const auto& l : log.lines())
            if (l.text.compare(0, prefix.size(), prefix) == 0) ++n;
        return n;
    }

    struct Counts {
        size_t periodic, fru;
        unsigned sdr, lan;
    };
    Counts counts() const {
        return Counts{linesStartingWith("IpmiIfc::poll - new events detected or skip count exceeded"),
                      log.count("IpmiIfc::poll - Refreshing FRU"),
                      Sim::Simulator::instance().exchanges(netfn::storage, cmd::getSdrRepositoryInfo),
                      Sim::Simulator::instance().exchanges(netfn::transport, cmd::getLanConfigParameters)};
    }

    // Asks for one pass and waits until the loop has done it.
    PassWork pass(IPMI_POLL_TYPE type = IPMI_POLL_NORMAL) {
        Counts before = counts();
        bool shutdown = false;
        IpmiIfc::pollAll(1, true, type, &shutdown);
        Counts after = counts();
        return PassWork{after.periodic > before.periodic, after.sdr > before.sdr, after.fru > before.fru,
                        after.lan > before.lan};
    }

    template <typename Pred>
    void waitUntil(Pred done) {
        while (!done()) std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }

    std::unique_ptr<LoopThread> loop_;
};

TEST_F(PollLoop, IntervalIsCountedInSixteenSecondUnits) {
    startLoop(1);
    waitUntil([&] { return log.count("Node 0: IpmiIfc::poll woke up.") >= 2; });
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Node 0: IpmiIfc::poll sleeping for 16 second(s)"));
    EXPECT_GE(virtualSecondsElapsed(), 31.0);  // real time counts towards each sleep
    EXPECT_LT(virtualSecondsElapsed(), 100.0);
}

TEST_F(PollLoop, NoIntervalWaitsForAWakeUp) {
    startLoop(-1);
    pass();
    const unsigned before = sim().exchanges(netfn::storage, cmd::getSelInfo);
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSelInfo), before);
    // pollAll's own waits move virtual time on while a pass runs, so the
    // proof that the loop did not time out is that it never armed a sleep.
    EXPECT_EQ(linesStartingWith("Node 0: IpmiIfc::poll sleeping for"), 0u);
    // A wake-up that comes while the loop is still busy is lost by design: repeat it.
    waitUntil([&] {
        IpmiIfc::doPoll();
        return sim().exchanges(netfn::storage, cmd::getSelInfo) > before;
    });
}

TEST_F(PollLoop, NewIntervalWakesTheLoopAndSetsTheNextSleep) {
    startLoop(0);
    pass();
    EXPECT_EQ(IpmiIfc::getPollingInterval(), 0);
    IpmiIfc::setPollingInterval(2);
    EXPECT_EQ(IpmiIfc::getPollingInterval(3), 2);
    waitUntil([&] { return log.contains(LOG_DEBUG, "Node 0: IpmiIfc::poll sleeping for 32 second(s)"); });
}

TEST_F(PollLoop, SelCountDroppingToOneIsNoNews) {
    bmc().sel.entries = 5;
    startLoop(0);
    pass();
    bmc().sel.entries = 1;  // the loop waits between passes: pollAll orders this before its next read
    EXPECT_FALSE(pass().periodic);
    EXPECT_FALSE(pass().periodic);
}

TEST_F(PollLoop, FirstSelEntryIsNews) {
    startLoop(0);
    pass();
    bmc().sel.entries = 1;
    PassWork work = pass();
    EXPECT_TRUE(work.periodic);
    EXPECT_TRUE(work.fru);
    EXPECT_TRUE(log.contains(LOG_DEBUG,
                             "IpmiIfc::poll - new events detected or skip count exceeded (skipRemaining = 5, "
                             "entryCount = 1, lastEntryCount = 0)"));
}

// With both steps at 3: periodic passes every eighth pass; SDR and FRU
// reloads on the second periodic pass, then every third; new events at pass
// 20 restart the phase and reload at once, and again on the next periodic pass.
TEST_F(PollLoop, ReloadsFallOnTheirPasses) {
    SKIP_SDR_STEP = 3;
    SKIP_FRU_STEP = 3;
    startLoop(0);
    std::vector<int> periodic, sdr, fru, lan;
    for (int i = 1; i <= 70; ++i) {
        if (i == 20) bmc().sel.entries = 3;
        PassWork w = pass();
        if (w.periodic) periodic.push_back(i);
        if (w.sdr) sdr.push_back(i);
        if (w.fru) fru.push_back(i);
        if (w.lan) lan.push_back(i);
    }
    EXPECT_EQ(periodic, (std::vector<int>{7, 15, 20, 28, 36, 44, 52, 60, 68}));
    EXPECT_EQ(sdr, (std::vector<int>{15, 20, 28, 52}));
    EXPECT_EQ(fru, (std::vector<int>{15, 20, 28, 52}));
    EXPECT_EQ(lan, periodic);
}

TEST_F(PollLoop, FullPollRefreshesWithoutNews) {
    startLoop(0);
    PassWork w = pass(IPMI_POLL_FULL);
    EXPECT_TRUE(w.periodic && w.sdr && w.fru && w.lan);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Triggering poll for node 0, poll count = 1"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "pollAll: Nodes done polling"));
    // The phase restarted: the next periodic pass is eight passes on.
    std::vector<int> periodic;
    for (int i = 1; i <= 8; ++i)
        if (pass().periodic) periodic.push_back(i);
    EXPECT_EQ(periodic, (std::vector<int>{8}));
}

TEST_F(PollLoop, SelOnlyPollPostponesThePeriodicPass) {
    startLoop(0);
    for (int i = 1; i <= 6; ++i) ASSERT_FALSE(pass().periodic);
    EXPECT_FALSE(pass(IPMI_POLL_SEL).periodic);  // would have been the periodic pass
    EXPECT_TRUE(pass().periodic);
    EXPECT_EQ(log.count("Going to do FULL POLL for node 0"), 2u);
}

TEST_F(PollLoop, ParallelPollAllWaitsForThePass) {
    startLoop(0);
    const unsigned before = sim().exchanges(netfn::storage, cmd::getSelInfo);
    bool shutdown = false;
    IpmiIfc::pollAll(1, false, IPMI_POLL_NORMAL, &shutdown);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSelInfo), before + 1);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Running threads in parallel. Waiting for nodes to poll"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "pollAll: Nodes done polling"));
}

TEST_F(PollLoop, PollAllGivesUpWaitingOnShutdown) {
    bool shutdown = false;
    std::thread waiter([&] { IpmiIfc::pollAll(1, true, IPMI_POLL_FULL, &shutdown); });
    waitUntil([&] { return log.count("Still waiting for poll thread for node 0 to start (500 tries") > 0; });
    __atomic_store_n(&shutdown, true, __ATOMIC_RELEASE);
    waiter.join();
    EXPECT_TRUE(log.contains(LOG_WARNING, "Still waiting for poll thread for node 0 to start (500 tries"));
    EXPECT_TRUE(log.contains(LOG_INFO, "Waiting for poll thread for node 0 to start"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Shutdown signal received. Returning from IpmiIfc::pollAll()"));
}

TEST_F(PollLoop, NonePollDoesNothing) {
    startLoop(0);
    pass();
    const unsigned before = sim().totalExchanges();
    bool shutdown = false;
    std::thread waiter([&] { IpmiIfc::pollAll(1, true, IPMI_POLL_NONE, &shutdown); });
    waitUntil([&] { return log.count("Poll signaled for Node 0 with poll type NONE. No poll performed") > 0; });
    __atomic_store_n(&shutdown, true, __ATOMIC_RELEASE);
    waiter.join();
    EXPECT_EQ(sim().totalExchanges(), before);
}

TEST_F(PollLoop, SelInfoIsRetriedTenTimes) {
    startLoop(0);
    pass();
    const unsigned before = sim().exchanges(netfn::storage, cmd::getSelInfo);
    const double t0 = virtualSecondsElapsed();
    sim().addFault(netfn::storage, cmd::getSelInfo, Sim::Fault::completionCode(cc::nodeBusy, 10));
    pass();
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSelInfo), before + 10);
    EXPECT_EQ(log.count("Retrying IpmiIfcSelGetInfo"), 1u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "Could not get SEL info for node 0 after 10 tries"));
    EXPECT_EQ(log.count("IpmiIfcSelGetInfo: IPMI_CMD_GET_SEL_INFO cc=0xc0"), 0u);  // busy is normal
    EXPECT_GE(virtualSecondsElapsed() - t0, 9.0);
}

TEST_F(PollLoop, UnexpectedSelInfoCodeIsLoggedAndRetried) {
    startLoop(0);
    pass();
    const unsigned before = sim().exchanges(netfn::storage, cmd::getSelInfo);
    sim().addFault(netfn::storage, cmd::getSelInfo, Sim::Fault::completionCode(cc::invalidCommand));
    pass();
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSelInfo), before + 2);
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcSelGetInfo: IPMI_CMD_GET_SEL_INFO cc=0xc1"));
}

struct HandlerLog {
    std::atomic<int> calls{0};
    std::atomic<int> withRecord{0};
};

void countingHandler(void* context, IpmiSelData* record) {
    auto* h = static_cast<HandlerLog*>(context);
    h->calls++;
    if (record) h->withRecord++;
}

void otherCountingHandler(void* context, IpmiSelData* record) { countingHandler(context, record); }

void failingHandler(void*, IpmiSelData*) { throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED); }

void brokenHandler(void*, IpmiSelData*) { throw std::runtime_error("broken"); }

TEST_F(PollLoop, HandlersAreCalledWithoutRecordOnPeriodicPasses) {
    startLoop(0);  // start clears the node record: register afterwards
    HandlerLog a;
    ASSERT_EQ(IpmiIfc::registerSelEventHandler(countingHandler, &a), 0);
    for (int i = 1; i <= 8; ++i) pass();
    EXPECT_EQ(a.calls.load(), 1);  // pass 7 only
    pass(IPMI_POLL_FULL);
    EXPECT_EQ(a.calls.load(), 2);
    EXPECT_EQ(a.withRecord.load(), 0);
}

// The list is newest first: a throwing handler keeps older ones from running.
TEST_F(PollLoop, ThrowingHandlerEndsTheWalkForThatPass) {
    startLoop(0);
    HandlerLog a;
    IpmiIfc::registerSelEventHandler(countingHandler, &a);
    IpmiIfc::registerSelEventHandler(failingHandler, nullptr);
    PassWork w = pass(IPMI_POLL_FULL);
    EXPECT_EQ(a.calls.load(), 0);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Event handler ran into issues: (null)(1)"));
    EXPECT_TRUE(w.fru && w.lan);  // the pass went on

    IpmiIfc::unRegisterSelEventHandler(failingHandler);
    IpmiIfc::registerSelEventHandler(brokenHandler, nullptr);
    pass(IPMI_POLL_FULL);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Event handler ran into issues"));
    EXPECT_EQ(a.calls.load(), 0);
}

TEST_F(PollLoop, HandlerRegistrationRules) {
    startLoop(0);
    HandlerLog first, second;
    EXPECT_EQ(IpmiIfc::registerSelEventHandler(nullptr, &first), 5);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(nullptr), 5);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(countingHandler), 2);
    EXPECT_EQ(IpmiIfc::registerSelEventHandler(countingHandler, &first), 0);
    EXPECT_EQ(IpmiIfc::registerSelEventHandler(2, countingHandler, &second), 0);  // same function: kept once
    pass(IPMI_POLL_FULL);
    EXPECT_EQ(first.calls.load(), 1);
    EXPECT_EQ(second.calls.load(), 0);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(countingHandler), 0);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(countingHandler), 2);
}

// Registered A, B, C (list C, B, A): removing A also unlinks B.
TEST_F(PollLoop, UnregisteringTheTailAlsoDropsTheMiddle) {
    HandlerLog a, b, c;
    IpmiIfc::registerSelEventHandler(countingHandler, &a);
    IpmiIfc::registerSelEventHandler(otherCountingHandler, &b);
    IpmiIfc::registerSelEventHandler(failingHandler, &c);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(countingHandler), 0);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(otherCountingHandler), 2);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(failingHandler), 0);
    EXPECT_EQ(node().work.sel_handlers, nullptr);
}

TEST_F(PollLoop, SelInfoAnswersAreStored) {
    ASSERT_GE(IpmiIfcOpenIpmiOpen(0), 0);
    bmc().sel.entries = 300;
    bmc().sel.additionTimestamp = 0x01020304;
    uint16_t count = 0;
    ASSERT_EQ(IpmiIfcSelGetInfo(0, &count), 0u);
    EXPECT_EQ(count, 44);  // the low byte only
    const uint8_t* header = node().work.sel.header;
    EXPECT_EQ(header[1], 0x51);
    EXPECT_EQ(header[2] | (header[3] << 8), 300);
    EXPECT_EQ(header[6], 0x04);
    EXPECT_EQ(header[9], 0x01);

    IpmiIfcDataGet(7);
    const uint8_t* alloc = node().work.sel.alloc_info;
    EXPECT_EQ(alloc[1] | (alloc[2] << 8), 1024);  // allocation units
    EXPECT_EQ(alloc[3] | (alloc[4] << 8), 16);    // unit size
    EXPECT_EQ(alloc[5] | (alloc[6] << 8), 1024 - 300);

    sim().addFault(netfn::storage, cmd::getSelInfo, Sim::Fault::completionCode(cc::requestedSensorNotPresent));
    EXPECT_EQ(IpmiIfcSelGetInfo(0, &count), 0xFFFFFFFFu);
    EXPECT_EQ(log.count("IpmiIfcSelGetInfo: IPMI_CMD_GET_SEL_INFO cc=0xcb"), 0u);  // normal at start-up
    IpmiIfcOpenIpmiClose(0);
}

}  // namespace
