// Our sensor decodings next to two independent decoders: ipmitool and
// FreeIPMI's ipmi-sensors, run against the same simulated controller (the
// preload library) on the same profile, and the reference decodings that
// were captured from OpenIPMI's ipmi_sim with the real servers' data.
//
// Where the library keeps a behaviour that makes its answer differ from the
// tools', or where ipmi_sim differs from a real controller, the difference is
// named in a normalisation below; anything else that differs fails.

#include <math.h>
#include <stdlib.h>

#include <algorithm>
#include <cctype>
#include <functional>
#include <map>
#include <set>

#include "CmpiStatus.h"
#include "IpmiIfc.h"
#include "IpmiSensor.h"
#include "PeerTools.h"
#include "SdrLayout.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using namespace TestSupport;
using SensorPtr = std::shared_ptr<IpmiSensor>;

// ---------------------------------------------------------------- values

// A number as a tool printed it, with half a unit of its last printed digit
// as the rounding it allows.
struct Printed {
    bool present = false;
    double value = 0.0;
    double tolerance = 0.0;
    std::string unit;  // whatever followed the number
};

Printed parsePrinted(const std::string& text) {
    Printed p;
    const std::string t = trim(text);
    const char* start = t.c_str();
    char* end = nullptr;
    const double v = strtod(start, &end);
    if (end == start) return p;
    const std::string number(start, static_cast<const char*>(end));
    const size_t dot = number.find('.');
    const size_t decimals = dot == std::string::npos ? 0 : number.size() - dot - 1;
    p.present = true;
    p.value = v;
    p.tolerance = 0.5 * pow(10.0, -static_cast<double>(decimals)) + 1e-9 * fabs(v);
    p.unit = trim(end);
    return p;
}

bool near(double ours, const Printed& theirs) { return fabs(ours - theirs.value) <= theirs.tolerance; }

// ---------------------------------------------------------------- the library's view

struct Ours {
    SensorPtr sensor;
    std::string name;  // ID string with the library's instance suffix
    std::string idString;  // the same without the suffix
    uint16_t recordId = 0;
    uint8_t recordType = 0;
    uint8_t owner = 0;
    uint8_t number = 0;
    bool firstOfRecord = true;  // the record as read, not one of its shared copies
    bool suffixed = false;
    bool alphabeticSuffix = false;
    uint8_t instanceOffset = 0;
    uint8_t shareCount = 0;        // as this sensor's copy of the record says
    uint8_t recordShareCount = 0;  // as the record itself says
    IpmiEntity entity;
    std::string typeText;
    std::string unitText;
    bool percentage = false;
    bool readingPresent = false;
    double value = 0.0;
    unsigned state = 0;

    bool isFull() const { return recordType == sdr::type::fullSensor; }
    bool isEventOnly() const { return recordType == sdr::type::eventOnly; }
    bool isThreshold() const { return !sensor->isDiscrete(); }
    // Threshold sensors of full records: the only ones with a reading in units.
    // (In command-line mode the library gives a compact record with no
    // modifier unit the name of its event/reading type as base unit; the
    // tools print no unit for those, so compact records are not compared.)
    bool analog() const { return isFull() && isThreshold() && sensor->isConvertible(); }
};

sdr::SdrView recordOf(const IpmiSensor& s) {
    const unsigned char* bytes = nullptr;
    int length = 0;
    s.RawRecord(bytes, length);
    return sdr::SdrView(bytes, static_cast<size_t>(length));
}

// The library names each sensor of a compact or event-only record whose share
// count is not 0 with an instance suffix, one record-sharing sensor included
// (share count 1), and writes an alphabetic suffix as the letter's character
// code. Its ID string is what comes before that suffix.
void describeSuffix(Ours& o) {
    const sdr::SdrView rec = recordOf(*o.sensor);
    const sdr::SensorRecordOffsets at = sdr::sensorRecordOffsets(rec.recordType());
    if (at.sharing == 0) return;
    const sdr::SharingView sharing{rec.byteAt(at.sharing), rec.byteAt(at.instanceModifier)};
    o.shareCount = sharing.shareCount();
    o.instanceOffset = sharing.instanceModifierOffset();
    o.alphabeticSuffix = sharing.instanceModifierType() != 0;
    constexpr uint8_t kLastSuffixedOffset = 75;  // alphabetic offsets above this get none
    o.suffixed = o.shareCount != 0 && !(o.alphabeticSuffix && o.instanceOffset > kLastSuffixedOffset);
    if (o.suffixed) {
        const size_t blank = o.name.rfind(' ');
        o.idString = blank == std::string::npos ? o.name : o.name.substr(0, blank);
    }
}

