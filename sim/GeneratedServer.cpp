// A generated repository of a large server: benchmarks build it directly,
// other programs name it as the profile "generated:N".

#include "GeneratedServer.h"

#include <stdexcept>
#include <string>
#include <vector>

#include "FruLayout.h"
#include "SdrLayout.h"

namespace Sim {

using namespace Ipmi;

namespace {

// A controller numbers at most 256 sensors: each owns 250, the BMC first,
// then controllers on IPMB at 0x2C, 0x2E, ...
constexpr size_t kRecordsPerOwner = 250;
constexpr uint8_t kBmcAddress = 0x20;
constexpr uint8_t kFirstIpmbOwner = 0x2C;

// SEL events are stamped from 2025-01-01 00:00 UTC, ten minutes apart.
constexpr uint32_t kFirstEventTime = 1735689600;
constexpr uint32_t kEventSpacing = 600;

uint8_t ownerOf(size_t record) {
    const size_t block = record / kRecordsPerOwner;
    return block == 0 ? kBmcAddress : static_cast<uint8_t>(kFirstIpmbOwner + 2 * (block - 1));
}

void putName(std::vector<uint8_t>& r, size_t codeAt, const std::string& name) {
    r[codeAt] = static_cast<uint8_t>(0xC0 | name.size());
    r.insert(r.end(), name.begin(), name.end());
}

std::vector<uint8_t> header(uint16_t id, uint8_t type, size_t bodyEnd) {
    std::vector<uint8_t> r(bodyEnd, 0);
    r[sdr::header::recordId] = static_cast<uint8_t>(id & 0xFF);
    r[sdr::header::recordId + 1] = static_cast<uint8_t>(id >> 8);
    r[sdr::header::version] = 0x51;
    r[sdr::header::recordType] = type;
    return r;
}

void finish(std::vector<uint8_t>& r) {
    r[sdr::header::remainingLength] = static_cast<uint8_t>(r.size() - sdr::header::length);
}

void putKey(std::vector<uint8_t>& r, uint8_t owner, uint8_t number, uint8_t entity, uint8_t instance) {
    r[sdr::key::ownerId] = owner;
    r[sdr::key::sensorNumber] = number;
    r[sdr::key::entityId] = entity;
    r[sdr::key::entityInstance] = instance;
}

// The first two locators name the logical FRU devices of the BMC that the
// default server has (system board, power supply); the others name FRU
// EEPROMs on each controller's private bus, which only that controller reads.
std::vector<uint8_t> fruLocator(uint16_t id, size_t locatorIndex, uint8_t owner, uint8_t number, uint8_t entity,
                                uint8_t instance) {
    std::vector<uint8_t> r = header(id, sdr::type::fruDeviceLocator, fru::locator::idStringTypeLength + 1);
    constexpr uint8_t kFruInventoryDevice = 0x10;
    r[fru::locator::deviceType] = kFruInventoryDevice;
    if (locatorIndex < 2) {
        const bool board = locatorIndex == 0;
        r[fru::locator::deviceAccessAddress] = kBmcAddress;
        r[fru::locator::deviceId] = static_cast<uint8_t>(locatorIndex);
        r[fru::locator::accessFlags] = fru::locator::logical;
        r[fru::locator::entityId] = board ? 0x07 : 0x0A;
        r[fru::locator::entityInstance] = 1;
        putName(r, fru::locator::idStringTypeLength, board ? "System Board" : "PSU 1");
    } else {
        r[fru::locator::deviceAccessAddress] = owner;
        // The EEPROM's 7-bit address and private bus: one of its own for every locator.
        r[fru::locator::deviceId] = static_cast<uint8_t>((number & 0x7F) << 1);
        r[fru::locator::accessFlags] = static_cast<uint8_t>(number >> 7);
        r[fru::locator::entityId] = entity;
        r[fru::locator::entityInstance] = instance;
        putName(r, fru::locator::idStringTypeLength, "FRU " + std::to_string(id));
    }
    finish(r);
    return r;
}

// Upper non-critical crossings of the temperature sensors and presence
// changes of the processor sensors, in turn, asserted and then deasserted.
void fillSel(Bmc& bmc, size_t events) {
    struct Source {
        uint8_t owner, number, type, readingType;
    };
    std::vector<Source> sources;
    for (const auto& s : bmc.sensors)
        if (!s.eventOnly && (s.type == 0x01 || s.type == 0x07))
            sources.push_back(Source{s.owner, s.number, s.type, s.eventReadingType});
    if (sources.empty()) return;
    for (size_t i = 0; i < events; ++i) {
        const Source& s = sources[i % sources.size()];
        const bool deassert = (i / sources.size()) % 2 == 1;
        const uint32_t stamp = kFirstEventTime + static_cast<uint32_t>(i) * kEventSpacing;
        const bool threshold = s.readingType == sdr::eventReadingTypeThreshold;
        const uint8_t record[16] = {0, 0,  // the log assigns the ID
                                    0x02,  // system event record
                                    static_cast<uint8_t>(stamp), static_cast<uint8_t>(stamp >> 8),
                                    static_cast<uint8_t>(stamp >> 16), static_cast<uint8_t>(stamp >> 24),
                                    s.owner, 0x00,  // generator: the sensor's controller, channel 0, LUN 0
                                    0x04,           // event message revision
                                    s.type, s.number,
                                    static_cast<uint8_t>((deassert ? 0x80 : 0x00) | s.readingType),
                                    // threshold: upper non-critical going high, trigger reading and
                                    // threshold follow; processor: presence detected, nothing follows
                                    static_cast<uint8_t>(threshold ? 0x57 : 0x07),
                                    static_cast<uint8_t>(threshold ? 80 : 0xFF),
                                    static_cast<uint8_t>(threshold ? 75 : 0xFF)};
        if (addSelRecord(bmc, record, true) == 0) return;
    }
}

}  // namespace

std::shared_ptr<Bmc> generatedServer(size_t records) {
    auto bmc = std::make_shared<Bmc>();
    static const uint8_t kEntities[] = {0x03, 0x07, 0x0A, 0x1D, 0x20};  // processor, board, PSU, fan, memory
    size_t locators = 0;
    for (size_t i = 0; i < records; ++i) {
        const auto id = static_cast<uint16_t>(i + 1);
        const uint8_t owner = ownerOf(i);
        const auto number = static_cast<uint8_t>(i % kRecordsPerOwner);
        const uint8_t entity = kEntities[(i / 5) % sizeof kEntities];
        const auto instance = static_cast<uint8_t>(1 + (i / 25) % 8);
        const std::string name = "Sensor " + std::to_string(id);
        std::vector<uint8_t> r;
        SensorModel m;
        m.owner = owner;
        m.number = number;
        switch (i % 5) {
        case 0:  // full threshold: a temperature, hysteresis readable
            r = header(id, sdr::type::fullSensor, sdr::full::idString);
            putKey(r, owner, number, entity, instance);
            r[sdr::sensor::capabilities] = 0x18;
            r[sdr::sensor::sensorType] = 0x01;
            r[sdr::sensor::eventReadingType] = sdr::eventReadingTypeThreshold;
            r[sdr::sensor::readableThresholds] = sdr::bits::allThresholds;
            r[sdr::sensor::baseUnit] = 1;
            r[sdr::full::mLow] = 1;
            putName(r, sdr::full::idStringTypeLength, name);
            m.type = 0x01;
            m.eventReadingType = sdr::eventReadingTypeThreshold;
            m.reading = static_cast<uint8_t>(30 + i % 20);
            m.readableMask = sdr::bits::allThresholds;
            m.thresholds[1] = 5;
            m.thresholds[4] = 90;
            m.hysteresisSupport = 1;
            break;
        case 1:  // compact sensor-specific (processor)
        case 2:  // compact generic discrete
            r = header(id, sdr::type::compactSensor, sdr::compact::idString);
            putKey(r, owner, number, entity, instance);
            r[sdr::sensor::sensorType] = i % 5 == 1 ? 0x07 : 0x08;
            r[sdr::sensor::eventReadingType] = i % 5 == 1 ? 0x6F : 0x03;
            r[sdr::compact::sharing] = 0x01;
            putName(r, sdr::compact::idStringTypeLength, name);
            m.type = r[sdr::sensor::sensorType];
            m.eventReadingType = r[sdr::sensor::eventReadingType];
            m.states = 0x0001;
            break;
        case 3:  // event-only
            r = header(id, sdr::type::eventOnly, sdr::eventOnly::idString);
            putKey(r, owner, number, entity, instance);
            r[sdr::eventOnly::sensorType] = 0x0F;
            r[sdr::eventOnly::eventReadingType] = 0x6F;
            r[sdr::eventOnly::sharing] = 0x01;
            putName(r, sdr::eventOnly::idStringTypeLength, name);
            m.eventOnly = true;
            break;
        default:  // FRU device locator: no sensor behind it
            bmc->sdr.records.push_back(fruLocator(id, locators++, owner, number, entity, instance));
            continue;
        }
        finish(r);
        bmc->sdr.records.push_back(r);
        bmc->sensors.push_back(m);
    }
    bmc->fru = loadProfile(defaultProfilePath())->fru;
    const size_t capacity = bmc->sel.allocationUnits;  // one 16-byte unit per record
    fillSel(*bmc, records / 2 < capacity ? records / 2 : capacity);
    return bmc;
}

bool generatedProfile(const std::string& name, size_t& records) {
    static const std::string kPrefix = "generated:";
    if (name.compare(0, kPrefix.size(), kPrefix) != 0) return false;
    const std::string count = name.substr(kPrefix.size());
    size_t n = 0;
    bool digits = !count.empty() && count.size() <= 5;
    for (char c : count) {
        digits = digits && c >= '0' && c <= '9';
        if (digits) n = n * 10 + static_cast<size_t>(c - '0');
    }
    if (!digits || n < kGeneratedMinRecords || n > kGeneratedMaxRecords)
        throw std::runtime_error(name + ": a generated server has 1 to " + std::to_string(kGeneratedMaxRecords) +
                                 " SDR records");
    records = n;
    return true;
}

}  // namespace Sim
