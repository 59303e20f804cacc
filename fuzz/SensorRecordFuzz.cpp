// Any bytes as sensor records (full, compact, event-only or anything else):
// a threshold and a discrete sensor built from each, and every getter that
// answers from the record or the stored reading.

#include <stddef.h>
#include <stdint.h>
#include <string.h>

#include <string>

#include "CmpiStatus.h"
#include "FuzzSupport.h"
#include "IpmiSensor.h"

namespace {

template <typename F>
void tolerate(F f) {
    try {
        f();
    } catch (const kelInt::CmpiStatus&) {
    }
}

void readEverything(Ipmi::IpmiSensor& s, const uint8_t* reading) {
    (void)(s.getOwnerId() + s.getLun() + s.getChannel() + s.getSensorType() + s.getEventReadingType() +
           s.getRateUnit() + s.getModifierUnitUse() + s.getBaseUnit() + s.getModifierUnit() +
           s.getSensorDirection() + s.getHysteresisSupport() + s.getThresholdAccessSupport() +
           s.getEventMessageSupport() + s.getFlags() + s.getAssertionEventMask() + s.getDeassertionEventMask());
    (void)(s.isLinear() + s.isAnalog() + s.isConvertible() + s.isNominalReadingSet() + s.isNormalMaxSet() +
           s.isNormalMinSet() + s.isDiscrete());
    (void)s.getEntity();
    const unsigned char* bytes;
    int length;
    s.RawRecord(bytes, length);
    std::string text = s.getSensorTypeString() + s.getSensorDirectionString() + s.getModifierUnitString() +
                       s.getBaseUnitString() + s.getSensorIdString() + s.getName() + s.getDescription() +
                       s.getDeviceId() + s.convertToEnumeration();
    for (unsigned raw : {0u, 1u, 0x7Fu, 0x80u, 0xFFu, static_cast<unsigned>(reading[1])})
        (void)s.convertToRawValue(s.convertRawValue(raw));
    tolerate([&] { (void)(s.getMinReadable() + s.getMaxReadable()); });
    tolerate([&] { (void)(s.getNormalMin() + s.getNormalMax() + s.getNominalReading()); });

    s.setReading(const_cast<uint8_t*>(reading));
    s.setThresholdReading(const_cast<uint8_t*>(reading));
    text += s.convertToEnumeration();
    (void)(s.readingStateUnavailable() + s.scanningDisabled() + s.hasReadingTime());
    tolerate([&] { (void)s.getState(false); });
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzSupport::quietLog();
    // Each record is followed by the 8 bytes its sensor is given as reading and thresholds.
    size_t at = 0;
    for (int n = 0; n < 8 && size - at >= 5; ++n) {
        const size_t length = 5u + data[at + 4];
        const size_t taken = length < size - at ? length : size - at;
        std::vector<uint8_t> record(data + at, data + at + taken);
        at += taken;
        uint8_t reading[8] = {0, 0, 0, 0, 0, 0, 0, 0};
        const size_t extra = size - at < sizeof reading ? size - at : sizeof reading;
        memcpy(reading, data + at, extra);
        at += extra;
        Ipmi::IpmiThresholdSensor threshold(0, record.data(), static_cast<int>(record.size()));
        readEverything(threshold, reading);
        unsigned char positive, negative;
        (void)threshold.getHysteresis(positive, negative, false);
        (void)(threshold.getLowerThresholdReadingMask() + threshold.getUpperThresholdReadingMask() +
               threshold.getReadableMask() + threshold.getSettableMask());
        Ipmi::IpmiDiscreteSensor discrete(0, record.data(), static_cast<int>(record.size()));
        readEverything(discrete, reading);
        (void)discrete.getReadingMask();
    }
    return 0;
}
