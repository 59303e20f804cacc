#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <thread>
#include <utility>
#include <vector>

#include "IpmiIfcEntity.h"
#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;
using ::testing::ElementsAre;
using ::testing::Pair;

namespace {

using Bytes = std::vector<uint8_t>;
using EntityKey = std::pair<unsigned, unsigned>;

constexpr uint8_t kRanges = 0x80;
constexpr uint8_t kPresenceAccessible = 0x20;

// Entity IDs used below.
constexpr uint8_t kProcessor = 0x03;
constexpr uint8_t kSystemBoard = 0x07;
constexpr uint8_t kMemoryModule = 0x08;
constexpr uint8_t kPowerSupply = 0x0A;
constexpr uint8_t kSystemChassis = 0x17;
constexpr uint8_t kFan = 0x1D;

Bytes association(uint8_t containerId, uint8_t containerInstance, uint8_t flags, const Bytes& contained) {
    Bytes r(8 + std::max<size_t>(contained.size(), 8), 0);
    const uint8_t head[] = {0x00, 0x00, 0x51, sdr::type::entityAssociation, 11, containerId, containerInstance, flags};
    std::copy(std::begin(head), std::end(head), r.begin());
    std::copy(contained.begin(), contained.end(), r.begin() + 8);
    return r;
}

// A sensor record of the given type naming an entity; only the key matters here.
Bytes sensorRecord(uint8_t type, uint8_t entityId, uint8_t entityInstance) {
    Bytes r(type == sdr::type::fullSensor ? 48 : type == sdr::type::compactSensor ? 32 : 17, 0);
    r[sdr::header::recordType] = type;
    r[sdr::header::remainingLength] = static_cast<uint8_t>(r.size() - sdr::header::length);
    r[sdr::key::ownerId] = 0x20;
    r[sdr::key::entityId] = entityId;
    r[sdr::key::entityInstance] = entityInstance;
    return r;
}

std::vector<EntityKey> keys(const std::vector<IpmiEntity>& entities) {
    std::vector<EntityKey> out;
    for (const auto& e : entities) out.emplace_back(e.id, e.instance);
    return out;
}

class EntityTree : public TestSupport::SimTest {
protected:
    void TearDown() override {
        IpmiIfcEntityCleanUpAll(0);
        IpmiIfcSdrCleanUpAll(0);
        IpmiIfcSdrCleanUpHeaders(0);
        SimTest::TearDown();
    }

    // Files records through the repository reader, which puts each at the
    // head of its group: a group lists its records last first. Arguments are
    // in repository order.
    void repository(const std::vector<Bytes>& records) {
        for (const auto& bytes : records) {
            auto* element = new ipmiifc_sdr_list();
            element->record_type = bytes.size() > sdr::header::recordType ? bytes[sdr::header::recordType] : 0;
            element->length = static_cast<uint8_t>(bytes.size());
            element->data = new uint8_t[bytes.size()];
            std::copy(bytes.begin(), bytes.end(), element->data);
            IpmiIfcSdrListAdd(0, element);
        }
    }

    // The tree-building half of the SDR refresh chain.
    void build() {
        IpmiIfcEntityListCreate(0);
        IpmiIfcEntityInstantiateAll(0);
    }

    std::vector<EntityKey> entities() { return keys(IpmiIfc::getEntities()); }

    EntityKey parentOf(unsigned id, unsigned instance) {
        IpmiEntity p = IpmiIfc::getEntityParent(id, instance);
        EXPECT_EQ(p.reserved, 0u);
        EXPECT_EQ(p.node, 0);
        return {p.id, p.instance};
    }
};

const EntityKey kNoParent{0, 0};

TEST_F(EntityTree, RangeRecordContainsEveryInstanceInOrder) {
    repository({association(kSystemChassis, 1, kRanges, {kSystemBoard, 1, kSystemBoard, 4})});
    build();
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 1), Pair(kSystemBoard, 1), Pair(kSystemBoard, 2),
                                        Pair(kSystemBoard, 3), Pair(kSystemBoard, 4)));
    EXPECT_EQ(parentOf(kSystemBoard, 3), EntityKey(kSystemChassis, 1));
}