// Every sensor the library hands out, with its first reading refreshed once.
std::vector<Ours> librarySensors() {
    std::vector<Ours> out;
    for (const SensorPtr& s : IpmiIfc::getSensors()) {
        Ours o;
        o.sensor = s;
        o.name = s->getSensorIdString();
        o.idString = o.name;
        o.recordId = s->getSensorRecordNumber();
        o.recordType = recordOf(*s).recordType();
        o.owner = s->getOwnerId();
        o.number = s->getSensorNumber();
        o.entity = s->getEntity();
        o.typeText = s->getSensorTypeString();
        o.unitText = s->getBaseUnitString();
        o.percentage = (s->getFlags() & IpmiSensor::FLAG_PERCENTAGE) != 0;
        describeSuffix(o);
        if (o.analog()) {
            const unsigned raw = s->getReading();
            o.readingPresent = !s->readingStateUnavailable() && !s->scanningDisabled();
            o.value = s->convertRawValue(raw);
            try {
                o.state = s->getState(false);
            } catch (const kelInt::CmpiStatus&) {
            }
        }
        out.push_back(o);
    }
    // Shared copies carry the record ID of the record as read, follow it with
    // higher sensor numbers and count one sensor less each.
    for (Ours& o : out) {
        o.recordShareCount = o.shareCount;
        for (const Ours& other : out) {
            if (other.recordId != o.recordId || other.recordType != o.recordType || other.owner != o.owner) continue;
            if (other.number < o.number && o.shareCount != 0) o.firstOfRecord = false;
            o.recordShareCount = std::max(o.recordShareCount, other.shareCount);
        }
    }
    return out;
}

// ---------------------------------------------------------------- normalisations

// Type names. Both tools spell some sensor types differently from the
// library's table; these are the wordings, not different meanings. Texts
// are compared without blanks, punctuation and case ("Cable/Interconnect",
// "Add In Card").
std::string squeezed(const std::string& s) {
    std::string out;
    for (unsigned char c : s)
        if (isalnum(c)) out += static_cast<char>(tolower(c));
    return out;
}

std::string ipmitoolTypeName(uint8_t code, const std::string& ours) {
    switch (code) {
    case 0x0F: return "System Firmwares";
    case 0x11: return "Watchdog1";  // the library names 0x11 and 0x23 both "Watchdog"
    case 0x23: return "Watchdog2";
    case 0x28: return "Management Subsys Health";
    }
    // Beyond the table: the library writes "OEM Reserved #" and the code.
    if (code > 0x2C) return "Unknown";
    return ours;
}

std::string freeIpmiTypeName(uint8_t code, const std::string& ours) {
    switch (code) {
    case 0x06: return "Platform Security Violation Attempt";
    case 0x0B: return "Other Units Based Sensor";
    case 0x0D: return "Drive Slot";
    case 0x0F: return "System Firmware Progress";
    case 0x11: return "Watchdog 1";
    case 0x14: return "Button/Switch";
    case 0x16: return "Microcontroller/Coprocessor";
    case 0x1D: return "System Boot/Restart Initiated";
    case 0x23: return "Watchdog 2";
    }
    if (code > 0x2C) return "OEM Reserved";
    return ours;
}

// Units. The library names only the base unit and leaves the percentage to
// getFlags(); the tools print a percentage sensor's unit as "percent" or "%".
std::string ipmitoolUnit(const Ours& o) { return o.percentage ? "percent" : o.unitText; }
std::string freeIpmiUnit(const Ours& o) { return o.percentage ? "%" : o.unitText; }

