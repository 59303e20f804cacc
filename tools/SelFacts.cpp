#include "SelFacts.h"

#include <stdio.h>
#include <time.h>

#include <map>
#include <mutex>

#include "IpmiFru.h"
#include "IpmiIfc.h"
#include "IpmiSel.h"
#include "IpmiSensor.h"
#include "Metrics.h"

namespace Tool {

namespace {

// Record types up to here carry a time stamp.
constexpr uint8_t kLastTimestampedType = 0xDF;
constexpr uint8_t kFirstGenericType = 0x01;
constexpr uint8_t kLastGenericType = 0x0C;
constexpr uint8_t kOffsetMask = 0x0F;

std::mutex countMutex;
std::map<std::string, double>& eventCounts() {
    static std::map<std::string, double> counts{{"none", 0}, {"major", 0}, {"critical", 0}, {"fatal", 0}};
    return counts;
}

Json timeText(const Ipmi::IpmiSelData& r) {
    if (r.recordType() > kLastTimestampedType) return Json();
    const time_t t = static_cast<time_t>(r.messageTimeStamp());
    struct tm tm;
    char text[32];
    if (gmtime_r(&t, &tm) == nullptr || strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &tm) == 0) return Json();
    return text;
}

Json descriptionText(const Ipmi::IpmiSelData& r) {
    if (!r.isSelEventRecord()) {
        char text[32];
        snprintf(text, sizeof text, "OEM record type 0x%02x", r.recordType());
        return text;
    }
    // Event data 1 of a generic event may carry flags above the offset,
    // which the exact text lookup does not expect: look up the offset alone.
    Ipmi::Event_log record = r.record();
    const uint8_t type = record.event_dir_type & Ipmi::SEL_EVENT_TYPE_MASK;
    if (type >= kFirstGenericType && type <= kLastGenericType) record.event_data[0] &= kOffsetMask;
    return Ipmi::GetMessage(record);
}

// SEL size, newest record and the events counted so far: all cached.
void addSelSeries(MetricSet& m) {
    const auto sel = Ipmi::IpmiIfc::getSel(0);
    if (sel)
        m.add("tavipmi_sel_entries", "gauge", "Records in the system event log.", {},
              sel->getCurrentNumberOfRecords());
    const auto records = Ipmi::IpmiIfc::getSelData(0);
    for (auto it = records.rbegin(); it != records.rend(); ++it) {
        if ((*it)->recordType() > kLastTimestampedType) continue;
        m.add("tavipmi_sel_newest_record_timestamp_seconds", "gauge", "Time stamp of the newest SEL record.", {},
              (*it)->messageTimeStamp());
        break;
    }
    std::lock_guard<std::mutex> lock(countMutex);
    for (const auto& c : eventCounts())
        m.add("tavipmi_sel_events_total", "counter", "SEL records handed over by the polling loop, by severity.",
              {{"severity", c.first}}, c.second);
}

void addFruSeries(MetricSet& m) {
    for (const auto& f : Ipmi::IpmiIfc::getFrus(0)) {
        const Ipmi::IpmiEntity& e = f->getEntity();
        std::string manufacturer, product, part, serial;
        if (auto b = f->getBoard()) {
            manufacturer = b->getManufacturer();
            product = b->getName();
            part = b->getPartNumber();
            serial = b->getSerialNumber();
        }
        if (auto p = f->getProduct()) {
            manufacturer = p->getManufacturer();
            product = p->getName();
            part = p->getPartNumber();
            serial = p->getSerialNumber();
        }
        m.add("tavipmi_fru_info", "gauge", "Identity of a FRU device.",
              {{"device", std::to_string(f->getDeviceId())},
               {"name", f->getName()},
               {"entity", std::to_string(e.id) + "." + std::to_string(e.instance)},
               {"manufacturer", manufacturer},
               {"product", product},
               {"part_number", part},
               {"serial_number", serial}},
              1);
    }
}

const bool registered = [] {
    addMetricSource(addSelSeries);
    addMetricSource(addFruSeries);
    return true;
}();

}  // namespace

std::string severityName(int severity) {
    switch (severity) {
    case 5: return "major";
    case 6: return "critical";
    case 7: return "fatal";
    default: return "none";
    }
}

void countSelEvent(const Ipmi::IpmiSelData& r) {
    std::lock_guard<std::mutex> lock(countMutex);
    eventCounts()[severityName(r.severity())] += 1;
}

std::vector<Column> selColumns() {
    return {{"record_id", "ID"},  {"time", "Time (UTC)"},     {"timestamp", "Time stamp", Column::DataOnly},
            {"sensor", "Sensor"}, {"sensor_number", "Sensor number", Column::DataOnly},
            {"caption", "Caption"}, {"severity", "Severity"}, {"description", "Description"}};
}

Json selRecord(const Ipmi::IpmiSelData& r, const std::vector<std::shared_ptr<Ipmi::IpmiSensor>>& sensors) {
    Json j;
    j["record_id"] = r.recordId();
    j["time"] = timeText(r);
    j["timestamp"] = r.recordType() > kLastTimestampedType ? Json() : Json(r.messageTimeStamp());
    if (r.isSelEventRecord()) {
        const uint8_t number = r.record().sensor_number;
        std::string name;
        for (const auto& s : sensors)
            if (s && s->getSensorNumber() == number) name = s->getSensorIdString();
        char text[80];
        snprintf(text, sizeof text, "%s #0x%02x", name.empty() ? "sensor" : name.c_str(), number);
        j["sensor"] = text;
        j["sensor_number"] = number;
    }
    j["caption"] = r.caption();
    j["severity"] = severityName(r.severity());
    j["description"] = descriptionText(r);
    return j;
}

}  // namespace Tool
