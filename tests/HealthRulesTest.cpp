// Sensor health: the rules file's line syntax, the once-only loader and its two
// tables, the per-bit mapping of discrete sensor states, and the shipped rules.

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "IpmiMapper.h"
#include "IpmiMapperInternal.h"
#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

// Event/reading types, then sensor types.
constexpr uint8_t kThreshold = 0x01, kSensorSpecific = 0x6F, kRedundancy = 0x0B;
constexpr uint8_t kProcessor = 0x07, kPowerSupply = 0x08, kPowerUnit = 0x09, kMemory = 0x0C, kDriveSlot = 0x0D;
constexpr uint8_t kCable = 0x1B;

constexpr uint16_t bit(unsigned n) { return static_cast<uint16_t>(1u << n); }
uint16_t health(uint8_t sensorClass, uint8_t sensorType, uint16_t state) {
    return getSensorHealthState(sensorClass, sensorType, 12, state);
}

HealthTableEntry parse(const std::string& line) {
    std::istringstream in(line);
    HealthTableEntry entry;
    in >> entry;
    return entry;
}
// eventReadingType, sensorType, offset, matchValue, healthState, incomplete, anySensorType, anyOffset
std::vector<int> fields(const HealthTableEntry& e) {
    return {e.eventReadingType, e.sensorType, e.offset, e.matchValue, e.healthState, e.incomplete, e.anySensorType,
            e.anyOffset};
}

TEST(HealthRulesParser, ReadsEveryFieldOfARule) {
    EXPECT_EQ(fields(parse("111,7,*,1:25")), (std::vector<int>{111, 7, 255, 1, 25, 0, 0, 1}));
    EXPECT_EQ(fields(parse("3,*,0,0:5")), (std::vector<int>{3, 0, 0, 0, 5, 0, 1, 0}));
    for (const char* noHealthState : {"3,*,0,0:", "3,*,0,0:   ", "3,*,0,0::"})
        EXPECT_EQ(fields(parse(noHealthState)), (std::vector<int>{3, 0, 0, 0, 1, 0, 1, 0})) << noHealthState;
    for (const char* alike : {"111, 7, *, 1 : 25", "  111 ,\t7 ,  * ,\t1 :  25", "111;7;*;1:25", "111,7,*,1:25\r",
                              "111,7,*,1:25   a note after the rule"})
        EXPECT_EQ(fields(parse(alike)), fields(parse("111,7,*,1:25"))) << alike;
}

TEST(HealthRulesParser, LinesWithoutTheColonPartAreIncompleteAndEatNoOtherLine) {
    for (const char* line : {"111,7,1,1", "111,7,1,1,25", "111,7,1", "", "   ", "# 111,7,*,1:25",
                             "tav-ipmi sensor health rules: 111,7,*,1:25", "*,7,1,1:25"})
        EXPECT_TRUE(parse(line).incomplete) << line;
    std::istringstream in("junk, *, x\n111,7,*,1:25\n");
    HealthTableEntry first, second;
    in >> first >> second;
    EXPECT_TRUE(first.incomplete);
    EXPECT_EQ(fields(second), fields(parse("111,7,*,1:25")));
}

// Each test writes its own rules file and starts from empty tables.
class HealthRules : public ::testing::Test {
protected:
    void SetUp() override { ResetSensorHealthData(); }
    void TearDown() override {
        std::remove(path.c_str());
        ResetSensorHealthData();
    }
    void write(const std::string& text) { std::ofstream(path, std::ios::trunc) << text; }
    void loadRules(const std::string& text) {
        ResetSensorHealthData();
        write(text);
        ASSERT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    }
    std::string loadingLine() const { return "tav-ipmi: Loading " + path; }
    std::string readLine(int lines, size_t entries) const {
        return "tav-ipmi: Read " + std::to_string(lines) + " lines from " + path + ", total entries " +
               std::to_string(entries);
    }

    TestSupport::LogCapture log;
    const std::string path = ::testing::TempDir() + "tav-ipmi-health-" + std::to_string(getpid());
};