// FreeIPMI abbreviates units unless asked not to; its reference decodings
// were captured with the abbreviations.
std::string freeIpmiAbbreviation(const Ours& o) {
    static const std::map<std::string, std::string> kAbbreviated = {
        {"degrees C", "C"}, {"degrees F", "F"}, {"degrees K", "K"}, {"Volts", "V"}, {"Amps", "A"}, {"Watts", "W"},
    };
    if (o.percentage) return "%";
    auto it = kAbbreviated.find(o.unitText);
    return it == kAbbreviated.end() ? o.unitText : it->second;
}

// Names. ipmitool names a shared record once, by its ID string; so does
// FreeIPMI unless asked to list every shared sensor, and then it appends the
// instance number (or letter) only for records shared by two or more sensors.
std::string singleName(const Ours& o) { return trim(o.idString); }

std::string sharedName(const Ours& o) {
    if (!o.suffixed || o.recordShareCount < 2) return singleName(o);
    if (!o.alphabeticSuffix) return trim(o.name);
    // The library streams the letter as its character code.
    constexpr uint8_t kLettersInAlphabet = 26;
    if (o.instanceOffset < kLettersInAlphabet)
        return trim(o.idString + " " + std::string(1, static_cast<char>('A' + o.instanceOffset)));
    return trim(o.name);  // two-letter suffixes: left as the library writes them
}

// ipmitool's status column for a threshold sensor's comparison bits.
std::string ipmitoolStatus(unsigned bits) {
    const struct {
        unsigned bit;
        const char* text;
    } order[] = {{sdr::bits::lowerNonRecoverable, "lnr"}, {sdr::bits::lowerCritical, "lcr"},
                 {sdr::bits::lowerNonCritical, "lnc"},    {sdr::bits::upperNonRecoverable, "unr"},
                 {sdr::bits::upperCritical, "ucr"},       {sdr::bits::upperNonCritical, "unc"}};
    for (const auto& o : order)
        if (bits & o.bit) return o.text;
    return "ok";
}

// ---------------------------------------------------------------- the tools' views

struct ElistRow {
    std::string name;
    unsigned number = 0;
    std::string status;
    unsigned entityId = 0;
    unsigned entityInstance = 0;
    std::string reading;
    bool used = false;
};

// `ipmitool sdr elist`: name | number | status | entity | reading.
std::vector<ElistRow> parseElist(const std::string& text) {
    std::vector<ElistRow> rows;
    for (const std::string& line : lines(text)) {
        const std::vector<std::string> f = split(line, '|', 5);
        if (f.size() != 5) continue;
        ElistRow r;
        r.name = trim(f[0]);
        r.number = static_cast<unsigned>(strtoul(trim(f[1]).c_str(), nullptr, 16));
        r.status = trim(f[2]);
        const std::string entity = trim(f[3]);
        if (sscanf(entity.c_str(), "%u.%u", &r.entityId, &r.entityInstance) != 2) continue;
        r.reading = trim(f[4]);
        rows.push_back(r);
    }
    return rows;
}

// The row of this sensor: same name and number, preferably the same entity
// (controllers behind the BMC reuse names and numbers).
ElistRow* findRow(std::vector<ElistRow>& rows, const Ours& o) {
    ElistRow* any = nullptr;
    for (ElistRow& r : rows) {
        if (r.used || r.name != singleName(o) || r.number != o.number) continue;
        if (r.entityId == o.entity.id && r.entityInstance == o.entity.instance) {
            r.used = true;
            return &r;
        }
        if (any == nullptr) any = &r;
    }
    if (any) any->used = true;
    return any;
}

struct CsvRow {
    unsigned recordId = 0;
    std::string name, type, reading, units, event;
    bool used = false;
};

// ipmi-sensors --comma-separated-output: ID,Name,Type,Reading,Units,Event.
std::vector<CsvRow> parseFreeIpmiCsv(const std::string& text) {
    std::vector<CsvRow> rows;
    for (const std::string& line : lines(text)) {
        const std::vector<std::string> f = split(line, ',', 6);
        if (f.size() != 6 || f[0].empty() || !isdigit(static_cast<unsigned char>(f[0][0]))) continue;
        CsvRow r;
        r.recordId = static_cast<unsigned>(strtoul(f[0].c_str(), nullptr, 10));
        r.name = trim(f[1]);
        r.type = f[2];
        r.reading = f[3];
        r.units = f[4];
        r.event = f[5];
        rows.push_back(r);
    }
    return rows;
}

