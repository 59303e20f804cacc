// The two-level entity tree built from association and sensor records, the
// flat list and the parent query callers see, and readers during rebuilds.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
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
constexpr uint8_t kProcessor = 0x03, kSystemBoard = 0x07, kMemoryModule = 0x08, kPowerSupply = 0x0A;
constexpr uint8_t kSystemChassis = 0x17, kFan = 0x1D;
const EntityKey kNoParent{0, 0};

Bytes association(uint8_t containerId, uint8_t containerInstance, uint8_t flags, const Bytes& contained) {
    Bytes r(8 + std::max<size_t>(contained.size(), 8), 0);
    const uint8_t head[] = {0x00, 0x00, 0x51, sdr::type::entityAssociation, 11, containerId, containerInstance, flags};
    std::copy(std::begin(head), std::end(head), r.begin());
    std::copy(contained.begin(), contained.end(), r.begin() + 8);
    return r;
}

Bytes sensorRecord(uint8_t type, uint8_t entityId, uint8_t entityInstance) {
    return TestSupport::SdrBuilder::of(type).set(sdr::key::entityId, entityId).set(sdr::key::entityInstance,
                                                                                  entityInstance);
}

class EntityTree : public TestSupport::SimTest {
protected:
    // Files records as the repository reader does, each at the head of its group
    // (a group lists its records last first), then builds the tree from them.
    void tree(const std::vector<Bytes>& records) {
        for (const auto& bytes : records) {
            auto* element = new ipmiifc_sdr_list();
            element->record_type = bytes.size() > sdr::header::recordType ? bytes[sdr::header::recordType] : 0;
            element->length = static_cast<uint8_t>(bytes.size());
            element->data = new uint8_t[bytes.size()];
            std::copy(bytes.begin(), bytes.end(), element->data);
            IpmiIfcSdrListAdd(0, element);
        }
        IpmiIfcEntityListCreate(0);
        IpmiIfcEntityInstantiateAll(0);
    }
    // The controller's repository, with record IDs in order, read through the whole refresh chain.
    void refreshChain(std::vector<Bytes> records) {
        for (size_t i = 0; i < records.size(); ++i) records[i][sdr::header::recordId] = static_cast<uint8_t>(i + 1);
        bmc().sdr.records = records;
        ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    }

    static std::vector<EntityKey> entities() {
        std::vector<EntityKey> out;
        for (const auto& e : IpmiIfc::getEntities()) out.emplace_back(e.id, e.instance);
        return out;
    }

    EntityKey parentOf(unsigned id, unsigned instance) {
        IpmiEntity p = IpmiIfc::getEntityParent(id, instance);
        EXPECT_EQ(p.reserved, 0u);
        EXPECT_EQ(p.node, 0);
        return {p.id, p.instance};
    }
};

// A range over every instance byte ends; device-relative duplicates collapse.
TEST_F(EntityTree, RangeRecordContainsEveryInstanceInOrderMalformedRangesNothing) {
    tree({
        association(kSystemChassis, 5, kRanges, {kFan, 0x7E, kFan, 0xFF}),
        association(kSystemChassis, 1, kRanges, {kSystemBoard, 1, kSystemBoard, 4}),
        association(kSystemChassis, 2, kRanges, {kSystemBoard, 1, kFan, 4}),          // IDs differ
        association(kSystemChassis, 3, kRanges, {kSystemBoard, 5, kSystemBoard, 4}),  // first above last
        association(kSystemChassis, 4, kRanges, {0, 1, 0, 2, kFan, 7, kFan, 7}),      // only the second range
    });
    const auto all = entities();
    ASSERT_EQ(all.size(), 9u + 1u + 128u);
    EXPECT_THAT(std::vector<EntityKey>(all.begin(), all.begin() + 13),
                ElementsAre(Pair(kSystemChassis, 4), Pair(kFan, 7), Pair(kSystemChassis, 3), Pair(kSystemChassis, 2),
                            Pair(kSystemChassis, 1), Pair(kSystemBoard, 1), Pair(kSystemBoard, 2),
                            Pair(kSystemBoard, 3), Pair(kSystemBoard, 4), Pair(kSystemChassis, 5), Pair(kFan, 0x7E),
                            Pair(kFan, 0x7F), Pair(kFan, 0x00)));
}

TEST_F(EntityTree, ListRecordsSkipEmptySlotsShareTheirContainerAndRefuseDuplicates) {
    tree({
        association(kSystemChassis, 1, 0, {kPowerSupply, 3, 0, 0, kPowerSupply, 4, 0, 0}),
        association(kSystemChassis, 1, 0, {kPowerSupply, 2, kFan, 1, kPowerSupply, 3}),
        association(kSystemChassis, 0x81, 0, {kPowerSupply, 0x81, kPowerSupply, 2}),  // device-relative: the same
    });
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 1), Pair(kPowerSupply, 1), Pair(kPowerSupply, 2),
                                        Pair(kFan, 1), Pair(kPowerSupply, 3), Pair(kPowerSupply, 4)));
}

