#include <dirent.h>
#include <string.h>

#include <algorithm>
#include <fstream>
#include <functional>
#include <iterator>
#include <map>
#include <thread>

#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

using Bytes = std::vector<uint8_t>;

constexpr uint32_t kFailed = 0xFFFFFFFFu;

// A record of `total` bytes, header included; the body is a pattern that
// differs from record to record so that misplaced bytes show.
Bytes sdrRecord(uint16_t id, uint8_t type, size_t total) {
    Bytes r(total);
    r[0] = static_cast<uint8_t>(id & 0xFF);
    r[1] = static_cast<uint8_t>(id >> 8);
    r[2] = 0x51;
    r[3] = type;
    r[4] = static_cast<uint8_t>(total - 5);
    for (size_t i = 5; i < total; ++i) r[i] = static_cast<uint8_t>(id * 7 + i);
    // One sensor per record unless a test asks for sharing.
    const sdr::SensorRecordOffsets at = sdr::sensorRecordOffsets(type);
    if (at.sharing != 0 && at.sharing < total) r[at.sharing] &= 0xF0;
    return r;
}

struct Shared {
    uint8_t number;
    uint8_t instanceByte;  // entity instance, bit 7 device-relative
    uint8_t shareCount;
    uint8_t modifierByte;  // bit 7 entity instance increments, 6:0 modifier offset
};

// A compact sensor record (type 0x02) sharing its description.
Bytes compactRecord(uint16_t id, const Shared& s) {
    Bytes r = sdrRecord(id, sdr::type::compactSensor, 40);
    r[sdr::key::sensorNumber] = s.number;
    r[sdr::key::entityInstance] = s.instanceByte;
    r[sdr::compact::sharing] = static_cast<uint8_t>(0x10 | s.shareCount);  // modifier type 1 (alpha)
    r[sdr::compact::instanceModifier] = s.modifierByte;
    return r;
}

// An event-only record (type 0x03) sharing its description.
Bytes eventOnlyRecord(uint16_t id, const Shared& s) {
    Bytes r = sdrRecord(id, sdr::type::eventOnly, 20);
    r[sdr::key::sensorNumber] = s.number;
    r[sdr::key::entityInstance] = s.instanceByte;
    r[sdr::eventOnly::sharing] = s.shareCount;
    r[sdr::eventOnly::instanceModifier] = s.modifierByte;
    return r;
}

struct Filed {
    uint16_t recordId;
    uint8_t recordType;
    Bytes bytes;
};

struct ChunkRead {
    uint16_t reservation;
    uint16_t recordId;
    uint8_t offset;
    uint8_t count;
    bool operator==(const ChunkRead& o) const {
        return reservation == o.reservation && recordId == o.recordId && offset == o.offset && count == o.count;
    }
};

std::ostream& operator<<(std::ostream& os, const ChunkRead& c) {
    return os << "{resv " << c.reservation << " id " << c.recordId << " @" << int(c.offset) << " n"
              << int(c.count) << "}";
}

size_t chunkReads(size_t length) { return (length + 15) / 16; }

IpmiSdrGroup expectedGroup(uint8_t type) {
    switch (type) {
    case 0x01: return SDR_GROUP_FULL;
    case 0x02: return SDR_GROUP_COMPACT;
    case 0x03: return SDR_GROUP_EVENT_ONLY;
    case 0x08: case 0x09: return SDR_GROUP_ENTITY_ASSOC;
    case 0x10: return SDR_GROUP_GENERIC_LOCATOR;
    case 0x11: return SDR_GROUP_FRU_LOCATOR;
    case 0x12: return SDR_GROUP_MC_LOCATOR;
    case 0xC0: return SDR_GROUP_OEM;
    default: return SDR_GROUP_OTHER;
    }
}

class SdrReader : public TestSupport::SimTest {
protected:
    void TearDown() override {
        IpmiIfcSdrCleanUpAll(0);
        IpmiIfcSdrCleanUpHeaders(0);
        IpmiIfcEntityCleanUpAll(0);  // the chain builds the entity tree too
        SimTest::TearDown();
    }

    void setRepository(std::vector<Bytes> records) { bmc().sdr.records = std::move(records); }

    // One group's list as it stands, head first.
    std::vector<Filed> list(IpmiSdrGroup group) {
        std::vector<Filed> out;
        for (ipmiifc_sdr_list* e = node().work.sdr.lists[group]; e != nullptr; e = e->next)
            out.push_back(Filed{e->record_id, e->record_type, Bytes(e->data, e->data + e->length)});
        return out;
    }

    // Lines this reader wrote (the sensor and entity rebuilds log their own).
    size_t readerLines() {
        size_t n = 0;
        for (const auto& l : log.lines())
            if (l.text.compare(0, 10, "IpmiIfcSdr") == 0) ++n;
        return n;
    }

