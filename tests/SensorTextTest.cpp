#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

// A sensor record built field by field.
class Record {
public:
    Record(uint8_t recordType, size_t idStringOffset) : bytes_(idStringOffset, 0), idAt_(idStringOffset) {
        bytes_[sdr::header::recordId] = 0x07;
        bytes_[sdr::header::version] = 0x51;
        bytes_[sdr::header::recordType] = recordType;
        set(sdr::key::ownerId, 0x20);
        set(sdr::key::sensorNumber, 0x05);
        set(sdr::key::entityId, 0x03);  // processor
        set(sdr::key::entityInstance, 0x01);
    }
    static Record full() { return Record(sdr::type::fullSensor, sdr::full::idString); }
    static Record compact() { return Record(sdr::type::compactSensor, sdr::compact::idString); }
    static Record eventOnly() { return Record(sdr::type::eventOnly, sdr::eventOnly::idString); }

    Record& set(size_t offset, uint8_t value) {
        bytes_.at(offset) = value;
        return *this;
    }
    // ID string of 8-bit characters (type bits 11).
    Record& id(const std::string& text) { return idCoded(uint8_t(0xC0 | text.size()), text); }
    Record& idCoded(uint8_t typeLength, const std::string& text) {
        bytes_.resize(idAt_);
        bytes_[idAt_ - 1] = typeLength;
        bytes_.insert(bytes_.end(), text.begin(), text.end());
        return *this;
    }
    std::vector<uint8_t> bytes() const {
        std::vector<uint8_t> out = bytes_;
        out[sdr::header::remainingLength] = uint8_t(out.size() - sdr::header::length);
        return out;
    }

private:
    std::vector<uint8_t> bytes_;
    size_t idAt_;
};

IpmiDiscreteSensor sensorOf(const Record& r, int node = 0) {
    std::vector<uint8_t> b = r.bytes();
    return IpmiDiscreteSensor(node, b.data(), int(b.size()));
}

class SensorText : public TestSupport::SimTest {};

TEST_F(SensorText, SensorTypeNames) {
    EXPECT_EQ(IpmiSensor::DescFromType(0x00), "reserved");
    EXPECT_EQ(IpmiSensor::DescFromType(0x0D), "Drive Slot / Bay");
    EXPECT_EQ(IpmiSensor::DescFromType(0x11), "Watchdog");
    EXPECT_EQ(IpmiSensor::DescFromType(0x23), "Watchdog");
    EXPECT_EQ(IpmiSensor::DescFromType(0x2C), "FRU State");
    EXPECT_EQ(IpmiSensor::DescFromType(0x2D), "OEM Reserved #2d");
    EXPECT_EQ(IpmiSensor::DescFromType(0xC0), "OEM Reserved #c0");
    EXPECT_EQ(IpmiSensor::DescFromType(0xFF), "OEM Reserved #ff");
}

TEST_F(SensorText, SensorTypeStringReadsTheTypeOfEachRecordKind) {
    EXPECT_EQ(sensorOf(Record::full().set(sdr::sensor::sensorType, 0x01)).getSensorTypeString(), "Temperature");
    EXPECT_EQ(sensorOf(Record::compact().set(sdr::sensor::sensorType, 0x21)).getSensorTypeString(),
              "Slot / Connector");
    EXPECT_EQ(sensorOf(Record::eventOnly().set(sdr::eventOnly::sensorType, 0x2A)).getSensorTypeString(),
              "Session Audit");
    Record locator(sdr::type::fruDeviceLocator, 17);
    locator.set(sdr::sensor::sensorType, 0x01);
    EXPECT_EQ(sensorOf(locator).getSensorTypeString(), "");
}

TEST_F(SensorText, DirectionStrings) {
    EXPECT_EQ(IpmiSensor::DescFromDirection(0), "Unspecified");
    EXPECT_EQ(IpmiSensor::DescFromDirection(1), "input");
    EXPECT_EQ(IpmiSensor::DescFromDirection(2), "output");
    EXPECT_EQ(IpmiSensor::DescFromDirection(3), "reserved");
    EXPECT_EQ(IpmiSensor::DescFromDirection(4), "");

    // The full record's direction field counts here, unlike getSensorDirection.
    IpmiDiscreteSensor full = sensorOf(Record::full().set(sdr::full::accuracyDirection, 0xF1));
    EXPECT_EQ(full.getSensorDirectionString(), "input");
    EXPECT_EQ(full.getSensorDirection(), 0);
    EXPECT_EQ(sensorOf(Record::compact().set(sdr::compact::sharing, 0x80)).getSensorDirectionString(), "output");
    EXPECT_EQ(sensorOf(Record::eventOnly().set(sdr::eventOnly::sharing, 0xC0)).getSensorDirectionString(),
              "reserved");
    EXPECT_EQ(sensorOf(Record(sdr::type::oem, 17)).getSensorDirectionString(), "");
}