// An entity that is a container itself answers as top-level, even where
// another container lists it.
TEST_F(EntityTree, SensorEntitiesNotYetInTheTreeFollowTheContainersParentsAnswerFromTheTree) {
    tree({
        association(kSystemChassis, 1, 0, {kSystemBoard, 1}),
        sensorRecord(sdr::type::fullSensor, kProcessor, 1),
        association(kSystemBoard, 1, 0, {kProcessor, 1, kMemoryModule, 1}),
        sensorRecord(sdr::type::eventOnly, kFan, 2),
        sensorRecord(sdr::type::compactSensor, kMemoryModule, 1),  // already contained
        sensorRecord(sdr::type::compactSensor, kSystemBoard, 1),   // already a container
        sensorRecord(sdr::type::compactSensor, kFan, 1),
        sensorRecord(sdr::type::fullSensor, kPowerSupply, 0x82),  // device-relative
        sensorRecord(sdr::type::eventOnly, kFan, 1),              // added by the compact one
    });
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemBoard, 1), Pair(kProcessor, 1), Pair(kMemoryModule, 1),
                                        Pair(kSystemChassis, 1), Pair(kSystemBoard, 1),  // container and child
                                        Pair(kPowerSupply, 2), Pair(kFan, 1), Pair(kFan, 2)));
    EXPECT_EQ(parentOf(kProcessor, 1), EntityKey(kSystemBoard, 1));
    EXPECT_EQ(parentOf(kMemoryModule, 0x81), EntityKey(kSystemBoard, 1));  // device-relative bit ignored
    EXPECT_EQ(parentOf(kSystemBoard, 1), kNoParent);
    EXPECT_EQ(parentOf(kSystemChassis, 1), kNoParent);
    EXPECT_EQ(parentOf(kFan, 2), kNoParent);  // a sensor entity is in no container
    EXPECT_EQ(parentOf(kFan, 4), kNoParent);
    EXPECT_EQ(parentOf(0x100 + kProcessor, 1), kNoParent);  // not an entity ID at all
    EXPECT_EQ(IpmiIfc::getEntityParent(1, kProcessor, 1), IpmiEntity());  // node 1 has no tree
    EXPECT_TRUE(IpmiIfc::getEntities(7).empty());
}

TEST_F(EntityTree, ShortRecordsGiveOnlyWhatTheyHold) {
    auto cut = [](Bytes r, size_t length) {
        r.resize(length);
        return r;
    };
    tree({cut(association(kSystemChassis, 1, 0, {kFan, 1, kFan, 2, kFan, 3}), 13),  // inside the third pair
                cut(association(kSystemChassis, 2, kRanges, {kFan, 4, kFan, 5, kFan, 6, kFan, 7}), 14),
                cut(association(kSystemChassis, 3, kRanges, {kFan, 8, kFan, 8}), 7),  // no flags
                cut(association(kSystemChassis, 4, 0, {kFan, 9}), 6),                 // no container instance
                cut(sensorRecord(sdr::type::fullSensor, kProcessor, 1), 9)});       // no entity instance
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 3), Pair(kSystemChassis, 2), Pair(kFan, 4),
                                        Pair(kFan, 5), Pair(kSystemChassis, 1), Pair(kFan, 1), Pair(kFan, 2)));
}

// Every later accepted repository info runs the chain again over the kept tree;
// clean-up (at stop) frees the tree but leaves the list until it is rebuilt.
TEST_F(EntityTree, RefreshChainBuildsTheTreeOnceCleanUpFreesIt) {
    refreshChain({association(kSystemChassis, 1, kRanges, {kPowerSupply, 1, kPowerSupply, 2}),
                  sensorRecord(sdr::type::compactSensor, kFan, 1),
                  sensorRecord(sdr::type::fullSensor, kPowerSupply, 2)});
    const auto first = entities();
    EXPECT_THAT(first,
                ElementsAre(Pair(kSystemChassis, 1), Pair(kPowerSupply, 1), Pair(kPowerSupply, 2), Pair(kFan, 1)));
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(entities(), first);

    IpmiIfcEntityCleanUpAll(0);
    EXPECT_EQ(entities(), first);
    EXPECT_EQ(parentOf(kPowerSupply, 1), kNoParent);
    IpmiIfcEntityInstantiateAll(0);
    EXPECT_TRUE(entities().empty());
}

