#include "IpmiMapper.h"

#include <ctype.h>
#include <errno.h>

#include <algorithm>
#include <fstream>
#include <sstream>
#include <string>

#include "CmpiStatus.h"
#include "IpmiLog.h"
#include "IpmiMapperInternal.h"
#include "Mutex.h"

#ifndef TAV_IPMI_HEALTH_FILE
#define TAV_IPMI_HEALTH_FILE "/etc/sfcb/tav/sensor_health"
#endif

namespace Ipmi {

std::vector<HealthTableEntry> healthList;
SensorHealthMap sensorHealthMap;

namespace {

// IPMI event/reading type codes that select how a sensor is mapped.
enum : uint8_t {
    EVENT_READING_UNSPECIFIED = 0x00,
    EVENT_READING_THRESHOLD = 0x01,
    EVENT_READING_SENSOR_SPECIFIC = 0x6F
};

// ---- rules file parser ----

// Skips blanks without failing the stream at end of input.
void eatwhite(std::istream& in) {
    int c;
    while ((c = in.peek()) != std::char_traits<char>::eof() && isspace(c)) in.get();
}

// A separator is whatever single non-blank character stands in its place.
char takeToken(std::istream& in) {
    char c = 0;
    in >> c;
    return c;
}

// Sensor type or offset: "*" (sets `any`) or a number, each followed by a separator.
void readFieldOrAny(std::istream& in, uint16_t& value, uint8_t& any) {
    eatwhite(in);
    if (in.peek() == '*') {
        in.get();
        any = 1;
        eatwhite(in);
        in.get();
        return;
    }
    in >> value;
    takeToken(in);
}

void parseRule(std::istream& in, HealthTableEntry& entry) {
    in >> entry.eventReadingType;
    takeToken(in);
    readFieldOrAny(in, entry.sensorType, entry.anySensorType);
    readFieldOrAny(in, entry.offset, entry.anyOffset);
    entry.matchValue = static_cast<uint8_t>(takeToken(in) - '0');
    if (takeToken(in) != ':') {
        entry.incomplete = 1;
        return;
    }
    entry.incomplete = 0;
    eatwhite(in);
    char c = 0;
    if (in.get(c) && c != ':') {
        in.putback(c);
        in >> entry.healthState;
        in.get();
    }
}

// ---- loader ----

TAV::Mutex& listGuard() {
    // Never destroyed: a loader may still run while the process exits.
    static TAV::Mutex* guard = new TAV::Mutex;
    return *guard;
}

void addRule(const HealthTableEntry& entry) {
    healthList.push_back(entry);
    if (entry.matchValue == 0) return;
    uint16_t type = entry.anySensorType ? uint16_t(HealthTableEntry::ANY_SENSOR_TYPE) : entry.sensorType;
    uint16_t offset = entry.anyOffset ? uint16_t(HealthTableEntry::ANY_OFFSET) : entry.offset;
    sensorHealthMap[entry.eventReadingType][type][offset] = entry;
}

// ---- mapper ----

// Fold of a rule's health state (1-30) to what the mapper reports; 0 = ignored.
const uint16_t kFoldedHealth[30] = {
    HEALTH_OK, 0, 0, 0, HEALTH_OK,                    // 1-5
    0, 0, 0, 0, HEALTH_DEGRADED,                      // 6-10
    0, 0, 0, 0, HEALTH_DEGRADED,                      // 11-15
    0, 0, 0, 0, HEALTH_DEGRADED,                      // 16-20
    0, 0, 0, 0, HEALTH_CRITICAL_FAILURE,              // 21-25
    0, 0, 0, 0, HEALTH_CRITICAL_FAILURE};             // 26-30

struct StatusBitOfType {
    uint8_t sensorType;
    uint8_t statusBit;
};

// Offset that selects the rule of a sensor-specific sensor; other types use 0.
const StatusBitOfType kSensorSpecificStatusBits[] = {
    {0x07, 1},   // processor
    {0x08, 1},   // power supply
    {0x09, 6},   // power unit
    {0x0C, 10},  // memory
    {0x0D, 1},   // drive slot
    {0x1B, 1},   // cable/interconnect
};

}  // namespace

std::istream& operator>>(std::istream& is, HealthTableEntry& entry) {
    // One line at a time, so that a broken line never eats into the next.
    std::string line;
    std::getline(is, line);
    std::istringstream in(line);
    parseRule(in, entry);
    return is;
}

bool LoadSensorHealthDataFile(const char* path) {
    TAV::MutexLock lock(listGuard());
    if (!healthList.empty()) return true;

    ipmiLog(LOG_DEBUG, "tav-ipmi: Loading %s", path);
    std::ifstream file(path);
    if (!file.is_open()) {
        int err = errno;
        errno = err;
        ipmiLog(LOG_ERR, "%s: open(%s) failed %d %m", "LoadSensorHealthDataFile", path, err);
        return false;
    }

    int lines = 0;
    for (;;) {
        HealthTableEntry entry;
        file >> entry;
        ++lines;
        // The read that meets the end is counted but not kept, even when it
        // holds a last line without a newline.
        if (!file.good()) break;
        if (!entry.incomplete) addRule(entry);
    }
    ipmiLog(LOG_DEBUG, "tav-ipmi: Read %d lines from %s, total entries %zu", lines, path,
            healthList.size());
    return true;
}

bool LoadSensorHealthDataFile() { return LoadSensorHealthDataFile(TAV_IPMI_HEALTH_FILE); }

void ResetSensorHealthData() {
    TAV::MutexLock lock(listGuard());
    healthList.clear();
    sensorHealthMap.clear();
}

IpmiMapper::IpmiMapper(uint8_t sensorClass_, uint8_t sensorType_, uint8_t statusBit_,
                       uint8_t sensorNumber_, uint16_t state_)
    : sensorClass(sensorClass_),
      sensorType(sensorType_),
      statusBit(statusBit_),
      sensorNumber(sensorNumber_),
      state(state_),
      rule() {
    init();
}

void IpmiMapper::init() {
    // Threshold sensors and OEM reading types get no rule.
    if (sensorClass < 2 || sensorClass > EVENT_READING_SENSOR_SPECIFIC) return;
    if (sensorClass == EVENT_READING_SENSOR_SPECIFIC) statusBit = GetSensorSpecificStatusBit();
    for (HealthTableEntry& entry : healthList) {
        if (isMatch(entry)) {
            rule = entry;
            return;
        }
    }
}

bool IpmiMapper::isMatch(HealthTableEntry& entry) {
    return entry.eventReadingType == sensorClass &&
           (entry.sensorType == sensorType || entry.anySensorType) &&
           (entry.offset == statusBit || entry.anyOffset);
}

uint8_t IpmiMapper::GetSensorSpecificStatusBit() {
    for (const StatusBitOfType& s : kSensorSpecificStatusBits)
        if (s.sensorType == sensorType) return s.statusBit;
    return 0;
}

uint16_t IpmiMapper::getHealthState() {
    switch (sensorClass) {
    case EVENT_READING_UNSPECIFIED:
        ipmiLog(LOG_ERR, "Invalid class for sensor number %d, sensor type: %d", sensorNumber,
                sensorType);
        return HEALTH_UNKNOWN;
    case EVENT_READING_THRESHOLD:
        ipmiLog(LOG_ERR, "Expected discrete sensor/threshold for sensor number : %d Sendor Type %d",
                sensorNumber, sensorType);
        return HEALTH_UNKNOWN;
    // 0x02 (usage state) and 0x08 (device presence) stay unmapped on purpose:
    // they tell what a device is doing or whether it is there, not its health.
    case 0x03: case 0x04: case 0x05: case 0x06: case 0x07:
    case 0x09: case 0x0A: case 0x0B: case 0x0C:
    case EVENT_READING_SENSOR_SPECIFIC:
        return getHealthStateFromSensorHealthMap();
    default:
        ipmiLog(LOG_DEBUG, "Unsupported sensor class %d for sensor number %d type %d", sensorClass,
                sensorNumber, sensorType);
        return HEALTH_UNKNOWN;
    }
}

uint16_t IpmiMapper::getHealthStateFromSensorHealthMap() const {
    if (state == 0) return HEALTH_OK;
    if (rule.incomplete) return HEALTH_UNKNOWN;

    uint16_t result = HEALTH_UNKNOWN;
    const auto byClass = sensorHealthMap.find(sensorClass);
    unsigned offset = 0;
    for (unsigned bits = state; bits != 0; bits >>= 1, ++offset) {
        if (!(bits & 1) || byClass == sensorHealthMap.end()) continue;
        const auto& byType = byClass->second;
        auto typeRules = byType.find(sensorType);
        if (typeRules == byType.end()) {
            if (byType.empty() || byType.begin()->first != HealthTableEntry::ANY_SENSOR_TYPE) continue;
            typeRules = byType.begin();
        }
        const auto& byOffset = typeRules->second;
        auto bitRule = byOffset.find(static_cast<uint16_t>(offset));
        if (bitRule == byOffset.end()) bitRule = byOffset.find(HealthTableEntry::ANY_OFFSET);
        if (bitRule == byOffset.end()) {
            // A bit without a rule sets the result back to OK, even after a worse
            // bit. Deliberate, kept behaviour: it is an assignment, not a maximum.
            result = HEALTH_OK;
            continue;
        }
        uint16_t h = bitRule->second.healthState;
        if (h >= 1 && h <= 30) result = std::max(result, kFoldedHealth[h - 1]);
    }
    return result;
}

uint16_t IpmiMapper::getDigitalDiscrete(uint16_t state_) {
    if (rule.incomplete) return (state_ & 1) ? HEALTH_OK : HEALTH_CRITICAL_FAILURE;
    if ((statusBit & state_) == rule.matchValue) return rule.healthState;
    return HEALTH_CRITICAL_FAILURE;
}

uint16_t getSensorHealthState(uint8_t sensorClass, uint8_t sensorType, uint8_t sensorNumber,
                              uint16_t state) {
    try {
        IpmiMapper mapper(sensorClass, sensorType, 0, sensorNumber, state);
        return mapper.getHealthState();
    } catch (const kelInt::CmpiStatus&) {
        ipmiLog(LOG_ERR,
                "%s: sensorClass=%d, sensorType=%d, sensorNumber=%d has no health state, return bad state",
                "getSensorHealthState", sensorClass, sensorType, sensorNumber);
        return HEALTH_UNKNOWN;
    }
}

}  // namespace Ipmi
