#include "Bmc.h"

#include <algorithm>

#include "IpmiCommands.h"

namespace Sim {

using namespace Ipmi;

namespace {
uint16_t key(uint8_t netfn, uint8_t cmd) { return static_cast<uint16_t>(((netfn & 0xFE) << 8) | cmd); }

Response ccOnly(uint8_t code) { return Response{code}; }

bool lengthIs(const Request& r, size_t n) { return r.data.size() == n; }
}  // namespace

Bmc::Bmc() {
    registerStandardHandlers();
    registerSdrHandlers(*this);
    registerSensorHandlers(*this);
    registerSelHandlers(*this);
    registerLanHandlers(*this);
    registerFruHandlers(*this);
}

SensorModel* Bmc::findSensor(uint8_t owner, uint8_t lun, uint8_t number) {
    for (auto& s : sensors)
        if (s.owner == owner && s.lun == lun && s.number == number) return &s;
    return nullptr;
}

void Bmc::on(uint8_t netfn, uint8_t cmd, Handler handler) { handlers_[key(netfn, cmd)] = std::move(handler); }

Response Bmc::handle(const Request& req) {
    auto it = handlers_.find(key(req.netfn, req.cmd));
    if (it == handlers_.end()) return ccOnly(cc::invalidCommand);
    return it->second(*this, req);
}

void Bmc::setSystemInfoString(uint8_t parameter, const std::string& value, uint8_t encoding) {
    SysInfoParameter p;
    std::vector<uint8_t> bytes;
    bytes.push_back(encoding);
    bytes.push_back(static_cast<uint8_t>(value.size()));
    bytes.insert(bytes.end(), value.begin(), value.end());
    uint8_t selector = 0;
    for (size_t i = 0; i < bytes.size(); i += 16, ++selector) {
        std::vector<uint8_t> block(16, 0);
        for (size_t j = 0; j < 16 && i + j < bytes.size(); ++j) block[j] = bytes[i + j];
        p.blocks[selector] = block;
    }
    systemInfo[parameter] = p;
}

std::string Bmc::systemInfoString(uint8_t parameter) const {
    auto it = systemInfo.find(parameter);
    if (it == systemInfo.end() || it->second.blocks.empty()) return std::string();
    std::vector<uint8_t> bytes;
    for (const auto& b : it->second.blocks) bytes.insert(bytes.end(), b.second.begin(), b.second.end());
    if (bytes.size() < 2) return std::string();
    size_t len = bytes[1];
    if (len > bytes.size() - 2) len = bytes.size() - 2;
    return std::string(bytes.begin() + 2, bytes.begin() + 2 + static_cast<long>(len));
}

void Bmc::registerStandardHandlers() {
    on(netfn::app, cmd::getDeviceId, [](Bmc& b, const Request& r) {
        if (!lengthIs(r, 0)) return ccOnly(cc::requestDataLengthInvalid);
        const Identity& id = b.identity;
        return Response{cc::ok,
                        id.deviceId,
                        static_cast<uint8_t>((id.hasDeviceSdrs ? 0x80 : 0) | (id.deviceRevision & 0x0F)),
                        static_cast<uint8_t>(id.fwMajor & 0x7F),
                        id.fwMinor,
                        id.ipmiVersion,
                        id.additionalSupport,
                        static_cast<uint8_t>(id.manufacturerId & 0xFF),
                        static_cast<uint8_t>((id.manufacturerId >> 8) & 0xFF),
                        static_cast<uint8_t>((id.manufacturerId >> 16) & 0x0F),
                        static_cast<uint8_t>(id.productId & 0xFF),
                        static_cast<uint8_t>(id.productId >> 8),
                        id.auxFw[0],
                        id.auxFw[1],
                        id.auxFw[2],
                        id.auxFw[3]};
    });
    on(netfn::app, cmd::getSystemGuid, [](Bmc& b, const Request& r) {
        if (b.identity.guid.empty()) return ccOnly(cc::invalidCommand);
        if (!lengthIs(r, 0)) return ccOnly(cc::requestDataLengthInvalid);
        Response out{cc::ok};
        out.insert(out.end(), b.identity.guid.begin(), b.identity.guid.end());
        return out;
    });
    on(netfn::app, cmd::getSelfTestResults, [](Bmc& b, const Request& r) {
        if (!lengthIs(r, 0)) return ccOnly(cc::requestDataLengthInvalid);
        return Response{cc::ok, b.selfTestResult, b.selfTestDetail};
    });
    on(netfn::app, cmd::getSystemInfoParameters, [](Bmc& b, const Request& r) {
        if (!lengthIs(r, 4)) return ccOnly(cc::requestDataLengthInvalid);
        const uint8_t revision = 0x11;
        if (r.data[0] & 0x80) return Response{cc::ok, revision};  // revision only
        auto p = b.systemInfo.find(r.data[1]);
        if (p == b.systemInfo.end()) return ccOnly(cc::parameterNotSupported);
        uint8_t selector = r.data[2];
        auto block = p->second.blocks.find(selector);
        // Completion code, revision, set selector, then one 16-byte block.
        Response out(3 + 16, 0);
        out[0] = cc::ok;
        out[1] = revision;
        out[2] = selector;
        if (block != p->second.blocks.end()) {
            size_t n = block->second.size() < 16 ? block->second.size() : 16;
            std::copy_n(block->second.begin(), n, out.begin() + 3);
        }
        return out;
    });
    on(netfn::app, cmd::setSystemInfoParameters, [](Bmc& b, const Request& r) {
        if (r.data.size() < 2) return ccOnly(cc::requestDataLengthInvalid);
        uint8_t parameter = r.data[0];
        if (parameter != 4 && parameter != 5 && parameter != 1 && parameter != 2 && parameter != 3)
            return ccOnly(cc::parameterNotSupported);
        if (r.data.size() > 18) return ccOnly(cc::requestDataLengthInvalid);
        std::vector<uint8_t> block(r.data.begin() + 2, r.data.end());
        block.resize(16, 0);
        b.systemInfo[parameter].blocks[r.data[1]] = block;
        return ccOnly(cc::ok);
    });
    on(netfn::chassis, cmd::chassisIdentify, [](Bmc& b, const Request& r) {
        if (r.data.size() > 2) return ccOnly(cc::requestDataLengthInvalid);
        b.identifyInterval = r.data.empty() ? 15 : r.data[0];
        b.identifyForced = r.data.size() == 2 && (r.data[1] & 1);
        return ccOnly(cc::ok);
    });
}

}  // namespace Sim
