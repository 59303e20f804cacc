#include <gtest/gtest.h>

#include <climits>

#include "IpmiEntity.h"

using Ipmi::IpmiEntity;

namespace {

// Table rows, both names of the peripheral bay, the first and last ID of each
// range past the table, and IDs that are no byte at all (also read as signed).
TEST(EntityName, NameAndAlertClassOfTableRowsRangesAndOtherIds) {
    const char* const generic = "TAV_IpmiAlertIndication";
    const struct { unsigned id; const char* name; const char* alertClass; } cases[] = {
        {0x03, "Processor", "TAV_ProcessorIpmiAlertIndication"},
        {0x04, "Disk or Disk Bay", "TAV_DiskIpmiAlertIndication"},
        {0x14, "Power Module (DC-to-DC)", "TAV_PowerIpmiAlertIndication"},
        {0x17, "System Chassis", "TAV_ChassisIpmiAlertIndication"},
        {0x1D, "Fan Device", "TAV_CoolingUnitIpmiAlertIndication"},
        {0x20, "Memory Device", "TAV_MemoryIpmiAlertIndication"},
        {0x22, "BIOS", "TAV_BIOSIpmiAlertIndication"}, {0x28, "Battery", "TAV_BatteryIpmiAlertIndication"},
        {0x00, "Unspecified", generic}, {0x05, "Peripheral Bay", generic}, {0x1B, "Peripheral Bay", generic},
        {0x36, "System Firmware", generic}, {0x37, "Other", generic}, {0x8F, "Other", generic},
        {0x90, "Chasis Specific", generic}, {0xAF, "Chasis Specific", generic}, {0xB0, "Board Set Specific", generic},
        {0xCF, "Board Set Specific", generic}, {0xD0, "OEM System Integrator defined", generic},
        {0xFF, "OEM System Integrator defined", generic}, {0x100, "Other", generic}, {0x80000090u, "Other", generic},
        {unsigned(INT_MIN), "Other", generic}, {unsigned(-1), "Other", generic},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.id);
        EXPECT_EQ(IpmiEntity::getName(c.id), c.name);
        EXPECT_EQ(IpmiEntity(c.id, 1, 0, 0).getName(), c.name);
        EXPECT_EQ(IpmiEntity(c.id, 1, 0, 0).getAlertClassName(), c.alertClass);
    }
}

}  // namespace
