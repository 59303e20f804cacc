#ifndef TAV_IPMI_SDRLAYOUT_H
#define TAV_IPMI_SDRLAYOUT_H

#include <stddef.h>
#include <stdint.h>

// Byte layouts of the sensor data records that the library reads (common
// header, full sensor, compact sensor, event-only), named once, and small
// read-only views that read those fields by name.
//
// The bytes come from firmware: every view carries the number of bytes it
// may read, and a field that lies beyond it reads as 0. A view never owns or
// copies its bytes; the caller keeps them alive and passes no more bytes than
// the buffer really holds.
namespace Ipmi {
namespace sdr {

// Record type codes (byte 3 of the header).
namespace type {
constexpr uint8_t fullSensor = 0x01;
constexpr uint8_t compactSensor = 0x02;
constexpr uint8_t eventOnly = 0x03;
constexpr uint8_t entityAssociation = 0x08;
constexpr uint8_t deviceRelativeEntityAssociation = 0x09;
constexpr uint8_t genericDeviceLocator = 0x10;
constexpr uint8_t fruDeviceLocator = 0x11;
constexpr uint8_t mcDeviceLocator = 0x12;
constexpr uint8_t oem = 0xC0;
}  // namespace type

// Common header of every record.
namespace header {
constexpr size_t recordId = 0;  // u16 little-endian
constexpr size_t version = 2;
constexpr size_t recordType = 3;
constexpr size_t remainingLength = 4;  // bytes after the header
constexpr size_t length = 5;
}  // namespace header

// Sensor key and entity: the same place in full, compact and event-only records.
namespace key {
constexpr size_t ownerId = 5;         // bit 0 software ID, bits 7:1 address or ID
constexpr size_t ownerLun = 6;        // bits 7:4 channel, bits 1:0 LUN
constexpr size_t sensorNumber = 7;
constexpr size_t entityId = 8;
constexpr size_t entityInstance = 9;  // bit 7 device-relative, bits 6:0 instance
}  // namespace key

// Bytes 10-22: the same place in full and compact records.
namespace sensor {
constexpr size_t initialisation = 10;
constexpr size_t capabilities = 11;
constexpr size_t sensorType = 12;
constexpr size_t eventReadingType = 13;
constexpr size_t assertionMask = 14;    // u16 LE; threshold: lower reading mask in bits 14:12
constexpr size_t deassertionMask = 16;  // u16 LE; threshold: upper reading mask in bits 14:12
constexpr size_t readingMask = 18;      // u16 LE (discrete)
constexpr size_t readableThresholds = 18;  // threshold sensors
constexpr size_t settableThresholds = 19;  // threshold sensors
constexpr size_t units1 = 20;
constexpr size_t baseUnit = 21;
constexpr size_t modifierUnit = 22;
}  // namespace sensor

// Fields only the full sensor record (type 0x01) has.
namespace full {
constexpr size_t linearisation = 23;
constexpr size_t mLow = 24;
constexpr size_t mHighTolerance = 25;  // bits 7:6 M bits 9:8, bits 5:0 tolerance
constexpr size_t bLow = 26;
constexpr size_t bHighAccuracy = 27;   // bits 7:6 B bits 9:8, bits 5:0 accuracy bits 5:0
constexpr size_t accuracyDirection = 28;  // bits 7:4 accuracy bits 9:6, 3:2 accuracy exp, 1:0 direction
constexpr size_t exponents = 29;       // bits 7:4 R exponent, bits 3:0 B exponent
constexpr size_t analogFlags = 30;
constexpr size_t nominalReading = 31;
constexpr size_t normalMax = 32;
constexpr size_t normalMin = 33;
constexpr size_t sensorMax = 34;
constexpr size_t sensorMin = 35;
constexpr size_t upperNonRecoverable = 36;
constexpr size_t upperCritical = 37;
constexpr size_t upperNonCritical = 38;
constexpr size_t lowerNonRecoverable = 39;
constexpr size_t lowerCritical = 40;
constexpr size_t lowerNonCritical = 41;
constexpr size_t positiveHysteresis = 42;
constexpr size_t negativeHysteresis = 43;
constexpr size_t oem = 46;
constexpr size_t idStringTypeLength = 47;
constexpr size_t idString = 48;
}  // namespace full

// Fields only the compact sensor record (type 0x02) has.
namespace compact {
constexpr size_t sharing = 23;           // bits 7:6 direction, 5:4 modifier type, 3:0 share count
constexpr size_t instanceModifier = 24;  // bit 7 entity instance increments, 6:0 modifier offset
constexpr size_t positiveHysteresis = 25;
constexpr size_t negativeHysteresis = 26;
constexpr size_t oem = 30;
constexpr size_t idStringTypeLength = 31;
constexpr size_t idString = 32;
}  // namespace compact

// The event-only record (type 0x03) after the sensor key.
namespace eventOnly {
constexpr size_t sensorType = 10;
constexpr size_t eventReadingType = 11;
constexpr size_t sharing = 12;           // as compact::sharing
constexpr size_t instanceModifier = 13;  // as compact::instanceModifier
constexpr size_t oem = 15;
constexpr size_t idStringTypeLength = 16;
constexpr size_t idString = 17;
}  // namespace eventOnly

// Bit fields, named once.
namespace bits {
constexpr uint8_t ownerSoftwareId = 0x01;
constexpr uint8_t entityDeviceRelative = 0x80;
constexpr uint8_t entityInstanceNumber = 0x7F;
// initialisation byte
constexpr uint8_t initSettable = 0x80;
constexpr uint8_t initScanning = 0x40;
constexpr uint8_t initEvents = 0x20;
constexpr uint8_t initThresholds = 0x10;
constexpr uint8_t initHysteresis = 0x08;
constexpr uint8_t initSensorType = 0x04;
constexpr uint8_t eventsEnabledAtStart = 0x02;
constexpr uint8_t scanningEnabledAtStart = 0x01;
// capabilities byte
constexpr uint8_t ignoreSensor = 0x80;
constexpr uint8_t autoRearm = 0x40;
// units 1 byte
constexpr uint8_t percentage = 0x01;
// analog characteristic flags
constexpr uint8_t hasNominalReading = 0x01;
constexpr uint8_t hasNormalMax = 0x02;
constexpr uint8_t hasNormalMin = 0x04;
// sharing / instance modifier bytes
constexpr uint8_t shareCount = 0x0F;
constexpr uint8_t entityInstanceIncrements = 0x80;
constexpr uint8_t instanceModifierOffset = 0x7F;
// threshold masks: bit of each threshold in the readable/settable masks and
// in the threshold comparison status of a reading
constexpr uint8_t lowerNonCritical = 0x01;
constexpr uint8_t lowerCritical = 0x02;
constexpr uint8_t lowerNonRecoverable = 0x04;
constexpr uint8_t upperNonCritical = 0x08;
constexpr uint8_t upperCritical = 0x10;
constexpr uint8_t upperNonRecoverable = 0x20;
constexpr uint8_t allThresholds = 0x3F;
}  // namespace bits

// Analog data formats (units 1 bits 7:6).
namespace analogFormat {
constexpr uint8_t unsignedValue = 0;
constexpr uint8_t onesComplement = 1;
constexpr uint8_t twosComplement = 2;
constexpr uint8_t noAnalogReading = 3;
}  // namespace analogFormat

// Event/reading type code of a threshold sensor.
constexpr uint8_t eventReadingTypeThreshold = 0x01;

// Two's complement numbers narrower than a byte or wider than one.
constexpr int signExtend(unsigned value, unsigned width) {
  const unsigned mask = (1u << width) - 1u;
  const unsigned v = value & mask;
  return (v & (1u << (width - 1))) ? static_cast<int>(v) - static_cast<int>(mask + 1u)
                                   : static_cast<int>(v);
}

// The whole record seen through its common header.
class SdrView {
 public:
  constexpr SdrView() = default;
  constexpr SdrView(const uint8_t* bytes, size_t length)
      : bytes_(bytes), length_(bytes ? length : 0) {}

