// The SDR repository reader against the simulated controller (what it asks,
// how it retries, what it files), and the simulated repository's own answers.

#include <stdio.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <functional>
#include <map>
#include <stdexcept>
#include <thread>

#include <gmock/gmock.h>

#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

using Bytes = std::vector<uint8_t>;
using Sim::Fault;
using Sim::FaultKind;
using Plain = std::function<Sim::Response()>;
constexpr uint32_t kFailed = 0xFFFFFFFFu;
constexpr uint8_t st = netfn::storage;

// A record of `total` bytes, header included, describing one sensor; the body
// differs from record to record so that misplaced bytes show.
Bytes sdrRecord(uint16_t id, uint8_t type, size_t total) {
    Bytes r(total);
    r[0] = id & 0xFF;
    r[1] = id >> 8;
    r[2] = 0x51;
    r[3] = type;
    r[4] = static_cast<uint8_t>(total - 5);
    for (size_t i = 5; i < total; ++i) r[i] = static_cast<uint8_t>(id * 7 + i);
    const size_t sharing = sdr::sensorRecordOffsets(type).sharing;
    if (sharing != 0 && sharing < total) r[sharing] &= 0xF0;
    return r;
}

// A compact or event-only record whose description several sensors share.
Bytes sharedRecord(uint16_t id, uint8_t type, uint8_t number, uint8_t instance, uint8_t sharing, uint8_t modifier) {
    Bytes r = sdrRecord(id, type, type == sdr::type::compactSensor ? 40 : 20);
    r[sdr::key::sensorNumber] = number;
    r[sdr::key::entityInstance] = instance;                          // bit 7 device-relative
    r[sdr::sensorRecordOffsets(type).sharing] = sharing;             // low nibble share count
    r[sdr::sensorRecordOffsets(type).instanceModifier] = modifier;  // bit 7 instance increments, 6:0 offset
    return r;
}

size_t chunkReads(size_t length) { return (length + 15) / 16; }

IpmiSdrGroup expectedGroup(uint8_t type) {
    static const std::map<uint8_t, IpmiSdrGroup> groups = {
        {0x01, SDR_GROUP_FULL},           {0x02, SDR_GROUP_COMPACT},     {0x03, SDR_GROUP_EVENT_ONLY},
        {0x08, SDR_GROUP_ENTITY_ASSOC},   {0x09, SDR_GROUP_ENTITY_ASSOC}, {0x10, SDR_GROUP_GENERIC_LOCATOR},
        {0x11, SDR_GROUP_FRU_LOCATOR},    {0x12, SDR_GROUP_MC_LOCATOR},  {0xC0, SDR_GROUP_OEM}};
    const auto g = groups.find(type);
    return g == groups.end() ? SDR_GROUP_OTHER : g->second;
}

class SdrReader : public TestSupport::SimTest {
protected:
    void setRepository(std::vector<Bytes> records) { bmc().sdr.records = std::move(records); }