TEST_F(EntityTree, MalformedRangesContainNothing) {
    repository({
        association(kSystemChassis, 1, kRanges, {kSystemBoard, 1, kFan, 4}),            // IDs differ
        association(kSystemChassis, 2, kRanges, {kSystemBoard, 5, kSystemBoard, 4}),    // first above last
        association(kSystemChassis, 3, kRanges, {0, 1, 0, 2, kFan, 7, kFan, 7}),        // only the second range
    });
    build();
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 3), Pair(kFan, 7), Pair(kSystemChassis, 2),
                                        Pair(kSystemChassis, 1)));
}

// A range over every instance byte ends; device-relative duplicates collapse.
TEST_F(EntityTree, RangeUpToTheLastInstanceByteEnds) {
    repository({association(kSystemChassis, 1, kRanges, {kFan, 0x7E, kFan, 0xFF})});
    build();
    auto all = entities();
    ASSERT_EQ(all.size(), 1u + 128u);
    EXPECT_EQ(all[1], EntityKey(kFan, 0x7E));
    EXPECT_EQ(all[2], EntityKey(kFan, 0x7F));
    EXPECT_EQ(all[3], EntityKey(kFan, 0x00));
}

TEST_F(EntityTree, ListRecordSkipsEmptySlots) {
    repository({association(kSystemChassis, 1, 0, {kPowerSupply, 1, 0, 0, kPowerSupply, 2, 0, 0})});
    build();
    EXPECT_THAT(entities(),
                ElementsAre(Pair(kSystemChassis, 1), Pair(kPowerSupply, 1), Pair(kPowerSupply, 2)));
}

TEST_F(EntityTree, RecordsForOneContainerShareItAndRefuseDuplicates) {
    repository({
        association(kSystemChassis, 1, 0, {kPowerSupply, 1, kPowerSupply, 2}),
        association(kSystemChassis, 1, 0, {kPowerSupply, 2, kFan, 1}),
        // The device-relative bit does not make another entity.
        association(kSystemChassis, 0x81, 0, {kPowerSupply, 0x81}),
    });
    build();
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 1), Pair(kPowerSupply, 1), Pair(kPowerSupply, 2),
                                        Pair(kFan, 1)));
}

TEST_F(EntityTree, SensorEntitiesNotYetInTheTreeFollowTheContainers) {
    repository({
        sensorRecord(sdr::type::fullSensor, kProcessor, 1),
        association(kSystemBoard, 1, 0, {kProcessor, 1, kMemoryModule, 1}),
        sensorRecord(sdr::type::eventOnly, kFan, 2),
        sensorRecord(sdr::type::compactSensor, kMemoryModule, 1),  // already contained
        sensorRecord(sdr::type::compactSensor, kSystemBoard, 1),   // already a container
        sensorRecord(sdr::type::compactSensor, kFan, 1),
        sensorRecord(sdr::type::fullSensor, kPowerSupply, 0x82),  // device-relative
        sensorRecord(sdr::type::eventOnly, kFan, 1),              // added by the compact one
    });
    build();
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemBoard, 1), Pair(kProcessor, 1), Pair(kMemoryModule, 1),
                                        Pair(kPowerSupply, 2), Pair(kFan, 1), Pair(kFan, 2)));
    EXPECT_EQ(parentOf(kFan, 2), kNoParent);
}

TEST_F(EntityTree, RebuildingFromTheSameRecordsAddsNothing) {
    repository({association(kSystemChassis, 1, kRanges, {kFan, 1, kFan, 2}),
                sensorRecord(sdr::type::fullSensor, kProcessor, 1)});
    build();
    auto first = entities();
    build();
    build();
    EXPECT_EQ(entities(), first);
    EXPECT_EQ(first.size(), 4u);
}

