// The per-poll reading refresh: what it asks the controller, which sensors it
// stops asking after they failed, and where a pass ends.

#include <gtest/gtest.h>

#include "IpmiIfc.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using Bytes = std::vector<uint8_t>;
using Sim::Fault;

constexpr uint8_t se = netfn::sensorEvent;
constexpr uint8_t kThresholdType = sdr::eventReadingTypeThreshold;
constexpr uint8_t kSensorSpecific = 0x6F;

// A sensor record of the given type with everything the refresh looks at.
Bytes sensorRecord(uint16_t id, uint8_t recordType, uint8_t number, uint8_t eventReadingType, uint8_t owner = 0x20) {
    const size_t idAt = recordType == sdr::type::fullSensor      ? sdr::full::idString
                        : recordType == sdr::type::compactSensor ? sdr::compact::idString
                                                                 : sdr::eventOnly::idString;
    Bytes r(idAt + 1, 0);
    r[sdr::header::recordId] = static_cast<uint8_t>(id & 0xFF);
    r[sdr::header::recordId + 1] = static_cast<uint8_t>(id >> 8);
    r[sdr::header::version] = 0x51;
    r[sdr::header::recordType] = recordType;
    r[sdr::header::remainingLength] = static_cast<uint8_t>(r.size() - sdr::header::length);
    r[sdr::key::ownerId] = owner;
    r[sdr::key::sensorNumber] = number;
    r[sdr::key::entityId] = 0x07;
    r[sdr::key::entityInstance] = 1;
    if (recordType == sdr::type::eventOnly) {
        r[sdr::eventOnly::sensorType] = 0x01;
        r[sdr::eventOnly::eventReadingType] = eventReadingType;
    } else {
        r[sdr::sensor::sensorType] = 0x01;
        r[sdr::sensor::eventReadingType] = eventReadingType;
        r[sdr::sensor::readableThresholds] = sdr::bits::allThresholds;
    }
    r[idAt - 1] = 0xC1;
    r[idAt] = 'S';
    return r;
}

class SensorRefresh : public TestSupport::SimTest {
protected:
    void TearDown() override {
        IpmiIfcSdrCleanUpAll(0);
        IpmiIfcSdrCleanUpHeaders(0);
        IpmiIfcEntityCleanUpAll(0);  // the tree the refresh chain built
        IpmiIfcSensorInstantiateAll(0);
        SimTest::TearDown();
    }

    Sim::SensorModel& add(uint8_t recordType, uint8_t number, uint8_t eventReadingType = kThresholdType,
                          uint8_t owner = 0x20) {
        const auto id = static_cast<uint16_t>(bmc().sdr.records.size() + 1);
        bmc().sdr.records.push_back(sensorRecord(id, recordType, number, eventReadingType, owner));
        Sim::SensorModel m;
        m.owner = owner;
        m.number = number;
        m.eventReadingType = eventReadingType;
        m.readableMask = sdr::bits::allThresholds;
        m.eventOnly = recordType == sdr::type::eventOnly;
        bmc().sensors.push_back(m);
        return bmc().sensors.back();
    }

    Sim::SensorModel* model(uint8_t number) {
        for (auto& m : bmc().sensors)
            if (m.number == number) return &m;
        return nullptr;
    }

    // Discovery, then the counters start from zero.
    void discover() {
        ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
        sim().resetCounters();
        log.clear();
    }

    unsigned asked(uint8_t command, uint8_t number) const {
        unsigned n = 0;
        for (const auto& r : Sim::Simulator::instance().requests())
            if (r.netfn == se && r.cmd == command && !r.data.empty() && r.data[0] == number) ++n;
        return n;
    }
    unsigned readsOf(uint8_t number) const { return asked(cmd::getSensorReading, number); }

    std::shared_ptr<IpmiSensor> sensor(uint8_t number) {
        for (const auto& s : IpmiIfc::getSensors())
            if (s->getSensorNumber() == number) return s;
        return nullptr;
    }

    std::string skipping(uint8_t number) {
        char text[80];
        snprintf(text, sizeof text, "Skipping reading update for previous failed sensor 0x%x", number);
        return text;
    }
};

