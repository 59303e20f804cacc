#include <stdio.h>
#include <unistd.h>

#include <fstream>
#include <stdexcept>

#include "TestSupport.h"

using namespace Ipmi;

namespace {

using Bytes = std::vector<uint8_t>;

Bytes record(uint16_t id, uint8_t type, size_t total) {
    Bytes r(total);
    r[0] = static_cast<uint8_t>(id & 0xFF);
    r[1] = static_cast<uint8_t>(id >> 8);
    r[2] = 0x51;
    r[3] = type;
    r[4] = static_cast<uint8_t>(total - 5);
    for (size_t i = 5; i < total; ++i) r[i] = static_cast<uint8_t>(i);
    return r;
}

class SimSdr : public ::testing::Test {
protected:
    Sim::Response ask(uint8_t netfn, uint8_t command, Bytes data = {}) {
        Sim::Request r;
        r.netfn = netfn;
        r.cmd = command;
        r.data = std::move(data);
        return bmc.handle(r);
    }
    uint16_t reserve() {
        Sim::Response a = ask(netfn::storage, cmd::reserveSdrRepository);
        return static_cast<uint16_t>(a.at(1) | (a.at(2) << 8));
    }
    Sim::Response getSdr(uint16_t reservation, uint16_t id, uint8_t offset, uint8_t count) {
        return ask(netfn::storage, cmd::getSdr,
                   {static_cast<uint8_t>(reservation & 0xFF), static_cast<uint8_t>(reservation >> 8),
                    static_cast<uint8_t>(id & 0xFF), static_cast<uint8_t>(id >> 8), offset, count});
    }
    // Writes `bytes` to a file of this test's own and returns its path.
    std::string tempFile(const Bytes& bytes) {
        path_ = "/tmp/tav-ipmi-simsdr-" + std::to_string(getpid()) + ".sdr";
        std::ofstream out(path_, std::ios::binary);
        out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
        return path_;
    }
    void TearDown() override {
        if (!path_.empty()) unlink(path_.c_str());
    }

