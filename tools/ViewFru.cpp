#include <ctype.h>
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

// The power-supply values a reader of an inventory looks for.
const std::pair<const char*, FruKey> kPowerSupply[] = {
    {"PSU capacity (W)", FruKey::PsOverallCapacity},   {"PSU peak (W)", FruKey::PsPeakWattage},
    {"PSU hold-up (s)", FruKey::PsHoldUpTime},         {"PSU input low (V)", FruKey::PsLowInputVoltage1},
    {"PSU input high (V)", FruKey::PsHighInputVoltage1}, {"PSU input low 2 (V)", FruKey::PsLowInputVoltage2},
    {"PSU input high 2 (V)", FruKey::PsHighInputVoltage2}, {"PSU frequency (Hz)", FruKey::PsLowInputFrequency},
    {"PSU hot swap", FruKey::PsHotSwap},                {"PSU predictive fail", FruKey::PsPredictiveFailMode},
};

// Snake-case member name of a label such as "PSU capacity (W)".
std::string keyOf(const std::string& label) {
    std::string key;
    for (char c : label) {
        if (isalnum(static_cast<unsigned char>(c))) key += static_cast<char>(tolower(static_cast<unsigned char>(c)));
        else if (!key.empty() && key.back() != '_') key += '_';
    }
    while (!key.empty() && key.back() == '_') key.pop_back();
    return key;
}

struct Fields {
    Tool::Section& section;
    Tool::Json& record;
    // Adds the column once; an empty value leaves the field out.
    void add(const std::string& label, const std::string& value) {
        const std::string key = keyOf(label);
        bool known = false;
        for (const auto& c : section.columns) known = known || c.key == key;
        if (!known) section.columns.push_back({key, label});
        if (!value.empty()) record[key] = value;
    }
};

Tool::Json device(const Ipmi::IpmiFru& fru, Tool::Section& section) {
    const Ipmi::IpmiEntity& e = fru.getEntity();
    Tool::Json r;
    Fields f{section, r};
    f.add("Device ID", std::to_string(fru.getDeviceId()));
    r["device_id"] = fru.getDeviceId();
    f.add("Name", fru.getName());
    f.add("Entity", std::to_string(e.id) + "." + std::to_string(e.instance));
    f.add("Entity name", e.getName());
    if (auto c = fru.getChassis()) {
        f.add("Chassis type", c->getType());
        f.add("Chassis part number", c->getPartNumber());
        f.add("Chassis serial number", c->getSerialNumber());
    }
    if (auto b = fru.getBoard()) {
        f.add("Board manufacturer", b->getManufacturer());
        f.add("Board name", b->getName());
        f.add("Board serial number", b->getSerialNumber());
        f.add("Board part number", b->getPartNumber());
        f.add("Board mfg date", b->getMfgDateTime8601());
    }
    if (auto p = fru.getProduct()) {
        f.add("Product manufacturer", p->getManufacturer());
        f.add("Product name", p->getName());
        f.add("Product part number", p->getPartNumber());
        f.add("Product version", p->getVersion());
        f.add("Product serial number", p->getSerialNumber());
        f.add("Product asset tag", p->getAssetTag());
    }
    auto m = fru.getMulti();
    constexpr uint8_t psu = Ipmi::fru::recordType::powerSupply;
    if (m && m->isMultiRecordTypePresent(psu))
        for (const auto& v : kPowerSupply) f.add(v.first, m->getValue(psu, v.second));
    return r;
}

int showFru(std::vector<Tool::Section>& out) {
    // Without a polling loop nothing has read the repository or the devices yet.
    // FRU discovery needs the FRU locator records, not the sensors.
    if (Ipmi::IpmiIfcSdrReadRecords(0) != 0) fprintf(stderr, "tavipmi: could not read the SDR repository\n");
    Ipmi::IpmiIfcFruInstantiateAll(0);
    Tool::Section s;
    s.name = "fru";
    s.title = "FRU inventory";
    s.layout = Tool::Section::Fields;
    s.omitMissing = true;
    for (const auto& f : Ipmi::IpmiIfc::getFrus(0)) s.records.push_back(device(*f, s));
    out.push_back(std::move(s));
    return 0;
}

Tool::ViewRegistrar reg("fru", Tool::View{"FRU inventory: board, product, chassis, power supplies", nullptr, showFru,
                                          50, true});

}  // namespace