TEST_F(EntityTree, ParentOfContainedTopLevelAndUnknownEntities) {
    repository({association(kSystemChassis, 1, 0, {kPowerSupply, 1, kFan, 3}),
                sensorRecord(sdr::type::fullSensor, kProcessor, 1)});
    build();
    EXPECT_EQ(parentOf(kFan, 3), EntityKey(kSystemChassis, 1));
    EXPECT_EQ(parentOf(kFan, 0x83), EntityKey(kSystemChassis, 1));  // device-relative bit ignored
    EXPECT_EQ(parentOf(kSystemChassis, 1), kNoParent);
    EXPECT_EQ(parentOf(kProcessor, 1), kNoParent);
    EXPECT_EQ(parentOf(kFan, 4), kNoParent);
    EXPECT_EQ(parentOf(0x100 + kFan, 3), kNoParent);  // not an entity ID at all

    IpmiEntity viaNode = IpmiIfc::getEntityParent(0, kPowerSupply, 1);
    EXPECT_EQ(viaNode, IpmiEntity(kSystemChassis, 1, 0, 0));
    EXPECT_EQ(IpmiIfc::getEntityParent(1, kPowerSupply, 1), IpmiEntity());  // node 1 has no tree
    EXPECT_EQ(IpmiIfc::getEntityParent(7, kPowerSupply, 1), IpmiEntity());
    EXPECT_TRUE(IpmiIfc::getEntities(7).empty());
}

// An entity that is a container itself answers as top-level, even where
// another container lists it.
TEST_F(EntityTree, AContainerFoundFirstHasNoParent) {
    repository({
        association(kSystemChassis, 1, 0, {kSystemBoard, 1}),
        association(kSystemBoard, 1, 0, {kProcessor, 1}),
    });
    build();
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemBoard, 1), Pair(kProcessor, 1), Pair(kSystemChassis, 1),
                                        Pair(kSystemBoard, 1)));
    EXPECT_EQ(parentOf(kSystemBoard, 1), kNoParent);
    EXPECT_EQ(parentOf(kProcessor, 1), EntityKey(kSystemBoard, 1));
}

TEST_F(EntityTree, ShortRecordsGiveOnlyWhatTheyHold) {
    Bytes twoPairs = association(kSystemChassis, 1, 0, {kFan, 1, kFan, 2, kFan, 3});
    twoPairs.resize(13);  // ends inside the third pair
    Bytes oneRange = association(kSystemChassis, 2, kRanges, {kFan, 4, kFan, 5, kFan, 6, kFan, 7});
    oneRange.resize(14);
    Bytes noFlags = association(kSystemChassis, 3, kRanges, {kFan, 8, kFan, 8});
    noFlags.resize(7);
    Bytes noContainer = association(kSystemChassis, 4, 0, {kFan, 9});
    noContainer.resize(6);
    Bytes sensorWithoutInstance = sensorRecord(sdr::type::fullSensor, kProcessor, 1);
    sensorWithoutInstance.resize(9);
    repository({twoPairs, oneRange, noFlags, noContainer, sensorWithoutInstance});
    build();
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 3), Pair(kSystemChassis, 2), Pair(kFan, 4),
                                        Pair(kFan, 5), Pair(kSystemChassis, 1), Pair(kFan, 1), Pair(kFan, 2)));
}

TEST_F(EntityTree, ChildrenTakeTheContainersPresenceFlag) {
    repository({association(kSystemChassis, 1, 0, {kFan, 3}),  // read last: the container exists by then
                association(kSystemBoard, 1, 0, {kFan, 2}),
                association(kSystemChassis, 1, kPresenceAccessible, {kFan, 1})});
    build();
    const ipmiifc_entity_list* chassis = node().work.entity_tree;
    ASSERT_NE(chassis, nullptr);
    const ipmiifc_entity_list* board = chassis->next;
    ASSERT_NE(board, nullptr);
    EXPECT_EQ(board->parent, chassis);  // a top-level element remembers the one before it
    EXPECT_EQ(board->flags, 0);
    EXPECT_EQ(board->children->flags, 0);
    EXPECT_EQ(chassis->flags, ENTITY_FLAG_PRESENCE_ACCESSIBLE);
    ASSERT_NE(chassis->children->next, nullptr);
    EXPECT_EQ(chassis->children->flags, ENTITY_FLAG_PRESENCE_ACCESSIBLE);
    EXPECT_EQ(chassis->children->next->flags, ENTITY_FLAG_PRESENCE_ACCESSIBLE);
}

