#ifndef TAV_IPMI_SDRCACHELAYOUT_H
#define TAV_IPMI_SDRCACHELAYOUT_H

#include <stddef.h>
#include <stdint.h>
#include <string.h>

// Byte layout of an SDR cache file: a fixed header (magic, format version,
// the key the records are valid for, body length and checksum), then the
// body, each record as a length byte followed by the whole record (5-byte
// header included), in the order Get SDR walked the repository. Numbers are
// little-endian.
//
// The file is read back from disk as untrusted as a controller's answer: the
// view reads a field only when the bytes hold it, and reads 0 otherwise.
namespace Ipmi {
namespace sdrcache {

constexpr uint8_t magic[8] = {'t', 'a', 'v', 'S', 'D', 'R', 0x0D, 0x0A};
constexpr uint16_t formatVersion = 1;

namespace head {
constexpr size_t magic = 0;            // 8 bytes
constexpr size_t formatVersion = 8;    // u16
constexpr size_t flags = 10;           // bit 0: the controller answered Get System GUID
constexpr size_t recordCount = 11;     // u16: the repository info's record count
constexpr size_t additionStamp = 13;   // u32: the repository info's most recent addition
constexpr size_t eraseStamp = 17;      // u32: the repository info's most recent erase
constexpr size_t deviceId = 21;        // Get Device ID byte 1
constexpr size_t deviceRevision = 22;  // Get Device ID byte 2
constexpr size_t firmware1 = 23;       // Get Device ID byte 3
constexpr size_t firmware2 = 24;       // Get Device ID byte 4
constexpr size_t manufacturer = 25;    // 3 bytes, Get Device ID bytes 7-9
constexpr size_t product = 28;         // 2 bytes, Get Device ID bytes 10-11
constexpr size_t auxFirmware = 30;     // 4 bytes, Get Device ID bytes 12-15
constexpr size_t guid = 34;            // 16 bytes, zeros without a GUID
constexpr size_t keyFirst = flags;     // the key: flags up to the end of the GUID
constexpr size_t keyLength = guid + 16 - keyFirst;
constexpr size_t records = 50;         // u16: records in the body
constexpr size_t bodyLength = 52;      // u32
constexpr size_t bodyChecksum = 56;    // u32, CRC-32 of the body
constexpr size_t length = 60;
}  // namespace head

namespace bits {
constexpr uint8_t hasGuid = 0x01;
}

// A record of the body: its length byte, then the record.
constexpr size_t recordLengthByte = 1;
// No record is longer than its length byte says, and no repository holds
// more records than a 16-bit count: so no file is longer than this.
constexpr size_t maxRecords = 0xFFFF;
constexpr size_t maxFileBytes = head::length + maxRecords * (recordLengthByte + 0xFF);

inline uint16_t le16(const uint8_t* p) { return static_cast<uint16_t>(p[0] | (p[1] << 8)); }
inline uint32_t le32(const uint8_t* p) {
    return static_cast<uint32_t>(p[0]) | (static_cast<uint32_t>(p[1]) << 8) | (static_cast<uint32_t>(p[2]) << 16) |
           (static_cast<uint32_t>(p[3]) << 24);
}
inline void putLe16(uint8_t* p, uint16_t v) {
    p[0] = static_cast<uint8_t>(v);
    p[1] = static_cast<uint8_t>(v >> 8);
}
inline void putLe32(uint8_t* p, uint32_t v) {
    for (int i = 0; i < 4; ++i) p[i] = static_cast<uint8_t>(v >> (8 * i));
}

// The header of a cache file, over as many bytes as were read.
class HeadView {
public:
    HeadView(const uint8_t* bytes, size_t size) : bytes_(bytes), size_(size) {}
    bool complete() const { return size_ >= head::length; }
    bool magicMatches() const { return complete() && memcmp(bytes_ + head::magic, magic, sizeof magic) == 0; }
    uint16_t formatVersion() const { return complete() ? le16(bytes_ + head::formatVersion) : 0; }
    const uint8_t* key() const { return bytes_ + head::keyFirst; }  // head::keyLength bytes; complete() first
    uint16_t records() const { return complete() ? le16(bytes_ + head::records) : 0; }
    uint32_t bodyLength() const { return complete() ? le32(bytes_ + head::bodyLength) : 0; }
    uint32_t bodyChecksum() const { return complete() ? le32(bytes_ + head::bodyChecksum) : 0; }
    const uint8_t* body() const { return bytes_ + head::length; }
    size_t bodyBytesPresent() const { return complete() ? size_ - head::length : 0; }

private:
    const uint8_t* bytes_;
    size_t size_;
};

// CRC-32 (IEEE 802.3, reflected), as zlib computes it.
inline uint32_t crc32(const uint8_t* bytes, size_t size) {
    uint32_t crc = 0xFFFFFFFFu;
    for (size_t i = 0; i < size; ++i) {
        crc ^= bytes[i];
        for (int bit = 0; bit < 8; ++bit) crc = (crc >> 1) ^ (0xEDB88320u & (0u - (crc & 1u)));
    }
    return ~crc;
}

}  // namespace sdrcache
}  // namespace Ipmi

#endif
