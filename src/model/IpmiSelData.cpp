// One SEL record as callers see it: identity, time, CIM severity and alert
// type, caption, and the flat property text the alert indications carry.

#include <stdio.h>
#include <string.h>

#include "IpmiEventTables.h"
#include "IpmiIfcInternal.h"
#include "IpmiSelData.h"
#include "IpmiSensor.h"
#include "SelLayout.h"

namespace Ipmi {

namespace {

constexpr uint32_t kNoValue = 0xFFFFFFFF;
constexpr uint8_t kOldestCaptionedEvmRev = 4;
constexpr uint8_t kOffsetMask = 0x0F;
constexpr uint8_t kOemTimestampedFirst = 0xC0;
constexpr uint8_t kOemTimestampedLast = 0xDF;
constexpr uint8_t kLastStandardEventType = 0x6F;

// CIM PerceivedSeverity and AlertType values.
constexpr int kSeverityUnknown = 0;
constexpr int kSeverityMajor = 5;
constexpr int kSeverityCritical = 6;
constexpr int kSeverityFatal = 7;
constexpr int kAlertNone = 0;
constexpr int kAlertDevice = 5;
constexpr int kAlertEnvironmental = 6;
constexpr int kAlertSecurity = 8;

// Sensor types that decide the alert type.
constexpr uint8_t kSensorTypeTemperature = 0x01;
constexpr uint8_t kSensorTypePhysicalSecurity = 0x05;
constexpr uint8_t kSensorTypePlatformSecurity = 0x06;
constexpr uint8_t kSensorTypeEventLoggingDisabled = 0x10;
// Entities whose sensors are not reported by number: unspecified and BIOS.
constexpr unsigned kEntityUnspecified = 0x00;
constexpr unsigned kEntitySystemFirmware = 0x22;

// Threshold event offsets 0-11 map in pairs of going-low/going-high onto
// non-critical, critical and non-recoverable.
constexpr int kThresholdSeverity[16] = {kSeverityMajor,    kSeverityMajor,    kSeverityCritical, kSeverityCritical,
                                        kSeverityFatal,    kSeverityFatal,    kSeverityMajor,    kSeverityMajor,
                                        kSeverityCritical, kSeverityCritical, kSeverityFatal,    kSeverityFatal,
                                        kSeverityUnknown,  kSeverityUnknown,  kSeverityUnknown,  kSeverityUnknown};

constexpr char kMessageFormat[] =
    "*string CIM_Sensor.DeviceID*uint8[2] IPMI_RecordID*uint8 IPMI_RecordType*uint8[4] IPMI_Timestamp"
    "*uint8[2] IPMI_GeneratorID*uint8 IPMI_EvMRev*uint8 IPMI_SensorType*uint8 IPMI_SensorNumber"
    "*boolean IPMI_AssertionEvent*uint8 IPMI_EventType*uint8 IPMI_EventData1*uint8 IPMI_EventData2"
    "*uint8 IPMI_EventData3*uint32 IANA*";
constexpr unsigned kIana = 1;

const ipmi_caption_row* findCaptionRow(const ipmi_caption_row* rows, uint8_t code, uint8_t offset) {
    for (const ipmi_caption_row* r = rows; r->group; ++r)
        if (r->code == code && r->offset == offset) return r;
    return nullptr;
}

// Group name of a sensor type; the search skips the "Reserved" row 0.
const char* sensorTypeGroup(uint8_t sensorType) {
    for (const ipmi_caption_row* r = sensor_specific_types + 1; r->group; ++r)
        if (r->code == sensorType) return r->group;
    return nullptr;
}

}  // namespace

IpmiSelData::IpmiSelData(sel_event_record* record, int node) : record_(*record), node_(node) {}

uint64_t IpmiSelCursor::digestOf(const sel_event_record& record) {
    const auto* bytes = reinterpret_cast<const uint8_t*>(&record);
    uint64_t h = 0xcbf29ce484222325ull;
    for (size_t i = 0; i < sizeof record; ++i) h = (h ^ bytes[i]) * 0x100000001b3ull;
    return h != 0 ? h : 1;  // 0 means no cursor
}

IpmiSelCursor IpmiSelCursor::at(const IpmiSelData& record) {
    IpmiSelCursor c;
    c.recordId = record.recordId();
    c.timestamp = record.messageTimeStamp();
    c.digest = digestOf(record.record());
    return c;
}

uint16_t IpmiSelData::recordId() const { return sel::le16(record_.record_id); }

uint8_t IpmiSelData::recordType() const { return record_.record_type; }

bool IpmiSelData::isSelEventRecord() const {
    return record_.record_type == 0x00 || record_.record_type == SEL_RECORD_TYPE_SYSTEM_EVENT;
}

uint16_t IpmiSelData::getGeneratorId() const { return isSelEventRecord() ? sel::le16(record_.generator_id) : 0; }

uint32_t IpmiSelData::messageTimeStamp() const {
    const bool oemTimestamped =
        record_.record_type >= kOemTimestampedFirst && record_.record_type <= kOemTimestampedLast;
    return (isSelEventRecord() || oemTimestamped) ? sel::le32(record_.timestamp) : kNoValue;
}

uint32_t IpmiSelData::eventType() const {
    return isSelEventRecord() ? (record_.event_dir_type & SEL_EVENT_TYPE_MASK) : kNoValue;
}

// The direction is not looked at: a deassertion is as severe as its assertion.
int IpmiSelData::severity() const {
    if ((record_.event_dir_type & SEL_EVENT_TYPE_MASK) != EVENT_TYPE_THRESHOLD) return kSeverityUnknown;
    return kThresholdSeverity[record_.event_data[0] & kOffsetMask];
}

int IpmiSelData::alertType() const {
    if (!isSelEventRecord() || (record_.event_dir_type & SEL_EVENT_TYPE_MASK) > kLastStandardEventType)
        return kAlertNone;
    switch (record_.sensor_type) {
    case kSensorTypeTemperature:
        return kAlertEnvironmental;
    case kSensorTypePhysicalSecurity:
    case kSensorTypePlatformSecurity:
        return kAlertSecurity;
    default:
        return kAlertDevice;
    }
}

std::string IpmiSelData::messageFormat() const { return isSelEventRecord() ? kMessageFormat : ""; }

std::string IpmiSelData::caption() const {
    if (!isSelEventRecord() || record_.evm_rev < kOldestCaptionedEvmRev) return "";
    const std::string direction = (record_.event_dir_type & SEL_EVENT_DEASSERTION) ? "Deassert + " : "Assert + ";
    const uint8_t type = record_.event_dir_type & SEL_EVENT_TYPE_MASK;
    const uint8_t offset = record_.event_data[0] & kOffsetMask;
    if (type >= EVENT_TYPE_THRESHOLD && type <= EVENT_TYPE_GENERIC_LAST) {
        std::string caption = direction;
        const char* group = record_.sensor_type == 0 ? sensor_specific_types[0].group : sensorTypeGroup(record_.sensor_type);
        if (group) caption.append(group).append(" ");
        const ipmi_caption_row* row = findCaptionRow(generic_event_types, type, offset);
        if (row && row->desc) caption += row->desc;
        return caption;
    }
    if (type == EVENT_TYPE_SENSOR_SPECIFIC) {
        std::string caption = direction;
        const ipmi_caption_row* row = findCaptionRow(sensor_specific_types, record_.sensor_type, offset);
        if (!row) return caption;
        caption += row->group;
        if (row->desc) caption.append(" ").append(row->desc);
        return caption;
    }
    return "";
}

std::string IpmiSelData::description() const { return ""; }

uint8_t IpmiSelData::getSensorNumber() const {
    const uint8_t number = record_.sensor_number;
    if (!isSelEventRecord() || number == 0) return 0;
    auto sensors = IpmiIfc::getSensors(node_);
    if (sensors.empty()) {
        IpmiIfcSdrGetInfo(node_);
        sensors = IpmiIfc::getSensors(node_);
    }
    for (auto it = sensors.rbegin(); it != sensors.rend(); ++it) {
        if (!*it || (*it)->getSensorNumber() != number) continue;
        const unsigned entity = (*it)->getEntity().getId();
        if (entity == kEntityUnspecified || entity == kEntitySystemFirmware ||
            (*it)->getSensorType() == kSensorTypeEventLoggingDisabled)
            return 0;
        return number;
    }
    return 0;
}

std::string IpmiSelData::recordId(int n) const {
    if (n == 0) return "Invalid";
    char text[16];
    snprintf(text, sizeof text, "%04d", n);
    return text;
}

// AssertionEvent reads "true" for a DEassertion: the indications' consumers
// expect that inverted sense.
std::string IpmiSelData::recordDataString() const {
    if (!isSelEventRecord()) return "";
    const unsigned s = getSensorNumber();
    const sel_event_record& r = record_;
    char text[256];
    snprintf(text, sizeof text, "*%u.%u.%u*%u %u*%u*%u %u %u %u*%u %u*%u*%u*%u*%s*%u*%u*%u*%u*%u*", s,
             unsigned(r.generator_id[1]), unsigned(r.generator_id[0]), unsigned(r.record_id[0]),
             unsigned(r.record_id[1]), unsigned(r.record_type), unsigned(r.timestamp[0]), unsigned(r.timestamp[1]),
             unsigned(r.timestamp[2]), unsigned(r.timestamp[3]), unsigned(r.generator_id[0]),
             unsigned(r.generator_id[1]), unsigned(r.evm_rev), unsigned(r.sensor_type), s,
             (r.event_dir_type & SEL_EVENT_DEASSERTION) ? "true" : "false",
             unsigned(r.event_dir_type & SEL_EVENT_TYPE_MASK), unsigned(r.event_data[0]), unsigned(r.event_data[1]),
             unsigned(r.event_data[2]), kIana);
    return text;
}

// Sends command 0x46 (Delete SEL Entry), not Reserve SEL: the request
// providers have always sent; what the answer's bytes 2-3 hold is kept as the ID.
int IpmiSelData::reserve(uint16_t& reservationId) const {
    uint8_t answer[4] = {0, 0, 0, 0};
    uint16_t length = sizeof answer;
    const uint8_t code = IpmiIfc::sendCmd(node_, cmd::deleteSelEntry, netfn::storage, 0, nullptr, &length, answer);
    if (code == cc::invalidCommand || code == cc::illegalForSensorType) return 1;
    reservationId = sel::le16(answer + 2);
    return code;
}

// The record ID travels cut to its low byte: kept as providers know it.
int IpmiSelData::clear() const {
    uint16_t reservation = 0;
    reserve(reservation);
    uint8_t request[sel::deleteRequest::size];
    sel::putLe16(request + sel::deleteRequest::reservation, reservation);
    request[sel::deleteRequest::recordId] = record_.record_id[0];
    request[sel::deleteRequest::recordId + 1] = 0x00;
    uint8_t answer[4] = {0, 0, 0, 0};
    uint16_t length = sizeof answer;
    const uint8_t code =
        IpmiIfc::sendCmd(node_, cmd::deleteSelEntry, netfn::storage, sizeof request, request, &length, answer);
    return (code == cc::invalidCommand || code == cc::illegalForSensorType) ? 1 : code;
}

}  // namespace Ipmi
