// Sensor records and value conversion: what a caller reads from a sensor
// object built from one SDR, without talking to a controller.

#include <gtest/gtest.h>
#include <math.h>

#include <map>

#include "CmpiStatus.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using TestSupport::LogCapture;
using TestSupport::SdrBuilder;
using Bytes = std::vector<uint8_t>;

constexpr uint8_t kNumber = 0x31;
constexpr uint8_t kUnsigned = sdr::analogFormat::unsignedValue;
constexpr uint8_t kOnes = sdr::analogFormat::onesComplement;
constexpr uint8_t kTwos = sdr::analogFormat::twosComplement;

// A full threshold record of sensor 0x31, record 0x1234: linear, M and B
// 10-bit, the exponents 4-bit two's complement numbers.
SdrBuilder fullRecord(unsigned m = 1, unsigned b = 0, int rExp = 0, int bExp = 0, uint8_t format = kUnsigned) {
    SdrBuilder r = SdrBuilder::full(0x1234);
    r.set(sdr::key::sensorNumber, kNumber).set(sdr::sensor::eventReadingType, sdr::eventReadingTypeThreshold);
    r.set(sdr::sensor::units1, static_cast<uint8_t>(format << 6));
    r.set(sdr::full::mLow, m & 0xFF).set(sdr::full::mHighTolerance, static_cast<uint8_t>((m >> 8) << 6));
    r.set(sdr::full::bLow, b & 0xFF).set(sdr::full::bHighAccuracy, static_cast<uint8_t>((b >> 8) << 6));
    return r.set(sdr::full::exponents, static_cast<uint8_t>(((rExp & 0xF) << 4) | (bExp & 0xF)));
}

SdrBuilder compactRecord() {
    return SdrBuilder::compact(0x1234).set(sdr::key::sensorNumber, kNumber).set(sdr::sensor::eventReadingType, 1);
}

IpmiThresholdSensor sensorOf(Bytes r) { return IpmiThresholdSensor(0, r.data(), static_cast<int>(r.size())); }

TEST(SensorConversion, RawValuesConvertToUnitsAndBack) {
    // back: convertToRawValue(value)
    const struct { unsigned m, b; int rExp, bExp; uint8_t format; unsigned raw; double value; unsigned back; } cases[] = {
        {2, 0, -1, 0, kUnsigned, 100, 20.0, 100},
        {0x300, 0, 0, 0, kUnsigned, 1, -256.0, 1},  // M is 10-bit two's complement
        {0x1FF, 0, 0, 0, kUnsigned, 1, 511.0, 1},
        {1, 0x300, 0, 0, kUnsigned, 0, -256.0, 0},  // and so is B
        {1, 3, -2, 1, kUnsigned, 50, 0.8, 50},      // (50 + 3 * 10^1) * 10^-2
        {3, 2, 0, 0, kTwos, 0xF6, -28.0, 0xFFFFFFF6},  // not clamped to a byte
        {3, 2, 0, 0, kOnes, 0xFF, 2.0, 0xFFFFFFFF},    // 0xFF reads as 0
        {3, 2, 0, 0, kOnes, 0xFE, -1.0, 0xFFFFFFFE},
        {3, 2, 0, 0, kOnes, 5, 17.0, 4},  // the inverse subtracts one from positive values too
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << "M " << c.m << " B " << c.b << " format " << int(c.format) << " raw " << c.raw);
        auto s = sensorOf(fullRecord(c.m, c.b, c.rExp, c.bExp, c.format));
        EXPECT_DOUBLE_EQ(c.value, s.convertRawValue(c.raw));
        EXPECT_DOUBLE_EQ(c.value, s.getReading(c.raw));
        EXPECT_EQ(c.back, s.convertToRawValue(c.value));
    }
}

TEST(SensorConversion, LinearisationsApplyToTheLinearValue) {
    const std::map<uint8_t, double> expected = {
        {0, 8.0},   {1, log(8.0)},  {2, log10(8.0)}, {3, 3.0},   {4, exp(8.0)},   {5, 1e8},
        {6, 256.0}, {7, 0.125},     {8, 64.0},       {9, 512.0}, {10, sqrt(8.0)}, {11, 2.0},
        {0x70, 8.0}};
    for (const auto& e : expected) {
        auto s = sensorOf(fullRecord().set(sdr::full::linearisation, e.first));
        EXPECT_NEAR(e.second, s.convertRawValue(8), 1e-9 * fabs(e.second)) << "code " << int(e.first);
    }
}

