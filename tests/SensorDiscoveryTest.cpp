// Sensor discovery and the per-poll reading refresh: which records become
// sensors of which class, what the controller is asked and when it stops being
// asked, what callers get, and callers reading while the repository is read again.

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "IpmiIfc.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using Sim::Fault;
using TestSupport::SdrBuilder;
using Bytes = std::vector<uint8_t>;
using SensorList = std::vector<std::shared_ptr<IpmiSensor>>;

constexpr uint8_t se = netfn::sensorEvent;
constexpr uint8_t kFull = sdr::type::fullSensor, kCompact = sdr::type::compactSensor, kEventOnly = sdr::type::eventOnly;
constexpr uint8_t kThreshold = sdr::eventReadingTypeThreshold;
constexpr uint8_t kSensorSpecific = 0x6F;
constexpr uint8_t kMemory = 0x0C, kBios = 0x22;

// A record of sensor `number`, whose record ID is the number too.
SdrBuilder record(uint8_t recordType, uint8_t number, uint8_t eventReadingType = kThreshold, uint8_t sensorType = 1) {
    return SdrBuilder::of(recordType, number).set(sdr::key::sensorNumber, number).types(sensorType, eventReadingType)
        .id("S");
}

class SensorDiscovery : public TestSupport::SimTest {
protected:
    // Files the record and gives the controller the sensor behind it.
    Sim::SensorModel& add(const Bytes& r) {
        bmc().sdr.records.push_back(r);
        const sdr::SdrView v(r.data(), r.size());
        Sim::SensorModel m;
        m.owner = v.byteAt(sdr::key::ownerId);
        m.channel = v.byteAt(sdr::key::ownerLun) >> 4;
        m.lun = v.byteAt(sdr::key::ownerLun) & 0x03;
        m.number = v.byteAt(sdr::key::sensorNumber);
        m.eventOnly = v.isEventOnly();
        m.eventReadingType = v.byteAt(m.eventOnly ? sdr::eventOnly::eventReadingType : sdr::sensor::eventReadingType);
        m.readableMask = sdr::bits::allThresholds;
        bmc().sensors.push_back(m);
        return bmc().sensors.back();
    }

    SensorList discover() {
        EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
        return IpmiIfc::getSensors();
    }
    // Discovery; what the refresh asks and logs is counted from here.
    void discoverThenCount() {
        discover();
        sim().resetCounters();
        log.clear();
    }

    // Requests of one Sensor/Event command for one sensor number.
    unsigned asked(uint8_t command, uint8_t number) const {
        unsigned n = 0;
        for (const auto& r : Sim::Simulator::instance().requests())
            if (r.netfn == se && r.cmd == command && !r.data.empty() && r.data[0] == number) ++n;
        return n;
    }
    unsigned readsOf(uint8_t number) const { return asked(cmd::getSensorReading, number); }
    // Readings, thresholds and hysteresis asked of one sensor.
    std::vector<unsigned> asks(uint8_t number) const {
        return {readsOf(number), asked(cmd::getSensorThresholds, number), asked(cmd::getSensorHysteresis, number)};
    }

    static std::shared_ptr<IpmiSensor> numbered(const SensorList& list, uint8_t number) {
        for (const auto& s : list)
            if (s->getSensorNumber() == number) return s;
        return nullptr;
    }
    static std::string skipping(uint8_t number) {
        return "Skipping reading update for previous failed sensor 0x" + std::to_string(number);  // numbers below 10
    }
};

using SensorRefresh = SensorDiscovery;

