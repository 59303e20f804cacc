// The SEL as callers and handlers see it: the record object, the follow-up
// of the controller's log with exactly-once delivery, hostile controllers,
// the handler list under concurrent use, and the direct synchroniser.

#include <stdlib.h>
#include <string.h>

#include <algorithm>
#include <atomic>
#include <mutex>
#include <random>
#include <thread>

#include "IpmiIfcSel.h"
#include "IpmiSel.h"
#include "IpmiSensor.h"
#include "SelLayout.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using TestSupport::waitUntil;

using Bytes = std::vector<uint8_t>;

using TestSupport::eventRecord;

Bytes bytesOf(const sel_event_record& r) {
    const auto* p = reinterpret_cast<const uint8_t*>(&r);
    return Bytes(p, p + sizeof r);
}

TEST(SelRecord, AnswersFromItsBytes) {
    const struct {
        const char* what;
        sel_event_record record;
        uint32_t timestamp;
        int severity, alert;
        const char* caption;
    } cases[] = {
        {"threshold assertion", eventRecord(0x01, 0x01, 0x59), 0x5F000000, 6, 6,
         "Assert + Temperature Upper Critical going high"},
        {"deassertion, same severity", eventRecord(0x01, 0x81, 0x09), 0x5F000000, 6, 6,
         "Deassert + Temperature Upper Critical going high"},
        {"non-recoverable", eventRecord(0x02, 0x01, 0x0B), 0x5F000000, 7, 5,
         "Assert + Voltage Upper Non-recoverable going high"},
        {"sensor-specific", eventRecord(0x05, 0x6F, 0x00), 0x5F000000, 0, 8,
         "Assert + Physical Security General Chassis intrusion"},
        {"no row for the offset", eventRecord(0x08, 0x6F, 0x0F), 0x5F000000, 0, 5, "Assert + "},
        {"hot swap M6", eventRecord(0xF0, 0x6F, 0x06), 0x5F000000, 0, 5, "Assert + FRU Hot Swap Transition to M6"},
        {"hot swap M7 has no row", eventRecord(0xF0, 0x6F, 0x07), 0x5F000000, 0, 5, "Assert + "},
        {"OEM sensor type", eventRecord(0xC0, 0x6F, 0x00), 0x5F000000, 0, 5, "Assert + OEM"},
        {"sensor type 0, generic", eventRecord(0x00, 0x03, 0x01), 0x5F000000, 0, 5,
         "Assert + Reserved State Asserted"},
        {"OEM event type", eventRecord(0x01, 0x70, 0x00), 0x5F000000, 0, 0, ""},
        {"EvM revision 3", eventRecord(0x01, 0x01, 0x09, 0xFF, 0xFF, 0x02, 3), 0x5F000000, 6, 6, ""},
        {"type 0 counts as an event", eventRecord(0x01, 0x01, 0x00, 0xFF, 0xFF, 0x00), 0x5F000000, 5, 6,
         "Assert + Temperature Lower Non-critical going low "},  // the table's text ends in a blank
        {"OEM with time stamp", eventRecord(0x01, 0x01, 0x00, 0xFF, 0xFF, 0xD5), 0x5F000000, 5, 0, ""},
        {"OEM without time stamp", eventRecord(0x01, 0x01, 0x00, 0xFF, 0xFF, 0xE5), 0xFFFFFFFF, 5, 0, ""},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        sel_event_record r = c.record;
        IpmiSelData data(&r, 0);
        EXPECT_EQ(data.messageTimeStamp(), c.timestamp);
        EXPECT_EQ(data.severity(), c.severity);
        EXPECT_EQ(data.alertType(), c.alert);
        EXPECT_EQ(data.caption(), c.caption);
        EXPECT_EQ(data.messageFormat().empty(), !data.isSelEventRecord());
    }
    sel_event_record oem = eventRecord(0x01, 0x01, 0, 0, 0, 0xE5);
    IpmiSelData noEvent(&oem, 0);
    EXPECT_EQ(noEvent.eventType(), 0xFFFFFFFFu);
    EXPECT_EQ(noEvent.recordDataString(), "");
    EXPECT_EQ(noEvent.recordId(0), "Invalid");
    EXPECT_EQ(noEvent.recordId(7), "0007");
    EXPECT_EQ(noEvent.recordId(12345), "12345");
}