TEST_F(SensorText, UnitNames) {
    auto units = [](uint8_t base, uint8_t modifier) {
        IpmiDiscreteSensor s = sensorOf(Record::full()
                                            .set(sdr::sensor::baseUnit, base)
                                            .set(sdr::sensor::modifierUnit, modifier));
        return s.getBaseUnitString() + "|" + s.getModifierUnitString();
    };
    EXPECT_EQ(units(1, 0), "degrees C|unspecified");
    EXPECT_EQ(units(18, 22), "RPM|second");
    EXPECT_EQ(units(59, 90), "reserved|uncorrectable error");
    EXPECT_EQ(units(91, 100), "|");
    EXPECT_EQ(units(144, 145), "|");
    EXPECT_EQ(units(255, 200), "|");

    IpmiDiscreteSensor eventOnly = sensorOf(Record::eventOnly().id("Event"));
    EXPECT_EQ(eventOnly.getBaseUnitString(), "");
    EXPECT_EQ(eventOnly.getModifierUnitString(), "");
}

TEST_F(SensorText, CommandLineModeNamesTheReadingKindOfCompactSensorsWithoutModifier) {
    auto compact = [](uint8_t eventReadingType, uint8_t base, uint8_t modifier) {
        return sensorOf(Record::compact()
                            .set(sdr::sensor::eventReadingType, eventReadingType)
                            .set(sdr::sensor::baseUnit, base)
                            .set(sdr::sensor::modifierUnit, modifier))
            .getBaseUnitString();
    };
    EXPECT_EQ(compact(0x6F, 1, 0), "degrees C");
    _setState(0, IpmiIfc::IPMI_STATE_CLI);
    EXPECT_EQ(compact(0x6F, 1, 0), "sensor-discrete");
    EXPECT_EQ(compact(0x01, 4, 0), "threshold");
    EXPECT_EQ(compact(0x0D, 0, 0), "int-drive");
    EXPECT_EQ(compact(0x1B, 0, 0), "present-discrete");
    EXPECT_EQ(compact(0x23, 0, 0), "watchdog");
    EXPECT_EQ(compact(0x0E, 0, 0), "unspecified");
    EXPECT_EQ(compact(0x70, 0, 0), "unspecified");
    EXPECT_EQ(compact(0x6F, 1, 5), "degrees C");  // a modifier unit keeps the unit
    EXPECT_EQ(compact(0x6F, 145, 0), "");
    EXPECT_EQ(sensorOf(Record::full().set(sdr::sensor::eventReadingType, 0x6F).set(sdr::sensor::baseUnit, 4))
                  .getBaseUnitString(),
              "Volts");
}

TEST_F(SensorText, IdStringOfEachRecordKind) {
    EXPECT_EQ(sensorOf(Record::full().id("CPU1 Temp")).getSensorIdString(), "CPU1 Temp");
    EXPECT_EQ(sensorOf(Record::compact().id("Intrusion")).getSensorIdString(), "Intrusion");
    EXPECT_EQ(sensorOf(Record::eventOnly().id("BIOS Evt Sensor")).getSensorIdString(), "BIOS Evt Sensor");
    // Packed 6-bit and BCD strings are not unpacked: their bytes are shown as they are.
    EXPECT_EQ(sensorOf(Record::full().idCoded(0x83, "ABC")).getSensorIdString(), "ABC");
    EXPECT_EQ(sensorOf(Record::full().idCoded(0x43, "123")).getSensorIdString(), "123");
    EXPECT_EQ(log.countAtPriority(LOG_WARNING), 0u);
}

TEST_F(SensorText, IdStringsWithoutTextAreLogged) {
    EXPECT_EQ(sensorOf(Record::compact().idCoded(0x03, "abc")).getSensorIdString(), "");
    EXPECT_TRUE(log.contains(LOG_WARNING, "Unhandled Compact SDR description"));
    EXPECT_EQ(sensorOf(Record::eventOnly().idCoded(0xC0, "")).getSensorIdString(), "");
    EXPECT_TRUE(log.contains(LOG_WARNING, "Unhandled eventonly SDR description"));
    log.clear();
    EXPECT_EQ(sensorOf(Record::full().idCoded(0x00, "")).getSensorIdString(), "");
    EXPECT_EQ(log.lines().size(), 0u);
    EXPECT_EQ(sensorOf(Record(sdr::type::mcDeviceLocator, 17)).getSensorIdString(), "");
    EXPECT_TRUE(log.contains(LOG_WARNING, "Unhandled unknown SDR description"));
}

