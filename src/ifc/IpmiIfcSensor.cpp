// Sensor discovery and reading refresh: sensor objects built from a node's
// SDR lists, their first readings and thresholds, the per-poll refresh, and
// the copies of the sensor list that callers get.

#include <string.h>

#include <exception>
#include <memory>
#include <new>
#include <vector>

#include "IpmiIfcInternal.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"

namespace Ipmi {

namespace {

// Results of the two request functions besides completion codes.
constexpr int kNotSent = -1;        // software-owned sensor, or no answer
constexpr int kNoSdrElement = -2;   // nothing to address
constexpr int kThresholdsFailed = -3;

constexpr uint8_t kSensorTypeMemory = 0x0C;
constexpr size_t kReadingBytes = 5;
constexpr size_t kThresholdBytes = 8;

// Event/reading type codes that decide a sensor's class.
constexpr uint8_t kGenericDiscreteFirst = 0x02;
constexpr uint8_t kGenericDiscreteLast = 0x0C;
constexpr uint8_t kSensorSpecific = 0x6F;
constexpr uint8_t kOemFirst = 0x70;
constexpr uint8_t kOemLast = 0x7F;

// Discrete sensors of these entities are never offered to callers.
constexpr unsigned kEntityUnspecified = 0x00;
constexpr unsigned kEntityBios = 0x22;

enum class SensorClass { none, threshold, discrete };

bool validNode(int node) { return node >= 0 && node < IPMI_NODE_COUNT; }

bool inRange(uint8_t v, uint8_t first, uint8_t last) { return v >= first && v <= last; }

SensorClass classOf(uint8_t eventReadingType) {
    if (eventReadingType == sdr::eventReadingTypeThreshold) return SensorClass::threshold;
    if (inRange(eventReadingType, kGenericDiscreteFirst, kGenericDiscreteLast) ||
        eventReadingType == kSensorSpecific || inRange(eventReadingType, kOemFirst, kOemLast))
        return SensorClass::discrete;
    return SensorClass::none;
}

// Event-only records: the OEM range is looked for in the instance-modifier
// byte (13) instead of the event/reading type (11). Kept as callers know it.
SensorClass classOfEventOnly(const sdr::EventOnlyView& rec) {
    const uint8_t eventReadingType = rec.eventReadingType();
    if (eventReadingType == sdr::eventReadingTypeThreshold) return SensorClass::threshold;
    if (inRange(eventReadingType, kGenericDiscreteFirst, kGenericDiscreteLast) ||
        eventReadingType == kSensorSpecific ||
        inRange(rec.sharingBytes().instanceModifier, kOemFirst, kOemLast))
        return SensorClass::discrete;
    return SensorClass::none;
}

sdr::SensorRecordView viewOf(const ipmiifc_sdr_list* element) { return {element->data, element->length}; }

std::shared_ptr<IpmiSensor> makeSensor(int node, SensorClass kind, ipmiifc_sdr_list* element) {
    if (kind == SensorClass::threshold)
        return std::make_shared<IpmiThresholdSensor>(node, element->data, element->length);
    return std::make_shared<IpmiDiscreteSensor>(node, element->data, element->length);
}

bool hiddenFromCallers(const IpmiSensor& sensor) {
    if (!sensor.isDiscrete()) return false;
    const unsigned entity = sensor.getEntity().id;
    return entity == kEntityUnspecified || entity == kEntityBios;
}

ipmiifc_resp* sendToOwner(int node, const sdr::SensorKeyView& key, uint8_t command) {
    return IpmiIfcSendToOwner(node, command, key.sensorNumber(), key.ownerId(), key.ownerChannel(), key.ownerLun());
}

// Copies at most `capacity` answer bytes (completion code first); the rest stays 0.
void copyAnswer(const ipmiifc_resp& resp, uint8_t* out, size_t capacity) {
    memset(out, 0, capacity);
    size_t count = resp.data_len < capacity ? resp.data_len : capacity;
    memcpy(out, resp.data, count);
}

// Reads one sensor and keeps the outcome in it: the repeat count behind the
// refresh's skip rules, and the reading itself when it came.
int readInto(int node, ipmiifc_sdr_list* element, IpmiSensor& sensor) {
    ipmiifc_sensor_reading_list request;
    memset(&request, 0, sizeof request);
    request.sdr = element;
    const int rc = IpmiIfcSensorGetReading(node, &request);
    sensor.recordPollResult(static_cast<uint32_t>(rc));
    if (rc == 0) sensor.setReading(request.reading);
    return rc;
}

// Whether the refresh asks for this sensor again: never after "not present"
// or "illegal for this sensor type" (until the next discovery), and after a
// time-out only until the same time-out has come back three more times.
bool worthReading(const IpmiSensor& sensor) {
    const uint32_t last = sensor.getLastPollResult();
    if (last == cc::timeout) return sensor.getPollRepeatCount() <= 2;
    return last != cc::requestedSensorNotPresent && last != cc::illegalForSensorType;
}

// The sensor's own record copy, dressed as a list element for the request
// functions: the refresh runs without the node lock, so the node's lists may
// be rebuilt or freed under it. The request functions only read the bytes.
ipmiifc_sdr_list elementOf(const IpmiSensor& sensor) {
    const unsigned char* bytes = nullptr;
    int length = 0;
    sensor.RawRecord(bytes, length);
    ipmiifc_sdr_list element;
    memset(&element, 0, sizeof element);
    const sdr::SdrView rec(bytes, static_cast<size_t>(length));
    element.record_id = rec.recordId();
    element.record_type = rec.recordType();
    element.length = static_cast<uint8_t>(length);  // at most 64: the copy's buffer
    element.data = const_cast<uint8_t*>(bytes);
    return element;
}

// Drops the back-references of every sensor record: the objects they point
// to are about to be released.
void forgetBackReferences(ipmiifc_sdr_state& s) {
    for (int group : {SDR_GROUP_FULL, SDR_GROUP_COMPACT, SDR_GROUP_EVENT_ONLY})
        for (ipmiifc_sdr_list* e = s.lists[group]; e != nullptr; e = e->next) e->sensor = nullptr;
}

// Appends the sensor unless callers never get to see it.
void offer(IpmiNode& n, ipmiifc_sdr_list* element, const std::shared_ptr<IpmiSensor>& sensor) {
    if (hiddenFromCallers(*sensor)) return;
    n.sensors.push_back(sensor);
    element->sensor = sensor.get();
}

void logDropped(const ipmiifc_sdr_list* element, uint8_t eventReadingType) {
    if (element->record_type == sdr::type::fullSensor)
        ipmiLog(LOG_DEBUG, "dropping sdr, full event_type %x (ID: %x, Type %x)\n", eventReadingType,
                element->record_id, element->record_type);
    else
        ipmiLog(LOG_DEBUG, "dropping sdr, compact event_type %d, full event_type %d\n", eventReadingType,
                eventReadingType);
}

// Whether discovery asks each new sensor for its thresholds and reading.
enum class Ask { controller, nothing };

void instantiateSensorRecords(int node, IpmiNode& n, ipmiifc_sdr_list* list, bool& memoryEvents, Ask ask) {
    for (ipmiifc_sdr_list* element = list; element != nullptr; element = element->next) {
        const sdr::SensorRecordView rec = viewOf(element);
        if (rec.sensorType() == kSensorTypeMemory && (rec.assertionMask() != 0 || rec.deassertionMask() != 0))
            memoryEvents = true;
        const SensorClass kind = classOf(rec.eventReadingType());
        if (kind == SensorClass::none) {
            logDropped(element, rec.eventReadingType());
            continue;
        }
        std::shared_ptr<IpmiSensor> sensor = makeSensor(node, kind, element);
        offer(n, element, sensor);
        if (ask == Ask::nothing) continue;
        if (kind == SensorClass::threshold) IpmiIfcSensorGetThresholds(node, element, sensor);
        readInto(node, element, *sensor);
    }
}

// Event-only sensors have nothing to read; only threshold ones are asked for thresholds.
void instantiateEventOnlyRecords(int node, IpmiNode& n, ipmiifc_sdr_list* list, bool& memoryEvents, Ask ask) {
    for (ipmiifc_sdr_list* element = list; element != nullptr; element = element->next) {
        const sdr::EventOnlyView rec(element->data, element->length);
        if (rec.sensorType() == kSensorTypeMemory) memoryEvents = true;
        const SensorClass kind = classOfEventOnly(rec);
        if (kind == SensorClass::none) continue;
        std::shared_ptr<IpmiSensor> sensor = makeSensor(node, kind, element);
        offer(n, element, sensor);
        if (ask == Ask::controller && kind == SensorClass::threshold) IpmiIfcSensorGetThresholds(node, element, sensor);
    }
}

int instantiateAll(int node, Ask ask) {
    if (!validNode(node)) return kNotSent;
    IpmiNode& n = g_IpmiNode[node];
    // Held for the whole pass, requests included: callers see the old list or the new one.
    CacheWriteLock guard(n.cacheLock);
    forgetBackReferences(n.work.sdr);
    n.sensors.clear();
    // Callers read the flag without the lock: it is worked out first and
    // stored once, so a rebuild never shows it cleared for a moment.
    bool memoryEvents = false;
    try {
        instantiateSensorRecords(node, n, n.work.sdr.lists[SDR_GROUP_FULL], memoryEvents, ask);
        instantiateSensorRecords(node, n, n.work.sdr.lists[SDR_GROUP_COMPACT], memoryEvents, ask);
        instantiateEventOnlyRecords(node, n, n.work.sdr.lists[SDR_GROUP_EVENT_ONLY], memoryEvents, ask);
    } catch (const std::bad_alloc&) {
        // Out of memory: callers get the sensors built so far.
        ipmiLog(LOG_ERR, "%s: failed memory alloc.", "IpmiIfcSensorInstantiateAll");
    }
    __atomic_store_n(&n.work.memory_events, static_cast<uint8_t>(memoryEvents), __ATOMIC_RELEASE);
    return 0;
}

}  // namespace

int IpmiIfcSensorInstantiateAll(int node) { return instantiateAll(node, Ask::controller); }

int IpmiIfcSensorDescribeAll(int node) { return instantiateAll(node, Ask::nothing); }

int IpmiIfcSensorGetThresholds(int node, ipmiifc_sdr_list* element, std::shared_ptr<IpmiSensor> sensor) {
    if (element == nullptr || element->data == nullptr || !sensor || !validNode(node)) return kNoSdrElement;
    const sdr::SensorKeyView key(element->data, element->length);
    if (key.ownerIsSoftware()) return kNotSent;
    RespHolder resp(sendToOwner(node, key, cmd::getSensorThresholds));
    if (!resp) return kNotSent;
    const uint8_t code = resp->cc;
    if (code == cc::invalidCommand || code == cc::requestedSensorNotPresent || code == cc::illegalForSensorType)
        return kThresholdsFailed;
    if (code != cc::ok) {
        ipmiLog(LOG_WARNING, "%s: Sensor Number = 0x%x, failed send cc = 0x%x", "IpmiIfcSensorGetThresholds",
                key.sensorNumber(), code);
        return kThresholdsFailed;
    }
    uint8_t thresholds[kThresholdBytes];
    copyAnswer(*resp.get(), thresholds, sizeof thresholds);
    resp.reset(nullptr);
    sensor->setThresholdReading(thresholds);

    auto* threshold = dynamic_cast<IpmiThresholdSensor*>(sensor.get());
    if (threshold != nullptr && threshold->getHysteresisSupport() != 0) {
        unsigned char positive = 0;
        unsigned char negative = 0;
        try {
            const int rc = threshold->getHysteresis(positive, negative, true);
            if (rc != 0)
                ipmiLog(LOG_ERR, "%s: getHysteresis(%u, %u, true) returned cc = %u", "IpmiIfcSensorGetThresholds",
                        positive, negative, static_cast<unsigned>(rc));
        } catch (...) {
            ipmiLog(LOG_DEBUG, "%s: failed to cache hysteresis.", "IpmiIfcSensorGetThresholds");
        }
    }
    return 0;
}

int IpmiIfcSensorGetReading(int node, ipmiifc_sensor_reading_list* r) {
    if (r == nullptr || r->sdr == nullptr || r->sdr->data == nullptr || !validNode(node)) {
        ipmiLog(LOG_DEBUG, "IpmiIfcSensorGetReading: sreading->sdr not valid");
        return kNoSdrElement;
    }
    const sdr::SensorKeyView key(r->sdr->data, r->sdr->length);
    if (key.ownerIsSoftware()) return kNotSent;
    RespHolder resp(sendToOwner(node, key, cmd::getSensorReading));
    if (!resp) {
        ipmiLog(LOG_DEBUG, "IpmiIfcSensorGetReading: failed send to get reading.");
        return kNotSent;
    }
    const uint8_t code = resp->cc;
    if (code != cc::ok) {
        if (code != cc::requestedSensorNotPresent && code != cc::illegalForSensorType)
            ipmiLog(LOG_WARNING, "IpmiIfcSensorGetReading: Sensor Number 0x%x, failed send cc = 0x%x",
                    key.sensorNumber(), code);
        return code;
    }
    copyAnswer(*resp.get(), r->reading, kReadingBytes);
    return 0;
}

int IpmiIfcSensorUpdateReading(int node) {
    ipmiLog(LOG_DEBUG, "Entering IpmiIfcSensorUpdateReading");
    // A copy: the pass runs without the node lock and keeps its sensors alive
    // even if a rebuild drops them from the list meanwhile.
    const std::vector<std::shared_ptr<IpmiSensor>> sensors = IpmiIfc::getSensors(node);
    for (const std::shared_ptr<IpmiSensor>& sensor : sensors) {
        ipmiifc_sdr_list element = elementOf(*sensor);
        const sdr::SensorRecordView rec(element.data, element.length);
        if (rec.isFullOrCompact()) {
            if (!worthReading(*sensor)) {
                ipmiLog(LOG_DEBUG, "Skipping reading update for previous failed sensor 0x%x",
                        sensor->getSensorNumber());
                continue;
            }
            if (readInto(node, &element, *sensor) == kNotSent) {
                ipmiLog(LOG_DEBUG, "IpmiIfcSensorUpdateReading: failed send to get reading.");
                return kNotSent;
            }
            if (rec.eventReadingType() == sdr::eventReadingTypeThreshold)
                IpmiIfcSensorGetThresholds(node, &element, sensor);
        } else if (rec.isEventOnly() &&
                   sdr::EventOnlyView(element.data, element.length).eventReadingType() ==
                       sdr::eventReadingTypeThreshold) {
            IpmiIfcSensorGetThresholds(node, &element, sensor);
        }
    }
    return 0;
}

std::vector<std::shared_ptr<IpmiSensor>> IpmiIfc::getSensors(int node) {
    if (!validNode(node)) return std::vector<std::shared_ptr<IpmiSensor>>();
    IpmiNode& n = g_IpmiNode[node];
    CacheReadLock guard(n.cacheLock);
    return n.sensors;
}

std::vector<std::shared_ptr<IpmiSensor>> IpmiIfc::getSensors() { return getSensors(0); }

// Callers have always received an empty pointer here and find their sensors
// through getSensors; the walk is kept, the answer is too.
std::shared_ptr<IpmiSensor> IpmiIfc::getSensor(int node, unsigned, unsigned number) {
    if (!validNode(node)) return std::shared_ptr<IpmiSensor>();
    IpmiNode& n = g_IpmiNode[node];
    CacheReadLock guard(n.cacheLock);
    for (const std::shared_ptr<IpmiSensor>& sensor : n.sensors) {
        if (sensor->getSensorNumber() != number) continue;
        (void)sensor->getOwnerId();
        break;
    }
    return std::shared_ptr<IpmiSensor>();
}

std::shared_ptr<IpmiSensor> IpmiIfc::getSensor(unsigned owner, unsigned number) {
    return getSensor(0, owner, number);
}

}  // namespace Ipmi
