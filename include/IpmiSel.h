#ifndef TAV_IPMI_IPMISEL_H
#define TAV_IPMI_IPMISEL_H

#include <stdint.h>

#include <memory>

#include "IpmiIfc.h"
#include "IpmiSelData.h"
#include "TavIpmiExport.h"

/// @file
/// The SEL summary, and the direct SEL synchroniser: the event log read
/// without the polling loop.

namespace Ipmi {

/// Summary of a controller's SEL: one Get SEL Info answer and the allocation
/// unit size. Immutable once built: any thread may read it; nothing here
/// sends but clear().
class TAV_IPMI_API IpmiSel {
public:
    /// Either pointer may be null; its fields then read as 0.
    IpmiSel(ipmiifc_sel_info* info, ipmiifc_sel_alloc_info* alloc, int node);

    uint32_t version() const { return version_; }                    ///< SEL version, 0x51
    uint32_t getCurrentNumberOfRecords() const { return records_; }  ///< records in the log
    ///@{
    /// Unix time of the last addition or erase; 0 when the stamp is unset
    /// (0xFFFFFFFF) or counts from controller start (up to 0x20000000).
    uint32_t getAddTimeStampUnix() const;
    uint32_t getEraseTimeStampUnix() const;
    ///@}
    uint32_t getFlags() const { return flags_; }  ///< operation support byte
    /// Records that fit: (records * 16 + free bytes) / 16.
    int getMaxNumberOfRecords() const;
    bool getOverFlowFlag() const;                 ///< the log overflowed (bit 7 of the flags)
    bool isEnabled() const { return enabled_; }   ///< always true
    ///@{
    /// The SEL cannot be switched off; both return true and change nothing.
    bool enable() { return true; }
    bool disable() { return true; }
    ///@}
    /// IpmiIfc::clearSel() on node 0.
    int clear();
    uint32_t getAllocationUnitSize() const { return unitSize_; }  ///< bytes; 16 when unknown
    int node() const { return node_; }                              ///< the node

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
// Reads the controller's event log into a flat array on a descriptor of its
// own, without the polling loop (it works with or without one). The process
// keeps one message counter and one reservation without locks: calls must
// not overlap.

/// What the caller keeps between sync_device_eventlog calls; zero it first.
struct sel_state {
    uint8_t version;      ///< 0x51 once seen
    uint8_t opSupport;    ///< operation support byte without the overflow bit
    uint8_t overflow;     ///< 0x80 when the SEL overflowed
    uint8_t polls;        ///< successful Get SEL Info answers
    uint16_t count;       ///< entries at the last poll
    uint16_t freeBytes;   ///< free bytes at the last poll
    uint32_t addStamp;    ///< last addition stamp seen
    uint32_t eraseStamp;  ///< last erase stamp seen
    uint16_t lastRecordId;  ///< last record loaded; 0 asks for a full load
};

/// Hands over the records added since the previous call (all of them after a
/// clear) as a calloc'ed array the caller frees; *records is null and *n 0
/// when nothing is new. False when the controller cannot be read; `state` is
/// then as it was. Opens /dev/ipmi0 for the call: Get Device ID once per
/// process, Get SEL Info, and when the log grew a Reserve SEL and one Get SEL
/// Entry per new record; each answer is waited for at most 20 seconds. Not
/// concurrently with itself or GetSelInfo().
TAV_IPMI_API bool sync_device_eventlog(Event_log** records, int* n, sel_state* state);

/// The current summary read directly from the controller (Get SEL Info on a
/// descriptor of its own, as sync_device_eventlog); null on failure.
TAV_IPMI_API std::shared_ptr<IpmiSel> GetSelInfo();

/// syslog priorities, for SetLogLevel().
enum LogLvl {
    LOG_LVL_ERROR = 3,    ///< errors
    LOG_LVL_WARNING = 4,  ///< warnings
    LOG_LVL_INFO = 6,     ///< information
    LOG_LVL_DEBUG = 7     ///< debugging
};
/// Enables every syslog priority (setlogmask), whatever it is given.
TAV_IPMI_API void SetLogLevel(LogLvl level);

}  // namespace Ipmi

#endif
