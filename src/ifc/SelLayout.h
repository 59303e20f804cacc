#ifndef TAV_IPMI_SELLAYOUT_H
#define TAV_IPMI_SELLAYOUT_H

#include <stddef.h>
#include <stdint.h>

// Byte layouts of the SEL commands' requests and answers, named once. The
// 16-byte record itself is sel_event_record (IpmiSelData.h). Answer offsets
// count the completion code as byte 0, as the transport stores answers.
namespace Ipmi {
namespace sel {

constexpr size_t recordSize = 16;
constexpr uint16_t lastRecord = 0xFFFF;   // next record ID after the last record
constexpr uint16_t firstRecord = 0x0000;  // record ID that asks for the first record
constexpr uint8_t wholeRecord = 0xFF;     // bytes-to-read value: the whole record
constexpr uint8_t supportedVersion = 0x51;
constexpr uint8_t overflowFlag = 0x80;    // operation support bit 7

// Get SEL Info answer.
namespace info {
constexpr size_t version = 1;
constexpr size_t entries = 2;             // u16 LE
constexpr size_t freeSpace = 4;           // u16 LE, bytes
constexpr size_t additionTimestamp = 6;   // u32 LE
constexpr size_t eraseTimestamp = 10;     // u32 LE
constexpr size_t operationSupport = 14;
constexpr size_t size = 15;
}  // namespace info

// Get SEL Allocation Info answer.
namespace allocInfo {
constexpr size_t units = 1;         // u16 LE
constexpr size_t unitSize = 3;      // u16 LE
constexpr size_t size = 10;
}  // namespace allocInfo

// Reserve SEL answer.
namespace reserveAnswer {
constexpr size_t reservation = 1;  // u16 LE
constexpr size_t size = 3;
}  // namespace reserveAnswer

// Get SEL Entry request and answer.
namespace entryRequest {
constexpr size_t reservation = 0;  // u16 LE
constexpr size_t recordId = 2;     // u16 LE
constexpr size_t offset = 4;
constexpr size_t count = 5;
constexpr size_t size = 6;
}  // namespace entryRequest
namespace entryAnswer {
constexpr size_t nextRecordId = 1;  // u16 LE
constexpr size_t data = 3;          // the bytes asked for
}  // namespace entryAnswer

// Clear SEL request and answer.
namespace clearRequest {
constexpr size_t reservation = 0;  // u16 LE
constexpr size_t signature = 2;    // 'C', 'L', 'R'
constexpr size_t action = 5;
constexpr size_t size = 6;
constexpr uint8_t initiateErase = 0xAA;
constexpr uint8_t getStatus = 0x00;
}  // namespace clearRequest
namespace clearAnswer {
constexpr size_t status = 1;  // bits 3:0
constexpr uint8_t statusMask = 0x0F;
constexpr uint8_t inProgress = 0;
constexpr uint8_t completed = 1;
}  // namespace clearAnswer

// Delete SEL Entry request and answer.
namespace deleteRequest {
constexpr size_t reservation = 0;  // u16 LE
constexpr size_t recordId = 2;     // u16 LE
constexpr size_t size = 4;
}  // namespace deleteRequest

// Get SEL Time answer.
namespace timeAnswer {
constexpr size_t seconds = 1;  // u32 LE
constexpr size_t size = 5;
}  // namespace timeAnswer

// Set Last Processed Event ID request; Get Last Processed Event ID answer.
namespace lastProcessed {
constexpr size_t selector = 0;         // request: 0 software's ID, 1 BMC's
constexpr size_t recordId = 1;         // request: u16 LE
constexpr size_t requestSize = 3;
constexpr uint8_t softwareId = 0x00;
constexpr size_t answerAddition = 1;   // answer: u32 LE most recent addition
constexpr size_t answerLastRecord = 5; // answer: u16 LE last record ID
constexpr size_t answerSoftware = 7;   // answer: u16 LE last software-processed ID
constexpr size_t answerBmc = 9;        // answer: u16 LE last BMC-processed ID
constexpr size_t answerSize = 11;
}  // namespace lastProcessed

inline uint16_t le16(const uint8_t* b) { return static_cast<uint16_t>(b[0] | (b[1] << 8)); }
inline uint32_t le32(const uint8_t* b) {
    return static_cast<uint32_t>(b[0]) | (static_cast<uint32_t>(b[1]) << 8) | (static_cast<uint32_t>(b[2]) << 16) |
           (static_cast<uint32_t>(b[3]) << 24);
}
inline void putLe16(uint8_t* b, uint16_t v) {
    b[0] = static_cast<uint8_t>(v & 0xFF);
    b[1] = static_cast<uint8_t>(v >> 8);
}

}  // namespace sel
}  // namespace Ipmi

#endif
