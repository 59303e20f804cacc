#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "IpmiMapper.h"
#include "IpmiMapperInternal.h"
#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::LogCapture;

namespace {

HealthTableEntry parse(const std::string& line) {
    std::istringstream in(line);
    HealthTableEntry entry;
    in >> entry;
    return entry;
}

void expectSameEntry(const HealthTableEntry& a, const HealthTableEntry& b) {
    EXPECT_EQ(a.eventReadingType, b.eventReadingType);
    EXPECT_EQ(a.sensorType, b.sensorType);
    EXPECT_EQ(a.offset, b.offset);
    EXPECT_EQ(a.matchValue, b.matchValue);
    EXPECT_EQ(a.healthState, b.healthState);
    EXPECT_EQ(a.incomplete, b.incomplete);
    EXPECT_EQ(a.anySensorType, b.anySensorType);
    EXPECT_EQ(a.anyOffset, b.anyOffset);
}

TEST(HealthRulesParser, ReadsAllFieldsOfARule) {
    HealthTableEntry e = parse("111,7,*,1:25");
    EXPECT_EQ(e.eventReadingType, 111);
    EXPECT_EQ(e.sensorType, 7);
    EXPECT_EQ(e.offset, 255);  // "*" leaves the default
    EXPECT_TRUE(e.anyOffset);
    EXPECT_FALSE(e.anySensorType);
    EXPECT_EQ(e.matchValue, 1);
    EXPECT_EQ(e.healthState, 25);
    EXPECT_FALSE(e.incomplete);

    HealthTableEntry f = parse("3,*,0,0:5");
    EXPECT_TRUE(f.anySensorType);
    EXPECT_EQ(f.sensorType, 0);
    EXPECT_EQ(f.offset, 0);
    EXPECT_FALSE(f.anyOffset);
    EXPECT_EQ(f.matchValue, 0);
    EXPECT_EQ(f.healthState, 5);
}

TEST(HealthRulesParser, BlanksAndOtherSeparatorsParseAlike) {
    const HealthTableEntry plain = parse("111,7,*,1:25");
    expectSameEntry(parse("111, 7, *, 1 : 25"), plain);
    expectSameEntry(parse("  111 ,\t7 ,  * ,\t1 :  25"), plain);
    expectSameEntry(parse("111;7;*;1:25"), plain);
    expectSameEntry(parse("111,7,*,1:25\r"), plain);
    expectSameEntry(parse("111,7,*,1:25   a note after the rule"), plain);
}

TEST(HealthRulesParser, ColonWithoutHealthStateKeepsOne) {
    HealthTableEntry e = parse("3,*,0,0:");
    EXPECT_FALSE(e.incomplete);
    EXPECT_EQ(e.healthState, 1);
    EXPECT_EQ(parse("3,*,0,0:   ").healthState, 1);
    EXPECT_EQ(parse("3,*,0,0::").healthState, 1);
}

TEST(HealthRulesParser, LinesWithoutTheColonPartAreIncomplete) {
    for (const char* line : {"111,7,1,1", "111,7,1,1,25", "111,7,1", "", "   ",
                             "# 111,7,*,1:25", "tav-ipmi sensor health rules: 111,7,*,1:25",
                             "*,7,1,1:25"}) {
        SCOPED_TRACE(line);
        EXPECT_TRUE(parse(line).incomplete);
    }
}

TEST(HealthRulesParser, ABrokenLineDoesNotEatTheNext) {
    std::istringstream in("junk, *, x\n111,7,*,1:25\n");
    HealthTableEntry first, second;
    in >> first >> second;
    EXPECT_TRUE(first.incomplete);
    expectSameEntry(second, parse("111,7,*,1:25"));
}

// Each test writes its own rules files and starts from empty tables.
class HealthRules : public ::testing::Test {
protected:
    void SetUp() override {
        ResetSensorHealthData();
        char pattern[] = "/tmp/tav-ipmi-health-XXXXXX";
        ASSERT_NE(mkdtemp(pattern), nullptr);
        dir = pattern;
        path = dir + "/sensor_health";
    }
    void TearDown() override {
        unlink(path.c_str());
        rmdir(dir.c_str());
        ResetSensorHealthData();
    }
    void write(const std::string& text) { std::ofstream(path, std::ios::trunc) << text; }
    std::string loadingLine() const { return "tav-ipmi: Loading " + path; }
    std::string readLine(int lines, size_t entries) const {
        return "tav-ipmi: Read " + std::to_string(lines) + " lines from " + path + ", total entries " +
               std::to_string(entries);
    }