// Full sensors come first although the compact records lead the repository,
// event-only ones last; each group lists its records newest first.
TEST_F(SensorDiscovery, TypesChooseTheClassOrDropTheRecordDiscreteOnesOfEntityZeroAndBiosAreHidden) {
    add(record(kCompact, 12, 0x6E));
    add(record(kCompact, 13, kSensorSpecific));
    add(record(kCompact, 17, kSensorSpecific).set(sdr::key::entityId, 0x00));
    const uint8_t types[] = {0x01, 0x02, 0x0C, 0x6F, 0x70, 0x75, 0x7F, 0x00, 0x0D, 0x6E, 0x80};
    for (uint8_t n = 1; n <= 11; ++n) add(record(kFull, n, types[n - 1]));
    Bytes cut = record(kFull, 14, kSensorSpecific);  // ends before its event/reading type
    cut.resize(sdr::sensor::eventReadingType);
    cut[sdr::header::remainingLength] = static_cast<uint8_t>(cut.size() - sdr::header::length);
    add(cut);
    add(record(kFull, 15).set(sdr::key::entityId, kBios));
    add(record(kFull, 16, kSensorSpecific).set(sdr::key::entityId, kBios));
    const uint8_t eventOnlyTypes[] = {kThreshold, kSensorSpecific, 0x05, 0x75, 0x00, 0x40};
    for (uint8_t n = 21; n <= 26; ++n) add(record(kEventOnly, n, eventOnlyTypes[n - 21]));
    // The OEM range is looked for in byte 13, not in the event/reading type.
    bmc().sdr.records.back()[sdr::eventOnly::instanceModifier] = 0x72;
    add(record(kEventOnly, 27, kSensorSpecific).set(sdr::key::entityId, kBios));

    std::vector<std::pair<int, bool>> seen;
    for (const auto& s : discover()) seen.emplace_back(s->getSensorNumber(), s->isDiscrete());

    EXPECT_EQ(seen, (std::vector<std::pair<int, bool>>{{15, false}, {7, true}, {6, true}, {5, true}, {4, true},
                                                       {3, true}, {2, true}, {1, false}, {13, true}, {26, true},
                                                       {23, true}, {22, true}, {21, false}}));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, full event_type 0 (ID: 8, Type 1)\n"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, full event_type 6e (ID: a, Type 1)\n"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, full event_type 80 (ID: b, Type 1)\n"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, full event_type 0 (ID: e, Type 1)\n"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, compact event_type 110, full event_type 110\n"));
    // Event-only sensors are never read; a threshold one has its thresholds asked.
    for (uint8_t n = 21; n <= 27; ++n) EXPECT_EQ(asks(n), (std::vector<unsigned>{0, n == 21, 0})) << int(n);
}

TEST_F(SensorDiscovery, EachSensorIsReadOnceWhatWasReadIsKeptFailuresAreLoggedExceptAbsentAndIllegal) {
    Sim::SensorModel& t = add(record(kFull, 0x10).set(sdr::sensor::capabilities, 0x28));  // hysteresis settable
    t.states = sdr::bits::upperNonCritical;
    t.hysteresisPositive = 2;
    t.hysteresisNegative = 3;
    add(record(kFull, 0x11));  // its record claims no hysteresis
    add(record(kCompact, 0x20, kSensorSpecific, 0x07)).states = 0x0180;

    const SensorList sensors = discover();

    EXPECT_EQ(asks(0x10), (std::vector<unsigned>{1, 1, 1}));
    EXPECT_EQ(asks(0x11), (std::vector<unsigned>{1, 1, 0}));
    EXPECT_EQ(asks(0x20), (std::vector<unsigned>{1, 0, 0}));
    // State, reading time and hysteresis answer without asking again.
    const unsigned before = sim().totalExchanges();
    auto threshold = std::dynamic_pointer_cast<IpmiThresholdSensor>(numbered(sensors, 0x10));
    ASSERT_NE(threshold, nullptr);
    EXPECT_EQ(threshold->getState(false), sdr::bits::upperNonCritical);
    EXPECT_TRUE(threshold->hasReadingTime());
    unsigned char positive = 0, negative = 0;
    EXPECT_EQ(threshold->getHysteresis(positive, negative, false), 0);
    EXPECT_EQ(positive, 2);
    EXPECT_EQ(negative, 3);
    EXPECT_EQ(numbered(sensors, 0x20)->getState(false), 0x0180u);
    EXPECT_EQ(sim().totalExchanges(), before);

    sim().addFault(se, cmd::getSensorHysteresis, Fault::completionCode(cc::nodeBusy));
    discover();
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSensorGetThresholds: getHysteresis(0, 0, true) returned cc = 192"));

    // Sensor 0x11 is asked first. 0xCB and 0xCD are never reported; 0xC1 only for the reading.
    for (uint8_t code : {cc::nodeBusy, cc::invalidCommand, cc::requestedSensorNotPresent, cc::illegalForSensorType}) {
        sim().addFault(se, cmd::getSensorThresholds, Fault::completionCode(code));
        sim().addFault(se, cmd::getSensorReading, Fault::completionCode(code));
        EXPECT_EQ(numbered(discover(), 0x11)->getLastPollResult(), code);
    }
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcSensorGetThresholds: Sensor Number = 0x11, failed send cc = 0xc0"));
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcSensorGetReading: Sensor Number 0x11, failed send cc = 0xc0"));
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcSensorGetReading: Sensor Number 0x11, failed send cc = 0xc1"));
    EXPECT_EQ(log.countAtPriority(LOG_WARNING), 3u) << log.dump();
}

