// Sensor discovery: which records become sensors of which class, what the
// controller is asked while they are built, what callers get from getSensors,
// and callers reading the list while the repository is read again.

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "IpmiIfc.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using Bytes = std::vector<uint8_t>;
using SensorList = std::vector<std::shared_ptr<IpmiSensor>>;

constexpr uint8_t se = netfn::sensorEvent;
constexpr uint8_t kThresholdType = sdr::eventReadingTypeThreshold;
constexpr uint8_t kSensorSpecific = 0x6F;
constexpr uint8_t kMemory = 0x0C;
constexpr uint8_t kEntitySystemBoard = 0x07;
constexpr uint8_t kEntityBios = 0x22;

// What a test says about one sensor; the rest of its record is zero.
struct Spec {
    uint8_t number = 1;
    uint8_t eventReadingType = kThresholdType;
    uint8_t sensorType = 0x01;
    uint8_t owner = 0x20;
    uint8_t channel = 0;
    uint8_t lun = 0;
    uint8_t entity = kEntitySystemBoard;
    uint16_t assertionMask = 0;
    uint16_t deassertionMask = 0;
    uint8_t capabilities = 0;
    std::string name = "Sensor";
};

Bytes record(uint16_t id, uint8_t type, size_t idStringAt, const Spec& s) {
    Bytes r(idStringAt + s.name.size(), 0);
    r[sdr::header::recordId] = static_cast<uint8_t>(id & 0xFF);
    r[sdr::header::recordId + 1] = static_cast<uint8_t>(id >> 8);
    r[sdr::header::version] = 0x51;
    r[sdr::header::recordType] = type;
    r[sdr::header::remainingLength] = static_cast<uint8_t>(r.size() - sdr::header::length);
    r[sdr::key::ownerId] = s.owner;
    r[sdr::key::ownerLun] = static_cast<uint8_t>(s.channel << 4 | s.lun);
    r[sdr::key::sensorNumber] = s.number;
    r[sdr::key::entityId] = s.entity;
    r[sdr::key::entityInstance] = 1;
    r[idStringAt - 1] = static_cast<uint8_t>(0xC0 | s.name.size());
    std::copy(s.name.begin(), s.name.end(), r.begin() + static_cast<long>(idStringAt));
    return r;
}

void putMasks(Bytes& r, const Spec& s) {
    r[sdr::sensor::capabilities] = s.capabilities;
    r[sdr::sensor::sensorType] = s.sensorType;
    r[sdr::sensor::eventReadingType] = s.eventReadingType;
    r[sdr::sensor::assertionMask] = static_cast<uint8_t>(s.assertionMask & 0xFF);
    r[sdr::sensor::assertionMask + 1] = static_cast<uint8_t>(s.assertionMask >> 8);
    r[sdr::sensor::deassertionMask] = static_cast<uint8_t>(s.deassertionMask & 0xFF);
    r[sdr::sensor::deassertionMask + 1] = static_cast<uint8_t>(s.deassertionMask >> 8);
}

Bytes fullRecord(uint16_t id, const Spec& s) {
    Bytes r = record(id, sdr::type::fullSensor, sdr::full::idString, s);
    putMasks(r, s);
    r[sdr::sensor::readableThresholds] = sdr::bits::allThresholds;
    r[sdr::full::mLow] = 1;
    return r;
}

Bytes compactRecord(uint16_t id, const Spec& s) {
    Bytes r = record(id, sdr::type::compactSensor, sdr::compact::idString, s);
    putMasks(r, s);
    return r;
}

Bytes eventOnlyRecord(uint16_t id, const Spec& s, uint8_t instanceModifierByte = 0) {
    Bytes r = record(id, sdr::type::eventOnly, sdr::eventOnly::idString, s);
    r[sdr::eventOnly::sensorType] = s.sensorType;
    r[sdr::eventOnly::eventReadingType] = s.eventReadingType;
    r[sdr::eventOnly::instanceModifier] = instanceModifierByte;
    return r;
}

class SensorDiscovery : public TestSupport::SimTest {
protected:
    void TearDown() override {
        IpmiIfcSdrCleanUpAll(0);
        IpmiIfcSdrCleanUpHeaders(0);
        IpmiIfcEntityCleanUpAll(0);  // the tree the refresh chain built
        IpmiIfcSensorInstantiateAll(0);  // no records left: empties the list
        SimTest::TearDown();
    }

