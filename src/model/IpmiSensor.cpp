#include "IpmiSensor.h"

#include <math.h>
#include <stdio.h>
#include <string.h>
#include <time.h>

#include <limits>

#include "CmpiStatus.h"
#include "IpmiIfcInternal.h"
#include "SdrLayout.h"

namespace Ipmi {

namespace {

sdr::FullSensorView recordOf(const unsigned char* bytes, size_t length) { return {bytes, length}; }

// Linearisation codes (full record byte 23).
enum Linearisation : uint8_t {
    linear = 0,
    ln = 1,
    log10Of = 2,
    log2Of = 3,
    expE = 4,
    exp10 = 5,
    exp2 = 6,
    reciprocal = 7,
    square = 8,
    cube = 9,
    squareRoot = 10,
    cubeRoot = 11
};

constexpr double kLn2 = 0.6931471805599453;
// e squared: the kept inverse of the log2 linearisation multiplies by it.
constexpr double kESquared = 7.38905609893065;

constexpr uint8_t kStatusScanningEnabled = 0x40;
constexpr uint8_t kStatusReadingUnavailable = 0x20;
constexpr uint8_t kRearmAll = 0x00;
constexpr uint8_t kRearmSelected = 0x80;
constexpr uint8_t kAllEventMessagesEnabled = 0x80;
constexpr size_t kReadingBytes = 5;
constexpr size_t kThresholdBytes = 8;
// Set Sensor Thresholds request: sensor number, set mask, then one byte per
// threshold in mask-bit order (LNC, LC, LNR, UNC, UC, UNR).
constexpr size_t kSetMaskByte = 1;
constexpr size_t kFirstThresholdByte = 2;
constexpr int kThresholdCount = 6;

double linearise(uint8_t code, double y) {
    switch (code) {
    case linear: return y;
    case ln: return log(y);
    case log10Of: return log10(y);
    case log2Of: return log(y) / kLn2;
    case expE: return exp(y);
    case exp10: return pow(10.0, y);
    case exp2: return pow(2.0, y);
    case reciprocal: return 1.0 / y;
    case square: return y * y;
    case cube: return pow(y, 3.0);
    case squareRoot: return sqrt(y);
    case cubeRoot: return cbrt(y);
    default: return y;  // non-linear and OEM codes: as read
    }
}

// Inverse of linearise, with two kept oddities: code 3 multiplies by e^2
// instead of raising 2, and code 7 divides by ln(-1), which is not a number.
// Existing callers depend on both results.
double unlinearise(uint8_t code, double v) {
    switch (code) {
    case linear: return v;
    case ln: return exp(v);
    case log10Of: return pow(10.0, v);
    case log2Of: return kESquared * exp(v);
    case expE: return log(v);
    case exp10: return log10(v);
    case exp2: return log(v) / kLn2;
    case reciprocal: return log(v) / log(-1.0);
    case square: return sqrt(v);
    case cube: return cbrt(v);
    case squareRoot: return v * v;
    case cubeRoot: return pow(v, 3.0);
    default: return v;
    }
}

// Truncates to a 32-bit int as x86's cvttsd2si does: NaN and values out of
// range give the "integer indefinite" 0x80000000. In C++ that conversion is
// undefined, so the x86 result that callers have always seen is made explicit.
uint32_t truncateToInt32(double d) {
    constexpr uint32_t kIntegerIndefinite = 0x80000000u;
    if (!(d >= -2147483648.0 && d < 2147483648.0)) return kIntegerIndefinite;
    return static_cast<uint32_t>(static_cast<int32_t>(d));
}

}  // namespace

IpmiSensor::IpmiSensor(int node_, unsigned char* bytes, int len)
    : sdr(bytes != nullptr && len > 0 ? static_cast<uint32_t>(len) : 0u, bytes),
      reading{0, 0, 0, 0, 0},
      last_poll_result(0),
      poll_repeat_count(0),
      reading_time(0),
      reading_valid(false),
      sensor_present(false),
      not_available_pending(true),
      request_failed_pending(true),
      threshold_reading{0, 0, 0, 0, 0, 0, 0, 0},
      hysteresis{0, 0, 0},
      node(node_),
      sensor_number(0),
      record_id(0),
      reading_length(0) {
    if (bytes != nullptr && len >= 9) {
        sdr::SensorKeyView key(bytes, static_cast<size_t>(len));
        sensor_number = key.sensorNumber();
        record_id = key.recordId();
    }
}

IpmiSensor::~IpmiSensor() {}

size_t IpmiSensor::readableLength() const {
    const size_t capacity = sizeof sdr.data;
    return sdr.length < capacity ? sdr.length : capacity;
}

// ---- record accessors ----

unsigned char IpmiSensor::getOwnerId() const { return recordOf(recordBytes(), readableLength()).ownerId(); }

unsigned char IpmiSensor::getLun() const { return recordOf(recordBytes(), readableLength()).ownerLun(); }

unsigned char IpmiSensor::getChannel() const { return recordOf(recordBytes(), readableLength()).ownerChannel(); }

unsigned char IpmiSensor::getSensorType() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (rec.isFullOrCompact()) return rec.sensorType();
    if (rec.isEventOnly()) return sdr::EventOnlyView(rec).sensorType();
    return 0;
}