  constexpr const uint8_t* bytes() const { return bytes_; }
  constexpr size_t length() const { return length_; }
  constexpr bool has(size_t offset, size_t count = 1) const {
    return offset <= length_ && count <= length_ - offset;
  }
  // The byte at `offset`, or 0 beyond the record.
  constexpr uint8_t byteAt(size_t offset) const {
    return offset < length_ ? bytes_[offset] : 0;
  }
  // Little-endian u16; each missing byte reads as 0.
  constexpr uint16_t wordAt(size_t offset) const {
    return static_cast<uint16_t>(byteAt(offset) | (byteAt(offset + 1) << 8));
  }

  constexpr uint16_t recordId() const { return wordAt(header::recordId); }
  constexpr uint8_t version() const { return byteAt(header::version); }
  constexpr uint8_t recordType() const { return byteAt(header::recordType); }
  constexpr uint8_t remainingLength() const { return byteAt(header::remainingLength); }

  constexpr bool isFull() const { return recordType() == type::fullSensor; }
  constexpr bool isCompact() const { return recordType() == type::compactSensor; }
  constexpr bool isEventOnly() const { return recordType() == type::eventOnly; }
  constexpr bool isFullOrCompact() const { return isFull() || isCompact(); }

 private:
  const uint8_t* bytes_ = nullptr;
  size_t length_ = 0;
};

// Sensor key and entity, common to full, compact and event-only records.
class SensorKeyView : public SdrView {
 public:
  using SdrView::SdrView;
  constexpr explicit SensorKeyView(const SdrView& v) : SdrView(v) {}

