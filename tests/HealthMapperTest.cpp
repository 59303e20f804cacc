#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "IpmiMapper.h"
#include "IpmiMapperInternal.h"
#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::LogCapture;

namespace {

constexpr uint8_t kSensorSpecific = 0x6F;
constexpr uint8_t kProcessor = 0x07;
constexpr uint8_t kPowerSupply = 0x08;
constexpr uint8_t kPowerUnit = 0x09;
constexpr uint8_t kMemory = 0x0C;
constexpr uint8_t kDriveSlot = 0x0D;
constexpr uint8_t kCable = 0x1B;
constexpr uint8_t kSeverity = 0x07;    // generic discrete reading type
constexpr uint8_t kRedundancy = 0x0B;  // generic discrete reading type
constexpr uint8_t kSensorNumber = 12;

constexpr uint16_t bit(unsigned n) { return static_cast<uint16_t>(1u << n); }

uint16_t health(uint8_t sensorClass, uint8_t sensorType, uint16_t state) {
    return getSensorHealthState(sensorClass, sensorType, kSensorNumber, state);
}

// Loads rules written by the test into the process-wide tables.
class RulesFixture : public ::testing::Test {
protected:
    void SetUp() override {
        ResetSensorHealthData();
        char pattern[] = "/tmp/tav-ipmi-mapper-XXXXXX";
        ASSERT_NE(mkdtemp(pattern), nullptr);
        dir = pattern;
    }
    void TearDown() override {
        std::filesystem::remove_all(dir);
        ResetSensorHealthData();
    }
    void loadRules(const std::string& text) {
        ResetSensorHealthData();
        const std::string path = dir + "/sensor_health";
        std::ofstream(path, std::ios::trunc) << text;
        ASSERT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    }

    LogCapture log;
    std::string dir;
};

using HealthMapper = RulesFixture;

TEST_F(HealthMapper, NoAssertedStateIsOkEvenWithoutRules) {
    EXPECT_EQ(health(kSensorSpecific, kProcessor, 0), 5);
    EXPECT_EQ(health(kRedundancy, 0x04, 0), 5);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0)), 0);
}

TEST_F(HealthMapper, WithoutAMatchingListLineEveryStateIsUnknown) {
    // Processor rules exist, but none for offset 1 (its rule-selecting offset) or "*".
    loadRules("111,7,0,1:25\n111,7,2,1:25\n111,8,*,1:25\n3,*,*,1:25\n");
    for (uint16_t state : {bit(0), bit(1), bit(2), uint16_t(0x7FFF)}) EXPECT_EQ(health(kSensorSpecific, kProcessor, state), 0);
}

TEST_F(HealthMapper, EachSensorSpecificTypeSelectsItsRuleByItsOwnOffset) {
    struct Case {
        uint8_t sensorType;
        unsigned selectingOffset;
    };
    for (Case c : {Case{kProcessor, 1}, Case{kPowerSupply, 1}, Case{kPowerUnit, 6}, Case{kMemory, 10},
                   Case{kDriveSlot, 1}, Case{kCable, 1}, Case{0x05, 0}, Case{0x25, 0}}) {
        SCOPED_TRACE(static_cast<int>(c.sensorType));
        const std::string type = std::to_string(c.sensorType);
        // A list-only line at the selecting offset, map rules elsewhere.
        loadRules("111," + type + "," + std::to_string(c.selectingOffset) + ",0:5\n111," + type + ",14,1:10\n");
        EXPECT_EQ(health(kSensorSpecific, c.sensorType, bit(14)), 10);
        // The same rules one offset further on select nothing.
        loadRules("111," + type + "," + std::to_string(c.selectingOffset + 1) + ",0:5\n111," + type + ",14,1:10\n");
        EXPECT_EQ(health(kSensorSpecific, c.sensorType, bit(14)), 0);
    }
}

TEST_F(HealthMapper, GenericReadingTypesSelectByOffsetZero) {
    loadRules("7,12,0,0:5\n7,*,2,1:25\n11,12,10,0:5\n11,*,1,1:10\n");
    EXPECT_EQ(health(kSeverity, kMemory, bit(2)), 25);
    EXPECT_EQ(health(kRedundancy, kMemory, bit(1)), 0);  // offset 10 is the memory offset of sensor-specific rules only
}

TEST_F(HealthMapper, WorstAssertedStateWins) {
    loadRules("111,7,*,1:5\n111,7,0,1:25\n111,7,10,1:10\n111,7,7,1:5\n");
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(7)), 5);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(7) | bit(10)), 10);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0) | bit(7) | bit(10)), 25);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0) | bit(3)), 25);  // bit 3 takes the "*" rule
}

TEST_F(HealthMapper, AStateWithoutAnyRuleSetsTheResultBackToOk) {
    loadRules("111,7,1,0:5\n111,7,0,1:25\n");
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0)), 25);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0) | bit(3)), 5);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(3)), 5);
}

