// What monitoring sees of the transport and the loop: exchanges counted by
// result, whether a pass reached the controller, when each cache was refreshed.

#include <errno.h>

#include "IpmiIfc.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using Result = IpmiIfc::IPMI_EXCHANGE_RESULT;

class LoopWatch : public TestSupport::SimTest {};

class LoopWatchWithLoop : public TestSupport::SimTest {
protected:
    LoopWatchWithLoop() { openDevice = false; }
};

std::vector<uint64_t> exchangeCounts() {
    std::vector<uint64_t> out;
    for (int r = 0; r < IpmiIfc::IPMI_EXCHANGE_RESULT_COUNT; ++r)
        out.push_back(IpmiIfc::getExchangeCount(static_cast<Result>(r)));
    return out;
}

TEST_F(LoopWatch, EachExchangeCountsOnceUnderItsResult) {
    struct Case {
        const char* what;
        bool faulted;
        Sim::Fault fault;
        Result result;
    };
    const Case cases[] = {
        {"answered", false, Sim::Fault(), IpmiIfc::IPMI_EXCHANGE_OK},
        {"invalid command", true, Sim::Fault::completionCode(0xC1), IpmiIfc::IPMI_EXCHANGE_COMPLETION_CODE},
        {"the driver's time-out code", true, Sim::Fault::completionCode(0xC3), IpmiIfc::IPMI_EXCHANGE_TIMEOUT},
        {"no answer", true, Sim::Fault::of(Sim::FaultKind::NoAnswer), IpmiIfc::IPMI_EXCHANGE_TIMEOUT},
        {"send fails", true, Sim::Fault::errnoFault(Sim::FaultKind::SendError, EIO), IpmiIfc::IPMI_EXCHANGE_ERROR},
        {"receive fails", true, Sim::Fault::errnoFault(Sim::FaultKind::ReceiveError, EIO),
         IpmiIfc::IPMI_EXCHANGE_ERROR},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        if (c.faulted) sim().addFault(netfn::app, cmd::getDeviceId, c.fault);
        const std::vector<uint64_t> before = exchangeCounts();
        uint8_t answer[32];
        uint16_t length = sizeof answer;
        IpmiIfc::sendCmd(cmd::getDeviceId, netfn::app, 0, nullptr, &length, answer);
        const std::vector<uint64_t> after = exchangeCounts();
        for (int r = 0; r < IpmiIfc::IPMI_EXCHANGE_RESULT_COUNT; ++r)
            EXPECT_EQ(after[r] - before[r], r == c.result ? 1u : 0u) << "result " << r;
    }
}

// A silent controller: the pass still ends (after ten Get SEL Info tries a
// second apart) but did not reach it, and no cache counts as refreshed. (The
// pass's duration is on the monotonic clock, which stays real here;
// scripts/prometheus-test.sh checks it.)
TEST_F(LoopWatchWithLoop, PassesAndCachesAreStampedOnlyWhenTheControllerAnswers) {
    useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
    TestSupport::LoopThread loop(1);
    ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING);
    TestSupport::waitUntil([] { return IpmiIfc::getLastPassTime() > 0; });
    EXPECT_TRUE(IpmiIfc::lastPassReachedController());
    std::vector<double> refreshed;
    for (int c = 0; c < IpmiIfc::IPMI_CACHE_COUNT; ++c) {
        refreshed.push_back(IpmiIfc::getCacheRefreshTime(static_cast<IpmiIfc::IPMI_CACHE>(c)));
        EXPECT_GT(refreshed.back(), 0) << "cache " << c;
    }
    const double answered = IpmiIfc::getLastSuccessfulPassTime();
    EXPECT_EQ(answered, IpmiIfc::getLastPassTime());

    sim().addFault(Sim::kAnyCommand, Sim::kAnyCommand, Sim::Fault::completionCode(0xC3, -1));
    bool shutdown = false;
    IpmiIfc::pollAll(1, true, IPMI_POLL_FULL, &shutdown);
    EXPECT_FALSE(IpmiIfc::lastPassReachedController());
    EXPECT_EQ(IpmiIfc::getLastSuccessfulPassTime(), answered);
    EXPECT_GT(IpmiIfc::getLastPassTime(), answered);
    for (int c = 0; c < IpmiIfc::IPMI_CACHE_COUNT; ++c)
        EXPECT_EQ(IpmiIfc::getCacheRefreshTime(static_cast<IpmiIfc::IPMI_CACHE>(c)), refreshed[c]) << "cache " << c;

    sim().clearFaults();
    IpmiIfc::pollAll(1, true, IPMI_POLL_FULL, &shutdown);
    EXPECT_TRUE(IpmiIfc::lastPassReachedController());
    EXPECT_GT(IpmiIfc::getLastSuccessfulPassTime(), answered);
    for (int c = 0; c < IpmiIfc::IPMI_CACHE_COUNT; ++c)
        EXPECT_GT(IpmiIfc::getCacheRefreshTime(static_cast<IpmiIfc::IPMI_CACHE>(c)), refreshed[c]) << "cache " << c;
}

}  // namespace