    // One group's records as filed, head first; each entry's id and type are its record's.
    std::vector<Bytes> list(IpmiSdrGroup group) {
        std::vector<Bytes> out;
        for (ipmiifc_sdr_list* e = node().work.sdr.lists[group]; e != nullptr; e = e->next) {
            out.emplace_back(e->data, e->data + e->length);
            if (e->length >= 4) {
                EXPECT_EQ(e->record_id | e->record_type << 16, e->data[0] | e->data[1] << 8 | e->data[3] << 16);
            }
        }
        return out;
    }
    size_t filedCount() {
        size_t n = 0;
        for (int g = 0; g < SDR_GROUP_COUNT; ++g) n += list(static_cast<IpmiSdrGroup>(g)).size();
        return n;
    }
    // Lines this reader wrote (the sensor and entity rebuilds log their own).
    size_t readerLines() {
        const auto lines = log.lines();
        return std::count_if(lines.begin(), lines.end(),
                             [](const TestSupport::LogLine& l) { return l.text.compare(0, 10, "IpmiIfcSdr") == 0; });
    }
    // Every Get SDR sent, as "reservation:record@offset+count" (record in hex),
    // the reservations lettered a, b, ... in the order they were used.
    std::string getSdrs() {
        std::string out;
        std::map<int, char> letter;
        for (const auto& r : sim().requests()) {
            if (r.netfn != st || r.cmd != cmd::getSdr) continue;
            const int reservation = r.data[0] | r.data[1] << 8;
            letter.emplace(reservation, static_cast<char>('a' + letter.size()));
            char one[32];
            snprintf(one, sizeof one, " %c:%x@%d+%d", letter[reservation], r.data[2] | r.data[3] << 8, r.data[4], r.data[5]);
            out += one;
        }
        return out.empty() ? out : out.substr(1);
    }
    // Puts `hook` in front of a storage command; `plain()` is the repository's own answer.
    void hook(uint8_t command, std::function<Sim::Response(Sim::Bmc&, const Sim::Request&, const Plain& plain)> hook) {
        auto plain = std::make_shared<Sim::Bmc>();
        bmc().on(st, command, [plain, hook](Sim::Bmc& b, const Sim::Request& r) {
            return hook(b, r, [&] {
                plain->sdr = b.sdr;
                return plain->handle(r);
            });
        });
    }
    // Makes the controller report `count` records whatever its repository holds.
    void reportRecordCount(uint16_t count) {
        hook(cmd::getSdrRepositoryInfo, [count](Sim::Bmc&, const Sim::Request&, const Plain& plain) {
            Sim::Response a = plain();
            a[2] = count & 0xFF;
            a[3] = count >> 8;
            return a;
        });
    }
};

// One info, one reservation, one header read per record, one read per 16 bytes;
// each record in its group's list, newest first.
TEST_F(SdrReader, RefreshFilesEveryRecordInItsGroupWithTheExchangesTheWalkNeeds) {
    const uint8_t types[] = {0x01, 0x02, 0x03, 0x08, 0x09, 0x10, 0x11, 0x12, 0xC0, 0x14, 0xC1, 0x01};
    std::vector<Bytes> records;
    std::map<int, std::vector<Bytes>> expected;
    size_t chunks = 0;
    for (uint8_t t : types) {
        records.push_back(sdrRecord(static_cast<uint16_t>(0x0100 + records.size()), t, 20 + 3 * records.size()));
        expected[expectedGroup(t)].insert(expected[expectedGroup(t)].begin(), records.back());
        chunks += chunkReads(records.back().size());
    }
    setRepository(records);
    bmc().sdr.additionTimestamp = 0x11223344;
    bmc().sdr.eraseTimestamp = 0x55667788;
    EXPECT_EQ(IpmiIfc::getSdr(0).version, 0);  // never fetched

    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    for (int g = 0; g < SDR_GROUP_COUNT; ++g) EXPECT_EQ(list(static_cast<IpmiSdrGroup>(g)), expected[g]) << "group " << g;
    EXPECT_EQ(sim().exchanges(st, cmd::getSdrRepositoryInfo), 1u);
    EXPECT_EQ(sim().exchanges(st, cmd::reserveSdrRepository), 1u);
    EXPECT_EQ(sim().exchanges(st, cmd::getSdr), records.size() + chunks);
    EXPECT_THAT(getSdrs(), testing::StartsWith("a:0@0+5 a:101@0+5 a:102@0+5 "));  // the walk follows the next ids
    EXPECT_EQ(readerLines(), 0u) << log.dump();
    const ipmiifc_sdr_info info = IpmiIfc::getSdr(0);
    EXPECT_EQ((std::vector<size_t>{info.record_count, info.addition_timestamp, info.erase_timestamp}),
              (std::vector<size_t>{records.size(), 0x11223344u, 0x55667788u}));

    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcSdrCleanUpHeaders(0);
    EXPECT_EQ(filedCount(), 0u);
    EXPECT_EQ(IpmiIfcSdrReadAll(0), kFailed);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadAll: header_cnt == 0 or no header data"));
}