    size_t filedCount() {
        size_t n = 0;
        for (int g = 0; g < SDR_GROUP_COUNT; ++g) n += list(static_cast<IpmiSdrGroup>(g)).size();
        return n;
    }

    // Every Get SDR the controller saw, with its request fields.
    std::vector<ChunkRead> getSdrRequests() {
        std::vector<ChunkRead> out;
        for (const auto& r : sim().requests()) {
            if (r.netfn != netfn::storage || r.cmd != cmd::getSdr || r.data.size() != 6) continue;
            out.push_back(ChunkRead{static_cast<uint16_t>(r.data[0] | (r.data[1] << 8)),
                                    static_cast<uint16_t>(r.data[2] | (r.data[3] << 8)), r.data[4], r.data[5]});
        }
        return out;
    }

    // Puts `hook` in front of the controller's Get SDR: it sees every request
    // first and answers instead of the repository when it returns something.
    void hookGetSdr(std::function<Sim::Response(Sim::Bmc&, const Sim::Request&)> hook) {
        auto plain = std::make_shared<Sim::Bmc>();
        bmc().on(netfn::storage, cmd::getSdr, [plain, hook](Sim::Bmc& b, const Sim::Request& r) {
            Sim::Response early = hook(b, r);
            if (!early.empty()) return early;
            plain->sdr = b.sdr;
            return plain->handle(r);
        });
    }

    // Makes the controller report `count` records whatever its repository holds.
    void reportRecordCount(uint16_t count) {
        bmc().on(netfn::storage, cmd::getSdrRepositoryInfo, [count](Sim::Bmc& b, const Sim::Request&) {
            return Sim::Response{0x00, b.sdr.version, static_cast<uint8_t>(count & 0xFF),
                                 static_cast<uint8_t>(count >> 8), 0, 0x10, 0, 0, 0, 0, 0, 0, 0, 0, b.sdr.operationSupport};
        });
    }

    // The header walk as the refresh chain leaves it, without reading records.
    void walkHeaders() {
        ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
        RespHolder info(IpmiIfcSendCmd(0, cmd::getSdrRepositoryInfo, netfn::storage, 0, 0, nullptr, 0));
        ASSERT_TRUE(info);
        memcpy(node().work.sdr.info, info->data, sizeof node().work.sdr.info);
        ASSERT_EQ(IpmiIfcSdrGetHeaders(0), 0u);
    }

    uint16_t reservation() { return static_cast<uint16_t>(node().work.sdr.reservation[1] | (node().work.sdr.reservation[2] << 8)); }
};

// ---------------------------------------------------------------------------
// The whole read

TEST_F(SdrReader, AcceptedInfoFilesEveryRecordInItsGroupNewestFirst) {
    const uint8_t types[] = {0x01, 0x02, 0x03, 0x08, 0x09, 0x10, 0x11, 0x12, 0xC0, 0x14, 0xC1, 0x01};
    std::vector<Bytes> records;
    uint16_t id = 0x0100;
    for (uint8_t t : types) records.push_back(sdrRecord(id++, t, 20 + 3 * records.size()));
    setRepository(records);

    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    std::map<int, std::vector<Bytes>> expected;
    for (const auto& r : records) expected[expectedGroup(r[3])].insert(expected[expectedGroup(r[3])].begin(), r);
    for (int g = 0; g < SDR_GROUP_COUNT; ++g) {
        std::vector<Bytes> got;
        for (const auto& f : list(static_cast<IpmiSdrGroup>(g))) got.push_back(f.bytes);
        EXPECT_EQ(got, expected[g]) << "group " << g;
    }
    EXPECT_EQ(list(SDR_GROUP_ENTITY_ASSOC).size(), 2u);
    EXPECT_EQ(list(SDR_GROUP_OTHER).size(), 2u);
    EXPECT_EQ(list(SDR_GROUP_FULL)[0].recordId, 0x010B);
    EXPECT_EQ(list(SDR_GROUP_FULL)[0].recordType, 0x01);
    EXPECT_EQ(filedCount(), records.size());
    EXPECT_EQ(node().work.sdr.header_cnt, records.size());
    EXPECT_EQ(node().work.sdr.headers_valid, 1);
    EXPECT_EQ(readerLines(), 0u) << log.dump();
}