TEST_F(EntityTree, CleanUpEmptiesTheTreeButKeepsTheList) {
    repository({association(kSystemChassis, 1, 0, {kFan, 1})});
    build();
    IpmiIfcEntityCleanUpAll(0);
    EXPECT_EQ(node().work.entity_tree, nullptr);
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 1), Pair(kFan, 1)));
    EXPECT_EQ(parentOf(kFan, 1), kNoParent);
    IpmiIfcEntityInstantiateAll(0);
    EXPECT_TRUE(entities().empty());
}

// Readers on other threads see either the old or the new list, never a
// half-built one, while the chain rebuilds it over and over.
TEST_F(EntityTree, ReadersDuringRebuildsSeeWholeLists) {
    repository({association(kSystemChassis, 1, kRanges, {kFan, 1, kFan, 8}),
                association(kSystemBoard, 1, 0, {kProcessor, 1, kProcessor, 2}),
                sensorRecord(sdr::type::compactSensor, kPowerSupply, 1)});
    build();
    const auto expected = entities();
    ASSERT_EQ(expected.size(), 13u);

    std::atomic<bool> done{false};
    std::atomic<int> torn{0};
    std::atomic<int> wrongParent{0};
    auto reader = [&] {
        while (!done) {
            auto seen = keys(IpmiIfc::getEntities());
            if (seen != expected) ++torn;
            IpmiEntity p = IpmiIfc::getEntityParent(kFan, 5);
            if (!(p == IpmiEntity(kSystemChassis, 1, 0, 0)) && !(p == IpmiEntity())) ++wrongParent;
            IpmiIfc::getEntityParent(kProcessor, 2);
        }
    };
    std::thread a(reader), b(reader);
    for (int i = 0; i < 300; ++i) {
        IpmiIfcEntityCleanUpAll(0);
        build();
        IpmiIfcEntityDumpAll(0);
    }
    done = true;
    a.join();
    b.join();
    EXPECT_EQ(torn.load(), 0);
    EXPECT_EQ(wrongParent.load(), 0);
    EXPECT_EQ(entities(), expected);
}

// The whole chain: the controller's repository is read, then the tree built;
// every later accepted repository info runs it again over the kept tree.
TEST_F(EntityTree, RefreshChainBuildsTheTreeOnce) {
    bmc().sdr.records = {
        association(kSystemChassis, 1, kRanges, {kPowerSupply, 1, kPowerSupply, 2}),
        sensorRecord(sdr::type::compactSensor, kFan, 1),
        sensorRecord(sdr::type::fullSensor, kPowerSupply, 2),
    };
    for (uint16_t id = 0; id < bmc().sdr.records.size(); ++id) bmc().sdr.records[id][0] = static_cast<uint8_t>(id + 1);
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    const auto first = entities();
    EXPECT_THAT(first, ElementsAre(Pair(kSystemChassis, 1), Pair(kPowerSupply, 1), Pair(kPowerSupply, 2),
                                   Pair(kFan, 1)));
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(entities(), first);
    EXPECT_EQ(parentOf(kPowerSupply, 2), EntityKey(kSystemChassis, 1));
}

// A threshold sensor of the given type and base unit.
Bytes powerSensor(uint8_t number, uint8_t entityId, uint8_t entityInstance, uint8_t sensorType, uint8_t baseUnit) {
    Bytes r = sensorRecord(sdr::type::fullSensor, entityId, entityInstance);
    r[sdr::header::recordId] = number;
    r[sdr::key::sensorNumber] = number;
    r[sdr::sensor::sensorType] = sensorType;
    r[sdr::sensor::eventReadingType] = sdr::eventReadingTypeThreshold;
    r[sdr::sensor::baseUnit] = baseUnit;
    return r;
}

