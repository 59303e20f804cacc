#include <sys/time.h>

#include <atomic>
#include <stdexcept>
#include <vector>

#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::waitUntil;

namespace {

// What one pass of the loop did, as the controller and the log show it.
struct PassWork {
    bool periodic, sdr, fru, lan;  // the "new events ... or skip count exceeded" pass; SDR info, FRU, LAN read
};

class PollLoop : public TestSupport::SimTest {
protected:
    PollLoop() { openDevice = false; }
    void TearDown() override {
        loop_.reset();
        SKIP_SDR_STEP = SKIP_FRU_STEP = 30;
        SimTest::TearDown();
    }
    // Returns once the loop's preamble has read the LAN settings (six
    // parameters of the plain controller), its last exchange before it waits.
    void startLoop(int interval) {
        loop_.reset(new TestSupport::LoopThread(interval));
        ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING);
        waitUntil([this] { return sim().exchanges(netfn::transport, cmd::getLanConfigParameters) >= 6; });
    }
    size_t linesStartingWith(const std::string& prefix) const {
        size_t n = 0;
        for (const auto& l : log.lines()) n += l.text.compare(0, prefix.size(), prefix) == 0;
        return n;
    }
    unsigned selReads() { return sim().exchanges(netfn::storage, cmd::getSelInfo); }
    std::vector<size_t> counts() {
        return {linesStartingWith("IpmiIfc::poll - new events detected or skip count exceeded"),
                sim().exchanges(netfn::storage, cmd::getSdrRepositoryInfo), log.count("IpmiIfc::poll - Refreshing FRU"),
                sim().exchanges(netfn::transport, cmd::getLanConfigParameters)};
    }
    // Asks for one pass and waits until the loop has done it.
    PassWork pass(IPMI_POLL_TYPE type = IPMI_POLL_NORMAL) {
        std::vector<size_t> before = counts();
        bool shutdown = false;
        IpmiIfc::pollAll(1, true, type, &shutdown);
        std::vector<size_t> after = counts();
        return PassWork{after[0] > before[0], after[1] > before[1], after[2] > before[2], after[3] > before[3]};
    }
    std::vector<int> periodicPasses(int count) {
        std::vector<int> out;
        for (int i = 1; i <= count; ++i)
            if (pass().periodic) out.push_back(i);
        return out;
    }
    std::unique_ptr<TestSupport::LoopThread> loop_;
};

// Each sleep ends at its deadline in virtual time of day, real time included.
TEST_F(PollLoop, IntervalIsCountedInSixteenSecondUnits) {
    auto now = [] {
        struct timeval tv;
        gettimeofday(&tv, nullptr);
        return static_cast<double>(tv.tv_sec) + tv.tv_usec / 1e6;
    };
    const double t0 = now();
    startLoop(1);
    waitUntil([&] { return log.count("Node 0: IpmiIfc::poll woke up.") >= 2; });
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Node 0: IpmiIfc::poll sleeping for 16 second(s)"));
    EXPECT_GE(now() - t0, 31.9);
}

// pollAll's own waits move virtual time while a pass runs, so the proof that
// the loop waited for a wake-up is that it never armed a sleep.
TEST_F(PollLoop, WithoutIntervalTheLoopWaitsForAWakeUp) {
    startLoop(-1);
    pass();
    EXPECT_EQ(linesStartingWith("Node 0: IpmiIfc::poll sleeping for"), 0u);
    const unsigned before = selReads();
    waitUntil([&] {
        IpmiIfc::doPoll();  // repeated: a wake-up while the loop is busy is lost
        return selReads() > before;
    });
    waitUntil([&] {
        IpmiIfc::setPollingInterval(2);  // wakes the loop, which then sleeps the new period
        return log.contains(LOG_DEBUG, "Node 0: IpmiIfc::poll sleeping for 32 second(s)");
    });
    EXPECT_EQ(IpmiIfc::getPollingInterval(3), 2);
}

// With both steps at 3: periodic passes every eighth pass; SDR and FRU
// reloads on the second periodic pass, then every third. A SEL count from 0
// to 1 (pass 20) and from 1 to 5 (pass 30) is news: the phase restarts, with
// reloads at once and again on the next periodic pass; from 5 to 1 (pass 45,
// a log cleared down to its clear-event record) is not.
TEST_F(PollLoop, ReloadsFallOnTheirPasses) {
    SKIP_SDR_STEP = 3;
    SKIP_FRU_STEP = 3;
    startLoop(0);
    std::vector<int> periodic, sdr, fru, lan;
    for (int i = 1; i <= 70; ++i) {
        if (i == 20 || i == 30 || i == 45) bmc().sel.entries = i == 30 ? 5 : 1;
        PassWork w = pass();  // pollAll orders the change before the pass's read
        if (w.periodic) periodic.push_back(i);
        if (w.sdr) sdr.push_back(i);
        if (w.fru) fru.push_back(i);
        if (w.lan) lan.push_back(i);
    }
    EXPECT_EQ(periodic, (std::vector<int>{7, 15, 20, 28, 30, 38, 46, 54, 62, 70}));
    EXPECT_EQ(sdr, (std::vector<int>{15, 20, 28, 30, 38, 62}));
    EXPECT_EQ(fru, sdr);
    EXPECT_EQ(lan, periodic);
}

