// SEL access: follows the controller's SEL from the Get SEL Info answers that
// the polling loop asks for, reads new records, and hands each new event
// record to the registered handlers; plus the public SEL entry points.

#include "IpmiIfcSel.h"

#include <string.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <mutex>
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

// Results of registering and unregistering a handler.
constexpr int kHandlerOk = 0;
constexpr int kHandlerNotRegistered = 2;
constexpr int kHandlerMissing = 5;


IpmiNode& slot(int node) { return g_IpmiNode[(node >= 0 && node < IPMI_NODE_COUNT) ? node : 0]; }
int slotIndex(int node) { return (node >= 0 && node < IPMI_NODE_COUNT) ? node : 0; }

// Sleeps a pseudo-random 0-3 seconds, as the retry rules want.
void sleepTimeAnd3() { sleep(static_cast<unsigned>(time(nullptr) & 3)); }

// Makes the passes of one node run one at a time (a handler that clears the
// SEL starts a nested pass on its own thread).
struct SelFollow {
    std::recursive_mutex follow;
};

SelFollow& followOf(int node) {
    static SelFollow* state = new SelFollow[IPMI_NODE_COUNT];  // never destroyed: may run during exit
    return state[slotIndex(node)];
}

// Handler walks of node 0's list. Entries unlinked while a walk runs get a
// null function at once, so no walk calls them after unRegister returns, and
// are freed only when no walk runs, so a walk standing on one goes on safely.
struct HandlerWalks {
    int walks = 0;
    std::vector<ipmiifc_sel_handler*> retired;
    struct Call {
        const ipmiifc_sel_handler* entry;
        pthread_t thread;
    };
    std::vector<Call> calls;  // handler calls running now
    pthread_cond_t callEnded = PTHREAD_COND_INITIALIZER;
};

HandlerWalks& handlerWalks() {
    static HandlerWalks* walks = new HandlerWalks();  // never destroyed: may run during exit
    return *walks;
}

// Takes an entry out of use; selMutex held.
void retire(HandlerWalks& w, ipmiifc_sel_handler* e) {
    e->handler = nullptr;
    if (w.walks > 0)
        w.retired.push_back(e);
    else
        delete e;
}

bool runningElsewhere(const HandlerWalks& w, const ipmiifc_sel_handler* e) {
    for (const auto& c : w.calls)
        if (c.entry == e && !pthread_equal(c.thread, pthread_self())) return true;
    return false;
}

// Scope of one walk, and of one handler call within it; both run with
// selMutex held at construction and destruction.
class WalkScope {
public:
    explicit WalkScope(HandlerWalks& w) : w_(w) { ++w_.walks; }
    ~WalkScope() {
        if (--w_.walks > 0) return;
        for (ipmiifc_sel_handler* e : w_.retired) delete e;
        w_.retired.clear();
    }
    WalkScope(const WalkScope&) = delete;
    WalkScope& operator=(const WalkScope&) = delete;

private:
    HandlerWalks& w_;
};

class CallScope {
public:
    CallScope(HandlerWalks& w, const ipmiifc_sel_handler* e) : w_(w), e_(e) {
        w_.calls.push_back(HandlerWalks::Call{e, pthread_self()});
    }
    ~CallScope() {
        for (auto it = w_.calls.begin(); it != w_.calls.end(); ++it) {
            if (it->entry == e_ && pthread_equal(it->thread, pthread_self())) {
                w_.calls.erase(it);
                break;
            }
        }
        pthread_cond_broadcast(&w_.callEnded);
    }
    CallScope(const CallScope&) = delete;
    CallScope& operator=(const CallScope&) = delete;

private:
    HandlerWalks& w_;
    const ipmiifc_sel_handler* e_;
};

// Releases a held mutex for a scope.
class Unlocked {
public:
    explicit Unlocked(TAV::Mutex& m) : m_(m) { pthread_mutex_unlock(m_.native()); }
    ~Unlocked() { pthread_mutex_lock(m_.native()); }
    Unlocked(const Unlocked&) = delete;
    Unlocked& operator=(const Unlocked&) = delete;

private:
    TAV::Mutex& m_;
};

// Beside each node's record list, under its selMutex: the latest event time
// stamp among the records up to each position. Delivery starts where that
// first passes `since`: every record before holds nothing newer, so a log of
// thousands is not looked through for the one record that came.
std::vector<uint32_t> g_latestStampUpTo[IPMI_NODE_COUNT];

