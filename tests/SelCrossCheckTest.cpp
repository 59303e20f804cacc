// The tool's `sel` view, ipmitool `sel elist` and FreeIPMI `ipmi-sel` read the
// same simulated SEL: they must list the same records with the same IDs,
// times, sensor numbers and types, and event texts.

#include <gtest/gtest.h>

#include <ctype.h>
#include <stdlib.h>
#include <time.h>

#include "PeerTools.h"
#include "TestSupport.h"

namespace {

using namespace TestSupport;

// One record as a tool prints it; empty fields are not compared.
struct Row {
    long id = -1;
    std::string time;    // "YYYY-MM-DD HH:MM:SS", UTC
    long sensor = -1;    // sensor number
    std::string type;    // sensor type name
    std::string event;   // event text
};

// Texts where a peer says the same thing in other words than the library's
// event tables (and the sensor type names they share).
std::string canonical(std::string s) {
    static const std::pair<std::string, std::string> kSameMeaning[] = {
        {"correctable memory error", "correctable ecc"},  // FreeIPMI's event text
        {"watchdog2 ", "watchdog 2 "},                     // ipmitool's sensor type name
    };
    s = lower(trim(s.substr(0, s.find(" ; "))));  // FreeIPMI appends readings
    for (size_t at; (at = s.find(" - ")) != std::string::npos;) s.replace(at, 3, " ");
    for (const auto& same : kSameMeaning)
        if (s.compare(0, same.first.size(), same.first) == 0) s.replace(0, same.first.size(), same.second);
    return s;
}

std::string timeText(const std::string& text, const char* format) {
    struct tm tm = {};
    if (strptime(text.c_str(), format, &tm) == nullptr) return "?" + text;
    char out[32];
    strftime(out, sizeof out, "%Y-%m-%d %H:%M:%S", &tm);
    return out;
}

// Where each tool prints what, by field between the '|'s.
struct Layout {
    size_t fields;
    bool exactly;  // or at least that many
    int idBase;
    int date, clock;  // clock -1: the date field has the time too
    const char* timeFormat;
    int sensor;  // -1: no sensor number
    const char* sensorMark;
    size_t numberAfterMark;
    int sensorBase;
    int type;
    bool canonicalType;  // our caption is compared by containment as it stands
    int event;
};

// "  0004 | 2025-11-24 07:33:48 | Inlet Temp #0x01 | Assert + Temperature Upper ... | major | Upper ..."
const Layout kOurs{6, true, 10, 1, -1, "%Y-%m-%d %H:%M:%S", 2, "#0x", 1, 16, 3, false, 5};
// "   4 | 11/24/25 | 07:33:48 UTC | Temperature Inlet Temp | Upper Non-critical going high | Asserted | ..."
const Layout kIpmitool{6, false, 16, 1, 2, "%m/%d/%y %H:%M:%S", -1, "", 0, 0, 3, true, 4};
// "4 | Nov-24-2025 | 07:33:48 | Sensor #1 | Temperature | Upper Non-critical - going high ; ..."
const Layout kFreeIpmi{6, true, 10, 1, 2, "%b-%d-%Y %H:%M:%S", 3, "Sensor #", 8, 10, 4, true, 5};

std::vector<Row> rowsOf(const std::string& out, const Layout& l) {
    std::vector<Row> rows;
    for (const auto& line : lines(out)) {
        const auto f = split(line, '|');
        if (f.size() < l.fields || (l.exactly && f.size() != l.fields) || trim(f[0]) == "ID") continue;
        Row r;
        r.id = strtol(trim(f[0]).c_str(), nullptr, l.idBase);
        const std::string clock = l.clock < 0 ? "" : trim(f[l.clock]);
        r.time = timeText(trim(f[l.date]) + (l.clock < 0 ? "" : " " + clock.substr(0, clock.find(' '))), l.timeFormat);
        const size_t mark = l.sensor < 0 ? std::string::npos : f[l.sensor].find(l.sensorMark);
        if (mark != std::string::npos)
            r.sensor = strtol(f[l.sensor].c_str() + mark + l.numberAfterMark, nullptr, l.sensorBase);
        r.type = l.canonicalType ? canonical(f[l.type]) : trim(f[l.type]);
        r.event = canonical(f[l.event]);
        rows.push_back(r);
    }
    return rows;
}

class SelPeerCrossCheck : public ::testing::TestWithParam<std::string> {
protected:
    void SetUp() override {
        SKIP_WITHOUT_TOOL("ipmitool");
        SKIP_WITHOUT_TOOL("ipmi-sel");
        setenv("TZ", "UTC", 1);  // the peers print local time
    }
};

// Records with a standard event type carry type and text in all three; OEM
// records only their ID and time (and FreeIPMI its sensor number).
TEST_P(SelPeerCrossCheck, AllToolsListTheSameRecords) {
    ToolRun mine = runTool(GetParam(), TAV_IPMI_TOOL, {"sel"});
    ToolRun elist = runTool(GetParam(), toolPath("ipmitool"), {"-I", "open", "sel", "elist"});
    ToolRun fi = runTool(GetParam(), toolPath("ipmi-sel"), {"--driver-type=OPENIPMI", "--ignore-sdr-cache"});
    ASSERT_EQ(mine.exitCode, 0) << mine.err;
    ASSERT_EQ(elist.exitCode, 0) << elist.err;
    ASSERT_EQ(fi.exitCode, 0) << fi.err;
    auto ours = rowsOf(mine.out, kOurs), tool = rowsOf(elist.out, kIpmitool), free = rowsOf(fi.out, kFreeIpmi);
    ASSERT_FALSE(ours.empty()) << mine.out;
    ASSERT_EQ(ours.size(), tool.size()) << elist.out;
    ASSERT_EQ(ours.size(), free.size()) << fi.out;
    for (size_t i = 0; i < ours.size(); ++i) {
        SCOPED_TRACE(lines(mine.out)[i + 2]);
        EXPECT_EQ(ours[i].id, tool[i].id);
        EXPECT_EQ(ours[i].id, free[i].id);
        EXPECT_EQ(ours[i].time, tool[i].time);
        EXPECT_EQ(ours[i].time, free[i].time);
        if (ours[i].sensor >= 0) {
            EXPECT_EQ(ours[i].sensor, free[i].sensor);
        }
        if (ours[i].type.empty()) continue;  // no caption: an OEM event type or record
        EXPECT_NE(lower(ours[i].type).find(" " + free[i].type + " "), std::string::npos) << free[i].type;
        EXPECT_EQ(tool[i].type.compare(0, free[i].type.size() + 1, free[i].type + " "), 0) << tool[i].type;
        EXPECT_EQ(ours[i].event, tool[i].event);
        EXPECT_EQ(ours[i].event, free[i].event);
    }
}

std::vector<std::string> selProfiles() {
    std::vector<std::string> all{"default"};
    for (const auto& f : realDataFiles("sel", ".sel")) all.push_back(f);
    return all;
}

INSTANTIATE_TEST_SUITE_P(Sel, SelPeerCrossCheck, ::testing::ValuesIn(selProfiles()), profileTestName);

}  // namespace