    // A record, and the sensor behind it on its controller.
    Sim::SensorModel& add(const Bytes& r, const Spec& s) {
        bmc().sdr.records.push_back(r);
        Sim::SensorModel m;
        m.owner = s.owner;
        m.channel = s.channel;
        m.lun = s.lun;
        m.number = s.number;
        m.type = s.sensorType;
        m.eventReadingType = s.eventReadingType;
        m.readableMask = sdr::bits::allThresholds;
        m.eventOnly = r[sdr::header::recordType] == sdr::type::eventOnly;
        bmc().sensors.push_back(m);
        return bmc().sensors.back();
    }

    SensorList discover() {
        EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
        return IpmiIfc::getSensors();
    }

    // Requests of one Sensor/Event command for one sensor number.
    unsigned asked(uint8_t command, uint8_t number) const {
        unsigned n = 0;
        for (const auto& r : Sim::Simulator::instance().requests())
            if (r.netfn == se && r.cmd == command && !r.data.empty() && r.data[0] == number) ++n;
        return n;
    }

    static std::shared_ptr<IpmiSensor> numbered(const SensorList& list, uint8_t number) {
        for (const auto& s : list)
            if (s->getSensorNumber() == number) return s;
        return nullptr;
    }
};

TEST_F(SensorDiscovery, EventReadingTypeChoosesTheClassOrDropsTheRecord) {
    const struct {
        uint8_t number;
        uint8_t eventReadingType;
        bool kept;
        bool discrete;
    } cases[] = {
        {1, 0x01, true, false},  {2, 0x02, true, true},   {3, 0x0C, true, true},  {4, 0x6F, true, true},
        {5, 0x70, true, true},   {6, 0x75, true, true},   {7, 0x7F, true, true},  {8, 0x00, false, false},
        {9, 0x0D, false, false}, {10, 0x6E, false, false}, {11, 0x80, false, false},
    };
    uint16_t id = 1;
    for (const auto& c : cases) {
        Spec s;
        s.number = c.number;
        s.eventReadingType = c.eventReadingType;
        add(fullRecord(id++, s), s);
    }
    const SensorList sensors = discover();

    for (const auto& c : cases) {
        SCOPED_TRACE(int(c.eventReadingType));
        const auto sensor = numbered(sensors, c.number);
        ASSERT_EQ(sensor != nullptr, c.kept);
        if (c.kept) {
            EXPECT_EQ(sensor->isDiscrete(), c.discrete);
        }
    }
    EXPECT_EQ(sensors.size(), 7u);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, full event_type 0 (ID: 8, Type 1)\n"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, full event_type 6e (ID: a, Type 1)\n"));
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, full event_type 80 (ID: b, Type 1)\n"));
}

TEST_F(SensorDiscovery, CompactRecordsAreDroppedWithTheirOwnMessage) {
    Spec s;
    s.number = 3;
    s.eventReadingType = 0x6E;
    add(compactRecord(1, s), s);
    s.number = 4;
    s.eventReadingType = kSensorSpecific;
    add(compactRecord(2, s), s);

    const SensorList sensors = discover();

    ASSERT_EQ(sensors.size(), 1u);
    EXPECT_EQ(sensors[0]->getSensorNumber(), 4);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, compact event_type 110, full event_type 110\n"));
}

// Full records first, then compact ones, each list newest record first.
TEST_F(SensorDiscovery, ListHoldsFullThenCompactSensorsInListOrder) {
    Spec s;
    for (uint8_t n : {1, 2}) {
        s.number = n;
        add(compactRecord(n, s), s);
    }
    for (uint8_t n : {3, 4}) {
        s.number = n;
        add(fullRecord(n, s), s);
    }
    std::vector<int> order;
    for (const auto& sensor : discover()) order.push_back(sensor->getSensorNumber());
    EXPECT_EQ(order, (std::vector<int>{4, 3, 2, 1}));
}

TEST_F(SensorDiscovery, DiscreteSensorsOfEntityZeroAndBiosAreHiddenThresholdOnesAreNot) {
    Spec s;
    s.entity = kEntityBios;
    s.number = 1;
    add(fullRecord(1, s), s);  // threshold
    s.number = 2;
    s.eventReadingType = kSensorSpecific;
    add(fullRecord(2, s), s);
    s.number = 3;
    s.entity = 0x00;
    add(compactRecord(3, s), s);
    s.number = 4;
    s.entity = kEntitySystemBoard;
    add(compactRecord(4, s), s);
    s.number = 5;
    s.entity = kEntityBios;
    add(eventOnlyRecord(5, s), s);

    const SensorList sensors = discover();

    std::vector<int> numbers;
    for (const auto& sensor : sensors) numbers.push_back(sensor->getSensorNumber());
    EXPECT_EQ(numbers, (std::vector<int>{1, 4}));
}