std::vector<uint32_t>& latestStampUpTo(const IpmiNode& n) { return g_latestStampUpTo[&n - g_IpmiNode]; }

// Empties the node's record list into `out` (released outside the lock).
void takeRecords(IpmiNode& n, std::vector<std::shared_ptr<IpmiSelData>>& out) {
    TAV::MutexLock guard(n.selMutex);
    out.swap(n.selRecords);
    latestStampUpTo(n).clear();
}

// Puts one record read into the list; selMutex not held.
void appendRecord(int node, ipmiifc_sel_entry& entry) {
    IpmiNode& n = slot(node);
    auto record = std::make_shared<IpmiSelData>(&entry.record, 0);
    const uint32_t stamp = record->isSelEventRecord() ? record->messageTimeStamp() : 0;
    TAV::MutexLock guard(n.selMutex);
    std::vector<uint32_t>& latest = latestStampUpTo(n);
    latest.push_back(latest.empty() || latest.back() < stamp ? stamp : latest.back());
    n.selRecords.push_back(std::move(record));
    n.work.sel.last_record_id = sel::le16(entry.record.record_id);
}

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

// Records read in one pass, to end a chain of next IDs that loops back.
class SeenIds {
public:
    bool insert(uint16_t id) {
        if (seen_.empty()) seen_.resize(0x10000);
        if (seen_[id]) return false;
        seen_[id] = true;
        return true;
    }

private:
    std::vector<bool> seen_;
};

// Reads the records after `last` (all of them from 0), at most `limit`
// requests, and stops where the next ID points back to a record of this pass.
uint32_t readNew(int node, uint16_t last, uint32_t limit) {
    ipmiifc_sel_entry entry;
    memset(&entry, 0, sizeof entry);
    sel::putLe16(entry.next_id, last);
    uint32_t rc = IpmiIfcSelReadEntry(node, &entry);
    if (rc != 0) return rc;
    SeenIds seen;
    seen.insert(sel::le16(entry.record.record_id));
    if (last == 0) appendRecord(node, entry);
    for (uint32_t requests = 1;; ++requests) {
        const uint16_t next = sel::le16(entry.next_id);
        if (next == sel::lastRecord || !seen.insert(next) || requests >= limit) return 0;
        rc = IpmiIfcSelReadEntry(node, &entry);
        if (rc != 0) {
            ipmiLog(LOG_ERR, "%s: failed call to IpmiIfcSelReadEntry cc = 0x%x", "IpmiIfcSelReadNew", rc & 0xFF);
            return rc;
        }
        appendRecord(node, entry);
    }
}

}  // namespace

// ---- Controller requests ---------------------------------------------------

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

// The record is read in chunks from its end towards its start: a short chunk
// takes the tail of what is still missing. Every answer must name the record
// asked for in its first two bytes, also a tail chunk's whose first bytes are
// no record ID; so a record asked for by ID that needs chunks never completes.
// Firmware has always been read this way.
uint32_t IpmiIfcSelReadEntry(int node, ipmiifc_sel_entry* entry) {
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
            if (!r) continue;
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
            lastCode = r->cc;
            remaining -= count;
            accepted = true;
        }
        if (!accepted) return kSelFailed;
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

// At most as many reads as the controller says it holds records; a chain of
// next IDs that loops back ends at the first record read twice.
uint32_t IpmiIfcSelReadAll(int node) {
    const uint32_t count = storedEntryCount(slot(node));
    if (count == 0) return kSelFailed;
    ipmiifc_sel_entry entry;
    memset(&entry, 0, sizeof entry);
    SeenIds seen;
    for (uint32_t attempt = 0; attempt < count; ++attempt) {
        if (IpmiIfcSelReadEntry(node, &entry) != 0) continue;  // the same record is asked for again
        if (!seen.insert(sel::le16(entry.record.record_id))) break;
        appendRecord(node, entry);
        const uint16_t next = sel::le16(entry.next_id);
        if (next == sel::lastRecord) break;
    }
    return 0;
}

uint32_t IpmiIfcSelReadNew(int node, uint16_t last) {
    return readNew(node, last, static_cast<uint32_t>(storedEntryCount(slot(node))) + 1);
}