TEST(SelRecord, SummaryOfTheLog) {
    ipmiifc_sel_info info = {0, 0x51, 3, 160, 0x1FFFFFFF, 0x60000000, 0x8F};
    ipmiifc_sel_alloc_info alloc = {0, 100, 0, 97, 97, 1};
    IpmiSel sel(&info, &alloc, 0);
    EXPECT_EQ(sel.getMaxNumberOfRecords(), 13);
    EXPECT_EQ(sel.getAddTimeStampUnix(), 0u);  // counts from controller start
    EXPECT_EQ(sel.getEraseTimeStampUnix(), 0x60000000u);
    EXPECT_TRUE(sel.getOverFlowFlag());
    EXPECT_EQ(sel.getAllocationUnitSize(), 16u);  // the controller said 0
}

// ---- A controller's SEL followed through Get SEL Info ----------------------

class SelFollow : public TestSupport::SimTest {
public:
    using SimTest::bmc;
    using SimTest::sim;
    using SimTest::useBmc;

    // Logs an event as a sensor would, stamped by the controller's clock;
    // `serial` makes it unique. Returns its bytes as stored, or empty when full.
    Bytes logEvent(uint16_t serial) {
        sel_event_record r = eventRecord(0x01, 0x01, 0x07, uint8_t(serial), uint8_t(serial >> 8));
        Bytes stored;
        sim().withBmc([&](Sim::Bmc& b) {
            if (Sim::addSelRecord(b, reinterpret_cast<uint8_t*>(&r)) != 0) stored = b.sel.records.back();
        });
        return stored;
    }
    size_t heldRecords() { return IpmiIfc::getSelData().size(); }
    // The controller's own answers, bent: the third record's next ID points
    // back to the first, or the log claims 0xFFFF entries.
    void bend(bool loopBack, bool hugeCount) {
        auto standard = std::make_shared<Sim::Bmc>();
        auto answer = [standard](Sim::Bmc& b, const Sim::Request& r) {
            standard->sel = b.sel;
            return standard->handle(r);
        };
        if (loopBack)
            bmc().on(netfn::storage, cmd::getSelEntry, [answer](Sim::Bmc& b, const Sim::Request& r) {
                Sim::Response out = answer(b, r);
                if (out.size() > 4 && out[3] == 3) out[1] = 1, out[2] = 0;
                return out;
            });
        if (hugeCount)
            bmc().on(netfn::storage, cmd::getSelInfo, [answer](Sim::Bmc& b, const Sim::Request& r) {
                Sim::Response out = answer(b, r);
                out[2] = out[3] = 0xFF;
                return out;
            });
    }
    unsigned entryReads() { return sim().exchanges(netfn::storage, cmd::getSelEntry); }
};

// What a handler received, in order.
struct Received {
    std::mutex mutex;
    std::vector<Bytes> records;
    std::atomic<int> withoutRecord{0};
};

void recordIt(void* context, IpmiSelData* data) {
    auto* got = static_cast<Received*>(context);
    if (data == nullptr) {
        ++got->withoutRecord;
        return;
    }
    IpmiIfc::getSelData();  // calling back into the library from the handler
    IpmiIfc::getSensors();
    std::lock_guard<std::mutex> guard(got->mutex);
    got->records.push_back(bytesOf(data->record()));
}
// Where two record lists part, or the common length when one continues the other.
size_t firstDifference(const std::vector<Bytes>& got, const std::vector<Bytes>& expected) {
    size_t i = 0;
    while (i < got.size() && i < expected.size() && got[i] == expected[i]) ++i;
    return i == got.size() && i == expected.size() ? i : std::min(i, std::min(got.size(), expected.size()));
}