// The last line has no newline: it is counted but not kept.
TEST_F(HealthRules, ListKeepsEveryCompleteLineMapTheMatchingOnesLastWins) {
    write("# health rules\n111,7,*,1:25\n3,*,0,0:5\n\n11,*,1,1:10\n111,8,2\n111,7,1,1:10\n111,7,1,1:25\n3,*,0,1:5");
    ASSERT_TRUE(LoadSensorHealthDataFile(path.c_str()));

    std::vector<std::vector<int>> list;
    for (const auto& e : healthList) list.push_back({e.eventReadingType, e.offset, e.healthState});
    EXPECT_EQ(list,
              (std::vector<std::vector<int>>{{111, 255, 25}, {3, 0, 5}, {11, 1, 10}, {111, 1, 10}, {111, 1, 25}}));
    EXPECT_EQ(sensorHealthMap.size(), 2u);  // 3: match value 0
    EXPECT_EQ(sensorHealthMap.at(111).at(7).size(), 2u);
    EXPECT_EQ(sensorHealthMap.at(111).at(7).at(255).healthState, 25);
    EXPECT_EQ(sensorHealthMap.at(111).at(7).at(1).healthState, 25);
    EXPECT_EQ(sensorHealthMap.at(11).at(0).at(1).healthState, 10);
    EXPECT_TRUE(log.contains(LOG_DEBUG, loadingLine()));
    EXPECT_TRUE(log.contains(LOG_DEBUG, readLine(9, 5)));
}

TEST_F(HealthRules, LoadsAgainUntilARuleIsKeptThenNeverAgain) {
    EXPECT_FALSE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_TRUE(
        log.contains(LOG_ERR, "LoadSensorHealthDataFile: open(" + path + ") failed 2 No such file or directory"));
    write("");
    EXPECT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_TRUE(log.contains(LOG_DEBUG, readLine(1, 0)));
    write("tav-ipmi health rules\n111,7,1,1\n");
    EXPECT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_TRUE(healthList.empty());

    write("111,7,1,1:25\n");
    EXPECT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    write("111,7,1,1:10\n3,*,0,1:5\n");
    EXPECT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_TRUE(LoadSensorHealthDataFile());  // another file does not matter either
    ASSERT_EQ(healthList.size(), 1u);
    EXPECT_EQ(healthList[0].healthState, 25);
    EXPECT_EQ(log.count(loadingLine()), 4u);
    EXPECT_EQ(log.count("tav-ipmi: Loading /etc/sfcb/tav/sensor_health"), 0u);
}

TEST_F(HealthRules, ConcurrentFirstCallsLoadOnce) {
    write("111,7,*,1:25\n111,8,*,1:10\n3,*,0,1:5\n");
    std::vector<std::thread> threads;
    std::vector<char> results(8, 0);
    for (size_t i = 0; i < results.size(); ++i)
        threads.emplace_back([this, &results, i] { results[i] = LoadSensorHealthDataFile(path.c_str()); });
    for (auto& t : threads) t.join();
    EXPECT_EQ(results, std::vector<char>(8, 1));
    EXPECT_EQ(healthList.size(), 3u);
    EXPECT_EQ(log.count(loadingLine()), 1u);
}

TEST_F(HealthRules, DefaultLoaderReadsTheSystemRulesFile) {
    const char* systemFile = "/etc/sfcb/tav/sensor_health";
    EXPECT_EQ(LoadSensorHealthDataFile(), access(systemFile, R_OK) == 0);
    EXPECT_TRUE(log.contains(LOG_DEBUG, std::string("tav-ipmi: Loading ") + systemFile));
}

using HealthMapper = HealthRules;

