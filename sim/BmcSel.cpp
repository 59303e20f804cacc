// SEL area of the simulated controller: Get SEL Info and Get SEL Allocation
// Info over the SelModel.

#include "Bmc.h"
#include "IpmiCommands.h"

namespace Sim {

using namespace Ipmi;

namespace {

constexpr size_t kRecordBytes = 16;

Response ccOnly(uint8_t code) { return Response{code}; }

void putLe16(Response& out, uint16_t v) {
    out.push_back(static_cast<uint8_t>(v & 0xFF));
    out.push_back(static_cast<uint8_t>(v >> 8));
}

void putLe32(Response& out, uint32_t v) {
    for (int i = 0; i < 4; ++i) out.push_back(static_cast<uint8_t>((v >> (8 * i)) & 0xFF));
}

// A model with records reports how many it holds; a bare count lets a test
// move the entry count without building records.
uint16_t entryCount(const SelModel& sel) {
    return sel.records.empty() ? sel.entries : static_cast<uint16_t>(sel.records.size());
}

uint16_t unitsPerRecord(const SelModel& sel) {
    if (sel.allocationUnitSize == 0) return 1;
    return static_cast<uint16_t>((kRecordBytes + sel.allocationUnitSize - 1) / sel.allocationUnitSize);
}

Response getSelInfo(Bmc& b, const Request& r) {
    if (!b.sel.enabled) return ccOnly(cc::invalidCommand);  // no SEL device
    if (!r.data.empty()) return ccOnly(cc::requestDataLengthInvalid);
    const SelModel& sel = b.sel;
    Response out{cc::ok, sel.version};
    putLe16(out, entryCount(sel));
    putLe16(out, sel.freeSpace);
    putLe32(out, sel.additionTimestamp);
    putLe32(out, sel.eraseTimestamp);
    out.push_back(sel.operationSupport);
    return out;
}

Response getSelAllocationInfo(Bmc& b, const Request& r) {
    if (!b.sel.enabled) return ccOnly(cc::invalidCommand);
    if (!r.data.empty()) return ccOnly(cc::requestDataLengthInvalid);
    const SelModel& sel = b.sel;
    uint32_t used = static_cast<uint32_t>(entryCount(sel)) * unitsPerRecord(sel);
    uint16_t freeUnits = used >= sel.allocationUnits ? 0 : static_cast<uint16_t>(sel.allocationUnits - used);
    Response out{cc::ok};
    putLe16(out, sel.allocationUnits);
    putLe16(out, sel.allocationUnitSize);
    putLe16(out, freeUnits);
    putLe16(out, freeUnits);  // largest free block: the log is never fragmented
    out.push_back(static_cast<uint8_t>(unitsPerRecord(sel)));
    return out;
}

}  // namespace

void registerSelHandlers(Bmc& bmc) {
    bmc.on(netfn::storage, cmd::getSelInfo, getSelInfo);
    bmc.on(netfn::storage, cmd::getSelAllocationInfo, getSelAllocationInfo);
}

}  // namespace Sim