void recordItToo(void* context, IpmiSelData* data) { recordIt(context, data); }
void churning(void* context, IpmiSelData*) { ++*static_cast<std::atomic<int>*>(context); }

// Events logged one by one and in bursts while the controller's clock moves
// on, the log fills up, is cleared (record IDs start again at 1) and refills:
// every event logged after start reaches both handlers once, in order; the
// log found at start reaches none. Newness is told by time stamp, so, as on a
// real controller, a second passes between a poll and the next event.
// Meanwhile another thread registers and unregisters a handler of its own.
TEST_F(SelFollow, EveryNewRecordReachesEveryHandlerOnce) {
    IpmiIfcOpenIpmiClose(0);
    sim().withBmc([](Sim::Bmc& b) {
        b.sel.allocationUnits = 40;
        b.sel.logsClearEvent = true;
    });
    for (uint16_t i = 0; i < 5; ++i) logEvent(0xF000 + i);
    TestSupport::LoopThread loop(0);
    ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING);
    waitUntil([this] { return heldRecords() == 5; });
    sim().withBmc([](Sim::Bmc& bmc) { bmc.sel.clockOffset += 1; });
    Received a, b;
    IpmiIfc::registerSelEventHandler(recordIt, &a);
    IpmiIfc::registerSelEventHandler(recordItToo, &b);
    std::atomic<bool> done{false};
    std::atomic<int> churned{0};
    std::thread churn([&] {
        while (!done) {
            IpmiIfc::registerSelEventHandler(churning, &churned);
            IpmiIfc::unRegisterSelEventHandler(churning);  // the head: nothing else leaves
        }
    });
    auto pass = [this] {
        bool shutdown = false;
        IpmiIfc::pollAll(1, true, IPMI_POLL_NORMAL, &shutdown);
        sim().withBmc([](Sim::Bmc& bmc) { bmc.sel.clockOffset += 1; });
    };
    std::vector<Bytes> expected;
    uint32_t highest = 0;
    // What was logged is read before a clear; a marker past every stamp so far.
    auto flush = [&](uint16_t serial) {
        pass();
        sim().withBmc([&](Sim::Bmc& bmc) {
            highest = std::max(highest, bmc.sel.additionTimestamp) + 10;
            bmc.sel.clockOffset += std::max<int64_t>(0, int64_t(highest) - int64_t(Sim::selClock(bmc)));
        });
        Bytes marker = logEvent(serial);
        if (!marker.empty()) expected.push_back(marker);
        pass();
    };
    std::mt19937 rng(8);
    uint16_t serial = 0;
    int clears = 0, refused = 0;
    for (int step = 0; step < 400; ++step) {
        const unsigned action = rng() % 100;
        const unsigned burst = action < 45 ? 1 : action < 60 ? 1 + rng() % 8 : 0;
        for (unsigned i = 0; i < burst; ++i) {
            Bytes stored = logEvent(++serial);
            stored.empty() ? ++refused : (expected.push_back(stored), 0);
        }
        if (action >= 60 && action < 75) {
            const int64_t move = int64_t(rng() % 5);
            sim().withBmc([&](Sim::Bmc& bmc) { bmc.sel.clockOffset += move; });
        }
        if (action >= 97) {
            flush(++serial);
            ++clears;
            sim().withBmc([&](Sim::Bmc& bmc) {
                Sim::clearSelRecords(bmc);
                expected.push_back(bmc.sel.records.back());  // the controller's own clear event
            });
        }
        if (rng() % 3 == 0) pass();
    }
    flush(++serial);
    done = true;
    churn.join();
    EXPECT_GT(clears, 3);
    EXPECT_GT(refused, 0);  // the log was full at times
    EXPECT_EQ(firstDifference(a.records, expected), expected.size()) << a.records.size() << " received";
    EXPECT_EQ(firstDifference(b.records, expected), expected.size());
    EXPECT_GT(churned.load() + a.withoutRecord.load(), 0);
}

void unregisterOther(void*, IpmiSelData*) { IpmiIfc::unRegisterSelEventHandler(churning); }
void unregisterSelf(void*, IpmiSelData*) { IpmiIfc::unRegisterSelEventHandler(unregisterSelf); }