// One info, one reservation, one header read per record, one read per 16 bytes.
TEST_F(SdrReader, FullLoadMakesExactlyTheExchangesTheWalkNeeds) {
    std::vector<Bytes> records;
    for (uint16_t id = 1; id <= 9; ++id) records.push_back(sdrRecord(id, 0x01, 5 + 7 * id));
    setRepository(records);
    size_t chunks = 0;
    for (const auto& r : records) chunks += chunkReads(r.size());

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdrRepositoryInfo), 1u);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::reserveSdrRepository), 1u);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdr), records.size() + chunks);
    // The walk follows the next-record ids from 0x0000.
    const std::vector<ChunkRead> reads = getSdrRequests();
    ASSERT_GE(reads.size(), 3u);
    const std::vector<ChunkRead> walk(reads.begin(), reads.begin() + 3);
    const uint16_t r = reservation();
    EXPECT_EQ(walk, (std::vector<ChunkRead>{{r, 0, 0, 5}, {r, 2, 0, 5}, {r, 3, 0, 5}}));
}

TEST_F(SdrReader, GetSdrHandsOutTheStoredInfo) {
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x02, 30)});
    bmc().sdr.additionTimestamp = 0x11223344;
    bmc().sdr.eraseTimestamp = 0x55667788;
    EXPECT_EQ(IpmiIfc::getSdr(0).version, 0);  // never fetched

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    ipmiifc_sdr_info info = IpmiIfc::getSdr(0);
    EXPECT_EQ(info.cc, 0);
    EXPECT_EQ(info.version, 0x51);
    EXPECT_EQ(info.record_count, 2);
    EXPECT_EQ(info.addition_timestamp, 0x11223344u);
    EXPECT_EQ(info.erase_timestamp, 0x55667788u);
    EXPECT_EQ(info.operation_support, bmc().sdr.operationSupport);
}

// The start-up command table hands the answer straight to the handler.
TEST_F(SdrReader, HandlerCalledDirectlyRunsTheWholeChain) {
    setRepository({sdrRecord(1, 0x01, 30)});
    RespHolder info(IpmiIfcSendCmd(0, cmd::getSdrRepositoryInfo, netfn::storage, 0, 0, nullptr, 0));
    ASSERT_TRUE(info);
    EXPECT_EQ(IpmiIfcRhGetSdrInfo(info.get()), 0u);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::reserveSdrRepository), 1u);
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 1u);
}

TEST_F(SdrReader, ConcurrentRefreshesDoNotInterleave) {
    std::vector<Bytes> records;
    for (uint16_t id = 1; id <= 5; ++id) records.push_back(sdrRecord(id, 0x01, 40));
    setRepository(records);

    std::thread other([] { IpmiIfcSdrGetInfo(0); });
    IpmiIfcSdrGetInfo(0);
    other.join();

    // Each refresh is info, reservation, then its Get SDRs, never mixed with the other's.
    std::vector<uint8_t> commands;
    for (const auto& r : sim().requests())
        if (r.netfn == netfn::storage) commands.push_back(r.cmd);
    const size_t perRefresh = 2 + records.size() + records.size() * chunkReads(40);
    ASSERT_EQ(commands.size(), 2 * perRefresh);
    for (size_t start : {size_t{0}, perRefresh}) {
        EXPECT_EQ(commands[start], cmd::getSdrRepositoryInfo);
        EXPECT_EQ(commands[start + 1], cmd::reserveSdrRepository);
        EXPECT_EQ(std::count(commands.begin() + static_cast<long>(start + 2),
                             commands.begin() + static_cast<long>(start + perRefresh), cmd::getSdr),
                  static_cast<long>(perRefresh - 2));
    }
    EXPECT_EQ(filedCount(), records.size());
}

TEST_F(SdrReader, RecordCountZeroKeepsTheLists) {
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x11, 20)});
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    bmc().sdr.records.clear();
    sim().resetCounters();
    log.clear();

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);  // the info itself is fine
    EXPECT_EQ(IpmiIfcSdrGetAll(0), kFailed);

    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdr), 0u);
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 1u);
    EXPECT_EQ(list(SDR_GROUP_FRU_LOCATOR).size(), 1u);
    EXPECT_EQ(readerLines(), 0u) << log.dump();
}

// All version cases in one test: the invalid-version line is written once per process.
TEST_F(SdrReader, VersionGate) {
    setRepository({sdrRecord(1, 0x01, 30)});

    bmc().sdr.version = 0x03;  // discarded by the handler: nothing reserved or read
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "Unexpected SDR Repository info version 0x3 - discarding results "));
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::reserveSdrRepository), 0u);
    EXPECT_EQ(IpmiIfc::getSdr(0).version, 0);

    bmc().sdr.version = 0x01;  // accepted as info, refused as a repository
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(IpmiIfc::getSdr(0).version, 0x01);
    EXPECT_EQ(IpmiIfcSdrGetAll(0), kFailed);
    bmc().sdr.version = 0x11;
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(IpmiIfcSdrGetAll(0), kFailed);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdr), 0u);
    EXPECT_EQ(log.count("IpmiIfcSdrGetAll: invalid version. version = 0x1"), 1u) << log.dump();
    EXPECT_EQ(log.count("IpmiIfcSdrGetAll: invalid version. version = 0x11"), 0u);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrGetAll: invalid version. version = 0x1"));
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 0u);

    for (uint8_t good : {uint8_t{0x51}, uint8_t{0x02}, uint8_t{0x52}}) {
        bmc().sdr.version = good;
        IpmiIfcSdrCleanUpAll(0);
        EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
        EXPECT_EQ(list(SDR_GROUP_FULL).size(), 1u) << "version " << int(good);
    }
}

