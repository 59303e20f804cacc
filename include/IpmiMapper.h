#ifndef TAV_IPMI_IPMIMAPPER_H
#define TAV_IPMI_IPMIMAPPER_H

#include <stdint.h>

#include <istream>
#include <map>
#include <vector>

#include "TavIpmiExport.h"

namespace Ipmi {

// CIM HealthState values that the mapper returns.
enum IpmiHealthState : uint16_t {
    HEALTH_UNKNOWN = 0,
    HEALTH_OK = 5,
    HEALTH_DEGRADED = 10,
    HEALTH_MINOR_FAILURE = 15,
    HEALTH_MAJOR_FAILURE = 20,
    HEALTH_CRITICAL_FAILURE = 25,
    HEALTH_NON_RECOVERABLE = 30
};

// One line of the sensor health rules file:
//   eventReadingType, sensorType|*, offset|*, matchValue : healthState
struct TAV_IPMI_API HealthTableEntry {
    enum : uint16_t { ANY_SENSOR_TYPE = 0, ANY_OFFSET = 255 };

    uint16_t eventReadingType = 0;
    uint16_t sensorType = ANY_SENSOR_TYPE;
    uint16_t offset = ANY_OFFSET;
    uint8_t matchValue = 0;   // 0 keeps the rule out of sensorHealthMap
    uint16_t healthState = 1;
    uint8_t incomplete = 1;   // no ":" part: the line is dropped
    uint8_t anySensorType = 0;
    uint8_t anyOffset = 0;
};

// Reads one line of `is` and parses it into `entry`; a line that does not parse
// leaves `entry` incomplete. The stream's own state tells end of input.
TAV_IPMI_API std::istream& operator>>(std::istream& is, HealthTableEntry& entry);

// eventReadingType -> sensorType (0 for "*") -> offset (255 for "*") -> rule.
typedef std::map<uint16_t, std::map<uint16_t, std::map<uint16_t, HealthTableEntry>>> SensorHealthMap;

// Loaded once per process by LoadSensorHealthDataFile and never changed after;
// readers do not lock.
TAV_IPMI_API extern std::vector<HealthTableEntry> healthList;  // every complete line, file order
TAV_IPMI_API extern SensorHealthMap sensorHealthMap;           // lines with a non-zero matchValue

// Loads "/etc/sfcb/tav/sensor_health" unless the rules are already loaded.
// False when the file cannot be opened; a later call tries again.
TAV_IPMI_API bool LoadSensorHealthDataFile();
// The same with a rules file kept elsewhere (tools run from a build tree).
TAV_IPMI_API bool LoadSensorHealthDataFile(const char* path);

// Health state of one discrete sensor from its event/reading type, sensor type
// and state bits (bit n = offset n asserted).
class TAV_IPMI_API IpmiMapper {
public:
    IpmiMapper(uint8_t sensorClass, uint8_t sensorType, uint8_t statusBit, uint8_t sensorNumber,
               uint16_t state);

    void init();
    bool isMatch(HealthTableEntry& entry);
    uint8_t GetSensorSpecificStatusBit();
    uint16_t getHealthState();
    uint16_t getHealthStateFromSensorHealthMap() const;
    // For two-state sensors; the library itself does not use it.
    uint16_t getDigitalDiscrete(uint16_t state);

    uint8_t sensorClass;   // event/reading type code
    uint8_t sensorType;
    uint8_t statusBit;     // matched against a rule's offset
    uint8_t sensorNumber;  // for messages only
    uint16_t state;
    HealthTableEntry rule;  // first matching healthList line, or the default entry
};

TAV_IPMI_API uint16_t getSensorHealthState(uint8_t sensorClass, uint8_t sensorType,
                                           uint8_t sensorNumber, uint16_t state);

}  // namespace Ipmi

#endif
