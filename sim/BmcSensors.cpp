#include <functional>

#include "Bmc.h"
#include "IpmiCommands.h"
#include "SdrLayout.h"

// Sensor/Event commands of the simulated controller, over Bmc::sensors.
//
// Addressing follows the Linux driver: a request over the system interface
// reaches the BMC itself (sensors owned by 0x20 on channel 0); a request over
// IPMB reaches the satellite controller at that slave address on that channel,
// and when no controller lives there the driver gives up and answers 0xC3.

namespace Sim {

using namespace Ipmi;

namespace {

constexpr uint8_t kBmcAddress = 0x20;
constexpr uint8_t kThresholdMask = 0x3F;
constexpr uint16_t kThresholdEventMask = 0x0FFF;  // bits 12-15 are reading masks in the SDR
constexpr uint16_t kDiscreteEventMask = 0x7FFF;   // states 0-14
constexpr uint8_t kEventMessagesEnabled = 0x80;
constexpr uint8_t kScanningEnabled = 0x40;
constexpr uint8_t kRearmSelected = 0x80;

// Get Sensor Reading: status bits 7:6 mirror the event-enable flags.
constexpr uint8_t kEnableFlags = kEventMessagesEnabled | kScanningEnabled;

// Set Sensor Event Enable action, flags bits 5:4.
enum EnableAction : uint8_t { keepEnables = 0, enableSelected = 1, disableSelected = 2 };

// Hysteresis support codes of the SDR capabilities byte.
enum HysteresisSupport : uint8_t { noHysteresis = 0, readable = 1, settable = 2, fixed = 3 };

// Event message control support codes of the SDR capabilities byte.
enum EventSupport : uint8_t { perState = 0, entireSensor = 1, globalOnly = 2, noEvents = 3 };

Response ccOnly(uint8_t code) { return Response{code}; }

uint8_t lowByte(uint16_t v) { return static_cast<uint8_t>(v & 0xFF); }
uint8_t highByte(uint16_t v) { return static_cast<uint8_t>(v >> 8); }

// Little-endian u16 at `at` of the request data; missing bytes read as 0.
uint16_t wordAt(const std::vector<uint8_t>& d, size_t at) {
    uint16_t lo = at < d.size() ? d[at] : 0;
    uint16_t hi = at + 1 < d.size() ? d[at + 1] : 0;
    return static_cast<uint16_t>(lo | (hi << 8));
}

bool isThreshold(const SensorModel& s) { return s.eventReadingType == sdr::eventReadingTypeThreshold; }

uint16_t eventMask(const SensorModel& s) { return isThreshold(s) ? kThresholdEventMask : kDiscreteEventMask; }

uint8_t ownerAddress(const Request& r) { return r.viaIpmb ? r.address : kBmcAddress; }
uint8_t ownerChannel(const Request& r) { return r.viaIpmb ? r.channel : 0; }

// Whether any controller answers at the request's address.
bool controllerAnswers(const Bmc& b, const Request& r) {
    if (!r.viaIpmb || r.address == kBmcAddress) return true;
    for (const auto& s : b.sensors)
        if (s.owner == r.address && s.channel == r.channel) return true;
    return false;
}

SensorModel* addressedSensor(Bmc& b, const Request& r) {
    for (auto& s : b.sensors)
        if (s.owner == ownerAddress(r) && s.channel == ownerChannel(r) && s.lun == r.lun &&
            s.number == r.data[0])
            return &s;
    return nullptr;
}

using SensorBody = std::function<Response(SensorModel&, const Request&)>;

// The checks every sensor command shares, then `body` on the addressed sensor.
// Event-only sensors exist in the SDR only: the controller has nothing to answer for them.
Bmc::Handler sensorCommand(size_t minLength, size_t maxLength, SensorBody body) {
    return [minLength, maxLength, body](Bmc& b, const Request& r) {
        if (!controllerAnswers(b, r)) return ccOnly(cc::timeout);
        if (r.data.size() < minLength || r.data.size() > maxLength) return ccOnly(cc::requestDataLengthInvalid);
        SensorModel* s = addressedSensor(b, r);
        if (s == nullptr || !s->present || s->eventOnly) return ccOnly(cc::requestedSensorNotPresent);
        return body(*s, r);
    };
}

// The same for commands that only threshold sensors know.
Bmc::Handler thresholdCommand(size_t minLength, size_t maxLength, SensorBody body) {
    return sensorCommand(minLength, maxLength, [body](SensorModel& s, const Request& r) {
        if (!isThreshold(s)) return ccOnly(cc::illegalForSensorType);
        return body(s, r);
    });
}

Response getReading(SensorModel& s, const Request&) {
    const uint8_t status = s.statusBits;
    if (isThreshold(s))
        return Response{cc::ok, s.reading, status, static_cast<uint8_t>(s.states & kThresholdMask)};
    return Response{cc::ok, s.reading, status, lowByte(s.states), static_cast<uint8_t>(highByte(s.states) & 0x7F)};
}

Response getThresholds(SensorModel& s, const Request&) {
    Response out{cc::ok, static_cast<uint8_t>(s.readableMask & kThresholdMask)};
    for (int i = 0; i < 6; ++i) out.push_back((s.readableMask & (1u << i)) ? s.thresholds[i] : 0);
    return out;
}

Response setThresholds(SensorModel& s, const Request& r) {
    const uint8_t mask = r.data[1];
    // Asking to set a threshold that is not settable fails the whole request.
    if (mask & ~(s.settableMask & kThresholdMask)) return ccOnly(cc::invalidDataField);
    for (int i = 0; i < 6; ++i)
        if (mask & (1u << i)) s.thresholds[i] = r.data[2 + i];
    return ccOnly(cc::ok);
}

Response getHysteresis(SensorModel& s, const Request&) {
    if (s.hysteresisSupport == noHysteresis || s.hysteresisSupport == fixed) return ccOnly(cc::illegalForSensorType);
    return Response{cc::ok, s.hysteresisPositive, s.hysteresisNegative};
}

Response setHysteresis(SensorModel& s, const Request& r) {
    if (s.hysteresisSupport != settable) return ccOnly(cc::illegalForSensorType);
    s.hysteresisPositive = r.data[2];
    s.hysteresisNegative = r.data[3];
    return ccOnly(cc::ok);
}

Response getEventEnable(SensorModel& s, const Request&) {
    if (s.eventSupport == noEvents) return ccOnly(cc::illegalForSensorType);
    const uint8_t flags = s.eventFlags & kEnableFlags;
    // Sensors without per-state control answer the sensor-wide flags only.
    if (s.eventSupport != perState) return Response{cc::ok, flags};
    return Response{cc::ok,
                    flags,
                    lowByte(s.assertEnables),
                    highByte(s.assertEnables),
                    lowByte(s.deassertEnables),
                    highByte(s.deassertEnables)};
}

Response setEventEnable(SensorModel& s, const Request& r) {
    if (s.eventSupport == noEvents) return ccOnly(cc::illegalForSensorType);
    const uint8_t flags = r.data[1];
    const uint8_t action = (flags >> 4) & 0x03;
    if (action != keepEnables && action != enableSelected && action != disableSelected)
        return ccOnly(cc::invalidDataField);
    s.eventFlags = flags & kEnableFlags;
    s.statusBits = static_cast<uint8_t>((s.statusBits & ~kEnableFlags) | s.eventFlags);
    const uint16_t assertBits = wordAt(r.data, 2) & eventMask(s);
    const uint16_t deassertBits = wordAt(r.data, 4) & eventMask(s);
    if (action == enableSelected) {
        s.assertEnables |= assertBits;
        s.deassertEnables |= deassertBits;
    } else if (action == disableSelected) {
        s.assertEnables &= static_cast<uint16_t>(~assertBits);
        s.deassertEnables &= static_cast<uint16_t>(~deassertBits);
    }
    return ccOnly(cc::ok);
}

Response rearm(SensorModel& s, const Request& r) {
    ++s.rearmCount;
    if (r.data[1] & kRearmSelected) {
        s.rearmedAssert = wordAt(r.data, 2);
        s.rearmedDeassert = wordAt(r.data, 4);
    } else {
        s.rearmedAssert = 0xFFFF;
        s.rearmedDeassert = 0xFFFF;
    }
    return ccOnly(cc::ok);
}

}  // namespace

void registerSensorHandlers(Bmc& bmc) {
    const uint8_t se = netfn::sensorEvent;
    bmc.on(se, cmd::getSensorReading, sensorCommand(1, 1, getReading));
    bmc.on(se, cmd::getSensorThresholds, thresholdCommand(1, 1, getThresholds));
    bmc.on(se, cmd::setSensorThresholds, thresholdCommand(8, 8, setThresholds));
    bmc.on(se, cmd::getSensorHysteresis, thresholdCommand(2, 2, getHysteresis));
    bmc.on(se, cmd::setSensorHysteresis, thresholdCommand(4, 4, setHysteresis));
    bmc.on(se, cmd::getSensorEventEnable, sensorCommand(1, 1, getEventEnable));
    bmc.on(se, cmd::setSensorEventEnable, sensorCommand(2, 6, setEventEnable));
    bmc.on(se, cmd::rearmSensorEvents, sensorCommand(2, 6, rearm));
}

}  // namespace Sim