TEST_F(SensorDiscovery, RequestsGoToTheOwnerAndOnlyTheAddressIsPutBack) {
    add(record(kFull, 0x42).set(sdr::key::ownerId, 0x2C).set(sdr::key::ownerLun, 0x61));  // channel 6, LUN 1
    node().targetAddress = node().targetChannel = node().targetLun = 0;

    discover();

    unsigned seen = 0;
    for (const auto& r : sim().requests()) {
        if (r.netfn != se) continue;
        ++seen;
        EXPECT_TRUE(r.viaIpmb && r.address == 0x2C && r.channel == 6 && r.lun == 1) << int(r.cmd);
        EXPECT_EQ(r.data, Bytes{0x42});
    }
    EXPECT_EQ(seen, 2u);  // thresholds, reading
    EXPECT_EQ(node().targetAddress, 0u);
    EXPECT_EQ(node().targetChannel, 6);
    EXPECT_EQ(node().targetLun, 1);
}

// Each discovery builds a new list and clears the memory-events flag first;
// callers keep the sensors they hold. getSensor is kept answering empty.
TEST_F(SensorDiscovery, RediscoveryStartsAfreshAndCallersKeepTheirCopies) {
    add(record(kFull, 1, kSensorSpecific, kMemory));
    const SensorList first = discover();
    EXPECT_FALSE(IpmiIfc::generatesMemoryEvents(0));

    add(record(kCompact, 2, kSensorSpecific, kMemory).word(sdr::sensor::deassertionMask, 0x0001));
    const SensorList second = discover();
    EXPECT_TRUE(IpmiIfc::generatesMemoryEvents(0));
    ASSERT_EQ(second.size(), 2u);
    EXPECT_EQ(first.at(0).use_count(), 1);  // the list let go of it
    EXPECT_NE(numbered(second, 1), first[0]);

    bmc().sdr.records.pop_back();
    discover();
    EXPECT_FALSE(IpmiIfc::generatesMemoryEvents(0));
    add(record(kEventOnly, 3, kSensorSpecific, kMemory));  // needs no mask
    discover();
    EXPECT_TRUE(IpmiIfc::generatesMemoryEvents(0));
    // Nor does a rebuild that finds the flag again clear it meanwhile.
    bool clearedMeanwhile = false;
    bmc().on(se, cmd::getSensorReading, [&clearedMeanwhile](Sim::Bmc&, const Sim::Request&) {
        clearedMeanwhile |= !IpmiIfc::generatesMemoryEvents(0);
        return Sim::Response{cc::requestedSensorNotPresent};
    });
    sim().resetCounters();
    discover();
    EXPECT_EQ(readsOf(1), 1u);
    EXPECT_FALSE(clearedMeanwhile);

    EXPECT_EQ(IpmiIfc::getSensor(0x20, 1), nullptr);
    EXPECT_EQ(IpmiIfc::getSensor(0, 0x20, 1), nullptr);
    EXPECT_TRUE(IpmiIfc::getSensors(IPMI_NODE_COUNT).empty());
}

