#include "IpmiEventTables.h"

#include <stdio.h>
#include <stdlib.h>

#include <array>

#include "IpmiLog.h"

namespace Ipmi {

namespace {

namespace st = sensorTypeName;

// Names of the event/reading types and of the sensor types, as the rows carry
// them (those the sensors' type texts also use are in the header).
constexpr char kThreshold[] = "Threshold";
constexpr char kUsageState[] = "Usage State";
constexpr char kDigitalState[] = "Digital State";
constexpr char kSeverityState[] = "Severity State";
constexpr char kAvailabilityState[] = "Availability State";
constexpr char kRedundancyState[] = "Redundancy State";
constexpr char kAcpiDevicePowerState[] = "ACPI Device Power State";
constexpr char kCableInterconnect[] = "Cable/Interconnect";
constexpr char kOtherUnitsBasedSensor[] = "Other Units-based Sensor";
constexpr char kDriveSlot[] = "Drive Slot";
constexpr char kSystemFirmwareError[] = "System Firmware Error";
constexpr char kSystemFirmwareHang[] = "System Firmware Hang";
constexpr char kSystemFirmwareProgress[] = "System Firmware Progress";
constexpr char kWatchdog1[] = "Watchdog 1";
constexpr char kModuleBoard[] = "Module/Board";
constexpr char kMicrocontroller[] = "Microcontroller/Coprocessor";
constexpr char kOsStopShutdown[] = "OS Stop/Shutdown";
constexpr char kSlotConnector[] = "Slot/Connector";
constexpr char kWatchdog2[] = "Watchdog 2";
constexpr char kMonitorAsic[] = "Monitor ASIC/IC";
constexpr char kFruHotSwap[] = "FRU Hot Swap";
constexpr char kIpmb0Status[] = "IPMB-0 Status";
constexpr char kModuleHotSwap[] = "Module Hot Swap";

// Event texts that several rows carry.
constexpr char kConnected[] = "Connected";
constexpr char kConfigError[] = "Config Error";
constexpr char kConfigurationError[] = "Configuration Error";
constexpr char kPresenceDetected[] = "Presence detected";
constexpr char kPresenceDetectedUpper[] = "Presence Detected";
constexpr char kDisabled[] = "Disabled";
constexpr char kThrottled[] = "Throttled";
constexpr char kPredictiveFailure[] = "Predictive failure";
constexpr char kPowerCycle[] = "Power cycle";

// The boot stages that System Firmware Hang and Progress events name in event data 3.
constexpr char kFwMemoryInit[] = "Memory initialization";
constexpr char kFwHardDiskInit[] = "Hard-disk initialization";
constexpr char kFwSecondaryCpuInit[] = "Secondary CPU Initialization";
constexpr char kFwUserAuthentication[] = "User authentication";
constexpr char kFwUserSetup[] = "User-initiated system setup";
constexpr char kFwUsbConfig[] = "USB resource configuration";
constexpr char kFwPciConfig[] = "PCI resource configuration";
constexpr char kFwOptionRomInit[] = "Option ROM initialization";
constexpr char kFwVideoInit[] = "Video initialization";
constexpr char kFwCacheInit[] = "Cache initialization";
constexpr char kFwSmbusInit[] = "SMBus initialization";
constexpr char kFwKeyboardControllerInit[] = "Keyboard controller initialization";
constexpr char kFwManagementControllerInit[] = "Management controller initialization";
constexpr char kFwDockingAttachment[] = "Docking station attachment";
constexpr char kFwEnablingDocking[] = "Enabling docking station";
constexpr char kFwDockingEjection[] = "Docking station ejection";
constexpr char kFwDisablingDocking[] = "Disabling docking station";
constexpr char kFwWakeUpVector[] = "Calling operating system wake-up vector";
constexpr char kFwBootInitiated[] = "System boot initiated";
constexpr char kFwMotherboardInit[] = "Motherboard initialization";
constexpr char kFwFloppyInit[] = "Floppy initialization";
constexpr char kFwKeyboardTest[] = "Keyboard test";
constexpr char kFwPointingDeviceTest[] = "Pointing device test";
constexpr char kFwPrimaryCpuInit[] = "Primary CPU initialization";

constexpr ipmi_sel_row generic(uint8_t eventType, uint8_t offset, const char* group, const char* desc) {
    return {selKey(SEL_KEY_GENERIC, eventType, offset, SEL_KEY_ANY_DATA3), 0, group, desc};
}

// A sensor-specific offset whose text does not depend on event data 3.
constexpr ipmi_sel_row specific(uint8_t sensorType, uint8_t data1, const char* group,
                                const char* desc) {
    return {selKey(SEL_KEY_SPECIFIC, sensorType, data1, SEL_KEY_ANY_DATA3), 0, group, desc};
}

// A sensor type without defined offsets: one row that names the type.
constexpr ipmi_sel_row typeOnly(uint8_t sensorType, const char* group) {
    return specific(sensorType, 0x00, group, nullptr);
}

constexpr ipmi_sel_row specificByData3(uint8_t sensorType, uint8_t data1, uint8_t data3,
                                       const char* group, const char* desc) {
    return {selKey(SEL_KEY_SPECIFIC, sensorType, data1, data3), 0, group, desc};
}

}  // namespace

constexpr ipmi_sel_row ipmi_sel_data[IPMI_SEL_DATA_ROWS] = {
    // The "going low" texts end in a blank; callers have always shown them so.
    generic(0x01, 0x00, kThreshold, "Lower Non-critical going low "),
    generic(0x01, 0x01, kThreshold, "Lower Non-critical going high"),
    generic(0x01, 0x02, kThreshold, "Lower Critical going low "),
    generic(0x01, 0x03, kThreshold, "Lower Critical going high"),
    generic(0x01, 0x04, kThreshold, "Lower Non-recoverable going low "),
    generic(0x01, 0x05, kThreshold, "Lower Non-recoverable going high"),
    generic(0x01, 0x06, kThreshold, "Upper Non-critical going low "),
    generic(0x01, 0x07, kThreshold, "Upper Non-critical going high"),
    generic(0x01, 0x08, kThreshold, "Upper Critical going low "),
    generic(0x01, 0x09, kThreshold, "Upper Critical going high"),
    generic(0x01, 0x0A, kThreshold, "Upper Non-recoverable going low "),
    generic(0x01, 0x0B, kThreshold, "Upper Non-recoverable going high"),
    generic(0x02, 0x00, kUsageState, "Transition to Idle"),
    generic(0x02, 0x01, kUsageState, "Transition to Active"),
    generic(0x02, 0x02, kUsageState, "Transition to Busy"),
    generic(0x03, 0x00, kDigitalState, "State Deasserted"),
    generic(0x03, 0x01, kDigitalState, "State Asserted"),
    generic(0x04, 0x00, kDigitalState, "Predictive Failure Deasserted"),
    generic(0x04, 0x01, kDigitalState, "Predictive Failure Asserted"),
    generic(0x05, 0x00, kDigitalState, "Limit Not Exceeded"),
    generic(0x05, 0x01, kDigitalState, "Limit Exceeded"),
    generic(0x06, 0x00, kDigitalState, "Performance Met"),
    generic(0x06, 0x01, kDigitalState, "Performance Lags"),
    generic(0x07, 0x00, kSeverityState, "Transition to OK"),
    generic(0x07, 0x01, kSeverityState, "Transition to Non-critical from OK"),
    generic(0x07, 0x02, kSeverityState, "Transition to Critical from less severe"),
    generic(0x07, 0x03, kSeverityState, "Transition to Non-recoverable from less severe"),
    generic(0x07, 0x04, kSeverityState, "Transition to Non-critical from more severe"),
    generic(0x07, 0x05, kSeverityState, "Transition to Critical from Non-recoverable"),
    generic(0x07, 0x06, kSeverityState, "Transition to Non-recoverable"),
    generic(0x07, 0x07, kSeverityState, "Monitor"),
    generic(0x07, 0x08, kSeverityState, "Informational"),
    generic(0x08, 0x00, kAvailabilityState, "Device Absent"),
    generic(0x08, 0x01, kAvailabilityState, "Device Present"),
    generic(0x09, 0x00, kAvailabilityState, "Device Disabled"),
    generic(0x09, 0x01, kAvailabilityState, "Device Enabled"),
    generic(0x0A, 0x00, kAvailabilityState, "Transition to Running"),
    generic(0x0A, 0x01, kAvailabilityState, "Transition to In Test"),
    generic(0x0A, 0x02, kAvailabilityState, "Transition to Power Off"),
    generic(0x0A, 0x03, kAvailabilityState, "Transition to On Line"),
    generic(0x0A, 0x04, kAvailabilityState, "Transition to Off Line"),
    generic(0x0A, 0x05, kAvailabilityState, "Transition to Off Duty"),
    generic(0x0A, 0x06, kAvailabilityState, "Transition to Degraded"),
    generic(0x0A, 0x07, kAvailabilityState, "Transition to Power Save"),
    generic(0x0A, 0x08, kAvailabilityState, "Install Error"),
    generic(0x0B, 0x00, kRedundancyState, "Fully Redundant"),
    generic(0x0B, 0x01, kRedundancyState, "Redundancy Lost"),
    generic(0x0B, 0x02, kRedundancyState, "Redundancy Degraded"),
    generic(0x0B, 0x03, kRedundancyState, "Non-Redundant: Sufficient from Redundant"),
    generic(0x0B, 0x04, kRedundancyState, "Non-Redundant: Sufficient from Insufficient"),
    generic(0x0B, 0x05, kRedundancyState, "Non-Redundant: Insufficient Resources"),
    generic(0x0B, 0x06, kRedundancyState, "Redundancy Degraded from Fully Redundant"),
    generic(0x0B, 0x07, kRedundancyState, "Redundancy Degraded from Non-Redundant"),
    generic(0x0C, 0x00, kAcpiDevicePowerState, "D0 Power State"),
    generic(0x0C, 0x01, kAcpiDevicePowerState, "D1 Power State"),
    generic(0x0C, 0x02, kAcpiDevicePowerState, "D2 Power State"),
    generic(0x0C, 0x03, kAcpiDevicePowerState, "D3 Power State"),
    // Never reached by SEL decoding (generic lookups stop at type 0x0C), kept for
    // the sensors' state names.
    generic(0x17, 0x00, st::addInCard, st::addInCard),
    generic(0x17, 0x01, st::addInCard, st::addInCard),
    generic(0x1B, 0x00, kCableInterconnect, kConnected),
    generic(0x1B, 0x01, kCableInterconnect, kConfigError),

    typeOnly(0x01, st::temperature),
    typeOnly(0x02, st::voltage),
    typeOnly(0x03, st::current),
    typeOnly(0x04, st::fan),
    specific(0x05, 0x00, st::physicalSecurity, "General Chassis intrusion"),
    specific(0x05, 0x01, st::physicalSecurity, "Drive Bay intrusion"),
    specific(0x05, 0x02, st::physicalSecurity, "I/O Card area intrusion"),
    specific(0x05, 0x03, st::physicalSecurity, "Processor area intrusion"),
    specific(0x05, 0x04, st::physicalSecurity, "System unplugged from LAN"),
    specific(0x05, 0x05, st::physicalSecurity, "Unauthorized dock"),
    specific(0x05, 0x06, st::physicalSecurity, "FAN area intrusion"),
    specific(0x06, 0x00, st::platformSecurity, "Front Panel Lockout violation attempted"),
    specific(0x06, 0x01, st::platformSecurity, "Pre-boot password violation - user password"),
    specific(0x06, 0x02, st::platformSecurity, "Pre-boot password violation - setup password"),
    specific(0x06, 0x03, st::platformSecurity, "Pre-boot password violation - network boot password"),
    specific(0x06, 0x04, st::platformSecurity, "Other pre-boot password violation"),
    specific(0x06, 0x05, st::platformSecurity, "Out-of-band access password violation"),
    specific(0x07, 0x00, st::processor, "IERR"),
    specific(0x07, 0x01, st::processor, "Thermal Trip"),
    specific(0x07, 0x02, st::processor, "FRB1/BIST failure"),
    specific(0x07, 0x03, st::processor, "FRB2/Hang in POST failure"),
    specific(0x07, 0x04, st::processor, "FRB3/Processor startup/init failure"),
    specific(0x07, 0x05, st::processor, kConfigurationError),
    specific(0x07, 0x06, st::processor, "SM BIOS Uncorrectable CPU-complex Error"),
    specific(0x07, 0x07, st::processor, kPresenceDetected),
    specific(0x07, 0x08, st::processor, kDisabled),
    specific(0x07, 0x09, st::processor, "Terminator presence detected"),
    specific(0x07, 0x0A, st::processor, kThrottled),
    specific(0x08, 0x00, st::powerSupply, kPresenceDetected),
    specific(0x08, 0x01, st::powerSupply, "Failure status"),
    specific(0x08, 0x02, st::powerSupply, kPredictiveFailure),
    specific(0x08, 0x03, st::powerSupply, "Power Supply AC lost"),
    specific(0x08, 0x04, st::powerSupply, "AC lost or out-of-range"),
    specific(0x08, 0x05, st::powerSupply, "AC out-of-range, but present"),
    specificByData3(0x08, 0x06, 0x00, st::powerSupply, "Config Error: Vendor Mismatch"),
    specificByData3(0x08, 0x06, 0x01, st::powerSupply, "Config Error: Revision Mismatch"),
    specificByData3(0x08, 0x06, 0x02, st::powerSupply, "Config Error: Processor Missing"),
    specific(0x08, 0x06, st::powerSupply, kConfigError),
    specific(0x09, 0x00, st::powerUnit, "Power off/down"),
    specific(0x09, 0x01, st::powerUnit, kPowerCycle),
    specific(0x09, 0x02, st::powerUnit, "240VA power down"),
    specific(0x09, 0x03, st::powerUnit, "Interlock power down"),
    specific(0x09, 0x04, st::powerUnit, "AC lost"),
    specific(0x09, 0x05, st::powerUnit, "Soft-power control failure"),
    specific(0x09, 0x06, st::powerUnit, "Failure detected"),
    specific(0x09, 0x07, st::powerUnit, kPredictiveFailure),
    typeOnly(0x0A, st::coolingDevice),
    typeOnly(0x0B, kOtherUnitsBasedSensor),
    specific(0x0C, 0x00, st::memory, "Correctable ECC"),
    specific(0x0C, 0x01, st::memory, "Uncorrectable ECC"),
    specific(0x0C, 0x02, st::memory, "Parity"),
    specific(0x0C, 0x03, st::memory, "Memory Scrub Failed"),
    specific(0x0C, 0x04, st::memory, "Memory Device Disabled"),
    specific(0x0C, 0x05, st::memory, "Correctable ECC logging limit reached"),
    specific(0x0C, 0x06, st::memory, kPresenceDetectedUpper),
    specific(0x0C, 0x07, st::memory, kConfigurationError),
    specific(0x0C, 0x08, st::memory, "Spare"),
    specific(0x0C, 0x09, st::memory, kThrottled),
    specific(0x0D, 0x00, kDriveSlot, "Drive Present"),
    specific(0x0D, 0x01, kDriveSlot, "Drive Fault"),
    specific(0x0D, 0x02, kDriveSlot, "Predictive Failure"),
    specific(0x0D, 0x03, kDriveSlot, "Hot Spare"),
    specific(0x0D, 0x04, kDriveSlot, "Parity Check In Progress"),
    specific(0x0D, 0x05, kDriveSlot, "In Critical Array"),
    specific(0x0D, 0x06, kDriveSlot, "In Failed Array"),
    specific(0x0D, 0x07, kDriveSlot, "Rebuild In Progress"),
    specific(0x0D, 0x08, kDriveSlot, "Rebuild Aborted"),
    typeOnly(0x0E, st::postMemoryResize),
    // System firmware events name their error, hang or progress code in event
    // data 3 (not event data 2), so that byte selects the text.
    specificByData3(0x0F, 0x00, 0x00, kSystemFirmwareError, word::Unspecified),
    specificByData3(0x0F, 0x00, 0x01, kSystemFirmwareError, "No system memory installed"),
    specificByData3(0x0F, 0x00, 0x02, kSystemFirmwareError, "No usable system memory"),
    specificByData3(0x0F, 0x00, 0x03, kSystemFirmwareError, "Unrecoverable IDE device failure"),
    specificByData3(0x0F, 0x00, 0x04, kSystemFirmwareError, "Unrecoverable system-board failure"),
    specificByData3(0x0F, 0x00, 0x05, kSystemFirmwareError, "Unrecoverable diskette failure"),
    specificByData3(0x0F, 0x00, 0x06, kSystemFirmwareError,
                    "Unrecoverable hard-disk controller failure"),
    specificByData3(0x0F, 0x00, 0x07, kSystemFirmwareError,
                    "Unrecoverable PS/2 or USB keyboard failure"),
    specificByData3(0x0F, 0x00, 0x08, kSystemFirmwareError, "Removable boot media not found"),
    specificByData3(0x0F, 0x00, 0x09, kSystemFirmwareError,
                    "Unrecoverable video controller failure"),
    specificByData3(0x0F, 0x00, 0x0A, kSystemFirmwareError, "No video device selected"),
    specificByData3(0x0F, 0x00, 0x0B, kSystemFirmwareError, "BIOS corruption detected"),
    specificByData3(0x0F, 0x00, 0x0C, kSystemFirmwareError, "CPU voltage mismatch"),
    specificByData3(0x0F, 0x00, 0x0D, kSystemFirmwareError, "CPU speed mismatch failure"),
    specific(0x0F, 0x00, kSystemFirmwareError, "Unknown Error"),
    specificByData3(0x0F, 0x01, 0x00, kSystemFirmwareHang, word::Unspecified),
    specificByData3(0x0F, 0x01, 0x01, kSystemFirmwareHang, kFwMemoryInit),
    specificByData3(0x0F, 0x01, 0x02, kSystemFirmwareHang, kFwHardDiskInit),
    specificByData3(0x0F, 0x01, 0x03, kSystemFirmwareHang, kFwSecondaryCpuInit),
    specificByData3(0x0F, 0x01, 0x04, kSystemFirmwareHang, kFwUserAuthentication),
    specificByData3(0x0F, 0x01, 0x05, kSystemFirmwareHang, kFwUserSetup),
    specificByData3(0x0F, 0x01, 0x06, kSystemFirmwareHang, kFwUsbConfig),
    specificByData3(0x0F, 0x01, 0x07, kSystemFirmwareHang, kFwPciConfig),
    specificByData3(0x0F, 0x01, 0x08, kSystemFirmwareHang, kFwOptionRomInit),
    specificByData3(0x0F, 0x01, 0x09, kSystemFirmwareHang, kFwVideoInit),
    specificByData3(0x0F, 0x01, 0x0A, kSystemFirmwareHang, kFwCacheInit),
    specificByData3(0x0F, 0x01, 0x0B, kSystemFirmwareHang, kFwSmbusInit),
    specificByData3(0x0F, 0x01, 0x0C, kSystemFirmwareHang, kFwKeyboardControllerInit),
    specificByData3(0x0F, 0x01, 0x0D, kSystemFirmwareHang, kFwManagementControllerInit),
    specificByData3(0x0F, 0x01, 0x0E, kSystemFirmwareHang, kFwDockingAttachment),
    specificByData3(0x0F, 0x01, 0x0F, kSystemFirmwareHang, kFwEnablingDocking),
    specificByData3(0x0F, 0x01, 0x10, kSystemFirmwareHang, kFwDockingEjection),
    specificByData3(0x0F, 0x01, 0x11, kSystemFirmwareHang, kFwDisablingDocking),
    specificByData3(0x0F, 0x01, 0x12, kSystemFirmwareHang, kFwWakeUpVector),
    specificByData3(0x0F, 0x01, 0x13, kSystemFirmwareHang, kFwBootInitiated),
    specificByData3(0x0F, 0x01, 0x14, kSystemFirmwareHang, kFwMotherboardInit),
    specificByData3(0x0F, 0x01, 0x15, kSystemFirmwareHang, word::reserved),
    specificByData3(0x0F, 0x01, 0x16, kSystemFirmwareHang, kFwFloppyInit),
    specificByData3(0x0F, 0x01, 0x17, kSystemFirmwareHang, kFwKeyboardTest),
    specificByData3(0x0F, 0x01, 0x18, kSystemFirmwareHang, kFwPointingDeviceTest),
    specificByData3(0x0F, 0x01, 0x19, kSystemFirmwareHang, kFwPrimaryCpuInit),
    specific(0x0F, 0x01, kSystemFirmwareHang, "Unknown Hang"),
    specificByData3(0x0F, 0x02, 0x00, kSystemFirmwareProgress, word::Unspecified),
    specificByData3(0x0F, 0x02, 0x01, kSystemFirmwareProgress, kFwMemoryInit),
    specificByData3(0x0F, 0x02, 0x02, kSystemFirmwareProgress, kFwHardDiskInit),
    specificByData3(0x0F, 0x02, 0x03, kSystemFirmwareProgress, kFwSecondaryCpuInit),
    specificByData3(0x0F, 0x02, 0x04, kSystemFirmwareProgress, kFwUserAuthentication),
    specificByData3(0x0F, 0x02, 0x05, kSystemFirmwareProgress, kFwUserSetup),
    specificByData3(0x0F, 0x02, 0x06, kSystemFirmwareProgress, kFwUsbConfig),
    specificByData3(0x0F, 0x02, 0x07, kSystemFirmwareProgress, kFwPciConfig),
    specificByData3(0x0F, 0x02, 0x08, kSystemFirmwareProgress, kFwOptionRomInit),
    specificByData3(0x0F, 0x02, 0x09, kSystemFirmwareProgress, kFwVideoInit),
    specificByData3(0x0F, 0x02, 0x0A, kSystemFirmwareProgress, kFwCacheInit),
    specificByData3(0x0F, 0x02, 0x0B, kSystemFirmwareProgress, kFwSmbusInit),
    specificByData3(0x0F, 0x02, 0x0C, kSystemFirmwareProgress, kFwKeyboardControllerInit),
    specificByData3(0x0F, 0x02, 0x0D, kSystemFirmwareProgress, kFwManagementControllerInit),
    specificByData3(0x0F, 0x02, 0x0E, kSystemFirmwareProgress, kFwDockingAttachment),
    specificByData3(0x0F, 0x02, 0x0F, kSystemFirmwareProgress, kFwEnablingDocking),
    specificByData3(0x0F, 0x02, 0x10, kSystemFirmwareProgress, kFwDockingEjection),
    specificByData3(0x0F, 0x02, 0x11, kSystemFirmwareProgress, kFwDisablingDocking),
    specificByData3(0x0F, 0x02, 0x12, kSystemFirmwareProgress, kFwWakeUpVector),
    specificByData3(0x0F, 0x02, 0x13, kSystemFirmwareProgress, kFwBootInitiated),
    specificByData3(0x0F, 0x02, 0x14, kSystemFirmwareProgress, kFwMotherboardInit),
    specificByData3(0x0F, 0x02, 0x15, kSystemFirmwareProgress, word::reserved),
    specificByData3(0x0F, 0x02, 0x16, kSystemFirmwareProgress, kFwFloppyInit),
    specificByData3(0x0F, 0x02, 0x17, kSystemFirmwareProgress, kFwKeyboardTest),
    specificByData3(0x0F, 0x02, 0x18, kSystemFirmwareProgress, kFwPointingDeviceTest),
    specificByData3(0x0F, 0x02, 0x19, kSystemFirmwareProgress, kFwPrimaryCpuInit),
    specific(0x0F, 0x02, kSystemFirmwareProgress, "Unknown Progress"),
    specific(0x10, 0x00, st::eventLoggingDisabled, "Correctable memory error logging disabled"),
    specific(0x10, 0x01, st::eventLoggingDisabled, "Event logging disabled"),
    specific(0x10, 0x02, st::eventLoggingDisabled, "Log area reset/cleared"),
    specific(0x10, 0x03, st::eventLoggingDisabled, "All event logging disabled"),
    specific(0x10, 0x04, st::eventLoggingDisabled, "Log full"),
    specific(0x10, 0x05, st::eventLoggingDisabled, "Log almost full"),
    specific(0x11, 0x00, kWatchdog1, "BIOS Reset"),
    specific(0x11, 0x01, kWatchdog1, "OS Reset"),
    specific(0x11, 0x02, kWatchdog1, "OS Shut Down"),
    specific(0x11, 0x03, kWatchdog1, "OS Power Down"),
    specific(0x11, 0x04, kWatchdog1, "OS Power Cycle"),
    specific(0x11, 0x05, kWatchdog1, "OS NMI/Diag Interrupt"),
    specific(0x11, 0x06, kWatchdog1, "OS Expired"),
    specific(0x11, 0x07, kWatchdog1, "OS pre-timeout Interrupt"),
    specific(0x12, 0x00, st::systemEvent, "System Reconfigured"),
    specific(0x12, 0x01, st::systemEvent, "OEM System boot event"),
    specific(0x12, 0x02, st::systemEvent, "Undetermined system hardware failure"),
    specific(0x12, 0x03, st::systemEvent, "Entry added to auxiliary log"),
    specific(0x12, 0x04, st::systemEvent, "PEF Action"),
    specific(0x12, 0x05, st::systemEvent, "Timestamp Clock Sync"),
    specific(0x13, 0x00, st::criticalInterrupt, "NMI/Diag Interrupt"),
    specific(0x13, 0x01, st::criticalInterrupt, "Bus Timeout"),
    specific(0x13, 0x02, st::criticalInterrupt, "I/O Channel check NMI"),
    specific(0x13, 0x03, st::criticalInterrupt, "Software NMI"),
    specific(0x13, 0x04, st::criticalInterrupt, "PCI PERR"),
    specific(0x13, 0x05, st::criticalInterrupt, "PCI SERR"),
    specific(0x13, 0x06, st::criticalInterrupt, "EISA failsafe timeout"),
    specific(0x13, 0x07, st::criticalInterrupt, "Bus Correctable error"),
    specific(0x13, 0x08, st::criticalInterrupt, "Bus Uncorrectable error"),
    specific(0x13, 0x09, st::criticalInterrupt, "Fatal NMI"),
    specific(0x13, 0x0A, st::criticalInterrupt, "Bus Fatal Error"),
    specific(0x14, 0x00, st::button, "Power Button pressed"),
    specific(0x14, 0x01, st::button, "Sleep Button pressed"),
    specific(0x14, 0x02, st::button, "Reset Button pressed"),
    specific(0x14, 0x03, st::button, "FRU Latch"),
    specific(0x14, 0x04, st::button, "FRU Service"),
    typeOnly(0x15, kModuleBoard),
    typeOnly(0x16, kMicrocontroller),
    typeOnly(0x17, st::addInCard),
    typeOnly(0x18, st::chassis),
    typeOnly(0x19, st::chipSet),
    typeOnly(0x1A, st::otherFru),
    specific(0x1B, 0x00, kCableInterconnect, kConnected),
    specific(0x1B, 0x01, kCableInterconnect, kConfigError),
    typeOnly(0x1C, st::terminator),
    specific(0x1D, 0x00, st::systemBootInitiated, "Initiated by power up"),
    specific(0x1D, 0x01, st::systemBootInitiated, "Initiated by hard reset"),
    specific(0x1D, 0x02, st::systemBootInitiated, "Initiated by warm reset"),
    specific(0x1D, 0x03, st::systemBootInitiated, "User requested PXE boot"),
    specific(0x1D, 0x04, st::systemBootInitiated, "Automatic boot to diagnostic"),
    specific(0x1D, 0x05, st::systemBootInitiated, "OS initiated hard reset"),
    specific(0x1D, 0x06, st::systemBootInitiated, "OS initiated warm reset"),
    specific(0x1D, 0x07, st::systemBootInitiated, "System Restart"),
    specific(0x1E, 0x00, st::bootError, "No bootable media"),
    specific(0x1E, 0x01, st::bootError, "Non-bootable disk in drive"),
    specific(0x1E, 0x02, st::bootError, "PXE server not found"),
    specific(0x1E, 0x03, st::bootError, "Invalid boot sector"),
    specific(0x1E, 0x04, st::bootError, "Timeout waiting for selection"),
    specific(0x1F, 0x00, st::osBoot, "A: boot completed"),
    specific(0x1F, 0x01, st::osBoot, "C: boot completed"),
    specific(0x1F, 0x02, st::osBoot, "PXE boot completed"),
    specific(0x1F, 0x03, st::osBoot, "Diagnostic boot completed"),
    specific(0x1F, 0x04, st::osBoot, "CD-ROM boot completed"),
    specific(0x1F, 0x05, st::osBoot, "ROM boot completed"),
    specific(0x1F, 0x06, st::osBoot, "boot completed - device not specified"),
    specific(0x20, 0x00, kOsStopShutdown, "Error during system startup"),
    specific(0x20, 0x01, kOsStopShutdown, "Run-time critical stop"),
    specific(0x20, 0x02, kOsStopShutdown, "OS graceful stop"),
    specific(0x20, 0x03, kOsStopShutdown, "OS graceful shutdown"),
    specific(0x20, 0x04, kOsStopShutdown, "PEF initiated soft shutdown"),
    specific(0x20, 0x05, kOsStopShutdown, "Agent not responding"),
    specific(0x21, 0x00, kSlotConnector, "Fault Status"),
    specific(0x21, 0x01, kSlotConnector, "Identify Status"),
    specific(0x21, 0x02, kSlotConnector, "Device Installed"),
    specific(0x21, 0x03, kSlotConnector, "Ready for Device Installation"),
    specific(0x21, 0x04, kSlotConnector, "Ready for Device Removal"),
    specific(0x21, 0x05, kSlotConnector, "Slot Power is Off"),
    specific(0x21, 0x06, kSlotConnector, "Device Removal Request"),
    specific(0x21, 0x07, kSlotConnector, "Interlock"),
    specific(0x21, 0x08, kSlotConnector, "Slot is Disabled"),
    specific(0x21, 0x09, kSlotConnector, "Spare Device"),
    specific(0x22, 0x00, st::systemAcpiPowerState, "S0/G0: working"),
    specific(0x22, 0x01, st::systemAcpiPowerState,
             "S1: sleeping with system hw & processor context maintained"),
    specific(0x22, 0x02, st::systemAcpiPowerState, "S2: sleeping, processor context lost"),
    specific(0x22, 0x03, st::systemAcpiPowerState,
             "S3: sleeping, processor & hw context lost, memory retained"),
    specific(0x22, 0x04, st::systemAcpiPowerState, "S4: non-volatile sleep/suspend-to-disk"),
    specific(0x22, 0x05, st::systemAcpiPowerState, "S5/G2: soft-off"),
    specific(0x22, 0x06, st::systemAcpiPowerState, "S4/S5: soft-off"),
    specific(0x22, 0x07, st::systemAcpiPowerState, "G3: mechanical off"),
    specific(0x22, 0x08, st::systemAcpiPowerState, "Sleeping in S1/S2/S3 state"),
    specific(0x22, 0x09, st::systemAcpiPowerState, "G1: sleeping"),
    specific(0x22, 0x0A, st::systemAcpiPowerState, "S5: entered by override"),
    specific(0x22, 0x0B, st::systemAcpiPowerState, "Legacy ON state"),
    specific(0x22, 0x0C, st::systemAcpiPowerState, "Legacy OFF state"),
    specific(0x22, 0x0E, st::systemAcpiPowerState, "Unknown"),
    specific(0x23, 0x00, kWatchdog2, "Timer expired"),
    specific(0x23, 0x01, kWatchdog2, "Hard reset"),
    specific(0x23, 0x02, kWatchdog2, "Power down"),
    specific(0x23, 0x03, kWatchdog2, kPowerCycle),
    specific(0x23, 0x04, kWatchdog2, word::reserved),
    specific(0x23, 0x05, kWatchdog2, word::reserved),
    specific(0x23, 0x06, kWatchdog2, word::reserved),
    specific(0x23, 0x07, kWatchdog2, word::reserved),
    specific(0x23, 0x08, kWatchdog2, "Timer interrupt"),
    specific(0x24, 0x00, st::platformAlert, "Platform generated page"),
    specific(0x24, 0x01, st::platformAlert, "Platform generated LAN alert"),
    specific(0x24, 0x02, st::platformAlert, "Platform Event Trap generated"),
    specific(0x24, 0x03, st::platformAlert, "Platform generated SNMP trap, OEM format"),
    specific(0x25, 0x00, st::entityPresence, "Present"),
    specific(0x25, 0x01, st::entityPresence, "Absent"),
    specific(0x25, 0x02, st::entityPresence, kDisabled),
    typeOnly(0x26, kMonitorAsic),
    specific(0x27, 0x00, st::lan, "Heartbeat Lost"),
    specific(0x27, 0x01, st::lan, "Heartbeat"),
    specific(0x28, 0x00, st::managementSubsystemHealth, "Sensor access degraded or unavailable"),
    specific(0x28, 0x01, st::managementSubsystemHealth, "Controller access degraded or unavailable"),
    specific(0x28, 0x02, st::managementSubsystemHealth, "Management controller off-line"),
    specific(0x28, 0x03, st::managementSubsystemHealth, "Management controller unavailable"),
    specific(0x28, 0x04, st::managementSubsystemHealth, "Sensor failure"),
    specific(0x28, 0x05, st::managementSubsystemHealth, "FRU failure"),
    specific(0x29, 0x00, st::battery, "Low"),
    specific(0x29, 0x01, st::battery, "Failed"),
    specific(0x29, 0x02, st::battery, kPresenceDetectedUpper),
    specific(0x2B, 0x00, st::versionChange, "Hardware change detected"),
    specific(0x2B, 0x01, st::versionChange, "Firmware or software change detected"),
    specific(0x2B, 0x02, st::versionChange, "Hardware incompatibility detected"),
    specific(0x2B, 0x03, st::versionChange, "Firmware or software incompatibility detected"),
    specific(0x2B, 0x04, st::versionChange, "Invalid or unsupported hardware version"),
    specific(0x2B, 0x05, st::versionChange, "Invalid or unsupported firmware or software version"),
    specific(0x2B, 0x06, st::versionChange, "Hardware change success"),
    specific(0x2B, 0x07, st::versionChange, "Firmware or software change success"),
    specific(0x2C, 0x00, st::fruState, "Not Installed"),
    specific(0x2C, 0x01, st::fruState, "Inactive"),
    specific(0x2C, 0x02, st::fruState, "Activation Requested"),
    specific(0x2C, 0x03, st::fruState, "Activation in Progress"),
    specific(0x2C, 0x04, st::fruState, "Active"),
    specific(0x2C, 0x05, st::fruState, "Deactivation Requested"),
    specific(0x2C, 0x06, st::fruState, "Deactivation in Progress"),
    specific(0x2C, 0x07, st::fruState, "Communication lost"),
    specific(0xF0, 0x00, kFruHotSwap, "Transition to M0"),
    specific(0xF0, 0x01, kFruHotSwap, "Transition to M1"),
    specific(0xF0, 0x02, kFruHotSwap, "Transition to M2"),
    specific(0xF0, 0x03, kFruHotSwap, "Transition to M3"),
    specific(0xF0, 0x04, kFruHotSwap, "Transition to M4"),
    specific(0xF0, 0x05, kFruHotSwap, "Transition to M5"),
    specific(0xF0, 0x06, kFruHotSwap, "Transition to M6"),
    specific(0xF0, 0x07, kFruHotSwap, "Transition to M7"),
    specific(0xF1, 0x00, kIpmb0Status, "IPMB-A disabled, IPMB-B disabled"),
    specific(0xF1, 0x01, kIpmb0Status, "IPMB-A enabled, IPMB-B disabled"),
    specific(0xF1, 0x02, kIpmb0Status, "IPMB-A disabled, IPMB-B enabled"),
    // "IPMP-B" is the text callers have always matched on.
    specific(0xF1, 0x03, kIpmb0Status, "IPMB-A enabled, IPMP-B enabled"),
    specific(0xF2, 0x00, kModuleHotSwap, "Module Handle Closed"),
    specific(0xF2, 0x01, kModuleHotSwap, "Module Handle Opened"),
    specific(0xF2, 0x02, kModuleHotSwap, "Quiesced"),
};

namespace {

constexpr size_t kRows = IPMI_SEL_DATA_ROWS;

// Strictly increasing keys also prove that no row was left zero-filled.
constexpr bool rowsSortedByKey() {
    for (size_t i = 1; i < kRows; ++i)
        if (ipmi_sel_data[i - 1].key >= ipmi_sel_data[i].key) return false;
    return true;
}
static_assert(rowsSortedByKey(), "ipmi_sel_data must be sorted by key, one row per key");

// ---- Minimal perfect hash (hash and displace) ------------------------------

constexpr uint32_t kHashPrime = 0x01000193;

constexpr uint32_t hashKey(uint32_t seed, uint32_t key) {
    uint32_t h = seed;
    for (int shift = 24; shift >= 0; shift -= 8) h = (h * kHashPrime) ^ ((key >> shift) & 0xFF);
    return h;
}

struct HashArrays {
    int32_t g[kRows];
    int32_t v[kRows];
};

constexpr uint32_t lookupRow(const int32_t (&g)[kRows], const int32_t (&v)[kRows], uint32_t key) {
    int32_t d = g[hashKey(kHashPrime, key) % kRows];
    if (d < 0) return uint32_t(v[-int64_t(d) - 1] - 1);
    uint32_t seed = d == 0 ? kHashPrime : uint32_t(d);
    return uint32_t(v[hashKey(seed, key) % kRows] - 1);
}

// Keys that share a first-level bucket get a displacement seed that sends each
// of them to a free slot of its own (largest buckets first); a key alone in its
// bucket takes a free slot directly, stored as -(slot + 1).
constexpr HashArrays buildHashArrays() {
    HashArrays a{};
    uint32_t bucketOf[kRows] = {};
    uint32_t bucketSize[kRows] = {};
    bool taken[kRows] = {};
    uint32_t largest = 0;
    for (size_t i = 0; i < kRows; ++i) {
        bucketOf[i] = hashKey(kHashPrime, ipmi_sel_data[i].key) % kRows;
        uint32_t size = ++bucketSize[bucketOf[i]];
        if (size > largest) largest = size;
    }
    for (uint32_t size = largest; size >= 2; --size) {
        for (size_t bucket = 0; bucket < kRows; ++bucket) {
            if (bucketSize[bucket] != size) continue;
            uint32_t members[kRows] = {};
            uint32_t count = 0;
            for (size_t i = 0; i < kRows; ++i)
                if (bucketOf[i] == bucket) members[count++] = uint32_t(i);
            uint32_t slots[kRows] = {};
            for (uint32_t seed = 1;; ++seed) {
                uint32_t placed = 0;
                for (; placed < count; ++placed) {
                    uint32_t slot = hashKey(seed, ipmi_sel_data[members[placed]].key) % kRows;
                    bool clash = taken[slot];
                    for (uint32_t j = 0; j < placed && !clash; ++j) clash = slots[j] == slot;
                    if (clash) break;
                    slots[placed] = slot;
                }
                if (placed == count) {
                    a.g[bucket] = int32_t(seed);
                    break;
                }
            }
            for (uint32_t j = 0; j < count; ++j) {
                taken[slots[j]] = true;
                a.v[slots[j]] = int32_t(members[j] + 1);
            }
        }
    }
    size_t freeSlot = kRows;
    for (size_t i = 0; i < kRows; ++i) {
        if (bucketSize[bucketOf[i]] != 1) continue;
        while (taken[--freeSlot]) {
        }
        taken[freeSlot] = true;
        a.g[bucketOf[i]] = -int32_t(freeSlot) - 1;
        a.v[freeSlot] = int32_t(i + 1);
    }
    return a;
}

constexpr HashArrays kHash = buildHashArrays();

constexpr bool everyKeyFindsItsRow() {
    for (size_t i = 0; i < kRows; ++i)
        if (lookupRow(kHash.g, kHash.v, ipmi_sel_data[i].key) != i) return false;
    return true;
}
static_assert(everyKeyFindsItsRow(), "the hash must send every key to its own row");

// ---- State name tables: the rows with a text, reshaped -----------------------

constexpr size_t countTexts(uint32_t category) {
    size_t n = 0;
    for (const ipmi_sel_row& row : ipmi_sel_data)
        if (selKeyCategory(row.key) == selKeyCategory(category) && row.desc) ++n;
    return n;
}

template <size_t N>
constexpr std::array<ipmi_event_type, N + 1> eventTypesOf(uint32_t category) {
    std::array<ipmi_event_type, N + 1> out{};
    size_t n = 0;
    for (const ipmi_sel_row& row : ipmi_sel_data) {
        if (selKeyCategory(row.key) != selKeyCategory(category) || !row.desc) continue;
        out[n++] = {selKeyType(row.key), selKeyData1(row.key), selKeyData3(row.key), row.desc};
    }
    return out;  // the last row stays zero: no text ends the table
}

constexpr auto kGenericEventTypes = eventTypesOf<countTexts(SEL_KEY_GENERIC)>(SEL_KEY_GENERIC);
constexpr auto kSpecificEventTypes = eventTypesOf<countTexts(SEL_KEY_SPECIFIC)>(SEL_KEY_SPECIFIC);

// ---- Caption tables: every row, reshaped -------------------------------------

constexpr size_t countRows(uint32_t category) {
    size_t n = 0;
    for (const ipmi_sel_row& row : ipmi_sel_data)
        if (selKeyCategory(row.key) == selKeyCategory(category)) ++n;
    return n;
}

constexpr char kCaptionReserved[] = "Reserved";
constexpr char kCaptionOem[] = "OEM";
constexpr uint8_t kFruHotSwapType = 0xF0;
constexpr uint8_t kOemSensorType = 0xC0;

// The sensor-specific table opens with a "Reserved" row for sensor type 0 and
// closes with an "OEM" row for 0xC0. Its FRU Hot Swap "Transition to M7" row
// sits under offset 6, behind M6, so a first-match search never shows it and
// offset 7 has no row: captions have always read that way.
template <size_t N>
constexpr std::array<ipmi_caption_row, N + 1> captionRowsOf(uint32_t category) {
    std::array<ipmi_caption_row, N + 1> out{};
    const bool specificRows = selKeyCategory(category) == selKeyCategory(SEL_KEY_SPECIFIC);
    size_t n = 0;
    if (specificRows) out[n++] = {0x00, 0x00, SEL_KEY_ANY_DATA3, 0, kCaptionReserved, nullptr};
    for (const ipmi_sel_row& row : ipmi_sel_data) {
        if (selKeyCategory(row.key) != selKeyCategory(category)) continue;
        const uint8_t code = selKeyType(row.key);
        uint8_t offset = selKeyData1(row.key);
        if (specificRows && code == kFruHotSwapType && offset == 7) offset = 6;
        const uint8_t cls = specificRows ? 0 : (code == EVENT_TYPE_THRESHOLD ? 2 : 1);
        out[n++] = {code, offset, selKeyData3(row.key), cls, row.group, row.desc};
    }
    if (specificRows) out[n++] = {kOemSensorType, 0x00, SEL_KEY_ANY_DATA3, 0, kCaptionOem, nullptr};
    return out;  // the last row stays zero: no group ends the table
}

constexpr auto kGenericCaptionRows = captionRowsOf<countRows(SEL_KEY_GENERIC)>(SEL_KEY_GENERIC);
constexpr auto kSpecificCaptionRows = captionRowsOf<countRows(SEL_KEY_SPECIFIC) + 2>(SEL_KEY_SPECIFIC);
static_assert(kGenericCaptionRows.size() == GENERIC_EVENT_TYPE_ROWS + 1, "generic caption rows");
static_assert(kSpecificCaptionRows.size() == SENSOR_SPECIFIC_TYPE_ROWS + 1, "sensor-specific caption rows");

// ---- SEL record description ------------------------------------------------

constexpr char kNoDescription[] = "n/a";
constexpr uint8_t kOldestDescribedEvmRev = 4;
constexpr size_t kMessageBufferSize = 64;

bool isEventRecord(uint8_t recordType) {
    return recordType == 0x00 || recordType == SEL_RECORD_TYPE_SYSTEM_EVENT;
}

bool isGenericEventType(uint8_t eventType) {
    return eventType >= EVENT_TYPE_THRESHOLD && eventType <= EVENT_TYPE_GENERIC_LAST;
}

const char* textOf(const ipmi_sel_row& row, uint32_t key) {
    return row.key == key && row.desc ? row.desc : "";
}

void writeText(char* dst, int size, const char* text) {
    if (dst && size > 0) snprintf(dst, size_t(size), "%s", text);
}

// The event's text as its event type selects it; null when the type has no table.
const char* eventText(const Event_log& record) {
    uint8_t eventType = record.event_dir_type & SEL_EVENT_TYPE_MASK;
    if (isGenericEventType(eventType)) return find_generic_desc(eventType, record.event_data[0]);
    if (eventType == EVENT_TYPE_SENSOR_SPECIFIC)
        return find_specific_desc(record.sensor_type, record.event_data[0], record.event_data[2]);
    return nullptr;
}

}  // namespace

const int32_t (&G_array)[IPMI_SEL_DATA_ROWS] = kHash.g;
const int32_t (&V_array)[IPMI_SEL_DATA_ROWS] = kHash.v;

const ipmi_event_type* const generic_sensor_event_types = kGenericEventTypes.data();
const ipmi_event_type* const sensor_specific_event_types = kSpecificEventTypes.data();
const ipmi_caption_row* const generic_event_types = kGenericCaptionRows.data();
const ipmi_caption_row* const sensor_specific_types = kSpecificCaptionRows.data();

// The hash is minimal: every slot of V_array holds a row, so any key, listed or
// not, names a row of the table.
uint32_t perfect_hash_lookup(uint32_t key) { return lookupRow(G_array, V_array, key); }

const char* find_generic_desc(uint8_t eventType, uint8_t data1) {
    uint32_t key = selKey(SEL_KEY_GENERIC, eventType, data1, SEL_KEY_ANY_DATA3);
    return textOf(ipmi_sel_data[perfect_hash_lookup(key)], key);
}

const char* find_specific_desc(uint8_t sensorType, uint8_t data1, uint8_t data3) {
    uint32_t key = selKey(SEL_KEY_SPECIFIC, sensorType, data1, data3);
    return textOf(ipmi_sel_data[perfect_hash_lookup(key)], key);
}

int code_compare(const void* a, const void* b) {
    uint32_t ka = static_cast<const ipmi_sel_row*>(a)->key;
    uint32_t kb = static_cast<const ipmi_sel_row*>(b)->key;
    if (selKeyCategory(ka) != selKeyCategory(kb)) return selKeyCategory(ka) < selKeyCategory(kb) ? -1 : 1;
    if (selKeyType(ka) != selKeyType(kb)) return selKeyType(ka) < selKeyType(kb) ? -1 : 1;
    return 0;
}

const char* find_sensor_type_name(uint8_t sensorType) {
    ipmi_sel_row wanted = {selKey(SEL_KEY_SPECIFIC, sensorType, 0, 0), 0, nullptr, nullptr};
    const void* found = bsearch(&wanted, ipmi_sel_data, kRows, sizeof(ipmi_sel_row), code_compare);
    return found ? static_cast<const ipmi_sel_row*>(found)->group : nullptr;
}

void build_sel_desc(Event_log record, char* dst, int size) {
    if (!isEventRecord(record.record_type)) {
        ipmiLog(LOG_ERR, "%s: no description for SEL type=%d (support only %d)", __func__,
                record.record_type, SEL_RECORD_TYPE_SYSTEM_EVENT);
        writeText(dst, size, kNoDescription);
    }
    // Revision 4 passes although the message calls 4 the bound to exceed.
    if (record.evm_rev < kOldestDescribedEvmRev) {
        ipmiLog(LOG_ERR, "%s: no description for SEL with IPMI version is %d, expect > %d",
                __func__, record.evm_rev, kOldestDescribedEvmRev);
        writeText(dst, size, kNoDescription);
        return;
    }
    const char* direction =
        (record.event_dir_type & SEL_EVENT_DEASSERTION) ? "Deassert +" : "Assert +";
    const char* name = find_sensor_type_name(record.sensor_type);
    if (!name) name = "";
    const char* text = eventText(record);
    if (!dst || size <= 0) return;
    if (text)
        snprintf(dst, size_t(size), "%s %s %s", direction, name, text);
    else
        snprintf(dst, size_t(size), "%s %s", direction, name);
}

std::string GetMessage(Event_log record) {
    const char* text = eventText(record);
    if (!text) return word::notAvailable;
    char message[kMessageBufferSize];
    snprintf(message, sizeof message, "%s", text);
    return message;
}

}  // namespace Ipmi
