#ifndef TAV_IPMI_IPMIMAPPER_H
#define TAV_IPMI_IPMIMAPPER_H

#include <stdint.h>

#include <istream>
#include <map>
#include <vector>

#include "TavIpmiExport.h"

/// @file
/// Health states of sensors: the rules file and the mapper of discrete
/// sensor states. Nothing here talks to the controller.
///
/// Load the rules once, before any thread maps states (before
/// IpmiIfc::start; IpmiIfcInitForCLI loads them itself): mapping reads them
/// without a lock.

namespace Ipmi {

/// CIM HealthState values that the mapper returns.
enum IpmiHealthState : uint16_t {
    HEALTH_UNKNOWN = 0,            ///< no rule, or not a health-bearing sensor
    HEALTH_OK = 5,                 ///< OK
    HEALTH_DEGRADED = 10,          ///< degraded/warning
    HEALTH_MINOR_FAILURE = 15,     ///< minor failure
    HEALTH_MAJOR_FAILURE = 20,     ///< major failure
    HEALTH_CRITICAL_FAILURE = 25,  ///< critical failure
    HEALTH_NON_RECOVERABLE = 30    ///< non-recoverable error
};

/// One line of the sensor health rules file:
///   eventReadingType, sensorType|*, offset|*, matchValue : healthState
struct TAV_IPMI_API HealthTableEntry {
    /// Values that stand for "*".
    enum : uint16_t {
        ANY_SENSOR_TYPE = 0,  ///< any sensor type
        ANY_OFFSET = 255      ///< any offset
    };

    uint16_t eventReadingType = 0;          ///< event/reading type code the rule is for
    uint16_t sensorType = ANY_SENSOR_TYPE;  ///< sensor type code, or ANY_SENSOR_TYPE
    uint16_t offset = ANY_OFFSET;           ///< state offset, or ANY_OFFSET
    uint8_t matchValue = 0;   ///< 0 keeps the rule out of sensorHealthMap
    uint16_t healthState = 1;  ///< CIM HealthState the rule gives (1-30)
    uint8_t incomplete = 1;   ///< no ":" part: the line is dropped
    uint8_t anySensorType = 0;  ///< the sensor type was "*"
    uint8_t anyOffset = 0;      ///< the offset was "*"
};

/// Reads one line of `is` and parses it into `entry`; a line that does not parse
/// leaves `entry` incomplete. The stream's own state tells end of input.
TAV_IPMI_API std::istream& operator>>(std::istream& is, HealthTableEntry& entry);

/// eventReadingType -> sensorType (0 for "*") -> offset (255 for "*") -> rule.
typedef std::map<uint16_t, std::map<uint16_t, std::map<uint16_t, HealthTableEntry>>> SensorHealthMap;

/// Every complete line of the rules file, in file order. Loaded once per
/// process by LoadSensorHealthDataFile and never changed after; readers do
/// not lock.
TAV_IPMI_API extern std::vector<HealthTableEntry> healthList;
/// The lines with a non-zero matchValue, by type, sensor type and offset;
/// loaded with healthList.
TAV_IPMI_API extern SensorHealthMap sensorHealthMap;

/// Loads "/etc/sfcb/tav/sensor_health" unless the rules are already loaded.
/// False when the file cannot be opened (logged); a later call tries again.
TAV_IPMI_API bool LoadSensorHealthDataFile();
/// The same with a rules file kept elsewhere (tools run from a build tree).
TAV_IPMI_API bool LoadSensorHealthDataFile(const char* path);

/// Health state of one discrete sensor from its event/reading type, sensor type
/// and state bits (bit n = offset n asserted). A value type; any thread once
/// the rules are loaded.
class TAV_IPMI_API IpmiMapper {
public:
    /// Keeps the arguments and finds the sensor's rule (init()).
    IpmiMapper(uint8_t sensorClass, uint8_t sensorType, uint8_t statusBit, uint8_t sensorNumber,
               uint16_t state);

    /// Finds the first healthList line that matches; threshold and OEM types
    /// get none.
    void init();
    /// Whether `entry` is for this sensor's type, sensor type and status bit.
    bool isMatch(HealthTableEntry& entry);
    /// The offset that selects the rule of a sensor-specific sensor type; 0
    /// for types without one.
    uint8_t GetSensorSpecificStatusBit();
    /// The health state: HEALTH_UNKNOWN (logged) for threshold and
    /// unsupported types and for usage state (0x02) and device presence
    /// (0x08) sensors, otherwise getHealthStateFromSensorHealthMap().
    uint16_t getHealthState();
    /// HEALTH_OK without asserted states; else the worst state the asserted
    /// offsets' rules give, except that an offset without a rule sets the
    /// result back to HEALTH_OK, as callers have always seen.
    uint16_t getHealthStateFromSensorHealthMap() const;
    /// For two-state sensors; the library itself does not use it.
    uint16_t getDigitalDiscrete(uint16_t state);

    uint8_t sensorClass;   ///< event/reading type code
    uint8_t sensorType;    ///< sensor type code
    uint8_t statusBit;     ///< matched against a rule's offset
    uint8_t sensorNumber;  ///< for messages only
    uint16_t state;        ///< the state bits
    HealthTableEntry rule;  ///< first matching healthList line, or the default entry
};

/// The CIM health state of a discrete sensor's state bits (IpmiMapper::getHealthState);
/// HEALTH_UNKNOWN when there is none. Never throws.
TAV_IPMI_API uint16_t getSensorHealthState(uint8_t sensorClass, uint8_t sensorType,
                                           uint8_t sensorNumber, uint16_t state);

}  // namespace Ipmi

#endif