// Callers read sensors, copy the entity list and ask for parents while the
// repository is read again and again, the tree freed before each read as stop
// frees it: they see whole lists, and a parent or none while the tree is empty.
TEST_F(SensorDiscovery, CallersReadWhileTheRepositoryIsReadAgain) {
    for (uint8_t n = 1; n <= 6; ++n)
        add(record(n % 3 ? kFull : kCompact, n, n % 2 ? kThreshold : kSensorSpecific)
                .set(sdr::key::entityId, static_cast<uint8_t>(0x07 + n % 3)));
    bmc().sdr.records.push_back({7, 0, 0x51, sdr::type::entityAssociation, 11, 0x17, 1, 0, 0x07, 1, 0, 0, 0, 0, 0, 0});
    discover();
    const std::vector<IpmiEntity> entities = IpmiIfc::getEntities();
    ASSERT_EQ(entities.size(), 4u);  // chassis, its board, and the other two sensor entities

    std::atomic<bool> done{false};
    std::atomic<unsigned> looks{0};
    auto caller = [&] {
        while (!done.load()) {
            for (const auto& sensor : IpmiIfc::getSensors()) {
                EXPECT_FALSE(sensor->getSensorIdString().empty());
                (void)sensor->getSensorTypeString();
                (void)sensor->getLastPollResult();
            }
            EXPECT_EQ(IpmiIfc::getEntities(), entities);
            const IpmiEntity parent = IpmiIfc::getEntityParent(0x07, 1);
            EXPECT_TRUE(parent == IpmiEntity(0x17, 1, 0, 0) || parent == IpmiEntity());
            ++looks;
        }
    };
    std::thread a(caller), b(caller);
    // At least 20 rebuilds, and as many more as it takes the callers to look 50 times.
    for (int i = 0; (i < 20 || looks.load() < 50) && i < 100000; ++i) {
        IpmiIfcEntityCleanUpAll(0);
        EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    }
    done = true;
    a.join();
    b.join();
    EXPECT_EQ(IpmiIfc::getSensors().size(), 6u);
}

TEST_F(SensorRefresh, ReadsFullAndCompactSensorsAndRefreshesThresholdsOfThresholdSensors) {
    add(record(kFull, 1));
    add(record(kCompact, 2, kSensorSpecific));
    add(record(kCompact, 3));
    add(record(kEventOnly, 4));
    add(record(kEventOnly, 5, kSensorSpecific));
    discoverThenCount();
    const auto threshold = numbered(IpmiIfc::getSensors(), 1);
    const auto discrete = numbered(IpmiIfc::getSensors(), 2);
    bmc().sensors[0].states = sdr::bits::lowerCritical;
    bmc().sensors[1].states = 0x0104;

    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), 0);

    const std::vector<unsigned> expected[] = {{1, 1, 0}, {1, 0, 0}, {1, 1, 0}, {0, 1, 0}, {0, 0, 0}};
    for (uint8_t n = 1; n <= 5; ++n) EXPECT_EQ(asks(n), expected[n - 1]) << int(n);
    EXPECT_EQ(sim().totalExchanges(), 6u);
    // The new readings reach the objects callers already hold.
    EXPECT_EQ(threshold->getState(false), sdr::bits::lowerCritical);
    EXPECT_EQ(discrete->getState(false), 0x0104u);

    IpmiIfcSdrCleanUpAll(0);  // what stop does to the records: the sensors still refresh safely
    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), 0);
    EXPECT_EQ(readsOf(1), 2u);
}