// A handler that another one unregisters in the same walk is not called
// after that; one that unregisters itself returns normally.
TEST_F(SelFollow, UnregisteredHandlersAreNotCalledLater) {
    std::atomic<int> calls{0};
    IpmiIfc::registerSelEventHandler(churning, &calls);
    IpmiIfc::registerSelEventHandler(unregisterSelf, nullptr);
    IpmiIfc::registerSelEventHandler(unregisterOther, nullptr);
    IpmiIfcSelCallHandlers(nullptr);  // list: unregisterOther, unregisterSelf, churning
    EXPECT_EQ(calls.load(), 0);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(unregisterSelf), 2);
    EXPECT_EQ(IpmiIfc::unRegisterSelEventHandler(unregisterOther), 0);
}

struct Gate {
    std::atomic<bool> inside{false}, release{false}, finished{false};
};
void blocking(void* context, IpmiSelData*) {
    auto* g = static_cast<Gate*>(context);
    g->inside = true;
    waitUntil([g] { return g->release.load(); });
    g->finished = true;
}

// A provider may free its context as soon as unregistering returns.
TEST_F(SelFollow, UnregisterWaitsForTheRunningCall) {
    Gate gate;
    IpmiIfc::registerSelEventHandler(blocking, &gate);
    std::thread walk([] { IpmiIfcSelCallHandlers(nullptr); });
    waitUntil([&] { return gate.inside.load(); });
    std::atomic<bool> sawFinished{false};
    std::thread unregister([&] {
        IpmiIfc::unRegisterSelEventHandler(blocking);
        sawFinished = gate.finished.load();
    });
    Sim::realSleepNs(20000000);
    gate.release = true;
    unregister.join();
    walk.join();
    EXPECT_TRUE(sawFinished.load());
}

// Every ID names a record, and every record has a next one.
Sim::Response endlessChain(Sim::Bmc&, const Sim::Request& r) {
    const uint16_t id = sel::le16(r.data.data() + sel::entryRequest::recordId);
    const uint16_t own = id == 0 ? 1 : id;
    Sim::Response out{cc::ok, uint8_t(own + 1), uint8_t((own + 1) >> 8)};
    sel_event_record e = eventRecord(0x01, 0x01, 0x07);
    sel::putLe16(e.record_id, own);
    const Bytes bytes = bytesOf(e);
    out.insert(out.end(), bytes.begin(), bytes.end());
    return out;
}