// A version of 0 looks like "never fetched"; inside the chain it must not ask again.
TEST_F(SdrReader, VersionZeroFromTheControllerEndsTheChain) {
    setRepository({sdrRecord(1, 0x01, 30)});
    bmc().sdr.version = 0x00;
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdrRepositoryInfo), 1u);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdr), 0u);
}

// Called with no info stored, the whole read asks for it, and the accepted
// info runs the chain, which reads the repository before the outer call does.
TEST_F(SdrReader, GetAllWithoutInfoFetchesItFirst) {
    setRepository({sdrRecord(1, 0x01, 30)});
    EXPECT_EQ(IpmiIfcSdrGetAll(0), 0u);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdrRepositoryInfo), 1u);
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 1u);
}

TEST_F(SdrReader, InfoHandlerRefusals) {
    ipmiifc_resp resp{};
    resp.cc = 0xC1;
    resp.data[0] = 0xC1;
    resp.data_len = 1;
    EXPECT_EQ(IpmiIfcRhGetSdrInfo(&resp), kFailed);
    EXPECT_TRUE(log.contains(LOG_WARNING, "Unable to fetch SDR info - cc=0xc1"));

    resp.cc = 0;
    resp.data[0] = 0x05;
    resp.data_len = 15;
    EXPECT_EQ(IpmiIfcRhGetSdrInfo(&resp), kFailed);
    EXPECT_TRUE(log.contains(LOG_WARNING, "Inconsistent SDR Response codes 5 != 0"));

    sim().addFault(netfn::storage, cmd::getSdrRepositoryInfo, Sim::Fault::answerLength(Sim::FaultKind::CutAnswer, 14));
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "SDR response buffer was wrong size e (expecting f)"));
    sim().addFault(netfn::storage, cmd::getSdrRepositoryInfo, Sim::Fault::answerLength(Sim::FaultKind::LongAnswer, 40));
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "SDR response buffer was wrong size 20 (expecting f)"));

    sim().addFault(netfn::storage, cmd::getSdrRepositoryInfo, Sim::Fault::completionCode(0xC0));
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), kFailed);
    sim().addFault(netfn::storage, cmd::getSdrRepositoryInfo, Sim::Fault::of(Sim::FaultKind::NoAnswer));
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), kFailed);

    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::reserveSdrRepository), 0u);
    EXPECT_EQ(IpmiIfc::getSdr(0).version, 0);
}

TEST_F(SdrReader, ReservationKeepsTheLastGrantedId) {
    bmc().sdr.reservation = 0x1233;
    EXPECT_EQ(IpmiIfcSdrReserve(0), 0u);
    EXPECT_EQ(reservation(), 0x1234);
    sim().addFault(netfn::storage, cmd::reserveSdrRepository, Sim::Fault::completionCode(0xC1));
    EXPECT_EQ(IpmiIfcSdrReserve(0), kFailed);
    sim().addFault(netfn::storage, cmd::reserveSdrRepository, Sim::Fault::answerLength(Sim::FaultKind::CutAnswer, 2));
    EXPECT_EQ(IpmiIfcSdrReserve(0), kFailed);
    EXPECT_EQ(reservation(), 0x1234);
}

TEST_F(SdrReader, NodeOutsideTheTableIsRefused) {
    EXPECT_EQ(IpmiIfcSdrGetAll(4), kFailed);
    EXPECT_EQ(IpmiIfcSdrGetInfo(4), kFailed);
    EXPECT_EQ(IpmiIfcSdrGetAll(-1), kFailed);
    IpmiIfcSdrCleanUpHeaders(7);
    IpmiIfcSdrCleanUpAll(7);
    EXPECT_EQ(sim().totalExchanges(), 0u);
}

// ---------------------------------------------------------------------------
// Reading one record

TEST_F(SdrReader, FortyByteRecordIsReadFromItsEnd) {
    const Bytes record = sdrRecord(0x0207, 0x01, 40);
    setRepository({record});
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
    const uint16_t r = reservation();

    Bytes buffer(40);
    ASSERT_EQ(IpmiIfcSdrReadRecordId(0, 0x0207, buffer.data(), 40), 0u);

    EXPECT_EQ(buffer, record);
    EXPECT_EQ(getSdrRequests(), (std::vector<ChunkRead>{{r, 0x0207, 24, 16}, {r, 0x0207, 8, 16}, {r, 0x0207, 0, 8}}));
}

