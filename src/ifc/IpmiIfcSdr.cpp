// SDR repository reader: Get SDR Repository Info, Reserve SDR Repository and
// Get SDR into a node's per-type record lists, and the refresh chain that an
// accepted repository info starts.

#include <string.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <memory>
#include <new>
#include <vector>

#include "IpmiIfcInternal.h"
#include "IpmiSdrCache.h"
#include "SdrLayout.h"

namespace Ipmi {

TAV::Mutex sdr_mutex;

namespace {

constexpr uint32_t kFailed = 0xFFFFFFFFu;
constexpr int kTriesPerRequest = 4;
constexpr uint8_t kFirstChunkBytes = 16;
// Shrinking a chunk down to this size or below is reported as an error.
constexpr uint8_t kQuietShrinkLimit = 8;
constexpr uint16_t kFirstRecordId = 0x0000;
constexpr uint16_t kNoMoreRecords = 0xFFFF;
// Passes the version gate although its low nibble says otherwise.
constexpr uint8_t kVersionAlwaysAccepted = 0x51;
constexpr uint8_t kHighestInfoVersion = 2;

// Stored Get SDR Repository Info answer, completion code first.
static_assert(sizeof(ipmiifc_sdr_info) == sdrInfoAnswer::size, "the stored info is handed out as it is");

// Stored Reserve SDR Repository answer: completion code, reservation id (LE).
constexpr size_t kReservationBytes = 3;
constexpr size_t kReservationId = 1;

// Get SDR request: reservation id (LE), record id (LE), offset, bytes to read.
constexpr size_t kRequestReservation = 0;
constexpr size_t kRequestRecordId = 2;
constexpr size_t kRequestOffset = 4;
constexpr size_t kRequestCount = 5;
constexpr uint16_t kRequestBytes = 6;

// Get SDR answer: completion code, next record id (LE), record bytes.
constexpr size_t kAnswerNextRecordId = 1;
constexpr size_t kAnswerRecord = 3;

uint16_t le16(const uint8_t* p) { return static_cast<uint16_t>(p[0] | (p[1] << 8)); }

void putLe16(uint8_t* p, uint16_t v) {
    p[0] = static_cast<uint8_t>(v & 0xFF);
    p[1] = static_cast<uint8_t>(v >> 8);
}

bool validNode(int node) { return node >= 0 && node < IPMI_NODE_COUNT; }

uint8_t storedVersion(const ipmiifc_sdr_state& s) { return s.info[sdrInfoAnswer::version]; }
uint16_t storedRecordCount(const ipmiifc_sdr_state& s) { return le16(s.info + sdrInfoAnswer::recordCount); }
uint16_t storedReservation(const ipmiifc_sdr_state& s) { return le16(s.reservation + kReservationId); }

IpmiSdrGroup groupOf(uint8_t recordType) {
    switch (recordType) {
    case sdr::type::fullSensor:
        return SDR_GROUP_FULL;
    case sdr::type::compactSensor:
        return SDR_GROUP_COMPACT;
    case sdr::type::eventOnly:
        return SDR_GROUP_EVENT_ONLY;
    case sdr::type::entityAssociation:
    case sdr::type::deviceRelativeEntityAssociation:
        return SDR_GROUP_ENTITY_ASSOC;
    case sdr::type::genericDeviceLocator:
        return SDR_GROUP_GENERIC_LOCATOR;
    case sdr::type::fruDeviceLocator:
        return SDR_GROUP_FRU_LOCATOR;
    case sdr::type::mcDeviceLocator:
        return SDR_GROUP_MC_LOCATOR;
    case sdr::type::oem:
        return SDR_GROUP_OEM;
    default:
        return SDR_GROUP_OTHER;
    }
}

// Set while this thread holds sdr_mutex: the chain calls back into
// IpmiIfcSdrGetAll and the handler may be reached with or without the mutex.
thread_local bool t_holdsSdrMutex = false;

class SdrChainLock {
public:
    SdrChainLock() : owner_(!t_holdsSdrMutex) {
        if (owner_) {
            sdr_mutex.lock();
            t_holdsSdrMutex = true;
        }
    }
    ~SdrChainLock() {
        if (owner_) {
            t_holdsSdrMutex = false;
            sdr_mutex.unlock();
        }
    }
    SdrChainLock(const SdrChainLock&) = delete;
    SdrChainLock& operator=(const SdrChainLock&) = delete;

private:
    bool owner_;
};

// The node's cacheLock for writing, released around sleeps and nested requests.
class RelockableWriteLock {
public:
    explicit RelockableWriteLock(pthread_rwlock_t& l) : lock_(l) { lock(); }
    ~RelockableWriteLock() {
        if (held_) unlock();
    }
    RelockableWriteLock(const RelockableWriteLock&) = delete;
    RelockableWriteLock& operator=(const RelockableWriteLock&) = delete;
    void lock() {
        pthread_rwlock_wrlock(&lock_);
        held_ = true;
    }
    void unlock() {
        held_ = false;
        pthread_rwlock_unlock(&lock_);
    }

private:
    pthread_rwlock_t& lock_;
    bool held_ = false;
};

// A cheap random back-off of 0 to 3 seconds before asking again.
void backOff() { sleep(static_cast<unsigned>(time(nullptr) & 3)); }

uint16_t currentReservation(int node) {
    IpmiNode& n = g_IpmiNode[node];
    CacheWriteLock guard(n.cacheLock);
    return storedReservation(n.work.sdr);
}

ipmiifc_resp* sendGetSdr(int node, uint8_t* request) {
    return IpmiIfcSendCmd(node, cmd::getSdr, netfn::storage, 0, kRequestBytes, request, 0);
}

void fillGetSdrRequest(uint8_t* request, uint16_t reservation, uint16_t recordId, uint8_t offset, uint8_t count) {
    putLe16(request + kRequestReservation, reservation);
    putLe16(request + kRequestRecordId, recordId);
    request[kRequestOffset] = offset;
    request[kRequestCount] = count;
}

void freeRecord(ipmiifc_sdr_list* element) {
    delete[] element->data;
    delete element;
}

// Where a compact or event-only record keeps its sharing bytes; false for
// other records and for records too short to hold them.
bool sharingFields(const ipmiifc_sdr_list* element, sdr::SensorRecordOffsets* at) {
    *at = sdr::sensorRecordOffsets(element->record_type);
    const sdr::SdrView record(element->data, element->length);
    return at->sharing != 0 && record.has(at->instanceModifier);
}

uint8_t shareCount(const uint8_t* bytes, const sdr::SensorRecordOffsets& at) {
    return sdr::SharingView{bytes[at.sharing], bytes[at.instanceModifier]}.shareCount();
}

// Adds `step` to the bits of `mask` in `byte`, wrapping within them; other bits stay.
uint8_t advanceWithin(uint8_t byte, uint8_t mask, uint8_t step) {
    return static_cast<uint8_t>((byte & ~mask) | ((byte + step) & mask));
}

// The next of the sensors a shared record describes: one sensor less to share,
// sensor number and ID string modifier one on, and the entity instance too
// when the record asks for it.
void advanceToNextSharedSensor(uint8_t* bytes, const sdr::SensorRecordOffsets& at) {
    const sdr::SharingView was{bytes[at.sharing], bytes[at.instanceModifier]};
    bytes[at.sharing] = static_cast<uint8_t>((bytes[at.sharing] & ~sdr::bits::shareCount) |
                                             ((was.shareCount() - 1) & sdr::bits::shareCount));
    bytes[at.instanceModifier] = advanceWithin(bytes[at.instanceModifier], sdr::bits::instanceModifierOffset, 1);
    bytes[sdr::key::sensorNumber] = static_cast<uint8_t>(bytes[sdr::key::sensorNumber] + 1);
    if (was.entityInstanceIncrements())
        bytes[sdr::key::entityInstance] =
            advanceWithin(bytes[sdr::key::entityInstance], sdr::bits::entityInstanceNumber, 1);
}

ipmiifc_sdr_list* nextSharedInstance(const ipmiifc_sdr_list* element, const sdr::SensorRecordOffsets& at) {
    ipmiifc_sdr_list* copy = new (std::nothrow) ipmiifc_sdr_list();
    uint8_t* bytes = new (std::nothrow) uint8_t[element->length];
    if (copy == nullptr || bytes == nullptr) {
        delete copy;
        delete[] bytes;
        return nullptr;
    }
    memcpy(bytes, element->data, element->length);
    copy->record_id = element->record_id;
    copy->record_type = element->record_type;
    copy->length = element->length;
    copy->data = bytes;
    advanceToNextSharedSensor(copy->data, at);
    return copy;
}

void logRepeatedRecord(uint16_t id, uint32_t walked) {
    ipmiLog(LOG_WARNING,
            "IpmiIfcSdrGetHeaders: record ID 0x%04X comes again after %u records; the rest of the repository is ignored",
            id, walked);
}

// The sensor, entity list and entity tree rebuilds that follow every record read.
void rebuildFromRecords(int node) {
    IpmiIfcSensorInstantiateAll(node);
    IpmiIfcEntityListCreate(node);
    IpmiIfcEntityInstantiateAll(node);
}

// While a chain keeps what it reads for the SDR cache: the records as read,
// in walk order (IpmiIfcSdrReadAll appends to it).
thread_local SdrCacheRecords* t_recordsRead = nullptr;

class KeepRecordsRead {
public:
    explicit KeepRecordsRead(SdrCacheRecords* into) { t_recordsRead = into; }
    ~KeepRecordsRead() { t_recordsRead = nullptr; }
    KeepRecordsRead(const KeepRecordsRead&) = delete;
    KeepRecordsRead& operator=(const KeepRecordsRead&) = delete;
};

constexpr size_t kDeviceIdBytes = 16;
constexpr size_t kGuidAnswerBytes = 17;  // completion code, GUID

// The key a cache file must carry for the info just accepted. The identity
// is asked afresh, so a firmware update or a swapped controller never meets
// the records of the one before. False when in doubt: no identity answer.
bool askCacheKey(int node, const uint8_t* info, SdrCacheKey* key) {
    uint8_t deviceId[kDeviceIdBytes] = {};
    RespHolder id(IpmiIfcSendCmd(node, cmd::getDeviceId, netfn::app, 0, 0, nullptr, 0));
    if (!id || id->cc != cc::ok) return false;
    memcpy(deviceId, id->data, id->data_len < kDeviceIdBytes ? id->data_len : kDeviceIdBytes);
    *key = sdrCacheKey(info, deviceId);
    return true;
}

// Controllers without a GUID refuse the command; their key has none.
void askCacheGuid(int node, SdrCacheKey* key) {
    RespHolder guid(IpmiIfcSendCmd(node, cmd::getSystemGuid, netfn::app, 0, 0, nullptr, 0));
    if (guid && guid->cc == cc::ok && guid->data_len >= kGuidAnswerBytes) sdrCacheKeyAddGuid(key, guid->data + 1);
}

// Files the records of a valid cache file in place of the node's lists, as
// a whole read would have left them. False: no valid file, nothing changed.
bool fileFromCache(int node, const SdrCacheFile& file, const SdrCacheKey& key) {
    SdrCacheRecords records;
    if (!sdrCacheUse(file, key, &records)) return false;
    // Everything allocated before the lists are touched: a failure leaves them be.
    using Element = std::unique_ptr<ipmiifc_sdr_list, void (*)(ipmiifc_sdr_list*)>;
    std::vector<Element> elements;
    elements.reserve(records.size());
    std::unique_ptr<uint8_t[]> headers(new (std::nothrow) uint8_t[records.size() * sdr::header::length + 1]);
    if (!headers) return false;
    for (size_t i = 0; i < records.size(); ++i) {
        const std::vector<uint8_t>& r = records[i];
        Element element(new (std::nothrow) ipmiifc_sdr_list(), freeRecord);
        if (!element) return false;
        element->data = new (std::nothrow) uint8_t[r.size()];
        if (element->data == nullptr) return false;
        memcpy(element->data, r.data(), r.size());
        const sdr::SdrView header(element->data, r.size());
        element->record_id = header.recordId();
        element->record_type = header.recordType();
        element->length = static_cast<uint8_t>(r.size());  // the reader kept it within a length byte
        memcpy(headers.get() + i * sdr::header::length, element->data, sdr::header::length);
        elements.push_back(std::move(element));
    }
    IpmiIfcSdrCleanUpAll(node);
    IpmiNode& n = g_IpmiNode[node];
    CacheWriteLock guard(n.cacheLock);
    ipmiifc_sdr_state& s = n.work.sdr;
    delete[] s.headers;
    s.headers = headers.release();
    s.header_cnt = static_cast<uint32_t>(records.size());
    s.headers_valid = 1;
    for (auto& element : elements) IpmiIfcSdrListAdd(node, element.release());
    return true;
}

// Whether the last read filed every record its walk found: only then is it
// worth keeping.
bool wholeRepositoryFiled(int node, const SdrCacheRecords& read) {
    IpmiNode& n = g_IpmiNode[node];
    CacheWriteLock guard(n.cacheLock);
    return n.work.sdr.headers_valid && n.work.sdr.header_cnt != 0 && read.size() == n.work.sdr.header_cnt;
}

enum class Rebuild { sensorsAndEntities, nothing };

uint32_t acceptSdrInfo(ipmiifc_resp* resp, Rebuild rebuild);

uint32_t getSdrInfo(int node, Rebuild rebuild) {
    if (!validNode(node)) return kFailed;
    SdrChainLock chain;
    RespHolder resp(IpmiIfcSendCmd(node, cmd::getSdrRepositoryInfo, netfn::storage, 0, 0, nullptr, 0));
    if (!resp || resp->cc != cc::ok) return kFailed;
    acceptSdrInfo(resp.get(), rebuild);
    return 0;
}

uint32_t acceptSdrInfo(ipmiifc_resp* resp, Rebuild rebuild) {
    if (resp == nullptr) return kFailed;
    if (resp->cc != cc::ok) {
        ipmiLog(LOG_WARNING, "Unable to fetch SDR info - cc=0x%x", resp->cc);
        return kFailed;
    }
    if (resp->data[0] != cc::ok) {
        ipmiLog(LOG_WARNING, "Inconsistent SDR Response codes %x != %x", resp->data[0], cc::ok);
        return kFailed;
    }
    if (resp->data_len != sdrInfoAnswer::size) {
        ipmiLog(LOG_WARNING, "SDR response buffer was wrong size %x (expecting %x)", resp->data_len,
                static_cast<unsigned>(sdrInfoAnswer::size));
        return kFailed;
    }
    const uint8_t version = resp->data[sdrInfoAnswer::version];
    if ((version & 0x0F) > kHighestInfoVersion) {
        ipmiLog(LOG_WARNING, "Unexpected SDR Repository info version 0x%x - discarding results ", version);
        return kFailed;
    }
    const int node = resp->node;
    if (!validNode(node)) return kFailed;

    // The start-up command table calls this handler directly, without the mutex.
    SdrChainLock chain;
    {
        IpmiNode& n = g_IpmiNode[node];
        CacheWriteLock guard(n.cacheLock);
        memcpy(n.work.sdr.info, resp->data, sdrInfoAnswer::size);
    }
    // The cache is consulted only when asked for: without it the exchanges
    // are the ones a reader of the repository expects.
    SdrCacheKey key;
    const bool cached = !sdrCacheDirectory().empty() && askCacheKey(node, resp->data, &key);
    bool filed = false;
    if (cached) {
        const SdrCacheFile file = sdrCacheRead(node);
        // The GUID is asked for only where the file has one to compare with;
        // a file without one is replaced by one with the GUID asked below.
        const bool guidAsked = sdrCacheHasGuid(file);
        if (guidAsked) askCacheGuid(node, &key);
        filed = fileFromCache(node, file, key);
        if (!filed && !guidAsked) askCacheGuid(node, &key);
    }
    if (!filed) {
        IpmiIfcSdrReserve(node);
        SdrCacheRecords read;
        KeepRecordsRead keep(cached ? &read : nullptr);
        if (IpmiIfcSdrGetAll(node) == 0 && cached && wholeRepositoryFiled(node, read)) sdrCacheStore(node, key, read);
    }
    if (rebuild == Rebuild::sensorsAndEntities) rebuildFromRecords(node);
    return 0;
}

}  // namespace

uint32_t IpmiIfcSdrGetInfo(int node) { return getSdrInfo(node, Rebuild::sensorsAndEntities); }

uint32_t IpmiIfcSdrReadRecords(int node) { return getSdrInfo(node, Rebuild::nothing); }

uint32_t IpmiIfcRhGetSdrInfo(ipmiifc_resp* resp) { return acceptSdrInfo(resp, Rebuild::sensorsAndEntities); }

uint32_t IpmiIfcSdrReserve(int node) {
    if (!validNode(node)) return kFailed;
    RespHolder resp(IpmiIfcSendCmd(node, cmd::reserveSdrRepository, netfn::storage, 0, 0, nullptr, 0));
    if (!resp || resp->cc != cc::ok) return kFailed;
    if (resp->data_len < kReservationBytes) return kFailed;  // no id in it
    IpmiNode& n = g_IpmiNode[node];
    CacheWriteLock guard(n.cacheLock);
    memcpy(n.work.sdr.reservation, resp->data, kReservationBytes);
    return 0;
}

uint32_t IpmiIfcSdrGetHeaders(int node) {
    if (!validNode(node)) return kFailed;
    IpmiNode& n = g_IpmiNode[node];
    ipmiifc_sdr_state& s = n.work.sdr;
    RelockableWriteLock lock(n.cacheLock);

    const uint32_t wanted = storedRecordCount(s);
    const uint32_t had = s.header_cnt;
    if (wanted > had) {
        delete[] s.headers;
        s.headers = nullptr;
        s.header_cnt = 0;
    }
    if (s.headers == nullptr || had == 0) {
        delete[] s.headers;
        s.headers = new (std::nothrow) uint8_t[wanted * sdr::header::length];
        if (s.headers == nullptr) {
            ipmiLog(LOG_ERR, "IpmiIfcSdrGetHeaders: failed alloc memory size = %d",
                    static_cast<int>(wanted * sdr::header::length));
            return kFailed;
        }
        s.header_cnt = wanted;
    }
    uint8_t* const headers = s.headers;

    uint8_t request[kRequestBytes];
    fillGetSdrRequest(request, storedReservation(s), kFirstRecordId, 0, sdr::header::length);
    uint32_t stored = 0;
    bool expired = false;
    // A repository whose next ids lead back to a record already read would
    // keep the walk (and every read and sensor after it) going as long as the
    // claimed record count allows: each id is walked once.
    std::vector<bool> seen(kNoMoreRecords + 1u, false);
    while (stored < wanted) {
        RespHolder answer;
        for (int tries = 0; tries < kTriesPerRequest && !answer; ++tries) {
            RespHolder resp(sendGetSdr(node, request));
            if (!resp) continue;
            if (resp->cc == cc::reservationCancelled) {
                resp.reset(nullptr);
                lock.unlock();
                backOff();
                IpmiIfcSdrReserve(node);
                lock.lock();
                if (s.headers != headers) return kFailed;  // freed by a stop meanwhile
                putLe16(request + kRequestReservation, storedReservation(s));
                continue;
            }
            if (resp->cc != cc::ok || resp->data_len < kAnswerRecord + sdr::header::length) continue;
            answer.reset(resp.release());
        }
        if (!answer) {
            expired = true;
            break;
        }
        const uint16_t id = le16(answer->data + kAnswerRecord);
        if (seen[id]) {
            logRepeatedRecord(id, stored);
            break;
        }
        seen[id] = true;
        memcpy(headers + stored * sdr::header::length, answer->data + kAnswerRecord, sdr::header::length);
        ++stored;
        const uint16_t next = le16(answer->data + kAnswerNextRecordId);
        if (next == kNoMoreRecords) break;
        if (seen[next]) {
            logRepeatedRecord(next, stored);
            break;
        }
        putLe16(request + kRequestRecordId, next);
    }
    s.header_cnt = stored;
    if (expired) {
        ipmiLog(LOG_DEBUG, "IpmiIfcSdrGetHeaders: retry expired.");
        return kFailed;
    }
    s.headers_valid = 1;
    return 0;
}

uint32_t IpmiIfcSdrReadRecordId(int node, uint16_t record_id, uint8_t* buffer, uint8_t length) {
    if (length == 0 || buffer == nullptr || !validNode(node)) {
        ipmiLog(LOG_ERR, "IpmiIfcSdrReadRecordId: retry expired.");
        return kFailed;
    }
    // Never below one byte: a chunk of nothing would never finish the record.
    uint8_t chunk = kFirstChunkBytes;
    uint8_t remaining = length;
    uint8_t request[kRequestBytes];
    // The record is read from its end towards its start.
    while (remaining > 0) {
        const uint8_t count = remaining < chunk ? remaining : chunk;
        const uint8_t offset = static_cast<uint8_t>(remaining - count);
        fillGetSdrRequest(request, currentReservation(node), record_id, offset, count);
        bool done = false;
        for (int tries = 0; tries < kTriesPerRequest && !done; ++tries) {
            RespHolder resp(sendGetSdr(node, request));
            if (!resp) continue;
            const uint8_t code = resp->cc;
            if (code == cc::reservationCancelled) {
                resp.reset(nullptr);
                backOff();
                IpmiIfcSdrReserve(node);
                putLe16(request + kRequestReservation, currentReservation(node));
                continue;
            }
            if (code == cc::cannotReturnRequestedBytes || code == cc::requestDataLengthInvalid) {
                // Only the chunks after this one get smaller; the retry asks as much again.
                if (chunk > 1) --chunk;
                if (chunk > kQuietShrinkLimit) continue;
            }
            if (code == cc::requestedSensorNotPresent) {
                ipmiLog(LOG_ERR, "IpmiIfcSdrReadRecordId: sensor not found, record id: %X", record_id);
                return kFailed;
            }
            if (code != cc::ok) {
                ipmiLog(LOG_ERR, "IpmiIfcSdrReadRecordId:record id: %X, error %d. Try again...", record_id, code);
                continue;
            }
            if (resp->data_len != kAnswerRecord + count) {
                ipmiLog(LOG_ERR, "IpmiIfcSdrReadRecordId: data length mismatch req=%d,resp=%d",
                        static_cast<int>(kAnswerRecord + count), static_cast<int>(resp->data_len));
                resp.reset(nullptr);
                backOff();
                continue;
            }
            remaining = offset;
            memcpy(buffer + remaining, resp->data + kAnswerRecord, count);
            done = true;
        }
        if (!done) {
            ipmiLog(LOG_ERR, "IpmiIfcSdrReadRecordId: retry expired.");
            return kFailed;
        }
    }
    return 0;
}

uint32_t IpmiIfcSdrListAdd(int node, ipmiifc_sdr_list* element) {
    if (!validNode(node) || element == nullptr) return kFailed;
    ipmiifc_sdr_list*& head = g_IpmiNode[node].work.sdr.lists[groupOf(element->record_type)];
    element->next = head;
    head = element;

    sdr::SensorRecordOffsets at;
    if (!sharingFields(element, &at) || shareCount(element->data, at) < 2) return 0;
    ipmiifc_sdr_list* next = nextSharedInstance(element, at);
    if (next == nullptr) {
        ipmiLog(LOG_ERR, "IpmiIfcSdrListAdd: failed memory alloc.");
        return kFailed;
    }
    // Each copy shares one sensor less, so this ends after at most 14 copies.
    return IpmiIfcSdrListAdd(node, next);
}

uint32_t IpmiIfcSdrReadAll(int node) {
    if (!validNode(node)) return kFailed;
    IpmiNode& n = g_IpmiNode[node];
    ipmiifc_sdr_state& s = n.work.sdr;
    RelockableWriteLock lock(n.cacheLock);
    if (s.header_cnt == 0 || s.headers == nullptr) {
        ipmiLog(LOG_ERR, "%s: header_cnt == 0 or no header data", "IpmiIfcSdrReadAll");
        return kFailed;
    }
    // Our own copy: the lock is released for every record and a stop may free the array.
    const uint32_t count = s.header_cnt;
    std::unique_ptr<uint8_t[]> headers(new (std::nothrow) uint8_t[count * sdr::header::length]);
    if (!headers) {
        ipmiLog(LOG_ERR, "%s: failed memory alloc.", "IpmiIfcSdrReadAll");
        return kFailed;
    }
    memcpy(headers.get(), s.headers, count * sdr::header::length);

    for (uint32_t i = 0; i < count; ++i) {
        const sdr::SdrView header(headers.get() + i * sdr::header::length, sdr::header::length);
        const uint8_t size = static_cast<uint8_t>(header.remainingLength() + sdr::header::length);
        uint8_t* bytes = new (std::nothrow) uint8_t[size];
        if (bytes == nullptr) {
            ipmiLog(LOG_ERR, "%s: failed memory alloc.", "IpmiIfcSdrReadAll");
            return kFailed;
        }
        lock.unlock();
        const uint32_t rc = IpmiIfcSdrReadRecordId(node, header.recordId(), bytes, size);
        lock.lock();
        if (rc != 0) {
            delete[] bytes;
            continue;
        }
        ipmiifc_sdr_list* element = new (std::nothrow) ipmiifc_sdr_list();
        if (element == nullptr) {
            delete[] bytes;
            ipmiLog(LOG_ERR, "%s: failed memory alloc.", "IpmiIfcSdrReadAll");
            return kFailed;
        }
        element->record_id = header.recordId();
        element->record_type = header.recordType();
        element->length = size;
        element->data = bytes;
        if (t_recordsRead != nullptr) t_recordsRead->emplace_back(bytes, bytes + size);
        IpmiIfcSdrListAdd(node, element);
    }
    return 0;
}

uint32_t IpmiIfcSdrGetAll(int node) {
    if (!validNode(node)) return kFailed;
    IpmiNode& n = g_IpmiNode[node];
    ipmiifc_sdr_state& s = n.work.sdr;
    uint8_t version;
    uint16_t reservation;
    {
        CacheWriteLock guard(n.cacheLock);
        version = storedVersion(s);
        reservation = storedReservation(s);
    }
    // Inside the chain a version of 0 is what the controller said: asking again would never end.
    if (version == 0 && !t_holdsSdrMutex) {
        const uint32_t rc = IpmiIfcSdrGetInfo(node);
        if (rc != 0) return rc;
    }
    if (reservation == 0) {
        const uint32_t rc = IpmiIfcSdrReserve(node);
        if (rc != 0) return rc;
    }
    uint16_t records;
    {
        CacheWriteLock guard(n.cacheLock);
        version = storedVersion(s);
        records = storedRecordCount(s);
    }
    if (version != kVersionAlwaysAccepted && (version & 0x0F) < kHighestInfoVersion) {
        static std::atomic<bool> reported{false};
        if (!reported.exchange(true))
            ipmiLog(LOG_ERR, "IpmiIfcSdrGetAll: invalid version. version = 0x%x", version);
        return kFailed;
    }
    if (records == 0) return kFailed;
    const uint32_t rc = IpmiIfcSdrGetHeaders(node);
    if (rc != 0) return rc;
    IpmiIfcSdrCleanUpAll(node);
    return IpmiIfcSdrReadAll(node);
}

void IpmiIfcSdrCleanUpHeaders(int node) {
    if (!validNode(node)) return;
    IpmiNode& n = g_IpmiNode[node];
    CacheWriteLock guard(n.cacheLock);
    delete[] n.work.sdr.headers;
    n.work.sdr.headers = nullptr;
    n.work.sdr.header_cnt = 0;
    n.work.sdr.headers_valid = 0;
}

void IpmiIfcSdrCleanUpAll(int node) {
    if (!validNode(node)) return;
    IpmiNode& n = g_IpmiNode[node];
    CacheWriteLock guard(n.cacheLock);
    for (int group = 0; group < SDR_GROUP_COUNT; ++group) {
        ipmiifc_sdr_list* element = n.work.sdr.lists[group];
        while (element != nullptr) {
            ipmiifc_sdr_list* next = element->next;
            element->sensor = nullptr;
            freeRecord(element);
            element = next;
        }
        n.work.sdr.lists[group] = nullptr;
    }
}

ipmiifc_sdr_info IpmiIfc::getSdr(int node) {
    ipmiifc_sdr_info info;
    memset(&info, 0, sizeof info);
    if (!validNode(node)) return info;
    IpmiNode& n = g_IpmiNode[node];
    CacheWriteLock guard(n.cacheLock);
    memcpy(&info, n.work.sdr.info, sizeof info);
    return info;
}

}  // namespace Ipmi