// Controllers that answer badly: every pass ends within its bounds (four
// attempts a chunk and a retry budget for the whole pass, one request per
// record the log claims plus one, at most 4,096 records) and no record is
// held twice; the reload never asks Get SEL Info again from within itself.
TEST_F(SelFollow, HostileAnswersEndWithinBounds) {
    for (uint16_t i = 1; i <= 5; ++i) logEvent(i);
    auto fault = [this](const Sim::Fault& f) { sim().addFault(netfn::storage, cmd::getSelEntry, f); };
    const struct {
        const char* what;
        std::function<void()> spoil;
        size_t held;
        unsigned maxEntryReads;
    } scenes[] = {
        {"next ID points back", [this] { bend(true, false); }, 3, 5},
        {"count of 0xFFFF", [this] { bend(false, true); }, 5, 6},
        {"answers cut short", [&] { fault(Sim::Fault::answerLength(Sim::FaultKind::CutAnswer, 12, -1)); }, 0, 4 * 6},
        {"answers too long", [&] { fault(Sim::Fault::answerLength(Sim::FaultKind::LongAnswer, 30, -1)); }, 0, 4 * 6},
        {"reservation always cancelled", [&] { fault(Sim::Fault::completionCode(cc::reservationCancelled, -1)); }, 0,
         24},
        {"busy for ever", [&] { fault(Sim::Fault::completionCode(cc::nodeBusy, -1)); }, 0, 24},
        {"next IDs that never end, 0xFFFF entries claimed",
         [this] {
             bmc().on(netfn::storage, cmd::getSelEntry, endlessChain);
             bend(false, true);
         },
         4096, 4097},
        {"version 0, erased at every answer",
         [this] {
             auto standard = std::make_shared<Sim::Bmc>();
             bmc().sel.version = 0;
             bmc().on(netfn::storage, cmd::getSelInfo, [standard](Sim::Bmc& b, const Sim::Request& r) {
                 b.sel.eraseTimestamp += 1;
                 standard->sel = b.sel;
                 return standard->handle(r);
             });
         },
         0, 0},
    };
    for (uint32_t erase : {0u, 1000u}) {  // the first read: incremental from record 0, or a reload
        for (const auto& s : scenes) {
            SCOPED_TRACE(std::string(s.what) + (erase ? ", reload" : ", incremental"));
            InitIpmiNode(0);
            sim().clearFaults();
            Sim::registerSelHandlers(bmc());
            sim().withBmc([&](Sim::Bmc& b) {
                b.sel.eraseTimestamp = erase;
                b.sel.version = sel::supportedVersion;
            });
            s.spoil();
            sim().resetCounters();
            EXPECT_EQ(IpmiIfcSelGetInfo(0, nullptr), 0u);
            EXPECT_EQ(heldRecords(), s.held);
            EXPECT_LE(entryReads(), s.maxEntryReads);
        }
    }
    // Command-line mode reloads at every call: version 0 ends there too.
    ASSERT_EQ(IpmiIfcInitForCLI(0), 0);
    EXPECT_EQ(IpmiIfcSelGetInfo(0, nullptr), 0u);
    IpmiIfcCloseForCLI(0);
}

// The smaller promises, one scene: an empty log and a bad version
// fail the reload (the version message once per process); a clear whose
// erasure is still in progress succeeds; the last-processed ID and the
// clock go to the controller; the property line names the cached sensor.
TEST_F(SelFollow, ControllerOperations) {
    useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
    sim().withBmc([](Sim::Bmc& b) { b.sel.eraseTimestamp = 1; });
    EXPECT_EQ(IpmiIfcSelGetInfo(0, nullptr), 0u);
    ASSERT_EQ(heldRecords(), 8u);
    sel_event_record example = eventRecord(0x01, 0x01, 0x59);
    EXPECT_EQ(IpmiSelData(&example, 0).recordDataString(), "*48.0.32*2 1*2*0 0 0 95*32 0*4*1*48*false*1*89*255*255*1*");

    bmc().sel.lastProcessedBySoftware = 0xFFFF;
    EXPECT_EQ(IpmiIfc::getLastProcessedSELEntry(), 0);
    IpmiIfc::setLastProcessedSELEntry(7);
    EXPECT_EQ(IpmiIfc::getLastProcessedSELEntry(), 7);
    const uint32_t clock = Sim::selClock(bmc());
    EXPECT_GE(IpmiIfc::GetSelClock(), clock);
    EXPECT_TRUE(node().isOpen);  // the clock used a descriptor of its own

    bmc().on(netfn::storage, cmd::clearSel, [](Sim::Bmc& b, const Sim::Request&) {
        Sim::clearSelRecords(b);
        return Sim::Response{cc::ok, sel::clearAnswer::inProgress};
    });
    EXPECT_EQ(IpmiIfc::clearSel(), IpmiIfc::SEL_CLEAR_OK);
    EXPECT_TRUE(log.contains(LOG_ERR, "IpmiIfcSelGetAll: node 0 no record count"));
    EXPECT_EQ(heldRecords(), 0u);

    bmc().sel.version = 0x01;
    logEvent(1);
    bmc().sel.eraseTimestamp += 1;
    EXPECT_EQ(IpmiIfcSelGetInfo(0, nullptr), 0u);
    bmc().sel.eraseTimestamp += 1;
    EXPECT_EQ(IpmiIfcSelGetInfo(0, nullptr), 0u);
    EXPECT_EQ(log.count("IpmiIfcSelGetAll: invalid version. Version = 0x1"), 1u);
    EXPECT_EQ(heldRecords(), 0u);
}

