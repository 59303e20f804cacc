// Sensors talking to a controller: readings, states, thresholds, event
// enables, re-arm and hysteresis, as the controller and the caller see them.

#include <gtest/gtest.h>

#include <functional>

#include "CmpiStatus.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using Sim::Fault;
using Sim::FaultKind;
using TestSupport::SdrBuilder;
using Bytes = std::vector<uint8_t>;

constexpr uint8_t kNumber = 0x05;
constexpr uint8_t se = netfn::sensorEvent;

// Full threshold record of sensor 5 on the BMC: M = 1, B = 0, linear; all
// thresholds readable, LC and UC settable (defaults 10 and 90), hysteresis settable.
SdrBuilder thresholdRecord() {
    return SdrBuilder::full()
        .set(sdr::key::sensorNumber, kNumber).types(0x01, sdr::eventReadingTypeThreshold)
        .set(sdr::sensor::capabilities, 0x28)  // hysteresis settable, thresholds readable and settable
        .set(sdr::sensor::readableThresholds, 0x3F)
        .set(sdr::sensor::settableThresholds, sdr::bits::lowerCritical | sdr::bits::upperCritical)
        .set(sdr::full::mLow, 1).set(sdr::full::upperCritical, 90).set(sdr::full::lowerCritical, 10);
}

class SensorTest : public TestSupport::SimTest {
protected:
    void SetUp() override {
        SimTest::SetUp();
        Sim::SensorModel t;
        t.number = kNumber;
        t.eventReadingType = sdr::eventReadingTypeThreshold;
        t.reading = 42;
        t.readableMask = 0x3F;
        t.settableMask = sdr::bits::lowerCritical | sdr::bits::upperCritical;
        t.thresholds[1] = 10;  // LC
        t.thresholds[4] = 90;  // UC
        t.hysteresisPositive = 2;
        t.hysteresisNegative = 3;
        bmc().sensors = {t};
    }
    Sim::SensorModel& model() { return bmc().sensors[0]; }
    template <class S>
    static S sensorOf(Bytes r) { return S(0, r.data(), static_cast<int>(r.size())); }
    IpmiThresholdSensor threshold() { return sensorOf<IpmiThresholdSensor>(thresholdRecord()); }
    IpmiDiscreteSensor discrete() {
        return sensorOf<IpmiDiscreteSensor>(thresholdRecord().set(sdr::sensor::capabilities, 0).types(0x07, 0x6F));
    }
    Bytes lastRequest() { return sim().requests().back().data; }
    // The message of the CmpiStatus that `call` throws, as logged (msg() reads "(null)" without a broker).
    std::string failureOf(const std::function<void()>& call) {
        log.clear();
        try {
            call();
        } catch (const kelInt::CmpiStatus& e) {
            for (const auto& l : log.lines())
                if (e.rc() == CMPI_RC_ERR_FAILED && l.text.rfind("CmpiStatus error 1 ", 0) == 0) return l.text.substr(19);
            return "(no message)";
        }
        return "(no exception)";
    }
};

// Satellite owners are SensorDiscovery's and SensorOwner's.
TEST_F(SensorTest, ReadingIsAskedOfTheBmcUnlessSoftwareOwnsTheSensor) {
    auto s = threshold();
    EXPECT_EQ(42u, s.getReading());
    EXPECT_FALSE(sim().requests().back().viaIpmb);
    EXPECT_EQ(Bytes{kNumber}, lastRequest());
    std::string when;
    s.getReadingTime(when);
    EXPECT_TRUE(when.size() == 20 && when[4] == '-' && when[10] == 'T' && when[19] == 'Z') << when;

    const unsigned before = sim().totalExchanges();  // a software-owned sensor is never asked
    EXPECT_EQ(0u, sensorOf<IpmiThresholdSensor>(thresholdRecord().set(sdr::key::ownerId, 0x41)).getReading());
    EXPECT_EQ(before, sim().totalExchanges());
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiSensor::getSDReading no value read for sensor 5"));
}