TEST_F(SdrReader, ReservationCancelledMidRecordReReservesAndRepeatsTheChunk) {
    const Bytes record = sdrRecord(5, 0x01, 40);
    setRepository({record});
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
    const uint16_t first = reservation();
    bool cancelled = false;
    hookGetSdr([&cancelled](Sim::Bmc& b, const Sim::Request& r) {
        if (r.data[4] == 8 && !cancelled) {
            cancelled = true;
            ++b.sdr.reservation;  // another client reserved the repository
        }
        return Sim::Response{};
    });

    Bytes buffer(40);
    ASSERT_EQ(IpmiIfcSdrReadRecordId(0, 5, buffer.data(), 40), 0u);

    EXPECT_EQ(buffer, record);
    const uint16_t second = reservation();
    EXPECT_NE(second, first);
    EXPECT_EQ(getSdrRequests(),
              (std::vector<ChunkRead>{{first, 5, 24, 16}, {first, 5, 8, 16}, {second, 5, 8, 16}, {second, 5, 0, 8}}));
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::reserveSdrRepository), 2u);
    EXPECT_EQ(readerLines(), 0u) << log.dump();
}

TEST_F(SdrReader, CannotReturnThatManyBytesShrinksOnlyTheChunksAfter) {
    const Bytes record = sdrRecord(5, 0x01, 40);
    setRepository({record});
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
    const uint16_t r = reservation();
    sim().addFault(netfn::storage, cmd::getSdr, Sim::Fault::completionCode(cc::cannotReturnRequestedBytes));

    Bytes buffer(40);
    ASSERT_EQ(IpmiIfcSdrReadRecordId(0, 5, buffer.data(), 40), 0u);

    EXPECT_EQ(buffer, record);
    EXPECT_EQ(getSdrRequests(), (std::vector<ChunkRead>{{r, 5, 24, 16}, {r, 5, 24, 16}, {r, 5, 9, 15}, {r, 5, 0, 9}}));
    EXPECT_EQ(readerLines(), 0u) << log.dump();
}

// The retry of a refused chunk asks as much again, so a controller that can
// never return 16 bytes fails the record: kept as the library always did.
TEST_F(SdrReader, ControllerThatReadsLessThanSixteenBytesFailsTheFirstChunk) {
    setRepository({sdrRecord(5, 0x01, 40)});
    bmc().sdr.maxReadBytes = 12;
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);

    Bytes buffer(40);
    EXPECT_EQ(IpmiIfcSdrReadRecordId(0, 5, buffer.data(), 40), kFailed);

    for (const auto& c : getSdrRequests()) EXPECT_EQ(c.count, 16);
    EXPECT_EQ(getSdrRequests().size(), 4u);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadRecordId: retry expired."));
}

// Refused three times per chunk: the chunks shrink to one byte and no further,
// and the refusals once the chunk is down to eight bytes are logged.
TEST_F(SdrReader, ChunksShrinkToOneByteAndTheRecordStillCompletes) {
    const Bytes record = sdrRecord(0x33, 0x01, 60);
    setRepository({record});
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
    std::map<uint8_t, int> refusals;
    hookGetSdr([&refusals](Sim::Bmc&, const Sim::Request& r) {
        if (refusals[r.data[4]]++ < 3) return Sim::Response{cc::requestDataLengthInvalid};
        return Sim::Response{};
    });

    Bytes buffer(60);
    ASSERT_EQ(IpmiIfcSdrReadRecordId(0, 0x33, buffer.data(), 60), 0u);

    EXPECT_EQ(buffer, record);
    std::vector<uint8_t> counts;
    for (const auto& c : getSdrRequests())
        if (counts.empty() || counts.back() != c.count) counts.push_back(c.count);
    EXPECT_EQ(counts, (std::vector<uint8_t>{16, 13, 10, 7, 4, 1}));
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadRecordId:record id: 33, error 199. Try again..."));
}

TEST_F(SdrReader, LengthMismatchIsRetried) {
    const Bytes record = sdrRecord(9, 0x01, 40);
    setRepository({record});
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
    sim().addFault(netfn::storage, cmd::getSdr, Sim::Fault::answerLength(Sim::FaultKind::CutAnswer, 10));
    sim().addFault(netfn::storage, cmd::getSdr, Sim::Fault::answerLength(Sim::FaultKind::LongAnswer, 40));

    Bytes buffer(40);
    ASSERT_EQ(IpmiIfcSdrReadRecordId(0, 9, buffer.data(), 40), 0u);

    EXPECT_EQ(buffer, record);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadRecordId: data length mismatch req=19,resp=10"));
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadRecordId: data length mismatch req=19,resp=32"));
    const auto reads = getSdrRequests();
    ASSERT_EQ(reads.size(), 5u);
    EXPECT_EQ(reads[0], reads[1]);
    EXPECT_EQ(reads[1], reads[2]);
}

