#include <fstream>
#include <sstream>
#include <stdexcept>

#include "Bmc.h"

namespace Sim {

namespace {

unsigned long hexValue(const std::string& token, const std::string& where) {
    try {
        size_t used = 0;
        unsigned long v = std::stoul(token, &used, 16);
        if (used != token.size()) throw std::invalid_argument(token);
        return v;
    } catch (const std::exception&) {
        throw std::runtime_error(where + ": not a hexadecimal number: " + token);
    }
}

}  // namespace

std::shared_ptr<Bmc> loadProfile(const std::string& path) {
    std::ifstream in(path);
    if (!in) throw std::runtime_error(path + ": cannot open profile");
    auto bmc = std::make_shared<Bmc>();
    std::string line;
    int lineNo = 0;
    while (std::getline(in, line)) {
        ++lineNo;
        std::string where = path + ":" + std::to_string(lineNo);
        std::istringstream words(line);
        std::vector<std::string> t;
        std::string w;
        while (words >> w) {
            if (w[0] == '#') break;
            t.push_back(w);
        }
        if (t.empty()) continue;
        if (t[0] == "mc_add") {
            if (t.size() < 10) throw std::runtime_error(where + ": mc_add needs 9 arguments");
            if (hexValue(t[1], where) != 0x20) continue;  // other controllers are not modelled yet
            Identity& id = bmc->identity;
            id.deviceId = static_cast<uint8_t>(hexValue(t[2], where));
            id.hasDeviceSdrs = t[3] == "has-device-sdrs" || t[3] == "yes" || t[3] == "1";
            id.deviceRevision = static_cast<uint8_t>(hexValue(t[4], where));
            id.fwMajor = static_cast<uint8_t>(hexValue(t[5], where));
            id.fwMinor = static_cast<uint8_t>(hexValue(t[6], where));
            id.additionalSupport = static_cast<uint8_t>(hexValue(t[7], where));
            id.manufacturerId = static_cast<uint32_t>(hexValue(t[8], where));
            id.productId = static_cast<uint16_t>(hexValue(t[9], where));
        }
        // Commands not modelled yet are skipped.
    }
    return bmc;
}

std::string defaultProfilePath() {
#ifdef TAV_IPMI_SIM_PROFILE_DIR
    return std::string(TAV_IPMI_SIM_PROFILE_DIR) + "/default.emu";
#else
    return "sim/profiles/default.emu";
#endif
}

}  // namespace Sim
