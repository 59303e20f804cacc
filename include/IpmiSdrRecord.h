#ifndef TAV_IPMI_IPMISDRRECORD_H
#define TAV_IPMI_IPMISDRRECORD_H

#include <stdint.h>

#include "TavIpmiExport.h"

namespace Ipmi {

/// @file
/// A copy of one sensor data record.

/// A value copy of one SDR, header included, as a sensor keeps it.
class TAV_IPMI_API IpmiSdrRecord {
public:
    /// The longest record kept, in bytes.
    enum { MAX_LENGTH = 64 };

    /// An empty record.
    IpmiSdrRecord();
    /// Callers pass at most MAX_LENGTH bytes; a longer length is stored but only
    /// MAX_LENGTH bytes are copied.
    IpmiSdrRecord(uint32_t length, const unsigned char* bytes);
    ///@{
    /// Copies the other record.
    IpmiSdrRecord(const IpmiSdrRecord& other);
    IpmiSdrRecord& operator=(const IpmiSdrRecord& other);
    ///@}
    ~IpmiSdrRecord();

    /// Replaces the record. Over MAX_LENGTH bytes: logs, copies nothing, keeps
    /// the over-long length and returns true (callers test the length they get back).
    bool set(uint32_t length, const unsigned char* bytes);

    uint32_t getLength() const { return length; }           ///< the stored length
    const unsigned char* getData() const { return data; }   ///< the record's bytes

    uint32_t length;                 ///< the stored length; may exceed MAX_LENGTH (see set())
    unsigned char data[MAX_LENGTH];  ///< the record, header first
};

}  // namespace Ipmi

#endif