uint32_t IpmiIfcSelGetAll(int node) {
    // Logged once per process, whatever the node.
    static std::atomic<bool> _invalid_version_logged{false};
    IpmiNode& n = slot(node);
    uint8_t version;
    {
        TAV::MutexLock guard(n.selMutex);
        version = n.work.sel.header[sel::info::version];
    }
    if (version == 0) {
        if (IpmiIfcSelGetInfo(node, nullptr) != 0) return kSelFailed;
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
        return kSelFailed;
    }
    if (storedEntryCount(n) == 0) {
        ipmiLog(LOG_ERR, "IpmiIfcSelGetAll: node %d no record count", node);
        return kSelFailed;
    }
    return IpmiIfcSelReadAll(node);
}

// ---- Following the controller's SEL -----------------------------------------

// `count` gets only the low byte of the entry count: a log of 300 entries
// reports 44. The polling loop compares counts from pass to pass and relies on this.
//
// New records are told by time: records stamped at or before the addition
// stamp the pass started from (`since`) are not delivered. So the log found
// by the first answer loads without reaching any handler (`since` is then
// the controller's own stamp), and a record reaches the handlers once, in
// the pass that reads it.
uint32_t IpmiIfcRhSelInfo(ipmiifc_resp* resp, uint16_t* count) {
    if (resp == nullptr || resp->cc != 0 || resp->data_len < sel::info::size) return kSelFailed;
    if (count) *count = resp->data[sel::info::entries];
    const int node = resp->node;
    IpmiNode& n = slot(node);
    std::lock_guard<std::recursive_mutex> pass(followOf(node).follow);
    const bool cli = _getState(0) == IpmiIfc::IPMI_STATE_CLI;
    const uint32_t newAdd = sel::le32(resp->data + sel::info::additionTimestamp);
    const uint32_t newErase = sel::le32(resp->data + sel::info::eraseTimestamp);
    const uint16_t newCount = sel::le16(resp->data + sel::info::entries);
    uint32_t oldAdd, oldErase;
    uint16_t last;
    bool nothingStored;
    {
        TAV::MutexLock guard(n.selMutex);
        const ipmiifc_sel_info stored = headerOf(n);
        oldAdd = stored.addition_timestamp;
        oldErase = stored.erase_timestamp;
        nothingStored = stored.version == 0 && oldAdd == 0 && oldErase == 0;
        last = n.work.sel.last_record_id;
    }
    if (!cli && oldAdd == newAdd && oldErase == newErase) return 0;
    const uint32_t since = oldAdd != 0 ? oldAdd : newAdd;

    std::vector<std::shared_ptr<IpmiSelData>> previous;  // released outside the lock
    if (!cli && oldErase == newErase) {
        // Records held from before a restart would be read again behind themselves.
        if (nothingStored) takeRecords(n, previous);
        previous.clear();
        IpmiIfcSelReserve(node);
        readNew(node, last, static_cast<uint32_t>(newCount) + 1);
        {
            TAV::MutexLock guard(n.selMutex);
            storeHeader(n, resp->data, node);
        }
        IpmiIfcSelGenerateEvents(node, since);
        return 0;
    }

    {
        TAV::MutexLock guard(n.selMutex);
        storeHeader(n, resp->data, node);
        n.work.sel.last_record_id = 0;
    }
    IpmiIfcSelReserve(node);
    takeRecords(n, previous);
    previous.clear();
    IpmiIfcSelGetAll(node);
    IpmiIfcSelGenerateEvents(node, since);
    return 0;
}

void IpmiIfcSelDropRecords(int node) {
    std::vector<std::shared_ptr<IpmiSelData>> gone;  // released outside the lock
    takeRecords(slot(node), gone);
}

int IpmiIfcRhSelInfoNoCount(ipmiifc_resp* resp) { return static_cast<int>(IpmiIfcRhSelInfo(resp, nullptr)); }

