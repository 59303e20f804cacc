// The event description table, its perfect hash and lookups, and the one-line
// SEL record description.

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <map>
#include <string>
#include <vector>

#include "IpmiEventTables.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

using TestSupport::eventRecord;

std::string describe(const Event_log& r) {
    char line[256];
    build_sel_desc(r, line, sizeof line);
    return line;
}

TEST(EventTables, EveryOneOfThe352KeysHashesToItsOwnRowAndNoOtherKeyFindsText) {
    ASSERT_EQ(std::size(ipmi_sel_data), 352u);
    std::map<uint32_t, std::string> texts;
    for (uint32_t row = 0; row < 352; ++row) {
        const ipmi_sel_row& r = ipmi_sel_data[row];
        EXPECT_TRUE(row == 0 || ipmi_sel_data[row - 1].key < r.key) << "row " << row;
        EXPECT_EQ(perfect_hash_lookup(r.key), row) << std::hex << r.key;
        texts[r.key] = r.desc ? r.desc : "";
    }
    auto expected = [&](uint32_t key) { return texts.count(key) ? texts[key] : std::string(); };
    for (unsigned type = 0; type < 256; ++type) {
        for (unsigned data1 = 0; data1 < 256; ++data1) {
            const uint32_t generic = selKey(SEL_KEY_GENERIC, type, data1, SEL_KEY_ANY_DATA3);
            ASSERT_EQ(find_generic_desc(type, data1), expected(generic)) << std::hex << generic;
            for (unsigned data3 : {0x00u, 0x01u, 0x19u, 0x1Au, 0xFFu}) {
                const uint32_t specific = selKey(SEL_KEY_SPECIFIC, type, data1, data3);
                ASSERT_EQ(find_specific_desc(type, data1, data3), expected(specific)) << std::hex << specific;
            }
        }
    }
}

TEST(EventTables, TextsAreKeptAsTheyStandAndSomeAreKeyedOnEventDataThree) {
    EXPECT_EQ(std::count_if(std::begin(ipmi_sel_data), std::end(ipmi_sel_data),
                            [](const ipmi_sel_row& row) { return row.desc && std::string(row.desc).back() == ' '; }),
              6);  // the threshold "going low" texts
    EXPECT_STREQ(find_specific_desc(0xF1, 0x03, 0xFF), "IPMB-A enabled, IPMP-B enabled");
    // Firmware progress is keyed on event data 3.
    EXPECT_STREQ(find_specific_desc(0x0F, 0x02, 0x19), "Primary CPU initialization");
    EXPECT_STREQ(find_specific_desc(0x08, 0x06, 0x01), "Config Error: Revision Mismatch");
    EXPECT_STREQ(find_specific_desc(0x01, 0x00, 0xFF), "");  // a type without offsets: a row, no text
}

TEST(SelDescription, JoinsDirectionSensorTypeNameAndEventTextOldRevisionsGiveNA) {
    TestSupport::LogCapture log;
    const struct { Event_log record; const char* line; const char* message; } cases[] = {
        {eventRecord(0x01, 0x01, 0x09), "Assert + Temperature Upper Critical going high", "Upper Critical going high"},
        {eventRecord(0x01, 0x81, 0x02), "Deassert + Temperature Lower Critical going low ",
         "Lower Critical going low "},
        {eventRecord(0x07, 0x6F, 0x01), "Assert + Processor Thermal Trip", "Thermal Trip"},
        {eventRecord(0x08, 0x6F, 0x06, 0xFF, 0x02), "Assert + Power Supply Config Error: Processor Missing",
         "Config Error: Processor Missing"},
        // Event data 1 counts whole: flags for event data 2/3 in use miss the text.
        {eventRecord(0x01, 0x01, 0x59), "Assert + Temperature ", ""},
        // Other event types: direction and name only; generic rows of 0x17 and 0x1B are never looked up.
        {eventRecord(0x1B, 0x1B, 0x00), "Assert + Cable/Interconnect", "N/A"},
        {eventRecord(0x01, 0x70, 0x00), "Assert + Temperature", "N/A"},
        // A sensor type without a name still gives a line.
        {eventRecord(0x2D, 0x01, 0x09), "Assert +  Upper Critical going high", "Upper Critical going high"},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(describe(c.record), c.line);
        EXPECT_EQ(GetMessage(c.record), c.message) << c.line;
    }
    Event_log r = eventRecord(0x01, 0x01, 0x09);
    r.record_type = 0x00;  // an event record too
    EXPECT_EQ(describe(r), "Assert + Temperature Upper Critical going high");
    EXPECT_EQ(log.lines().size(), 0u);

    // Old revisions are not described; other record types are logged, then described.
    r.evm_rev = 3;
    EXPECT_EQ(describe(r), "n/a");
    EXPECT_TRUE(log.contains(LOG_ERR, "build_sel_desc: no description for SEL with IPMI version is 3, expect > 4"));
    r.evm_rev = 4;
    r.record_type = 0xC0;
    EXPECT_EQ(describe(r), "Assert + Temperature Upper Critical going high");
    EXPECT_TRUE(log.contains(LOG_ERR, "build_sel_desc: no description for SEL type=192 (support only 2)"));
    EXPECT_EQ(log.lines().size(), 2u);
}

TEST(SelDescription, CutsTheLineToTheBufferWithoutWritingPastIt) {
    const std::string full =
        "Deassert + System ACPI Power State S1: sleeping with system hw & processor context maintained";
    Event_log r = eventRecord(0x22, 0xEF, 0x01);
    build_sel_desc(r, nullptr, 0);
    for (int size = 0; size <= int(full.size()) + 2; ++size) {
        std::vector<char> buf(size_t(size) + 1, '#');  // one guard byte
        build_sel_desc(r, buf.data(), size);
        EXPECT_EQ(buf[size], '#') << "size " << size;
        if (size == 0) continue;
        EXPECT_EQ(std::string(buf.data()), full.substr(0, size - 1)) << "size " << size;
    }
    std::vector<char> tiny(2, '#');
    r.evm_rev = 1;  // "n/a" into one byte
    build_sel_desc(r, tiny.data(), 1);
    EXPECT_EQ(std::string(tiny.data(), 2), std::string("\0#", 2));
}

TEST(SelDescription, RealOemRecordsFromServers) {
    const std::string hotSwap = TestSupport::realDataPath("sel/pyipmi_kontron_picmg_hotswap.sel");
    const std::string oem = TestSupport::realDataPath("sel/issue_ipmitool384_oem_ts_df.sel");
    SKIP_WITHOUT_REAL_DATA(hotSwap);
    SKIP_WITHOUT_REAL_DATA(oem);
    auto firstRecord = [](const std::string& path) {
        Event_log r{};
        EXPECT_TRUE(std::ifstream(path, std::ios::binary).read(reinterpret_cast<char*>(&r), sizeof r)) << path;
        return r;
    };
    EXPECT_EQ(describe(firstRecord(hotSwap)), "Assert + Module Hot Swap");  // an OEM event type
    EXPECT_EQ(GetMessage(firstRecord(hotSwap)), "N/A");
    EXPECT_EQ(describe(firstRecord(oem)), "n/a");  // an OEM record type, revision 0
}

}  // namespace