// ---- Over time: clocks, storms, wrapping logs, handlers that misbehave -------

// A scene starts with a log of three records found at start, then logs
// events and runs passes; whatever happens, a recording handler gets every
// record logged after start once, in log order. The SEL clock stands still
// unless a scene moves it, so events share seconds as in a storm.
class SelOverTime : public SelFollow {
public:
    void begin(std::function<void(Sim::Bmc&)> setUp = nullptr) {
        IpmiIfcSelCleanUpEventHandlers(0);
        useBmc(std::make_shared<Sim::Bmc>());
        sim().clearFaults();
        InitIpmiNode(0);
        logged.clear();
        got.records.clear();
        sim().withBmc([&](Sim::Bmc& b) {
            b.sel.frozenClock = 0x60000000;
            if (setUp) setUp(b);
        });
        for (uint16_t i = 0; i < 3; ++i) logEvent(0xF000 + i);
        pass();
        IpmiIfc::registerSelEventHandler(recordIt, &got);
    }
    void pass() { IpmiIfcSelGetInfo(0, nullptr); }
    void tick(int64_t seconds = 1) {
        sim().withBmc([&](Sim::Bmc& b) { b.sel.frozenClock = uint32_t(int64_t(b.sel.frozenClock) + seconds); });
    }
    void event() {
        Bytes stored = logEvent(++serial);
        ASSERT_FALSE(stored.empty());
        logged.push_back(stored);
    }
    // The records logged as the controller stores them, found by ID.
    void loggedByController(Sim::Bmc& b) { logged.push_back(b.sel.records.back()); }

    std::vector<Bytes> logged;
    Received got;
    uint16_t serial = 0;
};

int clearedOnce = 0;
void clearing(void*, IpmiSelData* record) {
    if (record != nullptr && clearedOnce++ == 0) IpmiIfc::clearSel();
}
void throwing(void*, IpmiSelData* record) {
    if (record != nullptr) throw std::runtime_error("handler failed");
}

TEST_F(SelOverTime, EveryRecordLoggedAfterStartReachesTheHandlersOnce) {
    const struct {
        const char* what;
        std::function<void(SelOverTime&)> run;
    } scenes[] = {
        {"events within the second of the last answer",
         [](SelOverTime& t) {
             t.event(), t.pass(), t.event(), t.pass(), t.event(), t.event(), t.pass();
         }},
        {"an event logged while a pass reads, a second later",
         [](SelOverTime& t) {
             bool once = false;
             auto standard = std::make_shared<Sim::Bmc>();
             t.bmc().on(netfn::storage, cmd::getSelEntry, [&, standard](Sim::Bmc& b, const Sim::Request& r) {
                 standard->sel = b.sel;
                 Sim::Response out = standard->handle(r);
                 if (!once) {
                     once = true;
                     b.sel.frozenClock += 1;
                     sel_event_record e = eventRecord(0x01, 0x01, 0x07, 0x55, 0x55);
                     Sim::addSelRecord(b, reinterpret_cast<uint8_t*>(&e));
                     t.loggedByController(b);
                 }
                 return out;
             });
             t.tick(), t.event(), t.pass();
             Sim::registerSelHandlers(t.bmc());
             t.pass(), t.tick(), t.event(), t.pass();
         }},
        {"the clock set back an hour",
         [](SelOverTime& t) {
             t.tick(5), t.event(), t.pass();
             t.tick(-3600);
             for (int i = 0; i < 3; ++i) t.tick(), t.event(), t.pass();
         }},
        {"a full log that overwrites its oldest records, the last read among them",
         [](SelOverTime& t) {
             // Four records fit: four events a pass overwrite the last one read.
             t.bmc().sel.allocationUnits = 4;
             t.bmc().sel.circular = true;
             for (int p = 0; p < 3; ++p) {
                 for (int i = 0; i < 4; ++i) t.tick(), t.event();
                 t.pass();
             }
         }},
        {"a read that fails mid-pass",
         [](SelOverTime& t) {
             for (int i = 0; i < 3; ++i) t.tick(), t.event();
             // The first read (the record last held) and the next pass; the four after it are busy.
             Sim::Bmc& b = t.bmc();
             int reads = 0;
             auto standard = std::make_shared<Sim::Bmc>();
             b.on(netfn::storage, cmd::getSelEntry, [&reads, standard](Sim::Bmc& m, const Sim::Request& r) {
                 standard->sel = m.sel;
                 return ++reads >= 3 && reads <= 6 ? Sim::Response{cc::nodeBusy} : standard->handle(r);
             });
             t.pass();
             Sim::registerSelHandlers(b);
             t.pass(), t.pass(), t.tick(), t.event(), t.pass();
         }},
        {"a handler that clears the log",
         [](SelOverTime& t) {
             t.bmc().sel.logsClearEvent = true;
             clearedOnce = 0;
             IpmiIfc::registerSelEventHandler(clearing, nullptr);
             for (int i = 0; i < 4; ++i) t.tick(), t.event();
             t.pass();
             t.sim().withBmc([&](Sim::Bmc& b) { t.logged.push_back(b.sel.records.front()); });
             t.pass(), t.tick(), t.event(), t.pass();
         }},
        {"a handler that throws",
         [](SelOverTime& t) {
             IpmiIfc::registerSelEventHandler(throwing, nullptr);
             for (int i = 0; i < 4; ++i) t.tick(), t.event();
             t.pass(), t.tick(), t.event(), t.pass();
         }},
    };
    for (const auto& s : scenes) {
        SCOPED_TRACE(s.what);
        begin();
        s.run(*this);
        EXPECT_EQ(got.records, logged);
        IpmiIfc::unRegisterSelEventHandler(clearing);
        IpmiIfc::unRegisterSelEventHandler(throwing);
    }
}

