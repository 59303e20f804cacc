#include "IpmiSdrRecord.h"

#include <string.h>

#include "IpmiLog.h"

namespace Ipmi {

namespace {
uint32_t bytesThatFit(uint32_t length) {
    return length > IpmiSdrRecord::MAX_LENGTH ? static_cast<uint32_t>(IpmiSdrRecord::MAX_LENGTH) : length;
}
}  // namespace

IpmiSdrRecord::IpmiSdrRecord() : length(0) { memset(data, 0, sizeof data); }

IpmiSdrRecord::IpmiSdrRecord(uint32_t len, const unsigned char* bytes) : length(len) {
    memset(data, 0, sizeof data);
    if (bytes != nullptr) memcpy(data, bytes, bytesThatFit(len));
}

// The source may carry an over-long length left by set(): its buffer still holds 64 bytes.
IpmiSdrRecord::IpmiSdrRecord(const IpmiSdrRecord& other) : length(other.length) {
    memset(data, 0, sizeof data);
    memcpy(data, other.data, bytesThatFit(other.length));
}

IpmiSdrRecord& IpmiSdrRecord::operator=(const IpmiSdrRecord& other) {
    if (this != &other) (void)set(other.length, other.data);
    return *this;
}

IpmiSdrRecord::~IpmiSdrRecord() { explicit_bzero(data, sizeof data); }

bool IpmiSdrRecord::set(uint32_t len, const unsigned char* bytes) {
    memset(data, 0, sizeof data);
    length = len;
    if (len > MAX_LENGTH) {
        ipmiLog(LOG_ERR, "%s: SDR is too long", "set");
        return true;
    }
    if (bytes != nullptr) memcpy(data, bytes, len);
    return false;
}

}  // namespace Ipmi
