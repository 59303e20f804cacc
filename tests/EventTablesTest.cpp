#include <gtest/gtest.h>

#include <cstring>
#include <fstream>
#include <iterator>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "IpmiEventTables.h"
#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::LogCapture;

namespace {

// A system event record as a controller would log it.
Event_log eventRecord(uint8_t sensorType, uint8_t dirType, uint8_t data1, uint8_t data3 = 0xFF) {
    Event_log r{};
    r.record_id[0] = 0x01;
    r.record_type = SEL_RECORD_TYPE_SYSTEM_EVENT;
    r.generator_id[0] = 0x20;
    r.evm_rev = 0x04;
    r.sensor_type = sensorType;
    r.sensor_number = 0x30;
    r.event_dir_type = dirType;
    r.event_data[0] = data1;
    r.event_data[1] = 0xFF;
    r.event_data[2] = data3;
    return r;
}

std::string describe(const Event_log& r) {
    char line[256];
    build_sel_desc(r, line, sizeof line);
    return line;
}

std::vector<Event_log> readSelFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::vector<char> bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::vector<Event_log> records(bytes.size() / sizeof(Event_log));
    if (!records.empty()) memcpy(records.data(), bytes.data(), records.size() * sizeof(Event_log));
    return records;
}

TEST(EventTables, HoldsOneRowPerKeyInKeyOrder) {
    ASSERT_EQ(sizeof(ipmi_sel_data) / sizeof(ipmi_sel_data[0]), 352u);
    for (size_t i = 1; i < 352; ++i)
        EXPECT_LT(ipmi_sel_data[i - 1].key, ipmi_sel_data[i].key) << "row " << i;
    for (const ipmi_sel_row& row : ipmi_sel_data) {
        EXPECT_EQ(row.reserved, 0u);
        EXPECT_TRUE(row.group && *row.group) << std::hex << row.key;
        uint8_t category = selKeyCategory(row.key);
        EXPECT_TRUE(category == 1 || category == 2) << std::hex << row.key;
        if (category == 1) {
            EXPECT_EQ(selKeyData3(row.key), 0xFF) << std::hex << row.key;
        }
    }
}

TEST(EventTables, EveryKeyHashesToItsOwnRow) {
    for (uint32_t row = 0; row < 352; ++row)
        EXPECT_EQ(perfect_hash_lookup(ipmi_sel_data[row].key), row) << std::hex << ipmi_sel_data[row].key;
    std::set<int32_t> rowsInV(std::begin(V_array), std::end(V_array));
    EXPECT_EQ(rowsInV.size(), 352u);
    EXPECT_EQ(*rowsInV.begin(), 1);
    EXPECT_EQ(*rowsInV.rbegin(), 352);
}

TEST(EventTables, LookupsFindExactlyTheKeysOfTheTable) {
    std::map<uint32_t, const char*> texts;
    for (const ipmi_sel_row& row : ipmi_sel_data) texts[row.key] = row.desc ? row.desc : "";
    auto expected = [&](uint32_t key) {
        auto it = texts.find(key);
        return std::string(it == texts.end() ? "" : it->second);
    };
    for (unsigned type = 0; type < 256; ++type) {
        for (unsigned data1 = 0; data1 < 256; ++data1) {
            ASSERT_EQ(find_generic_desc(type, data1),
                      expected(selKey(SEL_KEY_GENERIC, type, data1, SEL_KEY_ANY_DATA3)));
            for (unsigned data3 : {0x00u, 0x01u, 0x19u, 0x1Au, 0xFFu})
                ASSERT_EQ(find_specific_desc(type, data1, data3),
                          expected(selKey(SEL_KEY_SPECIFIC, type, data1, data3)))
                    << std::hex << type << "/" << data1 << "/" << data3;
        }
    }
}

TEST(EventTables, KeepsTheTextsThatCallersMatchOn) {
    std::vector<std::string> endingInBlank;
    for (const ipmi_sel_row& row : ipmi_sel_data)
        if (row.desc && std::string(row.desc).back() == ' ') endingInBlank.push_back(row.desc);
    EXPECT_EQ(endingInBlank,
              (std::vector<std::string>{"Lower Non-critical going low ", "Lower Critical going low ",
                                        "Lower Non-recoverable going low ", "Upper Non-critical going low ",
                                        "Upper Critical going low ", "Upper Non-recoverable going low "}));
    EXPECT_STREQ(find_specific_desc(0xF1, 0x03, 0xFF), "IPMB-A enabled, IPMP-B enabled");
    EXPECT_STREQ(find_specific_desc(0x08, 0x06, 0x01), "Config Error: Revision Mismatch");
    EXPECT_STREQ(find_specific_desc(0x08, 0x06, 0xFF), "Config Error");
    EXPECT_STREQ(find_specific_desc(0x0F, 0x02, 0x19), "Primary CPU initialization");
    EXPECT_STREQ(find_specific_desc(0x0F, 0x01, 0xFF), "Unknown Hang");
    EXPECT_STREQ(find_specific_desc(0x22, 0x0E, 0xFF), "Unknown");
    EXPECT_STREQ(find_specific_desc(0x22, 0x0D, 0xFF), "");
    // A sensor type without offsets has a row but no text.
    EXPECT_STREQ(find_specific_desc(0x01, 0x00, 0xFF), "");
}