// HPE controllers list power supply bays that hold nothing; only a supply
// with a Watts power-supply sensor of its own instance is real.
TEST_F(EntityTree, PhantomPowerSuppliesAreStrippedOnHpeControllers) {
    constexpr uint8_t kPowerSupplyType = 0x08, kVoltageType = 0x02, kWatts = 6, kAmps = 5, kPowerDistribution = 0x15;
    auto powerSensor = [](uint8_t entityId, uint8_t instance, uint8_t sensorType, uint8_t baseUnit) -> Bytes {
        return TestSupport::SdrBuilder::full().set(sdr::key::entityId, entityId).set(sdr::key::entityInstance, instance)
            .set(sdr::key::sensorNumber, instance).types(sensorType, sdr::eventReadingTypeThreshold)
            .set(sdr::sensor::baseUnit, baseUnit);
    };
    struct Restore { ~Restore() { IpmiIfc::hpe_bmc = false; } } restore;
    const std::vector<Bytes> records = {
        association(kSystemChassis, 1, 0, {kPowerSupply, 1, kPowerSupply, 2, kPowerSupply, 3, kPowerSupply, 4}),
        powerSensor(kPowerSupply, 1, kPowerSupplyType, kWatts),
        powerSensor(kPowerSupply, 2, kPowerSupplyType, kAmps),
        powerSensor(kPowerSupply, 3, kVoltageType, kWatts),
        powerSensor(kPowerDistribution, 4, kPowerSupplyType, kWatts),  // right sensor, other entity
        powerSensor(kPowerSupply, 0x85, kPowerSupplyType, kWatts),     // device-relative instance 5
    };
    refreshChain(records);
    ASSERT_EQ(IpmiIfc::getSensors().size(), 5u);
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 1), Pair(kPowerSupply, 1), Pair(kPowerSupply, 2),
                                        Pair(kPowerSupply, 3), Pair(kPowerSupply, 4), Pair(kPowerSupply, 5),
                                        Pair(kPowerDistribution, 4)));

    IpmiIfc::hpe_bmc = true;
    refreshChain(records);
    EXPECT_THAT(entities(), ElementsAre(Pair(kSystemChassis, 1), Pair(kPowerSupply, 1), Pair(kPowerSupply, 5),
                                        Pair(kPowerDistribution, 4)));
    EXPECT_TRUE(log.contains(LOG_INFO, "IpmiIfcEntityInstantiateAll: stripping out phantom power supply IPMI SDRs"));
    // The tree itself keeps them: only the list handed to callers is stripped.
    EXPECT_EQ(parentOf(kPowerSupply, 2), EntityKey(kSystemChassis, 1));
}

// OpenIPMI's Marvell board: chassis and blades with association records.
TEST_F(EntityTree, RealRepositoryWithAssociationRecords) {
    const std::string path = TestSupport::realDataPath("sdr/openipmi_marvell_axp_sdrcomp.sdr");
    SKIP_WITHOUT_REAL_DATA(path);
    Sim::loadSdrDump(bmc(), path);
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    // As ipmitool shows it: chassis 23.1 holds power supplies, fans, switch 42.1 and blades 41.1-6;
    // each blade a processor, a memory module and a front panel board; the switch processor 3.7.
    EXPECT_EQ(parentOf(kPowerSupply, 2), EntityKey(kSystemChassis, 1));
    EXPECT_EQ(parentOf(kFan, 8), EntityKey(kSystemChassis, 1));
    EXPECT_EQ(parentOf(kProcessor, 4), EntityKey(0x29, 4));
    EXPECT_EQ(parentOf(0x0C, 6), EntityKey(0x29, 6));
    EXPECT_EQ(parentOf(kProcessor, 7), EntityKey(0x2A, 1));
    EXPECT_EQ(parentOf(0x29, 3), kNoParent);  // a blade is a container itself
    EXPECT_EQ(parentOf(kSystemChassis, 1), kNoParent);

    // 8 containers (6 blades, the switch, the chassis) holding 18 + 1 + 17 entities, every sensor's among them.
    auto listed = entities();
    EXPECT_EQ(listed.size(), 8u + 36u);
    for (const auto& record : bmc().sdr.records) {
        const sdr::SdrView r(record.data(), record.size());
        EntityKey e(r.byteAt(sdr::key::entityId), r.byteAt(sdr::key::entityInstance) & 0x7F);
        const bool sensor = r.isFull() || r.isCompact() || r.isEventOnly();
        EXPECT_TRUE(!sensor || std::count(listed.begin(), listed.end(), e)) << e.first << "." << e.second;
    }
}

}  // namespace