// One block of a verbose listing: "key : value" lines, keys trimmed.
using Block = std::map<std::string, std::string>;

std::vector<Block> parseBlocks(const std::string& text, const std::string& firstKey) {
    std::vector<Block> blocks;
    for (const std::string& line : lines(text)) {
        const size_t colon = line.find(':');
        if (colon == std::string::npos) continue;
        const std::string key = trim(line.substr(0, colon));
        const std::string value = trim(line.substr(colon + 1));
        if (key == firstKey) blocks.emplace_back();
        if (!blocks.empty() && blocks.back().count(key) == 0) blocks.back()[key] = value;
    }
    return blocks;
}

std::string field(const Block& b, const std::string& key) {
    auto it = b.find(key);
    return it == b.end() ? std::string() : it->second;
}

// ---------------------------------------------------------------- the fixture

std::vector<std::string> allProfiles() {
    std::vector<std::string> all{"default"};
    for (const auto& f : realDataFiles("sim", ".emu")) all.push_back(f);
    for (const auto& f : realDataFiles("sdr", ".sdr")) all.push_back(f);
    return all;
}

class DecoderCrossCheck : public TestSupport::SimTest {
protected:
    // The library in command-line mode, as the tool runs it, on `profile`.
    std::vector<Ours> libraryOn(const std::string& profile) {
        try {
            useBmc(Sim::loadProfile(profile == "default" ? Sim::defaultProfilePath() : profile));
        } catch (const std::exception& e) {
            // Templates and files that include others under their published names.
            loadFailure_ = e.what();
            return std::vector<Ours>();
        }
        _setState(0, IpmiIfc::IPMI_STATE_CLI);
        EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
        return librarySensors();
    }

    std::string loadFailure_;

    // The record a tool row stands for, from the controller's repository.
    const std::vector<uint8_t>* recordWithId(unsigned id) {
        for (const auto& r : bmc().sdr.records)
            if (sdr::SdrView(r.data(), r.size()).recordId() == id) return &r;
        return nullptr;
    }
};

// Records the library builds no sensor for, on purpose: sensors of event/reading
// types it does not handle, and discrete sensors of entity 0x00 (unspecified)
// and 0x22 (BIOS), which callers never see.
bool leftOutOnPurpose(const std::vector<uint8_t>& record) {
    const sdr::SdrView rec(record.data(), record.size());
    auto generic = [](uint8_t t) { return t >= 0x02 && t <= 0x0C; };
    auto oem = [](uint8_t t) { return t >= 0x70 && t <= 0x7F; };
    uint8_t eventReadingType;
    bool handled;
    if (rec.isEventOnly()) {
        const sdr::EventOnlyView e(record.data(), record.size());
        eventReadingType = e.eventReadingType();
        // The OEM range is looked for in byte 13 of an event-only record.
        handled = eventReadingType == 0x01 || generic(eventReadingType) || eventReadingType == 0x6F ||
                  oem(e.sharingBytes().instanceModifier);
    } else {
        eventReadingType = sdr::SensorRecordView(rec).eventReadingType();
        handled = eventReadingType == 0x01 || generic(eventReadingType) || eventReadingType == 0x6F ||
                  oem(eventReadingType);
    }
    if (!handled) return true;
    const uint8_t entity = sdr::SensorKeyView(rec).entityId();
    return eventReadingType != 0x01 && (entity == 0x00 || entity == 0x22);
}

// ------------------------------------------------ live: the same simulated controller

class LiveDecoders : public DecoderCrossCheck, public ::testing::WithParamInterface<std::string> {};

