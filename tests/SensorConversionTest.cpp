// Sensor records and value conversion: what a caller reads from a sensor
// object built from one SDR, without talking to a controller.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <math.h>

#include <fstream>
#include <iterator>
#include <map>

#include "CmpiStatus.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using TestSupport::LogCapture;

constexpr uint8_t kNumber = 0x31;

// A full threshold record: linear, unsigned, M = 1, B = 0, both exponents 0.
std::vector<uint8_t> fullRecord() {
    std::vector<uint8_t> r(sdr::full::idString, 0);
    r[sdr::header::recordId] = 0x34;
    r[sdr::header::recordId + 1] = 0x12;
    r[sdr::header::version] = 0x51;
    r[sdr::header::recordType] = sdr::type::fullSensor;
    r[sdr::header::remainingLength] = static_cast<uint8_t>(r.size() - sdr::header::length);
    r[sdr::key::ownerId] = 0x20;
    r[sdr::key::sensorNumber] = kNumber;
    r[sdr::key::entityId] = 0x07;
    r[sdr::key::entityInstance] = 0x01;
    r[sdr::sensor::eventReadingType] = sdr::eventReadingTypeThreshold;
    r[sdr::full::mLow] = 1;
    return r;
}

std::vector<uint8_t> compactRecord() {
    std::vector<uint8_t> r = fullRecord();
    r.resize(sdr::compact::idString);
    r[sdr::header::recordType] = sdr::type::compactSensor;
    r[sdr::header::remainingLength] = static_cast<uint8_t>(r.size() - sdr::header::length);
    return r;
}

void setCoefficients(std::vector<uint8_t>& r, unsigned m10, unsigned b10, int rExp, int bExp) {
    r[sdr::full::mLow] = m10 & 0xFF;
    r[sdr::full::mHighTolerance] = static_cast<uint8_t>((m10 >> 8) << 6);
    r[sdr::full::bLow] = b10 & 0xFF;
    r[sdr::full::bHighAccuracy] = static_cast<uint8_t>((b10 >> 8) << 6);
    r[sdr::full::exponents] = static_cast<uint8_t>(((rExp & 0xF) << 4) | (bExp & 0xF));
}

void setFormat(std::vector<uint8_t>& r, uint8_t format) { r[sdr::sensor::units1] = static_cast<uint8_t>(format << 6); }

IpmiThresholdSensor sensorOf(std::vector<uint8_t> r) {
    return IpmiThresholdSensor(0, r.data(), static_cast<int>(r.size()));
}

TEST(SensorConversion, UnsignedLinearConvertsBothWays) {
    auto r = fullRecord();
    setCoefficients(r, 2, 0, -1, 0);
    auto s = sensorOf(r);
    EXPECT_DOUBLE_EQ(20.0, s.convertRawValue(100));
    EXPECT_EQ(100u, s.convertToRawValue(20.0));
    EXPECT_DOUBLE_EQ(20.0, s.getReading(100u));
}

TEST(SensorConversion, CoefficientsAreTenBitAndExponentsFourBitSigned) {
    auto r = fullRecord();
    setCoefficients(r, 0x300, 0, 0, 0);
    EXPECT_DOUBLE_EQ(-256.0, sensorOf(r).convertRawValue(1));
    setCoefficients(r, 0x1FF, 0, 0, 0);
    EXPECT_DOUBLE_EQ(511.0, sensorOf(r).convertRawValue(1));
    setCoefficients(r, 1, 0x300, 0, 0);
    EXPECT_DOUBLE_EQ(-256.0, sensorOf(r).convertRawValue(0));
    // (50 + 3 * 10^1) * 10^-2
    setCoefficients(r, 1, 3, -2, 1);
    EXPECT_DOUBLE_EQ(0.8, sensorOf(r).convertRawValue(50));
}

TEST(SensorConversion, SignedFormatsReadTheRawByteAsSigned) {
    auto r = fullRecord();
    setCoefficients(r, 3, 2, 0, 0);
    setFormat(r, sdr::analogFormat::twosComplement);
    EXPECT_DOUBLE_EQ(-28.0, sensorOf(r).convertRawValue(0xF6));
    EXPECT_EQ(0xF6u, sensorOf(r).convertToRawValue(-28.0) & 0xFF);

    setFormat(r, sdr::analogFormat::onesComplement);
    auto ones = sensorOf(r);
    EXPECT_DOUBLE_EQ(ones.convertRawValue(0), ones.convertRawValue(0xFF));
    EXPECT_DOUBLE_EQ(-1.0, ones.convertRawValue(0xFE));
    // The inverse subtracts one from every value, positive ones included.
    EXPECT_DOUBLE_EQ(17.0, ones.convertRawValue(5));
    EXPECT_EQ(4u, ones.convertToRawValue(17.0));
}