TEST_F(SdrReader, RecordThatNeverAnswersRunsOutOfTries) {
    setRepository({sdrRecord(9, 0x01, 40)});
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
    sim().addFault(netfn::storage, cmd::getSdr, Sim::Fault::of(Sim::FaultKind::NoAnswer, 4));

    Bytes buffer(40);
    EXPECT_EQ(IpmiIfcSdrReadRecordId(0, 9, buffer.data(), 40), kFailed);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdr), 4u);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadRecordId: retry expired."));

    EXPECT_EQ(IpmiIfcSdrReadRecordId(0, 9, buffer.data(), 0), kFailed);  // nothing to read
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdr), 4u);
    EXPECT_EQ(log.count("IpmiIfcSdrReadRecordId: retry expired."), 2u);
}

TEST_F(SdrReader, RecordGoneAfterTheWalkIsSkippedAndTheRestFiled) {
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x01, 30), sdrRecord(3, 0x01, 30)});
    walkHeaders();
    bmc().sdr.records.erase(bmc().sdr.records.begin() + 1);

    EXPECT_EQ(IpmiIfcSdrReadAll(0), 0u);

    std::vector<uint16_t> ids;
    for (const auto& f : list(SDR_GROUP_FULL)) ids.push_back(f.recordId);
    EXPECT_EQ(ids, (std::vector<uint16_t>{3, 1}));
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadRecordId: sensor not found, record id: 2"));
    EXPECT_EQ(log.count("IpmiIfcSdrReadRecordId: retry expired."), 0u);
}

// ---------------------------------------------------------------------------
// The header walk

TEST_F(SdrReader, HeaderWalkReReservesWhenItsReservationIsCancelled) {
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x01, 30)});
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
    RespHolder info(IpmiIfcSendCmd(0, cmd::getSdrRepositoryInfo, netfn::storage, 0, 0, nullptr, 0));
    memcpy(node().work.sdr.info, info->data, 15);
    const uint16_t first = reservation();
    sim().resetCounters();
    sim().addFault(netfn::storage, cmd::getSdr, Sim::Fault::completionCode(cc::reservationCancelled));

    EXPECT_EQ(IpmiIfcSdrGetHeaders(0), 0u);

    const uint16_t second = reservation();
    EXPECT_NE(first, second);
    EXPECT_EQ(getSdrRequests(), (std::vector<ChunkRead>{{first, 0, 0, 5}, {second, 0, 0, 5}, {second, 2, 0, 5}}));
    EXPECT_EQ(node().work.sdr.header_cnt, 2u);
    EXPECT_LE(virtualSecondsElapsed(), 3.5);
}

TEST_F(SdrReader, HeaderWalkThatRunsOutOfTriesKeepsTheOldLists) {
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x12, 30), sdrRecord(3, 0x01, 30)});
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    bmc().sdr.records.push_back(sdrRecord(4, 0x01, 30));
    hookGetSdr([](Sim::Bmc&, const Sim::Request& r) {
        return r.data[2] == 3 ? Sim::Response{cc::nodeBusy} : Sim::Response{};
    });
    log.clear();

    EXPECT_EQ(IpmiIfcSdrGetAll(0), kFailed);

    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcSdrGetHeaders: retry expired."));
    EXPECT_EQ(node().work.sdr.header_cnt, 2u);  // the headers read before the failure
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 2u);
    EXPECT_EQ(list(SDR_GROUP_MC_LOCATOR).size(), 1u);
}

// ---------------------------------------------------------------------------
// Shared records

TEST_F(SdrReader, CompactRecordSharingThreeSensorsYieldsThree) {
    // Instance 0x7E device-relative and modifier offset 0x7E: both wrap within 7 bits.
    const Bytes record = compactRecord(0x40, Shared{0x30, 0xFE, 3, 0x80 | 0x7E});
    setRepository({record});

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    const auto filed = list(SDR_GROUP_COMPACT);
    ASSERT_EQ(filed.size(), 3u);
    // The record as read is filed first, so it ends up last.
    EXPECT_EQ(filed[2].bytes, record);
    const uint8_t numbers[3] = {0x30, 0x31, 0x32};
    const uint8_t instances[3] = {0xFE, 0xFF, 0x80};
    const uint8_t modifiers[3] = {0xFE, 0xFF, 0x80};
    for (int i = 0; i < 3; ++i) {
        const Filed& f = filed[2 - i];
        EXPECT_EQ(f.recordId, 0x40);
        EXPECT_EQ(f.recordType, 0x02);
        ASSERT_EQ(f.bytes.size(), record.size());
        EXPECT_EQ(f.bytes[sdr::key::sensorNumber], numbers[i]);
        EXPECT_EQ(f.bytes[sdr::key::entityInstance], instances[i]);
        EXPECT_EQ(f.bytes[sdr::compact::instanceModifier], modifiers[i]);
        EXPECT_EQ(f.bytes[sdr::compact::sharing], 0x10 | (3 - i));
        EXPECT_EQ(f.bytes[sdr::compact::oem], record[sdr::compact::oem]);  // the rest is the record's
    }
}

