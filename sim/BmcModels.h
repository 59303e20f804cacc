#ifndef TAV_IPMI_SIM_BMCMODELS_H
#define TAV_IPMI_SIM_BMCMODELS_H

// State of the simulated controller, one structure per area. Each area's
// command handlers live in their own file (BmcSdr.cpp, BmcSensors.cpp, ...).

#include <stdint.h>

#include <map>
#include <string>
#include <vector>

namespace Sim {

// SDR repository: whole records (5-byte header + body), in repository order.
struct SdrModel {
    std::vector<std::vector<uint8_t>> records;
    uint8_t version = 0x51;
    uint16_t reservation = 0;  // 0: none granted yet
    uint32_t additionTimestamp = 0;
    uint32_t eraseTimestamp = 0;
    uint8_t operationSupport = 0x22;  // non-modal update, reserve supported, no allocation info
    // Largest record slice one Get SDR answers; asking more gives 0xCA.
    uint8_t maxReadBytes = 28;
};

// One sensor, addressed by owner (slave address), LUN, channel and number.
struct SensorModel {
    uint8_t owner = 0x20;
    uint8_t lun = 0;
    uint8_t channel = 0;
    uint8_t number = 0;
    uint8_t type = 0;
    uint8_t eventReadingType = 0;
    bool present = true;
    bool eventOnly = false;
    uint8_t reading = 0;
    uint8_t statusBits = 0xC0;  // event messages and scanning enabled
    uint16_t states = 0;        // discrete states / threshold comparison bits
    uint8_t thresholds[6] = {0, 0, 0, 0, 0, 0};  // LNC, LC, LNR, UNC, UC, UNR
    uint8_t readableMask = 0;
    uint8_t settableMask = 0;
    uint8_t hysteresisPositive = 0;
    uint8_t hysteresisNegative = 0;
    uint8_t eventFlags = 0xC0;
    uint16_t assertEnables = 0;
    uint16_t deassertEnables = 0;
    uint8_t eventSupport = 0;  // SDR capability bits 1:0
    // SDR capability bits 5:4: 0 none, 1 readable, 2 readable and settable, 3 fixed.
    uint8_t hysteresisSupport = 2;
    // What the last Re-arm Sensor Events asked for (all = both masks 0xFFFF).
    unsigned rearmCount = 0;
    uint16_t rearmedAssert = 0;
    uint16_t rearmedDeassert = 0;
};

// System event log: 16-byte records in log order. Record IDs start at 1 and
// start again at 1 after a clear, as many controllers do.
struct SelModel {
    uint8_t version = 0x51;
    // Entry count reported while `records` is empty (tests that move the
    // count without building records).
    uint16_t entries = 0;
    uint32_t additionTimestamp = 0;
    uint32_t eraseTimestamp = 0;
    uint8_t operationSupport = 0x0F;  // delete, partial add, reserve, allocation info
    std::vector<std::vector<uint8_t>> records;
    bool enabled = true;
    uint16_t allocationUnits = 1024;  // capacity in records: one unit holds one record
    uint16_t allocationUnitSize = 16;
    bool overflow = false;            // an addition found the log full
    uint16_t reservation = 0;         // 0: none granted
    uint16_t nextRecordId = 1;
    int64_t clockOffset = 0;          // SEL clock minus the host's (Set SEL Time)
    uint16_t lastProcessedBySoftware = 0xFFFF;
    uint16_t lastProcessedByBmc = 0xFFFF;
    // Log a "log area reset/cleared" event after an erase, as many controllers do.
    bool logsClearEvent = false;
    // A full log overwrites its oldest record, the erase stamp unchanged.
    bool circular = false;
    // Nonzero: the SEL clock stands at this value (tests move it by hand).
    uint32_t frozenClock = 0;
};

struct LanChannelModel {
    uint8_t number = 1;
    uint8_t medium = 4;          // 802.3 LAN
    uint8_t protocol = 1;        // IPMB-1.0, which LAN channels use
    uint8_t sessionSupport = 0x80;  // multi-session
};

// One IPv6 static address (LAN parameter 0x38, one set selector each).
struct LanIpv6StaticAddress {
    uint8_t source = 0x80;  // bit 7: enabled; low nibble 0: static
    uint8_t address[16] = {};
    uint8_t prefixLength = 64;
    uint8_t status = 0;  // 0 active
};

// LAN parameters a plain controller answers with: a static 192.168.1.10/24
// behind gateway 192.168.1.1.
std::map<uint8_t, std::vector<uint8_t>> defaultLanParameters();

struct LanModel {
    std::vector<LanChannelModel> channels{LanChannelModel{}};
    // Parameter number -> parameter data (after the revision byte).
    std::map<uint8_t, std::vector<uint8_t>> parameters = defaultLanParameters();
    // Parameter 0x38; empty: IPv6 not supported (0x80).
    std::vector<LanIpv6StaticAddress> ipv6StaticAddresses;
    // Firmware that answers LAN parameters asked on channel 0 as for its LAN channel.
    bool answersOnChannelZero = false;
};

struct FruDeviceModel {
    std::vector<uint8_t> data;
    bool wordAccess = false;  // offsets and counts in 16-bit words
    // Largest count in bytes one Read FRU Data answers; asking more gives 0xCA.
    uint8_t maxReadBytes = 32;
};

struct FruModel {
    std::map<uint8_t, FruDeviceModel> devices;  // FRU device id -> image
};

}  // namespace Sim

#endif
