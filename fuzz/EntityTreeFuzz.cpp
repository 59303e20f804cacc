// Any bytes as a set of SDRs (whole records, `ipmitool sdr dump` layout):
// filed as the reader files them, then the sensor list, the entity list and
// the two-level entity tree built from them, and every entity's parent asked.

#include <stddef.h>
#include <stdint.h>
#include <string.h>

#include <new>

#include "FuzzSupport.h"
#include "IpmiIfc.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzSupport::quietLog();
    // No device: the sensor pass asks nothing of a controller.
    Ipmi::g_IpmiNode[0].fd = -1;
    for (const auto& record : FuzzSupport::records(data, size, 64, nullptr)) {
        auto* element = new Ipmi::ipmiifc_sdr_list();
        element->record_id = static_cast<uint16_t>(record[0] | record[1] << 8);
        element->record_type = record[3];
        element->length = static_cast<uint8_t>(record.size());  // as the reader keeps it, modulo 256
        element->data = new uint8_t[element->length];
        memcpy(element->data, record.data(), element->length);
        Ipmi::IpmiIfcSdrListAdd(0, element);
    }
    Ipmi::IpmiIfcSensorInstantiateAll(0);
    Ipmi::IpmiIfcEntityListCreate(0);
    Ipmi::IpmiIfcEntityInstantiateAll(0);
    for (const Ipmi::IpmiEntity& e : Ipmi::IpmiIfc::getEntities(0)) {
        (void)Ipmi::IpmiIfc::getEntityParent(0, e.id, e.instance);
        (void)Ipmi::IpmiIfc::getEntityParent(0, e.id, e.instance | 0x80);
    }
    Ipmi::IpmiIfcEntityCleanUpAll(0);
    Ipmi::IpmiIfcSdrCleanUpAll(0);
    Ipmi::IpmiIfcSensorInstantiateAll(0);  // no records left: the list empties
    return 0;
}