TEST_F(SdrReader, EventOnlyRecordSharingKeepsTheInstanceUnlessAsked) {
    const Bytes record = eventOnlyRecord(0x41, Shared{0x50, 0x02, 2, 0x05});
    setRepository({record});

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    const auto filed = list(SDR_GROUP_EVENT_ONLY);
    ASSERT_EQ(filed.size(), 2u);
    EXPECT_EQ(filed[1].bytes, record);
    EXPECT_EQ(filed[0].bytes[sdr::key::sensorNumber], 0x51);
    EXPECT_EQ(filed[0].bytes[sdr::key::entityInstance], 0x02);
    EXPECT_EQ(filed[0].bytes[sdr::eventOnly::sharing], 1);
    EXPECT_EQ(filed[0].bytes[sdr::eventOnly::instanceModifier], 0x06);
}

TEST_F(SdrReader, SharedRecordTooShortForItsSharingBytesIsFiledAlone) {
    Bytes record = compactRecord(0x42, Shared{0x10, 1, 5, 0});
    record.resize(sdr::compact::instanceModifier);  // ends with the sharing byte
    record[sdr::header::remainingLength] = static_cast<uint8_t>(record.size() - sdr::header::length);
    setRepository({record});

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    ASSERT_EQ(list(SDR_GROUP_COMPACT).size(), 1u);
    EXPECT_EQ(list(SDR_GROUP_COMPACT)[0].bytes, record);
}

// ---------------------------------------------------------------------------
// Controllers whose answers do not add up

TEST_F(SdrReader, RecordsLongerThanASensorHoldsAreKeptWholeOrSkipped) {
    const Bytes long200 = sdrRecord(1, 0x01, 200);
    const Bytes max = sdrRecord(2, 0xC0, 260);  // length byte 255: whole size wraps to 4
    const Bytes zero = sdrRecord(3, 0xC0, 256);  // length byte 251: whole size wraps to 0
    const Bytes small = sdrRecord(4, 0x11, 20);
    setRepository({long200, max, zero, small});

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    ASSERT_EQ(list(SDR_GROUP_FULL).size(), 1u);
    EXPECT_EQ(list(SDR_GROUP_FULL)[0].bytes, long200);
    ASSERT_EQ(list(SDR_GROUP_OEM).size(), 1u);
    EXPECT_EQ(list(SDR_GROUP_OEM)[0].bytes, Bytes(max.begin(), max.begin() + 4));
    ASSERT_EQ(list(SDR_GROUP_FRU_LOCATOR).size(), 1u);
    EXPECT_EQ(list(SDR_GROUP_FRU_LOCATOR)[0].bytes, small);
}

TEST_F(SdrReader, RecordCountLargerThanTheRepositoryStopsAtTheLastRecord) {
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x01, 30)});
    reportRecordCount(40);
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(node().work.sdr.header_cnt, 2u);
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 2u);
}

TEST_F(SdrReader, RecordCountSmallerThanTheRepositoryReadsThatMany) {
    std::vector<Bytes> records;
    for (uint16_t id = 1; id <= 6; ++id) records.push_back(sdrRecord(id, 0x01, 30));
    setRepository(records);
    reportRecordCount(3);
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(node().work.sdr.header_cnt, 3u);
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 3u);

    // The header array is kept for a smaller count and replaced for a larger one.
    reportRecordCount(6);
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 6u);
    reportRecordCount(2);
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 2u);
}

TEST_F(SdrReader, NextRecordIdLoopEndsAtTheRecordCount) {
    // Two records with id 1: the next id of the second record leads back to the first.
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x01, 30), sdrRecord(1, 0x01, 30)});
    reportRecordCount(50);

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    EXPECT_EQ(node().work.sdr.header_cnt, 50u);
    EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdr), 50u + 50u * chunkReads(30));
}

TEST_F(SdrReader, NextRecordIdThatLeadsNowhereFailsTheWalk) {
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x01, 30)});
    hookGetSdr([](Sim::Bmc& b, const Sim::Request& r) {
        auto plain = std::make_shared<Sim::Bmc>();
        plain->sdr = b.sdr;
        Sim::Response a = plain->handle(r);
        if (a.size() > 2 && a[0] == 0) a[1] = 0x77;  // a next id no record has
        return a;
    });

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcSdrGetHeaders: retry expired."));
    EXPECT_EQ(node().work.sdr.header_cnt, 1u);
    EXPECT_EQ(filedCount(), 0u);
}

