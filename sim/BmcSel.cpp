// SEL area of the simulated controller: a real log over the SelModel with
// reservations, entry reads by offset and count, additions, deletions, erase
// and the clock, whose addition and erase stamps move as a controller's do.

#include <time.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include "Bmc.h"
#include "IpmiCommands.h"
#include "SelLayout.h"

namespace Sim {

using namespace Ipmi;

namespace {

constexpr size_t kRecordBytes = sel::recordSize;
constexpr uint8_t kTimestampedLast = 0xDF;  // record types up to here carry a time stamp
constexpr size_t kRecordIdAt = 0;
constexpr size_t kRecordTypeAt = 2;
constexpr size_t kTimestampAt = 3;
constexpr uint8_t kEventLoggingDisabled = 0x10;  // sensor type
constexpr uint8_t kLogAreaCleared = 0x02;        // its offset
constexpr uint8_t kSetLastProcessedByBmc = 0x01;

Response ccOnly(uint8_t code) { return Response{code}; }

void putLe16(Response& out, uint16_t v) {
    out.push_back(static_cast<uint8_t>(v & 0xFF));
    out.push_back(static_cast<uint8_t>(v >> 8));
}

void putLe32(Response& out, uint32_t v) {
    for (int i = 0; i < 4; ++i) out.push_back(static_cast<uint8_t>((v >> (8 * i)) & 0xFF));
}

uint16_t idOf(const std::vector<uint8_t>& record) { return sel::le16(record.data() + kRecordIdAt); }

uint16_t entryCount(const SelModel& sel) {
    return sel.records.empty() ? sel.entries : static_cast<uint16_t>(sel.records.size());
}

uint16_t unitsPerRecord(const SelModel& sel) {
    if (sel.allocationUnitSize == 0) return 1;
    return static_cast<uint16_t>((kRecordBytes + sel.allocationUnitSize - 1) / sel.allocationUnitSize);
}

uint32_t capacity(const SelModel& sel) { return sel.allocationUnits / unitsPerRecord(sel); }

uint16_t freeUnits(const SelModel& sel) {
    uint32_t used = static_cast<uint32_t>(entryCount(sel)) * unitsPerRecord(sel);
    return used >= sel.allocationUnits ? 0 : static_cast<uint16_t>(sel.allocationUnits - used);
}

// A request's reservation: 0 passes for whole-record reads only.
bool reservationHolds(const SelModel& sel, uint16_t given, bool zeroAllowed) {
    if (given == 0) return zeroAllowed;
    return given == sel.reservation;
}

// Index of the record an ID names: 0x0000 the first, 0xFFFF the last.
int findRecord(const SelModel& sel, uint16_t id) {
    if (sel.records.empty()) return -1;
    if (id == sel::firstRecord) return 0;
    if (id == sel::lastRecord) return static_cast<int>(sel.records.size()) - 1;
    for (size_t i = 0; i < sel.records.size(); ++i)
        if (idOf(sel.records[i]) == id) return static_cast<int>(i);
    return -1;
}

Response getSelInfo(Bmc& b, const Request& r) {
    if (!b.sel.enabled) return ccOnly(cc::invalidCommand);  // no SEL device
    if (!r.data.empty()) return ccOnly(cc::requestDataLengthInvalid);
    const SelModel& sel = b.sel;
    Response out{cc::ok, sel.version};
    putLe16(out, entryCount(sel));
    const uint32_t freeBytes = uint32_t(freeUnits(sel)) * (sel.allocationUnitSize ? sel.allocationUnitSize : 16);
    putLe16(out, static_cast<uint16_t>(std::min<uint32_t>(freeBytes, 0xFFFF)));
    putLe32(out, sel.additionTimestamp);
    putLe32(out, sel.eraseTimestamp);
    out.push_back(static_cast<uint8_t>(sel.operationSupport | (sel.overflow ? sel::overflowFlag : 0)));
    return out;
}

Response getSelAllocationInfo(Bmc& b, const Request& r) {
    if (!b.sel.enabled) return ccOnly(cc::invalidCommand);
    if (!r.data.empty()) return ccOnly(cc::requestDataLengthInvalid);
    const SelModel& sel = b.sel;
    Response out{cc::ok};
    putLe16(out, sel.allocationUnits);
    putLe16(out, sel.allocationUnitSize);
    putLe16(out, freeUnits(sel));
    putLe16(out, freeUnits(sel));  // largest free block: the log is never fragmented
    out.push_back(static_cast<uint8_t>(unitsPerRecord(sel)));
    return out;
}

// A new reservation cancels the one before.
Response reserveSel(Bmc& b, const Request& r) {
    if (!b.sel.enabled) return ccOnly(cc::invalidCommand);
    if (!r.data.empty()) return ccOnly(cc::requestDataLengthInvalid);
    if (++b.sel.reservation == 0) b.sel.reservation = 1;
    Response out{cc::ok};
    putLe16(out, b.sel.reservation);
    return out;
}

Response getSelEntry(Bmc& b, const Request& r) {
    if (!b.sel.enabled) return ccOnly(cc::invalidCommand);
    if (r.data.size() != sel::entryRequest::size) return ccOnly(cc::requestDataLengthInvalid);
    const SelModel& sel = b.sel;
    const uint8_t offset = r.data[sel::entryRequest::offset];
    const uint8_t asked = r.data[sel::entryRequest::count];
    const bool whole = offset == 0 && asked == sel::wholeRecord;
    if (!reservationHolds(sel, sel::le16(r.data.data() + sel::entryRequest::reservation), whole))
        return ccOnly(cc::reservationCancelled);
    const int at = findRecord(sel, sel::le16(r.data.data() + sel::entryRequest::recordId));
    if (at < 0) return ccOnly(cc::requestedSensorNotPresent);
    if (offset >= kRecordBytes) return ccOnly(cc::parameterOutOfRange);
    const size_t count = asked == sel::wholeRecord ? kRecordBytes - offset : asked;
    if (offset + count > kRecordBytes) return ccOnly(cc::cannotReturnRequestedBytes);
    const bool last = static_cast<size_t>(at) + 1 == sel.records.size();
    Response out{cc::ok};
    putLe16(out, last ? sel::lastRecord : idOf(sel.records[static_cast<size_t>(at) + 1]));
    const auto& record = sel.records[static_cast<size_t>(at)];
    out.insert(out.end(), record.begin() + offset, record.begin() + static_cast<long>(offset + count));
    return out;
}

Response addSelEntry(Bmc& b, const Request& r) {
    if (!b.sel.enabled) return ccOnly(cc::invalidCommand);
    if (r.data.size() != kRecordBytes) return ccOnly(cc::requestDataLengthInvalid);
    const uint16_t id = addSelRecord(b, r.data.data());
    if (id == 0) return ccOnly(cc::outOfSpace);
    Response out{cc::ok};
    putLe16(out, id);
    return out;
}

Response deleteSelEntry(Bmc& b, const Request& r) {
    if (!b.sel.enabled) return ccOnly(cc::invalidCommand);
    if (r.data.size() != sel::deleteRequest::size) return ccOnly(cc::requestDataLengthInvalid);
    SelModel& sel = b.sel;
    if (!reservationHolds(sel, sel::le16(r.data.data() + sel::deleteRequest::reservation), false))
        return ccOnly(cc::reservationCancelled);
    const int at = findRecord(sel, sel::le16(r.data.data() + sel::deleteRequest::recordId));
    if (at < 0) return ccOnly(cc::requestedSensorNotPresent);
    const uint16_t id = idOf(sel.records[static_cast<size_t>(at)]);
    sel.records.erase(sel.records.begin() + at);
    sel.eraseTimestamp = selClock(b);
    Response out{cc::ok};
    putLe16(out, id);
    return out;
}

Response clearSel(Bmc& b, const Request& r) {
    if (!b.sel.enabled) return ccOnly(cc::invalidCommand);
    if (r.data.size() != sel::clearRequest::size) return ccOnly(cc::requestDataLengthInvalid);
    if (!reservationHolds(b.sel, sel::le16(r.data.data() + sel::clearRequest::reservation), false))
        return ccOnly(cc::reservationCancelled);
    const uint8_t* sig = r.data.data() + sel::clearRequest::signature;
    if (sig[0] != 'C' || sig[1] != 'L' || sig[2] != 'R') return ccOnly(cc::invalidDataField);
    const uint8_t action = r.data[sel::clearRequest::action];
    if (action == sel::clearRequest::initiateErase) {
        clearSelRecords(b);
    } else if (action != sel::clearRequest::getStatus) {
        return ccOnly(cc::invalidDataField);
    }
    return Response{cc::ok, sel::clearAnswer::completed};
}

Response getSelTime(Bmc& b, const Request& r) {
    if (!r.data.empty()) return ccOnly(cc::requestDataLengthInvalid);
    Response out{cc::ok};
    putLe32(out, selClock(b));
    return out;
}

Response setSelTime(Bmc& b, const Request& r) {
    if (r.data.size() != 4) return ccOnly(cc::requestDataLengthInvalid);
    b.sel.clockOffset = static_cast<int64_t>(sel::le32(r.data.data())) - static_cast<int64_t>(time(nullptr));
    return ccOnly(cc::ok);
}

Response setLastProcessedEventId(Bmc& b, const Request& r) {
    if (r.data.size() != sel::lastProcessed::requestSize) return ccOnly(cc::requestDataLengthInvalid);
    const uint16_t id = sel::le16(r.data.data() + sel::lastProcessed::recordId);
    if (r.data[sel::lastProcessed::selector] & kSetLastProcessedByBmc)
        b.sel.lastProcessedByBmc = id;
    else
        b.sel.lastProcessedBySoftware = id;
    return ccOnly(cc::ok);
}

Response getLastProcessedEventId(Bmc& b, const Request& r) {
    if (!r.data.empty()) return ccOnly(cc::requestDataLengthInvalid);
    const SelModel& sel = b.sel;
    Response out{cc::ok};
    putLe32(out, sel.additionTimestamp);
    putLe16(out, sel.records.empty() ? sel::lastRecord : idOf(sel.records.back()));
    putLe16(out, sel.lastProcessedBySoftware);
    putLe16(out, sel.lastProcessedByBmc);
    return out;
}

}  // namespace

uint32_t selClock(const Bmc& bmc) {
    if (bmc.sel.frozenClock != 0) return bmc.sel.frozenClock;
    return static_cast<uint32_t>(static_cast<int64_t>(time(nullptr)) + bmc.sel.clockOffset);
}

uint16_t addSelRecord(Bmc& bmc, const uint8_t record[16], bool keepTimestamp) {
    SelModel& sel = bmc.sel;
    if (sel.records.size() >= capacity(sel)) {
        sel.overflow = true;
        if (!sel.circular || sel.records.empty()) return 0;
        sel.records.erase(sel.records.begin());
    }
    std::vector<uint8_t> r(record, record + kRecordBytes);
    uint16_t id = sel.nextRecordId;
    sel.nextRecordId = static_cast<uint16_t>(id + 1);
    if (sel.nextRecordId == sel::lastRecord) sel.nextRecordId = 1;
    r[kRecordIdAt] = static_cast<uint8_t>(id & 0xFF);
    r[kRecordIdAt + 1] = static_cast<uint8_t>(id >> 8);
    const uint32_t now = selClock(bmc);
    if (!keepTimestamp && r[kRecordTypeAt] <= kTimestampedLast) {
        for (int i = 0; i < 4; ++i) r[kTimestampAt + i] = static_cast<uint8_t>((now >> (8 * i)) & 0xFF);
    }
    sel.records.push_back(std::move(r));
    sel.additionTimestamp = now;
    return id;
}

void clearSelRecords(Bmc& bmc) {
    SelModel& sel = bmc.sel;
    sel.records.clear();
    sel.entries = 0;
    sel.overflow = false;
    sel.nextRecordId = 1;
    sel.eraseTimestamp = selClock(bmc);
    if (sel.logsClearEvent) {
        const uint8_t cleared[16] = {0, 0, 0x02, 0, 0, 0, 0, 0x20, 0x00, 0x04, kEventLoggingDisabled, 0x01, 0x6F,
                                     kLogAreaCleared, 0xFF, 0xFF};
        addSelRecord(bmc, cleared);
    }
}

void loadSelDump(Bmc& bmc, const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) throw std::runtime_error(path + ": cannot be read");
    std::vector<uint8_t> bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    if (bytes.size() % kRecordBytes != 0) throw std::runtime_error(path + ": not whole 16-byte records");
    SelModel& sel = bmc.sel;
    for (size_t at = 0; at < bytes.size(); at += kRecordBytes) {
        std::vector<uint8_t> record(bytes.begin() + static_cast<long>(at),
                                    bytes.begin() + static_cast<long>(at + kRecordBytes));
        const uint16_t id = idOf(record);
        if (id >= sel.nextRecordId && id < sel::lastRecord - 1) sel.nextRecordId = static_cast<uint16_t>(id + 1);
        if (record[kRecordTypeAt] <= kTimestampedLast)
            sel.additionTimestamp = std::max(sel.additionTimestamp, sel::le32(record.data() + kTimestampAt));
        sel.records.push_back(std::move(record));
    }
}

void registerSelHandlers(Bmc& bmc) {
    bmc.on(netfn::storage, cmd::getSelInfo, getSelInfo);
    bmc.on(netfn::storage, cmd::getSelAllocationInfo, getSelAllocationInfo);
    bmc.on(netfn::storage, cmd::reserveSel, reserveSel);
    bmc.on(netfn::storage, cmd::getSelEntry, getSelEntry);
    bmc.on(netfn::storage, cmd::addSelEntry, addSelEntry);
    bmc.on(netfn::storage, cmd::deleteSelEntry, deleteSelEntry);
    bmc.on(netfn::storage, cmd::clearSel, clearSel);
    bmc.on(netfn::storage, cmd::getSelTime, getSelTime);
    bmc.on(netfn::storage, cmd::setSelTime, setSelTime);
    bmc.on(netfn::sensorEvent, cmd::setLastProcessedEventId, setLastProcessedEventId);
    bmc.on(netfn::sensorEvent, cmd::getLastProcessedEventId, getLastProcessedEventId);
}

}  // namespace Sim