TEST_F(PollLoop, FullAndSelOnlyPolls) {
    startLoop(0);
    PassWork w = pass(IPMI_POLL_FULL);  // a full refresh without news, done when pollAll returns
    EXPECT_TRUE(w.periodic && w.sdr && w.fru && w.lan);
    EXPECT_EQ(periodicPasses(7), std::vector<int>{});  // the phase restarted
    EXPECT_FALSE(pass(IPMI_POLL_SEL).periodic);  // would have been periodic: postponed
    EXPECT_EQ(periodicPasses(1), std::vector<int>{1});

    const unsigned before = selReads();
    bool shutdown = false;
    IpmiIfc::pollAll(1, false, IPMI_POLL_NORMAL, &shutdown);  // in parallel mode too
    EXPECT_EQ(selReads(), before + 1);
}

TEST_F(PollLoop, PollAllReturnsOnShutdown) {
    node().pollCount = 0;  // no loop has started
    bool shutdown = false;
    auto pollAllUntilShutdown = [&](IPMI_POLL_TYPE type, const std::string& seen) {
        std::thread waiter([&] { IpmiIfc::pollAll(1, true, type, &shutdown); });
        waitUntil([&] { return log.count(seen) > 0; });
        __atomic_store_n(&shutdown, true, __ATOMIC_RELEASE);
        waiter.join();
        shutdown = false;
    };
    pollAllUntilShutdown(IPMI_POLL_FULL, "Still waiting for poll thread for node 0 to start (500 tries");
    EXPECT_TRUE(log.contains(LOG_WARNING, "Still waiting for poll thread for node 0 to start (500 tries"));

    startLoop(0);
    pass();
    const unsigned before = sim().totalExchanges();
    // A NONE wake-up does no pass, so pollAll waits until it is told to stop.
    pollAllUntilShutdown(IPMI_POLL_NONE, "Poll signaled for Node 0 with poll type NONE. No poll performed");
    EXPECT_EQ(sim().totalExchanges(), before);
}

TEST_F(PollLoop, SelInfoFailuresAreRetried) {
    startLoop(0);
    pass();
    const unsigned before = selReads();
    sim().addFault(netfn::storage, cmd::getSelInfo, Sim::Fault::completionCode(cc::nodeBusy, 10));
    pass();
    EXPECT_EQ(selReads(), before + 10);
    EXPECT_EQ(log.count("Retrying IpmiIfcSelGetInfo"), 1u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "Could not get SEL info for node 0 after 10 tries"));
    EXPECT_EQ(log.count("IpmiIfcSelGetInfo: IPMI_CMD_GET_SEL_INFO cc=0xc0"), 0u);  // busy is normal
}

TEST_F(PollLoop, SelInfoAnswersAreStored) {
    ASSERT_GE(IpmiIfcOpenIpmiOpen(0), 0);
    bmc().sel.entries = 300;
    bmc().sel.additionTimestamp = 1000;  // a log that never changed is not stored
    uint16_t count = 0;
    ASSERT_EQ(IpmiIfcSelGetInfo(0, &count), 0u);
    EXPECT_EQ(count, 44);  // the low byte only
    EXPECT_EQ(node().work.sel.header[2] | (node().work.sel.header[3] << 8), 300);
    IpmiIfcDataGet(7);
    EXPECT_EQ(node().work.sel.alloc_info[5] | (node().work.sel.alloc_info[6] << 8), 1024 - 300);  // free units
    sim().addFault(netfn::storage, cmd::getSelInfo, Sim::Fault::completionCode(cc::requestedSensorNotPresent));
    EXPECT_EQ(IpmiIfcSelGetInfo(0, &count), 0xFFFFFFFFu);
    EXPECT_EQ(log.count("IpmiIfcSelGetInfo: IPMI_CMD_GET_SEL_INFO cc=0xcb"), 0u);  // normal at start-up
}

// A call with a record would count 1000.
void counting(void* calls, IpmiSelData* record) { *static_cast<std::atomic<int>*>(calls) += record ? 1000 : 1; }
void otherCounting(void* calls, IpmiSelData* record) { counting(calls, record); }
void failing(void*, IpmiSelData*) { throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED); }
void broken(void*, IpmiSelData*) { throw std::runtime_error("broken"); }

// The list is newest first: a throwing handler keeps older ones from running.
TEST_F(PollLoop, HandlersRunWithoutRecordOnPeriodicPasses) {
    startLoop(0);  // start clears the node record: register afterwards
    std::atomic<int> a{0}, b{0};
    EXPECT_EQ(IpmiIfc::registerSelEventHandler(counting, &a), 0);
    EXPECT_EQ(IpmiIfc::registerSelEventHandler(2, counting, &b), 0);  // same function: kept once
    for (int i = 1; i <= 8; ++i) pass();
    EXPECT_EQ(a.load(), 1);  // pass 7 only
    EXPECT_EQ(b.load(), 0);

    IpmiIfc::registerSelEventHandler(failing, nullptr);
    PassWork w = pass(IPMI_POLL_FULL);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Event handler ran into issues: (null)(1)"));
    EXPECT_TRUE(w.fru && w.lan);  // the pass went on
    IpmiIfc::unRegisterSelEventHandler(failing);
    IpmiIfc::registerSelEventHandler(broken, nullptr);
    pass(IPMI_POLL_FULL);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Event handler ran into issues"));
    EXPECT_EQ(a.load(), 1);
}

// Registered A, B, C (list C, B, A): removing A also unlinks B.
TEST_F(PollLoop, HandlerRegistrationRules) {
    std::atomic<int> a{0};
    EXPECT_EQ(IpmiIfc::registerSelEventHandler(nullptr, &a), 5);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(nullptr), 5);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(counting), 2);
    for (auto h : {counting, otherCounting, failing}) IpmiIfc::registerSelEventHandler(h, &a);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(counting), 0);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(otherCounting), 2);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(failing), 0);
    EXPECT_EQ(node().work.sel_handlers, nullptr);
}

}  // namespace