TEST_F(SensorRefresh, ReadsEverySensorAndRefreshesThresholdsOfThresholdSensors) {
    add(sdr::type::fullSensor, 1);
    add(sdr::type::compactSensor, 2, kSensorSpecific);
    add(sdr::type::compactSensor, 3);
    add(sdr::type::eventOnly, 4);
    add(sdr::type::eventOnly, 5, kSensorSpecific);
    discover();

    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), 0);

    EXPECT_TRUE(log.contains(LOG_DEBUG, "Entering IpmiIfcSensorUpdateReading"));
    EXPECT_EQ(readsOf(1), 1u);
    EXPECT_EQ(readsOf(2), 1u);
    EXPECT_EQ(readsOf(3), 1u);
    EXPECT_EQ(readsOf(4), 0u);
    EXPECT_EQ(readsOf(5), 0u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 1), 1u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 2), 0u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 3), 1u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 4), 1u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 5), 0u);
    EXPECT_EQ(sim().totalExchanges(), 6u);
}

TEST_F(SensorRefresh, NewReadingsReachTheSensorsCallersHold) {
    add(sdr::type::fullSensor, 1);
    add(sdr::type::fullSensor, 2, kSensorSpecific);
    discover();
    const auto threshold = sensor(1);
    const auto discrete = sensor(2);
    ASSERT_NE(threshold, nullptr);
    ASSERT_NE(discrete, nullptr);
    EXPECT_EQ(threshold->getState(false), 0u);

    model(1)->states = sdr::bits::lowerCritical;
    model(2)->states = 0x0104;
    IpmiIfcSensorUpdateReading(0);

    EXPECT_EQ(threshold->getState(false), sdr::bits::lowerCritical);
    EXPECT_EQ(discrete->getState(false), 0x0104u);
}

TEST_F(SensorRefresh, AbsentOrIllegalSensorIsNeverAskedAgainUntilRediscovery) {
    for (uint8_t code : {cc::requestedSensorNotPresent, cc::illegalForSensorType}) {
        SCOPED_TRACE(int(code));
        bmc().sdr.records.clear();
        bmc().sensors.clear();
        add(sdr::type::fullSensor, 1);
        add(sdr::type::fullSensor, 2);
        discover();

        sim().addFault(se, cmd::getSensorReading, Fault::completionCode(code));  // the first one read: sensor 2
        IpmiIfcSensorUpdateReading(0);
        IpmiIfcSensorUpdateReading(0);
        IpmiIfcSensorUpdateReading(0);

        EXPECT_EQ(readsOf(2), 1u);
        EXPECT_EQ(readsOf(1), 3u);
        EXPECT_EQ(log.count(skipping(2)), 2u);
        EXPECT_EQ(asked(cmd::getSensorThresholds, 2), 1u);  // only with the failed read

        // A new discovery builds new objects: they start without a past.
        ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
        sim().resetCounters();
        IpmiIfcSensorUpdateReading(0);
        EXPECT_EQ(readsOf(2), 1u);
    }
}

TEST_F(SensorRefresh, SensorFoundAbsentAtDiscoveryIsNotAskedByTheRefresh) {
    add(sdr::type::fullSensor, 1).present = false;
    discover();
    IpmiIfcSensorUpdateReading(0);
    EXPECT_EQ(readsOf(1), 0u);
    EXPECT_TRUE(log.contains(LOG_DEBUG, skipping(1)));
}

TEST_F(SensorRefresh, TimeOutsAreRetriedUntilTheyRepeatThreeTimes) {
    add(sdr::type::fullSensor, 1);
    discover();  // read fine
    sim().addFault(se, cmd::getSensorReading, Fault::completionCode(cc::timeout, -1));

    for (int poll = 0; poll < 6; ++poll) IpmiIfcSensorUpdateReading(0);

    EXPECT_EQ(readsOf(1), 4u);
    EXPECT_EQ(log.count(skipping(1)), 2u);
    EXPECT_EQ(log.count("IpmiIfcSensorGetReading: Sensor Number 0x1, failed send cc = 0xc3"), 4u);
}