// A caller that restarts hands the library the last record it received:
// the first pass delivers what followed it, once a handler is there; a
// cursor whose record is gone falls back to its time stamp.
TEST_F(SelOverTime, DeliveryResumesAfterTheCursor) {
    for (bool cleared : {false, true}) {
        SCOPED_TRACE(cleared ? "cursor record cleared" : "cursor record present");
        begin();
        for (int i = 0; i < 3; ++i) tick(), event();
        pass();
        ASSERT_EQ(got.records.size(), 3u);
        const auto held = IpmiIfc::getSelData();
        const IpmiSelCursor cursor = IpmiSelCursor::at(*held[held.size() - 2]);  // the second new record
        IpmiIfcSelCleanUpEventHandlers(0);
        InitIpmiNode(0);  // the caller restarts
        std::vector<Bytes> missed(logged.end() - 1, logged.end());
        if (cleared) {
            sim().withBmc([](Sim::Bmc& b) { Sim::clearSelRecords(b); });
            missed.clear();
        }
        for (int i = 0; i < 2; ++i) {
            tick(), event();
            missed.push_back(logged.back());
        }
        IpmiIfc::resumeSelDelivery(0, cursor);
        got.records.clear();
        pass();  // no handler yet: the records wait
        IpmiIfc::registerSelEventHandler(recordIt, &got);
        pass(), tick(), event(), pass();
        missed.push_back(logged.back());
        EXPECT_EQ(got.records, missed);
    }
}

// ---- Direct synchroniser ---------------------------------------------------

class SelSync : public SelFollow {
protected:
    std::vector<uint16_t> sync(bool expectOk = true) {
        Event_log* records = nullptr;
        int n = -1;
        EXPECT_EQ(sync_device_eventlog(&records, &n, &state), expectOk);
        std::vector<uint16_t> ids;
        for (int i = 0; i < n; ++i) ids.push_back(sel::le16(records[i].record_id));
        free(records);
        return ids;
    }
    void later() { sim().withBmc([](Sim::Bmc& b) { b.sel.clockOffset += 5; }); }
    sel_state state = {};
};

