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
    if (refresh) getSDReading();
    if (!reading_valid) {
        not_available_pending = false;
        throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Discrete Sensor reading not available");
    }
    // All eight bits of byte 4, the reserved one included, as callers know it.
    if (reading[0] == cc::ok) return reading[3] + reading[4] * 256u;
    request_failed_pending = false;
    throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Discrete Sensor reading request failed");
}

bool IpmiDiscreteSensor::getSensorState(int& state) {
    state = 0;
    getSDReading();
    if (!sensor_present) return false;
    if (!reading_valid) return true;
    const uint16_t bits =
        static_cast<uint16_t>(reading[3] | (reading_length > 4 ? (reading[4] & kHighStates) << 8 : 0));
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