TEST_F(SensorText, IdStringStopsAtTheEndOfTheRecord) {
    // 31 bytes claimed, 4 present.
    EXPECT_EQ(sensorOf(Record::full().idCoded(0xDF, "Fan1")).getSensorIdString(), "Fan1");
    EXPECT_EQ(sensorOf(Record::compact().idCoded(0xDF, "")).getSensorIdString(), "");
    // A record cut short before its type/length byte.
    std::vector<uint8_t> cut = Record::full().id("CPU1 Temp").bytes();
    cut.resize(sdr::full::idStringTypeLength);
    IpmiDiscreteSensor s(0, cut.data(), int(cut.size()));
    EXPECT_EQ(s.getSensorIdString(), "");
}

TEST_F(SensorText, SharedRecordsGetAnInstanceSuffix) {
    auto shared = [](uint8_t sharing, uint8_t offset) {
        return sensorOf(Record::compact()
                            .set(sdr::compact::sharing, sharing)
                            .set(sdr::compact::instanceModifier, uint8_t(0x80 | offset))
                            .id("DIMM"))
            .getSensorIdString();
    };
    EXPECT_EQ(shared(0x00, 3), "DIMM");  // not shared
    EXPECT_EQ(shared(0x04, 0), "DIMM 0");
    EXPECT_EQ(shared(0x04, 12), "DIMM 12");
    // Alphabetic suffixes come out as the letter's character code.
    EXPECT_EQ(shared(0x14, 0), "DIMM 65");
    EXPECT_EQ(shared(0x11, 25), "DIMM 90");
    EXPECT_EQ(shared(0x24, 26), "DIMM A65");
    EXPECT_EQ(shared(0x14, 50), "DIMM A89");
    EXPECT_EQ(shared(0x14, 51), "DIMM A65");
    EXPECT_EQ(shared(0x34, 75), "DIMM A89");
    EXPECT_EQ(shared(0x14, 76), "DIMM");
    EXPECT_EQ(shared(0x14, 127), "DIMM");
    EXPECT_EQ(sensorOf(Record::eventOnly()
                           .set(sdr::eventOnly::sharing, 0x02)
                           .set(sdr::eventOnly::instanceModifier, 7)
                           .id("PS"))
                  .getSensorIdString(),
              "PS 7");
    // Full records have no sharing.
    EXPECT_EQ(sensorOf(Record::full().set(sdr::compact::sharing, 0x04).id("CPU")).getSensorIdString(), "CPU");
}

TEST_F(SensorText, NameIsTheIdStringOfFullAndCompactSensors) {
    EXPECT_EQ(sensorOf(Record::full().id("CPU1 Temp")).getName(), "CPU1 Temp");
    EXPECT_EQ(sensorOf(Record::compact().set(sdr::compact::sharing, 0x02).id("Fan")).getName(), "Fan 0");
    EXPECT_EQ(sensorOf(Record::eventOnly().id("Event")).getName(), "");
}

TEST_F(SensorText, DescriptionNamesEntityInstanceAndSensor) {
    EXPECT_EQ(sensorOf(Record::full().id("CPU1 Temp")).getDescription(), "Processor 1 CPU1 Temp");
    EXPECT_EQ(sensorOf(Record::compact().set(sdr::key::entityId, 0x07).set(sdr::key::entityInstance, 0x62).id("VR"))
                  .getDescription(),
              "[Device] System Board 2 VR");
    EXPECT_EQ(sensorOf(Record::full().set(sdr::key::entityInstance, 0xDF).id("X")).getDescription(),
              "Processor 95 X");
    EXPECT_EQ(sensorOf(Record::full().id("CPU1 Temp"), 2).getDescription(), "Processor 1 CPU1 Temp (node 2)");
    EXPECT_EQ(sensorOf(Record::eventOnly().id("Event")).getDescription(), "Other");
}

TEST_F(SensorText, DeviceIdIsOwnerChannelLunAndNumber) {
    EXPECT_EQ(sensorOf(Record::full()).getDeviceId(), "32.0.5");
    EXPECT_EQ(sensorOf(Record::compact()
                           .set(sdr::key::ownerId, 0x2C)
                           .set(sdr::key::ownerLun, 0x63)
                           .set(sdr::key::sensorNumber, 0x81))
                  .getDeviceId(),
              "44.99.129");
    EXPECT_EQ(sensorOf(Record::eventOnly()).getDeviceId(), "");
}

// ---- names of the current discrete state ----------------------------------

class SensorState : public TestSupport::SimTest {
protected:
    // A sensor of the controller with the given states, read once.
    std::string stateName(uint8_t sensorType, uint8_t eventReadingType, uint16_t states,
                          Record record = Record::compact()) {
        Sim::SensorModel model;
        model.number = 0x40;
        model.type = sensorType;
        model.eventReadingType = eventReadingType;
        model.states = states;
        bmc().sensors = {model};
        IpmiDiscreteSensor s = sensorOf(record.set(sdr::key::sensorNumber, 0x40)
                                            .set(sdr::sensor::sensorType, sensorType)
                                            .set(sdr::sensor::eventReadingType, eventReadingType));
        s.getSDReading();
        return s.convertToEnumeration();
    }
};

