#ifndef TAV_IPMI_IPMISEL_H
#define TAV_IPMI_IPMISEL_H

#include <stdint.h>

#include <memory>

#include "IpmiIfc.h"
#include "IpmiSelData.h"
#include "TavIpmiExport.h"

namespace Ipmi {

// Summary of a controller's SEL: one Get SEL Info answer and the allocation
// unit size. Immutable once built.
class TAV_IPMI_API IpmiSel {
public:
    // Either pointer may be null; its fields then read as 0.
    IpmiSel(ipmiifc_sel_info* info, ipmiifc_sel_alloc_info* alloc, int node);

    uint32_t version() const { return version_; }
    uint32_t getCurrentNumberOfRecords() const { return records_; }
    // Unix time of the last addition or erase; 0 when the stamp is unset
    // (0xFFFFFFFF) or counts from controller start (up to 0x20000000).
    uint32_t getAddTimeStampUnix() const;
    uint32_t getEraseTimeStampUnix() const;
    uint32_t getFlags() const { return flags_; }
    // Records that fit: (records * 16 + free bytes) / 16.
    int getMaxNumberOfRecords() const;
    bool getOverFlowFlag() const;
    bool isEnabled() const { return enabled_; }
    // The SEL cannot be switched off; both return true and change nothing.
    bool enable() { return true; }
    bool disable() { return true; }
    // IpmiIfc::clearSel() on node 0.
    int clear();
    uint32_t getAllocationUnitSize() const { return unitSize_; }
    int node() const { return node_; }

private:
    uint32_t version_ = 0;
    uint32_t records_ = 0;
    uint32_t freeBytes_ = 0;
    uint32_t addStamp_ = 0;
    uint32_t eraseStamp_ = 0;
    uint32_t flags_ = 0;
    uint32_t node_ = 0;
    uint32_t unitSize_ = 16;
    bool enabled_ = true;
};

// ---- Direct SEL synchroniser ----------------------------------------------
// Reads the controller's whole event log into a flat array on a descriptor of
// its own, without the polling loop. The process keeps one message counter
// and one reservation without locks: calls must not overlap.

// What the caller keeps between sync_device_eventlog calls; zero it first.
struct sel_state {
    uint8_t version;      // 0x51 once seen
    uint8_t opSupport;    // operation support byte without the overflow bit
    uint8_t overflow;     // 0x80 when the SEL overflowed
    uint8_t polls;        // successful Get SEL Info answers
    uint16_t count;       // entries at the last poll
    uint16_t freeBytes;
    uint32_t addStamp;
    uint32_t eraseStamp;
    uint16_t lastRecordId;  // last record loaded; 0 asks for a full load
};

// Hands over the records added since the previous call (all of them after a
// clear) as a calloc'ed array the caller frees; *records is null and *n 0
// when nothing is new. False when the controller cannot be read; `state` is
// then as it was.
TAV_IPMI_API bool sync_device_eventlog(Event_log** records, int* n, sel_state* state);

// The current summary read directly from the controller; empty on failure.
TAV_IPMI_API std::shared_ptr<IpmiSel> GetSelInfo();

enum LogLvl { LOG_LVL_ERROR = 3, LOG_LVL_WARNING = 4, LOG_LVL_INFO = 6, LOG_LVL_DEBUG = 7 };
// Enables every syslog priority, whatever it is given.
TAV_IPMI_API void SetLogLevel(LogLvl level);

}  // namespace Ipmi

#endif