// HPE controllers list power supply bays that hold nothing; only a supply
// with a Watts power-supply sensor of its own instance is real.
TEST_F(EntityTree, PhantomPowerSuppliesAreStrippedOnHpeControllers) {
    constexpr uint8_t kPowerSupplyType = 0x08, kVoltageType = 0x02;
    constexpr uint8_t kWatts = 6, kAmps = 5;
    constexpr uint8_t kPowerDistribution = 0x15;
    bmc().sdr.records = {
        association(kSystemChassis, 1, 0, {kPowerSupply, 1, kPowerSupply, 2, kPowerSupply, 3, kPowerSupply, 4}),
        powerSensor(0x10, kPowerSupply, 1, kPowerSupplyType, kWatts),
        powerSensor(0x11, kPowerSupply, 2, kPowerSupplyType, kAmps),
        powerSensor(0x12, kPowerSupply, 3, kVoltageType, kWatts),
        powerSensor(0x13, kPowerDistribution, 4, kPowerSupplyType, kWatts),  // right sensor, other entity
        powerSensor(0x14, kPowerSupply, 0x85, kPowerSupplyType, kWatts),     // device-relative instance 5
    };
    struct Restore {
        ~Restore() { IpmiIfc::hpe_bmc = false; }
    } restore;

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    ASSERT_EQ(IpmiIfc::getSensors().size(), 5u);
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 1), Pair(kPowerSupply, 1), Pair(kPowerSupply, 2),
                                        Pair(kPowerSupply, 3), Pair(kPowerSupply, 4), Pair(kPowerSupply, 5),
                                        Pair(kPowerDistribution, 4)));
    EXPECT_EQ(log.count("IpmiIfcEntityInstantiateAll: stripping out phantom power supply IPMI SDRs"), 0u);

    IpmiIfc::hpe_bmc = true;
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 1), Pair(kPowerSupply, 1), Pair(kPowerSupply, 5),
                                        Pair(kPowerDistribution, 4)));
    EXPECT_TRUE(log.contains(LOG_INFO, "IpmiIfcEntityInstantiateAll: stripping out phantom power supply IPMI SDRs"));
    // The tree itself keeps them: only the list handed to callers is stripped.
    EXPECT_EQ(parentOf(kPowerSupply, 2), EntityKey(kSystemChassis, 1));
}

// OpenIPMI's Marvell board: chassis and blades with association records,
// read from a simulated controller.
TEST_F(EntityTree, RealRepositoryWithAssociationRecords) {
    const std::string path = TestSupport::realDataPath("sdr/openipmi_marvell_axp_sdrcomp.sdr");
    SKIP_WITHOUT_REAL_DATA(path);
    Sim::loadSdrDump(bmc(), path);
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    // ipmitool shows chassis 23.1 holding power supplies 10.1-2, switch 42.1,
    // fans 29.1-8 and blades 41.1-6; each blade holds a processor, a memory
    // module and a front panel board of its own instance; the switch holds
    // processor 3.7.
    EXPECT_EQ(parentOf(kPowerSupply, 2), EntityKey(kSystemChassis, 1));
    EXPECT_EQ(parentOf(kFan, 8), EntityKey(kSystemChassis, 1));
    EXPECT_EQ(parentOf(kProcessor, 4), EntityKey(0x29, 4));
    EXPECT_EQ(parentOf(0x0C, 6), EntityKey(0x29, 6));
    EXPECT_EQ(parentOf(kProcessor, 7), EntityKey(0x2A, 1));
    EXPECT_EQ(parentOf(0x29, 3), kNoParent);  // a blade is a container itself
    EXPECT_EQ(parentOf(kSystemChassis, 1), kNoParent);

    auto listed = entities();
    for (const auto& record : bmc().sdr.records) {
        uint8_t type = record[sdr::header::recordType];
        if (type < sdr::type::fullSensor || type > sdr::type::eventOnly) continue;
        EntityKey e(record[sdr::key::entityId], record[sdr::key::entityInstance] & 0x7F);
        EXPECT_NE(std::find(listed.begin(), listed.end(), e), listed.end()) << e.first << "." << e.second;
    }
    // 8 containers (6 blades, the switch, the chassis) holding 18 + 1 + 17
    // entities; every sensor names one of them.
    EXPECT_EQ(listed.size(), 8u + 36u);
}

}  // namespace