TEST_F(SensorState, GenericStatesAreNamedByEventReadingType) {
    EXPECT_EQ(stateName(0x0A, 0x0B, 0x0002), "Redundancy Lost");
    EXPECT_EQ(stateName(0x0A, 0x0B, 0x0085), "Redundancy Degraded from Non-Redundant");  // last set state wins
    EXPECT_EQ(stateName(0x07, 0x07, 0x0100), "Informational");
    EXPECT_EQ(stateName(0x25, 0x08, 0x0002, Record::full()), "Device Present");
}

TEST_F(SensorState, SensorSpecificStatesAreNamedBySensorType) {
    EXPECT_EQ(stateName(0x07, 0x6F, 0x0080), "Presence detected");
    EXPECT_EQ(stateName(0x07, 0x6F, 0x0200), "Terminator presence detected");
    EXPECT_EQ(stateName(0x07, 0x6F, 0x0481), "Throttled");
    EXPECT_EQ(stateName(0x22, 0x6F, 0x4000), "Unknown");
}

TEST_F(SensorState, RowsThatNeedEventDataThreeDoNotCount) {
    EXPECT_EQ(stateName(0x08, 0x6F, 0x0040), "Config Error");
    EXPECT_EQ(stateName(0x0F, 0x6F, 0x0001), "Unknown Error");
    EXPECT_EQ(stateName(0x0F, 0x6F, 0x0004), "Unknown Progress");
}

TEST_F(SensorState, NoNameWithoutAStateThatHasOne) {
    EXPECT_EQ(stateName(0x07, 0x6F, 0x0000), "N/A");
    EXPECT_EQ(stateName(0x07, 0x6F, 0x0800), "N/A");   // processor offset 11 has no row
    EXPECT_EQ(stateName(0x01, 0x6F, 0x0001), "N/A");   // temperature has no offsets
    EXPECT_EQ(stateName(0x2A, 0x6F, 0x0001), "N/A");   // no rows at all
    EXPECT_EQ(stateName(0xC0, 0x70, 0x0001), "N/A");   // OEM reading type
    EXPECT_EQ(stateName(0x05, 0x6F, 0x0001, Record::eventOnly()), "N/A");
}

TEST_F(SensorState, NoNameWithoutAValidReading) {
    Sim::SensorModel model;
    model.number = 0x41;
    model.eventReadingType = 0x6F;
    model.type = 0x07;
    model.states = 0x0080;
    model.present = false;
    bmc().sensors = {model};
    IpmiDiscreteSensor s = sensorOf(Record::compact()
                                        .set(sdr::key::sensorNumber, 0x41)
                                        .set(sdr::sensor::sensorType, 0x07)
                                        .set(sdr::sensor::eventReadingType, 0x6F));
    EXPECT_EQ(s.convertToEnumeration(), "N/A");  // never read
    s.getSDReading();
    EXPECT_EQ(s.convertToEnumeration(), "N/A");
}

// ---- real repositories -------------------------------------------------------

std::vector<std::vector<uint8_t>> readSdrFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::vector<uint8_t> b((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::vector<std::vector<uint8_t>> records;
    for (size_t at = 0; at + sdr::header::length <= b.size();) {
        size_t length = sdr::header::length + b[at + sdr::header::remainingLength];
        if (at + length > b.size()) break;
        records.emplace_back(b.begin() + long(at), b.begin() + long(at + length));
        at += length;
    }
    return records;
}

TEST_F(SensorText, RealDellRepositoryNamesSharedSensors) {
    std::string path = TestSupport::realDataPath("sdr/infrasim_dell_r630.sdr");
    SKIP_WITHOUT_REAL_DATA(path);
    std::vector<std::string> names;
    for (std::vector<uint8_t>& r : readSdrFile(path)) {
        if (r[sdr::header::recordType] != sdr::type::fullSensor &&
            r[sdr::header::recordType] != sdr::type::compactSensor)
            continue;
        IpmiDiscreteSensor s(0, r.data(), int(r.size()));
        names.push_back(s.getName());
        EXPECT_FALSE(s.getDescription().empty());
    }
    auto has = [&](const std::string& n) { return std::count(names.begin(), names.end(), n); };
    EXPECT_EQ(has(""), 0);
    EXPECT_EQ(has("Drive 0 0"), 1);          // numeric instance, offset 0
    EXPECT_EQ(has("QPIRC Warning 65"), 2);   // alphabetic instance, offset 0
    EXPECT_EQ(has("A  1"), 1);               // the ID string itself ends in a blank
    EXPECT_EQ(log.countAtPriority(LOG_WARNING), 0u);
}

}  // namespace