TEST_F(SensorRefresh, TimeOutAtDiscoveryCountsAsTheFirstOfThem) {
    add(sdr::type::fullSensor, 1);
    sim().addFault(se, cmd::getSensorReading, Fault::completionCode(cc::timeout, -1));
    discover();

    for (int poll = 0; poll < 5; ++poll) IpmiIfcSensorUpdateReading(0);

    EXPECT_EQ(readsOf(1), 3u);
}

TEST_F(SensorRefresh, AnswerBetweenTimeOutsStartsTheCountAgain) {
    add(sdr::type::fullSensor, 1);
    discover();
    sim().addFault(se, cmd::getSensorReading, Fault::completionCode(cc::timeout, 3));
    for (int poll = 0; poll < 3; ++poll) IpmiIfcSensorUpdateReading(0);  // three time-outs
    IpmiIfcSensorUpdateReading(0);                                        // answered
    sim().addFault(se, cmd::getSensorReading, Fault::completionCode(cc::timeout, 3));
    for (int poll = 0; poll < 3; ++poll) IpmiIfcSensorUpdateReading(0);

    EXPECT_EQ(readsOf(1), 7u);
    EXPECT_EQ(log.count(skipping(1)), 0u);
}

TEST_F(SensorRefresh, OtherFailuresAreAskedAgainOnEveryPoll) {
    add(sdr::type::fullSensor, 1);
    discover();
    sim().addFault(se, cmd::getSensorReading, Fault::completionCode(cc::nodeBusy, -1));
    for (int poll = 0; poll < 5; ++poll) IpmiIfcSensorUpdateReading(0);
    EXPECT_EQ(readsOf(1), 5u);
    EXPECT_EQ(sensor(1)->getLastPollResult(), cc::nodeBusy);
    EXPECT_EQ(sensor(1)->getPollRepeatCount(), 4);
}

// The list holds full sensors newest record first: 3, 2 (software-owned), 1.
TEST_F(SensorRefresh, SoftwareOwnedSensorEndsThePassWhereItStands) {
    add(sdr::type::fullSensor, 1);
    add(sdr::type::fullSensor, 2, kThresholdType, 0x41);
    add(sdr::type::fullSensor, 3);
    add(sdr::type::compactSensor, 4);
    discover();

    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), -1);

    EXPECT_EQ(readsOf(3), 1u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 3), 1u);
    EXPECT_EQ(readsOf(1), 0u);
    EXPECT_EQ(readsOf(4), 0u);
    EXPECT_EQ(sim().totalExchanges(), 2u);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcSensorUpdateReading: failed send to get reading."));
}

TEST_F(SensorRefresh, UnansweredRequestEndsThePass) {
    add(sdr::type::fullSensor, 1);
    add(sdr::type::fullSensor, 2);
    discover();
    sim().addFault(se, cmd::getSensorReading, Fault::of(Sim::FaultKind::NoAnswer));

    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), -1);

    EXPECT_EQ(readsOf(2), 1u);
    EXPECT_EQ(readsOf(1), 0u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 2), 0u);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcSensorGetReading: failed send to get reading."));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcSensorUpdateReading: failed send to get reading."));
    EXPECT_EQ(sensor(2)->getLastPollResult(), 0xFFFFFFFFu);

    // Not a failure the sensor is held to: the next pass asks it again.
    sim().resetCounters();
    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), 0);
    EXPECT_EQ(readsOf(2), 1u);
    EXPECT_EQ(readsOf(1), 1u);
}

TEST_F(SensorRefresh, SensorsFreedFromTheListMeanwhileAreStillSafeToRefresh) {
    add(sdr::type::fullSensor, 1);
    discover();
    const auto held = sensor(1);
    IpmiIfcSdrCleanUpAll(0);  // what stop does to the records
    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), 0);
    EXPECT_EQ(readsOf(1), 1u);
    EXPECT_TRUE(held->hasReadingTime());
}

TEST_F(SensorRefresh, NothingDiscoveredNothingAsked) {
    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), 0);
    EXPECT_EQ(sim().totalExchanges(), 0u);
}

}  // namespace