TEST_F(SelSync, ReportsWhatWasAddedSinceTheLastCall) {
    for (uint16_t i = 1; i <= 5; ++i) logEvent(i);
    EXPECT_EQ(sync(), (std::vector<uint16_t>{1, 2, 3, 4, 5}));
    EXPECT_EQ(state.lastRecordId, 5);
    EXPECT_TRUE(sync().empty());  // nothing logged since
    later();
    logEvent(6), logEvent(7);
    EXPECT_EQ(sync(), (std::vector<uint16_t>{6, 7}));

    later();
    logEvent(8);
    sim().addFault(netfn::storage, cmd::getSelEntry, Sim::Fault::completionCode(cc::reservationCancelled));
    EXPECT_TRUE(sync(false).empty());
    EXPECT_EQ(state.lastRecordId, 7);  // as it was
    EXPECT_EQ(sync(), (std::vector<uint16_t>{8}));

    later();
    sim().withBmc([](Sim::Bmc& b) { Sim::clearSelRecords(b); });
    logEvent(9), logEvent(10);
    EXPECT_EQ(sync(), (std::vector<uint16_t>{1, 2}));  // a full load after the erase

    later();
    sim().withBmc([](Sim::Bmc& b) { b.sel.allocationUnits = 3; });
    logEvent(11);  // the log is full now, and its addition stamp moved
    EXPECT_EQ(sync(), (std::vector<uint16_t>{1, 2, 3}));
    EXPECT_TRUE(log.contains(LOG_INFO, "count_events: Full SEL, add timestamp changed, full load req'd"));

    // IDs that do not follow the last one: n + 1 requests, nothing loaded.
    later();
    sim().withBmc([](Sim::Bmc& b) {
        b.sel.allocationUnits = 100;
        b.sel.nextRecordId = 50;
    });
    logEvent(12), logEvent(13);
    sim().resetCounters();
    EXPECT_TRUE(sync().empty());
    EXPECT_EQ(entryReads(), 3u);
}


// The synchroniser's own transport and bounds: a device that reports an
// error ends the wait; a refused reservation fails the call and keeps the
// state; a log that claims without end, or answers only with completion
// codes, costs a bounded number of exchanges a call.
TEST_F(SelSync, FailsAndEndsWithinBounds) {
    for (uint16_t i = 1; i <= 3; ++i) logEvent(i);
    sim().addFault(netfn::storage, cmd::getSelInfo, Sim::Fault::of(Sim::FaultKind::PollError));
    EXPECT_TRUE(sync(false).empty());
    EXPECT_EQ(sim().pollErrorsReported(), 1u);
    const auto lines = log.lines();
    EXPECT_EQ(std::count_if(lines.begin(), lines.end(),
                            [](const TestSupport::LogLine& l) {
                                return l.text.rfind("recv_reply: poll(", 0) == 0 &&
                                       l.text.find(") reports a device error (revents 0x8)") != std::string::npos;
                            }),
              1);

    sim().addFault(netfn::storage, cmd::reserveSel, Sim::Fault::completionCode(cc::invalidCommand));
    sim().resetCounters();
    EXPECT_TRUE(sync(false).empty());
    EXPECT_EQ(entryReads(), 0u);
    EXPECT_EQ(state.lastRecordId, 0);
    EXPECT_EQ(sync(), (std::vector<uint16_t>{1, 2, 3}));

    bend(false, true);  // 0xFFFF entries
    const struct {
        const char* what;
        std::function<void()> spoil;
        unsigned maxEntryReads;
    } scenes[] = {
        {"only completion codes", [this] { sim().addFault(netfn::storage, cmd::getSelEntry, Sim::Fault::completionCode(cc::unspecifiedError, -1)); }, 16},
        {"next IDs that never end", [this] { bmc().on(netfn::storage, cmd::getSelEntry, endlessChain); }, 4096},
    };
    for (const auto& s : scenes) {
        SCOPED_TRACE(s.what);
        sim().clearFaults();
        s.spoil();
        later();
        logEvent(9);
        sim().resetCounters();
        sync();
        EXPECT_LE(entryReads(), s.maxEntryReads);
    }
}

}  // namespace