TEST_F(HealthMapper, RuleHealthStatesFoldToFourResults) {
    struct Case {
        int ruleState;
        uint16_t result;
    };
    for (Case c : {Case{1, 5}, Case{2, 0}, Case{5, 5}, Case{10, 10}, Case{15, 10}, Case{20, 10},
                   Case{25, 25}, Case{29, 0}, Case{30, 25}, Case{31, 0}, Case{0, 0}}) {
        SCOPED_TRACE(c.ruleState);
        loadRules("11,*,0,1:" + std::to_string(c.ruleState) + "\n");
        EXPECT_EQ(health(kRedundancy, 0x04, bit(0)), c.result);
    }
    loadRules("11,*,0,1:\n");  // no health state: 1
    EXPECT_EQ(health(kRedundancy, 0x04, bit(0)), 5);
}

TEST_F(HealthMapper, WildcardSensorTypeServesTypesWithoutRulesOfTheirOwn) {
    loadRules("111,*,*,1:10\n111,7,*,1:25\n");
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(4)), 25);
    EXPECT_EQ(health(kSensorSpecific, kPowerSupply, bit(4)), 10);
    EXPECT_EQ(health(kSensorSpecific, 0xC2, bit(4)), 10);

    // Without the "*" type, a type that has only a list line finds nothing in the map.
    loadRules("111,8,1,0:5\n111,7,*,1:25\n");
    EXPECT_EQ(health(kSensorSpecific, kPowerSupply, bit(4)), 0);
}

TEST_F(HealthMapper, ThresholdAndUnknownClassesAreReportedAndUnknown) {
    loadRules("0,*,*,1:25\n1,*,*,1:25\n2,*,*,1:25\n8,*,*,1:25\n112,*,*,1:25\n");
    EXPECT_EQ(health(0, kProcessor, bit(1)), 0);
    EXPECT_TRUE(log.contains(LOG_ERR, "Invalid class for sensor number 12, sensor type: 7"));
    EXPECT_EQ(health(1, kProcessor, bit(1)), 0);
    EXPECT_TRUE(log.contains(LOG_ERR, "Expected discrete sensor/threshold for sensor number : 12 Sendor Type 7"));
    for (uint8_t cls : {2, 8, 0x0D, 0x70, 0x7E}) {
        SCOPED_TRACE(static_cast<int>(cls));
        EXPECT_EQ(health(cls, kProcessor, bit(1)), 0);
        EXPECT_TRUE(log.contains(LOG_DEBUG, "Unsupported sensor class " + std::to_string(cls) +
                                                " for sensor number 12 type 7"));
    }
    EXPECT_EQ(health(8, kProcessor, 0), 0);  // even with no state asserted
}

TEST_F(HealthMapper, EveryGenericClassButUsageAndPresenceIsMapped) {
    std::string rules;
    for (int cls : {3, 4, 5, 6, 7, 9, 10, 11, 12}) rules += std::to_string(cls) + ",*,*,1:10\n";
    loadRules(rules);
    for (int cls : {3, 4, 5, 6, 7, 9, 10, 11, 12}) {
        SCOPED_TRACE(cls);
        EXPECT_EQ(health(static_cast<uint8_t>(cls), 0x02, bit(1)), 10);
    }
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u);
}

TEST_F(HealthMapper, MapperKeepsTheFirstMatchingLine) {
    loadRules("111,7,2,1:20\n111,7,*,0:10\n111,*,1,1:25\n");
    IpmiMapper mapper(kSensorSpecific, kProcessor, 0, kSensorNumber, bit(2));
    EXPECT_EQ(mapper.statusBit, 1);
    EXPECT_FALSE(mapper.rule.incomplete);
    EXPECT_EQ(mapper.rule.healthState, 10);

    IpmiMapper threshold(1, kProcessor, 0, kSensorNumber, bit(2));
    EXPECT_TRUE(threshold.rule.incomplete);
    EXPECT_EQ(threshold.rule.offset, 255);
}

TEST_F(HealthMapper, DigitalDiscreteComparesTheRuleMatchValue) {
    IpmiMapper noRule(3, 0x02, 1, kSensorNumber, 0);
    EXPECT_EQ(noRule.getDigitalDiscrete(bit(0)), 5);
    EXPECT_EQ(noRule.getDigitalDiscrete(bit(1)), 25);

    loadRules("3,*,1,1:10\n");
    IpmiMapper mapper(3, 0x02, 1, kSensorNumber, 0);
    EXPECT_EQ(mapper.getDigitalDiscrete(bit(0)), 10);
    EXPECT_EQ(mapper.getDigitalDiscrete(bit(1)), 25);
}

// The rules file that ships with the library.
class ShippedHealthRules : public RulesFixture {
protected:
    void SetUp() override {
        RulesFixture::SetUp();
        ASSERT_TRUE(LoadSensorHealthDataFile(shippedFile.c_str()));
    }
    const std::string shippedFile = std::string(TAV_IPMI_SOURCE_DIR) + "/data/sensor_health";
};

TEST_F(ShippedHealthRules, HeaderLinesAreDroppedAndEveryRuleIsKept) {
    std::ifstream in(shippedFile);
    std::string line;
    size_t lines = 0, rules = 0;
    while (std::getline(in, line)) {
        ++lines;
        if (line.empty() || line[0] != '#') ++rules;
    }
    EXPECT_EQ(healthList.size(), rules);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "tav-ipmi: Read " + std::to_string(lines + 1) + " lines from " +
                                            shippedFile + ", total entries " + std::to_string(rules)));
}