unsigned char IpmiSensor::getEventReadingType() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (rec.isFullOrCompact()) return rec.eventReadingType();
    if (rec.isEventOnly()) return sdr::EventOnlyView(rec).eventReadingType();
    return 0;
}

unsigned char IpmiSensor::getRateUnit() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.rateUnit() : 0;
}

unsigned char IpmiSensor::getModifierUnitUse() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.modifierUnitUse() : 0;
}

unsigned char IpmiSensor::getBaseUnit() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.baseUnit() : 0;
}

unsigned char IpmiSensor::getModifierUnit() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.modifierUnit() : 0;
}

// The full record's own direction field is not consulted here (its text
// counterpart does read it); callers have always seen 0 for full records.
unsigned char IpmiSensor::getSensorDirection() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (rec.isCompact()) return sdr::CompactSensorView(rec).direction();
    if (rec.isEventOnly()) return sdr::EventOnlyView(rec).direction();
    return 0;
}

unsigned char IpmiSensor::getHysteresisSupport() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.hysteresisSupport() : 0;
}

unsigned char IpmiSensor::getThresholdAccessSupport() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.thresholdAccessSupport() : 0;
}

unsigned char IpmiSensor::getEventMessageSupport() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFullOrCompact() ? rec.eventMessageControl() : 255;
}

unsigned short IpmiSensor::getFlags() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (!rec.isFullOrCompact()) return 0;
    const uint8_t init = rec.initialisation();
    unsigned short flags = 0;
    if (init & sdr::bits::initScanning) flags |= FLAG_INIT_SCANNING;
    if (init & sdr::bits::initEvents) flags |= FLAG_INIT_EVENTS;
    if (init & sdr::bits::initHysteresis) flags |= FLAG_INIT_HYSTERESIS;
    if (init & sdr::bits::initSensorType) flags |= FLAG_INIT_SENSOR_TYPE;
    if (init & sdr::bits::scanningEnabledAtStart) flags |= FLAG_SCANNING_ENABLED;
    if (init & sdr::bits::eventsEnabledAtStart) flags |= FLAG_EVENTS_ENABLED;
    if (rec.ignoreSensor()) flags |= FLAG_IGNORE_SENSOR;
    if (rec.autoRearm()) flags |= FLAG_AUTO_REARM;
    if (rec.percentage()) flags |= FLAG_PERCENTAGE;
    return flags;
}

// Kept as callers know it: only the record type decides, not the linearisation.
bool IpmiSensor::isLinear() const { return !recordOf(recordBytes(), readableLength()).isFull(); }

bool IpmiSensor::isAnalog() const {
    return recordOf(recordBytes(), readableLength()).analogDataFormat() != sdr::analogFormat::noAnalogReading;
}

bool IpmiSensor::isConvertible() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFull() && rec.analogDataFormat() != sdr::analogFormat::noAnalogReading;
}

bool IpmiSensor::isNominalReadingSet() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFull() && rec.hasNominalReading();
}

bool IpmiSensor::isNormalMaxSet() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFull() && rec.hasNormalMax();
}

bool IpmiSensor::isNormalMinSet() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return rec.isFull() && rec.hasNormalMin();
}

bool IpmiSensor::readingStateUnavailable() const {
    const ReadingSnapshot r = currentReading();
    return !r.valid || (r.bytes[2] & kStatusReadingUnavailable);
}

bool IpmiSensor::scanningDisabled() const {
    const ReadingSnapshot r = currentReading();
    return r.valid && !(r.bytes[2] & kStatusScanningEnabled);
}