// A failed reading is logged and thrown by the state getters; an absent sensor is no error.
TEST_F(SensorTest, StatesFollowTheReading) {
    auto t = threshold();
    int state = -1;
    for (const auto& c : std::vector<std::pair<uint16_t, int>>{{0x08, 10}, {0x01, 10}, {0x02, 25}, {0x20, 25}, {0, 5}}) {
        model().states = c.first;
        EXPECT_TRUE(t.getSensorState(state));
        EXPECT_EQ(c.second, state) << "states 0x" << std::hex << c.first;
    }
    model().states = 0x10;
    EXPECT_EQ(0x10u, t.getState(true));

    model().eventReadingType = 0x6F;  // discrete readings carry fifteen state bits
    model().states = 0x7F81;
    auto d = discrete();
    EXPECT_EQ(0x7F81u, d.getReading());
    EXPECT_EQ(0x7F81u, d.getState(true));
    model().states = 0x0102;  // an answer without byte 4: the previous answer's states do not linger
    sim().addFault(se, cmd::getSensorReading, Fault::answerLength(FaultKind::CutAnswer, 4));
    EXPECT_EQ(0x02u, d.getReading());
    model().states = 0;
    EXPECT_TRUE(d.getSensorState(state));
    EXPECT_EQ(5, state) << "no state asserted is OK";

    model().present = false;
    EXPECT_FALSE(t.getSensorState(state));
    EXPECT_EQ(0, state);
    EXPECT_EQ(0u, t.getState(true));
    EXPECT_EQ(0u, log.count("IpmiSensor::getSDReading no value read for sensor 5"));

    sim().addFault(se, cmd::getSensorReading, Fault::completionCode(cc::nodeBusy, -1));
    EXPECT_TRUE(t.getSensorState(state = -1));
    EXPECT_EQ(0, state);
    EXPECT_TRUE(log.contains(LOG_WARNING,
                             "IpmiSensor::getSDReading: unexpected return cc code for node: 0 cmd: 45/4 was 0xc0"));
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiSensor::getSDReading no value read for sensor 5"));
    EXPECT_EQ("Threshold Sensor reading not available", failureOf([&] { t.getState(false); }));
    EXPECT_EQ("Discrete Sensor reading not available", failureOf([&] { discrete().getState(true); }));
}

TEST_F(SensorTest, ThresholdsAreReadConvertedAndSetWhereSettable) {
    auto s = threshold();
    EXPECT_DOUBLE_EQ(90.0, s.getUpperCriticalThreshold(true));
    EXPECT_EQ(cmd::getSensorThresholds, sim().requests().back().cmd);
    EXPECT_EQ(Bytes{kNumber}, lastRequest());
    EXPECT_DOUBLE_EQ(10.0, s.getLowerCriticalThreshold());
    EXPECT_DOUBLE_EQ(0.0, s.getLowerNonCriticalThreshold()) << "readable in the SDR but not by the controller";
    sim().addFault(se, cmd::getSensorThresholds, Fault::answerLength(FaultKind::CutAnswer, 4));
    EXPECT_DOUBLE_EQ(0.0, s.getUpperCriticalThreshold()) << "bytes not sent read as 0, not as the last answer's";
    sim().addFault(se, cmd::getSensorThresholds, Fault::completionCode(cc::illegalForSensorType));
    EXPECT_EQ("Failed to get threshold reading", failureOf([&] { s.getUpperCriticalThreshold(); }));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "invalid command to sensor(0x5), cc = 0xcd"));

    auto partly = sensorOf<IpmiThresholdSensor>(thresholdRecord().set(sdr::sensor::readableThresholds, sdr::bits::upperCritical));
    const unsigned before = sim().totalExchanges();
    EXPECT_EQ("Threshold sensor does not support lower non-critical", failureOf([&] { partly.getLowerNonCriticalThreshold(); }));
    EXPECT_EQ("Threshold sensor does not support upper non-recoverable",
              failureOf([&] { partly.getUpperNonRecoverableThreshold(); }));
    EXPECT_EQ("Not a threshold sensor", failureOf([&] { discrete().getUpperCriticalThreshold(); }));
    EXPECT_EQ(before, sim().totalExchanges());

    // Only settable non-zero values are sent.
    EXPECT_EQ(0, s.setThresholds(1.0, 12.0, 3.0, 0.0, 95.0, 0.0));
    EXPECT_EQ(cmd::setSensorThresholds, sim().requests().back().cmd);
    EXPECT_EQ((Bytes{kNumber, 0x12, 0, 12, 0, 0, 95, 0}), lastRequest());
    EXPECT_EQ(95, model().thresholds[4]);
    EXPECT_EQ(0, s.restoreDefaultThresholds());
    EXPECT_EQ((Bytes{kNumber, 0x12, 0, 10, 0, 0, 90, 0}), lastRequest());

    model().settableMask = sdr::bits::upperCritical;  // the controller disagrees with the SDR
    EXPECT_EQ(cc::invalidDataField, s.setThresholds(0.0, 11.0, 0.0, 0.0, 0.0, 0.0));
    EXPECT_EQ(10, model().thresholds[1]);
    sim().addFault(se, cmd::setSensorThresholds, Fault::completionCode(cc::invalidCommand));
    EXPECT_EQ(1, s.setThresholds(0.0, 0.0, 0.0, 0.0, 91.0, 0.0));
    const unsigned unchanged = sim().totalExchanges();
    EXPECT_EQ(1, discrete().setThresholds(1.0, 1.0, 1.0, 1.0, 1.0, 1.0));
    EXPECT_EQ(1, discrete().restoreDefaultThresholds());
    EXPECT_EQ(unchanged, sim().totalExchanges());
}