  constexpr uint8_t ownerId() const { return byteAt(key::ownerId); }
  constexpr bool ownerIsSoftware() const { return ownerId() & bits::ownerSoftwareId; }
  constexpr uint8_t ownerLunByte() const { return byteAt(key::ownerLun); }
  constexpr uint8_t ownerLun() const { return ownerLunByte() & 0x03; }
  constexpr uint8_t ownerChannel() const { return (ownerLunByte() >> 4) & 0x0F; }
  constexpr uint8_t sensorNumber() const { return byteAt(key::sensorNumber); }
  constexpr uint8_t entityId() const { return byteAt(key::entityId); }
  constexpr uint8_t entityInstanceByte() const { return byteAt(key::entityInstance); }
  constexpr uint8_t entityInstance() const {
    return entityInstanceByte() & bits::entityInstanceNumber;
  }
  constexpr bool entityDeviceRelative() const {
    return entityInstanceByte() & bits::entityDeviceRelative;
  }
};

// Bytes 10-22, common to full and compact records. These accessors do not
// look at the record type; callers check it where it matters.
class SensorRecordView : public SensorKeyView {
 public:
  using SensorKeyView::SensorKeyView;

  constexpr uint8_t initialisation() const { return byteAt(sensor::initialisation); }
  constexpr uint8_t capabilities() const { return byteAt(sensor::capabilities); }
  constexpr bool ignoreSensor() const { return capabilities() & bits::ignoreSensor; }
  constexpr bool autoRearm() const { return capabilities() & bits::autoRearm; }
  constexpr uint8_t hysteresisSupport() const { return (capabilities() >> 4) & 0x03; }
  constexpr uint8_t thresholdAccessSupport() const { return (capabilities() >> 2) & 0x03; }
  constexpr uint8_t eventMessageControl() const { return capabilities() & 0x03; }

  constexpr uint8_t sensorType() const { return byteAt(sensor::sensorType); }
  constexpr uint8_t eventReadingType() const { return byteAt(sensor::eventReadingType); }

  constexpr uint16_t assertionMask() const { return wordAt(sensor::assertionMask); }
  constexpr uint16_t deassertionMask() const { return wordAt(sensor::deassertionMask); }
  constexpr uint16_t readingMask() const { return wordAt(sensor::readingMask); }
  // Threshold sensors keep their reading masks in bits 14:12 of the event masks.
  constexpr uint8_t lowerThresholdReadingMask() const { return (assertionMask() >> 12) & 0x07; }
  constexpr uint8_t upperThresholdReadingMask() const {
    return (deassertionMask() >> 12) & 0x07;
  }
  constexpr uint8_t readableThresholds() const {
    return byteAt(sensor::readableThresholds) & bits::allThresholds;
  }
  constexpr uint8_t settableThresholds() const {
    return byteAt(sensor::settableThresholds) & bits::allThresholds;
  }