// Hands the event records stamped after `sinceTimestamp` to the handlers,
// oldest first (0xFFFFFFFF: every event record). The list's length is read
// again after each record, so records appended meanwhile are visited too.
uint32_t IpmiIfcSelGenerateEvents(int node, uint32_t sinceTimestamp) {
    if (_getState(0) == IpmiIfc::IPMI_STATE_CLI) return 0;
    IpmiNode& n = slot(node);
    auto due = [sinceTimestamp](const IpmiSelData& r) {
        return r.isSelEventRecord() && (r.messageTimeStamp() > sinceTimestamp || sinceTimestamp == 0xFFFFFFFF);
    };
    for (size_t i = 0;; ++i) {
        std::shared_ptr<IpmiSelData> record;
        {
            // Records not due are passed over under one lock.
            TAV::MutexLock guard(n.selMutex);
            const std::vector<uint32_t>& latest = latestStampUpTo(n);
            if (i == 0 && sinceTimestamp != 0xFFFFFFFF && latest.size() == n.selRecords.size())
                i = static_cast<size_t>(std::upper_bound(latest.begin(), latest.end(), sinceTimestamp) - latest.begin());
            while (i < n.selRecords.size() && !due(*n.selRecords[i])) ++i;
            if (i >= n.selRecords.size()) return 0;
            record = n.selRecords[i];
        }
        IpmiIfcSelCallHandlers(record.get());
    }
}

// ---- Handlers ------------------------------------------------------------------

void IpmiIfcSelCallHandlers(IpmiSelData* record) {
    IpmiNode& n = g_IpmiNode[0];
    HandlerWalks& w = handlerWalks();
    TAV::MutexLock guard(n.selMutex);
    WalkScope walk(w);
    for (ipmiifc_sel_handler* e = n.work.sel_handlers; e; e = e->next) {
        const IpmiSelEventHandler handler = e->handler;
        if (handler == nullptr) continue;
        void* const context = e->context;
        CallScope call(w, e);
        Unlocked unlocked(n.selMutex);
        handler(context, record);
    }
}

// Registration always uses node 0's list, whatever node is named.
int IpmiIfc::registerSelEventHandler(int, IpmiSelEventHandler handler, void* context) {
    if (handler == nullptr) return kHandlerMissing;
    IpmiNode& n = g_IpmiNode[0];
    TAV::MutexLock guard(n.selMutex);
    for (ipmiifc_sel_handler* e = n.work.sel_handlers; e; e = e->next)
        if (e->handler == handler) return kHandlerOk;  // contexts are not compared
    n.work.sel_handlers = new ipmiifc_sel_handler{n.work.sel_handlers, handler, context};
    return kHandlerOk;
}

int IpmiIfc::registerSelEventHandler(IpmiSelEventHandler handler, void* context) {
    return registerSelEventHandler(0, handler, context);
}

// A match behind the head is unlinked by pointing the HEAD past it, so any
// entries between the head and the match leave the list too. Kept on purpose.
// Returns once no other thread runs the handler any more, so the caller may
// free its context; a handler that unregisters itself does not wait for itself.
int IpmiIfc::unRegisterSelEventHandler(int, IpmiSelEventHandler handler) {
    if (handler == nullptr) return kHandlerMissing;
    IpmiNode& n = g_IpmiNode[0];
    HandlerWalks& w = handlerWalks();
    TAV::MutexLock guard(n.selMutex);
    ipmiifc_sel_handler* head = n.work.sel_handlers;
    if (head == nullptr) return kHandlerNotRegistered;
    ipmiifc_sel_handler* match = nullptr;
    if (head->handler == handler) {
        match = head;
        n.work.sel_handlers = head->next;
    } else {
        for (ipmiifc_sel_handler* e = head->next; e; e = e->next) {
            if (e->handler != handler) continue;
            match = e;
            for (ipmiifc_sel_handler* cut = head->next; cut != e;) {
                ipmiifc_sel_handler* following = cut->next;
                retire(w, cut);
                cut = following;
            }
            head->next = e->next;
            break;
        }
    }
    if (match == nullptr) return kHandlerNotRegistered;
    match->handler = nullptr;  // a walk standing before it no longer calls it
    while (runningElsewhere(w, match)) pthread_cond_wait(&w.callEnded, n.selMutex.native());
    retire(w, match);
    return kHandlerOk;
}

int IpmiIfc::unRegisterSelEventHandler(IpmiSelEventHandler handler) { return unRegisterSelEventHandler(0, handler); }

void IpmiIfcSelCleanUpEventHandlers(int node) {
    IpmiNode& n = slot(node);
    HandlerWalks& w = handlerWalks();
    TAV::MutexLock guard(n.selMutex);
    while (ipmiifc_sel_handler* e = n.work.sel_handlers) {
        n.work.sel_handlers = e->next;
        retire(w, e);
    }
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
