// Controller identity and host properties: the one-shot commands run at
// start, the stored Get Device ID answer and what is derived from it, and the
// host OS name and version kept in the controller's system info parameters.

#include <stdio.h>
#include <string.h>

#include <exception>
#include <map>
#include <string>

#include "IpmiIfcInternal.h"
#include "IpmiLan.h"

namespace Ipmi {

bool IpmiIfc::hpe_bmc = false;

// The host OS name and version as the controller reports them; replaced by a
// swap once a read is complete, empty until then.
std::string os_name;
std::string os_version;

pthread_mutex_t manNameInitMut = PTHREAD_MUTEX_INITIALIZER;

namespace {


// Get System Info Parameters answer for a string parameter.
namespace sysInfoByte {
constexpr size_t setSelector = 2;
constexpr size_t encoding = 3;      // block 0 only, low nibble
constexpr size_t stringLength = 4;  // block 0 only
constexpr size_t firstString = 5;   // block 0: string bytes from here
// Blocks 1..: taken from the set selector on, so each later block puts its
// selector byte (shown as a space) in front of its 16 string bytes. Hosts
// that read the name back know it in this form.
constexpr size_t laterString = setSelector;
}  // namespace sysInfoByte

constexpr size_t kSetBlockBytes = 18;        // parameter, set selector, 16 data bytes
constexpr size_t kFirstChunkOffset = 4;      // after parameter, selector, encoding, length
constexpr size_t kLaterChunkOffset = 2;      // after parameter, selector
constexpr uint8_t kEncodingAscii = 0;        // ASCII / Latin-1
constexpr int kBlocksForOtherEncodings = 4;

IpmiNode& responseNode(const ipmiifc_resp* r) {
    int node = r->node;
    return g_IpmiNode[(node >= 0 && node < IPMI_NODE_COUNT) ? node : 0];
}

bool printable(uint8_t c) { return c >= 0x20 && c < 0x7F; }

void appendPrintable(std::string& out, const uint8_t* bytes, size_t count) {
    for (size_t i = 0; i < count; ++i) out.push_back(printable(bytes[i]) ? static_cast<char>(bytes[i]) : ' ');
}

// The two string parameters differ only in number, target and wording.
struct OsStringParameter {
    uint8_t parameter;
    std::string* target;
    const char* handlerName;
    const char* plural;    // "Names" / "Versions"
    const char* variable;  // "os_name" / "os_version"
};

int readOsString(ipmiifc_resp* r, const OsStringParameter& p) {
    if (r->cc == cc::parameterNotSupported) {
        ipmiLog(LOG_WARNING, "%s: BMC does not support OS %s retrieval", p.handlerName, p.plural);
        return -1;
    }
    if (r->cc != 0) {
        ipmiLog(LOG_ERR, "%s: retrieve %s failed cc=0x%x", p.handlerName, p.variable, r->cc);
        return -1;
    }
    const int firstLength = static_cast<int>(r->data_len);
    if (r->data_len < sysInfoByte::firstString + 1) {
        ipmiLog(LOG_ERR, "%s: retrieve %s failed short buffer read (%d)", p.handlerName, p.variable, firstLength);
        return -1;
    }
    int blocks = kBlocksForOtherEncodings;
    if ((r->data[sysInfoByte::encoding] & 0x0F) == kEncodingAscii) {
        // Enough 16-byte blocks for the encoding byte, the length byte and the string.
        blocks = (r->data[sysInfoByte::stringLength] + 17) / 16;
    }

    std::string value;
    appendPrintable(value, r->data + sysInfoByte::firstString, r->data_len - sysInfoByte::firstString);
    for (int selector = 1; selector < blocks; ++selector) {
        uint8_t request[4] = {0, p.parameter, static_cast<uint8_t>(selector), 0};
        ipmiifc_req req;
        memset(&req, 0, sizeof req);
        req.netfn = netfn::app;
        req.cmd = cmd::getSystemInfoParameters;
        req.data_len = sizeof request;
        req.data = request;
        RespHolder block(IpmiIfcSend(r->node, &req, 0));
        if (!block) return -1;
        if (block->data_len < sysInfoByte::laterString + 1) {
            ipmiLog(LOG_ERR, "%s: retrieve %s failed short buffer read (%d)", p.handlerName, p.variable,
                    firstLength);
            return -1;
        }
        appendPrintable(value, block->data + sysInfoByte::laterString, block->data_len - sysInfoByte::laterString);
    }
    p.target->swap(value);
    return 0;
}

uint8_t osNameRequest[4] = {0, sysInfoParam::osName, 0, 0};
uint8_t osVersionRequest[4] = {0, sysInfoParam::osVersion, 0, 0};

int rhGetSdrInfoRow(ipmiifc_resp* r) { return static_cast<int>(IpmiIfcRhGetSdrInfo(r)); }

ipmiifc_req rowRequest(uint8_t netfnValue, uint8_t cmdValue, uint16_t length = 0, uint8_t* data = nullptr) {
    ipmiifc_req req{};
    req.netfn = netfnValue;
    req.cmd = cmdValue;
    req.data_len = length;
    req.data = data;
    return req;
}

// One command sent once when the interface comes up.
struct OneShotCommand {
    uint32_t enabled;
    int (*handler)(ipmiifc_resp*);
    ipmiifc_req request;
    uint32_t flags;
};

// Get SEL Info stays switched off here: the polling loop reads it on every pass.
const OneShotCommand one_shot_list_cmd[] = {
    {1, IpmiIfcRhGetDeviceId, rowRequest(netfn::app, cmd::getDeviceId), 0},
    {1, IpmiIfcRhGetOS_Name, rowRequest(netfn::app, cmd::getSystemInfoParameters, 4, osNameRequest), 0},
    {1, IpmiIfcRhGetOS_Version, rowRequest(netfn::app, cmd::getSystemInfoParameters, 4, osVersionRequest), 0},
    {1, IpmiIfcRhGetSelfTest, rowRequest(netfn::app, cmd::getSelfTestResults), 0},
    {1, rhGetSdrInfoRow, rowRequest(netfn::storage, cmd::getSdrRepositoryInfo), 0},
    {0, IpmiIfcRhSelInfoNoCount, rowRequest(netfn::storage, cmd::getSelInfo), 0},
    {1, IpmiIfcRhSelGetAllocInfo, rowRequest(netfn::storage, cmd::getSelAllocationInfo), 0},
};
constexpr int kOneShotRows = sizeof one_shot_list_cmd / sizeof one_shot_list_cmd[0];

std::string dottedVersion(unsigned major, const char* minorFormat, unsigned minor) {
    char minorText[8];
    snprintf(minorText, sizeof minorText, minorFormat, minor);
    return std::to_string(major) + "." + minorText;
}

const uint8_t* storedDeviceId() { return g_IpmiNode[0].deviceId; }

}  // namespace

int IpmiIfcDataGet(int count) {
    if (count > kOneShotRows) count = kOneShotRows;
    for (int row = 0; row < count; ++row) {
        const OneShotCommand& c = one_shot_list_cmd[row];
        if (c.enabled != 1) continue;
        ipmiifc_req req = c.request;
        RespHolder resp(IpmiIfcSend(0, &req, static_cast<int>(c.flags)));
        if (resp) c.handler(resp.get());
    }
    return 0;
}

int IpmiIfcRhGetDeviceId(ipmiifc_resp* r) {
    if (r == nullptr || r->cc != 0) return -1;
    IpmiNode& n = responseNode(r);
    TAV::MutexLock guard(n.devInfoMutex);
    // Bytes the controller did not send are stored as zeros, not as stale buffer.
    size_t got = r->data_len < deviceIdAnswer::size ? r->data_len : deviceIdAnswer::size;
    memset(n.deviceId, 0, sizeof n.deviceId);
    memcpy(n.deviceId, r->data, got);
    std::string manufacturer = IpmiIfc::GetBmcManufacturer();
    std::string firmware = IpmiIfc::GetBmcFWVersion();
    ipmiLog(LOG_CRIT, "%s: BMC mfg is %s FW: %s", "IpmiIfcRhGetDeviceId", manufacturer.c_str(), firmware.c_str());
    if (manufacturer.find("Hewlett") != std::string::npos) IpmiIfc::hpe_bmc = true;
    return 0;
}

int IpmiIfcRhGetSelfTest(ipmiifc_resp* r) {
    if (r == nullptr || r->cc != 0) return -1;
    IpmiNode& n = responseNode(r);
    TAV::MutexLock guard(n.devInfoMutex);
    memset(n.selfTest, 0, sizeof n.selfTest);
    memcpy(n.selfTest, r->data, r->data_len < sizeof n.selfTest ? r->data_len : sizeof n.selfTest);
    return 0;
}

int IpmiIfcRhGetOS_Name(ipmiifc_resp* r) {
    if (r == nullptr) return -1;
    return readOsString(r, {sysInfoParam::osName, &os_name, "IpmiIfcRhGetOS_Name", "Names", "os_name"});
}

int IpmiIfcRhGetOS_Version(ipmiifc_resp* r) {
    if (r == nullptr) return -1;
    return readOsString(r, {sysInfoParam::osVersion, &os_version, "IpmiIfcRhGetOS_Version", "Versions", "os_version"});
}

std::string IpmiIfc::GetBmcReportedOSName() { return os_name; }

std::string IpmiIfc::GetBmcReportedOSVersion() { return os_version; }

// Firmware revision 1 is masked with 0x3F, not 0x7F: kept as callers know it.
std::string IpmiIfc::GetBmcFWVersion() {
    const uint8_t* id = storedDeviceId();
    return dottedVersion(id[deviceIdAnswer::fwRev1] & 0x3F, "%x", id[deviceIdAnswer::fwRev2]);
}

// The IPMI version byte holds the major version in its low nibble.
std::string IpmiIfc::GetBmcIpmiVersion() {
    const uint8_t v = storedDeviceId()[deviceIdAnswer::ipmiVersion];
    return dottedVersion(v & 0x0F, "%u", v >> 4);
}

typedef uint32_t IPMI_OEM;

const char* IpmiIfc::getManufacturerName(unsigned int id) {
    static std::map<IPMI_OEM, const char*> vendorNames;
    static bool manNameInit = true;
    if (__atomic_load_n(&manNameInit, __ATOMIC_ACQUIRE)) {
        PlainMutexLock guard(manNameInitMut);
        if (__atomic_load_n(&manNameInit, __ATOMIC_RELAXED)) {
            static const struct {
                IPMI_OEM number;
                const char* name;
            } table[] = {
                {0, "Unknown"},
                {2, "IBM"},
                {9, "Cisco Systems"},
                {11, "Hewlett-Packard"},
                {42, "Sun Microsystems"},
                {63, "Apple"},
                {94, "Nokia"},
                {116, "Hitachi, Ltd."},
                {119, "NEC Corporation"},
                {186, "Toshiba Corporation"},
                {343, "Intel Corporation"},
                {373, "Tatung Co., Ltd."},
                {399, "Hitachi Computer Products (America), Inc."},
                {674, "Dell Inc."},
                {1372, "LSI Logic"},
                {2168, "LMC Lan Management Consulting GmbH"},
                {4337, "RadiSys Corp."},
                {4413, "Broadcom Corporation"},
                {5593, "Magnum Technologies Inc."},
                {6653, "Tyan Computer Corporation"},
                {9237, "Newisys"},
                {10368, "Fujitsu Siemens Computers"},
                {10418, "Avocent Corporation"},
                {10437, "Peppercon AG"},
                {10876, "Super Micro Computer Inc."},
                {11102, "OSA Technologies Inc."},
                {12634, "PICMG"},
                {13742, "Raritan Computer, Inc."},
                {15000, "Kontron Canada Inc."},
                {20974, "American Megatrends, Inc"},  // no final point: callers match this text
                {19046, "Lenovo Group"},
            };
            for (const auto& row : table) vendorNames.emplace(row.number, row.name);
            __atomic_store_n(&manNameInit, false, __ATOMIC_RELEASE);
        }
    }
    auto it = vendorNames.find(id);
    return it == vendorNames.end() ? "Unknown" : it->second;
}

std::string IpmiIfc::GetBmcManufacturer() {
    ipmiifc_device_id info;
    if (getManagementControllerInfo(0, info) != 0) return "n/a";
    unsigned id = info.manufacturer_id[0] | (info.manufacturer_id[1] << 8) | (info.manufacturer_id[2] << 16);
    return getManufacturerName(id);
}

// `count` is 1 although three bytes are written: callers take them as one id.
int IpmiIfc::getManufacturerId(int, unsigned char* id, unsigned char& count) {
    const uint8_t* stored = storedDeviceId();
    if (stored[deviceIdAnswer::completionCode] != 0 || id == nullptr) return 1;
    memcpy(id, stored + deviceIdAnswer::manufacturer, 3);
    count = 1;
    return 0;
}

int IpmiIfc::getManufacturerId(unsigned char* id, unsigned char& count) { return getManufacturerId(0, id, count); }

int IpmiIfc::getManagementControllerInfo(int, ipmiifc_device_id& out) {
    const uint8_t* stored = storedDeviceId();
    if (stored[deviceIdAnswer::completionCode] != 0) return 1;
    static_assert(sizeof(ipmiifc_device_id) == deviceIdAnswer::size, "device id record is 16 bytes");
    memcpy(&out, stored, sizeof out);
    return 0;
}

int IpmiIfc::identifyChassis(int, unsigned char interval, unsigned char force) {
    uint8_t request[2];
    if (force & 1) {
        request[0] = 0;  // interval ignored: on until switched off
        request[1] = 1;
    } else {
        request[0] = interval;
        request[1] = 0;
    }
    uint8_t answer[1];
    uint16_t answerLength = sizeof answer;
    uint8_t rc = sendCmd(0, cmd::chassisIdentify, netfn::chassis, sizeof request, request, &answerLength, answer);
    if (rc == cc::invalidCommand || rc == cc::illegalForSensorType) return 1;  // not supported here
    return rc;
}

int IpmiIfc::identifyChassis(unsigned char interval, unsigned char force) { return identifyChassis(0, interval, force); }

int IpmiIfc::convertToGeneratorId(int address, int channel, int lun) {
    return (address & 0xFF) | ((lun & 3) << 8) | ((channel << 12) & 0xFFFF);
}

// For a process without a running interface: opens and closes the device itself.
IpmiLan* IpmiIfc::GetBMCNetworking() {
    try {
        IpmiIfcOpenIpmiOpen(0);
        getLan(0)->IpmiIfcLanInstantiate(0);
        IpmiIfcDataGet(3);  // device id, OS name, OS version
        IpmiIfcOpenIpmiClose(0);
    } catch (const std::exception& e) {
        ipmiLog(LOG_ERR, "%s: unexpected exception retrieving bmc config state %s", "GetBMCNetworking", e.what());
        IpmiIfcOpenIpmiClose(0);
        throw;
    }
    return getLan(0);
}

// The controller takes the string length from block 0; later blocks are sent
// whole, so a short last block carries leftover bytes of the block before.
bool set_bmc_prop(const char* value, unsigned int length, unsigned char parameter, unsigned char* ccOut) {
    if (length == 0) return true;
    if (value == nullptr) return false;
    const std::string text(value, length);
    uint8_t block[kSetBlockBytes];
    memset(block, 0, sizeof block);
    block[0] = parameter;
    block[2] = kEncodingAscii;
    block[3] = static_cast<uint8_t>(length);

    bool ok = true;
    unsigned int sent = 0;
    for (unsigned int selector = 0; sent < length; ++selector) {
        block[1] = static_cast<uint8_t>(selector);
        const size_t offset = selector == 0 ? kFirstChunkOffset : kLaterChunkOffset;
        const unsigned int room = static_cast<unsigned int>(kSetBlockBytes - offset);
        const unsigned int chunk = length - sent < room ? length - sent : room;
        memcpy(block + offset, value + sent, chunk);
        IpmiIfcNextMsgId(0);  // every block uses up two message ids
        RespHolder resp(IpmiIfcSendCmd(0, cmd::setSystemInfoParameters, netfn::app, 0, sizeof block, block, 0));
        if (!resp) {
            ipmiLog(LOG_DEBUG, "%s: No response to prop=%d, val='%s'", "set_bmc_prop", parameter, text.c_str());
            ok = false;
        } else if (resp->cc != 0) {
            ipmiLog(LOG_DEBUG, "%s: set bmc prop=%d/%s failed cc=0x%x", "set_bmc_prop", parameter, text.c_str(),
                    resp->cc);
            if (ccOut) *ccOut = resp->cc;
            ok = false;
        }
        sent += chunk;
    }
    return ok;
}

// Meant for a process in which the interface is not running; the device is
// left open on the normal path.
bool IpmiIfc::SetOSInfo(const std::string& osName, const std::string& osVersion) {
    try {
        ipmiLog(LOG_INFO, "%s: seting bmc osname='%s', version='%s'", "SetOSInfo", osName.c_str(), osVersion.c_str());
        IpmiIfcOpenIpmiOpen(0);
        unsigned char code = 0;
        std::string name = osName;
        bool result = true;
        if (!osVersion.empty()) {
            bool written = set_bmc_prop(osVersion.data(), static_cast<unsigned int>(osVersion.size()),
                                        sysInfoParam::osVersion, &code);
            if (!written) {
                // A controller without a version parameter gets it behind the name.
                if (code == cc::parameterNotSupported && !osName.empty()) {
                    name += " " + osVersion;
                } else {
                    result = false;
                }
            }
        }
        if (!name.empty()) {
            result = set_bmc_prop(name.data(), static_cast<unsigned int>(name.size()), sysInfoParam::osName, &code);
        }
        return result;
    } catch (const std::exception& e) {
        ipmiLog(LOG_ERR, "%s: unexpected exception retrieving bmc config state %s", "SetOSInfo", e.what());
        IpmiIfcOpenIpmiClose(0);
        return false;
    }
}

}  // namespace Ipmi
