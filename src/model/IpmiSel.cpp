// The SEL summary handed to callers.

#include "IpmiSel.h"

#include "SelLayout.h"

namespace Ipmi {

namespace {
constexpr uint32_t kUnsetStamp = 0xFFFFFFFF;
// IPMI stamps up to here count seconds from controller start, not Unix time.
constexpr uint32_t kLastRelativeStamp = 0x20000000;
constexpr uint32_t kDefaultUnitSize = 16;

uint32_t unixStamp(uint32_t stamp) { return (stamp == kUnsetStamp || stamp <= kLastRelativeStamp) ? 0 : stamp; }
}  // namespace

IpmiSel::IpmiSel(ipmiifc_sel_info* info, ipmiifc_sel_alloc_info* alloc, int node) : node_(uint32_t(node)) {
    if (info) {
        version_ = info->version;
        records_ = info->entries;
        freeBytes_ = info->free_space;
        addStamp_ = info->addition_timestamp;
        eraseStamp_ = info->erase_timestamp;
        flags_ = info->operation_support;
    }
    if (alloc && alloc->unit_size != 0) unitSize_ = alloc->unit_size;
    if (unitSize_ == 0) unitSize_ = kDefaultUnitSize;
}

uint32_t IpmiSel::getAddTimeStampUnix() const { return unixStamp(addStamp_); }

uint32_t IpmiSel::getEraseTimeStampUnix() const { return unixStamp(eraseStamp_); }

// A record takes 16 bytes here whatever allocation unit the controller uses.
int IpmiSel::getMaxNumberOfRecords() const {
    return (static_cast<int>(records_) * static_cast<int>(sel::recordSize) + static_cast<int>(freeBytes_)) /
           static_cast<int>(sel::recordSize);
}

bool IpmiSel::getOverFlowFlag() const { return (flags_ & sel::overflowFlag) != 0; }

int IpmiSel::clear() { return IpmiIfc::clearSel(); }

}  // namespace Ipmi