TEST_F(SensorDiscovery, EachSensorIsReadOnceAndThresholdSensorsAskForThresholdsAndHysteresis) {
    Spec threshold;
    threshold.number = 0x10;
    threshold.capabilities = 0x28;  // hysteresis settable, thresholds readable
    Sim::SensorModel& t = add(fullRecord(1, threshold), threshold);
    t.reading = 77;
    t.states = sdr::bits::upperNonCritical;
    t.hysteresisPositive = 2;
    t.hysteresisNegative = 3;
    Spec discrete;
    discrete.number = 0x20;
    discrete.eventReadingType = kSensorSpecific;
    discrete.sensorType = 0x07;
    add(compactRecord(2, discrete), discrete).states = 0x0180;

    const SensorList sensors = discover();

    EXPECT_EQ(asked(cmd::getSensorReading, 0x10), 1u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 0x10), 1u);
    EXPECT_EQ(asked(cmd::getSensorHysteresis, 0x10), 1u);
    EXPECT_EQ(asked(cmd::getSensorReading, 0x20), 1u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 0x20), 0u);
    EXPECT_EQ(asked(cmd::getSensorHysteresis, 0x20), 0u);

    // What was read is kept: state, time and hysteresis answer without asking again.
    const unsigned before = sim().totalExchanges();
    auto thresholdSensor = std::dynamic_pointer_cast<IpmiThresholdSensor>(numbered(sensors, 0x10));
    ASSERT_NE(thresholdSensor, nullptr);
    EXPECT_EQ(thresholdSensor->getState(false), sdr::bits::upperNonCritical);
    EXPECT_TRUE(thresholdSensor->hasReadingTime());
    unsigned char positive = 0, negative = 0;
    EXPECT_EQ(thresholdSensor->getHysteresis(positive, negative, false), 0);
    EXPECT_EQ(positive, 2);
    EXPECT_EQ(negative, 3);
    EXPECT_EQ(numbered(sensors, 0x20)->getState(false), 0x0180u);
    EXPECT_EQ(sim().totalExchanges(), before);
}

TEST_F(SensorDiscovery, ThresholdSensorWithoutHysteresisSupportIsNotAskedForIt) {
    Spec s;
    s.number = 0x10;
    add(fullRecord(1, s), s);
    discover();
    EXPECT_EQ(asked(cmd::getSensorThresholds, 0x10), 1u);
    EXPECT_EQ(asked(cmd::getSensorHysteresis, 0x10), 0u);
}

TEST_F(SensorDiscovery, RequestsGoToTheOwnerAndOnlyTheAddressIsPutBack) {
    Spec s;
    s.number = 0x42;
    s.owner = 0x2C;
    s.channel = 6;
    s.lun = 1;
    add(fullRecord(1, s), s);
    node().targetAddress = 0;
    node().targetChannel = 0;
    node().targetLun = 0;

    discover();

    unsigned seen = 0;
    for (const auto& r : sim().requests()) {
        if (r.netfn != se) continue;
        ++seen;
        EXPECT_TRUE(r.viaIpmb);
        EXPECT_EQ(r.address, 0x2C);
        EXPECT_EQ(r.channel, 6);
        EXPECT_EQ(r.lun, 1);
        EXPECT_EQ(r.data, Bytes{0x42});
    }
    EXPECT_EQ(seen, 2u);  // thresholds, reading
    EXPECT_EQ(node().targetAddress, 0u);
    EXPECT_EQ(node().targetChannel, 6);
    EXPECT_EQ(node().targetLun, 1);
}

TEST_F(SensorDiscovery, SoftwareOwnedSensorIsKeptButNeverAsked) {
    Spec s;
    s.number = 0x30;
    s.owner = 0x41;  // bit 0: a software ID
    add(fullRecord(1, s), s);

    const SensorList sensors = discover();

    ASSERT_EQ(sensors.size(), 1u);
    EXPECT_EQ(sim().exchanges(se, cmd::getSensorReading), 0u);
    EXPECT_EQ(sim().exchanges(se, cmd::getSensorThresholds), 0u);
    EXPECT_EQ(sensors[0]->getLastPollResult(), 0xFFFFFFFFu);
    EXPECT_FALSE(sensors[0]->hasReadingTime());
}

