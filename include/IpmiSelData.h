#ifndef TAV_IPMI_IPMISELDATA_H
#define TAV_IPMI_IPMISELDATA_H

#include <stdint.h>

#include <string>

#include "TavIpmiExport.h"

/// @file
/// SEL records: the 16-byte record and the object the library hands out.

namespace Ipmi {

/// One 16-byte SEL record as Get SEL Entry returns it. Multi-byte fields are
/// kept as bytes, least significant first, so the layout needs no packing.
struct sel_event_record {
    uint8_t record_id[2];     ///< record ID
    uint8_t record_type;     ///< 0x02 system event; 0xC0-0xDF OEM with time stamp; 0xE0-0xFF OEM
    uint8_t timestamp[4];     ///< seconds, controller time
    uint8_t generator_id[2];  ///< who logged it: slave address or software ID, channel, LUN
    uint8_t evm_rev;         ///< event message format revision
    uint8_t sensor_type;      ///< sensor type code
    uint8_t sensor_number;    ///< sensor number
    uint8_t event_dir_type;  ///< bit 7 set: deassertion; bits 6:0 event/reading type
    uint8_t event_data[3];   ///< event data 1 carries the offset in bits 3:0
};
static_assert(sizeof(sel_event_record) == 16, "a SEL record is 16 bytes");

/// The record as the direct synchroniser hands it out.
typedef sel_event_record Event_log;

/// Codes of sel_event_record fields.
enum {
    SEL_RECORD_TYPE_SYSTEM_EVENT = 0x02,  ///< record_type of a system event record
    SEL_EVENT_DEASSERTION = 0x80,         ///< event_dir_type bit of a deassertion
    SEL_EVENT_TYPE_MASK = 0x7F            ///< event_dir_type bits of the event/reading type
};

class IpmiSelData;

/// Where a caller's delivery stands: the last record it received, told by
/// its ID, its time stamp and a digest of its 16 bytes. A value a caller
/// keeps across restarts (see IpmiIfc::resumeSelDelivery), so its fields are
/// plain numbers.
struct IpmiSelCursor {
    uint16_t recordId = 0;   ///< the record's ID
    uint32_t timestamp = 0;  ///< messageTimeStamp() of the record
    uint64_t digest = 0;     ///< digestOf() its 16 bytes; 0: no cursor
    /// FNV-1a over the record's 16 bytes, never 0. Pure; any thread.
    TAV_IPMI_API static uint64_t digestOf(const sel_event_record& record);
    /// The cursor that stands on `record`. Pure; any thread.
    TAV_IPMI_API static IpmiSelCursor at(const IpmiSelData& record);
};

/// One SEL record as the library hands it to callers: the 16 bytes read from
/// the controller and the node they came from. Immutable once built, so any
/// thread may read it while the polling loop goes on; a value type, copy it
/// to keep a record a SEL event handler was given. The decoders send nothing
/// and never throw; reserve(), clear() and, with an empty sensor cache,
/// getSensorNumber() talk to the controller.
class TAV_IPMI_API IpmiSelData {
public:
    /// Copies the 16 bytes of `record`.
    IpmiSelData(sel_event_record* record, int node);

    uint16_t recordId() const;   ///< record ID
    uint8_t recordType() const;  ///< record type
    /// Types 0x00 and 0x02 are both taken as system event records.
    bool isSelEventRecord() const;
    /// Bytes 7-8 for an event record, else 0.
    uint16_t getGeneratorId() const;
    /// Seconds for event and timestamped OEM records; 0xFFFFFFFF otherwise.
    uint32_t messageTimeStamp() const;
    /// Event/reading type of an event record, else 0xFFFFFFFF.
    uint32_t eventType() const;
    /// CIM PerceivedSeverity of a threshold event: 5, 6, 7, or 0 for anything else.
    int severity() const;
    /// CIM AlertType: 6 environmental, 8 security, 5 device, 0 OEM or not an event.
    int alertType() const;
    /// Names and types of the values recordDataString() gives ("*type name*...").
    std::string messageFormat() const;
    /// "Assert + " or "Deassert + ", the sensor type name and the event text.
    std::string caption() const;
    /// The event's text from the library's tables; empty where they have none.
    std::string description() const;
    /// The sensor number when the sensor cache knows a sensor of that number on
    /// an ordinary entity; 0 otherwise. With an empty sensor cache it reads
    /// the SDR repository first (IpmiIfcSdrGetInfo).
    uint8_t getSensorNumber() const;
    /// "Invalid" for 0, else n with at least four digits ("0007").
    std::string recordId(int n) const;
    /// The record's values in messageFormat() order, '*'-separated.
    std::string recordDataString() const;
    /// Sends Storage command 0x46 without data (one exchange) and keeps bytes
    /// 2-3 of the answer in reservationId, as callers have always seen;
    /// returns the completion code (1 for 0xC1/0xCD).
    int reserve(uint16_t& reservationId) const;
    /// Deletes the record on the controller: reserve(), then Delete SEL
    /// Entry with the record ID cut to its low byte, as callers have always
    /// sent it (two exchanges). Returns the completion code (1 for 0xC1/0xCD).
    int clear() const;

    const sel_event_record& record() const { return record_; }  ///< the 16 bytes
    int node() const { return node_; }                          ///< the node

private:
    sel_event_record record_;
    int node_;
};

/// One line describing the event: direction, sensor type name and event text,
/// cut to `size` bytes including the terminating zero.
TAV_IPMI_API void build_sel_desc(Event_log record, char* dst, int size);

/// The event text alone, or "N/A" for event types without a table.
TAV_IPMI_API std::string GetMessage(Event_log record);

}  // namespace Ipmi

#endif