// Event masks in the enable and re-arm commands keep 12 bits for a threshold
// sensor and 15 for a discrete one; the enable masks are read only while events are on.
TEST_F(SensorTest, EventEnablesAndRearmLimitTheMasksByClass) {
    auto t = threshold();
    EXPECT_EQ(0, t.rearmEvents());
    EXPECT_EQ((Bytes{kNumber, 0x00}), lastRequest());
    EXPECT_EQ(0, t.rearmEvents(0xFFFF, 0xFFFF));
    EXPECT_EQ((Bytes{kNumber, 0x80, 0xFF, 0x0F, 0xFF, 0x0F}), lastRequest());
    EXPECT_EQ(0, t.setEventEnable(0x90, 0xF234, 0x0FFF));  // enable selected
    EXPECT_EQ((Bytes{kNumber, 0x90, 0x34, 0x02, 0xFF, 0x0F}), lastRequest());
    auto enables = [&t] {  // rc, flags, assertion and deassertion masks
        unsigned char flags = 0;
        unsigned short assertMask = 0xAAAA, deassertMask = 0xBBBB;
        const int rc = t.getEventEnable(flags, assertMask, deassertMask);
        return std::vector<int>{rc, flags, assertMask, deassertMask};
    };
    EXPECT_EQ(enables(), (std::vector<int>{0, 0x80, 0x0234, 0x0FFF}));
    model().eventFlags = 0x40;  // scanning only
    EXPECT_EQ(enables(), (std::vector<int>{0, 0x40, 0xAAAA, 0xBBBB}));
    sim().addFault(se, cmd::getSensorEventEnable, Fault::completionCode(cc::invalidCommand));
    EXPECT_EQ(enables()[0], 1);

    model().eventReadingType = 0x6F;
    EXPECT_EQ(0, discrete().rearmEvents(0xFFFF, 0xFFFF));
    EXPECT_EQ((Bytes{kNumber, 0x80, 0xFF, 0x7F, 0xFF, 0x7F}), lastRequest());
    sim().addFault(se, cmd::rearmSensorEvents, Fault::completionCode(cc::illegalForSensorType));
    EXPECT_EQ(1, discrete().rearmEvents());
}

TEST_F(SensorTest, HysteresisIsCachedUntilAskedAfresh) {
    auto t = threshold();
    auto hysteresis = [&t](bool fresh) {  // rc, positive, negative
        unsigned char positive = 9, negative = 9;
        const int rc = t.getHysteresis(positive, negative, fresh);
        return std::vector<int>{rc, positive, negative};
    };
    EXPECT_EQ(hysteresis(false), (std::vector<int>{0, 0, 0}));  // never fetched: nothing asked
    EXPECT_EQ(0u, sim().totalExchanges());

    t.cacheHysteresis();
    EXPECT_EQ((Bytes{kNumber, 0xFF}), lastRequest());
    EXPECT_EQ(hysteresis(false), (std::vector<int>{0, 2, 3}));
    EXPECT_EQ(0, t.setHysteresis(4, 5));
    EXPECT_EQ((Bytes{kNumber, 0xFF, 4, 5}), lastRequest());
    EXPECT_EQ(hysteresis(false), (std::vector<int>{0, 2, 3})) << "setting does not touch the cache";
    EXPECT_EQ(hysteresis(true), (std::vector<int>{0, 4, 5}));

    // A failed fresh ask reports its code and keeps what the cache held.
    sim().addFault(se, cmd::getSensorHysteresis, Fault::completionCode(cc::nodeBusy));
    EXPECT_EQ(hysteresis(true), (std::vector<int>{cc::nodeBusy, 9, 9}));
    sim().addFault(se, cmd::getSensorHysteresis, Fault::of(FaultKind::NoAnswer));
    EXPECT_EQ(hysteresis(true), (std::vector<int>{0xFF, 9, 9}));
    EXPECT_EQ(hysteresis(false), (std::vector<int>{0, 4, 5}));
}

}  // namespace