TEST_F(SdrReader, ConcurrentRefreshesRunOneAfterTheOther) {
    std::vector<Bytes> records;
    for (uint16_t id = 1; id <= 5; ++id) records.push_back(sdrRecord(id, 0x01, 40));
    setRepository(records);

    std::thread other([] { IpmiIfcSdrGetInfo(0); });
    IpmiIfcSdrGetInfo(0);
    other.join();

    std::string commands;  // i info, r reservation, g Get SDR
    for (const auto& r : sim().requests())
        if (r.netfn == st) commands += r.cmd == cmd::getSdrRepositoryInfo ? 'i' : r.cmd == cmd::getSdr ? 'g' : 'r';
    const std::string one = "ir" + std::string(5 + 5 * chunkReads(40), 'g');
    EXPECT_EQ(commands, one + one);
    EXPECT_EQ(filedCount(), records.size());
}

// All version cases in one process: the invalid-version line is written once per process.
TEST_F(SdrReader, VersionGate) {
    setRepository({sdrRecord(1, 0x01, 30)});
    bmc().sdr.version = 0x03;  // discarded by the handler: nothing reserved or read
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "Unexpected SDR Repository info version 0x3 - discarding results "));
    EXPECT_EQ(sim().exchanges(st, cmd::reserveSdrRepository), 0u);
    EXPECT_EQ(IpmiIfc::getSdr(0).version, 0);

    for (uint8_t bad : {uint8_t{0x01}, uint8_t{0x11}}) {  // accepted as info, refused as a repository
        bmc().sdr.version = bad;
        EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
        EXPECT_EQ(IpmiIfc::getSdr(0).version, bad);
        EXPECT_EQ(IpmiIfcSdrGetAll(0), kFailed);
    }
    EXPECT_EQ(sim().exchanges(st, cmd::getSdr), 0u);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrGetAll: invalid version. version = 0x1"));
    EXPECT_EQ(log.count("IpmiIfcSdrGetAll: invalid version. version = 0x11"), 0u);

    bmc().sdr.version = 0x52;
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 1u);

    bmc().sdr.version = 0x00;  // looks like "never fetched": the chain must not ask again
    sim().resetCounters();
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(sim().exchanges(st, cmd::getSdrRepositoryInfo), 1u);
    EXPECT_EQ(sim().exchanges(st, cmd::getSdr), 0u);
}

TEST_F(SdrReader, RefusedOrMisshapenInfoAndReservationChangeNothing) {
    EXPECT_EQ(IpmiIfcSdrGetAll(4), kFailed);  // nodes outside the table: nothing asked
    EXPECT_EQ(IpmiIfcSdrGetInfo(-1), kFailed);
    IpmiIfcSdrCleanUpHeaders(7);
    IpmiIfcSdrCleanUpAll(7);
    EXPECT_EQ(sim().totalExchanges(), 0u);
    ipmiifc_resp resp{};  // answers as the start-up command table hands them over
    resp.cc = resp.data[0] = cc::invalidCommand;
    EXPECT_EQ(IpmiIfcRhGetSdrInfo(&resp), kFailed);
    EXPECT_TRUE(log.contains(LOG_WARNING, "Unable to fetch SDR info - cc=0xc1"));
    resp.cc = 0;  // but data[0] still says otherwise
    resp.data_len = 15;
    EXPECT_EQ(IpmiIfcRhGetSdrInfo(&resp), kFailed);
    sim().addFault(st, cmd::getSdrRepositoryInfo, Fault::answerLength(FaultKind::CutAnswer, 14));
    sim().addFault(st, cmd::getSdrRepositoryInfo, Fault::answerLength(FaultKind::LongAnswer, 40));
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "SDR response buffer was wrong size 20 (expecting f)"));
    sim().addFault(st, cmd::getSdrRepositoryInfo, Fault::completionCode(cc::nodeBusy));
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), kFailed);
    sim().addFault(st, cmd::getSdrRepositoryInfo, Fault::of(FaultKind::NoAnswer));
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), kFailed);
    EXPECT_EQ(sim().exchanges(st, cmd::reserveSdrRepository), 0u);
    EXPECT_EQ(IpmiIfc::getSdr(0).version, 0);

    bmc().sdr.reservation = 0x1233;
    EXPECT_EQ(IpmiIfcSdrReserve(0), 0u);
    sim().addFault(st, cmd::reserveSdrRepository, Fault::completionCode(cc::invalidCommand));
    EXPECT_EQ(IpmiIfcSdrReserve(0), kFailed);
    sim().addFault(st, cmd::reserveSdrRepository, Fault::answerLength(FaultKind::CutAnswer, 2));
    EXPECT_EQ(IpmiIfcSdrReserve(0), kFailed);
    EXPECT_EQ(node().work.sdr.reservation[1] | node().work.sdr.reservation[2] << 8, 0x1234);

    setRepository({sdrRecord(2, 0x01, 30)});
    sim().resetCounters();
    EXPECT_EQ(IpmiIfcSdrGetAll(0), 0u);  // no info yet: it is fetched, and its handler reads the repository
    EXPECT_EQ(sim().exchanges(st, cmd::getSdrRepositoryInfo), 1u);
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 1u);
    bmc().sdr.records.push_back(sdrRecord(3, 0x01, 30));
    RespHolder info(IpmiIfcSendCmd(0, cmd::getSdrRepositoryInfo, st, 0, 0, nullptr, 0));
    ASSERT_TRUE(info);
    EXPECT_EQ(IpmiIfcRhGetSdrInfo(info.get()), 0u);  // a good answer reads the repository
    EXPECT_EQ(list(SDR_GROUP_FULL).size(), 2u);
}