TEST_F(HealthMapper, EachSensorSpecificTypeSelectsItsRuleByItsOwnOffsetGenericTypesByZero) {
    const struct { uint8_t sensorClass, sensorType, selectingOffset; } cases[] = {
        {kSensorSpecific, kProcessor, 1}, {kSensorSpecific, kPowerSupply, 1}, {kSensorSpecific, kPowerUnit, 6},
        {kSensorSpecific, kMemory, 10},   {kSensorSpecific, kDriveSlot, 1},   {kSensorSpecific, kCable, 1},
        {kSensorSpecific, 0x05, 0},       {kSensorSpecific, 0x25, 0},         {kRedundancy, kMemory, 0}};
    for (const auto& c : cases) {
        SCOPED_TRACE(std::to_string(c.sensorClass) + "/" + std::to_string(c.sensorType));
        const std::string prefix = std::to_string(c.sensorClass) + "," + std::to_string(c.sensorType) + ",";
        // A list-only line at the selecting offset, a map rule elsewhere; then the same one offset further on.
        loadRules(prefix + std::to_string(c.selectingOffset) + ",0:5\n" + prefix + "14,1:10\n");
        EXPECT_EQ(health(c.sensorClass, c.sensorType, bit(14)), 10);
        loadRules(prefix + std::to_string(c.selectingOffset + 1) + ",0:5\n" + prefix + "14,1:10\n");
        EXPECT_EQ(health(c.sensorClass, c.sensorType, bit(14)), 0);
    }
}

TEST_F(HealthMapper, NoStateIsOkEachAssertedStateCountsTheWorstWinsAStateWithoutRuleSetsOk) {
    EXPECT_EQ(health(kSensorSpecific, kProcessor, 0), 5);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0)), 0);
    // Processor rules exist, but none for offset 1 (its rule-selecting offset) or "*": no list line matches.
    loadRules("111,7,0,1:25\n111,7,2,1:25\n111,8,*,1:25\n3,*,*,1:25\n");
    EXPECT_EQ(health(kSensorSpecific, kProcessor, 0), 5);
    for (uint16_t state : {bit(0), bit(1), bit(2), uint16_t(0x7FFF)})
        EXPECT_EQ(health(kSensorSpecific, kProcessor, state), 0) << state;
    loadRules("111,7,*,1:5\n111,7,0,1:25\n111,7,10,1:10\n111,7,7,1:5\n");
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(7)), 5);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(7) | bit(10)), 10);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0) | bit(7) | bit(10)), 25);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0) | bit(3)), 25);  // bit 3 takes the "*" rule
    // Without a "*" rule, bit 3 sets the result back to 5, after bit 0 gave 25.
    loadRules("111,7,1,0:5\n111,7,0,1:25\n");
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0)), 25);
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(0) | bit(3)), 5);
    // A "*" sensor type serves types without rules of their own; without it they find nothing.
    loadRules("111,*,*,1:10\n111,7,*,1:25\n");
    EXPECT_EQ(health(kSensorSpecific, kProcessor, bit(4)), 25);
    EXPECT_EQ(health(kSensorSpecific, 0xC2, bit(4)), 10);
    loadRules("111,8,1,0:5\n111,7,*,1:25\n");
    EXPECT_EQ(health(kSensorSpecific, kPowerSupply, bit(4)), 0);
}

TEST_F(HealthMapper, RuleHealthStatesFoldToFourResults) {
    const std::pair<const char*, uint16_t> cases[] = {{"1", 5},   {"2", 0},   {"5", 5},   {"10", 10}, {"15", 10},
                                                     {"20", 10}, {"25", 25}, {"29", 0},  {"30", 25}, {"31", 0},
                                                     {"0", 0},   {"", 5}};
    for (const auto& [ruleState, result] : cases) {
        loadRules(std::string("11,*,0,1:") + ruleState + "\n");
        EXPECT_EQ(health(kRedundancy, 0x04, bit(0)), result) << ruleState;
    }
}