TEST_F(SensorDiscovery, EventOnlyRecordsBecomeSensorsWithoutBeingRead) {
    Spec s;
    s.number = 1;  // threshold
    add(eventOnlyRecord(1, s), s);
    s.number = 2;
    s.eventReadingType = kSensorSpecific;
    add(eventOnlyRecord(2, s), s);
    s.number = 3;
    s.eventReadingType = 0x05;
    add(eventOnlyRecord(3, s), s);
    // The OEM range is looked for in byte 13, not in the event/reading type.
    s.number = 4;
    s.eventReadingType = 0x75;
    add(eventOnlyRecord(4, s, 0x00), s);
    s.number = 5;
    s.eventReadingType = 0x40;
    add(eventOnlyRecord(5, s, 0x72), s);
    s.number = 6;
    s.eventReadingType = 0x00;
    add(eventOnlyRecord(6, s), s);

    const SensorList sensors = discover();

    std::vector<std::pair<int, bool>> seen;
    for (const auto& sensor : sensors) seen.emplace_back(sensor->getSensorNumber(), sensor->isDiscrete());
    EXPECT_EQ(seen, (std::vector<std::pair<int, bool>>{{5, true}, {3, true}, {2, true}, {1, false}}));
    EXPECT_EQ(sim().exchanges(se, cmd::getSensorReading), 0u);
    EXPECT_EQ(asked(cmd::getSensorThresholds, 1), 1u);
    EXPECT_EQ(sim().exchanges(se, cmd::getSensorThresholds), 1u);
    EXPECT_FALSE(log.contains(LOG_WARNING, "IpmiIfcSensorGetThresholds: Sensor Number = 0x1, failed send cc = 0xcb"));
}

TEST_F(SensorDiscovery, MemoryEventsFlagFollowsMemorySensorsWithEvents) {
    Spec quiet;
    quiet.number = 1;
    quiet.sensorType = kMemory;
    quiet.eventReadingType = kSensorSpecific;
    add(fullRecord(1, quiet), quiet);
    discover();
    EXPECT_FALSE(IpmiIfc::generatesMemoryEvents(0));

    Spec deasserting = quiet;
    deasserting.number = 2;
    deasserting.deassertionMask = 0x0001;
    add(compactRecord(2, deasserting), deasserting);
    discover();
    EXPECT_TRUE(IpmiIfc::generatesMemoryEvents(0));

    // Each discovery starts from a cleared flag.
    bmc().sdr.records.pop_back();
    discover();
    EXPECT_FALSE(IpmiIfc::generatesMemoryEvents(0));

    // An event-only memory record needs no mask.
    Spec eventOnly = quiet;
    eventOnly.number = 3;
    add(eventOnlyRecord(3, eventOnly), eventOnly);
    discover();
    EXPECT_TRUE(IpmiIfc::generatesMemoryEvents(0));
}

TEST_F(SensorDiscovery, FailedRequestsAreLoggedExceptAbsentAndIllegalSensors) {
    Spec s;
    s.number = 0x15;
    add(fullRecord(1, s), s);
    sim().addFault(se, cmd::getSensorThresholds, Sim::Fault::completionCode(cc::nodeBusy));
    sim().addFault(se, cmd::getSensorReading, Sim::Fault::completionCode(cc::nodeBusy));
    SensorList sensors = discover();
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcSensorGetThresholds: Sensor Number = 0x15, failed send cc = 0xc0"));
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcSensorGetReading: Sensor Number 0x15, failed send cc = 0xc0"));
    ASSERT_EQ(sensors.size(), 1u);
    EXPECT_EQ(sensors[0]->getLastPollResult(), cc::nodeBusy);

    for (uint8_t code : {cc::invalidCommand, cc::requestedSensorNotPresent, cc::illegalForSensorType}) {
        log.clear();
        sim().addFault(se, cmd::getSensorThresholds, Sim::Fault::completionCode(code));
        sim().addFault(se, cmd::getSensorReading, Sim::Fault::completionCode(code));
        sensors = discover();
        size_t sensorLines = 0;
        for (const auto& line : log.lines())
            if (line.text.find("Sensor Number") != std::string::npos) ++sensorLines;
        EXPECT_EQ(sensorLines, code == cc::invalidCommand ? 1u : 0u) << log.dump();
    }
}

TEST_F(SensorDiscovery, HysteresisThatCannotBeReadIsReported) {
    Spec s;
    s.number = 0x16;
    s.capabilities = 0x10;  // hysteresis readable
    add(fullRecord(1, s), s).hysteresisSupport = 0;
    discover();
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSensorGetThresholds: getHysteresis(0, 0, true) returned cc = 1"));

    log.clear();
    sim().addFault(se, cmd::getSensorHysteresis, Sim::Fault::completionCode(cc::nodeBusy));
    discover();
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSensorGetThresholds: getHysteresis(0, 0, true) returned cc = 192"));
}