// A 40-byte record is read from its end in chunks of 16. Each case: what the
// controller does, and every Get SDR that follows, as reservation:record@offset+count.
TEST_F(SdrReader, RecordIsReadFromItsEndAndRefusedChunksAreRetried) {
    const Bytes record = sdrRecord(5, 0x01, 40);
    setRepository({record});
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
    bool cancelled = false;
    const struct {
        const char* what;
        std::function<void()> controller;
        const char* reads;
    } cases[] = {
        {"plain", [] {}, "a:5@24+16 a:5@8+16 a:5@0+8"},
        // The smaller size is for the chunks after; the retry asks as much again.
        {"0xCA once", [&] { sim().addFault(st, cmd::getSdr, Fault::completionCode(cc::cannotReturnRequestedBytes)); },
         "a:5@24+16 a:5@24+16 a:5@9+15 a:5@0+9"},
        {"cut, then padded",
         [&] {
             sim().addFault(st, cmd::getSdr, Fault::answerLength(FaultKind::CutAnswer, 10));
             sim().addFault(st, cmd::getSdr, Fault::answerLength(FaultKind::LongAnswer, 40));
         },
         "a:5@24+16 a:5@24+16 a:5@24+16 a:5@8+16 a:5@0+8"},
        // Kept as the library always did: a controller that never returns 16 bytes fails the record.
        {"at most 12 bytes", [&] { bmc().sdr.maxReadBytes = 12; }, "a:5@24+16 a:5@24+16 a:5@24+16 a:5@24+16"},
        {"no answer", [&] { sim().addFault(st, cmd::getSdr, Fault::of(FaultKind::NoAnswer, 4)); },
         "a:5@24+16 a:5@24+16 a:5@24+16 a:5@24+16"},
        // Another client reserves before the second chunk: a new reservation, the same chunk
        // again. Last, since the hook stays.
        {"reservation cancelled",
         [&] {
             hook(cmd::getSdr, [&cancelled](Sim::Bmc& b, const Sim::Request& r, const Plain& plain) {
                 if (r.data[4] == 8 && !cancelled) ++b.sdr.reservation;
                 cancelled = cancelled || r.data[4] == 8;
                 return plain();
             });
         },
         "a:5@24+16 a:5@8+16 b:5@8+16 b:5@0+8"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        bmc().sdr.maxReadBytes = 28;
        sim().resetCounters();
        c.controller();
        Bytes buffer(40);
        const bool complete = IpmiIfcSdrReadRecordId(0, 5, buffer.data(), 40) == 0;
        EXPECT_EQ(getSdrs(), c.reads);
        EXPECT_EQ(complete, buffer == record);
    }
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadRecordId: data length mismatch req=19,resp=10"));
    EXPECT_EQ(log.count("IpmiIfcSdrReadRecordId: retry expired."), 2u);
    Bytes buffer(1);
    EXPECT_EQ(IpmiIfcSdrReadRecordId(0, 5, buffer.data(), 0), kFailed);  // nothing to read, nothing asked
    EXPECT_EQ(log.count("IpmiIfcSdrReadRecordId: retry expired."), 3u);
}

// Refused three times per chunk: the chunks shrink to one byte and no further,
// and the refusals once the chunk is down to eight bytes are logged.
TEST_F(SdrReader, ChunksShrinkToOneByteAndTheRecordStillCompletes) {
    const Bytes record = sdrRecord(0x33, 0x01, 60);
    setRepository({record});
    ASSERT_EQ(IpmiIfcSdrReserve(0), 0u);
    std::map<uint8_t, int> refusals;
    hook(cmd::getSdr, [&refusals](Sim::Bmc&, const Sim::Request& r, const Plain& plain) {
        return refusals[r.data[4]]++ < 3 ? Sim::Response{cc::requestDataLengthInvalid} : plain();
    });

    Bytes buffer(60);
    ASSERT_EQ(IpmiIfcSdrReadRecordId(0, 0x33, buffer.data(), 60), 0u);

    EXPECT_EQ(buffer, record);
    std::vector<int> counts;
    for (const auto& r : sim().requests())
        if (r.cmd == cmd::getSdr && (counts.empty() || counts.back() != r.data[5])) counts.push_back(r.data[5]);
    EXPECT_EQ(counts, (std::vector<int>{16, 13, 10, 7, 4, 1}));
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadRecordId:record id: 33, error 199. Try again..."));
}

// The walk re-reserves when its reservation is cancelled, and ends at the last
// record or at the reported count, whichever comes first; a count of 0 reads
// nothing and keeps the lists; next ids that loop or lead nowhere end it too.
TEST_F(SdrReader, HeaderWalkIsBoundedByTheRecordCountAndTheNextIds) {
    std::vector<Bytes> records;
    for (uint16_t id = 1; id <= 6; ++id) records.push_back(sdrRecord(id, 0x01, 30));
    setRepository(records);
    sim().addFault(st, cmd::getSdr, Fault::completionCode(cc::reservationCancelled));
    EXPECT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_THAT(getSdrs(), testing::StartsWith("a:0@0+5 b:0@0+5 b:2@0+5 "));
    EXPECT_LE(virtualSecondsElapsed(), 3.5);  // one back-off of at most 3 s
    // The header array is replaced for a larger count and kept for a smaller one.
    for (const auto& c : std::vector<std::pair<uint16_t, size_t>>{{3, 3}, {6, 6}, {2, 2}, {40, 6}}) {
        reportRecordCount(c.first);
        ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
        EXPECT_EQ(node().work.sdr.header_cnt, c.second) << "count " << c.first;
        EXPECT_EQ(list(SDR_GROUP_FULL).size(), c.second) << "count " << c.first;
    }

    reportRecordCount(0);
    sim().resetCounters();
    log.clear();
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);  // the info itself is fine
    EXPECT_EQ(IpmiIfcSdrGetAll(0), kFailed);
    EXPECT_EQ(sim().exchanges(st, cmd::getSdr), 0u);
    EXPECT_EQ(filedCount(), 6u);
    EXPECT_EQ(readerLines(), 0u) << log.dump();

    // Two compact records that both carry id 1 and a claim of 65,282 records:
    // the record after record 1 is record 1 again, and the walk stops there.
    const Bytes one = {0x01, 0x00, 0x51, 0x02, 0x0f, 0x20, 0x00, 0x01, 0x07, 0x01,
                       0x00, 0x00, 0x07, 0x6f, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00};
    setRepository({one, one});
    reportRecordCount(0xFF02);
    sim().resetCounters();
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcSdrGetHeaders: record ID 0x0001 comes again after 1 records; "
                                          "the rest of the repository is ignored"))
        << log.dump();
    EXPECT_EQ(node().work.sdr.header_cnt, 1u);
    EXPECT_EQ(filedCount(), 1u);
    EXPECT_LE(sim().totalExchanges(), 8u);  // info, reservation, one header, two chunks, the sensor's reading
    ASSERT_EQ(IpmiIfc::getSensors(0).size(), 1u);

    hook(cmd::getSdr, [](Sim::Bmc&, const Sim::Request&, const Plain& plain) {
        Sim::Response a = plain();
        if (a.size() > 2 && a[0] == 0) a[1] = 0x77;  // a next id no record has
        return a;
    });
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcSdrGetHeaders: retry expired."));
    EXPECT_EQ(node().work.sdr.header_cnt, 1u);
    EXPECT_EQ(filedCount(), 1u) << "a failed walk keeps the old lists";
}

