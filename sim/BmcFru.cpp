// The simulated FRU inventory devices: Get FRU Inventory Area Info and Read
// FRU Data over FruModel, by bytes or by words.

#include <algorithm>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include "Bmc.h"
#include "FruLayout.h"
#include "IpmiCommands.h"

namespace Sim {

using namespace Ipmi;

namespace {

Response ccOnly(uint8_t code) { return Response{code}; }

const FruDeviceModel* device(const Bmc& b, const Request& r) {
    const auto it = b.fru.devices.find(r.data[fru::readRequest::deviceId]);
    return it == b.fru.devices.end() ? nullptr : &it->second;
}

Response areaInfo(Bmc& b, const Request& r) {
    if (r.data.size() != 1) return ccOnly(cc::requestDataLengthInvalid);
    const FruDeviceModel* d = device(b, r);
    if (d == nullptr) return ccOnly(cc::requestedSensorNotPresent);
    const size_t size = d->data.size() > 0xFFFF ? 0xFFFF : d->data.size();
    return Response{cc::ok, static_cast<uint8_t>(size & 0xFF), static_cast<uint8_t>(size >> 8),
                    static_cast<uint8_t>(d->wordAccess ? fru::areaInfoAnswer::wordAccess : 0)};
}

Response readData(Bmc& b, const Request& r) {
    if (r.data.size() != fru::readRequest::length) return ccOnly(cc::requestDataLengthInvalid);
    const FruDeviceModel* d = device(b, r);
    if (d == nullptr) return ccOnly(cc::requestedSensorNotPresent);
    const fru::Bytes req(r.data.data(), r.data.size());
    const size_t unit = d->wordAccess ? 2 : 1;
    const size_t offset = req.le16(fru::readRequest::offset) * unit;
    const size_t count = req.byteAt(fru::readRequest::count) * unit;
    if (count > d->maxReadBytes) return ccOnly(cc::cannotReturnRequestedBytes);
    if (offset >= d->data.size()) return ccOnly(cc::parameterOutOfRange);
    const size_t n = std::min(count, d->data.size() - offset) / unit * unit;
    Response out{cc::ok, static_cast<uint8_t>(n / unit)};
    out.insert(out.end(), d->data.begin() + static_cast<long>(offset), d->data.begin() + static_cast<long>(offset + n));
    return out;
}

}  // namespace

void loadFruImage(Bmc& bmc, uint8_t deviceId, const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) throw std::runtime_error(path + ": cannot open FRU image");
    std::vector<uint8_t> bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    if (bytes.empty() || bytes.size() > 0xFFFF) throw std::runtime_error(path + ": not a FRU image of 1 to 65535 bytes");
    bmc.fru.devices[deviceId].data = std::move(bytes);
}

void registerFruHandlers(Bmc& bmc) {
    bmc.on(netfn::storage, cmd::getFruInventoryAreaInfo, areaInfo);
    bmc.on(netfn::storage, cmd::readFruData, readData);
}

}  // namespace Sim
