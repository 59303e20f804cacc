#ifndef TAV_IPMI_FRULAYOUT_H
#define TAV_IPMI_FRULAYOUT_H

#include <stddef.h>
#include <stdint.h>

// Byte layouts of FRU inventory data (common header, chassis/board/product
// info areas, multi-record headers and the record types the library decodes)
// and of the FRU device locator record, named once, with small read-only
// views over them.
//
// Like the SDR views, a view carries the number of bytes it may read and a
// field beyond them reads as 0: an image that claims more than it holds can
// make a value wrong, never a read go outside the buffer.
namespace Ipmi {
namespace fru {

// Bounded bytes: the base of every view below.
class Bytes {
public:
    constexpr Bytes() = default;
    constexpr Bytes(const uint8_t* bytes, size_t length) : bytes_(bytes), length_(bytes ? length : 0) {}

    constexpr const uint8_t* bytes() const { return bytes_; }
    constexpr size_t length() const { return length_; }
    constexpr bool has(size_t offset, size_t count = 1) const {
        return offset <= length_ && count <= length_ - offset;
    }
    constexpr uint8_t byteAt(size_t offset) const { return offset < length_ ? bytes_[offset] : 0; }
    constexpr uint16_t le16(size_t offset) const {
        return static_cast<uint16_t>(byteAt(offset) | (byteAt(offset + 1) << 8));
    }
    constexpr uint32_t le24(size_t offset) const {
        return static_cast<uint32_t>(byteAt(offset) | (byteAt(offset + 1) << 8) | (byteAt(offset + 2) << 16));
    }
    // The bytes from `offset` on (none past the end).
    constexpr Bytes from(size_t offset) const {
        return offset < length_ ? Bytes(bytes_ + offset, length_ - offset) : Bytes();
    }
    constexpr Bytes first(size_t count) const { return Bytes(bytes_, count < length_ ? count : length_); }

private:
    const uint8_t* bytes_ = nullptr;
    size_t length_ = 0;
};

// Area offsets in the common header and area lengths count in 8-byte units.
constexpr unsigned kUnit = 8;
// The only format version of the common header and of every info area.
constexpr uint8_t kFormatVersion = 1;
constexpr uint8_t kVersionMask = 0x0F;

// Common header, 8 bytes at offset 0 of the inventory.
namespace header {
constexpr size_t version = 0;
constexpr size_t internalUseOffset = 1;
constexpr size_t chassisOffset = 2;
constexpr size_t boardOffset = 3;
constexpr size_t productOffset = 4;
constexpr size_t multiRecordOffset = 5;
constexpr size_t pad = 6;
constexpr size_t checksum = 7;
constexpr size_t length = 8;
}  // namespace header

// First two bytes of every info area.
namespace infoArea {
constexpr size_t version = 0;
constexpr size_t length = 1;  // in 8-byte units, checksum byte included
constexpr size_t headerLength = 2;
}  // namespace infoArea

namespace chassis {
constexpr size_t type = 2;
constexpr size_t firstField = 3;  // part number, then serial number
}  // namespace chassis

namespace board {
constexpr size_t language = 2;
constexpr size_t mfgMinutes = 3;  // u24 LE, minutes since 1996-01-01 00:00 UTC
constexpr size_t firstField = 6;  // manufacturer, product name, serial number, part number
}  // namespace board

namespace product {
constexpr size_t language = 2;
// manufacturer, name, part/model number, version, serial number, asset tag
constexpr size_t firstField = 3;
}  // namespace product

// Type/length byte of an info area field.
namespace field {
constexpr uint8_t endOfFields = 0xC1;
constexpr uint8_t lengthMask = 0x3F;
constexpr unsigned typeShift = 6;
constexpr uint8_t typeBinary = 0;
constexpr uint8_t typeBcdPlus = 1;
constexpr uint8_t typeSixBitAscii = 2;
constexpr uint8_t typeText = 3;  // 8-bit ASCII + Latin-1
}  // namespace field

struct FieldCode {
    uint8_t code;
    constexpr uint8_t type() const { return code >> field::typeShift; }
    constexpr uint8_t length() const { return code & field::lengthMask; }
    constexpr bool endOfFields() const { return code == field::endOfFields; }
};

// Multi-record header, 5 bytes before each record's data.
namespace multi {
constexpr size_t typeId = 0;
constexpr size_t flags = 1;  // bit 7 end of list, bits 3:0 record format version
constexpr size_t dataLength = 2;
constexpr size_t dataChecksum = 3;
constexpr size_t headerChecksum = 4;
constexpr size_t headerLength = 5;
constexpr uint8_t endOfList = 0x80;
}  // namespace multi

class MultiRecordHeaderView : public Bytes {
public:
    using Bytes::Bytes;
    constexpr explicit MultiRecordHeaderView(const Bytes& b) : Bytes(b) {}
    constexpr uint8_t typeId() const { return byteAt(multi::typeId); }
    constexpr bool endOfList() const { return byteAt(multi::flags) & multi::endOfList; }
    constexpr uint8_t formatVersion() const { return byteAt(multi::flags) & kVersionMask; }
    constexpr uint8_t dataLength() const { return byteAt(multi::dataLength); }
    constexpr uint8_t dataChecksum() const { return byteAt(multi::dataChecksum); }
    constexpr size_t recordLength() const { return multi::headerLength + dataLength(); }
};

// Multi-record type IDs.
namespace recordType {
constexpr uint8_t powerSupply = 0x00;
constexpr uint8_t dcOutput = 0x01;
constexpr uint8_t dcLoad = 0x02;
constexpr uint8_t managementAccess = 0x03;
constexpr uint8_t baseCompatibility = 0x04;
constexpr uint8_t extendedCompatibility = 0x05;
constexpr uint8_t oemFirst = 0xC0;  // 0xC0-0xFF
}  // namespace recordType

// Power supply information record (type 0x00), offsets in the record data.
namespace powerSupply {
constexpr size_t overallCapacity = 0;  // u16 LE, bits 11:0 watts
constexpr size_t peakVa = 2;           // u16 LE, 0xFFFF not specified
constexpr size_t inrushCurrent = 4;    // amps, 0xFF not specified
constexpr size_t inrushInterval = 5;   // ms
constexpr size_t lowInputVoltage1 = 6;   // u16 LE, 10 mV
constexpr size_t highInputVoltage1 = 8;
constexpr size_t lowInputVoltage2 = 10;  // 0: single range
constexpr size_t highInputVoltage2 = 12;
constexpr size_t lowInputFrequency = 14;  // Hz
constexpr size_t highInputFrequency = 15;
constexpr size_t dropoutTolerance = 16;  // ms
constexpr size_t flags = 17;
constexpr size_t peakWattage = 18;       // u16 LE: bits 15:12 hold-up seconds, 11:0 watts
constexpr size_t combinedWattage = 20;   // bits 7:4 voltage 1, 3:0 voltage 2
constexpr size_t totalCombinedWattage = 21;  // u16 LE
constexpr size_t tachometerThreshold = 23;   // RPS; 0: the predictive fail pin is pass/fail
constexpr size_t length = 24;
// flags byte
constexpr uint8_t pulsesOrPolarity = 0x01;  // two pulses per rotation / failure on pin assertion
constexpr uint8_t hotSwap = 0x02;
constexpr uint8_t autoSwitch = 0x04;
constexpr uint8_t powerFactorCorrection = 0x08;
constexpr uint8_t predictiveFailPin = 0x10;
constexpr uint16_t capacityMask = 0x0FFF;
constexpr uint16_t notSpecified16 = 0xFFFF;
constexpr uint8_t notSpecified8 = 0xFF;
}  // namespace powerSupply

// DC output (type 0x01) and DC load (type 0x02) records share their shape.
namespace dc {
constexpr size_t outputInfo = 0;  // DC output: bit 7 standby; both: bits 3:0 output number
constexpr size_t nominalVoltage = 1;   // s16 LE, 10 mV
constexpr size_t lowVoltage = 3;       // output: max negative deviation; load: min specified voltage
constexpr size_t highVoltage = 5;      // output: max positive deviation; load: max specified voltage
constexpr size_t rippleNoise = 7;      // u16 LE, mV peak to peak
constexpr size_t minimumCurrent = 9;   // u16 LE, mA
constexpr size_t maximumCurrent = 11;  // u16 LE, mA
constexpr size_t length = 13;
constexpr uint8_t standby = 0x80;
constexpr uint8_t outputNumber = 0x0F;
}  // namespace dc

// Management access record (type 0x03): a sub-record type, then its text.
namespace managementAccess {
constexpr size_t subType = 0;
constexpr size_t text = 1;
}  // namespace managementAccess

// Base and extended compatibility records (types 0x04, 0x05).
namespace compatibility {
constexpr size_t manufacturerId = 0;  // u24 LE
constexpr size_t entityId = 3;
constexpr size_t base = 4;
constexpr size_t codeStart = 5;  // bits 6:0
constexpr size_t codeRangeMask = 6;  // to the end of the record
}  // namespace compatibility

// OEM records (types 0xC0-0xFF).
namespace oem {
constexpr size_t manufacturerId = 0;  // u24 LE
constexpr size_t data = 3;
}  // namespace oem

// FRU device locator record (SDR type 0x11), offsets in the whole record.
namespace locator {
constexpr size_t deviceAccessAddress = 5;  // controller's slave address (8-bit form)
constexpr size_t deviceId = 6;             // FRU device ID of a logical device
constexpr size_t accessFlags = 7;          // bit 7 logical, 4:3 access LUN, 2:0 private bus
constexpr size_t channel = 8;              // bits 7:4
constexpr size_t deviceType = 10;
constexpr size_t deviceTypeModifier = 11;
constexpr size_t entityId = 12;
constexpr size_t entityInstance = 13;
constexpr size_t oem = 14;
constexpr size_t idStringTypeLength = 15;
constexpr size_t idString = 16;
constexpr uint8_t logical = 0x80;
constexpr uint8_t idStringLengthMask = 0x1F;
}  // namespace locator

class LocatorView : public Bytes {
public:
    using Bytes::Bytes;
    constexpr uint8_t accessAddress() const { return byteAt(locator::deviceAccessAddress); }
    constexpr uint8_t deviceId() const { return byteAt(locator::deviceId); }
    constexpr bool logical() const { return byteAt(locator::accessFlags) & locator::logical; }
    constexpr uint8_t accessLun() const { return (byteAt(locator::accessFlags) >> 3) & 0x03; }
    constexpr uint8_t channel() const { return byteAt(locator::channel) >> 4; }
    constexpr uint8_t entityId() const { return byteAt(locator::entityId); }
    constexpr uint8_t entityInstance() const { return byteAt(locator::entityInstance); }
    constexpr uint8_t idStringLength() const {
        return byteAt(locator::idStringTypeLength) & locator::idStringLengthMask;
    }
};

// Read FRU Data request and answer; Get FRU Inventory Area Info answer.
namespace readRequest {
constexpr size_t deviceId = 0;
constexpr size_t offset = 1;  // u16 LE
constexpr size_t count = 3;
constexpr size_t length = 4;
}  // namespace readRequest
namespace readAnswer {
constexpr size_t count = 1;  // after the completion code
constexpr size_t data = 2;
}  // namespace readAnswer
namespace areaInfoAnswer {
constexpr size_t size = 1;    // u16 LE, bytes
constexpr size_t access = 3;  // bit 0: by words
constexpr size_t length = 4;
constexpr uint8_t wordAccess = 0x01;
}  // namespace areaInfoAnswer

}  // namespace fru
}  // namespace Ipmi

#endif
