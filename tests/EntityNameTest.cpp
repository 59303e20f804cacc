#include <gtest/gtest.h>

#include <climits>
#include <string>

#include "IpmiEntity.h"

using Ipmi::IpmiEntity;

namespace {

const std::string kGeneric = "TAV_IpmiAlertIndication";

IpmiEntity entity(unsigned int id) { return IpmiEntity(id, 1, 0, 0); }

TEST(EntityName, TableRowsGiveNameAndAlertClass) {
    struct Row {
        unsigned int id;
        const char* name;
        const char* alertClass;
    };
    for (const Row& r : {Row{0x00, "Unspecified", "TAV_IpmiAlertIndication"},
                         Row{0x03, "Processor", "TAV_ProcessorIpmiAlertIndication"},
                         Row{0x04, "Disk or Disk Bay", "TAV_DiskIpmiAlertIndication"},
                         Row{0x08, "Memory Module", "TAV_MemoryIpmiAlertIndication"},
                         Row{0x0A, "Power Supply", "TAV_PowerIpmiAlertIndication"},
                         Row{0x14, "Power Module (DC-to-DC)", "TAV_PowerIpmiAlertIndication"},
                         Row{0x17, "System Chassis", "TAV_ChassisIpmiAlertIndication"},
                         Row{0x1D, "Fan Device", "TAV_CoolingUnitIpmiAlertIndication"},
                         Row{0x20, "Memory Device", "TAV_MemoryIpmiAlertIndication"},
                         Row{0x22, "BIOS", "TAV_BIOSIpmiAlertIndication"},
                         Row{0x28, "Battery", "TAV_BatteryIpmiAlertIndication"},
                         Row{0x2B, "Processor/Memory Module", "TAV_IpmiAlertIndication"},
                         Row{0x36, "System Firmware", "TAV_IpmiAlertIndication"}}) {
        SCOPED_TRACE(r.id);
        EXPECT_EQ(IpmiEntity::getName(r.id), r.name);
        EXPECT_EQ(entity(r.id).getName(), r.name);
        EXPECT_EQ(entity(r.id).getAlertClassName(), r.alertClass);
    }
}

TEST(EntityName, PeripheralBayHasTwoIds) {
    EXPECT_EQ(IpmiEntity::getName(0x1B), "Peripheral Bay");
    EXPECT_EQ(IpmiEntity::getName(0x05), "Peripheral Bay");
    EXPECT_EQ(entity(0x1B).getAlertClassName(), kGeneric);
}

TEST(EntityName, IdsPastTheTableAreNamedByRange) {
    struct Range {
        unsigned int first;
        unsigned int last;
        const char* name;
    };
    for (const Range& r : {Range{0x37, 0x8F, "Other"}, Range{0x90, 0xAF, "Chasis Specific"},
                           Range{0xB0, 0xCF, "Board Set Specific"},
                           Range{0xD0, 0xFF, "OEM System Integrator defined"}}) {
        for (unsigned int id : {r.first, r.last}) {
            SCOPED_TRACE(id);
            EXPECT_EQ(IpmiEntity::getName(id), r.name);
            EXPECT_EQ(entity(id).getAlertClassName(), kGeneric);
        }
    }
}

TEST(EntityName, IdsOutsideOneByteAreOther) {
    for (unsigned int id : {0x100u, 0x190u, 0x7FFFFFFFu, 0x80000090u, static_cast<unsigned int>(-1),
                            static_cast<unsigned int>(INT_MIN)}) {
        SCOPED_TRACE(id);
        EXPECT_EQ(IpmiEntity::getName(id), "Other");
        EXPECT_EQ(entity(id).getAlertClassName(), kGeneric);
    }
}

}  // namespace
