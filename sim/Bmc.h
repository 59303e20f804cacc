#ifndef TAV_IPMI_SIM_BMC_H
#define TAV_IPMI_SIM_BMC_H

// The simulated controller: a model plus a table of command handlers.

#include <stdint.h>

#include <functional>
#include <map>
#include <string>
#include <vector>

#include "BmcModels.h"
#include "Sim.h"

namespace Sim {

struct Identity {
    uint8_t deviceId = 0x20;
    uint8_t deviceRevision = 0x01;
    uint8_t fwMajor = 0x02;  // bit 7 clear: device available
    uint8_t fwMinor = 0x10;  // BCD
    uint8_t ipmiVersion = 0x02;
    uint8_t additionalSupport = 0xBF;
    uint32_t manufacturerId = 674;
    uint16_t productId = 0x0100;
    uint8_t auxFw[4] = {0, 0, 0, 0};
    bool hasDeviceSdrs = false;
    // The system GUID Get System GUID answers; empty: the command is refused.
    std::vector<uint8_t> guid;
};

// One system information parameter, stored as the 16-byte blocks a Set wrote.
struct SysInfoParameter {
    std::map<uint8_t, std::vector<uint8_t>> blocks;  // set selector -> 16 bytes
};

class Bmc {
public:
    using Handler = std::function<Response(Bmc&, const Request&)>;

    Bmc();
    virtual ~Bmc() = default;

    // Registers (or replaces) the handler of one command.
    void on(uint8_t netfn, uint8_t cmd, Handler handler);
    // Answers a request; 0xC1 for a command it does not know.
    Response handle(const Request& req);

    // Sets a string parameter (4 = OS name, 5 = OS version) as a host would.
    void setSystemInfoString(uint8_t parameter, const std::string& value, uint8_t encoding = 0);
    std::string systemInfoString(uint8_t parameter) const;

    Identity identity;
    uint8_t selfTestResult = 0x55;
    uint8_t selfTestDetail = 0x00;
    std::map<uint8_t, SysInfoParameter> systemInfo;
    uint8_t identifyInterval = 0;
    bool identifyForced = false;
    SdrModel sdr;
    std::vector<SensorModel> sensors;
    SelModel sel;
    LanModel lan;
    FruModel fru;
    // Other controllers on IPMB (management engine, backplanes...), by slave address.
    std::map<uint8_t, Identity> satellites;

    // The sensor a request addresses, or null.
    SensorModel* findSensor(uint8_t owner, uint8_t lun, uint8_t number);

private:
    void registerStandardHandlers();
    std::map<uint16_t, Handler> handlers_;
};

// Each area registers its command handlers on a new controller.
void registerSdrHandlers(Bmc& bmc);
void registerSensorHandlers(Bmc& bmc);
void registerSelHandlers(Bmc& bmc);
void registerLanHandlers(Bmc& bmc);
void registerFruHandlers(Bmc& bmc);

// The controller's SEL clock (host time plus the offset Set SEL Time left).
uint32_t selClock(const Bmc& bmc);
// Logs a record as Add SEL Entry would: the next record ID and, for records
// with a time stamp, the SEL clock unless `keepTimestamp`. Returns the record
// ID, or 0 when the log is full (the overflow flag is then set).
uint16_t addSelRecord(Bmc& bmc, const uint8_t record[16], bool keepTimestamp = false);
// Empties the log and stamps the erase time.
void clearSelRecords(Bmc& bmc);
// Appends the records of a SEL file (16-byte records back to back) as they
// are, IDs and time stamps included.
// Throws std::runtime_error("file: message") when it cannot be read or is cut short.
void loadSelDump(Bmc& bmc, const std::string& path);

// Builds a controller from an ipmi_sim emulator command file, or the generated
// large server that "generated:N" names (GeneratedServer.h).
// Throws std::runtime_error("file:line: message") on a syntax error.
std::shared_ptr<Bmc> loadProfile(const std::string& path);
// The project's own profile of a plausible server.
std::string defaultProfilePath();
// Appends the records of an `ipmitool sdr dump` file (whole records back to
// back, 5-byte header + body) to the controller's SDR repository.
// Throws std::runtime_error("file: message") when it cannot be read or is cut short.
void loadSdrDump(Bmc& bmc, const std::string& path);
// Serves a raw FRU image file (offset 0 = common header) as FRU device `deviceId`.
// Throws std::runtime_error("file: message") when it cannot be read.
void loadFruImage(Bmc& bmc, uint8_t deviceId, const std::string& path);

}  // namespace Sim

#endif