TEST(SensorConversion, LinearisationsApplyToTheLinearValue) {
    const std::map<uint8_t, double> expected = {
        {0, 8.0},        {1, log(8.0)},  {2, log10(8.0)}, {3, 3.0},  {4, exp(8.0)},       {5, 1e8},
        {6, 256.0},      {7, 0.125},     {8, 64.0},       {9, 512.0}, {10, sqrt(8.0)},     {11, 2.0},
        {0x70, 8.0}};
    for (const auto& e : expected) {
        auto r = fullRecord();
        r[sdr::full::linearisation] = e.first;
        EXPECT_NEAR(e.second, sensorOf(r).convertRawValue(8), 1e-9 * fabs(e.second)) << "code " << int(e.first);
    }
}

TEST(SensorConversion, InverseKeepsItsQuirks) {
    auto r = fullRecord();
    setCoefficients(r, 1, 5, 0, 0);
    EXPECT_EQ(0u, sensorOf(r).convertToRawValue(0.0)) << "0.0 maps to raw 0 whatever B is";
    EXPECT_EQ(0xFFFFFFFDu, sensorOf(r).convertToRawValue(2.0)) << "no clamping to 0..255";

    r[sdr::full::linearisation] = 3;  // log2: inverted as e^2 * e^v, not 2^v
    setCoefficients(r, 1, 0, 0, 0);
    EXPECT_EQ(20u, sensorOf(r).convertToRawValue(1.0));
    r[sdr::full::linearisation] = 8;
    EXPECT_EQ(3u, sensorOf(r).convertToRawValue(9.0));
    r[sdr::full::linearisation] = 7;  // 1/y: inverted to a NaN, which truncates to x86's integer indefinite
    EXPECT_EQ(0x80000000u, sensorOf(r).convertToRawValue(4.0));

    auto zeroM = fullRecord();
    setCoefficients(zeroM, 0, 1, 0, 0);
    EXPECT_EQ(0u, sensorOf(zeroM).convertToRawValue(5.0));
    setFormat(zeroM, sdr::analogFormat::twosComplement);
    EXPECT_EQ(0x80000000u, sensorOf(zeroM).convertToRawValue(5.0)) << "no M check: a division by zero";
}

TEST(SensorConversion, OnlyFullAnalogRecordsConvert) {
    LogCapture log;
    auto compact = sensorOf(compactRecord());
    EXPECT_DOUBLE_EQ(0.0, compact.convertRawValue(10));
    EXPECT_TRUE(log.contains(LOG_ERR, "convertRawValue: request but not a full sensor"));
    EXPECT_EQ(0u, compact.convertToRawValue(10.0));
    try {
        compact.getMinReadable();
        FAIL() << "no exception";
    } catch (const kelInt::CmpiStatus& e) {
        EXPECT_EQ(CMPI_RC_ERR_FAILED, e.rc());
    }
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 1 Not a Full sensor"));
    EXPECT_THROW(compact.getMaxReadable(), kelInt::CmpiStatus);

    auto r = fullRecord();
    setFormat(r, sdr::analogFormat::noAnalogReading);
    EXPECT_DOUBLE_EQ(0.0, sensorOf(r).convertRawValue(10));
    EXPECT_TRUE(log.contains(LOG_ERR, "convertRawValue: request against non-threshold sensor"));
}

TEST(SensorConversion, RangeFlagsAreTestedOnlyOnRecordsThatAreNotFull) {
    LogCapture log;
    auto r = fullRecord();
    r[sdr::full::normalMin] = 7;
    r[sdr::full::normalMax] = 9;
    r[sdr::full::nominalReading] = 8;
    r[sdr::full::sensorMin] = 1;
    r[sdr::full::sensorMax] = 200;
    auto full = sensorOf(r);  // no analog characteristic flags set
    EXPECT_DOUBLE_EQ(7.0, full.getNormalMin());
    EXPECT_DOUBLE_EQ(9.0, full.getNormalMax());
    EXPECT_DOUBLE_EQ(8.0, full.getNominalReading());
    EXPECT_DOUBLE_EQ(1.0, full.getMinReadable());
    EXPECT_DOUBLE_EQ(200.0, full.getMaxReadable());

    auto c = compactRecord();
    EXPECT_DOUBLE_EQ(0.0, sensorOf(c).getNormalMin());
    c[sdr::full::analogFlags] = sdr::bits::hasNormalMin | sdr::bits::hasNormalMax |
                                sdr::bits::hasNominalReading;
    EXPECT_THROW(sensorOf(c).getNormalMin(), kelInt::CmpiStatus);
    EXPECT_THROW(sensorOf(c).getNormalMax(), kelInt::CmpiStatus);
    EXPECT_THROW(sensorOf(c).getNominalReading(), kelInt::CmpiStatus);
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 1 Not a Full sensor or available"));
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 1 Not a Full sensor or normal max not available"));
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 1 Not a Full sensor or no nominal reading"));
}