TEST_F(SdrReader, SharedRecordsYieldOneElementPerSensor) {
    // Instance 0x7E device-relative and modifier offset 0x7E: both wrap within 7 bits.
    const Bytes compact = sharedRecord(0x40, sdr::type::compactSensor, 0x30, 0xFE, 0x10 | 3, 0x80 | 0x7E);
    const Bytes eventOnly = sharedRecord(0x41, sdr::type::eventOnly, 0x50, 0x02, 2, 0x05);
    Bytes tooShort = sharedRecord(0x42, sdr::type::compactSensor, 0x10, 1, 5, 0);
    tooShort.resize(sdr::compact::instanceModifier);  // ends with the sharing byte: filed alone
    tooShort[sdr::header::remainingLength] = static_cast<uint8_t>(tooShort.size() - sdr::header::length);
    setRepository({compact, eventOnly, tooShort});

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    // Each later sensor: number, instance (only when asked) and modifier offset advanced,
    // share count down by one. The record as read is filed first, so it ends up last.
    const uint8_t c = sdr::type::compactSensor, e = sdr::type::eventOnly;
    EXPECT_EQ(list(SDR_GROUP_COMPACT), (std::vector<Bytes>{tooShort, sharedRecord(0x40, c, 0x32, 0x80, 0x11, 0x80),
                                                           sharedRecord(0x40, c, 0x31, 0xFF, 0x12, 0xFF), compact}));
    EXPECT_EQ(list(SDR_GROUP_EVENT_ONLY), (std::vector<Bytes>{sharedRecord(0x41, e, 0x51, 0x02, 1, 0x06), eventOnly}));
}