// The length handed out is what the buffer holds: an over-long record that
// was refused keeps its length but none of its bytes.
void IpmiSensor::RawRecord(const unsigned char*& bytes, int& length) const {
    bytes = recordBytes();
    length = static_cast<int>(readableLength());
}

IpmiEntity IpmiSensor::getEntity() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    return IpmiEntity(rec.entityId(), rec.entityInstance(), 0, node);
}

int IpmiSensor::getManufacturerId(unsigned char* id, unsigned char& count) const {
    return IpmiIfc::getManufacturerId(node, id, count);
}

uint32_t IpmiSensor::getLastPollResult() const {
    TAV::MutexLock guard(state_mutex);
    return last_poll_result;
}

int32_t IpmiSensor::getPollRepeatCount() const {
    TAV::MutexLock guard(state_mutex);
    return poll_repeat_count;
}

void IpmiSensor::recordPollResult(uint32_t result) {
    TAV::MutexLock guard(state_mutex);
    if (result == last_poll_result) {
        if (poll_repeat_count < std::numeric_limits<int32_t>::max()) ++poll_repeat_count;
    } else {
        poll_repeat_count = 0;
    }
    last_poll_result = result;
}

// ---- commands ----

int IpmiSensor::commandResult(uint8_t cc) {
    return (cc == cc::invalidCommand || cc == cc::illegalForSensorType) ? 1 : cc;
}

uint8_t IpmiSensor::sendSensorCommand(uint8_t command, const uint8_t* request, uint16_t requestLength,
                                      uint8_t* answer, uint16_t capacity) {
    uint8_t data[8] = {0, 0, 0, 0, 0, 0, 0, 0};
    if (requestLength > sizeof data) requestLength = sizeof data;
    memcpy(data, request, requestLength);
    memset(answer, 0, capacity);
    uint16_t answerLength = capacity;
    return IpmiIfc::sendCmd(node, command, netfn::sensorEvent, requestLength, data, &answerLength, answer);
}

// ---- readings ----

IpmiSensor::ReadingSnapshot IpmiSensor::currentReading() const {
    TAV::MutexLock guard(state_mutex);
    ReadingSnapshot now;
    memcpy(now.bytes, reading, sizeof reading);
    now.length = reading_length;
    now.valid = reading_valid;
    now.present = sensor_present;
    now.time = reading_time;
    return now;
}

IpmiSensor::ReadingSnapshot IpmiSensor::refreshReading() {
    // Starts from what is stored: a software-owned sensor is never asked and
    // keeps its validity, time and length.
    ReadingSnapshot fresh = currentReading();
    fresh.present = true;
    memset(fresh.bytes, 0, sizeof fresh.bytes);
    const auto rec = recordOf(recordBytes(), readableLength());
    bool absent = false;
    uint8_t code = cc::ok;
    if (!rec.ownerIsSoftware()) {
        // The owner is addressed under the senders' lock: a request another
        // thread sends meanwhile still goes to its own target.
        RespHolder resp(IpmiIfcSendToOwner(node, cmd::getSensorReading, sensor_number, rec.ownerId(),
                                           rec.ownerChannel(), rec.ownerLun()));
        uint16_t length = sizeof fresh.bytes;
        code = IpmiIfcCopyAnswer(resp.get(), &length, fresh.bytes);
        fresh.valid = code == cc::ok;
        absent = code == cc::requestedSensorNotPresent;
        if (absent) {
            fresh.present = false;
        } else if (code == cc::ok) {
            fresh.time = static_cast<uint64_t>(time(nullptr)) * 1000000u;
            fresh.length = static_cast<unsigned char>(length < kReadingBytes ? length : kReadingBytes);
        }
    }
    {
        TAV::MutexLock guard(state_mutex);
        memcpy(reading, fresh.bytes, sizeof reading);
        reading_length = fresh.length;
        reading_valid = fresh.valid;
        sensor_present = fresh.present;
        reading_time = fresh.time;
    }
    if (absent) return fresh;
    if (code != cc::ok)
        ipmiLog(LOG_WARNING, "IpmiSensor::getSDReading: unexpected return cc code for node: %d cmd: %d/%d was 0x%x",
                node, cmd::getSensorReading, netfn::sensorEvent, code);
    if (fresh.present && !fresh.valid)
        ipmiLog(LOG_WARNING, "IpmiSensor::getSDReading no value read for sensor %d", sensor_number);
    return fresh;
}

