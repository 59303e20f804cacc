#include <exception>

#include "CmpiStatus.h"
#include "IpmiIfcInternal.h"
#include "IpmiMapper.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"

namespace Ipmi {

namespace {

sdr::SensorRecordView recordOf(const unsigned char* bytes, size_t length) { return {bytes, length}; }

// Discrete sensors pass on states 0-14 of each event mask.
constexpr uint8_t kEventMaskHigh = 0x7F;
// Reading byte 4 bit 7 is reserved.
constexpr uint8_t kHighStates = 0x7F;

}  // namespace

IpmiDiscreteSensor::~IpmiDiscreteSensor() {}

unsigned int IpmiDiscreteSensor::getState(bool refresh) {
    const ReadingSnapshot r = refresh ? refreshReading() : currentReading();
    if (!r.valid) {
        clearPending(true);
        throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Discrete Sensor reading not available");
    }
    // All eight bits of byte 4, the reserved one included, as callers know it.
    if (r.bytes[0] == cc::ok) return r.bytes[3] + r.bytes[4] * 256u;
    clearPending(false);
    throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Discrete Sensor reading request failed");
}

bool IpmiDiscreteSensor::getSensorState(int& state) {
    state = 0;
    const ReadingSnapshot r = refreshReading();
    if (!r.present) return false;
    if (!r.valid) return true;
    const uint16_t bits = static_cast<uint16_t>(r.bytes[3] | (r.length > 4 ? (r.bytes[4] & kHighStates) << 8 : 0));
    try {
        state = getSensorHealthState(getEventReadingType(), getSensorType(), sensor_number, bits);
    } catch (const std::exception&) {
        state = 0;
        return false;
    }
    return true;
}

unsigned short IpmiDiscreteSensor::getAssertionEventMask() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.assertionMask() : 0;
}

unsigned short IpmiDiscreteSensor::getDeassertionEventMask() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.deassertionMask() : 0;
}

unsigned short IpmiDiscreteSensor::getReadingMask() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.readingMask() : 0;
}

int IpmiDiscreteSensor::rearmEvents(unsigned short assertMask, unsigned short deassertMask) {
    return rearmEventsMasked(kEventMaskHigh, assertMask, deassertMask);
}

int IpmiDiscreteSensor::getEventEnable(unsigned char& flags, unsigned short& assertMask,
                                       unsigned short& deassertMask) {
    return getEventEnableMasked(kEventMaskHigh, flags, assertMask, deassertMask);
}

int IpmiDiscreteSensor::setEventEnable(unsigned char flags, unsigned short assertMask,
                                       unsigned short deassertMask) {
    return setEventEnableMasked(kEventMaskHigh, flags, assertMask, deassertMask);
}

}  // namespace Ipmi