TEST_P(LiveDecoders, IpmitoolSeesTheSameNamesEntitiesAndReadings) {
    SKIP_WITHOUT_TOOL("ipmitool");
    const std::vector<Ours> ours = libraryOn(GetParam());
    if (!loadFailure_.empty()) GTEST_SKIP() << "the simulator cannot load this profile: " << loadFailure_;
    std::vector<ElistRow> rows =
        parseElist(runTool(GetParam(), toolPath("ipmitool"), {"-I", "open", "sdr", "elist", "all"}).out);
    ASSERT_FALSE(rows.empty()) << "ipmitool printed nothing";

    size_t compared = 0;
    for (const Ours& o : ours) {
        if (!o.firstOfRecord) continue;  // ipmitool lists a shared record once
        SCOPED_TRACE(o.name + " #" + std::to_string(o.number));
        ElistRow* row = findRow(rows, o);
        ASSERT_NE(row, nullptr) << "ipmitool does not list it";
        EXPECT_EQ(row->entityId, o.entity.id);
        EXPECT_EQ(row->entityInstance, o.entity.instance);
        if (!o.analog()) continue;
        const Printed theirs = parsePrinted(row->reading);
        EXPECT_EQ(theirs.present, o.readingPresent) << "ipmitool: " << row->reading;
        if (!theirs.present || !o.readingPresent) continue;
        ++compared;
        EXPECT_TRUE(near(o.value, theirs)) << o.value << " vs " << row->reading;
        EXPECT_EQ(theirs.unit, ipmitoolUnit(o));
        EXPECT_EQ(row->status, ipmitoolStatus(o.state));
    }
    RecordProperty("readings compared", static_cast<int>(compared));
}

TEST_P(LiveDecoders, FreeIpmiSeesTheSameSensorsTypesAndReadings) {
    SKIP_WITHOUT_TOOL("ipmi-sensors");
    const std::vector<Ours> ours = libraryOn(GetParam());
    if (!loadFailure_.empty()) GTEST_SKIP() << "the simulator cannot load this profile: " << loadFailure_;
    const std::string output = runIpmiSensors(GetParam(), {"--comma-separated-output", "--no-header-output",
                                                           "--non-abbreviated-units", "--shared-sensors"})
                                   .out;
    std::vector<CsvRow> rows = parseFreeIpmiCsv(output);

    // FreeIPMI lists every reading sensor of the BMC's own, and records of
    // other owners as far as it understands them.
    constexpr uint8_t kBmc = 0x20;
    for (const Ours& o : ours) {
        if (o.isEventOnly()) continue;  // no reading: FreeIPMI leaves them out
        SCOPED_TRACE(o.name + " #" + std::to_string(o.number));
        CsvRow* row = nullptr;
        for (CsvRow& r : rows)
            if (!r.used && r.recordId == o.recordId && r.name == sharedName(o)) {
                row = &r;
                break;
            }
        if (row == nullptr && o.owner != kBmc) continue;
        ASSERT_NE(row, nullptr) << "FreeIPMI does not list it as " << sharedName(o);
        row->used = true;
        EXPECT_EQ(squeezed(row->type), squeezed(freeIpmiTypeName(o.sensor->getSensorType(), o.typeText)))
            << row->type << " vs " << o.typeText;
        if (!o.analog()) continue;
        const Printed theirs = parsePrinted(row->reading);
        EXPECT_EQ(theirs.present, o.readingPresent) << "FreeIPMI: " << row->reading;
        EXPECT_EQ(row->units, freeIpmiUnit(o));
        if (theirs.present && o.readingPresent) {
            EXPECT_TRUE(near(o.value, theirs)) << o.value << " vs " << row->reading;
        }
    }
    for (const CsvRow& r : rows) {
        if (r.used) continue;
        const std::vector<uint8_t>* record = recordWithId(r.recordId);
        ASSERT_NE(record, nullptr) << "FreeIPMI lists record " << r.recordId << " that the controller lacks";
        EXPECT_TRUE(leftOutOnPurpose(*record)) << "the library has no sensor for " << r.name;
    }
}

INSTANTIATE_TEST_SUITE_P(Profiles, LiveDecoders, ::testing::ValuesIn(allProfiles()), profileTestName);

// ------------------------------------------------ reference decodings of the real servers

