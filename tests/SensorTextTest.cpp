// The words callers show for a sensor: type, units, direction, ID string with
// its instance suffix, name, description, device identity and state name.

#include <gtest/gtest.h>

#include <algorithm>

#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::SdrBuilder;

namespace {

IpmiDiscreteSensor sensorOf(const SdrBuilder& r, int node = 0) {
    std::vector<uint8_t> b = r.bytes();
    return IpmiDiscreteSensor(node, b.data(), int(b.size()));
}
std::string idOf(const SdrBuilder& r) { return sensorOf(r).getSensorIdString(); }

const SdrBuilder kOther(sdr::type::fruDeviceLocator, 17);
const SdrBuilder kFull = SdrBuilder::full(), kCompact = SdrBuilder::compact(), kEventOnly = SdrBuilder::eventOnly();

class SensorText : public TestSupport::SimTest {};

TEST_F(SensorText, SensorTypeAndDirectionAreReadWhereEachRecordKindKeepsThem) {
    EXPECT_EQ(IpmiSensor::DescFromType(0x23), "Watchdog");
    EXPECT_EQ(IpmiSensor::DescFromType(0x2D), "OEM Reserved #2d");
    EXPECT_EQ(IpmiSensor::DescFromType(0xC0), "OEM Reserved #c0");
    EXPECT_EQ(sensorOf(SdrBuilder(kFull).types(0x01, 0x01)).getSensorTypeString(), "Temperature");
    EXPECT_EQ(sensorOf(SdrBuilder(kCompact).types(0x21, 0x6F)).getSensorTypeString(), "Slot / Connector");
    EXPECT_EQ(sensorOf(SdrBuilder(kEventOnly).types(0x2A, 0x6F)).getSensorTypeString(), "Session Audit");
    EXPECT_EQ(sensorOf(SdrBuilder(kOther).set(sdr::sensor::sensorType, 0x01)).getSensorTypeString(), "");

    // The full record's direction field counts here, unlike getSensorDirection.
    IpmiDiscreteSensor full = sensorOf(SdrBuilder(kFull).set(sdr::full::accuracyDirection, 0xF1));
    EXPECT_EQ(full.getSensorDirectionString(), "input");
    EXPECT_EQ(full.getSensorDirection(), 0);
    EXPECT_EQ(sensorOf(SdrBuilder(kCompact).set(sdr::compact::sharing, 0x80)).getSensorDirectionString(), "output");
    EXPECT_EQ(sensorOf(SdrBuilder(kEventOnly).set(sdr::eventOnly::sharing, 0xC0)).getSensorDirectionString(),
              "reserved");
    EXPECT_EQ(sensorOf(kOther).getSensorDirectionString(), "");
}

TEST_F(SensorText, UnitNamesAndInCommandLineModeTheReadingKind) {
    auto units = [](const SdrBuilder& r, uint8_t base, uint8_t modifier) {
        IpmiDiscreteSensor s =
            sensorOf(SdrBuilder(r).set(sdr::sensor::baseUnit, base).set(sdr::sensor::modifierUnit, modifier));
        return s.getBaseUnitString() + "|" + s.getModifierUnitString();
    };
    const SdrBuilder discrete = SdrBuilder(kCompact).types(0x01, 0x6F);
    EXPECT_EQ(units(kFull, 59, 90), "reserved|uncorrectable error");
    EXPECT_EQ(units(kFull, 91, 144), "|");
    EXPECT_EQ(units(kFull, 255, 145), "|");
    EXPECT_EQ(units(SdrBuilder(kEventOnly).id("Event"), 1, 1), "|");

    // In command-line mode a compact sensor without modifier unit names its reading kind.
    EXPECT_EQ(units(discrete, 1, 0), "degrees C|unspecified");
    _setState(0, IpmiIfc::IPMI_STATE_CLI);
    EXPECT_EQ(units(discrete, 1, 0), "sensor-discrete|unspecified");
    EXPECT_EQ(units(SdrBuilder(kCompact).types(0x01, 0x01), 4, 0), "threshold|unspecified");
    EXPECT_EQ(units(SdrBuilder(kCompact).types(0x01, 0x70), 4, 0), "unspecified|unspecified");
    EXPECT_EQ(units(discrete, 1, 5), "degrees C|Amps");
    EXPECT_EQ(units(discrete, 145, 0), "|unspecified");
    EXPECT_EQ(units(SdrBuilder(kFull).types(0x01, 0x6F), 4, 0), "Volts|unspecified");
}

TEST_F(SensorText, IdStringIsTakenAsItStandsAndOnlyAsFarAsTheRecordGoes) {
    EXPECT_EQ(idOf(SdrBuilder(kFull).id("CPU1 Temp")), "CPU1 Temp");
    EXPECT_EQ(idOf(SdrBuilder(kCompact).id("Intrusion")), "Intrusion");
    EXPECT_EQ(idOf(SdrBuilder(kEventOnly).id("BIOS Evt")), "BIOS Evt");
    // Packed 6-bit and BCD strings are not unpacked: their bytes are shown as they are.
    EXPECT_EQ(idOf(SdrBuilder(kFull).idCoded(0x83, "ABC")), "ABC");
    EXPECT_EQ(idOf(SdrBuilder(kFull).idCoded(0x43, "123")), "123");
    // 31 bytes claimed, 4 or none present; a record that ends before its type/length byte.
    EXPECT_EQ(idOf(SdrBuilder(kFull).idCoded(0xDF, "Fan1")), "Fan1");
    EXPECT_EQ(idOf(SdrBuilder(kCompact).idCoded(0xDF, "")), "");
    std::vector<uint8_t> cut = SdrBuilder(kFull).id("CPU1 Temp");
    cut.resize(sdr::full::idStringTypeLength);
    EXPECT_EQ(IpmiDiscreteSensor(0, cut.data(), int(cut.size())).getSensorIdString(), "");
    // Type bits 00 or length 0: no text.
    EXPECT_EQ(idOf(SdrBuilder(kCompact).idCoded(0x03, "abc")), "");
    EXPECT_EQ(idOf(SdrBuilder(kEventOnly).idCoded(0xC0, "")), "");
    EXPECT_EQ(idOf(kOther), "");
}

// Alphabetic suffixes come out as the letter's character code, as they always have.
TEST_F(SensorText, SharedRecordsGetAnInstanceSuffix) {
    const struct { uint8_t sharing, offset; const char* id; } cases[] = {
        {0x00, 3, "DIMM"},     {0x04, 0, "DIMM 0"},    {0x04, 12, "DIMM 12"},  {0x14, 0, "DIMM 65"},
        {0x11, 25, "DIMM 90"}, {0x24, 26, "DIMM A65"}, {0x14, 50, "DIMM A89"}, {0x14, 51, "DIMM A65"},
        {0x34, 75, "DIMM A89"}, {0x14, 76, "DIMM"},
    };
    for (const auto& c : cases)
        EXPECT_EQ(idOf(SdrBuilder(kCompact)
                           .set(sdr::compact::sharing, c.sharing)
                           .set(sdr::compact::instanceModifier, uint8_t(0x80 | c.offset))
                           .id("DIMM")),
                  c.id);
    const SdrBuilder ps = SdrBuilder(kEventOnly).set(sdr::eventOnly::sharing, 2).id("PS");
    EXPECT_EQ(idOf(SdrBuilder(ps).set(sdr::eventOnly::instanceModifier, 7)), "PS 7");
    EXPECT_EQ(idOf(SdrBuilder(kFull).set(sdr::compact::sharing, 0x04).id("CPU")), "CPU");  // full records do not share
}

TEST_F(SensorText, NameDescriptionAndDeviceIdOfEachRecordKind) {
    auto texts = [](const SdrBuilder& r, int node = 0) {
        IpmiDiscreteSensor s = sensorOf(r, node);
        return s.getName() + "|" + s.getDescription() + "|" + s.getDeviceId();
    };
    const SdrBuilder cpu = SdrBuilder(kFull).set(sdr::key::entityId, 0x03).set(sdr::key::sensorNumber, 5).id("CPU1");
    EXPECT_EQ(texts(cpu), "CPU1|Processor 1 CPU1|32.0.5");
    EXPECT_EQ(texts(cpu, 2), "CPU1|Processor 1 CPU1 (node 2)|32.0.5");
    EXPECT_EQ(texts(SdrBuilder(kFull).set(sdr::key::entityInstance, 0xDF).id("X")), "X|System Board 95 X|32.0.1");
    EXPECT_EQ(texts(SdrBuilder(kCompact)
                        .set(sdr::key::entityInstance, 0x62)  // device-relative
                        .set(sdr::key::ownerId, 0x2C)
                        .set(sdr::key::ownerLun, 0x63)
                        .set(sdr::key::sensorNumber, 0x81)
                        .set(sdr::compact::sharing, 0x02)
                        .id("VR")),
              "VR 0|[Device] System Board 2 VR 0|44.99.129");
    EXPECT_EQ(texts(SdrBuilder(kEventOnly).id("Event")), "|Other|");
}

// The last set state with a row of its own (one that needs no event data 3) names it.
TEST_F(SensorText, DiscreteStateNameFromOneReading) {
    auto stateName = [this](uint8_t sensorType, uint8_t eventReadingType, uint16_t states,
                            SdrBuilder record = kCompact, bool present = true) {
        Sim::SensorModel model;
        model.number = 0x40;
        model.type = sensorType;
        model.eventReadingType = eventReadingType;
        model.states = states;
        model.present = present;
        bmc().sensors = {model};
        IpmiDiscreteSensor s = sensorOf(record.set(sdr::key::sensorNumber, 0x40).types(sensorType, eventReadingType));
        if (s.convertToEnumeration() != "N/A") return std::string("named before it was read");
        s.getSDReading();
        return s.convertToEnumeration();
    };
    EXPECT_EQ(stateName(0x0A, 0x0B, 0x0085), "Redundancy Degraded from Non-Redundant");
    EXPECT_EQ(stateName(0x25, 0x08, 0x0002, kFull), "Device Present");
    EXPECT_EQ(stateName(0x07, 0x6F, 0x0481), "Throttled");  // sensor-specific: by sensor type
    EXPECT_EQ(stateName(0x22, 0x6F, 0x4000), "Unknown");
    EXPECT_EQ(stateName(0x08, 0x6F, 0x0040), "Config Error");
    EXPECT_EQ(stateName(0x0F, 0x6F, 0x0004), "Unknown Progress");

    EXPECT_EQ(stateName(0x07, 0x6F, 0x0000), "N/A");
    EXPECT_EQ(stateName(0x07, 0x6F, 0x0800), "N/A");  // processor offset 11 has no row
    EXPECT_EQ(stateName(0x01, 0x6F, 0x0001), "N/A");  // temperature's one row has no text
    EXPECT_EQ(stateName(0xC0, 0x70, 0x0001), "N/A");  // OEM reading type
    EXPECT_EQ(stateName(0x05, 0x6F, 0x0001, kEventOnly), "N/A");
    EXPECT_EQ(stateName(0x07, 0x6F, 0x0080, kCompact, false), "N/A");  // no valid reading
}

TEST_F(SensorText, RealDellRepositoryNamesSharedSensors) {
    const std::string path = TestSupport::realDataPath("sdr/infrasim_dell_r630.sdr");
    SKIP_WITHOUT_REAL_DATA(path);
    Sim::loadSdrDump(bmc(), path);
    std::vector<std::string> names;
    for (std::vector<uint8_t>& r : bmc().sdr.records) {
        const sdr::SdrView view(r.data(), r.size());
        if (!view.isFull() && !view.isCompact()) continue;
        IpmiDiscreteSensor s(0, r.data(), int(r.size()));
        names.push_back(s.getName());
        EXPECT_FALSE(s.getDescription().empty());
    }
    auto has = [&](const std::string& n) { return std::count(names.begin(), names.end(), n); };
    EXPECT_EQ(has(""), 0);
    EXPECT_EQ(has("Drive 0 0"), 1);         // numeric instance, offset 0
    EXPECT_EQ(has("QPIRC Warning 65"), 2);  // alphabetic instance, offset 0
    EXPECT_EQ(has("A  1"), 1);              // the ID string itself ends in a blank
    EXPECT_EQ(log.countAtPriority(LOG_WARNING), 0u);
}

}  // namespace