// A record gone since the walk (0xCB), records longer than a sensor holds,
// length bytes that wrap, header answers cut short or padded: each record is
// skipped or read as its length says, never beyond a buffer, and the rest filed.
TEST_F(SdrReader, RecordsThatCannotBeReadAsTheyClaimAreSkippedOrCut) {
    const Bytes long200 = sdrRecord(1, 0x01, 200), small = sdrRecord(5, 0x11, 20);
    const Bytes max = sdrRecord(3, 0xC0, 260);  // length byte 255: whole size wraps to 4
    // 2 is gone; 4's length byte 251 wraps the whole size to 0: skipped.
    setRepository({long200, sdrRecord(2, 0x01, 30), max, sdrRecord(4, 0xC0, 256), small});
    sim().addFault(st, cmd::getSdr, Fault::answerLength(FaultKind::CutAnswer, 4));
    sim().addFault(st, cmd::getSdr, Fault::answerLength(FaultKind::LongAnswer, 64));
    hook(cmd::getSdr, [](Sim::Bmc&, const Sim::Request& r, const Plain& plain) {
        return r.data[2] == 2 && r.data[5] != 5 ? Sim::Response{cc::requestedSensorNotPresent} : plain();
    });

    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

    EXPECT_EQ(list(SDR_GROUP_FULL), std::vector<Bytes>{long200});
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSdrReadRecordId: sensor not found, record id: 2"));
    EXPECT_EQ(list(SDR_GROUP_OEM), std::vector<Bytes>{Bytes(max.begin(), max.begin() + 4)});
    EXPECT_EQ(list(SDR_GROUP_FRU_LOCATOR), std::vector<Bytes>{small});
}