class ReferenceDecodings : public DecoderCrossCheck, public ::testing::WithParamInterface<std::string> {
protected:
    std::vector<Ours> library() {
        return libraryOn(referenceProfile(GetParam()));
    }
    std::string reference(const std::string& kind) {
        return readFile(GetParam() + "." + kind + ".txt");
    }
};

// ipmitool's verbose SDR listing prints the thresholds, nominal and normal
// values that the record itself carries, converted by its own code.
TEST_P(ReferenceDecodings, IpmitoolVerboseListingAgreesOnTypesUnitsAndRecordValues) {
    const std::string text = reference("ipmitool-sdr-v");
    if (text.empty()) GTEST_SKIP() << "no ipmitool reference";
    const std::vector<Ours> ours = library();
    if (!loadFailure_.empty()) GTEST_SKIP() << "the simulator cannot load this profile: " << loadFailure_;
    std::vector<Block> blocks = parseBlocks(text, "Sensor ID");
    std::vector<bool> used(blocks.size(), false);

    size_t matched = 0;
    int recordValuesCompared = 0;
    for (const Ours& o : ours) {
        if (!o.firstOfRecord) continue;
        SCOPED_TRACE(o.name + " #" + std::to_string(o.number));
        char id[64];
        snprintf(id, sizeof id, " (0x%x)", o.number);
        const Block* b = nullptr;
        for (size_t i = 0; i < blocks.size() && b == nullptr; ++i) {
            const std::string sensorId = field(blocks[i], "Sensor ID");
            const std::string entity =
                std::to_string(o.entity.id) + "." + std::to_string(o.entity.instance) + " ";
            if (!used[i] && trim(sensorId.substr(0, sensorId.rfind(" ("))) == singleName(o) &&
                sensorId.size() >= strlen(id) && sensorId.compare(sensorId.size() - strlen(id), strlen(id), id) == 0 &&
                field(blocks[i], "Entity ID").rfind(entity, 0) == 0) {
                used[i] = true;
                b = &blocks[i];
            }
        }
        ASSERT_NE(b, nullptr) << "no ipmitool block with this name, number and entity";
        ++matched;

        std::string type;  // event-only records have a plain "Sensor Type"
        for (const char* key : {"Sensor Type (Threshold)", "Sensor Type (Discrete)", "Sensor Type"})
            if (type.empty()) type = field(*b, key);
        EXPECT_EQ(squeezed(type.substr(0, type.rfind(" ("))),
                  squeezed(ipmitoolTypeName(o.sensor->getSensorType(), o.typeText)))
            << type << " vs " << o.typeText;
        if (!o.analog()) continue;

        const Printed reading = parsePrinted(field(*b, "Sensor Reading"));
        EXPECT_EQ(reading.present, o.readingPresent) << field(*b, "Sensor Reading");
        if (reading.present) {
            // "41 (+/- 1.500) degrees C": the unit follows the tolerance.
            const std::string unit = trim(reading.unit.substr(reading.unit.find(')') + 1));
            EXPECT_EQ(unit, ipmitoolUnit(o));
            if (o.readingPresent) {
                EXPECT_TRUE(near(o.value, reading)) << o.value << " vs " << reading.value;
            }
        }
        const sdr::FullSensorView rec(recordOf(*o.sensor));
        auto raw = [&](uint8_t value) { return [&o, value] { return o.sensor->convertRawValue(value); }; };
        const struct {
            const char* key;
            std::function<double()> ours;
        } recordValues[] = {
            {"Upper non-recoverable", raw(rec.upperNonRecoverable())}, {"Upper critical", raw(rec.upperCritical())},
            {"Upper non-critical", raw(rec.upperNonCritical())},
            {"Lower non-recoverable", raw(rec.lowerNonRecoverable())}, {"Lower critical", raw(rec.lowerCritical())},
            {"Lower non-critical", raw(rec.lowerNonCritical())},
            {"Nominal Reading", [&] { return o.sensor->getNominalReading(); }},
            {"Normal Minimum", [&] { return o.sensor->getNormalMin(); }},
            {"Normal Maximum", [&] { return o.sensor->getNormalMax(); }},
        };
        for (const auto& v : recordValues) {
            const Printed theirs = parsePrinted(field(*b, v.key));
            recordValuesCompared += theirs.present;
            if (theirs.present) {
                EXPECT_TRUE(near(v.ours(), theirs)) << v.key;
            }
        }
    }
    EXPECT_GT(matched, 0u);
    RecordProperty("record values compared", recordValuesCompared);
}