void IpmiSensor::clearPending(bool notAvailable) {
    TAV::MutexLock guard(state_mutex);
    (notAvailable ? not_available_pending : request_failed_pending) = false;
}

void IpmiSensor::getSDReading() { (void)refreshReading(); }

unsigned int IpmiSensor::getReading() {
    const ReadingSnapshot r = refreshReading();
    if (!r.valid || r.bytes[0] != cc::ok) return 0;
    if (isDiscrete()) return r.bytes[3] | (r.length > 4 ? (r.bytes[4] & 0x7Fu) << 8 : 0u);
    return r.bytes[1];
}

unsigned int IpmiSensor::getReading(bool) { return getReading(); }

double IpmiSensor::getReading(unsigned raw) { return convertRawValue(raw); }

void IpmiSensor::setReading(unsigned char* five_bytes) {
    if (five_bytes == nullptr) return;
    const uint64_t now = static_cast<uint64_t>(time(nullptr)) * 1000000u;
    TAV::MutexLock guard(state_mutex);
    memcpy(reading, five_bytes, kReadingBytes);
    reading_valid = true;
    reading_time = now;
}

void IpmiSensor::setThresholdReading(unsigned char* eight_bytes) {
    if (eight_bytes == nullptr) return;
    TAV::MutexLock guard(state_mutex);
    memcpy(threshold_reading, eight_bytes, kThresholdBytes);
}

bool IpmiSensor::hasReadingTime() const { return currentReading().time != 0; }

IpmiSensor::CachedState IpmiSensor::getCachedState() const {
    CachedState out;
    TAV::MutexLock guard(state_mutex);
    memcpy(out.reading, reading, sizeof out.reading);
    out.readingLength = reading_length;
    out.readingValid = reading_valid;
    out.lastPollResult = last_poll_result;
    out.readingTime = reading_time;
    memcpy(out.thresholds, threshold_reading, sizeof out.thresholds);
    return out;
}

void IpmiSensor::getReadingTime(std::string& out) const {
    const time_t seconds = static_cast<time_t>(currentReading().time / 1000000u);
    struct tm utc;
    memset(&utc, 0, sizeof utc);
    gmtime_r(&seconds, &utc);
    char text[64];
    size_t n = strftime(text, sizeof text, "%FT%TZ", &utc);
    out.assign(text, n);
}

void IpmiSensor::dump() const {
    const size_t length = readableLength();
    printf("Sensor : 0x%02x", recordOf(recordBytes(), length).sensorNumber());
    for (size_t i = 0; i < length; ++i) {
        if (i % 16 == 0) printf("\nData 0x%02x:", static_cast<unsigned>(i));
        printf(" 0x%02x", recordBytes()[i]);
    }
    printf("\n");
}

// ---- conversion ----

double IpmiSensor::convertRawValue(unsigned raw) const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (!rec.isFull()) {
        ipmiLog(LOG_ERR, "%s: request but not a full sensor", "convertRawValue");
        return 0.0;
    }
    const int m = rec.m();
    const double bTerm = rec.b() * pow(10.0, rec.bExp());
    const double scale = pow(10.0, rec.rExp());
    double y;
    switch (rec.analogDataFormat()) {
    case sdr::analogFormat::unsignedValue:
        y = (m * static_cast<double>(raw) + bTerm) * scale;
        break;
    case sdr::analogFormat::onesComplement: {
        // Negative ones' complement values are one below their two's complement
        // reading, so 0xFF (negative zero) reads as 0.
        const int64_t x = (raw & 0x80) ? static_cast<int8_t>(static_cast<uint8_t>(raw + 1)) : static_cast<int64_t>(raw);
        y = (static_cast<double>(m * x) + bTerm) * scale;
        break;
    }
    case sdr::analogFormat::twosComplement: {
        const int64_t x = static_cast<int8_t>(static_cast<uint8_t>(raw));
        y = (static_cast<double>(m * x) + bTerm) * scale;
        break;
    }
    default:
        ipmiLog(LOG_ERR, "%s: request against non-threshold sensor", "convertRawValue");
        return 0.0;
    }
    return linearise(rec.linearisation(), y);
}

