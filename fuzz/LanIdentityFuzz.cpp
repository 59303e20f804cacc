// The controller's identity and LAN answers from the input: each answer a
// length byte and that many bytes (completion code first), taken in the order
// the library asks; the plain simulated controller answers once they run out.

#include <stddef.h>
#include <stdint.h>

#include "FuzzSupport.h"
#include "IpmiIfc.h"
#include "IpmiLan.h"

using namespace Ipmi;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzSupport::quietLog();
    auto bmc = std::make_shared<Sim::Bmc>();
    FuzzSupport::AnswerScript script(data, size);
    script.answer(*bmc, netfn::app, cmd::getDeviceId);
    script.answer(*bmc, netfn::app, cmd::getSelfTestResults);
    script.answer(*bmc, netfn::app, cmd::getSystemInfoParameters);
    script.answer(*bmc, netfn::app, cmd::getChannelInfo);
    script.answer(*bmc, netfn::transport, cmd::getLanConfigParameters);
    FuzzSupport::begin(bmc);

    uint8_t osName[4] = {0, sysInfoParam::osName, 0, 0};
    uint8_t osVersion[4] = {0, sysInfoParam::osVersion, 0, 0};
    struct {
        uint8_t netfn, cmd;
        uint8_t* request;
        int (*handler)(ipmiifc_resp*);
    } const rows[] = {{netfn::app, cmd::getDeviceId, nullptr, IpmiIfcRhGetDeviceId},
                      {netfn::app, cmd::getSystemInfoParameters, osName, IpmiIfcRhGetOS_Name},
                      {netfn::app, cmd::getSystemInfoParameters, osVersion, IpmiIfcRhGetOS_Version},
                      {netfn::app, cmd::getSelfTestResults, nullptr, IpmiIfcRhGetSelfTest}};
    for (const auto& row : rows) {
        RespHolder resp(IpmiIfcSendCmd(0, row.cmd, row.netfn, 0, row.request ? 4 : 0, row.request, 0));
        if (resp) row.handler(resp.get());
    }
    std::string text = IpmiIfc::GetBmcManufacturer() + IpmiIfc::GetBmcFWVersion() + IpmiIfc::GetBmcIpmiVersion() +
                       IpmiIfc::GetBmcReportedOSName() + IpmiIfc::GetBmcReportedOSVersion();
    ipmiifc_device_id id;
    (void)IpmiIfc::getManagementControllerInfo(0, id);
    unsigned char manufacturer[3];
    unsigned char count = sizeof manufacturer;
    (void)IpmiIfc::getManufacturerId(0, manufacturer, count);

    IpmiLan& lan = *IpmiIfc::getLan(0);
    lan.initChannelNumber(0);
    lan.IpmiIfcLanInstantiate(0);
    text += lan.getMACAddress() + lan.getIPv4Address() + lan.getIPv4Netmask() + lan.getIPv4DefaultGateway();
    for (const std::string& a : lan.getIPv6Addresses()) text += a;
    (void)(lan.isEnabled() + lan.getAddressOrigin() + lan.getChannel());
    FuzzSupport::end();
    return 0;
}
