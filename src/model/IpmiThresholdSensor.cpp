#include <string.h>

#include "CmpiStatus.h"
#include "IpmiIfcInternal.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"

namespace Ipmi {

namespace {

sdr::SensorRecordView recordOf(const unsigned char* bytes, size_t length) { return {bytes, length}; }

// Threshold sensors pass on 12 bits of each event mask: bits 12-15 of the
// SDR's masks are the threshold reading masks.
constexpr uint8_t kEventMaskHigh = 0x0F;
constexpr uint16_t kEventMask = 0x0FFF;

// Reading byte 3 of a threshold sensor: which thresholds are crossed.
constexpr uint8_t kCriticalCrossings = sdr::bits::upperNonRecoverable | sdr::bits::lowerNonRecoverable |
                                       sdr::bits::upperCritical | sdr::bits::lowerCritical;
constexpr uint8_t kNonCriticalCrossings = sdr::bits::upperNonCritical | sdr::bits::lowerNonCritical;

constexpr int kHealthOk = 5;
constexpr int kHealthDegraded = 10;
constexpr int kHealthCriticalFailure = 25;

// Get/Set Sensor Hysteresis: reserved mask byte, sent as 0xFF.
constexpr uint8_t kHysteresisMask = 0xFF;
// IpmiIfc::sendCmd: the answer was longer than the buffer, which holds its start.
constexpr uint8_t kAnswerCut = 0x10;

}  // namespace

IpmiThresholdSensor::~IpmiThresholdSensor() {}

unsigned int IpmiThresholdSensor::getState(bool refresh) {
    const ReadingSnapshot r = refresh ? refreshReading() : currentReading();
    // A sensor the controller does not have is not an error: its (zeroed)
    // reading says that no threshold is crossed.
    if (r.present && !r.valid) {
        clearPending(true);
        throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Threshold Sensor reading not available");
    }
    if (r.bytes[0] == cc::ok) return r.bytes[3];
    clearPending(false);
    throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Threshold Sensor reading request failed");
}

bool IpmiThresholdSensor::getSensorState(int& state) {
    state = 0;
    const ReadingSnapshot r = refreshReading();
    if (!r.present) return false;
    if (!r.valid) return true;
    const uint8_t crossed = r.bytes[3];
    if (crossed & kCriticalCrossings)
        state = kHealthCriticalFailure;
    else if (crossed & kNonCriticalCrossings)
        state = kHealthDegraded;
    else
        state = kHealthOk;
    return true;
}

unsigned short IpmiThresholdSensor::getAssertionEventMask() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.assertionMask() & kEventMask : 0;
}

unsigned short IpmiThresholdSensor::getDeassertionEventMask() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.deassertionMask() & kEventMask : 0;
}

unsigned char IpmiThresholdSensor::getLowerThresholdReadingMask() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.lowerThresholdReadingMask() : 0;
}

unsigned char IpmiThresholdSensor::getUpperThresholdReadingMask() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.upperThresholdReadingMask() : 0;
}

unsigned char IpmiThresholdSensor::getReadableMask() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.readableThresholds() : 0;
}

unsigned char IpmiThresholdSensor::getSettableMask() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.settableThresholds() : 0;
}

int IpmiThresholdSensor::rearmEvents(unsigned short assertMask, unsigned short deassertMask) {
    return rearmEventsMasked(kEventMaskHigh, assertMask, deassertMask);
}

int IpmiThresholdSensor::getEventEnable(unsigned char& flags, unsigned short& assertMask,
                                        unsigned short& deassertMask) {
    return getEventEnableMasked(kEventMaskHigh, flags, assertMask, deassertMask);
}

int IpmiThresholdSensor::setEventEnable(unsigned char flags, unsigned short assertMask,
                                        unsigned short deassertMask) {
    return setEventEnableMasked(kEventMaskHigh, flags, assertMask, deassertMask);
}

int IpmiThresholdSensor::getHysteresis(unsigned char& positive, unsigned char& negative, bool fresh) {
    if (fresh) {
        const uint8_t request[2] = {sensor_number, kHysteresisMask};
        uint8_t answer[3];
        const uint8_t code =
            sendSensorCommand(cmd::getSensorHysteresis, request, sizeof request, answer, sizeof answer);
        // A failed ask brings nothing back and leaves the cache as it was:
        // one time-out must not make every cached query fail until the next poll.
        if (code != cc::ok && code != kAnswerCut) return commandResult(code);
        TAV::MutexLock guard(state_mutex);
        hysteresis.cc = answer[0];
        hysteresis.positive = answer[1];
        hysteresis.negative = answer[2];
        if (code != cc::ok) return commandResult(code);
    }
    TAV::MutexLock guard(state_mutex);
    if (hysteresis.cc != cc::ok) return hysteresis.cc;
    positive = hysteresis.positive;
    negative = hysteresis.negative;
    return 0;
}

int IpmiThresholdSensor::setHysteresis(unsigned char positive, unsigned char negative) {
    const uint8_t request[4] = {sensor_number, kHysteresisMask, positive, negative};
    uint8_t answer[1];
    return commandResult(sendSensorCommand(cmd::setSensorHysteresis, request, sizeof request, answer, sizeof answer));
}

void IpmiThresholdSensor::cacheHysteresis() {
    if (getHysteresisSupport() == 0) return;
    unsigned char positive = 0;
    unsigned char negative = 0;
    if (getHysteresis(positive, negative, true) == 0) cacheHysteresis(positive, negative);
}

void IpmiThresholdSensor::cacheHysteresis(unsigned char positive, unsigned char negative) {
    TAV::MutexLock guard(state_mutex);
    hysteresis.positive = positive;
    hysteresis.negative = negative;
}

}  // namespace Ipmi