unsigned int IpmiSensor::convertToRawValue(double value) const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (value == 0.0 || !rec.isFull()) return 0;
    const double m = rec.m();
    const double bTerm = rec.b() * pow(10.0, rec.bExp());
    const double scale = pow(10.0, rec.rExp());
    const double x = unlinearise(rec.linearisation(), value);
    double raw;
    switch (rec.analogDataFormat()) {
    case sdr::analogFormat::unsignedValue:
        if (m == 0) return 0;
        raw = floor(x / (scale * m) - bTerm / m + 0.5);
        break;
    case sdr::analogFormat::twosComplement:
        raw = floor(x / (scale * m) - bTerm / m + 0.5);
        break;
    case sdr::analogFormat::onesComplement:
        // The -1.0 applies to positive values too; callers have always seen it.
        raw = floor(x / (scale * m) - bTerm / m - 1.0 + 0.5);
        break;
    default:
        return 0;
    }
    return truncateToInt32(raw);
}

// ---- thresholds and static range values ----

double IpmiSensor::getThreshold(unsigned bit, unsigned answerByte, const char* notReadable) {
    if (getThresholdAccessSupport() == 0 || getEventReadingType() != sdr::eventReadingTypeThreshold)
        throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Not a threshold sensor");
    if (!(recordOf(recordBytes(), readableLength()).readableThresholds() & bit))
        throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, notReadable);
    uint8_t answer[kThresholdBytes];
    const uint8_t code = sendSensorCommand(cmd::getSensorThresholds, &sensor_number, 1, answer, sizeof answer);
    if (code == cc::invalidCommand || code == cc::illegalForSensorType) {
        ipmiLog(LOG_DEBUG, "invalid command to sensor(0x%x), cc = 0x%x", sensor_number, code);
        throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Failed to get threshold reading");
    }
    // Other failures convert what the answer buffer holds (zeros where nothing
    // came back); callers rely on getting a value rather than an exception.
    const unsigned raw = (answer[1] & bit) ? answer[answerByte] : 0;
    return convertRawValue(raw);
}

double IpmiSensor::getLowerNonCriticalThreshold(bool) {
    return getThreshold(sdr::bits::lowerNonCritical, 2, "Threshold sensor does not support lower non-critical");
}

double IpmiSensor::getLowerCriticalThreshold(bool) {
    return getThreshold(sdr::bits::lowerCritical, 3, "Threshold sensor does not support lower critical");
}

double IpmiSensor::getLowerNonRecoverableThreshold(bool) {
    return getThreshold(sdr::bits::lowerNonRecoverable, 4,
                        "Threshold sensor does not support lower non-recoverable");
}

double IpmiSensor::getUpperNonCriticalThreshold(bool) {
    return getThreshold(sdr::bits::upperNonCritical, 5, "Threshold sensor does not support upper non-critical");
}

double IpmiSensor::getUpperCriticalThreshold(bool) {
    return getThreshold(sdr::bits::upperCritical, 6, "Threshold sensor does not support upper critical");
}

double IpmiSensor::getUpperNonRecoverableThreshold(bool) {
    return getThreshold(sdr::bits::upperNonRecoverable, 7,
                        "Threshold sensor does not support upper non-recoverable");
}

double IpmiSensor::getMinReadable() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (!rec.isFull()) throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Not a Full sensor");
    return convertRawValue(rec.sensorMin());
}

double IpmiSensor::getMaxReadable() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (!rec.isFull()) throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Not a Full sensor");
    return convertRawValue(rec.sensorMax());
}

// The next three test the analog characteristic flag only for records that are not
// full, and a full record converts its byte whatever the flag says. Kept.
double IpmiSensor::getNormalMin() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (!rec.isFull() && rec.hasNormalMin())
        throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Not a Full sensor or available");
    return convertRawValue(rec.normalMin());
}

double IpmiSensor::getNormalMax() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (!rec.isFull() && rec.hasNormalMax())
        throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Not a Full sensor or normal max not available");
    return convertRawValue(rec.normalMax());
}

double IpmiSensor::getNominalReading() const {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (!rec.isFull() && rec.hasNominalReading())
        throw kelInt::CmpiStatus(CMPI_RC_ERR_FAILED, "Not a Full sensor or no nominal reading");
    return convertRawValue(rec.nominalReading());
}