TEST(SensorRecord, AccessorsReadTheirRecordType) {
    auto r = fullRecord();
    r[sdr::key::ownerLun] = 0x61;  // channel 6, LUN 1
    r[sdr::key::entityInstance] = 0x83;
    r[sdr::full::accuracyDirection] = 0x01;  // input
    r[sdr::sensor::initialisation] = 0x7F;
    r[sdr::sensor::capabilities] = 0xC0;
    r[sdr::sensor::units1] = 0x01;
    auto full = sensorOf(r);
    EXPECT_EQ(0x20, full.getOwnerId());
    EXPECT_EQ(6, full.getChannel());
    EXPECT_EQ(1, full.getLun());
    EXPECT_EQ(kNumber, full.getSensorNumber());
    EXPECT_EQ(0x1234, full.getSensorRecordNumber());
    EXPECT_EQ(IpmiEntity(7, 3, 0, 0), full.getEntity());
    EXPECT_EQ(0, full.getSensorDirection()) << "a full record's direction is not consulted";
    EXPECT_EQ(0x11FB, full.getFlags());
    EXPECT_FALSE(full.isLinear());

    auto c = compactRecord();
    c[sdr::compact::sharing] = 0x40;
    EXPECT_EQ(1, sensorOf(c).getSensorDirection());
    EXPECT_TRUE(sensorOf(c).isLinear());

    std::vector<uint8_t> e(sdr::eventOnly::idString, 0);
    e[sdr::header::recordType] = sdr::type::eventOnly;
    e[sdr::eventOnly::sensorType] = 0x0C;
    e[sdr::eventOnly::eventReadingType] = 0x6F;
    e[sdr::eventOnly::sharing] = 0x80;
    auto eventOnly = IpmiDiscreteSensor(2, e.data(), static_cast<int>(e.size()));
    EXPECT_EQ(0x0C, eventOnly.getSensorType());
    EXPECT_EQ(0x6F, eventOnly.getEventReadingType());
    EXPECT_EQ(2, eventOnly.getSensorDirection());
    EXPECT_EQ(255, eventOnly.getEventMessageSupport());
    EXPECT_EQ(0, eventOnly.getFlags());
    EXPECT_EQ(0, eventOnly.getAssertionEventMask());
}

TEST(SensorRecord, ShortAndOverlongRecordsReadAsZero) {
    auto r = fullRecord();
    IpmiThresholdSensor six(0, r.data(), 6);
    EXPECT_EQ(0x20, six.getOwnerId());
    EXPECT_EQ(0, six.getSensorNumber()) << "too short to carry a sensor number";
    IpmiThresholdSensor three(0, r.data(), 3);
    EXPECT_EQ(0, three.getOwnerId());
    EXPECT_EQ(0, three.getSensorType());
    IpmiThresholdSensor none(0, nullptr, 40);
    EXPECT_EQ(0, none.getEventReadingType());

    std::vector<uint8_t> longRecord = fullRecord();
    longRecord.resize(80, 0xEE);
    IpmiThresholdSensor overlong(0, longRecord.data(), 80);
    const unsigned char* bytes = nullptr;
    int length = 0;
    overlong.RawRecord(bytes, length);
    EXPECT_EQ(64, length);
    EXPECT_EQ(kNumber, overlong.getSensorNumber());
}

TEST(SensorRecord, DumpPrintsTheRecordSixteenBytesALine) {
    std::vector<uint8_t> r(18, 0);
    r[sdr::key::sensorNumber] = 0xAB;
    r[17] = 0x5C;
    IpmiThresholdSensor s(0, r.data(), 18);
    testing::internal::CaptureStdout();
    s.dump();
    EXPECT_EQ("Sensor : 0xab\nData 0x00: 0x00 0x00 0x00 0x00 0x00 0x00 0x00 0xab 0x00 0x00 0x00 0x00 0x00 "
              "0x00 0x00 0x00\nData 0x10: 0x00 0x5c\n",
              testing::internal::GetCapturedStdout());
}