TEST_F(SdrReader, ShortHeaderAnswerIsRetriedAndAPaddedOneRead) {
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x02, 30)});
    sim().addFault(netfn::storage, cmd::getSdr, Sim::Fault::answerLength(Sim::FaultKind::CutAnswer, 4));
    sim().addFault(netfn::storage, cmd::getSdr, Sim::Fault::answerLength(Sim::FaultKind::LongAnswer, 64));

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 1u);
    EXPECT_EQ(list(SDR_GROUP_COMPACT).size(), 1u);
}

TEST_F(SdrReader, CleanUpEmptiesEveryListAndTheHeaders) {
    setRepository({sdrRecord(1, 0x01, 30), sdrRecord(2, 0x02, 30), sdrRecord(3, 0x08, 20), sdrRecord(4, 0xF0, 9)});
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    ASSERT_EQ(filedCount(), 4u);

    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcSdrCleanUpHeaders(0);

    EXPECT_EQ(filedCount(), 0u);
    EXPECT_EQ(node().work.sdr.headers, nullptr);
    EXPECT_EQ(IpmiIfcSdrReadAll(0), kFailed);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadAll: header_cnt == 0 or no header data"));
}

// ---------------------------------------------------------------------------
// Repositories captured from real servers

std::vector<Bytes> parseDump(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    Bytes all((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::vector<Bytes> records;
    for (size_t at = 0; at + 5 <= all.size() && at + 5 + all[at + 4] <= all.size(); at += 5 + all[at + 4])
        records.emplace_back(all.begin() + static_cast<long>(at), all.begin() + static_cast<long>(at + 5 + all[at + 4]));
    return records;
}

TEST_F(SdrReader, RealRepositoriesAreFiledWhole) {
    const std::string dir = TestSupport::realDataPath("sdr");
    SKIP_WITHOUT_REAL_DATA(dir);
    std::vector<std::string> files;
    if (DIR* d = opendir(dir.c_str())) {
        while (dirent* e = readdir(d)) {
            std::string name = e->d_name;
            if (name.size() > 4 && name.compare(name.size() - 4, 4, ".sdr") == 0) files.push_back(dir + "/" + name);
        }
        closedir(d);
    }
    std::sort(files.begin(), files.end());
    ASSERT_FALSE(files.empty());

    for (const auto& file : files) {
        SCOPED_TRACE(file);
        auto server = std::make_shared<Sim::Bmc>();
        Sim::loadSdrDump(*server, file);
        useBmc(server);
        IpmiIfcSdrCleanUpAll(0);
        IpmiIfcSdrCleanUpHeaders(0);
        memset(&node().work.sdr, 0, sizeof node().work.sdr);
        sim().resetCounters();
        log.clear();
        const std::vector<Bytes> records = parseDump(file);
        ASSERT_FALSE(records.empty());

        ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

        size_t chunks = 0;
        std::map<IpmiSdrGroup, std::vector<Bytes>> asRead;  // each group's records as read, newest first
        for (const auto& r : records) {
            chunks += chunkReads(r.size());
            asRead[expectedGroup(r[3])].insert(asRead[expectedGroup(r[3])].begin(), r);
        }
        EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdr), records.size() + chunks);
        for (int g = 0; g < SDR_GROUP_COUNT; ++g) {
            const auto group = static_cast<IpmiSdrGroup>(g);
            // Shared copies sit in front of the record they come from; leave them out.
            std::vector<Bytes> got;
            const auto filed = list(group);
            for (size_t i = 0; i < filed.size(); ++i) {
                const bool copyOfNext = i + 1 < filed.size() && filed[i + 1].recordId == filed[i].recordId;
                if (!copyOfNext) got.push_back(filed[i].bytes);
                EXPECT_EQ(expectedGroup(filed[i].recordType), group);
            }
            EXPECT_EQ(got, asRead[group]) << "group " << g;
        }
        // A shared record is there once per sensor it describes.
        for (const auto& r : records) {
            const sdr::SensorRecordOffsets at = sdr::sensorRecordOffsets(r[3]);
            if (at.sharing == 0) continue;
            const size_t sensors = std::max(1, r[at.sharing] & 0x0F);
            const auto filed = list(expectedGroup(r[3]));
            const uint16_t id = static_cast<uint16_t>(r[0] | (r[1] << 8));
            EXPECT_EQ(static_cast<size_t>(std::count_if(filed.begin(), filed.end(),
                                                        [id](const Filed& f) { return f.recordId == id; })),
                      sensors)
                << "record " << id;
        }
        EXPECT_EQ(readerLines(), 0u) << log.dump();
    }
}

}  // namespace
