// Any bytes as the sensor health rules file, then health states asked of it.

#include <stddef.h>
#include <stdint.h>
#include <stdio.h>
#include <unistd.h>

#include <string>

#include "FuzzSupport.h"
#include "IpmiMapper.h"
#include "IpmiMapperInternal.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzSupport::quietLog();
    static const std::string path = "/tmp/tav-ipmi-health-fuzz." + std::to_string(getpid());
    FILE* f = fopen(path.c_str(), "wb");
    if (f == nullptr) return 0;
    fwrite(data, 1, size, f);
    fclose(f);
    Ipmi::ResetSensorHealthData();
    Ipmi::LoadSensorHealthDataFile(path.c_str());
    // Every rule's own key, and the generic and sensor-specific types with every state bit.
    for (const Ipmi::HealthTableEntry& e : Ipmi::healthList)
        (void)Ipmi::getSensorHealthState(e.eventReadingType, e.sensorType, 0, e.matchValue);
    for (uint8_t type : {0x02, 0x07, 0x6F})
        for (int bit = 0; bit < 16; ++bit) (void)Ipmi::getSensorHealthState(type, 0x07, 1, static_cast<uint16_t>(1u << bit));
    return 0;
}