TEST(EventTables, SensorTypeNamesComeFromTheSensorSpecificRows) {
    EXPECT_STREQ(find_sensor_type_name(0x01), "Temperature");
    EXPECT_STREQ(find_sensor_type_name(0x0D), "Drive Slot");
    EXPECT_STREQ(find_sensor_type_name(0x11), "Watchdog 1");
    EXPECT_STREQ(find_sensor_type_name(0x17), "Add-in Card");
    EXPECT_STREQ(find_sensor_type_name(0xF2), "Module Hot Swap");
    EXPECT_EQ(std::string(find_sensor_type_name(0x0F)).rfind("System Firmware ", 0), 0u);
    for (uint8_t none : {0x00, 0x2A, 0x2D, 0x6F, 0xC0, 0xF3, 0xFF})
        EXPECT_EQ(find_sensor_type_name(none), nullptr) << int(none);
}

// The state name tables walked by the sensors are the texted rows of the main
// table, in table order, sharing its strings.
void expectStateNamesOf(uint8_t category, const ipmi_event_type* table) {
    size_t n = 0;
    for (const ipmi_sel_row& row : ipmi_sel_data) {
        if (selKeyCategory(row.key) != category || !row.desc) continue;
        const ipmi_event_type& t = table[n++];
        ASSERT_EQ(t.text, row.desc) << "row " << n - 1;
        EXPECT_EQ(t.code, selKeyType(row.key));
        EXPECT_EQ(t.offset, selKeyData1(row.key));
        EXPECT_EQ(t.qualifier, selKeyData3(row.key));
    }
    EXPECT_EQ(table[n].text, nullptr);
}

TEST(EventTables, StateNameTablesAreTheTextedRows) {
    expectStateNamesOf(1, generic_sensor_event_types);
    expectStateNamesOf(2, sensor_specific_event_types);
    size_t generic = 0, specific = 0;
    while (generic_sensor_event_types[generic].text) ++generic;
    while (sensor_specific_event_types[specific].text) ++specific;
    EXPECT_EQ(generic, 61u);
    EXPECT_EQ(specific, 352u - 61u - 15u);  // 15 sensor types have no offsets
}

TEST(SelDescription, JoinsDirectionSensorTypeAndEventText) {
    LogCapture log;
    EXPECT_EQ(describe(eventRecord(0x01, 0x01, 0x09)), "Assert + Temperature Upper Critical going high");
    EXPECT_EQ(describe(eventRecord(0x01, 0x81, 0x02)), "Deassert + Temperature Lower Critical going low ");
    EXPECT_EQ(describe(eventRecord(0x07, 0x6F, 0x01)), "Assert + Processor Thermal Trip");
    EXPECT_EQ(describe(eventRecord(0x0C, 0x08, 0x01)), "Assert + Memory Device Present");
    EXPECT_EQ(describe(eventRecord(0x08, 0x6F, 0x06, 0x02)),
              "Assert + Power Supply Config Error: Processor Missing");
    EXPECT_EQ(log.lines().size(), 0u);
}

TEST(SelDescription, UsesEventDataOneAndThreeWhole) {
    // Flags for event data 2/3 in use make the threshold lookup miss.
    EXPECT_EQ(describe(eventRecord(0x01, 0x01, 0x59)), "Assert + Temperature ");
    EXPECT_EQ(describe(eventRecord(0x0C, 0x6F, 0x00, 0x00)), "Assert + Memory ");
    EXPECT_EQ(describe(eventRecord(0x01, 0x6F, 0x00)), "Assert + Temperature ");
}

TEST(SelDescription, OtherEventTypesShowOnlyDirectionAndName) {
    EXPECT_EQ(describe(eventRecord(0x1B, 0x1B, 0x00)), "Assert + Cable/Interconnect");
    EXPECT_EQ(describe(eventRecord(0x17, 0x97, 0x01)), "Deassert + Add-in Card");
    EXPECT_EQ(describe(eventRecord(0x01, 0x70, 0x00)), "Assert + Temperature");
    EXPECT_EQ(GetMessage(eventRecord(0x01, 0x70, 0x00)), "N/A");
    EXPECT_EQ(GetMessage(eventRecord(0x1B, 0x1B, 0x00)), "N/A");
}

