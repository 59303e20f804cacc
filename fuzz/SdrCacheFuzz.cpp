// The SDR cache file reader: the input is a cache file, read as it is and
// read again with its body length and checksum made right, so that the
// checks behind them are reached. Its own key is taken as the current one
// for the same reason; records
// that pass are filed into node 0's lists and described as sensors, as a
// warm refresh would, and written back out, which must read back the same.

#include <stddef.h>
#include <stdint.h>
#include <string.h>

#include <cstdlib>

#include "FuzzSupport.h"
#include "IpmiSdrCache.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    namespace h = Ipmi::sdrcache::head;
    FuzzSupport::quietLog();
    Ipmi::SdrCacheKey key;
    memset(key.bytes, 0, sizeof key.bytes);
    if (size >= h::length) memcpy(key.bytes, data + h::keyFirst, sizeof key.bytes);

    Ipmi::SdrCacheRecords records;
    if (!Ipmi::sdrCacheParse(data, size, key, &records).empty()) {
        if (size < h::length) return 0;
        std::vector<uint8_t> mended(data, data + size);
        Ipmi::sdrcache::putLe32(mended.data() + h::bodyLength, static_cast<uint32_t>(size - h::length));
        Ipmi::sdrcache::putLe32(mended.data() + h::bodyChecksum,
                                Ipmi::sdrcache::crc32(mended.data() + h::length, size - h::length));
        if (!Ipmi::sdrCacheParse(mended.data(), mended.size(), key, &records).empty()) return 0;
    }

    const std::vector<uint8_t> image = Ipmi::sdrCacheImage(key, records);
    Ipmi::SdrCacheRecords again;
    if (!Ipmi::sdrCacheParse(image.data(), image.size(), key, &again).empty() || again != records) std::abort();

    Ipmi::InitIpmiNode(0);
    for (const auto& r : records) {
        auto* element = new Ipmi::ipmiifc_sdr_list();
        element->data = new uint8_t[r.size()];
        memcpy(element->data, r.data(), r.size());
        element->record_id = static_cast<uint16_t>(r[0] | r[1] << 8);
        element->record_type = r[3];
        element->length = static_cast<uint8_t>(r.size());
        Ipmi::IpmiIfcSdrListAdd(0, element);
    }
    Ipmi::IpmiIfcSensorDescribeAll(0);
    Ipmi::IpmiIfcSdrCleanUpAll(0);
    Ipmi::IpmiIfcSensorDescribeAll(0);  // no records left: empties the sensor list
    return 0;
}
