#ifndef TAV_IPMI_IPMISDRRECORD_H
#define TAV_IPMI_IPMISDRRECORD_H

#include <stdint.h>

#include "TavIpmiExport.h"

namespace Ipmi {

// A value copy of one SDR, header included, as a sensor keeps it.
class TAV_IPMI_API IpmiSdrRecord {
public:
    enum { MAX_LENGTH = 64 };

    IpmiSdrRecord();
    // Callers pass at most MAX_LENGTH bytes; a longer length is stored but only
    // MAX_LENGTH bytes are copied.
    IpmiSdrRecord(uint32_t length, const unsigned char* bytes);
    IpmiSdrRecord(const IpmiSdrRecord& other);
    IpmiSdrRecord& operator=(const IpmiSdrRecord& other);
    ~IpmiSdrRecord();

    // Replaces the record. Over MAX_LENGTH bytes: logs, copies nothing, keeps
    // the over-long length and returns true (callers test the length they get back).
    bool set(uint32_t length, const unsigned char* bytes);

    uint32_t getLength() const { return length; }
    const unsigned char* getData() const { return data; }

    uint32_t length;
    unsigned char data[MAX_LENGTH];
};

}  // namespace Ipmi

#endif