int IpmiSensor::sendSetThresholds(const unsigned char* request) {
    uint8_t answer[1];
    const uint8_t code = sendSensorCommand(cmd::setSensorThresholds, request, kThresholdBytes, answer, sizeof answer);
    return code == cc::ok ? 0 : commandResult(code);
}

int IpmiSensor::setThresholds(double lnc, double lc, double lnr, double unc, double uc, double unr) {
    if (getThresholdAccessSupport() == 0) return 1;
    const double values[kThresholdCount] = {lnc, lc, lnr, unc, uc, unr};
    const uint8_t settable = recordOf(recordBytes(), readableLength()).settableThresholds();
    unsigned char request[kThresholdBytes] = {sensor_number, 0, 0, 0, 0, 0, 0, 0};
    for (int i = 0; i < kThresholdCount; ++i) {
        const uint8_t bit = static_cast<uint8_t>(1u << i);
        if (values[i] == 0.0 || !(settable & bit)) continue;
        request[kSetMaskByte] |= bit;
        request[kFirstThresholdByte + i] = static_cast<uint8_t>(convertToRawValue(values[i]) & 0xFF);
    }
    return sendSetThresholds(request);
}

int IpmiSensor::restoreDefaultThresholds() {
    const auto rec = recordOf(recordBytes(), readableLength());
    if (!rec.isFull() || rec.eventReadingType() != sdr::eventReadingTypeThreshold) return 1;
    const uint8_t defaults[kThresholdCount] = {rec.lowerNonCritical(),    rec.lowerCritical(),
                                               rec.lowerNonRecoverable(), rec.upperNonCritical(),
                                               rec.upperCritical(),       rec.upperNonRecoverable()};
    const uint8_t settable = rec.settableThresholds();
    unsigned char request[kThresholdBytes] = {sensor_number, settable, 0, 0, 0, 0, 0, 0};
    for (int i = 0; i < kThresholdCount; ++i)
        if (settable & (1u << i)) request[kFirstThresholdByte + i] = defaults[i];
    return sendSetThresholds(request);
}

int IpmiSensor::rearmEvents() {
    const uint8_t request[2] = {sensor_number, kRearmAll};
    uint8_t answer[1];
    return commandResult(sendSensorCommand(cmd::rearmSensorEvents, request, sizeof request, answer, sizeof answer));
}

// ---- event enables and re-arm, shared by both sensor classes ----

int IpmiSensor::getEventEnableMasked(uint8_t highMask, unsigned char& flags, unsigned short& assertMask,
                                     unsigned short& deassertMask) {
    uint8_t answer[6];
    const uint8_t code = sendSensorCommand(cmd::getSensorEventEnable, &sensor_number, 1, answer, sizeof answer);
    if (code != cc::ok) return commandResult(code);
    flags = answer[1];
    // The per-state masks mean something only while event messages are on.
    if (flags & kAllEventMessagesEnabled) {
        assertMask = static_cast<unsigned short>(answer[2] | (answer[3] & highMask) << 8);
        deassertMask = static_cast<unsigned short>(answer[4] | (answer[5] & highMask) << 8);
    }
    return 0;
}

int IpmiSensor::setEventEnableMasked(uint8_t highMask, unsigned char flags, unsigned short assertMask,
                                     unsigned short deassertMask) {
    const uint8_t request[6] = {sensor_number,
                                flags,
                                static_cast<uint8_t>(assertMask & 0xFF),
                                static_cast<uint8_t>((assertMask >> 8) & highMask),
                                static_cast<uint8_t>(deassertMask & 0xFF),
                                static_cast<uint8_t>((deassertMask >> 8) & highMask)};
    uint8_t answer[1];
    return commandResult(sendSensorCommand(cmd::setSensorEventEnable, request, sizeof request, answer, sizeof answer));
}

int IpmiSensor::rearmEventsMasked(uint8_t highMask, unsigned short assertMask, unsigned short deassertMask) {
    const uint8_t request[6] = {sensor_number,
                                kRearmSelected,
                                static_cast<uint8_t>(assertMask & 0xFF),
                                static_cast<uint8_t>((assertMask >> 8) & highMask),
                                static_cast<uint8_t>(deassertMask & 0xFF),
                                static_cast<uint8_t>((deassertMask >> 8) & highMask)};
    uint8_t answer[1];
    return commandResult(sendSensorCommand(cmd::rearmSensorEvents, request, sizeof request, answer, sizeof answer));
}

}  // namespace Ipmi
