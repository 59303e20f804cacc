// Decoded FRU areas: field decoding, the getters of the chassis, board and
// product info areas, and the multi-record walk with its record decoders.

#include "IpmiFruOptional.h"

#include <ctype.h>
#include <stdio.h>
#include <string.h>
#include <time.h>

#include <new>

#include "FruLayout.h"
#include "IpmiLog.h"

namespace Ipmi {

namespace {

constexpr char kNa[] = "n/a";
// Minutes of the manufacturing date count from 1996-01-01 00:00:00 UTC.
constexpr long long kFruEpoch = 820454400;
constexpr unsigned kDumpBytesPerLine = 16;
// Records a walk looks at: an area of at most 64 KiB holds no more than this
// many records of at least a header each, so a longer walk is a broken chain.
constexpr unsigned kMaxRecords = 0x10000 / fru::multi::headerLength;

// Indexed by the chassis type byte.
const char* const chassis_type_desc[] = {
    "Unspecified", "Other", "Unknown", "Desktop", "Low Profile Desktop", "Pizza Box", "Mini Tower", "Tower",
    "Portable", "LapTop", "Notebook", "Hand Held", "Docking Station", "All in One", "Sub Notebook",
    "Space-saving", "Lunch Box", "Main Server Chassis", "Expansion Chassis", "SubChassis",
    "Bus Expansion Chassis", "Peripheral Chassis", "RAID Chassis", "Rack Mount Chassis", "Sealed-case PC",
    "multi-system", "Compact PCI", "Advanced TCA", "Blade", "Blade Enclosure", "Tablet", "Convertible",
    "Detachable", "IoT Gateway", "Embedded PC", "Mini PC", "Stick PC"};
constexpr unsigned kChassisTypeUnknownLower = 37;  // "unknown"; above it "Unknown"
static_assert(sizeof chassis_type_desc / sizeof chassis_type_desc[0] == kChassisTypeUnknownLower,
              "one name per chassis type below 37");

const char* const combined_voltage_desc[] = {"12 V", "-12 V", "5 V", "3.3 V"};

std::string number(long long v) { return std::to_string(v); }

// Hundredths (10 mV units) as volts with two decimals.
std::string centi(long long v) {
    char buf[32];
    snprintf(buf, sizeof buf, "%s%lld.%02lld", v < 0 ? "-" : "", (v < 0 ? -v : v) / 100, (v < 0 ? -v : v) % 100);
    return buf;
}

std::string hexBytes(const fru::Bytes& b) {
    std::string out;
    char buf[4];
    for (size_t i = 0; i < b.length(); ++i) {
        snprintf(buf, sizeof buf, "%02x", b.byteAt(i));
        out += buf;
    }
    return out;
}

std::string flag(bool set, const char* yes, const char* no) { return set ? yes : no; }

}  // namespace

std::string& toAsciiAndTrim(std::string& s) {
    for (char& c : s)
        if (!isprint(static_cast<unsigned char>(c))) c = ' ';
    const size_t last = s.find_last_not_of(" \t");
    if (last != std::string::npos) s.erase(last + 1);
    return s;
}

// ---------------------------------------------------------------- base

IpmiFruOptional::IpmiFruOptional() : size(0), data(nullptr) {}

IpmiFruOptional::IpmiFruOptional(unsigned int n, const unsigned char* bytes) : size(0), data(nullptr) {
    set(n, bytes);
}

IpmiFruOptional::IpmiFruOptional(const IpmiFruOptional& other) : size(0), data(nullptr) {
    set(other.size, other.data);
}

IpmiFruOptional& IpmiFruOptional::operator=(const IpmiFruOptional& other) {
    if (this != &other) set(other.size, other.data);
    return *this;
}

IpmiFruOptional::~IpmiFruOptional() { delete[] data; }

void IpmiFruOptional::set(unsigned int n, const unsigned char* bytes) {
    unsigned char* copy = nullptr;
    if (n > 0 && bytes != nullptr) {
        copy = new unsigned char[n];
        memcpy(copy, bytes, n);
    } else {
        n = 0;
    }
    delete[] data;
    data = copy;
    size = n;
}

bool IpmiFruOptional::versionOk() const {
    return size > 0 && (data[fru::infoArea::version] & fru::kVersionMask) == fru::kFormatVersion;
}

std::string IpmiFruOptional::getFruAreaString(unsigned int offset) const {
    const fru::Bytes area(data, size);
    if (!area.has(offset)) return std::string();
    const fru::FieldCode code{area.byteAt(offset)};
    // Bytes the area does not hold read as 0, as a short last group does.
    const fru::Bytes bytes = area.from(offset + 1);
    const unsigned length = code.length();
    switch (code.type()) {
    case fru::field::typeText: {
        const fru::Bytes text = bytes.first(length);
        return std::string(reinterpret_cast<const char*>(text.bytes()), text.length());
    }
    case fru::field::typeSixBitAscii: {
        const unsigned chars = length * 4 / 3;
        char* work = new (std::nothrow) char[chars + 1];
        if (work == nullptr) {
            ipmiLog(LOG_ERR, "IpmiFruOptional::getFruAreaString could not allocate buffer of length %d", chars + 1);
            return std::string();
        }
        auto at = [&bytes, length](unsigned i) -> uint32_t { return i < length ? bytes.byteAt(i) : 0; };
        unsigned out = 0;
        for (unsigned group = 0; out < chars; group += 3) {
            const uint32_t packed = at(group) | (at(group + 1) << 8) | (at(group + 2) << 16);
            for (unsigned unit = 0; unit < 4 && out < chars; ++unit)
                work[out++] = static_cast<char>(((packed >> (6 * unit)) & 0x3F) + 0x20);
        }
        work[chars] = '\0';
        std::string s(work, chars + 1);
        delete[] work;
        return s;
    }
    default:
        return std::string();
    }
}

unsigned int IpmiFruOptional::fieldOffset(unsigned int first, unsigned int index) const {
    const fru::Bytes area(data, size);
    unsigned int at = first;
    for (unsigned int i = 0;; ++i) {
        if (!area.has(at)) return 0;
        const fru::FieldCode code{area.byteAt(at)};
        if (code.endOfFields()) return 0;
        if (i == index) return at;
        at += 1 + code.length();
    }
}

std::string IpmiFruOptional::field(unsigned int first, unsigned int index, const char* absent) const {
    if (!versionOk()) return absent;
    const unsigned int at = fieldOffset(first, index);
    if (at == 0) return absent;
    std::string s = getFruAreaString(at);
    toAsciiAndTrim(s);
    return s.empty() ? std::string(absent) : s;
}

void IpmiFruOptional::dumpAs(const char* head, const char* enter, const char* leave) const {
    if (enter) ipmiLog(LOG_DEBUG, "%s", enter);
    std::string text;
    char buf[32];
    snprintf(buf, sizeof buf, head, size);
    text += buf;
    for (unsigned int i = 0; i < size; ++i) {
        if (i % kDumpBytesPerLine == 0) {
            snprintf(buf, sizeof buf, "\nData 0x%02x:", i);
            text += buf;
        }
        snprintf(buf, sizeof buf, " 0x%02x", data[i]);
        text += buf;
    }
    ipmiLog(LOG_DEBUG, "%s", text.c_str());
    if (leave) ipmiLog(LOG_DEBUG, "%s", leave);
}

void IpmiFruOptional::dump() const {
    dumpAs("Info Area : 0x%02x", "IpmiFruOptional: Dump Entering.", "IpmiFruOptional: Dump Exiting.");
}

void IpmiFruOptional::testDump() const { IpmiFruOptional::dump(); }

// ---------------------------------------------------------------- chassis

void IpmiFruChassis::dump() const { dumpAs("Chassis Info Area : 0x%02x", nullptr, nullptr); }

std::string IpmiFruChassis::getType() const {
    const fru::Bytes area(data, size);
    const uint8_t type = area.byteAt(fru::chassis::type);
    if (type > kChassisTypeUnknownLower) return "Unknown";
    const uint8_t version = area.byteAt(fru::infoArea::version);
    if ((version & fru::kVersionMask) != fru::kFormatVersion) {
        if ((version & fru::kVersionMask) == 0) return std::string();
        ipmiLog(LOG_ERR, "%s: return unknown, fru format not handled (area_ver = 0x%x", "getType", version);
        return "unknown";
    }
    if (type == kChassisTypeUnknownLower) return "unknown";
    return chassis_type_desc[type];
}

std::string IpmiFruChassis::getPartNumber() const { return field(fru::chassis::firstField, 0, ""); }

std::string IpmiFruChassis::getSerialNumber() const {
    if (!versionOk()) return kNa;
    const fru::Bytes area(data, size);
    const fru::FieldCode partNumber{area.byteAt(fru::chassis::firstField)};
    if (partNumber.endOfFields()) return kNa;
    // One byte short of the next field's type/length byte: kept as deployed.
    const unsigned int at = fru::chassis::firstField + partNumber.length();
    if (!area.has(at) || fru::FieldCode{area.byteAt(at)}.endOfFields()) return kNa;
    std::string s = getFruAreaString(at);
    toAsciiAndTrim(s);
    return s.empty() ? std::string(kNa) : s;
}

std::string IpmiFruChassis::getManufacturer() const { return kNa; }

// ---------------------------------------------------------------- board

void IpmiFruBoard::dump() const { dumpAs("Board Info Area : 0x%02x", nullptr, nullptr); }

std::string IpmiFruBoard::getManufacturer() const { return field(fru::board::firstField, 0, kNa); }
std::string IpmiFruBoard::getName() const { return field(fru::board::firstField, 1, ""); }
std::string IpmiFruBoard::getSerialNumber() const { return field(fru::board::firstField, 2, kNa); }
std::string IpmiFruBoard::getPartNumber() const { return field(fru::board::firstField, 3, ""); }

std::string IpmiFruBoard::getMfgDateTime8601() const {
    if (!versionOk()) return "N/A";
    const long long minutes = fru::Bytes(data, size).le24(fru::board::mfgMinutes);
    const time_t seconds = static_cast<time_t>(minutes * 60 + kFruEpoch);
    struct tm broken;
    if (gmtime_r(&seconds, &broken) == nullptr) return "N/A";
    char buf[24];
    if (strftime(buf, sizeof buf, "%FT%T", &broken) == 0) return "N/A";
    return buf;
}

// ---------------------------------------------------------------- product

void IpmiFruProduct::dump() const {
    dumpAs("Product Info Area : 0x%02x", "IpmiFruProduct: Dump Entering", "IpmiFruProduct: Dump Exiting.");
}

std::string IpmiFruProduct::getManufacturer() const { return field(fru::product::firstField, 0, kNa); }
std::string IpmiFruProduct::getName() const { return field(fru::product::firstField, 1, ""); }
std::string IpmiFruProduct::getPartNumber() const { return field(fru::product::firstField, 2, ""); }
std::string IpmiFruProduct::getVersion() const { return field(fru::product::firstField, 3, ""); }
std::string IpmiFruProduct::getSerialNumber() const { return field(fru::product::firstField, 4, kNa); }
std::string IpmiFruProduct::getAssetTag() const { return field(fru::product::firstField, 5, ""); }

// ---------------------------------------------------------------- multi-record

void IpmiFruMulti::dump() const { dumpAs("Multi Record Info Area : Data 0x", nullptr, nullptr); }

long IpmiFruMulti::findRecord(unsigned char type, const char* caller) const {
    const fru::Bytes area(data, size);
    size_t at = 0;
    for (unsigned n = 0; n < kMaxRecords && area.has(at, fru::multi::headerLength); ++n) {
        const fru::MultiRecordHeaderView header(area.from(at));
        if (header.dataLength() == 0) {
            ipmiLog(LOG_INFO, "%s: Multi FRU record len is equal to zero, not valid.", caller);
            return -1;
        }
        if (header.typeId() == type) return static_cast<long>(at);
        if (header.endOfList()) return -1;
        at += header.recordLength();
    }
    return -1;
}

bool IpmiFruMulti::isMultiRecordTypePresent(unsigned char type) const {
    return findRecord(type, "isMultiRecordTypePresent") >= 0;
}

std::string IpmiFruMulti::getValue(unsigned char type, FruKey key) const {
    const long at = findRecord(type, "getValue");
    if (at < 0) return kNa;
    const fru::Bytes area(data, size);
    const fru::MultiRecordHeaderView header(area.from(static_cast<size_t>(at)));
    // A record cut by the area's end is decoded as far as it goes.
    const fru::Bytes record = area.from(static_cast<size_t>(at) + fru::multi::headerLength).first(header.dataLength());
    const unsigned n = static_cast<unsigned>(record.length());
    switch (type) {
    case fru::recordType::powerSupply:
        return getPowerSupplyValue(record.bytes(), n, key);
    case fru::recordType::dcOutput:
        return getDCOutputValue(record.bytes(), n, key);
    case fru::recordType::dcLoad:
        return getDCLoad(record.bytes(), n, key);
    case fru::recordType::managementAccess:
        return getManagementAccessValue(record.bytes(), n, key);
    case fru::recordType::baseCompatibility:
    case fru::recordType::extendedCompatibility:
        return getExtendedCompatValue(record.bytes(), n, key);
    default:
        return type >= fru::recordType::oemFirst ? getOEMValue(record.bytes(), n, key) : std::string(kNa);
    }
}

std::string IpmiFruMulti::getPowerSupplyValue(const unsigned char* record, unsigned int length, FruKey key) {
    namespace ps = fru::powerSupply;
    const fru::Bytes r(record, length);
    auto need = [&r](size_t offset, size_t count) { return r.has(offset, count); };
    const uint8_t flags = r.byteAt(ps::flags);
    auto psFlag = [&](uint8_t bit) { return need(ps::flags, 1) ? flag(flags & bit, "true", "false") : kNa; };
    switch (key) {
    case FruKey::PsOverallCapacity:
        return need(ps::overallCapacity, 2) ? number(r.le16(ps::overallCapacity) & ps::capacityMask) : kNa;
    case FruKey::PsPeakVa:
        return need(ps::peakVa, 2) && r.le16(ps::peakVa) != ps::notSpecified16 ? number(r.le16(ps::peakVa)) : kNa;
    case FruKey::PsInrushCurrent:
        return need(ps::inrushCurrent, 1) && r.byteAt(ps::inrushCurrent) != ps::notSpecified8
                   ? number(r.byteAt(ps::inrushCurrent))
                   : kNa;
    case FruKey::PsInrushInterval:
        return need(ps::inrushInterval, 1) ? number(r.byteAt(ps::inrushInterval)) : kNa;
    case FruKey::PsLowInputVoltage1:
        return need(ps::lowInputVoltage1, 2) ? centi(r.le16(ps::lowInputVoltage1)) : kNa;
    case FruKey::PsHighInputVoltage1:
        return need(ps::highInputVoltage1, 2) ? centi(r.le16(ps::highInputVoltage1)) : kNa;
    case FruKey::PsLowInputVoltage2:
        return need(ps::lowInputVoltage2, 2) && r.le16(ps::lowInputVoltage2) ? centi(r.le16(ps::lowInputVoltage2))
                                                                             : kNa;
    case FruKey::PsHighInputVoltage2:
        return need(ps::highInputVoltage2, 2) && r.le16(ps::highInputVoltage2)
                   ? centi(r.le16(ps::highInputVoltage2))
                   : kNa;
    case FruKey::PsLowInputFrequency:
        return need(ps::lowInputFrequency, 1) ? number(r.byteAt(ps::lowInputFrequency)) : kNa;
    case FruKey::PsHighInputFrequency:
        return need(ps::highInputFrequency, 1) ? number(r.byteAt(ps::highInputFrequency)) : kNa;
    case FruKey::PsDropoutTolerance:
        return need(ps::dropoutTolerance, 1) ? number(r.byteAt(ps::dropoutTolerance)) : kNa;
    case FruKey::PsPredictiveFailSupport:
        return psFlag(ps::predictiveFailPin);
    case FruKey::PsPowerFactorCorrection:
        return psFlag(ps::powerFactorCorrection);
    case FruKey::PsAutoSwitch:
        return psFlag(ps::autoSwitch);
    case FruKey::PsHotSwap:
        // Deployed CIM mappings match this misspelling.
        return need(ps::flags, 1) ? flag(flags & ps::hotSwap, "true", "fase") : kNa;
    case FruKey::PsPredictiveFailMode: {
        if (!need(ps::flags, 1)) return kNa;
        const bool tachometer = r.byteAt(ps::tachometerThreshold) != 0;
        const bool bit = flags & ps::pulsesOrPolarity;
        if (tachometer) return bit ? "Two pulses per rotation" : "One pulse per rotation";
        return bit ? "Failure on pin assertion" : "Failure on pin de-assertion";
    }
    case FruKey::PsPeakWattage:
        return need(ps::peakWattage, 2) ? number(r.le16(ps::peakWattage) & ps::capacityMask) : kNa;
    case FruKey::PsHoldUpTime:
        return need(ps::peakWattage, 2) ? number(r.le16(ps::peakWattage) >> 12) : kNa;
    case FruKey::PsCombinedVoltage1:
    case FruKey::PsCombinedVoltage2: {
        if (!need(ps::combinedWattage, 1)) return kNa;
        const uint8_t b = r.byteAt(ps::combinedWattage);
        const unsigned index = key == FruKey::PsCombinedVoltage1 ? b >> 4 : b & 0x0F;
        return index < sizeof combined_voltage_desc / sizeof combined_voltage_desc[0] ? combined_voltage_desc[index]
                                                                                      : kNa;
    }
    case FruKey::PsTotalCombinedWattage:
        return need(ps::totalCombinedWattage, 2) ? number(r.le16(ps::totalCombinedWattage)) : kNa;
    case FruKey::PsTachometerThreshold:
        return need(ps::tachometerThreshold, 1) ? number(r.byteAt(ps::tachometerThreshold)) : kNa;
    default:
        return kNa;
    }
}

namespace {

// DC output and DC load records share their shape; only output records
// carry the standby flag, and the two voltages mean different limits.
std::string dcValue(const fru::Bytes& r, FruKey key, bool output) {
    auto s16 = [&r](size_t at) { return static_cast<long long>(static_cast<int16_t>(r.le16(at))); };
    auto need = [&r](size_t at, size_t count) { return r.has(at, count); };
    switch (key) {
    case FruKey::DcOutputNumber:
        return need(fru::dc::outputInfo, 1) ? number(r.byteAt(fru::dc::outputInfo) & fru::dc::outputNumber) : kNa;
    case FruKey::DcStandby:
        return output && need(fru::dc::outputInfo, 1) ? flag(r.byteAt(fru::dc::outputInfo) & fru::dc::standby, "yes", "no")
                                                      : kNa;
    case FruKey::DcNominalVoltage:
        return need(fru::dc::nominalVoltage, 2) ? centi(s16(fru::dc::nominalVoltage)) : kNa;
    case FruKey::DcLowVoltage:
        return need(fru::dc::lowVoltage, 2) ? centi(s16(fru::dc::lowVoltage)) : kNa;
    case FruKey::DcHighVoltage:
        return need(fru::dc::highVoltage, 2) ? centi(s16(fru::dc::highVoltage)) : kNa;
    case FruKey::DcRippleNoise:
        return need(fru::dc::rippleNoise, 2) ? number(r.le16(fru::dc::rippleNoise)) : kNa;
    case FruKey::DcMinimumCurrent:
        return need(fru::dc::minimumCurrent, 2) ? number(r.le16(fru::dc::minimumCurrent)) : kNa;
    case FruKey::DcMaximumCurrent:
        return need(fru::dc::maximumCurrent, 2) ? number(r.le16(fru::dc::maximumCurrent)) : kNa;
    default:
        return kNa;
    }
}

}  // namespace

std::string IpmiFruMulti::getDCOutputValue(const unsigned char* record, unsigned int length, FruKey key) {
    return dcValue(fru::Bytes(record, length), key, true);
}

std::string IpmiFruMulti::getDCLoad(const unsigned char* record, unsigned int length, FruKey key) {
    return dcValue(fru::Bytes(record, length), key, false);
}

std::string IpmiFruMulti::getManagementAccessValue(const unsigned char* record, unsigned int length, FruKey key) {
    const fru::Bytes r(record, length);
    if (!r.has(fru::managementAccess::subType)) return kNa;
    if (key == FruKey::MgmtSubRecordType) return number(r.byteAt(fru::managementAccess::subType));
    if (key != FruKey::MgmtValue) return kNa;
    const fru::Bytes text = r.from(fru::managementAccess::text);
    std::string s(reinterpret_cast<const char*>(text.bytes()), text.length());
    return toAsciiAndTrim(s);
}

std::string IpmiFruMulti::getExtendedCompatValue(const unsigned char* record, unsigned int length, FruKey key) {
    namespace c = fru::compatibility;
    const fru::Bytes r(record, length);
    switch (key) {
    case FruKey::CompatManufacturerId:
        return r.has(c::manufacturerId, 3) ? number(r.le24(c::manufacturerId)) : kNa;
    case FruKey::CompatEntityId:
        return r.has(c::entityId) ? number(r.byteAt(c::entityId)) : kNa;
    case FruKey::CompatBase:
        return r.has(c::base) ? number(r.byteAt(c::base)) : kNa;
    case FruKey::CompatCodeStart:
        return r.has(c::codeStart) ? number(r.byteAt(c::codeStart) & 0x7F) : kNa;
    case FruKey::CompatCodeRangeMask:
        return r.has(c::codeRangeMask) ? hexBytes(r.from(c::codeRangeMask)) : kNa;
    default:
        return kNa;
    }
}

std::string IpmiFruMulti::getOEMValue(const unsigned char* record, unsigned int length, FruKey key) {
    const fru::Bytes r(record, length);
    if (key == FruKey::OemManufacturerId)
        return r.has(fru::oem::manufacturerId, 3) ? number(r.le24(fru::oem::manufacturerId)) : kNa;
    if (key == FruKey::OemData) return r.has(fru::oem::data) ? hexBytes(r.from(fru::oem::data)) : kNa;
    return kNa;
}

}  // namespace Ipmi