TEST(SelDescription, SensorTypesWithoutNameStillGiveALine) {
    EXPECT_EQ(describe(eventRecord(0x2D, 0x01, 0x09)), "Assert +  Upper Critical going high");
    EXPECT_EQ(describe(eventRecord(0x2A, 0x6F, 0x00)), "Assert +  ");
    EXPECT_EQ(describe(eventRecord(0x2A, 0x70, 0x00)), "Assert + ");
}

TEST(SelDescription, OldEventRevisionsAreNotDescribed) {
    LogCapture log;
    Event_log r = eventRecord(0x01, 0x01, 0x09);
    r.evm_rev = 3;
    EXPECT_EQ(describe(r), "n/a");
    EXPECT_TRUE(log.contains(LOG_ERR, "build_sel_desc: no description for SEL with IPMI version is 3, expect > 4"));
    EXPECT_EQ(log.lines().size(), 1u);
}

TEST(SelDescription, RecordTypeZeroIsAnEventRecord) {
    LogCapture log;
    Event_log r = eventRecord(0x01, 0x01, 0x09);
    r.record_type = 0x00;
    EXPECT_EQ(describe(r), "Assert + Temperature Upper Critical going high");
    EXPECT_EQ(log.lines().size(), 0u);
}

TEST(SelDescription, OtherRecordTypesLogButAreStillDescribed) {
    LogCapture log;
    Event_log r = eventRecord(0x01, 0x01, 0x09);
    r.record_type = 0xC0;
    EXPECT_EQ(describe(r), "Assert + Temperature Upper Critical going high");
    EXPECT_TRUE(log.contains(LOG_ERR, "build_sel_desc: no description for SEL type=192 (support only 2)"));
}

TEST(SelDescription, CutsTheLineToTheBufferWithoutWritingPastIt) {
    const std::string full = "Deassert + System ACPI Power State S1: sleeping with system hw & processor context maintained";
    Event_log r = eventRecord(0x22, 0xEF, 0x01);
    build_sel_desc(r, nullptr, 0);
    for (int size = 0; size <= int(full.size()) + 2; ++size) {
        std::vector<char> buf(size_t(size) + 1, '#');  // one guard byte
        build_sel_desc(r, buf.data(), size);
        EXPECT_EQ(buf[size], '#') << "size " << size;
        if (size > 0) {
            EXPECT_EQ(std::string(buf.data()), full.substr(0, size - 1)) << "size " << size;
        }
    }
    std::vector<char> tiny(2, '#');
    r.evm_rev = 1;
    build_sel_desc(r, tiny.data(), 1);
    EXPECT_EQ(tiny[0], '\0');
    EXPECT_EQ(tiny[1], '#');
}

TEST(SelMessage, GivesTheEventTextAlone) {
    EXPECT_EQ(GetMessage(eventRecord(0x01, 0x81, 0x09)), "Upper Critical going high");
    EXPECT_EQ(GetMessage(eventRecord(0x0F, 0x6F, 0x00, 0x0B)), "BIOS corruption detected");
    EXPECT_EQ(GetMessage(eventRecord(0x22, 0x6F, 0x03)),
              "S3: sleeping, processor & hw context lost, memory retained");
    EXPECT_EQ(GetMessage(eventRecord(0x0F, 0x6F, 0x00, 0x0E)), "");
    EXPECT_EQ(GetMessage(eventRecord(0x01, 0x6F, 0x00)), "");
}

TEST(SelDescription, RealHotSwapRecordHasAnOemEventType) {
    std::string path = TestSupport::realDataPath("sel/pyipmi_kontron_picmg_hotswap.sel");
    SKIP_WITHOUT_REAL_DATA(path);
    std::vector<Event_log> records = readSelFile(path);
    ASSERT_EQ(records.size(), 1u);
    EXPECT_EQ(describe(records[0]), "Assert + Module Hot Swap");
    EXPECT_EQ(GetMessage(records[0]), "N/A");
}

TEST(SelDescription, RealOemRecordIsNotDescribed) {
    std::string path = TestSupport::realDataPath("sel/issue_ipmitool384_oem_ts_df.sel");
    SKIP_WITHOUT_REAL_DATA(path);
    LogCapture log;
    std::vector<Event_log> records = readSelFile(path);
    ASSERT_EQ(records.size(), 1u);
    EXPECT_EQ(describe(records[0]), "n/a");
    EXPECT_TRUE(log.contains(LOG_ERR, "build_sel_desc: no description for SEL type=223 (support only 2)"));
    EXPECT_TRUE(log.contains(LOG_ERR, "build_sel_desc: no description for SEL with IPMI version is 0, expect > 4"));
}

}  // namespace
