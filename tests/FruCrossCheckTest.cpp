// Every real FRU image, served as FRU device 0 of the simulated controller and
// read by the discovery pass, decodes as ipmitool (`fru print`) and FreeIPMI
// (`ipmi-fru -v`) decode it, except where the library keeps its own result.

#include <string.h>
#include <time.h>

#include <fstream>
#include <map>
#include <set>
#include <sstream>

#include "IpmiFru.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

struct Field {
    const char* name;
    const char* ipmitool;  // label in `fru print`
    const char* freeipmi;  // label in `ipmi-fru -v`
};

const Field kFields[] = {
    {"chassis type", "Chassis Type", "FRU Chassis Type"},
    {"chassis part", "Chassis Part Number", "FRU Chassis Part Number"},
    {"chassis serial", "Chassis Serial", "FRU Chassis Serial Number"},
    {"board date", "Board Mfg Date", "FRU Board Manufacturing Date/Time"},
    {"board manufacturer", "Board Mfg", "FRU Board Manufacturer"},
    {"board name", "Board Product", "FRU Board Product Name"},
    {"board serial", "Board Serial", "FRU Board Serial Number"},
    {"board part", "Board Part Number", "FRU Board Part Number"},
    {"product manufacturer", "Product Manufacturer", "FRU Product Manufacturer Name"},
    {"product name", "Product Name", "FRU Product Name"},
    {"product part", "Product Part Number", "FRU Product Part/Model Number"},
    {"product serial", "Product Serial", "FRU Product Serial Number"},
    {"asset tag", "Product Asset Tag", "FRU Product Asset Tag"},
};

// Where the library keeps a result of its own: image (base name), field, the
// library's value, and why.
struct Difference {
    const char* image;
    const char* field;
    const char* ours;
    const char* why;
};

// "*" matches any image, field or value; "<blank>" a value of blanks only.
const Difference kDifferences[] = {
    {"*", "chassis serial", "*", "read one byte before the field, as deployed providers read it"},
    {"*", "*", "<blank>", "a field of blanks stays as it is: trimming cuts only after the last non-blank"},
    {"infrasim_s2600wtt_fru5", "*", "", "board area checksum fails: the area is dropped"},
    {"infrasim_s2600wtt_fru17", "*", "", "board area checksum fails: the area is dropped"},
    {"qemu_aspeed_yosemitev2_bmc", "*", "", "checksums broken by masking: the areas are dropped"},
    {"pyipmi_vadatech_utc017", "board date", "1996-01-01T00:00:00", "0 minutes is the FRU epoch"},
};

using Decoded = std::map<std::string, std::string>;

std::string rtrim(std::string s) {
    const size_t end = s.find_last_not_of(" \t\r");
    return s.erase(end == std::string::npos ? 0 : end + 1);
}

// "label: value" lines of a reference decoding; the first of each label wins.
Decoded readReference(const std::string& path, const char* separator) {
    Decoded out;
    std::ifstream in(path);
    std::string line;
    while (std::getline(in, line)) {
        const size_t at = line.find(separator);
        if (at == std::string::npos) continue;
        const std::string label = rtrim(line.substr(0, at)).substr(line.find_first_not_of(' '));
        out.emplace(label, rtrim(line.substr(at + strlen(separator))));
    }
    return out;
}

// Both tools' dates as 2015-09-24T13:03:00.
std::string isoDate(const std::string& text, const char* format) {
    struct tm t;
    memset(&t, 0, sizeof t);
    if (strptime(text.c_str(), format, &t) == nullptr) return text;
    char buf[24];
    strftime(buf, sizeof buf, "%FT%T", &t);
    return buf;
}

Decoded decode(const IpmiFru* fru) {
    Decoded d;
    if (fru == nullptr) return d;
    if (auto c = fru->getChassis()) {
        d["chassis type"] = c->getType();
        d["chassis part"] = c->getPartNumber();
        d["chassis serial"] = c->getSerialNumber();
    }
    if (auto b = fru->getBoard()) {
        d["board date"] = b->getMfgDateTime8601();
        d["board manufacturer"] = b->getManufacturer();
        d["board name"] = b->getName();
        d["board serial"] = b->getSerialNumber();
        d["board part"] = b->getPartNumber();
    }
    if (auto p = fru->getProduct()) {
        d["product manufacturer"] = p->getManufacturer();
        d["product name"] = p->getName();
        d["product part"] = p->getPartNumber();
        d["product serial"] = p->getSerialNumber();
        d["asset tag"] = p->getAssetTag();
    }
    return d;
}

bool matches(const char* pattern, const std::string& value) {
    const std::string p = pattern;
    if (p == "<blank>") return !value.empty() && value.find_first_not_of(' ') == std::string::npos;
    return p == "*" || p == value;
}

// The difference that explains this result, or null.
const Difference* kept(const std::string& image, const std::string& field, const std::string& ours) {
    for (const auto& d : kDifferences)
        if (matches(d.image, image) && matches(d.field, field) && matches(d.ours, ours)) return &d;
    return nullptr;
}

using FruCrossCheck = TestSupport::SimTest;

TEST_F(FruCrossCheck, EveryRealImageAgreesWithIpmitoolAndFreeIpmi) {
    const auto images = TestSupport::realDataFiles("fru", ".bin");
    if (images.empty()) GTEST_SKIP() << "real server data not present";
    useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    std::set<const Difference*> used;
    for (const auto& path : images) {
        const std::string base = path.substr(0, path.size() - 4);
        const std::string image = base.substr(base.rfind('/') + 1);
        SCOPED_TRACE(image);
        Sim::loadFruImage(bmc(), 0, path);
        ASSERT_EQ(IpmiIfcFruInstantiateAll(0), 0);
        std::shared_ptr<IpmiFru> device;
        for (const auto& f : IpmiIfc::getFrus(0))
            if (f->getDeviceId() == 0) device = f;
        const Decoded ours = decode(device.get());
        Decoded ipmitool = readReference(base + ".ipmitool-fru-print.txt", " : ");
        Decoded freeipmi = readReference(base + ".ipmi-fru.txt", ": ");
        if (!std::ifstream(base + ".ipmi-fru.txt")) continue;  // decoded without a memory error is all we know

        for (const auto& field : kFields) {
            const auto mine = ours.find(field.name);
            const std::string value = mine == ours.end() ? "" : mine->second;
            for (int tool = 0; tool < 2; ++tool) {
                const Decoded& ref = tool == 0 ? ipmitool : freeipmi;
                const auto it = ref.find(tool == 0 ? field.ipmitool : field.freeipmi);
                if (it == ref.end() && mine == ours.end()) continue;
                std::string theirs = it == ref.end() ? "" : it->second;
                if (field.name == std::string("board date"))
                    theirs = isoDate(theirs, tool == 0 ? "%a %b %d %H:%M:%S %Y" : "%m/%d/%y - %H:%M:%S");
                // "n/a" is the library's value for an absent or empty field.
                if (value == theirs || (value == "n/a" && theirs.empty())) continue;
                if (const Difference* d = kept(image, field.name, value)) {
                    used.insert(d);
                    continue;
                }
                ADD_FAILURE() << image << " " << field.name << ": library \"" << value << "\", "
                              << (tool == 0 ? "ipmitool" : "FreeIPMI") << " \"" << theirs << "\"";
            }
        }
    }
    // Every difference named still happens.
    EXPECT_EQ(used.size(), sizeof kDifferences / sizeof kDifferences[0]);
}

}  // namespace
