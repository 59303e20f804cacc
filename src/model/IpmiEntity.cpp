#include "IpmiEntity.h"

#include "IpmiIfc.h"

namespace Ipmi {

namespace {

constexpr char kGenericAlert[] = "TAV_IpmiAlertIndication";
constexpr unsigned int kOtherEntity = 0x01;  // its name also serves IDs without a name of their own

struct EntityRange {
    int first;
    int last;
    const char* name;
};

// IDs past the table; the IPMI ID is taken as signed here, so a negative one falls through to "Other".
const EntityRange kEntityRanges[] = {
    {0x90, 0xAF, "Chasis Specific"},
    {0xB0, 0xCF, "Board Set Specific"},
    {0xD0, 0xFF, "OEM System Integrator defined"},
};

constexpr unsigned int kMappingSize = sizeof(IpmiEntity::_mapping) / sizeof(IpmiEntity::_mapping[0]);

}  // namespace

const IpmiEntity::Mapping IpmiEntity::_mapping[55] = {
    {"Unspecified", kGenericAlert},                                  // 0x00
    {"Other", kGenericAlert},                                        // 0x01
    {"Unknown", kGenericAlert},                                      // 0x02
    {"Processor", "TAV_ProcessorIpmiAlertIndication"},               // 0x03
    {"Disk or Disk Bay", "TAV_DiskIpmiAlertIndication"},             // 0x04
    {"Peripheral Bay", kGenericAlert},                               // 0x05
    {"System Management Module", kGenericAlert},                     // 0x06
    {"System Board", kGenericAlert},                                 // 0x07
    {"Memory Module", "TAV_MemoryIpmiAlertIndication"},              // 0x08
    {"Processor Module", "TAV_ProcessorIpmiAlertIndication"},        // 0x09
    {"Power Supply", "TAV_PowerIpmiAlertIndication"},                // 0x0A
    {"Add-in Card", kGenericAlert},                                  // 0x0B
    {"Front Panel Board", kGenericAlert},                            // 0x0C
    {"Back Panel Board", kGenericAlert},                             // 0x0D
    {"Power System Board", kGenericAlert},                           // 0x0E
    {"Drive Backplane", kGenericAlert},                              // 0x0F
    {"System Internal Expansion Board", kGenericAlert},              // 0x10
    {"Other System Board", kGenericAlert},                           // 0x11
    {"Processor Board", kGenericAlert},                              // 0x12
    {"Power Domain", "TAV_PowerIpmiAlertIndication"},                // 0x13
    {"Power Module (DC-to-DC)", "TAV_PowerIpmiAlertIndication"},     // 0x14
    {"Power Distribution", "TAV_PowerIpmiAlertIndication"},          // 0x15
    {"Chassis Back Panel Board", kGenericAlert},                     // 0x16
    {"System Chassis", "TAV_ChassisIpmiAlertIndication"},            // 0x17
    {"Sub-Chassis", "TAV_ChassisIpmiAlertIndication"},               // 0x18
    {"Other Chassis Board", "TAV_ChassisIpmiAlertIndication"},       // 0x19
    {"Disk Drive Bay", kGenericAlert},                               // 0x1A
    {"Peripheral Bay", kGenericAlert},                               // 0x1B, named like 0x05
    {"Device Bay", kGenericAlert},                                   // 0x1C
    {"Fan Device", "TAV_CoolingUnitIpmiAlertIndication"},            // 0x1D
    {"Cooling Unit", "TAV_CoolingUnitIpmiAlertIndication"},          // 0x1E
    {"Cable/Interconnect", kGenericAlert},                           // 0x1F
    {"Memory Device", "TAV_MemoryIpmiAlertIndication"},              // 0x20
    {"System Management Software", kGenericAlert},                   // 0x21
    {"BIOS", "TAV_BIOSIpmiAlertIndication"},                         // 0x22
    {"Operating System", kGenericAlert},                             // 0x23
    {"System Bus", kGenericAlert},                                   // 0x24
    {"Group", kGenericAlert},                                        // 0x25
    {"Remote Management Device", kGenericAlert},                     // 0x26
    {"External Environment", kGenericAlert},                         // 0x27
    {"Battery", "TAV_BatteryIpmiAlertIndication"},                   // 0x28
    {"Processing Blade", kGenericAlert},                             // 0x29
    {"Connectivity Switch", kGenericAlert},                          // 0x2A
    {"Processor/Memory Module", kGenericAlert},                      // 0x2B
    {"I/O Module", kGenericAlert},                                   // 0x2C
    {"Processor/IO Module", kGenericAlert},                          // 0x2D
    {"Management Controller Firmware", kGenericAlert},               // 0x2E
    {"IPMI Channel", kGenericAlert},                                 // 0x2F
    {"PCI Bus", kGenericAlert},                                      // 0x30
    {"PCI Express Bus", kGenericAlert},                              // 0x31
    {"SCSI Bus (parallel)", kGenericAlert},                          // 0x32
    {"SATA/SAS Bus", kGenericAlert},                                 // 0x33
    {"Processor/Front-Side Bus", kGenericAlert},                     // 0x34
    {"Real Time Clock", kGenericAlert},                              // 0x35
    {"System Firmware", kGenericAlert},                              // 0x36
};

std::string IpmiEntity::getName(unsigned int id) {
    if (id < kMappingSize) return _mapping[id].name;
    const int signedId = static_cast<int>(id);
    for (const EntityRange& range : kEntityRanges)
        if (signedId >= range.first && signedId <= range.last) return range.name;
    return _mapping[kOtherEntity].name;
}

std::string IpmiEntity::getAlertClassName() const {
    return id < kMappingSize ? _mapping[id].alertClass : kGenericAlert;
}

IpmiEntity IpmiEntity::getParent() const { return IpmiIfc::getEntityParent(node, id, instance); }

}  // namespace Ipmi
