#include "IpmiSdrRecord.h"

#include <vector>

#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::LogCapture;

namespace {

std::vector<unsigned char> pattern(size_t n) {
    std::vector<unsigned char> b(n);
    for (size_t i = 0; i < n; ++i) b[i] = static_cast<unsigned char>(i + 1);
    return b;
}

bool allZero(const IpmiSdrRecord& r, size_t from = 0) {
    for (size_t i = from; i < IpmiSdrRecord::MAX_LENGTH; ++i)
        if (r.data[i] != 0) return false;
    return true;
}

TEST(SdrRecord, StartsEmpty) {
    IpmiSdrRecord r;
    EXPECT_EQ(r.getLength(), 0u);
    EXPECT_TRUE(allZero(r));
}

TEST(SdrRecord, KeepsTheBytesItIsGivenAndZeroesTheRest) {
    const auto bytes = pattern(48);
    IpmiSdrRecord r(48, bytes.data());
    EXPECT_EQ(r.getLength(), 48u);
    EXPECT_EQ(std::vector<unsigned char>(r.getData(), r.getData() + 48), bytes);
    EXPECT_TRUE(allZero(r, 48));

    IpmiSdrRecord copy(r);
    EXPECT_EQ(copy.getLength(), 48u);
    EXPECT_EQ(std::vector<unsigned char>(copy.data, copy.data + 48), bytes);

    IpmiSdrRecord assigned(64, pattern(64).data());
    assigned = r;
    EXPECT_EQ(assigned.getLength(), 48u);
    EXPECT_EQ(std::vector<unsigned char>(assigned.data, assigned.data + 48), bytes);
    EXPECT_TRUE(allZero(assigned, 48));  // nothing of the longer record stays behind

    assigned = assigned;
    EXPECT_EQ(std::vector<unsigned char>(assigned.data, assigned.data + 48), bytes);
}

TEST(SdrRecord, SetRefusesARecordOverSixtyFourBytesButKeepsItsLength) {
    LogCapture log;
    const auto bytes = pattern(65);
    IpmiSdrRecord r(20, bytes.data());

    EXPECT_TRUE(r.set(65, bytes.data()));

    EXPECT_EQ(r.getLength(), 65u);
    EXPECT_TRUE(allZero(r));
    EXPECT_TRUE(log.contains(LOG_ERR, "set: SDR is too long"));

    EXPECT_FALSE(r.set(64, bytes.data()));
    EXPECT_EQ(r.getLength(), 64u);
    EXPECT_EQ(r.data[63], 64);
    EXPECT_EQ(log.count("set: SDR is too long"), 1u);
}

// The buffer holds 64 bytes whatever length a record claims.
TEST(SdrRecord, OverLongLengthsNeverCopyPastTheBuffer) {
    LogCapture log;
    const auto bytes = pattern(255);

    IpmiSdrRecord made(255, bytes.data());
    EXPECT_EQ(made.getLength(), 255u);
    EXPECT_EQ(std::vector<unsigned char>(made.data, made.data + 64), std::vector<unsigned char>(bytes.begin(), bytes.begin() + 64));

    IpmiSdrRecord refused;
    refused.set(200, bytes.data());
    IpmiSdrRecord copy(refused);
    EXPECT_EQ(copy.getLength(), 200u);
    EXPECT_TRUE(allZero(copy));

    IpmiSdrRecord assigned;
    assigned = made;
    EXPECT_EQ(assigned.getLength(), 255u);
    EXPECT_TRUE(allZero(assigned));
    EXPECT_EQ(log.count("set: SDR is too long"), 2u);
}

}  // namespace