TEST_F(HealthMapper, ThresholdUsageAndPresenceClassesAreReportedAndUnknown) {
    std::string rules;
    for (int cls : {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 0x70}) rules += std::to_string(cls) + ",*,*,1:10\n";
    loadRules(rules);
    for (int cls : {3, 4, 5, 6, 7, 9, 10, 11, 12}) EXPECT_EQ(health(uint8_t(cls), 0x02, bit(1)), 10) << cls;
    EXPECT_EQ(log.countAtPriority(LOG_ERR), 0u);
    EXPECT_EQ(health(0, kProcessor, bit(1)), 0);
    EXPECT_TRUE(log.contains(LOG_ERR, "Invalid class for sensor number 12, sensor type: 7"));
    EXPECT_EQ(health(1, kProcessor, bit(1)), 0);
    EXPECT_TRUE(log.contains(LOG_ERR, "Expected discrete sensor/threshold for sensor number : 12 Sendor Type 7"));
    for (uint8_t cls : {2, 8, 0x0D, 0x70}) {
        EXPECT_EQ(health(cls, kProcessor, 0), 0) << int(cls);  // even with no state asserted
        EXPECT_TRUE(log.contains(LOG_DEBUG, "Unsupported sensor class " + std::to_string(cls) +
                                                " for sensor number 12 type 7"));
    }
}

TEST_F(HealthMapper, MapperKeepsTheFirstMatchingLineDigitalSensorsCompareItsMatchValue) {
    IpmiMapper noRule(3, 0x02, 1, 12, 0);
    EXPECT_EQ(noRule.getDigitalDiscrete(bit(0)), 5);
    EXPECT_EQ(noRule.getDigitalDiscrete(bit(1)), 25);

    loadRules("111,7,2,1:20\n111,7,*,0:10\n111,*,1,1:25\n3,*,1,1:10\n");
    IpmiMapper mapper(kSensorSpecific, kProcessor, 0, 12, bit(2));
    EXPECT_EQ(fields(mapper.rule), (std::vector<int>{111, 7, 255, 0, 10, 0, 0, 1}));
    EXPECT_TRUE(IpmiMapper(1, kProcessor, 0, 12, bit(2)).rule.incomplete);  // threshold sensors get no rule
    IpmiMapper digital(3, 0x02, 1, 12, 0);
    EXPECT_EQ(digital.getDigitalDiscrete(bit(0)), 10);
    EXPECT_EQ(digital.getDigitalDiscrete(bit(1)), 25);
}

// Every line of the shipped rules but the header is a rule, and every state a
// captured sensor can report gets a known health state when they know its type.
TEST_F(HealthMapper, ShippedRulesNeverLeaveRealSensorsOfKnownTypesUnknown) {
    const std::string shipped = std::string(TAV_IPMI_SOURCE_DIR) + "/data/sensor_health";
    ASSERT_TRUE(LoadSensorHealthDataFile(shipped.c_str()));
    std::ifstream in(shipped);
    size_t lines = 0, rules = 0;
    for (std::string line; std::getline(in, line); ++lines) rules += line.empty() || line[0] != '#';
    EXPECT_EQ(healthList.size(), rules);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "tav-ipmi: Read " + std::to_string(lines + 1) + " lines from " + shipped +
                                            ", total entries " + std::to_string(rules)));

    SKIP_WITHOUT_REAL_DATA(TestSupport::realDataPath("sdr"));
    auto knownType = [](uint8_t sensorClass, uint8_t sensorType) {
        for (const HealthTableEntry& e : healthList)
            if (e.eventReadingType == sensorClass && (e.anySensorType || e.sensorType == sensorType)) return true;
        return false;
    };
    size_t checked = 0;
    for (const std::string& file : TestSupport::realDataFiles("sdr", ".sdr")) {
        Sim::Bmc bmc;
        Sim::loadSdrDump(bmc, file);
        for (const auto& record : bmc.sdr.records) {
            const sdr::SdrView view(record.data(), record.size());
            const sdr::SensorRecordView sensor(view);
            const uint8_t cls = sensor.eventReadingType();
            if (!view.isFullOrCompact() || cls == kThreshold || !knownType(cls, sensor.sensorType())) continue;
            for (unsigned offset = 0; offset < 15; ++offset) {
                if (!(sensor.readingMask() & bit(offset))) continue;
                ++checked;
                EXPECT_NE(health(cls, sensor.sensorType(), bit(offset)), 0)
                    << file << " sensor " << int(sensor.sensorNumber()) << " class " << int(cls)
                    << " type " << int(sensor.sensorType()) << " offset " << offset;
            }
        }
    }
    EXPECT_GT(checked, 100u);
}

}  // namespace
