// A generated repository of a large server, for the benchmarks.

#include "GeneratedServer.h"

#include <string>
#include <vector>

#include "SdrLayout.h"

namespace Bench {

using namespace Ipmi;

namespace {

// Sensors sit on five controllers (the BMC and four behind it on IPMB), 250
// records each, since a controller numbers at most 256 sensors. Every fifth
// record is a full threshold sensor, then a compact sensor-specific and a
// compact generic discrete sensor, an event-only record and a FRU locator.
constexpr uint8_t kOwners[] = {0x20, 0x2C, 0x2E, 0x30, 0x32};
constexpr size_t kRecordsPerOwner = 250;

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

}  // namespace

std::shared_ptr<Sim::Bmc> generatedServer(size_t records) {
    auto bmc = std::make_shared<Sim::Bmc>();
    static const uint8_t kEntities[] = {0x03, 0x07, 0x0A, 0x1D, 0x20};  // processor, board, PSU, fan, memory
    for (size_t i = 0; i < records; ++i) {
        const auto id = static_cast<uint16_t>(i + 1);
        const uint8_t owner = kOwners[(i / kRecordsPerOwner) % (sizeof kOwners)];
        const auto number = static_cast<uint8_t>(i % kRecordsPerOwner);
        const uint8_t entity = kEntities[(i / 5) % sizeof kEntities];
        const auto instance = static_cast<uint8_t>(1 + (i / 25) % 8);
        const std::string name = "Sensor " + std::to_string(id);
        std::vector<uint8_t> r;
        Sim::SensorModel m;
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
        default: {  // FRU device locator: no sensor behind it
            constexpr size_t kFruDeviceId = 6, kFruEntityId = 12, kFruEntityInstance = 13, kFruIdStringCode = 15;
            r = header(id, sdr::type::fruDeviceLocator, kFruIdStringCode + 1);
            r[sdr::key::ownerId] = 0x20;
            r[kFruDeviceId] = static_cast<uint8_t>(id & 0xFF);
            r[kFruEntityId] = entity;
            r[kFruEntityInstance] = instance;
            putName(r, kFruIdStringCode, "FRU " + std::to_string(id));
            finish(r);
            bmc->sdr.records.push_back(r);
            continue;
        }
        }
        finish(r);
        bmc->sdr.records.push_back(r);
        bmc->sensors.push_back(m);
    }
    return bmc;
}

}  // namespace Bench