// ipmi-sensors -v asks the controller for the thresholds, as the library does.
// ipmi_sim renumbers the records 1..n, so blocks are found by owner, number
// and name rather than by record ID.
TEST_P(ReferenceDecodings, FreeIpmiVerboseListingAgreesOnThresholdsAndUnits) {
    const std::string text = reference("ipmi-sensors-v");
    if (text.empty()) GTEST_SKIP() << "no FreeIPMI verbose reference";
    const std::vector<Ours> ours = library();
    if (!loadFailure_.empty()) GTEST_SKIP() << "the simulator cannot load this profile: " << loadFailure_;
    const std::vector<Block> blocks = parseBlocks(text, "Record ID");

    size_t compared = 0;
    for (const Ours& o : ours) {
        if (!o.firstOfRecord || !o.analog()) continue;
        SCOPED_TRACE(o.name + " #" + std::to_string(o.number));
        const Block* b = nullptr;
        for (const Block& candidate : blocks)
            if (trim(field(candidate, "ID String")) == singleName(o) &&
                strtoul(field(candidate, "Sensor Number").c_str(), nullptr, 10) == o.number &&
                strtoul(field(candidate, "Sensor Owner ID").c_str(), nullptr, 16) == o.owner)
                b = &candidate;
        if (b == nullptr) continue;  // FreeIPMI lists the BMC's own sensors only

        const struct {
            const char* key;
            std::function<double()> ours;
        } thresholds[] = {
            {"Lower Non-Critical Threshold", [&] { return o.sensor->getLowerNonCriticalThreshold(); }},
            {"Lower Critical Threshold", [&] { return o.sensor->getLowerCriticalThreshold(); }},
            {"Lower Non-Recoverable Threshold", [&] { return o.sensor->getLowerNonRecoverableThreshold(); }},
            {"Upper Non-Critical Threshold", [&] { return o.sensor->getUpperNonCriticalThreshold(); }},
            {"Upper Critical Threshold", [&] { return o.sensor->getUpperCriticalThreshold(); }},
            {"Upper Non-Recoverable Threshold", [&] { return o.sensor->getUpperNonRecoverableThreshold(); }},
            {"Sensor Min. Reading", [&] { return o.sensor->getMinReadable(); }},
            {"Sensor Max. Reading", [&] { return o.sensor->getMaxReadable(); }},
            {"Normal Min.", [&] { return o.sensor->getNormalMin(); }},
            {"Normal Max.", [&] { return o.sensor->getNormalMax(); }},
            {"Nominal Reading", [&] { return o.sensor->getNominalReading(); }},
        };
        for (const auto& t : thresholds) {
            const Printed theirs = parsePrinted(field(*b, t.key));
            if (!theirs.present) continue;
            ++compared;
            EXPECT_EQ(theirs.unit, freeIpmiAbbreviation(o)) << t.key;
            try {
                EXPECT_TRUE(near(t.ours(), theirs)) << t.key << ": " << t.ours() << " vs " << theirs.value;
            } catch (const kelInt::CmpiStatus& e) {
                ADD_FAILURE() << t.key << ": the library cannot read it: " << e.msg();
            }
        }
        const Printed reading = parsePrinted(field(*b, "Sensor Reading"));
        EXPECT_EQ(reading.present, o.readingPresent) << field(*b, "Sensor Reading");
        if (reading.present && o.readingPresent) {
            EXPECT_TRUE(near(o.value, reading)) << o.value << " vs " << reading.value;
        }
    }
    RecordProperty("values compared", static_cast<int>(compared));
}

INSTANTIATE_TEST_SUITE_P(RealServers, ReferenceDecodings, ::testing::ValuesIn(referenceSets()),
                         profileTestName);
GTEST_ALLOW_UNINSTANTIATED_PARAMETERIZED_TEST(ReferenceDecodings);

}  // namespace
