#include "IpmiSdrRecord.h"

#include <vector>

#include "TestSupport.h"

using namespace Ipmi;
using TestSupport::LogCapture;

namespace {

using Bytes = std::vector<unsigned char>;

Bytes pattern(size_t n) {
    Bytes b(n);
    for (size_t i = 0; i < n; ++i) b[i] = static_cast<unsigned char>(i + 1);
    return b;
}

Bytes held(const IpmiSdrRecord& r) { return Bytes(r.data, r.data + IpmiSdrRecord::MAX_LENGTH); }

Bytes padded(Bytes b) {
    b.resize(IpmiSdrRecord::MAX_LENGTH);
    return b;
}

TEST(SdrRecord, CopiesKeepTheBytesAndZeroTheRest) {
    EXPECT_EQ(held(IpmiSdrRecord()), padded({}));
    const IpmiSdrRecord r(48, pattern(48).data());
    IpmiSdrRecord assigned(64, pattern(64).data());
    assigned = r;  // nothing of the longer record stays behind
    const IpmiSdrRecord copy(r);
    for (const IpmiSdrRecord* c : {&r, &copy, static_cast<const IpmiSdrRecord*>(&assigned)}) {
        EXPECT_EQ(c->getLength(), 48u);
        EXPECT_EQ(held(*c), padded(pattern(48)));
    }
}

// set refuses a record over 64 bytes yet keeps its length, and a copy of such
// a record copies nothing: the buffer is never read or written past 64 bytes.
TEST(SdrRecord, OverLongRecordsKeepTheirLengthButNoBytes) {
    LogCapture log;
    const Bytes bytes = pattern(255);
    IpmiSdrRecord r(20, bytes.data());
    EXPECT_TRUE(r.set(65, bytes.data()));
    EXPECT_EQ(r.getLength(), 65u);
    EXPECT_EQ(held(r), padded({}));
    EXPECT_TRUE(log.contains(LOG_ERR, "set: SDR is too long"));
    EXPECT_FALSE(r.set(64, bytes.data()));
    EXPECT_EQ(held(r), pattern(64));

    const IpmiSdrRecord made(255, bytes.data());
    EXPECT_EQ(made.getLength(), 255u);
    EXPECT_EQ(held(made), pattern(64));
    IpmiSdrRecord assigned;
    assigned = made;
    EXPECT_EQ(assigned.getLength(), 255u);
    EXPECT_EQ(held(assigned), padded({}));
    EXPECT_EQ(held(IpmiSdrRecord(assigned)), padded({}));
    EXPECT_EQ(log.count("set: SDR is too long"), 2u);
}

}  // namespace