  constexpr uint8_t units1() const { return byteAt(sensor::units1); }
  constexpr uint8_t analogDataFormat() const { return (units1() >> 6) & 0x03; }
  constexpr uint8_t rateUnit() const { return (units1() >> 3) & 0x07; }
  constexpr uint8_t modifierUnitUse() const { return (units1() >> 1) & 0x03; }
  constexpr bool percentage() const { return units1() & bits::percentage; }
  constexpr uint8_t baseUnit() const { return byteAt(sensor::baseUnit); }
  constexpr uint8_t modifierUnit() const { return byteAt(sensor::modifierUnit); }
};

// ID string type/length code: bits 7:6 type, bits 4:0 length in bytes.
struct IdStringCode {
  uint8_t code;
  constexpr uint8_t type() const { return (code >> 6) & 0x03; }
  constexpr uint8_t length() const { return code & 0x1F; }
};

// Full sensor record (type 0x01).
class FullSensorView : public SensorRecordView {
 public:
  using SensorRecordView::SensorRecordView;

  constexpr uint8_t linearisation() const { return byteAt(full::linearisation) & 0x7F; }
  // M and B: 10-bit two's complement numbers.
  constexpr int m() const {
    return signExtend(byteAt(full::mLow) | ((byteAt(full::mHighTolerance) >> 6) << 8), 10);
  }
  constexpr int b() const {
    return signExtend(byteAt(full::bLow) | ((byteAt(full::bHighAccuracy) >> 6) << 8), 10);
  }
  constexpr uint8_t tolerance() const { return byteAt(full::mHighTolerance) & 0x3F; }
  constexpr uint16_t accuracy() const {
    return static_cast<uint16_t>((byteAt(full::bHighAccuracy) & 0x3F) |
                                 ((byteAt(full::accuracyDirection) >> 4) << 6));
  }
  constexpr uint8_t accuracyExponent() const {
    return (byteAt(full::accuracyDirection) >> 2) & 0x03;
  }
  constexpr uint8_t direction() const { return byteAt(full::accuracyDirection) & 0x03; }
  // R (result) and B exponents: 4-bit two's complement numbers.
  constexpr int rExp() const { return signExtend(byteAt(full::exponents) >> 4, 4); }
  constexpr int bExp() const { return signExtend(byteAt(full::exponents) & 0x0F, 4); }

  constexpr uint8_t analogFlags() const { return byteAt(full::analogFlags); }
  constexpr bool hasNominalReading() const {
    return analogFlags() & bits::hasNominalReading;
  }
  constexpr bool hasNormalMax() const { return analogFlags() & bits::hasNormalMax; }
  constexpr bool hasNormalMin() const { return analogFlags() & bits::hasNormalMin; }
  constexpr uint8_t nominalReading() const { return byteAt(full::nominalReading); }
  constexpr uint8_t normalMax() const { return byteAt(full::normalMax); }
  constexpr uint8_t normalMin() const { return byteAt(full::normalMin); }
  constexpr uint8_t sensorMax() const { return byteAt(full::sensorMax); }
  constexpr uint8_t sensorMin() const { return byteAt(full::sensorMin); }

  constexpr uint8_t upperNonRecoverable() const { return byteAt(full::upperNonRecoverable); }
  constexpr uint8_t upperCritical() const { return byteAt(full::upperCritical); }
  constexpr uint8_t upperNonCritical() const { return byteAt(full::upperNonCritical); }
  constexpr uint8_t lowerNonRecoverable() const { return byteAt(full::lowerNonRecoverable); }
  constexpr uint8_t lowerCritical() const { return byteAt(full::lowerCritical); }
  constexpr uint8_t lowerNonCritical() const { return byteAt(full::lowerNonCritical); }