TEST_F(SdrReader, RealRepositoriesAreFiledWhole) {
    SKIP_WITHOUT_REAL_DATA(TestSupport::realDataPath("sdr"));
    for (const auto& file : TestSupport::realDataFiles("sdr", ".sdr")) {
        SCOPED_TRACE(file);
        auto server = std::make_shared<Sim::Bmc>();
        Sim::loadSdrDump(*server, file);
        useBmc(server);
        IpmiIfcSdrCleanUpAll(0);
        IpmiIfcSdrCleanUpHeaders(0);
        memset(&node().work.sdr, 0, sizeof node().work.sdr);
        sim().resetCounters();
        log.clear();

        ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);

        std::map<uint16_t, std::pair<Bytes, size_t>> expected, filed;  // by record id: bytes, one element per sensor
        size_t chunks = 0;
        for (const auto& r : server->sdr.records) {
            const size_t sharing = sdr::sensorRecordOffsets(r[3]).sharing;
            expected[r[0] | r[1] << 8] = {r, sharing == 0 ? 1 : std::max(1, r[sharing] & 0x0F)};
            chunks += chunkReads(r.size());
        }
        EXPECT_EQ(sim().exchanges(st, cmd::getSdr), server->sdr.records.size() + chunks);
        for (int g = 0; g < SDR_GROUP_COUNT; ++g)
            for (const auto& f : list(static_cast<IpmiSdrGroup>(g))) {
                EXPECT_EQ(static_cast<int>(expectedGroup(f[3])), g);
                filed[f[0] | f[1] << 8].first = f;  // the last of a shared run is the record as read
                ++filed[f[0] | f[1] << 8].second;
            }
        EXPECT_EQ(filed, expected);
        EXPECT_EQ(readerLines(), 0u) << log.dump();
    }
}

// ---------------------------------------------------------------------------
// What the simulated repository answers beyond what the reader asks

using TestSupport::ask;

TEST(SimSdr, RepositoryCommandsCheckTheirRequests) {
    Sim::Bmc bmc;
    const Bytes a = sdrRecord(0x10, 0x01, 64), b = sdrRecord(0x22, 0x02, 48);
    bmc.sdr.records = {a, b};
    const uint16_t freeSpace = 0x4000 - 112;
    EXPECT_EQ(ask(bmc, st, cmd::getSdrRepositoryInfo),
              (Sim::Response{0x00, 0x51, 2, 0, freeSpace & 0xFF, freeSpace >> 8, 0, 0, 0, 0, 0, 0, 0, 0, 0x22}));
    EXPECT_EQ(ask(bmc, st, cmd::getSdrRepositoryInfo, {0}), Sim::Response{cc::requestDataLengthInvalid});
    EXPECT_EQ(ask(bmc, st, cmd::reserveSdrRepository, {1}), Sim::Response{cc::requestDataLengthInvalid});
    bmc.sdr.reservation = 0xFFFF;
    EXPECT_EQ(ask(bmc, st, cmd::reserveSdrRepository), (Sim::Response{0x00, 1, 0})) << "never zero";

    // Offset 0 needs no reservation; the last record's next id is 0xFFFF.
    const Sim::Response last = ask(bmc, st, cmd::getSdr, {0x99, 0x99, 0x22, 0, 0, 28});
    EXPECT_EQ(Bytes(last.begin(), last.begin() + 3), (Bytes{0x00, 0xFF, 0xFF}));
    EXPECT_EQ(Bytes(last.begin() + 3, last.end()), Bytes(b.begin(), b.begin() + 28));
    const Sim::Response tail = ask(bmc, st, cmd::getSdr, {1, 0, 0x10, 0, 60, 16});  // ends with the record
    EXPECT_EQ(Bytes(tail.begin() + 3, tail.end()), Bytes(a.begin() + 60, a.end()));
    EXPECT_EQ(ask(bmc, st, cmd::getSdr, {1, 0, 0x10, 0, 64, 1}), Sim::Response{cc::parameterOutOfRange});
    EXPECT_EQ(ask(bmc, st, cmd::getSdr, {1, 0, 0x10, 0, 0}), Sim::Response{cc::requestDataLengthInvalid});
}

TEST(SimSdr, DumpLoaderRefusesACutFile) {
    const std::string path = "/tmp/tav-ipmi-simsdr-" + std::to_string(getpid()) + ".sdr";
    Bytes cut = sdrRecord(1, 0x01, 64);
    cut.resize(30);
    std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(cut.data()), cut.size());
    Sim::Bmc bmc;
    EXPECT_THROW(Sim::loadSdrDump(bmc, path), std::runtime_error);
    EXPECT_THROW(Sim::loadSdrDump(bmc, "/nonexistent/x.sdr"), std::runtime_error);
    EXPECT_TRUE(bmc.sdr.records.empty());
    unlink(path.c_str());
}

}  // namespace