std::vector<uint8_t> readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return std::vector<uint8_t>((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
}

// Calls fn(bytes, length) for each whole record of an SDR dump.
template <class Fn>
void forEachRecord(const std::vector<uint8_t>& all, Fn fn) {
    for (size_t at = 0; at + sdr::header::length <= all.size();) {
        const size_t length = sdr::header::length + all[at + sdr::header::remainingLength];
        if (at + length > all.size()) break;
        fn(&all[at], length);
        at += length;
    }
}

// The number ipmitool prints after "<field>   : " in one sensor's block.
bool ipmitoolValue(const std::string& block, const std::string& field, double& value) {
    const size_t at = block.find("\n " + field + " ");
    if (at == std::string::npos) return false;
    const size_t colon = block.find(": ", at);
    if (colon == std::string::npos) return false;
    char* end = nullptr;
    value = strtod(block.c_str() + colon + 2, &end);
    return end != block.c_str() + colon + 2 && (*end == '\n' || *end == '\0');
}

const char* const kRealSdrSets[] = {"infrasim_dell_c6320", "infrasim_dell_r630", "infrasim_dell_r640",
                                    "infrasim_dell_r730",  "infrasim_s2600kp",   "infrasim_s2600tp",
                                    "infrasim_s2600wtt",   "infrasim_vnode",     "openipmi_marvell_axp_sdrcomp",
                                    "rawsel_ast2500_intel2s"};

// Full records of real servers: nominal reading and normal range as ipmitool decodes them.
TEST(SensorConversion, RealRecordsMatchIpmitool) {
    SKIP_WITHOUT_REAL_DATA(TestSupport::realDataPath("sdr/infrasim_dell_r630.sdr"));
    int compared = 0;
    for (const char* set : kRealSdrSets) {
        const std::string base = TestSupport::realDataPath(std::string("sdr/") + set + ".sdr");
        const std::vector<uint8_t> refBytes = readFile(TestSupport::realDataPath(std::string("sdr/") + set + ".ipmitool-sdr-v.txt"));
        const std::string reference(refBytes.begin(), refBytes.end());
        forEachRecord(readFile(base), [&](const uint8_t* bytes, size_t length) {
            IpmiThresholdSensor s(0, const_cast<uint8_t*>(bytes), static_cast<int>(length));
            const sdr::FullSensorView view(bytes, length);
            if (!view.isFull() || view.linearisation() != 0 || !s.isConvertible()) return;
            const size_t idLength = std::min<size_t>(view.idStringCode().length(), length - view.idStringOffset);
            const std::string id(reinterpret_cast<const char*>(bytes + view.idStringOffset), idLength);
            const std::string key = "Sensor ID              : " + id + " (0x" + [&] {
                char hex[8];
                snprintf(hex, sizeof hex, "%x", view.sensorNumber());
                return std::string(hex);
            }() + ")\n";
            const size_t block = reference.find(key);
            if (block == std::string::npos) return;
            const std::string text = reference.substr(block, reference.find("\n\n", block) - block);
            const std::pair<const char*, double> fields[] = {{"Normal Minimum", s.getNormalMin()},
                                                             {"Normal Maximum", s.getNormalMax()},
                                                             {"Nominal Reading", s.getNominalReading()}};
            for (const auto& f : fields) {
                double printed = 0;
                if (!ipmitoolValue(text, f.first, printed)) continue;
                EXPECT_NEAR(printed, f.second, 0.00051) << set << " " << id << " " << f.first;
                ++compared;
            }
        });
    }
    EXPECT_GT(compared, 100);
}

// Every record of every real repository, whatever its type, answers every
// record question without reading outside its bytes.
TEST(SensorRecord, RealRecordsOfEveryTypeAreReadSafely) {
    SKIP_WITHOUT_REAL_DATA(TestSupport::realDataPath("sdr/infrasim_dell_r630.sdr"));
    LogCapture quiet;
    int records = 0;
    for (const char* set : kRealSdrSets) {
        forEachRecord(readFile(TestSupport::realDataPath(std::string("sdr/") + set + ".sdr")),
                      [&](const uint8_t* bytes, size_t length) {
                          for (size_t cut : {length, length / 2, size_t{3}}) {
                              IpmiDiscreteSensor s(0, const_cast<uint8_t*>(bytes), static_cast<int>(cut));
                              unsigned sum = s.getOwnerId() + s.getLun() + s.getChannel() + s.getSensorType() +
                                             s.getEventReadingType() + s.getRateUnit() + s.getBaseUnit() +
                                             s.getModifierUnit() + s.getModifierUnitUse() + s.getSensorDirection() +
                                             s.getHysteresisSupport() + s.getEventMessageSupport() + s.getFlags() +
                                             s.getAssertionEventMask() + s.getDeassertionEventMask() +
                                             s.getReadingMask() + s.getEntity().id;
                              sum += s.isAnalog() + s.isLinear() + s.isNominalReadingSet() + s.isNormalMaxSet();
                              if (s.isConvertible()) sum += s.convertToRawValue(s.getMaxReadable()) & 1;
                              EXPECT_GE(sum, 0u);
                          }
                          ++records;
                      });
    }
    EXPECT_GT(records, 500);
}

}  // namespace