TEST(SensorConversion, InverseKeepsItsQuirks) {
    EXPECT_EQ(0u, sensorOf(fullRecord(1, 5)).convertToRawValue(0.0)) << "0.0 maps to raw 0 whatever B is";
    EXPECT_EQ(0xFFFFFFFDu, sensorOf(fullRecord(1, 5)).convertToRawValue(2.0)) << "no clamping to 0..255";
    // log2 is inverted as e^2 * e^v, not 2^v
    EXPECT_EQ(20u, sensorOf(fullRecord().set(sdr::full::linearisation, 3)).convertToRawValue(1.0));
    EXPECT_EQ(3u, sensorOf(fullRecord().set(sdr::full::linearisation, 8)).convertToRawValue(9.0));
    // 1/y is inverted to a NaN, which truncates to x86's integer indefinite
    EXPECT_EQ(0x80000000u, sensorOf(fullRecord().set(sdr::full::linearisation, 7)).convertToRawValue(4.0));
    EXPECT_EQ(0u, sensorOf(fullRecord(0, 1)).convertToRawValue(5.0)) << "M = 0 unsigned";
    EXPECT_EQ(0x80000000u, sensorOf(fullRecord(0, 1, 0, 0, kTwos)).convertToRawValue(5.0))
        << "no M check: a division by zero";
}

// Only full analog records convert; the range flags are tested only on records that are not full.
TEST(SensorConversion, OnlyFullAnalogRecordsConvertOrHaveRanges) {
    LogCapture log;
    auto full = sensorOf(fullRecord()  // no analog characteristic flags set
                             .set(sdr::full::normalMin, 7).set(sdr::full::normalMax, 9).set(sdr::full::nominalReading, 8)
                             .set(sdr::full::sensorMin, 1).set(sdr::full::sensorMax, 200));
    EXPECT_EQ((std::vector<double>{7, 9, 8, 1, 200}),
              (std::vector<double>{full.getNormalMin(), full.getNormalMax(), full.getNominalReading(),
                                   full.getMinReadable(), full.getMaxReadable()}));

    auto compact = sensorOf(compactRecord());
    EXPECT_DOUBLE_EQ(0.0, compact.convertRawValue(10));
    EXPECT_TRUE(log.contains(LOG_ERR, "convertRawValue: request but not a full sensor"));
    EXPECT_EQ(0u, compact.convertToRawValue(10.0));
    EXPECT_THROW(compact.getMinReadable(), kelInt::CmpiStatus);
    EXPECT_THROW(compact.getMaxReadable(), kelInt::CmpiStatus);
    EXPECT_EQ(log.count("CmpiStatus error 1 Not a Full sensor"), 2u);
    EXPECT_DOUBLE_EQ(0.0, compact.getNormalMin());
    EXPECT_DOUBLE_EQ(0.0, sensorOf(fullRecord(1, 0, 0, 0, sdr::analogFormat::noAnalogReading)).convertRawValue(10));
    EXPECT_TRUE(log.contains(LOG_ERR, "convertRawValue: request against non-threshold sensor"));
    auto flagged = sensorOf(compactRecord().set(sdr::full::analogFlags, sdr::bits::hasNormalMin |
                                                                           sdr::bits::hasNormalMax |
                                                                           sdr::bits::hasNominalReading));
    EXPECT_THROW(flagged.getNormalMin(), kelInt::CmpiStatus);
    EXPECT_THROW(flagged.getNormalMax(), kelInt::CmpiStatus);
    EXPECT_THROW(flagged.getNominalReading(), kelInt::CmpiStatus);
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 1 Not a Full sensor or available"));
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 1 Not a Full sensor or normal max not available"));
    EXPECT_TRUE(log.contains(LOG_ERR, "CmpiStatus error 1 Not a Full sensor or no nominal reading"));
}

