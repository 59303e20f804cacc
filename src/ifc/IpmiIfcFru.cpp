// FRU inventory: device access (Get FRU Inventory Area Info, Read FRU Data
// with its shrinking request size and retries), area lengths and checksums,
// and the discovery pass that turns every FRU device locator record of the
// node's SDR lists into an IpmiFru with its decoded areas.

#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <map>
#include <set>
#include <vector>

#include "FruLayout.h"
#include "IpmiFru.h"
#include "IpmiIfcInternal.h"

namespace Ipmi {

namespace {

constexpr uint32_t kFailed = 0xFFFFFFFFu;
constexpr int kLargestRequest = 23;  // keeps an answer within the 32-byte response
constexpr int kSmallestRequest = 8;
// A busy or time-out answer is retried only after a chunk has arrived.
constexpr int kRetries = 4;
// Answers of code 0 that carry no byte: a few in a row end the read, since
// such a controller would otherwise be asked for ever.
constexpr int kMaxEmptyAnswers = 3;
// Records a multi-record chain may have. Devices carry a handful; a chain
// of tiny records without an end mark would otherwise cost one read each
// up to the inventory's end.
constexpr unsigned kMaxMultiRecords = 255;
// What one discovery pass may spend: busy or time-out retries in all, and
// Read FRU Data requests. The devices not reached keep their last objects
// and are read first on the next pass.
constexpr int kPassRetries = 16;
constexpr int kPassReads = 4096;
// The local controller's address as FRU device locator records write it.
constexpr uint8_t kBmcAddress = 0x20;

bool validNode(int node) { return node >= 0 && node < IPMI_NODE_COUNT; }

struct PassBudget {
    int retriesLeft = kPassRetries;
    int readsLeft = kPassReads;
};
thread_local PassBudget* t_pass = nullptr;  // the discovery pass running on this thread

bool passSpent() { return t_pass != nullptr && t_pass->readsLeft <= 0; }

// A read that failed on the way (busy, time-out, no answer, or the pass's
// budget spent) says nothing of the device: its last good object stays.
bool unreachable(unsigned rc) { return rc == kFailed || rc == cc::nodeBusy || rc == cc::timeout; }

// Where the next pass starts, per node: after the last device a spent pass read.
size_t g_resumeAt[IPMI_NODE_COUNT];

int maxRequest() { return __atomic_load_n(&fru_max_req_size, __ATOMIC_RELAXED); }

// The cached access type says word access in bit 0.
uint8_t cachedWordAccess(const IpmiNode& n) {
    return n.fruState.area_info[fru::areaInfoAnswer::access] & fru::areaInfoAnswer::wordAccess;
}
uint16_t cachedAreaSize(const IpmiNode& n) {
    return fru::Bytes(n.fruState.area_info, sizeof n.fruState.area_info).le16(fru::areaInfoAnswer::size);
}

// The FRU device locator records of the node, in repository order (the
// lists hold them newest first).
std::vector<std::vector<uint8_t>> copyLocators(IpmiNode& n) {
    std::vector<std::vector<uint8_t>> out;
    CacheReadLock guard(n.cacheLock);
    for (const ipmiifc_sdr_list* e = n.work.sdr.lists[SDR_GROUP_FRU_LOCATOR]; e != nullptr; e = e->next)
        out.emplace_back(e->data, e->data + e->length);
    std::reverse(out.begin(), out.end());
    return out;
}

std::string locatorName(const fru::LocatorView& loc) {
    const fru::Bytes id = loc.from(fru::locator::idString).first(loc.idStringLength());
    std::string name(reinterpret_cast<const char*>(id.bytes()), id.length());
    return toAsciiAndTrim(name);
}

// Reads `length` bytes at `offset`; empty on failure, and `lost` set when
// the failure was the transport's.
std::vector<uint8_t> readArea(int node, uint8_t id, uint8_t word, unsigned offset, unsigned length,
                              unsigned areaSize, const char* what, bool& lost) {
    if (length == 0) return {};
    if (offset + length > areaSize) {
        ipmiLog(LOG_WARNING, "IpmiIfcFruInstantiateAll: FRU 0x%x %s area at 0x%x runs past the inventory end (0x%x)",
                id, what, offset, areaSize);
        return {};
    }
    std::vector<uint8_t> bytes(length);
    unsigned got = length;
    const unsigned rc = IpmiIfcReadFru(node, id, word, static_cast<int>(offset), &got, bytes.data());
    if (rc != 0) {
        ipmiLog(LOG_WARNING, "IpmiIfcFruInstantiateAll: FRU 0x%x %s area at 0x%x not read (0x%x)", id, what, offset,
                rc);
        lost = unreachable(rc);
        return {};
    }
    return bytes;
}

bool zeroSum(std::vector<uint8_t>& bytes) {
    unsigned char sum = 0;
    return IpmiIfcFruChecksum(bytes.data(), &sum, static_cast<unsigned>(bytes.size()));
}

unsigned infoAreaLength(int node, uint8_t id, uint8_t word, unsigned offset, unsigned& rc);
unsigned multiLength(int node, uint8_t id, unsigned offset, unsigned& rc);

template <class Area>
std::shared_ptr<const IpmiFruOptional> readInfoArea(int node, uint8_t id, uint8_t word, uint8_t offsetUnits,
                                                    unsigned areaSize, const char* what, bool& lost) {
    if (offsetUnits == 0) return nullptr;
    const unsigned offset = offsetUnits * fru::kUnit;
    if (offset + fru::infoArea::headerLength > areaSize) {
        ipmiLog(LOG_WARNING, "IpmiIfcFruInstantiateAll: FRU 0x%x %s area at 0x%x lies outside the inventory (0x%x)",
                id, what, offset, areaSize);
        return nullptr;
    }
    unsigned rc = 0;
    const unsigned length = infoAreaLength(node, id, word, offset, rc);
    lost = unreachable(rc);
    std::vector<uint8_t> bytes = readArea(node, id, word, offset, length, areaSize, what, lost);
    if (bytes.empty()) return nullptr;
    if (!zeroSum(bytes)) {
        ipmiLog(LOG_WARNING, "IpmiIfcFruInstantiateAll: FRU 0x%x %s area checksum invalid", id, what);
        return nullptr;
    }
    return std::make_shared<const Area>(static_cast<unsigned>(bytes.size()), bytes.data());
}

// Every record's header and data must sum to zero.
bool multiRecordsValid(const std::vector<uint8_t>& area, uint8_t id) {
    const fru::Bytes all(area.data(), area.size());
    size_t at = 0;
    while (all.has(at, fru::multi::headerLength)) {
        const fru::MultiRecordHeaderView header(all.from(at));
        std::vector<uint8_t> head(area.begin() + static_cast<long>(at),
                                  area.begin() + static_cast<long>(at + fru::multi::headerLength));
        const fru::Bytes body = all.from(at + fru::multi::headerLength).first(header.dataLength());
        std::vector<uint8_t> data(body.bytes(), body.bytes() + body.length());
        unsigned char sum = header.dataChecksum();
        if (!zeroSum(head) || body.length() != header.dataLength() ||
            !IpmiIfcFruChecksum(data.data(), &sum, static_cast<unsigned>(data.size()))) {
            ipmiLog(LOG_WARNING, "IpmiIfcFruInstantiateAll: FRU 0x%x multi-record at 0x%x checksum invalid", id,
                    static_cast<unsigned>(at));
            return false;
        }
        at += header.recordLength();
    }
    return true;
}

std::shared_ptr<const IpmiFruOptional> readMultiArea(int node, uint8_t id, uint8_t word, uint8_t offsetUnits,
                                                     unsigned areaSize, bool& lost) {
    if (offsetUnits == 0) return nullptr;
    const unsigned offset = offsetUnits * fru::kUnit;
    unsigned rc = 0;
    const unsigned length = multiLength(node, id, offset, rc);
    lost = unreachable(rc);
    if (lost) return nullptr;  // a chain cut short would pass for a whole one
    std::vector<uint8_t> bytes = readArea(node, id, word, offset, length, areaSize, "multi-record", lost);
    if (bytes.empty() || !multiRecordsValid(bytes, id)) return nullptr;
    return std::make_shared<const IpmiFruMulti>(static_cast<unsigned>(bytes.size()), bytes.data());
}

// One logical FRU device of the local controller; null when its common
// header is not one this library reads. A device or an area that the
// transport failed to reach keeps what `previous` (the last pass's object)
// holds: one busy answer must not take a device out of the inventory.
std::shared_ptr<IpmiFru> readDevice(int node, const fru::LocatorView& loc, const std::shared_ptr<IpmiFru>& previous) {
    IpmiNode& n = g_IpmiNode[node];
    uint8_t id = loc.deviceId();
    TAV::MutexLock guard(n.fruMutex);
    if (passSpent()) return previous;
    RespHolder resp(IpmiIfcSendCmd(node, cmd::getFruInventoryAreaInfo, netfn::storage, 0, 1, &id, 0));
    if (IpmiIfcRhFruInv(resp.get(), id) != 0) {
        const bool lost = !resp || resp->cc == cc::nodeBusy || resp->cc == cc::timeout;
        return lost ? previous : nullptr;
    }
    const unsigned areaSize = cachedAreaSize(n);
    const uint8_t word = cachedWordAccess(n);

    fru_header header;
    unsigned length = sizeof header;
    n.fruState.header_len = 0;
    if (areaSize < sizeof header) {
        ipmiLog(LOG_WARNING, "IpmiIfcFruInstantiateAll: FRU 0x%x inventory of %u bytes has no common header", id,
                areaSize);
        return nullptr;
    }
    const unsigned rc = IpmiIfcReadFru(node, id, word, 0, &length, n.fruState.header);
    if (rc != 0) {
        ipmiLog(LOG_WARNING, "IpmiIfcFruInstantiateAll: FRU 0x%x common header not read (0x%x)", id, rc);
        return unreachable(rc) ? previous : nullptr;
    }
    n.fruState.header_len = length;
    memcpy(&header, n.fruState.header, sizeof header);
    if (header.version != fru::kFormatVersion) {
        ipmiLog(LOG_WARNING, "IpmiIfcFruInstantiateAll: FRU 0x%x common header version 0x%x not supported", id,
                header.version);
        return nullptr;
    }

    IpmiFru::OptionalRefArray areas;
    bool lost[IpmiFru::FRU_AREA_COUNT] = {};
    areas[IpmiFru::FRU_AREA_CHASSIS] = readInfoArea<IpmiFruChassis>(node, id, word, header.chassis_offset, areaSize,
                                                                    "chassis", lost[IpmiFru::FRU_AREA_CHASSIS]);
    areas[IpmiFru::FRU_AREA_BOARD] = readInfoArea<IpmiFruBoard>(node, id, word, header.board_offset, areaSize,
                                                                "board", lost[IpmiFru::FRU_AREA_BOARD]);
    areas[IpmiFru::FRU_AREA_PRODUCT] = readInfoArea<IpmiFruProduct>(node, id, word, header.product_offset, areaSize,
                                                                    "product", lost[IpmiFru::FRU_AREA_PRODUCT]);
    areas[IpmiFru::FRU_AREA_MULTI] =
        readMultiArea(node, id, word, header.multi_offset, areaSize, lost[IpmiFru::FRU_AREA_MULTI]);
    if (previous)
        for (size_t k = 0; k < areas.size(); ++k)
            if (lost[k]) areas[k] = previous->getOptionalRefArray()[k];

    // The locator's instance byte carries the device-relative flag in bit 7.
    auto device = std::make_shared<IpmiFru>(
        node, id, locatorName(loc), IpmiEntity(loc.entityId(), loc.entityInstance() & 0x7F, 0, node), header);
    device->setOptionalRefArray(areas);
    return device;
}

}  // namespace

int fru_max_req_size = kLargestRequest;

int IpmiIfcRhFruInv(ipmiifc_resp* resp, uint8_t deviceId) {
    if (resp == nullptr) {
        ipmiLog(LOG_INFO, "IpmiIfcRhFruInv: deviceID = 0x%x - no answer to Get FRU Inventory Area Info", deviceId);
        return -1;
    }
    if (resp->cc != cc::ok || resp->data_len < fru::areaInfoAnswer::length) {
        ipmiLog(LOG_INFO, "IpmiIfcRhFruInv: deviceID = 0x%x - Get FRU Inventory Area Info failed cc=0x%x", deviceId,
                resp->cc);
        return -1;
    }
    ipmiifc_fru_state& s = g_IpmiNode[resp->node >= 0 && resp->node < IPMI_NODE_COUNT ? resp->node : 0].fruState;
    memcpy(s.area_info, resp->data, fru::areaInfoAnswer::length);
    s.area_info[fru::areaInfoAnswer::length] = deviceId;
    return 0;
}

unsigned int IpmiIfcReadFru(int node, unsigned char deviceId, unsigned char wordAccess, int offset,
                            unsigned int* length, unsigned char* buffer) {
    if (buffer == nullptr) {
        ipmiLog(LOG_ERR, "%s: unexpected null buffer", "IpmiIfcReadFru");
        return kFailed;
    }
    if (length == nullptr || *length == 0) {
        ipmiLog(LOG_ERR,
                "Node %d: IpmiIfcReadFru invalid parameter,device_id=0x%x,devAccessWord=0x%x,offset=%d,length=%d", 0,
                deviceId, wordAccess, offset, 0);
        return kFailed;
    }
    unsigned wanted = *length;
    *length = 0;
    int retries = kRetries;
    int emptyAnswers = 0;
    uint8_t request[fru::readRequest::length];
    request[fru::readRequest::deviceId] = deviceId;
    for (;;) {
        if (t_pass != nullptr && t_pass->readsLeft-- <= 0) return kFailed;
        const int largest = maxRequest();
        const unsigned chunk = wanted < static_cast<unsigned>(largest) ? wanted : static_cast<unsigned>(largest);
        request[fru::readRequest::offset] = static_cast<uint8_t>(offset & 0xFF);
        request[fru::readRequest::offset + 1] = static_cast<uint8_t>((offset >> 8) & 0xFF);
        request[fru::readRequest::count] = static_cast<uint8_t>(wordAccess ? (chunk + 1) / 2 : chunk);
        RespHolder resp(
            IpmiIfcSendCmd(node, cmd::readFruData, netfn::storage, 0, fru::readRequest::length, request, 0));
        if (!resp) {
            ipmiLog(LOG_INFO, "Node %d: IpmiIfcReadFru: deviceID = 0x%x - failed to fetch data", 0, deviceId);
            return kFailed;
        }
        const uint8_t code = resp->cc;
        if (code == cc::ok) {
            const unsigned n = resp->data_len > fru::readAnswer::count ? resp->data[fru::readAnswer::count] : 0;
            if (n > chunk) {
                ipmiLog(LOG_INFO,
                        "IpmiIfcReadFru: Response payload larger than expected (corrupt?) datalen: 0x%x, data[1]: "
                        "0x%x > 0x%x",
                        resp->data_len, n, chunk);
                return kFailed;
            }
            if (resp->data_len < fru::readAnswer::data + n) {
                ipmiLog(LOG_INFO,
                        "IpmiIfcReadFru: Response shorter than its count (corrupt?) datalen: 0x%x, data[1]: 0x%x",
                        resp->data_len, n);
                return kFailed;
            }
            if (n == 0 && ++emptyAnswers >= kMaxEmptyAnswers) {
                ipmiLog(LOG_INFO, "IpmiIfcReadFru: deviceID = 0x%x returned no data at offset %d", deviceId, offset);
                return kFailed;
            }
            if (n > 0) emptyAnswers = 0;
            memcpy(buffer + *length, resp->data + fru::readAnswer::data, n);
            *length += n;
            offset += static_cast<int>(n);
            wanted -= n;
            retries = 0;
            if (wanted == 0) return 0;
            continue;
        }
        if ((code == cc::requestDataLengthInvalid || code == cc::cannotReturnRequestedBytes ||
             code == cc::invalidDataField) &&
            largest > kSmallestRequest) {
            // Shared by every device: later reads start at the smaller size.
            __atomic_store_n(&fru_max_req_size, largest - 1, __ATOMIC_RELAXED);
            ipmiLog(LOG_INFO, "IpmiIfcReadFru: Command failed with 0x%x, retrying with smaller buffer (0x%x)", code,
                    largest - 1);
            continue;
        }
        if ((code == cc::nodeBusy || code == cc::timeout) && retries < kRetries &&
            (t_pass == nullptr || t_pass->retriesLeft-- > 0)) {
            ++retries;
            ipmiLog(LOG_INFO, "IpmiIfcReadFru: Timeout on 0x%x cc=0x%x after reading some data... retrying %d",
                    deviceId, code, retries);
            resp.reset(nullptr);
            sleep(static_cast<unsigned>(retries));
            continue;
        }
        if (wanted == 0) return 0;
        ipmiLog(LOG_INFO, "IpmiIfcReadFru: deviceID = 0x%x, bytes left to read = %d", deviceId,
                static_cast<int>(wanted));
        ipmiLog(LOG_INFO, "IpmiIfcReadFru: Failed during send cc = 0x%x", code);
        return code;
    }
}

unsigned int IpmiIfruInfoAreaLength(int node, unsigned char deviceId, unsigned char wordAccess, unsigned int offset) {
    unsigned rc = 0;
    return infoAreaLength(node, deviceId, wordAccess, offset, rc);
}

bool IpmiIfcFruChecksum(unsigned char* data, unsigned char* sum, unsigned int length) {
    for (unsigned int i = 0; i < length; ++i) *sum = static_cast<unsigned char>(*sum + data[i]);
    return *sum == 0;
}

unsigned int IpmiIfcFruMultiLength(int node, unsigned char deviceId, unsigned int offset) {
    unsigned rc = 0;
    return multiLength(node, deviceId, offset, rc);
}

namespace {

// The length of the info area at `offset`; 0, with the read's result in `rc`, when it cannot be read.
unsigned infoAreaLength(int node, uint8_t deviceId, uint8_t wordAccess, unsigned offset, unsigned& rc) {
    uint8_t head[fru::infoArea::headerLength];
    unsigned length = sizeof head;
    rc = IpmiIfcReadFru(node, deviceId, wordAccess, static_cast<int>(offset), &length, head);
    if (rc != 0) {
        ipmiLog(LOG_ERR, "IpmiIfruInfoAreaLength: Reading FRU for 0x%x at 0x%x FAILED cc=0x%x", deviceId, offset, rc);
        return 0;
    }
    return head[fru::infoArea::length] * fru::kUnit;
}

// The multi-record chain's length; a failed header read ends it, its result in `rc`.
unsigned multiLength(int node, uint8_t deviceId, unsigned offset, unsigned& rc) {
    const IpmiNode& n = g_IpmiNode[validNode(node) ? node : 0];
    const uint8_t word = cachedWordAccess(n);
    const unsigned areaSize = cachedAreaSize(n);
    unsigned total = 0;
    for (unsigned records = 0;; ++records) {
        // A chain without an end-of-list mark ends at the inventory's end.
        if (records == kMaxMultiRecords || offset + total + fru::multi::headerLength > areaSize) {
            ipmiLog(LOG_INFO, "IpmiIfcFruMultiLength: no end of list before offset 0x%x", offset + total);
            return total;
        }
        uint8_t head[fru::multi::headerLength];
        unsigned length = sizeof head;
        rc = IpmiIfcReadFru(node, deviceId, word, static_cast<int>(offset + total), &length, head);
        if (rc != 0) {
            ipmiLog(LOG_ERR, "IpmiIfcFruMultiLength: Reading FRU Multi Record Header for 0x%x at offset 0x%x FAILED cc=0x%x",
                    deviceId, offset + total, rc);
            return total;
        }
        const fru::MultiRecordHeaderView header(head, sizeof head);
        if (header.dataLength() == 0) {
            ipmiLog(LOG_INFO, "IpmiIfcFruMultiLength: record len is equal to zero, not valid.");
            return total + fru::multi::headerLength;
        }
        total += static_cast<unsigned>(header.recordLength());
        if (header.endOfList()) return total;
    }
}

}  // namespace

int IpmiIfcFruInstantiateAll(int node) {
    if (!validNode(node)) return -1;
    IpmiNode& n = g_IpmiNode[node];
    __atomic_store_n(&fru_max_req_size, kLargestRequest, __ATOMIC_RELAXED);

    // The devices this controller serves, each once, in repository order.
    std::vector<std::vector<uint8_t>> devices;
    std::set<uint8_t> seen;
    for (auto& record : copyLocators(n)) {
        const fru::LocatorView loc(record.data(), record.size());
        if (!loc.logical() || loc.accessAddress() != kBmcAddress || loc.channel() != 0 || loc.accessLun() != 0) {
            ipmiLog(LOG_DEBUG,
                    "IpmiIfcFruInstantiateAll: FRU 0x%x at address 0x%x channel %d skipped: not a logical device of "
                    "this controller",
                    loc.deviceId(), loc.accessAddress(), loc.channel());
            continue;
        }
        if (seen.insert(loc.deviceId()).second) devices.push_back(std::move(record));
    }
    std::map<uint8_t, std::shared_ptr<IpmiFru>> previous;
    for (auto& device : IpmiIfc::getFrus(node)) previous[device->getDeviceId()] = device;

    PassBudget budget;
    t_pass = &budget;
    std::vector<std::shared_ptr<IpmiFru>> read(devices.size());
    const size_t start = g_resumeAt[node] < devices.size() ? g_resumeAt[node] : 0;
    size_t next = 0;
    for (size_t k = 0; k < devices.size(); ++k) {
        const size_t i = (start + k) % devices.size();
        const fru::LocatorView loc(devices[i].data(), devices[i].size());
        auto before = previous.find(loc.deviceId());
        const std::shared_ptr<IpmiFru> old = before != previous.end() ? before->second : nullptr;
        if (n.stopRequested || passSpent()) {
            read[i] = old;  // read on the next pass
            continue;
        }
        read[i] = readDevice(node, loc, old);
        next = (i + 1) % devices.size();
    }
    t_pass = nullptr;
    if (n.stopRequested) return 0;  // the list in place stays
    g_resumeAt[node] = budget.readsLeft <= 0 ? next : 0;

    std::vector<std::shared_ptr<IpmiFru>> found;
    for (auto& device : read)
        if (device) found.push_back(std::move(device));
    {
        // Readers copy the pointers out; the old objects die with their last holder.
        CacheWriteLock guard(n.cacheLock);
        n.frus.swap(found);
    }
    return 0;
}

std::vector<std::shared_ptr<IpmiFru>> IpmiIfc::getFrus(int node) {
    if (!validNode(node)) return {};
    IpmiNode& n = g_IpmiNode[node];
    CacheReadLock guard(n.cacheLock);
    return n.frus;
}

std::vector<std::shared_ptr<IpmiFru>> IpmiIfc::getFrus() { return getFrus(0); }

std::shared_ptr<const IpmiFruOptional> IpmiIfc::getFruPart(int node, uint8_t deviceId, IpmiFru::AreaKind kind) {
    for (const auto& device : getFrus(node))
        if (device->getDeviceId() == deviceId) return device->getArea(kind);
    return nullptr;
}

std::shared_ptr<const IpmiFruOptional> IpmiIfc::getFruPart(uint8_t deviceId, IpmiFru::AreaKind kind) {
    return getFruPart(0, deviceId, kind);
}

ipmiifc_fru_area_info IpmiIfc::getFruDeviceHeader(int node) {
    ipmiifc_fru_area_info out;
    static_assert(sizeof out == sizeof(ipmiifc_fru_state::area_info), "the stored answer is handed out as it is");
    IpmiNode& n = g_IpmiNode[validNode(node) ? node : 0];
    TAV::MutexLock guard(n.fruMutex);
    memcpy(&out, n.fruState.area_info, sizeof out);
    return out;
}

}  // namespace Ipmi