TEST_F(SensorRefresh, AbsentOrIllegalSensorIsNeverAskedAgainUntilRediscovery) {
    for (uint8_t code : {cc::requestedSensorNotPresent, cc::illegalForSensorType}) {
        SCOPED_TRACE(int(code));
        bmc().sdr.records.clear();
        bmc().sensors.clear();
        add(record(kFull, 1));
        add(record(kFull, 2));
        add(record(kFull, 3)).present = false;  // absent already at discovery
        discoverThenCount();

        sim().addFault(se, cmd::getSensorReading, Fault::completionCode(code));  // the first one read: sensor 2
        for (int poll = 0; poll < 3; ++poll) IpmiIfcSensorUpdateReading(0);

        EXPECT_EQ(readsOf(3), 0u);
        EXPECT_EQ(readsOf(2), 1u);
        EXPECT_EQ(readsOf(1), 3u);
        EXPECT_EQ(log.count(skipping(3)), 3u);
        EXPECT_EQ(log.count(skipping(2)), 2u);
        EXPECT_EQ(asked(cmd::getSensorThresholds, 2), 1u);  // only with the failed read

        // A new discovery builds new objects: they start without a past.
        discoverThenCount();
        IpmiIfcSensorUpdateReading(0);
        EXPECT_EQ(readsOf(2), 1u);
    }
}

TEST_F(SensorRefresh, OnlyATimeOutThatRepeatsThreeTimesStopsTheReads) {
    constexpr uint8_t T = cc::timeout, B = cc::nodeBusy;
    // The answer to the reading at discovery, then on each poll (0: the reading).
    const struct { const char* what; std::vector<uint8_t> answers; unsigned reads; size_t skips; } cases[] = {
        {"time-outs from the first poll on", {0, T, T, T, T, T, T}, 4, 2},
        {"a time-out at discovery is the first", {T, T, T, T, T, T}, 3, 2},
        {"an answer between time-outs", {0, T, T, T, 0, T, T, T}, 7, 0},
        {"other failures", {0, B, B, B, B, B}, 5, 0},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        bmc().sdr.records.clear();
        bmc().sensors.clear();
        add(record(kFull, 1));
        for (size_t i = 0; i < c.answers.size(); ++i) {
            sim().clearFaults();
            if (c.answers[i] != 0) sim().addFault(se, cmd::getSensorReading, Fault::completionCode(c.answers[i]));
            if (i == 0) {
                discoverThenCount();
            } else {
                IpmiIfcSensorUpdateReading(0);
            }
        }
        EXPECT_EQ(readsOf(1), c.reads);
        EXPECT_EQ(log.count(skipping(1)), c.skips);
    }
}

// Full sensors are listed newest record first: 3, 2, then 1 (software-owned).
TEST_F(SensorRefresh, UnansweredRequestOrSoftwareOwnedSensorEndsThePassTheRestIsAskedNextTime) {
    add(record(kFull, 1).set(sdr::key::ownerId, 0x41));  // bit 0: a software ID
    add(record(kFull, 2));
    add(record(kFull, 3));
    add(record(kCompact, 4));
    const SensorList sensors = discover();
    ASSERT_EQ(sensors.size(), 4u);
    EXPECT_EQ(asks(1), (std::vector<unsigned>{0, 0, 0}));
    EXPECT_FALSE(numbered(sensors, 1)->hasReadingTime());
    sim().resetCounters();
    sim().addFault(se, cmd::getSensorReading, Fault::of(Sim::FaultKind::NoAnswer));

    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), -1);
    EXPECT_EQ(asks(3), (std::vector<unsigned>{1, 0, 0}));
    EXPECT_EQ(readsOf(2), 0u);

    sim().resetCounters();
    log.clear();
    EXPECT_EQ(IpmiIfcSensorUpdateReading(0), -1);
    EXPECT_EQ(asks(3), (std::vector<unsigned>{1, 1, 0}));
    EXPECT_EQ(asks(2), (std::vector<unsigned>{1, 1, 0}));
    EXPECT_EQ(sim().totalExchanges(), 4u);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcSensorUpdateReading: failed send to get reading."));
}

}  // namespace