TEST(SensorRecord, AccessorsReadTheirRecordType) {
    auto full = sensorOf(fullRecord()
                             .set(sdr::key::ownerLun, 0x61)  // channel 6, LUN 1
                             .set(sdr::key::entityInstance, 0x83)
                             .set(sdr::full::accuracyDirection, 0x01)  // input
                             .set(sdr::sensor::initialisation, 0x7F)
                             .set(sdr::sensor::capabilities, 0xC0)
                             .set(sdr::sensor::units1, 0x01));
    EXPECT_EQ((std::vector<int>{6, 1, 0x1234, 0x11FB, false}),
              (std::vector<int>{full.getChannel(), full.getLun(), full.getSensorRecordNumber(), full.getFlags(), full.isLinear()}));
    EXPECT_EQ(IpmiEntity(7, 3, 0, 0), full.getEntity());

    auto compact = sensorOf(compactRecord().set(sdr::compact::sharing, 0x40));
    EXPECT_EQ(1, compact.getSensorDirection());
    EXPECT_TRUE(compact.isLinear()) << "whatever the linearisation byte says";

    Bytes e = SdrBuilder::eventOnly().types(0x0C, 0x6F).set(sdr::eventOnly::sharing, 0x80);
    auto eventOnly = IpmiDiscreteSensor(2, e.data(), static_cast<int>(e.size()));  // type, event/reading type,
    EXPECT_EQ((std::vector<int>{0x0C, 0x6F, 2, 255, 0}),                            // direction, event support, flags
              (std::vector<int>{eventOnly.getSensorType(), eventOnly.getEventReadingType(), eventOnly.getSensorDirection(),
                                eventOnly.getEventMessageSupport(), eventOnly.getFlags()}));
}

TEST(SensorRecord, ShortOverlongAndMissingRecordsAreReadSafely) {
    Bytes r = fullRecord();
    IpmiThresholdSensor six(0, r.data(), 6);
    EXPECT_EQ(0x20, six.getOwnerId());
    EXPECT_EQ(0, six.getSensorNumber()) << "too short to carry a sensor number";
    EXPECT_EQ(0, IpmiThresholdSensor(0, r.data(), 3).getOwnerId());
    EXPECT_EQ(0, IpmiThresholdSensor(0, nullptr, 40).getEventReadingType());

    r.resize(80, 0xEE);
    IpmiThresholdSensor overlong(0, r.data(), 80);
    const unsigned char* bytes = nullptr;
    int length = 0;
    overlong.RawRecord(bytes, length);
    EXPECT_EQ(64, length);
    EXPECT_EQ(kNumber, overlong.getSensorNumber());
}

TEST(SensorRecord, DumpPrintsTheRecordSixteenBytesALine) {
    Bytes r(18, 0);
    r[sdr::key::sensorNumber] = 0xAB;
    r[17] = 0x5C;
    testing::internal::CaptureStdout();
    IpmiThresholdSensor(0, r.data(), 18).dump();
    EXPECT_EQ("Sensor : 0xab\nData 0x00: 0x00 0x00 0x00 0x00 0x00 0x00 0x00 0xab 0x00 0x00 0x00 0x00 0x00 "
              "0x00 0x00 0x00\nData 0x10: 0x00 0x5c\n",
              testing::internal::GetCapturedStdout());
}

// Every record of every real repository, whatever its type and wherever it is
// cut, answers every record question without reading outside its bytes.
TEST(SensorRecord, RealRecordsOfEveryTypeAreReadSafely) {
    SKIP_WITHOUT_REAL_DATA(TestSupport::realDataPath("sdr"));
    LogCapture quiet;
    size_t records = 0;
    for (const auto& file : TestSupport::realDataFiles("sdr", ".sdr")) {
        Sim::Bmc repository;
        Sim::loadSdrDump(repository, file);
        for (const Bytes& r : repository.sdr.records) {
            for (size_t cut : {r.size(), r.size() / 2, size_t{3}}) {
                Bytes part(r.begin(), r.begin() + static_cast<long>(cut));  // so that a read past it shows
                IpmiDiscreteSensor s(0, part.data(), static_cast<int>(cut));
                unsigned sum = s.getOwnerId() + s.getLun() + s.getChannel() + s.getSensorType() +
                               s.getEventReadingType() + s.getRateUnit() + s.getBaseUnit() + s.getModifierUnit() +
                               s.getModifierUnitUse() + s.getSensorDirection() + s.getHysteresisSupport() +
                               s.getEventMessageSupport() + s.getFlags() + s.getAssertionEventMask() +
                               s.getDeassertionEventMask() + s.getReadingMask() + s.getEntity().id;
                sum += s.isAnalog() + s.isLinear() + s.isNominalReadingSet() + s.isNormalMaxSet();
                if (s.isConvertible()) sum += s.convertToRawValue(s.getMaxReadable()) & 1;
                EXPECT_GE(sum, 0u);
            }
            ++records;
        }
    }
    EXPECT_GT(records, 2000u);
}

}  // namespace
