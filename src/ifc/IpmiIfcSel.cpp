// SEL access: follows the controller's SEL from the Get SEL Info answers that
// the polling loop asks for, reads new records, and hands each new event
// record to the registered handlers once; plus the public SEL entry points.
// The handler list itself is in IpmiIfcSelHandlers.cpp.
//
// What has been delivered is told by the record, never by a time stamp alone:
// every record held carries a mark, set when it goes to the handlers or when
// it belongs to the log found at start. A reload carries the marks over to
// the records it reads again (same ID, same bytes). So events within one
// second, a clock set back, records logged while a pass reads, a log that
// overwrites its oldest records and handlers that clear the log still see
// each record once, in log order.

#include "IpmiIfcSel.h"

#include <string.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <mutex>
#include <set>
#include <vector>

#include "IpmiIfcInternal.h"
#include "IpmiSel.h"
#include "SelLayout.h"

namespace Ipmi {

namespace {

constexpr uint32_t kSelFailed = 0xFFFFFFFF;
constexpr int kChunkAttempts = 4;
constexpr int kClearAttempts = 5;
constexpr unsigned kBusySeconds = 1;
constexpr unsigned kClearBusySeconds = 5;
constexpr uint8_t kRecordIdVersionNibbleMin = 2;
// What one pass may spend: failed attempts in all (busy, cancelled
// reservations, bad answers), and records read. A controller that claims
// more, or fails for ever, gets the rest on the next pass, so a pass never
// holds the SEL for long at a few milliseconds an exchange.
constexpr int kPassFailures = 16;
constexpr uint32_t kPassRecords = 4096;

IpmiNode& slot(int node) { return g_IpmiNode[(node >= 0 && node < IPMI_NODE_COUNT) ? node : 0]; }
int slotIndex(int node) { return (node >= 0 && node < IPMI_NODE_COUNT) ? node : 0; }

// Sleeps a pseudo-random 0-3 seconds, as the retry rules want.
void sleepTimeAnd3() { sleep(static_cast<unsigned>(time(nullptr) & 3)); }

using RecordKey = std::array<uint8_t, sel::recordSize>;

RecordKey keyOf(const sel_event_record& r) {
    RecordKey k;
    memcpy(k.data(), &r, k.size());
    return k;
}

// How a node follows its controller's log. All but `pass` under the node's selMutex.
struct Follow {
    std::recursive_mutex pass;         // one pass at a time; a handler's clearSel nests on its thread
    std::vector<uint8_t> handled;      // beside selRecords: delivered, or in the log found at start
    size_t firstUnhandled = 0;         // no record before it waits
    uint32_t foundAtStart = 0;         // records of the log found at start still to be read
    std::set<RecordKey> carried;       // records handled before a reload, until a whole read
    // Records read but not yet handed over when a reload (a clear from a
    // handler, say) took them out of the list: they go first.
    std::vector<std::shared_ptr<IpmiSelData>> pending;
    bool readOn = false;               // the last pass stopped short of the log's end
    IpmiSelCursor resumeAfter;         // set by resumeSelDelivery until the first pass
    bool cursorDue = false;            // resumeAfter waits for a whole read of the log
    bool holdForHandler = false;       // records wait for the first registered handler
};

Follow& followOf(int node) {
    static Follow* state = new Follow[IPMI_NODE_COUNT];  // never destroyed: may run during exit
    return state[slotIndex(node)];
}

// Passes and deliveries running on this thread: a pass started from a
// handler (clearSel) leaves the delivery to the walk it interrupted, so
// every handler still sees the log in order.
thread_local int t_passDepth = 0;
thread_local int t_delivering = 0;

class Depth {
public:
    explicit Depth(int& d) : d_(d) { ++d_; }
    ~Depth() { --d_; }
    Depth(const Depth&) = delete;
    Depth& operator=(const Depth&) = delete;

private:
    int& d_;
};

struct PassBudget {
    PassBudget(int node, uint32_t records) : n(slot(node)), recordsLeft(std::min(records, kPassRecords)) {}
    bool stopped() const { return n.stopRequested.load(std::memory_order_acquire); }
    // Counts one failed attempt; false once the pass may spend no more.
    bool fail() { return --failuresLeft > 0 && !stopped(); }
    IpmiNode& n;
    int failuresLeft = kPassFailures;
    uint32_t recordsLeft;
};

uint32_t readEntry(int node, ipmiifc_sel_entry* entry, PassBudget* budget);
void appendRecord(int node, const ipmiifc_sel_entry& entry);
bool getAll(int node, bool* whole);
void deliverDue(int node);

ipmiifc_sel_info headerOf(const IpmiNode& n) {
    ipmiifc_sel_info h;
    static_assert(sizeof h == sizeof n.work.sel.header, "stored SEL header is the Get SEL Info answer");
    memcpy(&h, n.work.sel.header, sizeof h);
    return h;
}

// Stores an accepted Get SEL Info answer and the summary built from it; selMutex held.
void storeHeader(IpmiNode& n, const uint8_t* data, int node) {
    memcpy(n.work.sel.header, data, sel::info::size);
    ipmiifc_sel_info info = headerOf(n);
    ipmiifc_sel_alloc_info alloc;
    static_assert(sizeof alloc == sizeof n.work.sel.alloc_info, "stored allocation info is the answer");
    memcpy(&alloc, n.work.sel.alloc_info, sizeof alloc);
    n.sel = std::make_shared<IpmiSel>(&info, &alloc, node);
}

uint16_t storedEntryCount(IpmiNode& n) {
    TAV::MutexLock guard(n.selMutex);
    return sel::le16(n.work.sel.header + sel::info::entries);
}

// Empties the node's record list into `out` (released outside the lock).
// With `carry`, the records handled so far stay handled when read again.
void takeRecords(int node, std::vector<std::shared_ptr<IpmiSelData>>& out, bool carry) {
    IpmiNode& n = slot(node);
    Follow& f = followOf(node);
    TAV::MutexLock guard(n.selMutex);
    out.swap(n.selRecords);
    if (carry) {
        for (size_t i = 0; i < out.size() && i < f.handled.size(); ++i) {
            if (!f.handled[i]) f.pending.push_back(out[i]);  // its copy read again counts as handled
            f.carried.insert(keyOf(out[i]->record()));
        }
    }
    f.handled.clear();
    f.firstUnhandled = 0;
}

// The first answer since the node was set up: the log it finds is not news,
// unless a caller resumes delivery after a record of it.
void startFollowing(int node, uint16_t entries) {
    std::vector<std::shared_ptr<IpmiSelData>> previous;  // held from before a restart
    takeRecords(node, previous, false);
    Follow& f = followOf(node);
    TAV::MutexLock guard(slot(node).selMutex);
    f.carried.clear();
    f.pending.clear();
    f.readOn = false;
    f.cursorDue = f.resumeAfter.digest != 0;
    f.holdForHandler = f.cursorDue;
    f.foundAtStart = f.cursorDue ? 0 : entries;
}

// Drops the oldest records the controller no longer holds: a log that
// overwrites its oldest records keeps its erase stamp, and the list would
// otherwise grow without end. Only records already handled go.
void dropVanished(int node, uint16_t entries) {
    IpmiNode& n = slot(node);
    Follow& f = followOf(node);
    std::vector<std::shared_ptr<IpmiSelData>> gone;  // released outside the lock
    TAV::MutexLock guard(n.selMutex);
    size_t drop = 0;
    while (n.selRecords.size() - drop > entries && drop < f.handled.size() && f.handled[drop]) ++drop;
    if (drop == 0) return;
    gone.assign(n.selRecords.begin(), n.selRecords.begin() + static_cast<long>(drop));
    n.selRecords.erase(n.selRecords.begin(), n.selRecords.begin() + static_cast<long>(drop));
    f.handled.erase(f.handled.begin(), f.handled.begin() + static_cast<long>(drop));
    f.firstUnhandled = f.firstUnhandled > drop ? f.firstUnhandled - drop : 0;
}

// After a pass: a whole read ends what a reload carried, and places the
// resume cursor. The records up to the cursor's own reached a handler
// before the restart; when that record is gone, its time stamp tells.
void endPass(int node, bool whole) {
    IpmiNode& n = slot(node);
    Follow& f = followOf(node);
    TAV::MutexLock guard(n.selMutex);
    f.readOn = !whole;
    if (!whole) return;
    f.carried.clear();
    if (!f.cursorDue) return;
    const IpmiSelCursor c = f.resumeAfter;
    size_t match = n.selRecords.size();
    for (size_t i = 0; i < n.selRecords.size(); ++i) {
        const IpmiSelData& r = *n.selRecords[i];
        if (r.recordId() == c.recordId && IpmiSelCursor::digestOf(r.record()) == c.digest) match = i;
    }
    for (size_t i = 0; i < n.selRecords.size(); ++i) {
        const IpmiSelData& r = *n.selRecords[i];
        const bool before = match < n.selRecords.size() ? i <= match : r.messageTimeStamp() <= c.timestamp;
        f.handled[i] = !r.isSelEventRecord() || before;
    }
    f.firstUnhandled = 0;
    f.cursorDue = false;
    f.resumeAfter = IpmiSelCursor();
}

// Records read in one pass, to end a chain of next IDs that loops back.
class SeenIds {
public:
    bool insert(uint16_t id) {
        if (seen_.empty()) seen_.resize(0x10000);
        if (seen_[id]) return false;
        seen_[id] = true;
        return true;
    }
    bool contains(uint16_t id) const { return !seen_.empty() && seen_[id]; }

private:
    std::vector<bool> seen_;
};

enum class ChainEnd { LogEnd, Failed, Cut };

struct ChainWalk {
    ChainEnd end;
    uint32_t rc;      // the failed read's result
    uint8_t code;     // its last completion code
    bool atFirst;     // the read of the starting record failed
};

// Reads along the controller's next-ID chain from `from` (0: the first
// record) and appends each record read, but `from` itself when it is held
// already. Ends at the log's end, where the chain points back to a record
// of this walk, after `requests` reads, or when the pass's budget is spent
// (Cut). A failed read is asked again when `retry` (it counts as a
// request); otherwise it ends the walk.
ChainWalk walkChain(int node, uint16_t from, bool fromIsHeld, uint32_t requests, bool retry, PassBudget& budget) {
    ipmiifc_sel_entry entry;
    memset(&entry, 0, sizeof entry);
    sel::putLe16(entry.next_id, from);
    SeenIds seen;
    bool first = true;
    for (uint32_t request = 0; request < requests; ++request) {
        if (budget.stopped() || budget.recordsLeft == 0) break;
        const uint32_t rc = readEntry(node, &entry, &budget);
        if (rc != 0) {
            if (budget.failuresLeft <= 0 || budget.stopped()) break;
            if (retry) continue;
            return ChainWalk{ChainEnd::Failed, rc, entry.cc, first};
        }
        --budget.recordsLeft;
        if (!seen.insert(sel::le16(entry.record.record_id))) return ChainWalk{ChainEnd::LogEnd, 0, 0, false};
        if (!(first && fromIsHeld)) appendRecord(node, entry);
        first = false;
        const uint16_t next = sel::le16(entry.next_id);
        if (next == sel::lastRecord || seen.contains(next)) return ChainWalk{ChainEnd::LogEnd, 0, 0, false};
    }
    return ChainWalk{ChainEnd::Cut, 0, 0, false};
}

// Reads the log again from its start, keeping what was handled.
bool reload(int node) {
    std::vector<std::shared_ptr<IpmiSelData>> previous;  // released outside the lock
    takeRecords(node, previous, true);
    previous.clear();
    bool whole = false;
    getAll(node, &whole);
    return whole;
}

}  // namespace

// ---- Following the controller's SEL -----------------------------------------

uint32_t IpmiIfcSelGetInfo(int node, uint16_t* count) {
    RespHolder r(IpmiIfcSendCmd(node, cmd::getSelInfo, netfn::storage, 0, 0, nullptr, 0));
    if (!r) return kSelFailed;
    if (r->cc != 0) {
        // Busy, not present and erase in progress are normal while the controller starts.
        if (r->cc != cc::nodeBusy && r->cc != cc::requestedSensorNotPresent && r->cc != cc::eraseInProgress)
            ipmiLog(LOG_WARNING, "%s: IPMI_CMD_GET_SEL_INFO cc=0x%x", "IpmiIfcSelGetInfo", r->cc);
        return kSelFailed;
    }
    return IpmiIfcRhSelInfo(r.get(), count);
}

// `count` gets only the low byte of the entry count: a log of 300 entries
// reports 44. The polling loop compares counts from pass to pass and relies on this.
//
// Unchanged stamps and count mean nothing new, unless the last pass stopped
// short. Otherwise the records after the last one read are read (the erase
// stamp kept), or the whole log again (it moved, or command-line mode).
uint32_t IpmiIfcRhSelInfo(ipmiifc_resp* resp, uint16_t* count) {
    if (resp == nullptr || resp->cc != 0 || resp->data_len < sel::info::size) return kSelFailed;
    if (count) *count = resp->data[sel::info::entries];
    const int node = resp->node;
    IpmiNode& n = slot(node);
    Follow& f = followOf(node);
    std::lock_guard<std::recursive_mutex> pass(f.pass);
    Depth depth(t_passDepth);
    const bool cli = _getState(0) == IpmiIfc::IPMI_STATE_CLI;
    const uint32_t newAdd = sel::le32(resp->data + sel::info::additionTimestamp);
    const uint32_t newErase = sel::le32(resp->data + sel::info::eraseTimestamp);
    const uint16_t newCount = sel::le16(resp->data + sel::info::entries);
    uint32_t oldAdd, oldErase;
    uint16_t oldCount, last;
    bool nothingStored, readOn;
    {
        TAV::MutexLock guard(n.selMutex);
        const ipmiifc_sel_info stored = headerOf(n);
        oldAdd = stored.addition_timestamp;
        oldErase = stored.erase_timestamp;
        oldCount = stored.entries;
        nothingStored = stored.version == 0 && oldAdd == 0 && oldErase == 0;
        last = n.work.sel.last_record_id;
        readOn = f.readOn;
    }
    // Stamps count seconds: a grown count is news within the same second too.
    if (!cli && oldAdd == newAdd && oldErase == newErase && oldCount == newCount && !readOn) return 0;
    if (nothingStored) startFollowing(node, newCount);

    bool whole;
    if (!cli && oldErase == newErase) {
        dropVanished(node, newCount);
        IpmiIfcSelReserve(node);
        PassBudget budget(node, static_cast<uint32_t>(newCount) + 1);
        const ChainWalk w = walkChain(node, last, last != 0, static_cast<uint32_t>(newCount) + 1, false, budget);
        if (w.end == ChainEnd::Failed && w.atFirst && w.code == cc::requestedSensorNotPresent && last != 0) {
            // The last record read is gone with the erase stamp unchanged: the
            // log overwrote its oldest records. Reading on from it would fail
            // on every pass; only the log's start tells where it goes on.
            {
                TAV::MutexLock guard(n.selMutex);
                storeHeader(n, resp->data, node);
                n.work.sel.last_record_id = 0;
            }
            whole = reload(node);
        } else {
            if (w.end == ChainEnd::Failed && !w.atFirst)
                ipmiLog(LOG_ERR, "%s: failed call to IpmiIfcSelReadEntry cc = 0x%x", "IpmiIfcSelReadNew", w.rc & 0xFF);
            whole = w.end == ChainEnd::LogEnd;
        }
        TAV::MutexLock guard(n.selMutex);
        storeHeader(n, resp->data, node);
    } else {
        {
            TAV::MutexLock guard(n.selMutex);
            storeHeader(n, resp->data, node);
            n.work.sel.last_record_id = 0;
            // A cleared log holds nothing of the one found at start.
            if (!nothingStored) f.foundAtStart = 0;
        }
        IpmiIfcSelReserve(node);
        whole = reload(node);
    }
    endPass(node, whole);
    if (t_delivering == 0) deliverDue(node);
    return 0;
}

int IpmiIfcRhSelInfoNoCount(ipmiifc_resp* resp) { return static_cast<int>(IpmiIfcRhSelInfo(resp, nullptr)); }

int IpmiIfcRhSelGetAllocInfo(ipmiifc_resp* resp) {
    if (resp == nullptr) return -1;
    if (resp->cc != 0) {
        ipmiLog(LOG_DEBUG, "%s: BMC returned cc=0x%x", "IpmiIfcRhSelGetAllocInfo", resp->cc);
        return -1;
    }
    IpmiNode& n = slot(resp->node);
    TAV::MutexLock guard(n.selMutex);
    uint8_t* store = n.work.sel.alloc_info;
    const size_t size = sizeof n.work.sel.alloc_info;
    memset(store, 0, size);
    memcpy(store, resp->data, resp->data_len < size ? resp->data_len : size);
    return 0;
}

uint32_t IpmiIfcSelGetAll(int node) { return getAll(node, nullptr) ? 0 : kSelFailed; }

// At most as many reads as the controller says it holds records; a failed
// read asks for the same record again.
uint32_t IpmiIfcSelReadAll(int node) {
    const uint32_t count = storedEntryCount(slot(node));
    if (count == 0) return kSelFailed;
    PassBudget budget(node, count);
    walkChain(node, sel::firstRecord, false, count, true, budget);
    return 0;
}

namespace {

// Full reload with the version check. Inside a pass the header was just
// stored: a version of 0 is the controller's own, and asking Get SEL Info
// again would start the same reload again, without end.
bool getAll(int node, bool* whole) {
    // Logged once per process, whatever the node.
    static std::atomic<bool> _invalid_version_logged{false};
    IpmiNode& n = slot(node);
    uint8_t version;
    {
        TAV::MutexLock guard(n.selMutex);
        version = n.work.sel.header[sel::info::version];
    }
    if (version == 0 && t_passDepth == 0) {
        if (IpmiIfcSelGetInfo(node, nullptr) != 0) return false;
        TAV::MutexLock guard(n.selMutex);
        version = n.work.sel.header[sel::info::version];
    }
    uint16_t reservation;
    {
        TAV::MutexLock guard(n.selMutex);
        reservation = n.work.sel.reservation;
    }
    if (reservation == 0) IpmiIfcSelReserve(node);
    if (version != sel::supportedVersion && (version & 0x0F) < kRecordIdVersionNibbleMin) {
        if (!_invalid_version_logged.exchange(true)) {
            ipmiLog(LOG_ERR, "IpmiIfcSelGetAll: invalid version. Version = 0x%x", version);
        }
        if (whole) *whole = true;  // nothing more to read from this log
        return false;
    }
    const uint32_t count = storedEntryCount(n);
    if (count == 0) {
        ipmiLog(LOG_ERR, "IpmiIfcSelGetAll: node %d no record count", node);
        if (whole) *whole = true;
        return false;
    }
    PassBudget budget(node, count);
    const ChainWalk w = walkChain(node, sel::firstRecord, false, count, true, budget);
    if (whole) *whole = w.end == ChainEnd::LogEnd;
    return true;
}

}  // namespace

// ---- Reading records ---------------------------------------------------------

uint32_t IpmiIfcSelReserve(int node) {
    RespHolder r(IpmiIfcSendCmd(node, cmd::reserveSel, netfn::storage, 0, 0, nullptr, 0));
    if (!r) {
        ipmiLog(LOG_WARNING, "Transmit issue for IPMI SEL Reserve node %d", node);
        return kSelFailed;
    }
    if (r->cc == cc::nodeBusy) {
        sleep(kBusySeconds);
        return kSelFailed;
    }
    if (r->cc == cc::invalidCommand) {
        ipmiLog(LOG_DEBUG, "node: %d reserve sel command is not supported", node);
        return kSelFailed;
    }
    if (r->cc != 0 || r->data_len < sel::reserveAnswer::size) {
        ipmiLog(LOG_WARNING, "node: %d reserve sel failed cc 0x%x", node, r->cc);
        return kSelFailed;
    }
    IpmiNode& n = slot(node);
    TAV::MutexLock guard(n.selMutex);
    n.work.sel.reservation = sel::le16(r->data + sel::reserveAnswer::reservation);
    return 0;
}

uint32_t IpmiIfcSelReadEntry(int node, ipmiifc_sel_entry* entry) { return readEntry(node, entry, nullptr); }

namespace {

// The record is read in chunks from its end towards its start: a short chunk
// takes the tail of what is still missing. Every answer must name the record
// asked for in its first two bytes, also a tail chunk's whose first bytes are
// no record ID; so a record asked for by ID that needs chunks never completes.
// Firmware has always been read this way. A pass's budget, when given, ends
// the read early once the pass may spend no more; on failure entry->cc holds
// the last completion code (0xFF: no answer).
uint32_t readEntry(int node, ipmiifc_sel_entry* entry, PassBudget* budget) {
    IpmiNode& n = slot(node);
    const uint16_t wanted = sel::le16(entry->next_id);
    uint8_t record[sel::recordSize];
    uint8_t nextId[2] = {0, 0};
    uint8_t lastCode = 0;
    size_t remaining = sel::recordSize;
    size_t chunk = sel::recordSize;
    while (remaining > 0) {
        bool accepted = false;
        for (int attempt = 0; attempt < kChunkAttempts && !accepted; ++attempt) {
            if (attempt > 0 && budget && !budget->fail()) break;
            const size_t count = std::min(chunk, remaining);
            const size_t offset = remaining - count;
            uint8_t request[sel::entryRequest::size];
            {
                TAV::MutexLock guard(n.selMutex);
                sel::putLe16(request + sel::entryRequest::reservation, n.work.sel.reservation);
            }
            sel::putLe16(request + sel::entryRequest::recordId, wanted);
            request[sel::entryRequest::offset] = static_cast<uint8_t>(offset);
            request[sel::entryRequest::count] = static_cast<uint8_t>(count);
            RespHolder r(IpmiIfcSendCmd(node, cmd::getSelEntry, netfn::storage, 0, sizeof request, request, 0));
            if (!r) {
                lastCode = 0xFF;
                continue;
            }
            lastCode = r->cc;
            switch (r->cc) {
            case cc::ok:
                break;
            case cc::reservationCancelled:
                r.reset(nullptr);
                sleepTimeAnd3();
                if (IpmiIfcSelReserve(node) != 0) {
                    TAV::MutexLock guard(n.selMutex);
                    n.work.sel.reservation = 0;
                }
                sleepTimeAnd3();
                continue;
            case cc::cannotReturnRequestedBytes:
            case cc::requestDataLengthInvalid:
                if (chunk > 1) --chunk;
                continue;
            case cc::nodeBusy:
                sleep(kBusySeconds);
                continue;
            default:
                continue;
            }
            const bool rightLength = r->data_len == count + sel::entryAnswer::data;
            if (!rightLength || (wanted != 0 && sel::le16(r->data + sel::entryAnswer::data) != wanted)) {
                sleepTimeAnd3();
                continue;
            }
            memcpy(record + offset, r->data + sel::entryAnswer::data, count);
            memcpy(nextId, r->data + sel::entryAnswer::nextRecordId, sizeof nextId);
            remaining -= count;
            accepted = true;
        }
        if (!accepted) {
            if (budget) budget->fail();  // the last attempt failed too
            entry->cc = lastCode;
            return kSelFailed;
        }
    }
    if (lastCode == cc::requestedSensorNotPresent) return kSelFailed;
    if (lastCode != 0) {
        ipmiLog(LOG_ERR, "%s:error ccode 0x%x.", "IpmiIfcSelReadEntry", lastCode);
        return kSelFailed;
    }
    entry->cc = lastCode;
    memcpy(entry->next_id, nextId, sizeof nextId);
    memcpy(&entry->record, record, sizeof record);
    return 0;
}

// Puts one record read into the list with its mark; selMutex not held.
void appendRecord(int node, const ipmiifc_sel_entry& entry) {
    IpmiNode& n = slot(node);
    Follow& f = followOf(node);
    sel_event_record bytes = entry.record;
    auto record = std::make_shared<IpmiSelData>(&bytes, 0);
    bool handled = !record->isSelEventRecord();  // only event records are delivered
    TAV::MutexLock guard(n.selMutex);
    if (f.foundAtStart > 0) {
        --f.foundAtStart;
        handled = true;
    } else if (!f.carried.empty() && f.carried.count(keyOf(entry.record)) != 0) {
        handled = true;
    }
    n.selRecords.push_back(std::move(record));
    f.handled.push_back(handled ? 1 : 0);
    n.work.sel.last_record_id = sel::le16(entry.record.record_id);
}

// The next record to hand over, marked handled; null when none is due. Records
// a reload took out of the list come first: they are older than any in it.
std::shared_ptr<IpmiSelData> takeNextDue(IpmiNode& n, Follow& f, bool anyHandler) {
    TAV::MutexLock guard(n.selMutex);
    if (f.cursorDue || (f.holdForHandler && !anyHandler)) return nullptr;
    std::shared_ptr<IpmiSelData> record;
    if (!f.pending.empty()) {
        record = std::move(f.pending.front());
        f.pending.erase(f.pending.begin());
    } else {
        size_t i = f.firstUnhandled;
        while (i < f.handled.size() && f.handled[i]) ++i;
        f.firstUnhandled = i;
        if (i >= n.selRecords.size() || i >= f.handled.size()) return nullptr;
        f.handled[i] = 1;
        record = n.selRecords[i];
    }
    f.holdForHandler = false;
    return record;
}

// Hands every record not yet handled to the handlers, oldest first, marking
// it before the call: a pass that a handler starts (clearSel) finds it
// handled. The list is looked at again after every record, so records
// appended meanwhile, or a list a nested pass rebuilt, are followed too.
void deliverDue(int node) {
    if (_getState(0) == IpmiIfc::IPMI_STATE_CLI) return;
    IpmiNode& n = slot(node);
    Follow& f = followOf(node);
    const bool anyHandler = IpmiIfcSelHasHandlers();
    Depth delivering(t_delivering);
    while (std::shared_ptr<IpmiSelData> record = takeNextDue(n, f, anyHandler))
        IpmiIfcSelDeliverToHandlers(record.get());
}

}  // namespace

void IpmiIfcSelGenerateEvents(int node) { deliverDue(node); }

void IpmiIfcSelDropRecords(int node) {
    std::vector<std::shared_ptr<IpmiSelData>> gone;  // released outside the lock
    takeRecords(node, gone, false);
}

void IpmiIfc::resumeSelDelivery(int node, const IpmiSelCursor& after) {
    Follow& f = followOf(node);
    TAV::MutexLock guard(slot(node).selMutex);
    f.resumeAfter = after;
}

bool IpmiIfc::generatesMemoryEvents(int node) {
    return __atomic_load_n(&slot(node).work.memory_events, __ATOMIC_ACQUIRE) != 0;
}

// ---- Public SEL entry points -------------------------------------------------

std::shared_ptr<IpmiSel> IpmiIfc::getSel(int node) {
    IpmiNode& n = slot(node);
    TAV::MutexLock guard(n.selMutex);
    return n.sel;
}

std::shared_ptr<IpmiSel> IpmiIfc::getSel() { return getSel(0); }

std::vector<std::shared_ptr<IpmiSelData>> IpmiIfc::getSelData(int node) {
    IpmiNode& n = slot(node);
    TAV::MutexLock guard(n.selMutex);
    return n.selRecords;
}

std::vector<std::shared_ptr<IpmiSelData>> IpmiIfc::getSelData() { return getSelData(0); }

ipmiifc_sel_info IpmiIfc::getRawSelHeader(int node) {
    IpmiNode& n = slot(node);
    TAV::MutexLock guard(n.selMutex);
    return headerOf(n);
}

ipmiifc_sel_info IpmiIfc::getRawSelHeader() { return getRawSelHeader(0); }

// The request keeps the reservation it was built with, also after a
// cancelled reservation was renewed: controllers have always been asked so.
int IpmiIfc::clearSel(int node) {
    IpmiNode& n = slot(node);
    IpmiIfcSelReserve(node);
    uint8_t request[sel::clearRequest::size];
    {
        TAV::MutexLock guard(n.selMutex);
        sel::putLe16(request + sel::clearRequest::reservation, n.work.sel.reservation);
    }
    request[sel::clearRequest::signature] = 'C';
    request[sel::clearRequest::signature + 1] = 'L';
    request[sel::clearRequest::signature + 2] = 'R';
    request[sel::clearRequest::action] = sel::clearRequest::initiateErase;
    RespHolder r;
    for (int attempt = 0;; ++attempt) {
        if (attempt == kClearAttempts) return SEL_CLEAR_NOT_CONFIRMED;
        {
            TAV::MutexLock guard(n.selMutex);
            r.reset(IpmiIfcSendCmd(node, cmd::clearSel, netfn::storage, 0, sizeof request, request, 0));
        }
        if (!r) return SEL_CLEAR_NO_ANSWER;
        if (r->cc == cc::ok) break;
        if (r->cc == cc::nodeBusy) {
            r.reset(nullptr);
            sleep(kClearBusySeconds);
            continue;
        }
        if (r->cc == cc::reservationCancelled) {
            IpmiIfcSelReserve(node);
            continue;
        }
        ipmiLog(LOG_ERR, "%s: Failed with completion code = 0x%x", "clearSel", r->cc);
        return SEL_CLEAR_REFUSED;
    }
    // An answer without the status byte is as unexpected as an unknown status.
    const uint8_t status = r->data_len > sel::clearAnswer::status
                               ? (r->data[sel::clearAnswer::status] & sel::clearAnswer::statusMask)
                               : sel::clearAnswer::statusMask;
    const uint8_t code = r->cc;
    r.reset(nullptr);
    if (status == sel::clearAnswer::completed || status == sel::clearAnswer::inProgress) {
        IpmiIfcSelGetInfo(node, nullptr);
        return SEL_CLEAR_OK;
    }
    ipmiLog(LOG_ERR, "%s: unspecified error cc = 0x%x, erasure status = 0x%x", "clearSel", code, status);
    IpmiIfcSelGetInfo(node, nullptr);
    return SEL_CLEAR_NOT_CONFIRMED;
}

int IpmiIfc::clearSel() { return clearSel(0); }

uint16_t IpmiIfc::getLastProcessedSELEntry(int node) {
    RespHolder r(IpmiIfcSendCmd(node, cmd::getLastProcessedEventId, netfn::sensorEvent, 0, 0, nullptr, 0));
    if (!r) {
        ipmiLog(LOG_DEBUG, "Failed to send get last processed SEL entry");
        return 0;
    }
    if (r->cc != 0) {
        ipmiLog(LOG_DEBUG, "Failed get last processed SEL entry request 0x%x", r->cc);
        return 0;
    }
    if (r->data_len < sel::lastProcessed::answerSoftware + 2) {
        ipmiLog(LOG_DEBUG, "get last processed SEL entry response too short (%d)", static_cast<int>(r->data_len));
        return 0;
    }
    const uint16_t id = sel::le16(r->data + sel::lastProcessed::answerSoftware);
    return id == sel::lastRecord ? 0 : id;
}

uint16_t IpmiIfc::getLastProcessedSELEntry() { return getLastProcessedSELEntry(0); }

void IpmiIfc::setLastProcessedSELEntry(int node, uint16_t id) {
    uint8_t request[sel::lastProcessed::requestSize];
    request[sel::lastProcessed::selector] = sel::lastProcessed::softwareId;
    sel::putLe16(request + sel::lastProcessed::recordId, id);
    RespHolder r(
        IpmiIfcSendCmd(node, cmd::setLastProcessedEventId, netfn::sensorEvent, 0, sizeof request, request, 0));
    if (!r)
        ipmiLog(LOG_DEBUG, "Failed to send set SEL last processed");
    else if (r->cc != 0)
        ipmiLog(LOG_DEBUG, "Failed set SEL last processed 0x%x", r->cc);
}

void IpmiIfc::setLastProcessedSELEntry(uint16_t id) { setLastProcessedSELEntry(0, id); }

// On a descriptor of its own: the node's device stays with the polling loop.
uint32_t IpmiIfc::selGetClock(int node) {
    const int fd = IpmiSelDirectOpen();
    if (fd < 0) return 0;
    uint8_t answer[IPMIIFC_RESP_MAX];
    size_t length = sizeof answer;
    const bool answered = IpmiSelDirectTransaction(fd, netfn::storage, cmd::getSelTime, nullptr, 0, answer, &length);
    IpmiSelDirectClose(fd);
    if (!answered || length == 0 || answer[0] != 0) {
        ipmiLog(LOG_ERR, "%s: IPMI_CMD_GET_SEL_TIME for node %d failed %x", "GetSelClock", node,
                answered && length > 0 ? answer[0] : 0);
        return 0;
    }
    return length >= sel::timeAnswer::size ? sel::le32(answer + sel::timeAnswer::seconds) : 0;
}

uint32_t IpmiIfc::GetSelClock() { return selGetClock(0); }

}  // namespace Ipmi
