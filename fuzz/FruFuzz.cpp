// Any bytes as a FRU area of every kind (every getter, the multi-record walk
// for every record type and key), and as a whole FRU image that the discovery
// pass reads from the simulated controller.

#include <stddef.h>
#include <stdint.h>

#include <memory>
#include <string>

#include "Bmc.h"
#include "IpmiFru.h"
#include "IpmiIfcInternal.h"
#include "IpmiLog.h"
#include "Sim.h"

namespace {

using namespace Ipmi;

void quiet(int, const char*, void*) {}

// FruKey runs from PsOverallCapacity to OemData.
constexpr int kKeys = static_cast<int>(FruKey::OemData) + 1;
const unsigned char kTypes[] = {0x00, 0x01, 0x02, 0x03, 0x04, 0x05, 0x06, 0xC0, 0xFF};

size_t sink;
void use(const std::string& s) { sink += s.size(); }

void decodeAreas(const IpmiFru::OptionalRefArray& areas) {
    if (auto c = std::dynamic_pointer_cast<const IpmiFruChassis>(areas[IpmiFru::FRU_AREA_CHASSIS])) {
        use(c->getType());
        use(c->getPartNumber());
        use(c->getSerialNumber());
        use(c->getManufacturer());
    }
    if (auto b = std::dynamic_pointer_cast<const IpmiFruBoard>(areas[IpmiFru::FRU_AREA_BOARD])) {
        use(b->getManufacturer());
        use(b->getName());
        use(b->getSerialNumber());
        use(b->getPartNumber());
        use(b->getMfgDateTime8601());
    }
    if (auto p = std::dynamic_pointer_cast<const IpmiFruProduct>(areas[IpmiFru::FRU_AREA_PRODUCT])) {
        use(p->getManufacturer());
        use(p->getName());
        use(p->getPartNumber());
        use(p->getVersion());
        use(p->getSerialNumber());
        use(p->getAssetTag());
    }
    if (auto m = std::dynamic_pointer_cast<const IpmiFruMulti>(areas[IpmiFru::FRU_AREA_MULTI])) {
        for (unsigned char type : kTypes) {
            sink += m->isMultiRecordTypePresent(type);
            for (int k = 0; k < kKeys; ++k) use(m->getValue(type, static_cast<FruKey>(k)));
        }
    }
}

// The default simulated server with its FRU locators read; FRU device 0
// serves each input.
std::shared_ptr<Sim::Bmc> server() {
    static std::shared_ptr<Sim::Bmc> bmc = [] {
        setLogSink(quiet, nullptr);
        auto b = Sim::loadProfile(Sim::defaultProfilePath());
        // Virtual time: a retry sleep of the reader costs nothing.
        Sim::Simulator::instance().install(b, true);
        InitIpmiNode(0);
        g_IpmiNode[0].myAddress = 0x20;
        IpmiIfcOpenIpmiOpen(0);
        IpmiIfcSdrGetInfo(0);
        return b;
    }();
    return bmc;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    auto bmc = server();
    const unsigned n = static_cast<unsigned>(size);
    // The input as each kind of area, held exactly (no slack past its end).
    IpmiFru::OptionalRefArray areas = {
        std::make_shared<const IpmiFruChassis>(n, data), std::make_shared<const IpmiFruBoard>(n, data),
        std::make_shared<const IpmiFruProduct>(n, data), std::make_shared<const IpmiFruMulti>(n, data)};
    decodeAreas(areas);
    for (unsigned offset = 0; offset <= n; ++offset) use(areas[0]->getFruAreaString(offset));
    for (int k = 0; k < kKeys; ++k) {
        const FruKey key = static_cast<FruKey>(k);
        use(IpmiFruMulti::getPowerSupplyValue(data, n, key));
        use(IpmiFruMulti::getDCOutputValue(data, n, key));
        use(IpmiFruMulti::getDCLoad(data, n, key));
        use(IpmiFruMulti::getManagementAccessValue(data, n, key));
        use(IpmiFruMulti::getExtendedCompatValue(data, n, key));
        use(IpmiFruMulti::getOEMValue(data, n, key));
    }

    // The whole discovery pass over the input as an inventory image.
    if (size == 0 || size > 0xFFFF) return 0;
    bmc->fru.devices[0].data.assign(data, data + size);
    IpmiIfcFruInstantiateAll(0);
    for (const auto& fru : IpmiIfc::getFrus(0)) decodeAreas(fru->getOptionalRefArray());
    // What a run allocates it frees: otherwise libFuzzer suspects a leak and
    // scans the heap after every input.
    {
        CacheWriteLock guard(g_IpmiNode[0].cacheLock);
        g_IpmiNode[0].frus.clear();
    }
    std::vector<uint8_t>().swap(bmc->fru.devices[0].data);
    Sim::Simulator::instance().resetCounters();  // its request log grows with every exchange
    return 0;
}
