#include "SensorFacts.h"

#include <stdio.h>
#include <stdlib.h>

#include <algorithm>
#include <exception>
#include <memory>

#include "IpmiCommands.h"
#include "IpmiIfc.h"
#include "IpmiMapper.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"

namespace Tool {

namespace {

// Bits of the threshold masks and comparison status, and the byte of each
// threshold in the Get Sensor Thresholds answer.
const struct {
    unsigned bit;
    unsigned answerByte;
} kThresholdPlaces[kThresholds] = {
    {0x04, 4}, {0x02, 3}, {0x01, 2}, {0x08, 5}, {0x10, 6}, {0x20, 7},
};

// Reading status byte: scanning enabled, reading unavailable.
constexpr unsigned kScanningEnabled = 0x40;
constexpr unsigned kReadingUnavailable = 0x20;
constexpr unsigned kHighStates = 0x7F;
constexpr unsigned kCritical = 0x36;     // LC, LNR, UC, UNR
constexpr unsigned kNonCritical = 0x09;  // LNC, UNC

// Conversions multiply by powers of ten and leave binary noise behind
// (13.200000000000001): twelve significant digits are more than any
// 8-bit reading carries.
double tidy(double v) {
    char text[32];
    snprintf(text, sizeof text, "%.12g", v);
    return strtod(text, nullptr);
}

std::string unitText(const Ipmi::IpmiSensor& s) {
    std::string unit = s.getBaseUnit() == 0 ? std::string() : s.getBaseUnitString();
    if (s.getFlags() & Ipmi::IpmiSensor::FLAG_PERCENTAGE) unit = unit.empty() ? "percent" : "percent " + unit;
    const std::string modifier = s.getModifierUnit() == 0 ? std::string() : s.getModifierUnitString();
    if (!unit.empty() && !modifier.empty()) {
        if (s.getModifierUnitUse() == 1) unit += "/" + modifier;
        if (s.getModifierUnitUse() == 2) unit += "*" + modifier;
    }
    return unit;
}

std::string thresholdStateText(unsigned bits) {
    std::string out;
    for (int t = 0; t < kThresholds; ++t) {
        if ((bits & kThresholdPlaces[t].bit) == 0) continue;
        out += (out.empty() ? "" : ",") + std::string(kThresholdKeys[t]);
    }
    return out.empty() ? "ok" : out;
}

void fillThresholds(const Ipmi::IpmiSensor& s, const Ipmi::IpmiSensor::CachedState& c, SensorFacts& f) {
    if (c.thresholds[0] != Ipmi::cc::ok || !s.isConvertible()) return;
    for (int t = 0; t < kThresholds; ++t)
        if (c.thresholds[1] & kThresholdPlaces[t].bit)
            f.threshold[t] = tidy(s.convertRawValue(c.thresholds[kThresholdPlaces[t].answerByte]));
}

void fillReading(const Ipmi::IpmiSensor& s, const Ipmi::IpmiSensor::CachedState& c, SensorFacts& f, bool describe) {
    f.present = c.lastPollResult != Ipmi::cc::requestedSensorNotPresent;
    // A reading stored by the discovery or refresh pass carries all five bytes.
    const unsigned length = c.readingLength ? c.readingLength : sizeof c.reading;
    if (!c.readingValid || c.reading[0] != Ipmi::cc::ok || length < 4) return;
    if (c.reading[2] & kReadingUnavailable) return;
    if (f.discrete) {
        const unsigned bits = c.reading[3] | (length > 4 ? (c.reading[4] & kHighStates) << 8 : 0u);
        f.stateBits = bits;
        try {
            f.health = Ipmi::getSensorHealthState(static_cast<uint8_t>(f.eventReadingType),
                                                  static_cast<uint8_t>(f.typeCode),
                                                  static_cast<uint8_t>(f.number), static_cast<uint16_t>(bits));
        } catch (const std::exception&) {
        }
        // The library's "N/A" (no state asserted) shows as the tool's one marker.
        if (describe && s.convertToEnumeration() != "N/A") f.state = s.convertToEnumeration();
        return;
    }
    if ((c.reading[2] & kScanningEnabled) == 0) return;
    const unsigned crossed = c.reading[3] & 0x3F;
    f.stateBits = crossed;
    f.state = thresholdStateText(crossed);
    f.health = (crossed & kCritical) ? Ipmi::HEALTH_CRITICAL_FAILURE
               : (crossed & kNonCritical) ? Ipmi::HEALTH_DEGRADED
                                          : Ipmi::HEALTH_OK;
    if (s.isConvertible()) f.reading = tidy(s.convertRawValue(c.reading[1]));
}

}  // namespace

const char* const kThresholdKeys[kThresholds] = {"lnr", "lcr", "lnc", "unc", "ucr", "unr"};
const char* const kThresholdLabels[kThresholds] = {
    "Lower Non-Recoverable", "Lower Critical", "Lower Non-Critical",
    "Upper Non-Critical",    "Upper Critical", "Upper Non-Recoverable",
};

std::string healthText(int state) {
    switch (state) {
    case Ipmi::HEALTH_OK: return "OK";
    case Ipmi::HEALTH_DEGRADED: return "Degraded";
    case Ipmi::HEALTH_MINOR_FAILURE: return "Minor failure";
    case Ipmi::HEALTH_MAJOR_FAILURE: return "Major failure";
    case Ipmi::HEALTH_CRITICAL_FAILURE: return "Critical failure";
    case Ipmi::HEALTH_NON_RECOVERABLE: return "Non-recoverable";
    default: return "Unknown";
    }
}

std::vector<SensorFacts> sensorFacts(bool describe) {
    std::vector<SensorFacts> out;
    auto sensors = Ipmi::IpmiIfc::getSensors(0);
    std::stable_sort(sensors.begin(), sensors.end(), [](const auto& a, const auto& b) {
        return a->getSensorRecordNumber() < b->getSensorRecordNumber();
    });
    for (const auto& sensor : sensors) {
        Ipmi::IpmiSensor& s = *sensor;
        SensorFacts f;
        const Ipmi::IpmiEntity e = s.getEntity();
        f.number = s.getSensorNumber();
        f.entity = std::to_string(e.id) + "." + std::to_string(e.instance);
        f.entityName = e.getName();
        f.name = s.getSensorIdString();
        f.type = s.getSensorTypeString();
        f.typeCode = s.getSensorType();
        f.eventReadingType = s.getEventReadingType();
        f.discrete = s.isDiscrete();
        const unsigned char* record = nullptr;
        int length = 0;
        s.RawRecord(record, length);
        f.eventOnly = Ipmi::sdr::SdrView(record, length > 0 ? static_cast<size_t>(length) : 0).isEventOnly();
        if (!f.discrete) f.unit = unitText(s);
        // The discrete states' text reads the object's own reading: ask afresh.
        if (describe && f.discrete && !f.eventOnly) s.getSDReading();
        const Ipmi::IpmiSensor::CachedState cache = s.getCachedState();
        f.readingTime = cache.readingTime;
        if (!f.discrete) fillThresholds(s, cache, f);
        if (!f.eventOnly) fillReading(s, cache, f, describe);
        out.push_back(std::move(f));
    }
    return out;
}

}  // namespace Tool