TEST_F(SensorDiscovery, RecordsPointBackAtTheSensorsCallersGet) {
    Spec s;
    s.number = 1;
    add(fullRecord(1, s), s);
    s.number = 2;
    s.eventReadingType = kSensorSpecific;
    s.entity = kEntityBios;
    add(fullRecord(2, s), s);

    const SensorList sensors = discover();

    ASSERT_EQ(sensors.size(), 1u);
    for (ipmiifc_sdr_list* e = node().work.sdr.lists[SDR_GROUP_FULL]; e != nullptr; e = e->next) {
        if (e->data[sdr::key::sensorNumber] == 1) {
            EXPECT_EQ(e->sensor, sensors[0].get());
        } else {
            EXPECT_EQ(e->sensor, nullptr);  // hidden: nothing keeps it alive
        }
    }
}

TEST_F(SensorDiscovery, RediscoveryReplacesTheListCallersKeepTheirCopies) {
    Spec s;
    s.number = 1;
    add(fullRecord(1, s), s);
    const SensorList first = discover();
    s.number = 2;
    add(fullRecord(2, s), s);

    const SensorList second = discover();

    ASSERT_EQ(first.size(), 1u);
    ASSERT_EQ(second.size(), 2u);
    EXPECT_EQ(first[0].use_count(), 1);  // the list let go of it
    EXPECT_EQ(first[0]->getSensorNumber(), 1);
    EXPECT_NE(numbered(second, 1), first[0]);
}

TEST_F(SensorDiscovery, GetSensorAnswersEmptyEvenForAKnownSensor) {
    Spec s;
    s.number = 7;
    add(fullRecord(1, s), s);
    ASSERT_EQ(discover().size(), 1u);
    EXPECT_EQ(IpmiIfc::getSensor(0x20, 7), nullptr);
    EXPECT_EQ(IpmiIfc::getSensor(0, 0x20, 7), nullptr);
    EXPECT_EQ(IpmiIfc::getSensor(0x20, 8), nullptr);
}

TEST_F(SensorDiscovery, NodesOutsideTheTableHaveNoSensors) {
    EXPECT_TRUE(IpmiIfc::getSensors(-1).empty());
    EXPECT_TRUE(IpmiIfc::getSensors(IPMI_NODE_COUNT).empty());
    EXPECT_EQ(IpmiIfc::getSensor(IPMI_NODE_COUNT, 0x20, 1), nullptr);
}

TEST_F(SensorDiscovery, RecordsCutShortAreReadOnlyAsFarAsTheyGo) {
    // A full record that ends inside its masks: its event/reading type reads as absent.
    Spec s;
    s.number = 9;
    Bytes cut = fullRecord(1, s);
    cut.resize(sdr::sensor::eventReadingType);
    cut[sdr::header::remainingLength] = static_cast<uint8_t>(cut.size() - sdr::header::length);
    add(cut, s);
    EXPECT_TRUE(discover().empty());
    EXPECT_TRUE(log.contains(LOG_DEBUG, "dropping sdr, full event_type 0 (ID: 1, Type 1)\n"));
}

// Callers copy the list, walk the entities and read their sensors' records
// while the repository is read and the sensors rebuilt again and again.
TEST_F(SensorDiscovery, CallersReadWhileTheRepositoryIsReadAgain) {
    Spec s;
    for (uint8_t n = 1; n <= 6; ++n) {
        s.number = n;
        s.eventReadingType = n % 2 ? kThresholdType : kSensorSpecific;
        s.entity = static_cast<uint8_t>(kEntitySystemBoard + n % 3);
        add(n % 3 ? fullRecord(n, s) : compactRecord(n, s), s);
    }
    discover();

    std::atomic<bool> done{false};
    std::atomic<unsigned> looks{0};
    auto caller = [&] {
        while (!done.load()) {
            for (const auto& sensor : IpmiIfc::getSensors()) {
                const IpmiEntity entity = sensor->getEntity();
                EXPECT_FALSE(sensor->getSensorIdString().empty());
                (void)sensor->getSensorTypeString();
                (void)sensor->getLastPollResult();
                (void)IpmiIfc::getEntityParent(entity.id, entity.instance);
            }
            (void)IpmiIfc::getEntities();
            ++looks;
        }
    };
    std::thread a(caller), b(caller);
    // At least 20 rebuilds, and as many more as it takes the callers to look 50 times.
    for (int i = 0; (i < 20 || looks.load() < 50) && i < 100000; ++i) EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    done = true;
    a.join();
    b.join();

    EXPECT_GT(looks.load(), 0u);
    EXPECT_EQ(IpmiIfc::getSensors().size(), 6u);
    EXPECT_FALSE(IpmiIfc::getEntities().empty());
}

}  // namespace
