// The simulated SDR repository: Get SDR Repository Info, Reserve SDR
// Repository and Get SDR over SdrModel, the device SDR commands of a
// controller that has device SDRs, and a loader for `ipmitool sdr dump` files.

#include <fstream>
#include <iterator>
#include <stdexcept>

#include "Bmc.h"
#include "IpmiCommands.h"
#include "SdrLayout.h"

namespace Sim {

using namespace Ipmi;

namespace {

constexpr uint16_t kFirstRecord = 0x0000;
constexpr uint16_t kNoMoreRecords = 0xFFFF;
constexpr uint8_t kWholeRecord = 0xFF;
// Nominal repository size that the free space is counted from.
constexpr size_t kRepositoryBytes = 0x4000;

// Get SDR request: reservation (LE), record id (LE), offset, bytes to read.
constexpr size_t kGetSdrRequestBytes = 6;
constexpr size_t kReqReservation = 0;
constexpr size_t kReqRecordId = 2;
constexpr size_t kReqOffset = 4;
constexpr size_t kReqCount = 5;

// Get Device SDR Info: request bit 0 asks for the SDR count instead of the sensor count.
constexpr uint8_t kCountSdrs = 0x01;
constexpr uint8_t kStaticPopulationLun0 = 0x01;

Response ccOnly(uint8_t code) { return Response{code}; }

uint16_t le16(const std::vector<uint8_t>& d, size_t at) { return static_cast<uint16_t>(d[at] | (d[at + 1] << 8)); }

void putLe16(Response& r, uint16_t v) {
    r.push_back(static_cast<uint8_t>(v & 0xFF));
    r.push_back(static_cast<uint8_t>(v >> 8));
}

void putLe32(Response& r, uint32_t v) {
    for (int i = 0; i < 4; ++i) r.push_back(static_cast<uint8_t>((v >> (8 * i)) & 0xFF));
}

uint16_t recordIdOf(const std::vector<uint8_t>& record) {
    return sdr::SdrView(record.data(), record.size()).recordId();
}

// The record a Get SDR names (0x0000: the first one), or records.size().
size_t findRecord(const SdrModel& m, uint16_t id) {
    if (id == kFirstRecord) return 0;
    for (size_t i = 0; i < m.records.size(); ++i)
        if (recordIdOf(m.records[i]) == id) return i;
    return m.records.size();
}

uint16_t recordCount(const SdrModel& m) {
    return m.records.size() > 0xFFFF ? 0xFFFF : static_cast<uint16_t>(m.records.size());
}

uint16_t freeSpace(const SdrModel& m) {
    size_t used = 0;
    for (const auto& r : m.records) used += r.size();
    return used >= kRepositoryBytes ? 0 : static_cast<uint16_t>(kRepositoryBytes - used);
}

bool isSensorRecord(const std::vector<uint8_t>& record) {
    const sdr::SdrView r(record.data(), record.size());
    return r.isFullOrCompact() || r.isEventOnly();
}

uint16_t grantReservation(SdrModel& m) {
    // A new reservation cancels the one before; 0 is never granted.
    m.reservation = static_cast<uint16_t>(m.reservation + 1);
    if (m.reservation == 0) m.reservation = 1;
    return m.reservation;
}

Response repositoryInfo(Bmc& b, const Request& r) {
    if (!r.data.empty()) return ccOnly(cc::requestDataLengthInvalid);
    const SdrModel& m = b.sdr;
    Response out{cc::ok, m.version};
    putLe16(out, recordCount(m));
    putLe16(out, freeSpace(m));
    putLe32(out, m.additionTimestamp);
    putLe32(out, m.eraseTimestamp);
    out.push_back(m.operationSupport);
    return out;
}

Response reserve(Bmc& b, const Request& r) {
    if (!r.data.empty()) return ccOnly(cc::requestDataLengthInvalid);
    Response out{cc::ok};
    putLe16(out, grantReservation(b.sdr));
    return out;
}

// Get SDR and Get Device SDR: next record id, then the slice asked for.
Response readRecord(Bmc& b, const Request& r) {
    if (r.data.size() != kGetSdrRequestBytes) return ccOnly(cc::requestDataLengthInvalid);
    const SdrModel& m = b.sdr;
    const uint16_t reservation = le16(r.data, kReqReservation);
    const uint8_t offset = r.data[kReqOffset];
    const uint8_t count = r.data[kReqCount];
    // A partial read needs the current reservation; a read from offset 0 needs none.
    if (offset != 0 && (m.reservation == 0 || reservation != m.reservation))
        return ccOnly(cc::reservationCancelled);
    const size_t index = findRecord(m, le16(r.data, kReqRecordId));
    if (index >= m.records.size()) return ccOnly(cc::requestedSensorNotPresent);
    const std::vector<uint8_t>& record = m.records[index];
    if (offset >= record.size()) return ccOnly(cc::parameterOutOfRange);
    const size_t left = record.size() - offset;
    const size_t asked = count == kWholeRecord ? left : count;
    if (asked > m.maxReadBytes) return ccOnly(cc::cannotReturnRequestedBytes);
    const size_t n = asked < left ? asked : left;

    Response out{cc::ok};
    putLe16(out, index + 1 < m.records.size() ? recordIdOf(m.records[index + 1]) : kNoMoreRecords);
    out.insert(out.end(), record.begin() + offset, record.begin() + static_cast<long>(offset + n));
    return out;
}

Response deviceSdrInfo(Bmc& b, const Request& r) {
    if (r.data.size() > 1) return ccOnly(cc::requestDataLengthInvalid);
    const bool countSdrs = !r.data.empty() && (r.data[0] & kCountSdrs);
    size_t n = 0;
    for (const auto& record : b.sdr.records)
        if (countSdrs || isSensorRecord(record)) ++n;
    return Response{cc::ok, static_cast<uint8_t>(n > 0xFF ? 0xFF : n), kStaticPopulationLun0};
}

// Device SDR commands answer only on a controller that says it has device SDRs.
Bmc::Handler whenDeviceSdrs(Bmc::Handler handler) {
    return [handler](Bmc& b, const Request& r) {
        if (!b.identity.hasDeviceSdrs) return ccOnly(cc::invalidCommand);
        return handler(b, r);
    };
}

}  // namespace

void registerSdrHandlers(Bmc& bmc) {
    bmc.on(netfn::storage, cmd::getSdrRepositoryInfo, repositoryInfo);
    bmc.on(netfn::storage, cmd::reserveSdrRepository, reserve);
    bmc.on(netfn::storage, cmd::getSdr, readRecord);
    bmc.on(netfn::sensorEvent, cmd::getDeviceSdrInfo, whenDeviceSdrs(deviceSdrInfo));
    bmc.on(netfn::sensorEvent, cmd::reserveDeviceSdrRepository, whenDeviceSdrs(reserve));
    bmc.on(netfn::sensorEvent, cmd::getDeviceSdr, whenDeviceSdrs(readRecord));
}

void loadSdrDump(Bmc& bmc, const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) throw std::runtime_error(path + ": cannot open SDR dump");
    const std::vector<uint8_t> bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::vector<std::vector<uint8_t>> records;
    size_t at = 0;
    while (at < bytes.size()) {
        if (bytes.size() - at < sdr::header::length)
            throw std::runtime_error(path + ": record header cut short at byte " + std::to_string(at));
        const size_t size = sdr::header::length + bytes[at + sdr::header::remainingLength];
        if (bytes.size() - at < size)
            throw std::runtime_error(path + ": record cut short at byte " + std::to_string(at));
        records.emplace_back(bytes.begin() + static_cast<long>(at), bytes.begin() + static_cast<long>(at + size));
        at += size;
    }
    bmc.sdr.records.insert(bmc.sdr.records.end(), records.begin(), records.end());
}

}  // namespace Sim
