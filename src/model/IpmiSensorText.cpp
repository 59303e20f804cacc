// The words that callers show for a sensor: type, units, direction, ID string,
// name, description, device identity and the name of its current state.

#include <stdio.h>

#include <sstream>

#include "IpmiEventTables.h"
#include "IpmiIfc.h"
#include "IpmiLog.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"

namespace Ipmi {

namespace {

constexpr char kUnspecified[] = "unspecified";
constexpr char kWatchdog[] = "Watchdog";
constexpr char kOther[] = "Other";  // also what records without a sensor describe themselves as

// Sensor type names by IPMI sensor type code.
constexpr const char* sensor_type_desc[] = {
    word::reserved,
    sensorTypeName::temperature,
    sensorTypeName::voltage,
    sensorTypeName::current,
    sensorTypeName::fan,
    sensorTypeName::physicalSecurity,
    sensorTypeName::platformSecurity,
    sensorTypeName::processor,
    sensorTypeName::powerSupply,
    sensorTypeName::powerUnit,
    sensorTypeName::coolingDevice,
    kOther,
    sensorTypeName::memory,
    "Drive Slot / Bay",
    sensorTypeName::postMemoryResize,
    "System Firmware",
    sensorTypeName::eventLoggingDisabled,
    kWatchdog,
    sensorTypeName::systemEvent,
    sensorTypeName::criticalInterrupt,
    sensorTypeName::button,
    "Module / Board",
    "Microcontroller",
    sensorTypeName::addInCard,
    sensorTypeName::chassis,
    sensorTypeName::chipSet,
    sensorTypeName::otherFru,
    "Cable / Interconnect",
    sensorTypeName::terminator,
    sensorTypeName::systemBootInitiated,
    sensorTypeName::bootError,
    sensorTypeName::osBoot,
    "OS Critical Stop",
    "Slot / Connector",
    sensorTypeName::systemAcpiPowerState,
    kWatchdog,
    sensorTypeName::platformAlert,
    sensorTypeName::entityPresence,
    "Monitor ASIC",
    sensorTypeName::lan,
    sensorTypeName::managementSubsystemHealth,
    sensorTypeName::battery,
    "Session Audit",
    sensorTypeName::versionChange,
    sensorTypeName::fruState,
};
constexpr size_t kSensorTypeNames = sizeof sensor_type_desc / sizeof sensor_type_desc[0];
static_assert(kSensorTypeNames == 45, "sensor types 0x00-0x2C");

// Unit names by IPMI sensor unit type code.
constexpr const char* unit_desc[] = {
    kUnspecified, "degrees C", "degrees F", "degrees K", "Volts", "Amps", "Watts", "Joules",
    "Coulombs", "VA", "Nits", "lumen", "lux", "Candela", "kPa", "PSI", "Newton", "CFM", "RPM",
    "Hz", "microsecond", "millisecond", "second", "minute", "hour", "day", "week", "mil",
    "inches", "feet", "cu in", "cu feet", "mm", "cm", "m", "cu cm", "cu m", "liters",
    "fluid ounce", "radians", "steradians", "revolutions", "cycles", "gravities", "ounce",
    "pound", "ft-lb", "oz-in", "gauss", "gilberts", "henry", "millihenry", "farad",
    "microfarad", "ohms", "siemens", "mole", "becquerel", "PPM", word::reserved, "Decibels",
    "DbA", "DbC", "gray", "sievert", "color temp deg K", "bit", "kilobit", "megabit", "gigabit",
    "byte", "kilobyte", "megabyte", "gigabyte", "word", "dword", "qword", "line", "hit",
    "miss", "retry", "reset", "overflow", "underrun", "collision", "packets", "messages",
    "characters", "error", "correctable error", "uncorrectable error",
};
constexpr size_t kUnitNames = sizeof unit_desc / sizeof unit_desc[0];
static_assert(kUnitNames == 91, "unit codes 0-90");

// Unit codes from here on are not looked up at all; codes between the end of
// the table and this bound read as an empty text.
constexpr uint8_t kUnitCodeLimit = 145;

// What the command-line tools print in place of a compact sensor's unit when
// it has no modifier unit: the kind of its event/reading type.
struct EventReadingTypeName {
    uint8_t code;
    const char* name;
};
constexpr EventReadingTypeName kEventReadingTypeNames[] = {
    {0x01, "threshold"},
    {0x02, "DMI-discrete"},
    {0x03, "assert-discrete"},
    {0x04, "predictive-discrete"},
    {0x05, "limit-discrete"},
    {0x06, "performance-discrete"},
    {0x07, "severity-discrete"},
    {0x08, "available-discrete"},
    {0x09, "enabled-discrete"},
    {0x0A, "availability-discrete"},
    {0x0B, "redundancy-discrete"},
    {0x0C, "ACPI-discrete"},
    {0x0D, "int-drive"},
    {0x1B, "present-discrete"},
    {0x23, "watchdog"},
    {0x6F, "sensor-discrete"},
};

const char* eventReadingTypeName(uint8_t code) {
    for (const EventReadingTypeName& t : kEventReadingTypeNames)
        if (t.code == code) return t.name;
    return kUnspecified;
}

std::string unitText(uint8_t code) { return code < kUnitNames ? unit_desc[code] : ""; }

// Entity instances 0x60-0x7F are relative to the owning controller.
constexpr unsigned kDeviceRelativeInstance = 0x60;

// ID strings: a type/length code below this has type 0 (unicode), which is not shown.
constexpr uint8_t kFirstShownIdStringCode = 0x40;

// Instance modifier offsets of shared records, alphabetic form: each band of
// letters after the first gets an "A" in front.
constexpr char kLaterBandPrefix[] = " A";
constexpr unsigned kSecondBandStart = 26;
constexpr unsigned kThirdBandStart = 51;
constexpr unsigned kLastLetteredOffset = 75;

}  // namespace

std::string IpmiSensor::DescFromType(unsigned char type) {
    if (type < kSensorTypeNames) return sensor_type_desc[type];
    char text[32];
    snprintf(text, sizeof text, "OEM Reserved #%02x", type);
    return text;
}

std::string IpmiSensor::DescFromDirection(unsigned char direction) {
    switch (direction) {
    case 0: return word::Unspecified;
    case 1: return "input";
    case 2: return "output";
    case 3: return word::reserved;
    default: return "";
    }
}

std::string IpmiSensor::getSensorTypeString() const {
    const sdr::SensorRecordView rec(recordBytes(), readableLength());
    if (rec.isFullOrCompact()) return DescFromType(rec.sensorType());
    if (rec.isEventOnly()) return DescFromType(sdr::EventOnlyView(rec).sensorType());
    return "";
}

// Unlike getSensorDirection, the full record's direction field is read here.
std::string IpmiSensor::getSensorDirectionString() const {
    const sdr::SdrView rec(recordBytes(), readableLength());
    if (rec.isFull()) return DescFromDirection(sdr::FullSensorView(rec).direction());
    if (rec.isCompact()) return DescFromDirection(sdr::CompactSensorView(rec).direction());
    if (rec.isEventOnly()) return DescFromDirection(sdr::EventOnlyView(rec).direction());
    return "";
}

std::string IpmiSensor::getModifierUnitString() const {
    const sdr::SensorRecordView rec(recordBytes(), readableLength());
    if (!rec.isFullOrCompact() || rec.modifierUnit() >= kUnitCodeLimit) return "";
    return unitText(rec.modifierUnit());
}

std::string IpmiSensor::getBaseUnitString() const {
    const sdr::SensorRecordView rec(recordBytes(), readableLength());
    if (!rec.isFullOrCompact() || rec.baseUnit() >= kUnitCodeLimit) return "";
    if (rec.isCompact() && rec.modifierUnit() == 0 &&
        IpmiIfc::getState(node) == IpmiIfc::IPMI_STATE_CLI)
        return eventReadingTypeName(rec.eventReadingType());
    return unitText(rec.baseUnit());
}

std::string IpmiSensor::convertToEnumeration() const {
    const sdr::SensorRecordView rec(recordBytes(), readableLength());
    const ReadingSnapshot r = currentReading();
    if (!rec.isFullOrCompact() || !r.valid || r.bytes[0] != 0) return word::notAvailable;
    const unsigned low = r.length > 3 ? r.bytes[3] : 0;
    const unsigned high = r.length >= 5 ? (r.bytes[4] & 0x7F) : 0;
    if (low == 0 && high == 0) return word::notAvailable;

    const bool sensorSpecific = rec.eventReadingType() == EVENT_TYPE_SENSOR_SPECIFIC;
    const ipmi_event_type* row =
        sensorSpecific ? sensor_specific_event_types : generic_sensor_event_types;
    const uint8_t code = sensorSpecific ? rec.sensorType() : rec.eventReadingType();
    while (row->text && row->code != code) ++row;

    // States 0-7 sit in the low byte, 8-14 in the high one; the last set state wins.
    const unsigned states = low | high << 8;
    std::string result = word::notAvailable;
    for (; row->text && row->code == code; ++row)
        if (row->qualifier == SEL_KEY_ANY_DATA3 && row->offset < 16 && (states >> row->offset & 1))
            result = row->text;
    return result;
}

std::string IpmiSensor::getSensorIdString() const {
    const sdr::SdrView rec(recordBytes(), readableLength());
    const sdr::SensorRecordOffsets at = sdr::sensorRecordOffsets(rec.recordType());
    if (at.idStringTypeLength == 0) {
        ipmiLog(LOG_WARNING, "Unhandled unknown SDR description");
        return "";
    }
    std::ostringstream text;
    const sdr::IdStringCode code{rec.byteAt(at.idStringTypeLength)};
    if (code.code >= kFirstShownIdStringCode && code.length() != 0) {
        // Taken byte for byte, whatever the type bits say; a length that
        // claims more than the record holds stops at the record's end.
        for (size_t i = 0; i < code.length() && rec.has(at.idString + i); ++i)
            text << static_cast<char>(rec.byteAt(at.idString + i));
    } else if (rec.isCompact()) {
        ipmiLog(LOG_WARNING, "Unhandled Compact SDR description");
    } else if (rec.isEventOnly()) {
        ipmiLog(LOG_WARNING, "Unhandled eventonly SDR description");
    }

    if (rec.isFull()) return text.str();
    const sdr::SharingView sharing{rec.byteAt(at.sharing), rec.byteAt(at.instanceModifier)};
    if (sharing.shareCount() == 0) return text.str();
    const unsigned m = sharing.instanceModifierOffset();
    if (sharing.instanceModifierType() == 0) {
        text << ' ' << m;
    } else if (m < kSecondBandStart) {
        // The letter goes out as its character code, a number; callers know it so.
        text << ' ' << int('A' + m);
    } else if (m < kThirdBandStart) {
        text << kLaterBandPrefix << int('A' + (m - kSecondBandStart));
    } else if (m <= kLastLetteredOffset) {
        text << kLaterBandPrefix << int('A' + (m - kThirdBandStart));
    }
    return text.str();
}

std::string IpmiSensor::getName() const {
    const sdr::SdrView rec(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? getSensorIdString() : "";
}

std::string IpmiSensor::getDescription() const {
    const sdr::SdrView rec(recordBytes(), readableLength());
    if (!rec.isFullOrCompact()) return kOther;
    const IpmiEntity entity = getEntity();
    std::ostringstream text;
    if (entity.instance >= kDeviceRelativeInstance)
        text << "[Device] " << entity.getName() << ' ' << entity.instance - kDeviceRelativeInstance;
    else
        text << entity.getName() << ' ' << entity.instance;
    text << ' ' << getSensorIdString();
    if (node != 0) text << " (node " << node << ")";
    return text.str();
}

std::string IpmiSensor::getDeviceId() const {
    const sdr::SensorKeyView rec(recordBytes(), readableLength());
    if (!rec.isFullOrCompact()) return "";
    std::ostringstream text;
    text << unsigned(rec.ownerId()) << '.' << unsigned(rec.ownerChannel() * 16 + rec.ownerLun())
         << '.' << unsigned(rec.sensorNumber());
    return text.str();
}

}  // namespace Ipmi
