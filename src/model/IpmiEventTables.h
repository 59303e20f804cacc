#ifndef TAV_IPMI_IPMIEVENTTABLES_H
#define TAV_IPMI_IPMIEVENTTABLES_H

// Texts of IPMI events and sensor types, looked up by SEL decoding and by the
// sensors' state names; not installed.

#include <stdint.h>

#include "IpmiSelData.h"

namespace Ipmi {

// Key layout of ipmi_sel_data: category, type, event data 1, event data 3
// from the most significant byte down.
enum : uint32_t {
    SEL_KEY_GENERIC = 0x01000000,   // generic event/reading type offsets
    SEL_KEY_SPECIFIC = 0x02000000,  // sensor-specific offsets, by sensor type
    SEL_KEY_ANY_DATA3 = 0xFF        // text does not depend on event data 3
};

constexpr uint32_t selKey(uint32_t category, uint8_t type, uint8_t data1, uint8_t data3) {
    return category | uint32_t(type) << 16 | uint32_t(data1) << 8 | data3;
}
constexpr uint8_t selKeyCategory(uint32_t key) { return uint8_t(key >> 24); }
constexpr uint8_t selKeyType(uint32_t key) { return uint8_t(key >> 16); }
constexpr uint8_t selKeyData1(uint32_t key) { return uint8_t(key >> 8); }
constexpr uint8_t selKeyData3(uint32_t key) { return uint8_t(key); }

// Event/reading type codes that have texts.
enum : uint8_t {
    EVENT_TYPE_THRESHOLD = 0x01,
    EVENT_TYPE_GENERIC_LAST = 0x0C,  // generic types run from threshold to here
    EVENT_TYPE_SENSOR_SPECIFIC = 0x6F
};

// Words that the event rows share with the sensors' own texts. These are not
// inline variables: GCC stops treating the address of one as a constant when
// the sanitizers are on, and the state name tables are built at compile time.
namespace word {
constexpr char notAvailable[] = "N/A";  // no state or message text
constexpr char reserved[] = "reserved";
constexpr char Unspecified[] = "Unspecified";
}  // namespace word

// Sensor type names that the event rows share with the sensors' type texts
// (where the two vocabularies differ, each file keeps its own).
namespace sensorTypeName {
constexpr char temperature[] = "Temperature";
constexpr char voltage[] = "Voltage";
constexpr char current[] = "Current";
constexpr char fan[] = "Fan";
constexpr char physicalSecurity[] = "Physical Security";
constexpr char platformSecurity[] = "Platform Security";
constexpr char processor[] = "Processor";
constexpr char powerSupply[] = "Power Supply";
constexpr char powerUnit[] = "Power Unit";
constexpr char coolingDevice[] = "Cooling Device";
constexpr char memory[] = "Memory";
constexpr char postMemoryResize[] = "POST Memory Resize";
constexpr char eventLoggingDisabled[] = "Event Logging Disabled";
constexpr char systemEvent[] = "System Event";
constexpr char criticalInterrupt[] = "Critical Interrupt";
constexpr char button[] = "Button";
constexpr char addInCard[] = "Add-in Card";
constexpr char chassis[] = "Chassis";
constexpr char chipSet[] = "Chip Set";
constexpr char otherFru[] = "Other FRU";
constexpr char terminator[] = "Terminator";
constexpr char systemBootInitiated[] = "System Boot Initiated";
constexpr char bootError[] = "Boot Error";
constexpr char osBoot[] = "OS Boot";
constexpr char systemAcpiPowerState[] = "System ACPI Power State";
constexpr char platformAlert[] = "Platform Alert";
constexpr char entityPresence[] = "Entity Presence";
constexpr char lan[] = "LAN";
constexpr char managementSubsystemHealth[] = "Management Subsystem Health";
constexpr char battery[] = "Battery";
constexpr char versionChange[] = "Version Change";
constexpr char fruState[] = "FRU State";
}  // namespace sensorTypeName

struct ipmi_sel_row {
    uint32_t key;
    uint32_t reserved;    // 0 in every row
    const char* group;    // event/reading type name or sensor type name
    const char* desc;     // null for a sensor type without offsets
};

enum { IPMI_SEL_DATA_ROWS = 352 };

// Sorted by key.
extern const ipmi_sel_row ipmi_sel_data[IPMI_SEL_DATA_ROWS];
// Minimal perfect hash over the keys of ipmi_sel_data (hash and displace),
// built from the table when the library is compiled.
extern const int32_t (&G_array)[IPMI_SEL_DATA_ROWS];
extern const int32_t (&V_array)[IPMI_SEL_DATA_ROWS];  // row number + 1

// Row that `key` hashes to; the caller checks that the row holds the key.
uint32_t perfect_hash_lookup(uint32_t key);

// Event text, or "" when no row has the key or the row has no text.
const char* find_generic_desc(uint8_t eventType, uint8_t data1);
const char* find_specific_desc(uint8_t sensorType, uint8_t data1, uint8_t data3);

// Orders rows by category and type only, for the sensor type name search.
int code_compare(const void* a, const void* b);
// Name of a sensor type from its sensor-specific rows; null when it has none.
const char* find_sensor_type_name(uint8_t sensorType);

// The discrete state names searched by IpmiSensor::convertToEnumeration: the
// rows with a text of ipmi_sel_data, same order, same texts. `qualifier` is
// the event data 3 value that selects the text (0xFF: any). Each table ends
// with a row whose text is null.
struct ipmi_event_type {
    uint8_t code;       // event/reading type, or sensor type
    uint8_t offset;     // event offset (event data 1)
    uint8_t qualifier;
    const char* text;
};

extern const ipmi_event_type* const generic_sensor_event_types;
extern const ipmi_event_type* const sensor_specific_event_types;

// The rows of ipmi_sel_data reshaped for SEL record captions, in table order.
// Each table ends with a row whose group is null.
struct ipmi_caption_row {
    uint8_t code;    // event/reading type, or sensor type
    uint8_t offset;  // event offset
    uint8_t match;   // event data 3 the text is for; 0xFF any
    uint8_t cls;     // reading class: 2 threshold, 1 discrete, 0 other
    const char* group;
    const char* desc;  // null for a sensor type without offsets
};

enum { GENERIC_EVENT_TYPE_ROWS = 61, SENSOR_SPECIFIC_TYPE_ROWS = 293 };

extern const ipmi_caption_row* const generic_event_types;
// Row 0 is sensor type 0 "Reserved" and the row before the end is 0xC0 "OEM".
extern const ipmi_caption_row* const sensor_specific_types;

}  // namespace Ipmi

#endif