  constexpr uint8_t positiveHysteresis() const { return byteAt(full::positiveHysteresis); }
  constexpr uint8_t negativeHysteresis() const { return byteAt(full::negativeHysteresis); }
  constexpr uint8_t oem() const { return byteAt(full::oem); }
  constexpr IdStringCode idStringCode() const { return {byteAt(full::idStringTypeLength)}; }
  static constexpr size_t idStringOffset = full::idString;
};

// Sharing bytes of compact and event-only records.
struct SharingView {
  uint8_t sharing;
  uint8_t instanceModifier;
  constexpr uint8_t direction() const { return (sharing >> 6) & 0x03; }
  constexpr uint8_t instanceModifierType() const { return (sharing >> 4) & 0x03; }
  constexpr uint8_t shareCount() const { return sharing & bits::shareCount; }
  constexpr bool entityInstanceIncrements() const {
    return instanceModifier & bits::entityInstanceIncrements;
  }
  constexpr uint8_t instanceModifierOffset() const {
    return instanceModifier & bits::instanceModifierOffset;
  }
};

// Compact sensor record (type 0x02).
class CompactSensorView : public SensorRecordView {
 public:
  using SensorRecordView::SensorRecordView;

  constexpr SharingView sharingBytes() const {
    return {byteAt(compact::sharing), byteAt(compact::instanceModifier)};
  }
  constexpr uint8_t direction() const { return sharingBytes().direction(); }
  constexpr uint8_t instanceModifierType() const { return sharingBytes().instanceModifierType(); }
  constexpr uint8_t shareCount() const { return sharingBytes().shareCount(); }
  constexpr bool entityInstanceIncrements() const {
    return sharingBytes().entityInstanceIncrements();
  }
  constexpr uint8_t instanceModifierOffset() const {
    return sharingBytes().instanceModifierOffset();
  }
  constexpr uint8_t positiveHysteresis() const { return byteAt(compact::positiveHysteresis); }
  constexpr uint8_t negativeHysteresis() const { return byteAt(compact::negativeHysteresis); }
  constexpr uint8_t oem() const { return byteAt(compact::oem); }
  constexpr IdStringCode idStringCode() const { return {byteAt(compact::idStringTypeLength)}; }
  static constexpr size_t idStringOffset = compact::idString;
};

// Event-only record (type 0x03).
class EventOnlyView : public SensorKeyView {
 public:
  using SensorKeyView::SensorKeyView;

  constexpr uint8_t sensorType() const { return byteAt(eventOnly::sensorType); }
  constexpr uint8_t eventReadingType() const { return byteAt(eventOnly::eventReadingType); }
  constexpr SharingView sharingBytes() const {
    return {byteAt(eventOnly::sharing), byteAt(eventOnly::instanceModifier)};
  }
  constexpr uint8_t direction() const { return sharingBytes().direction(); }
  constexpr uint8_t instanceModifierType() const { return sharingBytes().instanceModifierType(); }
  constexpr uint8_t shareCount() const { return sharingBytes().shareCount(); }
  constexpr bool entityInstanceIncrements() const {
    return sharingBytes().entityInstanceIncrements();
  }
  constexpr uint8_t instanceModifierOffset() const {
    return sharingBytes().instanceModifierOffset();
  }
  constexpr uint8_t oem() const { return byteAt(eventOnly::oem); }
  constexpr IdStringCode idStringCode() const {
    return {byteAt(eventOnly::idStringTypeLength)};
  }
  static constexpr size_t idStringOffset = eventOnly::idString;
};

// Where the sharing bytes and the ID string sit, by record type, for code
// that handles all three sensor record types alike. Offsets are 0 for a
// record type without the field.
struct SensorRecordOffsets {
  size_t sharing;
  size_t instanceModifier;
  size_t idStringTypeLength;
  size_t idString;
};
constexpr SensorRecordOffsets sensorRecordOffsets(uint8_t recordType) {
  return recordType == type::fullSensor
             ? SensorRecordOffsets{0, 0, full::idStringTypeLength, full::idString}
         : recordType == type::compactSensor
             ? SensorRecordOffsets{compact::sharing, compact::instanceModifier,
                                   compact::idStringTypeLength, compact::idString}
         : recordType == type::eventOnly
             ? SensorRecordOffsets{eventOnly::sharing, eventOnly::instanceModifier,
                                   eventOnly::idStringTypeLength, eventOnly::idString}
             : SensorRecordOffsets{0, 0, 0, 0};
}

}  // namespace sdr
}  // namespace Ipmi

#endif