TEST_F(ShippedHealthRules, CommonSensorStatesGetMeaningfulHealth) {
    struct Case {
        uint8_t sensorClass;
        uint8_t sensorType;
        uint16_t state;
        uint16_t expected;
        const char* what;
    };
    const Case cases[] = {
        {kSensorSpecific, kProcessor, bit(7), 5, "processor present"},
        {kSensorSpecific, kProcessor, bit(7) | bit(0), 25, "processor IERR"},
        {kSensorSpecific, kProcessor, bit(7) | bit(1), 25, "processor thermal trip"},
        {kSensorSpecific, kProcessor, bit(7) | bit(10), 10, "processor throttled"},
        {kSensorSpecific, kProcessor, bit(7) | bit(12), 10, "processor correctable machine check"},
        {kSensorSpecific, kPowerSupply, bit(0), 5, "power supply present"},
        {kSensorSpecific, kPowerSupply, bit(0) | bit(1), 25, "power supply failed"},
        {kSensorSpecific, kPowerSupply, bit(0) | bit(2), 10, "power supply predictive failure"},
        {kSensorSpecific, kPowerSupply, bit(0) | bit(3), 25, "power supply input lost"},
        {kSensorSpecific, kPowerUnit, bit(0), 5, "power unit off"},
        {kSensorSpecific, kPowerUnit, bit(6), 25, "power unit failure"},
        {kSensorSpecific, kMemory, bit(6), 5, "memory present"},
        {kSensorSpecific, kMemory, bit(6) | bit(0), 10, "memory correctable ECC"},
        {kSensorSpecific, kMemory, bit(6) | bit(1), 25, "memory uncorrectable ECC"},
        {kSensorSpecific, kMemory, bit(10), 25, "memory overtemperature"},
        {kSensorSpecific, kDriveSlot, bit(0), 5, "drive present"},
        {kSensorSpecific, kDriveSlot, bit(0) | bit(1), 25, "drive fault"},
        {kSensorSpecific, kDriveSlot, bit(0) | bit(7), 10, "drive rebuilding"},
        {kSensorSpecific, kCable, bit(0), 5, "cable connected"},
        {kSensorSpecific, kCable, bit(1), 10, "cable configuration error"},
        {kSensorSpecific, 0x29, bit(1), 25, "battery failed"},
        {kSensorSpecific, 0x25, bit(1), 5, "entity absent"},
        {kRedundancy, 0x04, bit(0), 5, "fans fully redundant"},
        {kRedundancy, 0x04, bit(1), 10, "fan redundancy lost"},
        {kRedundancy, 0x08, bit(5), 25, "power supplies insufficient"},
        {kSeverity, kMemory, bit(2), 25, "severity critical"},
        {kSensorSpecific, 0xC2, bit(0), 0, "OEM sensor type"},
    };
    for (const Case& c : cases) EXPECT_EQ(health(c.sensorClass, c.sensorType, c.state), c.expected) << c.what;
}

// Every state that a captured sensor can report gets a known health state
// when the shipped rules know its type.
TEST_F(ShippedHealthRules, RealSensorsOfKnownTypesNeverMapToUnknown) {
    const std::string sdrDir = TestSupport::realDataPath("sdr");
    SKIP_WITHOUT_REAL_DATA(sdrDir);
    auto knownType = [](uint8_t sensorClass, uint8_t sensorType) {
        for (const HealthTableEntry& e : healthList)
            if (e.eventReadingType == sensorClass && (e.anySensorType || e.sensorType == sensorType)) return true;
        return false;
    };
    size_t checked = 0;
    for (const auto& file : std::filesystem::directory_iterator(sdrDir)) {
        if (file.path().extension() != ".sdr") continue;
        std::ifstream in(file.path(), std::ios::binary);
        const std::vector<uint8_t> bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
        for (size_t at = 0; at + sdr::header::length <= bytes.size();) {
            const sdr::SdrView record(bytes.data() + at, bytes.size() - at);
            const size_t length = sdr::header::length + record.remainingLength();
            const sdr::SensorRecordView sensor(sdr::SdrView(bytes.data() + at, std::min(length, bytes.size() - at)));
            at += length;
            if (!record.isFullOrCompact()) continue;
            const uint8_t cls = sensor.eventReadingType();
            if (cls == sdr::eventReadingTypeThreshold || !knownType(cls, sensor.sensorType())) continue;
            for (unsigned offset = 0; offset < 15; ++offset) {
                if (!(sensor.readingMask() & bit(offset))) continue;
                ++checked;
                EXPECT_NE(health(cls, sensor.sensorType(), bit(offset)), 0)
                    << file.path().filename() << " sensor " << int(sensor.sensorNumber()) << " class " << int(cls)
                    << " type " << int(sensor.sensorType()) << " offset " << offset;
            }
        }
    }
    EXPECT_GT(checked, 100u);
}

}  // namespace
