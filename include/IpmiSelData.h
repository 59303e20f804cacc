#ifndef TAV_IPMI_IPMISELDATA_H
#define TAV_IPMI_IPMISELDATA_H

#include <stdint.h>

#include <string>

#include "TavIpmiExport.h"

namespace Ipmi {

// One 16-byte SEL record as Get SEL Entry returns it. Multi-byte fields are
// kept as bytes, least significant first, so the layout needs no packing.
struct sel_event_record {
    uint8_t record_id[2];
    uint8_t record_type;     // 0x02 system event; 0xC0-0xDF OEM with time stamp; 0xE0-0xFF OEM
    uint8_t timestamp[4];
    uint8_t generator_id[2];
    uint8_t evm_rev;         // event message format revision
    uint8_t sensor_type;
    uint8_t sensor_number;
    uint8_t event_dir_type;  // bit 7 set: deassertion; bits 6:0 event/reading type
    uint8_t event_data[3];   // event data 1 carries the offset in bits 3:0
};
static_assert(sizeof(sel_event_record) == 16, "a SEL record is 16 bytes");

typedef sel_event_record Event_log;

enum {
    SEL_RECORD_TYPE_SYSTEM_EVENT = 0x02,
    SEL_EVENT_DEASSERTION = 0x80,
    SEL_EVENT_TYPE_MASK = 0x7F
};

// One line describing the event: direction, sensor type name and event text,
// cut to `size` bytes including the terminating zero.
TAV_IPMI_API void build_sel_desc(Event_log record, char* dst, int size);

// The event text alone, or "N/A" for event types without a table.
TAV_IPMI_API std::string GetMessage(Event_log record);

}  // namespace Ipmi

#endif
