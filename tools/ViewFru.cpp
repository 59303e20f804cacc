#include <stdio.h>

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "FruLayout.h"
#include "IpmiFru.h"
#include "IpmiIfc.h"
#include "Views.h"

namespace {

using Ipmi::FruKey;

void line(const char* label, const std::string& value) {
    if (!value.empty()) printf("    %-22s %s\n", label, value.c_str());
}

// The power-supply values a reader of an inventory looks for.
const std::pair<const char*, FruKey> kPowerSupply[] = {
    {"PSU capacity (W)", FruKey::PsOverallCapacity},   {"PSU peak (W)", FruKey::PsPeakWattage},
    {"PSU hold-up (s)", FruKey::PsHoldUpTime},         {"PSU input low (V)", FruKey::PsLowInputVoltage1},
    {"PSU input high (V)", FruKey::PsHighInputVoltage1}, {"PSU input low 2 (V)", FruKey::PsLowInputVoltage2},
    {"PSU input high 2 (V)", FruKey::PsHighInputVoltage2}, {"PSU frequency (Hz)", FruKey::PsLowInputFrequency},
    {"PSU hot swap", FruKey::PsHotSwap},                {"PSU predictive fail", FruKey::PsPredictiveFailMode},
};

void showDevice(const Ipmi::IpmiFru& fru) {
    const Ipmi::IpmiEntity& e = fru.getEntity();
    printf("  FRU %u %s (%s %u.%u)\n", fru.getDeviceId(), fru.getName().c_str(), e.getName().c_str(), e.id,
           e.instance);
    if (auto c = fru.getChassis()) {
        line("Chassis type", c->getType());
        line("Chassis part number", c->getPartNumber());
        line("Chassis serial number", c->getSerialNumber());
    }
    if (auto b = fru.getBoard()) {
        line("Board manufacturer", b->getManufacturer());
        line("Board name", b->getName());
        line("Board serial number", b->getSerialNumber());
        line("Board part number", b->getPartNumber());
        line("Board mfg date", b->getMfgDateTime8601());
    }
    if (auto p = fru.getProduct()) {
        line("Product manufacturer", p->getManufacturer());
        line("Product name", p->getName());
        line("Product part number", p->getPartNumber());
        line("Product version", p->getVersion());
        line("Product serial number", p->getSerialNumber());
        line("Product asset tag", p->getAssetTag());
    }
    auto m = fru.getMulti();
    constexpr uint8_t psu = Ipmi::fru::recordType::powerSupply;
    if (m && m->isMultiRecordTypePresent(psu))
        for (const auto& v : kPowerSupply) line(v.first, m->getValue(psu, v.second));
}

int showFru(const std::vector<std::string>&) {
    // Without a polling loop nothing has read the repository or the devices yet.
    if (Ipmi::IpmiIfcSdrGetInfo(0) != 0) fprintf(stderr, "tavipmi: could not read the SDR repository\n");
    Ipmi::IpmiIfcFruInstantiateAll(0);
    const auto frus = Ipmi::IpmiIfc::getFrus(0);
    printf("FRU inventory\n");
    if (frus.empty()) printf("  (none)\n");
    for (const auto& f : frus) showDevice(*f);
    return 0;
}

Tool::ViewRegistrar reg("fru", Tool::View{"FRU inventory: board, product, chassis, power supplies", showFru, 50, true});

}  // namespace