    Sim::Bmc bmc;
    std::string path_;
};

TEST_F(SimSdr, RepositoryInfoDescribesTheRepository) {
    bmc.sdr.records = {record(1, 0x01, 64), record(2, 0x02, 48), record(3, 0x11, 16)};
    bmc.sdr.additionTimestamp = 0x01020304;
    bmc.sdr.eraseTimestamp = 0x0A0B0C0D;

    Sim::Response a = ask(netfn::storage, cmd::getSdrRepositoryInfo);

    const uint16_t freeSpace = 0x4000 - 128;
    EXPECT_EQ(a, (Sim::Response{0x00, 0x51, 3, 0, freeSpace & 0xFF, freeSpace >> 8, 0x04, 0x03, 0x02, 0x01, 0x0D,
                                0x0C, 0x0B, 0x0A, bmc.sdr.operationSupport}));
    EXPECT_EQ(ask(netfn::storage, cmd::getSdrRepositoryInfo, {0}), Sim::Response{cc::requestDataLengthInvalid});
}

TEST_F(SimSdr, EachReservationCancelsTheOneBeforeAndIsNeverZero) {
    const uint16_t first = reserve();
    EXPECT_NE(first, 0);
    EXPECT_EQ(reserve(), first + 1);
    bmc.sdr.reservation = 0xFFFF;
    EXPECT_EQ(reserve(), 1);
    EXPECT_EQ(ask(netfn::storage, cmd::reserveSdrRepository, {1}), Sim::Response{cc::requestDataLengthInvalid});
}

TEST_F(SimSdr, GetSdrWalksTheRepositoryByNextRecordId) {
    const Bytes a = record(0x10, 0x01, 20), b = record(0x22, 0x02, 12);
    bmc.sdr.records = {a, b};

    EXPECT_EQ(getSdr(0, 0x0000, 0, 5), (Sim::Response{0x00, 0x22, 0x00, 0x10, 0x00, 0x51, 0x01, 15}));
    EXPECT_EQ(getSdr(0, 0x0010, 0, 5), getSdr(0, 0x0000, 0, 5));
    Sim::Response last = getSdr(0, 0x0022, 0, 0xFF);  // the whole record
    EXPECT_EQ(Bytes(last.begin(), last.begin() + 3), (Bytes{0x00, 0xFF, 0xFF}));
    EXPECT_EQ(Bytes(last.begin() + 3, last.end()), b);
    EXPECT_EQ(getSdr(0, 0x0023, 0, 5), Sim::Response{cc::requestedSensorNotPresent});
    bmc.sdr.records.clear();
    EXPECT_EQ(getSdr(0, 0x0000, 0, 5), Sim::Response{cc::requestedSensorNotPresent});
}

TEST_F(SimSdr, PartialReadsNeedTheCurrentReservation) {
    const Bytes a = record(7, 0x01, 40);
    bmc.sdr.records = {a};

    EXPECT_EQ(getSdr(0, 7, 8, 16), Sim::Response{cc::reservationCancelled});  // none granted yet
    const uint16_t first = reserve();
    Sim::Response part = getSdr(first, 7, 8, 16);
    ASSERT_EQ(part.size(), 19u);
    EXPECT_EQ(Bytes(part.begin() + 3, part.end()), Bytes(a.begin() + 8, a.begin() + 24));

    reserve();  // someone else reserves
    EXPECT_EQ(getSdr(first, 7, 8, 16), Sim::Response{cc::reservationCancelled});
    EXPECT_EQ(getSdr(first, 7, 0, 16).size(), 19u);  // offset 0 needs none
}

TEST_F(SimSdr, ReadsAreLimitedAndEndWithTheRecord) {
    const Bytes a = record(7, 0x01, 40);
    bmc.sdr.records = {a};
    const uint16_t r = reserve();

    EXPECT_EQ(getSdr(r, 7, 0, 28).size(), 31u);
    EXPECT_EQ(getSdr(r, 7, 0, 29), Sim::Response{cc::cannotReturnRequestedBytes});
    EXPECT_EQ(getSdr(r, 7, 0, 0xFF), Sim::Response{cc::cannotReturnRequestedBytes});  // 40 bytes at once
    Sim::Response tail = getSdr(r, 7, 30, 16);
    EXPECT_EQ(Bytes(tail.begin() + 3, tail.end()), Bytes(a.begin() + 30, a.end()));
    EXPECT_EQ(getSdr(r, 7, 40, 1), Sim::Response{cc::parameterOutOfRange});
    EXPECT_EQ(ask(netfn::storage, cmd::getSdr, {0, 0, 7, 0, 0}), Sim::Response{cc::requestDataLengthInvalid});
}

TEST_F(SimSdr, DeviceSdrCommandsOnlyWithDeviceSdrs) {
    bmc.sdr.records = {record(1, 0x01, 20), record(2, 0x02, 20), record(3, 0x12, 20)};
    EXPECT_EQ(ask(netfn::sensorEvent, cmd::getDeviceSdrInfo), Sim::Response{cc::invalidCommand});

    bmc.identity.hasDeviceSdrs = true;
    EXPECT_EQ(ask(netfn::sensorEvent, cmd::getDeviceSdrInfo), (Sim::Response{0x00, 2, 0x01}));
    EXPECT_EQ(ask(netfn::sensorEvent, cmd::getDeviceSdrInfo, {1}), (Sim::Response{0x00, 3, 0x01}));
    Sim::Response resv = ask(netfn::sensorEvent, cmd::reserveDeviceSdrRepository);
    Sim::Response a = ask(netfn::sensorEvent, cmd::getDeviceSdr, {resv.at(1), resv.at(2), 2, 0, 5, 10});
    EXPECT_EQ(Bytes(a.begin(), a.begin() + 3), (Bytes{0x00, 0x03, 0x00}));
    EXPECT_EQ(a.size(), 13u);
}

TEST_F(SimSdr, DumpLoaderAppendsRecordsBackToBack) {
    const Bytes a = record(1, 0x01, 64), b = record(2, 0xC0, 5), c = record(3, 0x11, 30);
    Bytes file = a;
    file.insert(file.end(), b.begin(), b.end());
    file.insert(file.end(), c.begin(), c.end());
    bmc.sdr.records = {record(9, 0x12, 20)};

    Sim::loadSdrDump(bmc, tempFile(file));

    EXPECT_EQ(bmc.sdr.records, (std::vector<Bytes>{record(9, 0x12, 20), a, b, c}));
}

TEST_F(SimSdr, DumpLoaderRefusesACutFile) {
    Bytes file = record(1, 0x01, 40);
    file.resize(30);
    EXPECT_THROW(Sim::loadSdrDump(bmc, tempFile(file)), std::runtime_error);
    EXPECT_THROW(Sim::loadSdrDump(bmc, tempFile(Bytes{1, 0, 0x51})), std::runtime_error);
    EXPECT_THROW(Sim::loadSdrDump(bmc, "/nonexistent/x.sdr"), std::runtime_error);
    EXPECT_TRUE(bmc.sdr.records.empty());
}

}  // namespace