    LogCapture log;
    std::string dir;
    std::string path;
};

TEST_F(HealthRules, LoadFillsListInFileOrderAndMapUnderWildcardKeys) {
    write("# health rules\n"
          "111,7,*,1:25\n"
          "3,*,0,0:5\n"
          "\n"
          "11,*,1,1:10\n"
          "111,8,2\n");
    ASSERT_TRUE(LoadSensorHealthDataFile(path.c_str()));

    ASSERT_EQ(healthList.size(), 3u);
    EXPECT_EQ(healthList[0].eventReadingType, 111);
    EXPECT_EQ(healthList[1].eventReadingType, 3);
    EXPECT_EQ(healthList[2].eventReadingType, 11);

    EXPECT_EQ(sensorHealthMap.at(111).at(7).at(255).healthState, 25);
    EXPECT_EQ(sensorHealthMap.at(11).at(0).at(1).healthState, 10);
    EXPECT_EQ(sensorHealthMap.count(3), 0u);  // matchValue 0: list only
    EXPECT_EQ(sensorHealthMap.size(), 2u);

    EXPECT_TRUE(log.contains(LOG_DEBUG, loadingLine()));
    EXPECT_TRUE(log.contains(LOG_DEBUG, readLine(7, 3)));
}

TEST_F(HealthRules, DuplicatesStayInTheListAndTheLastWinsInTheMap) {
    write("111,7,1,1:10\n111,7,1,1:25\n");
    ASSERT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    ASSERT_EQ(healthList.size(), 2u);
    EXPECT_EQ(healthList[0].healthState, 10);
    EXPECT_EQ(healthList[1].healthState, 25);
    EXPECT_EQ(sensorHealthMap.at(111).at(7).size(), 1u);
    EXPECT_EQ(sensorHealthMap.at(111).at(7).at(1).healthState, 25);
}

TEST_F(HealthRules, ALastLineWithoutNewlineIsCountedButNotKept) {
    write("111,7,*,1:25\n3,*,0,1:5");
    ASSERT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    ASSERT_EQ(healthList.size(), 1u);
    EXPECT_EQ(healthList[0].eventReadingType, 111);
    EXPECT_TRUE(log.contains(LOG_DEBUG, readLine(2, 1)));
}

TEST_F(HealthRules, MissingFileFailsAndIsTriedAgain) {
    EXPECT_FALSE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_TRUE(log.contains(LOG_ERR, "LoadSensorHealthDataFile: open(" + path +
                                          ") failed 2 No such file or directory"));
    EXPECT_TRUE(healthList.empty());

    write("111,7,*,1:25\n");
    EXPECT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_EQ(healthList.size(), 1u);
    EXPECT_EQ(log.count(loadingLine()), 2u);
}

TEST_F(HealthRules, FileWithoutACompleteLineIsReadOnEveryCall) {
    write("");
    EXPECT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_TRUE(log.contains(LOG_DEBUG, readLine(1, 0)));
    write("tav-ipmi health rules\n111,7,1,1\n");
    EXPECT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_TRUE(log.contains(LOG_DEBUG, readLine(3, 0)));
    EXPECT_TRUE(healthList.empty());

    write("111,7,1,1:25\n");
    EXPECT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_EQ(healthList.size(), 1u);
    EXPECT_EQ(log.count(loadingLine()), 3u);
}

TEST_F(HealthRules, LoadedRulesAreNeverReread) {
    write("111,7,1,1:25\n");
    ASSERT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    write("111,7,1,1:10\n3,*,0,1:5\n");
    EXPECT_TRUE(LoadSensorHealthDataFile(path.c_str()));
    EXPECT_TRUE(LoadSensorHealthDataFile());  // another file does not matter either
    ASSERT_EQ(healthList.size(), 1u);
    EXPECT_EQ(healthList[0].healthState, 25);
    EXPECT_EQ(log.count(loadingLine()), 1u);
    EXPECT_EQ(log.count("tav-ipmi: Loading /etc/sfcb/tav/sensor_health"), 0u);
}

TEST_F(HealthRules, ConcurrentFirstCallsLoadOnce) {
    write("111,7,*,1:25\n111,8,*,1:10\n3,*,0,1:5\n");
    std::vector<std::thread> threads;
    std::vector<char> results(8, 0);
    for (size_t i = 0; i < results.size(); ++i)
        threads.emplace_back([this, &results, i] { results[i] = LoadSensorHealthDataFile(path.c_str()); });
    for (auto& t : threads) t.join();
    for (char r : results) EXPECT_TRUE(r);
    EXPECT_EQ(healthList.size(), 3u);
    EXPECT_EQ(log.count(loadingLine()), 1u);
}

TEST_F(HealthRules, DefaultLoaderReadsTheSystemRulesFile) {
    const char* systemFile = "/etc/sfcb/tav/sensor_health";
    const bool readable = access(systemFile, R_OK) == 0;
    EXPECT_EQ(LoadSensorHealthDataFile(), readable);
    EXPECT_TRUE(log.contains(LOG_DEBUG, std::string("tav-ipmi: Loading ") + systemFile));
}

}  // namespace
