// A long run against a controller that misbehaves in every way a real one
// does over time, with an oracle that knows every record it logged: single
// events and storms (some while a pass reads), a full log with and without
// overwriting, clears by another client, the clock jumping both ways, lost
// and busy answers, a controller restart, and handlers that register,
// unregister, clear the log and throw. Every record logged after start that
// the controller still held when a pass could read it reaches the steady
// handlers once, in log order. TAV_IPMI_SOAK_EVENTS sets the length
// (scripts/sel-soak.sh runs 100,000); the figures go to standard output.

#include <stdio.h>
#include <stdlib.h>

#include <map>
#include <random>
#include <set>

#include "IpmiIfcSel.h"
#include "SelLayout.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using Bytes = std::vector<uint8_t>;

struct Handler {
    std::vector<Bytes> got;
    int throwEvery = 0;
};

void steady(void* context, IpmiSelData* record) {
    auto* h = static_cast<Handler*>(context);
    if (record == nullptr) return;
    const auto* p = reinterpret_cast<const uint8_t*>(&record->record());
    h->got.emplace_back(p, p + 16);
    if (h->throwEvery && h->got.size() % h->throwEvery == 0) throw std::runtime_error("handler failed");
}
void steadyToo(void* context, IpmiSelData* record) { steady(context, record); }
void churning(void* context, IpmiSelData* record) { steady(context, record); }
std::atomic<int> clearsAsked{0};
void clearing(void*, IpmiSelData* record) {
    if (record != nullptr && clearsAsked.exchange(0) > 0) IpmiIfc::clearSel();
}

class SelSoak : public TestSupport::SimTest {
protected:
    // Records as the controller logged them, and whether a read served each.
    std::vector<Bytes> logged;
    std::set<Bytes> served, droppedUnread;
    std::mt19937 rng{20261125};
    unsigned events = 0, storms = 0, clears = 0, overwrites = 0, jumps = 0, restarts = 0, faults = 0;

    unsigned chance(unsigned n) { return rng() % n; }

    void logEvent(Sim::Bmc& b) {
        uint8_t r[16] = {0, 0, 0x02, 0, 0, 0, 0, 0x20, 0x00, 0x04, 0x01, 0x30, 0x01, 0x07,
                         uint8_t(events), uint8_t(events >> 8)};
        r[11] = uint8_t(events >> 16);
        if (b.sel.circular && b.sel.records.size() >= b.sel.allocationUnits) dropOldest(b);
        if (Sim::addSelRecord(b, r) == 0) return;  // full: the controller refuses it
        logged.push_back(b.sel.records.back());
        ++events;
    }
    void dropOldest(Sim::Bmc& b) {
        ++overwrites;
        if (!served.count(b.sel.records.front())) droppedUnread.insert(b.sel.records.front());
    }
    // A record with the ID and bytes of one before a clear cannot be told
    // from it by any reader: each clear happens in a second of its own, so
    // the controller's clear events differ.
    void clearLog(Sim::Bmc& b) {
        ++clears;
        b.sel.frozenClock = 0x70000000 + clears;
        for (const auto& r : b.sel.records)
            if (!served.count(r)) droppedUnread.insert(r);
        Sim::clearSelRecords(b);
        if (!b.sel.records.empty()) logged.push_back(b.sel.records.back());  // the clear event
    }

    // The controller's SEL commands, with storms while a pass reads and
    // clears (a handler's own included) accounted for.
    void instrument() {
        auto standard = std::make_shared<Sim::Bmc>();
        bmc().on(netfn::storage, cmd::getSelEntry, [this, standard](Sim::Bmc& b, const Sim::Request& r) {
            standard->sel = b.sel;
            Sim::Response out = standard->handle(r);
            b.sel.reservation = standard->sel.reservation;
            if (out.size() == 19) {
                const uint16_t id = sel::le16(out.data() + 3);
                for (const auto& rec : b.sel.records)
                    if (sel::le16(rec.data()) == id) served.insert(rec);
            }
            if (chance(60) == 0) {
                ++storms;
                for (unsigned i = 1 + chance(8); i > 0; --i) logEvent(b);
            }
            return out;
        });
        bmc().on(netfn::storage, cmd::clearSel, [this, standard](Sim::Bmc& b, const Sim::Request& r) {
            standard->sel = b.sel;
            Sim::Response out = standard->handle(r);
            if (out.size() > 1 && out[0] == 0) {
                b.sel.reservation = standard->sel.reservation;
                clearLog(b);
            }
            return out;
        });
    }

    static unsigned soakEvents() {
        const char* v = getenv("TAV_IPMI_SOAK_EVENTS");
        return v ? static_cast<unsigned>(strtoul(v, nullptr, 10)) : 3000;
    }

    // Records a steady handler should have: logged after start, minus those
    // the controller dropped before any read could see them.
    std::vector<Bytes> deliverable(size_t from) const {
        std::vector<Bytes> out;
        for (size_t i = from; i < logged.size(); ++i)
            if (!droppedUnread.count(logged[i])) out.push_back(logged[i]);
        return out;
    }
};

// Lost and repeated records of one handler against what it should have.
struct Tally {
    size_t delivered = 0, lost = 0, repeated = 0;
    bool inOrder = true;
};
Tally tally(const std::vector<Bytes>& got, const std::vector<Bytes>& expected) {
    Tally t;
    t.delivered = got.size();
    std::map<Bytes, long> balance;  // received minus expected, per record
    for (const auto& r : got) ++balance[r];
    for (const auto& r : expected) --balance[r];
    for (const auto& [record, n] : balance) (n > 0 ? t.repeated : t.lost) += static_cast<size_t>(n > 0 ? n : -n);
    t.inOrder = got == expected;
    return t;
}

TEST_F(SelSoak, NoRecordLostOrRepeated) {
    sim().withBmc([](Sim::Bmc& b) {
        b.sel.allocationUnits = 200;
        b.sel.logsClearEvent = true;
        b.sel.frozenClock = 0x60000000;
    });
    instrument();
    sim().withBmc([this](Sim::Bmc& b) {
        for (int i = 0; i < 20; ++i) logEvent(b);
    });
    IpmiIfcSelGetInfo(0, nullptr);  // the log found at start
    const size_t start = logged.size();
    Handler a, b, churn;
    b.throwEvery = 7;
    IpmiIfc::registerSelEventHandler(steady, &a);
    IpmiIfc::registerSelEventHandler(clearing, nullptr);
    IpmiIfc::registerSelEventHandler(steadyToo, &b);
    const unsigned target = soakEvents();
    sim().resetCounters();
    while (events < target) {
        const unsigned action = chance(100);
        sim().withBmc([&](Sim::Bmc& m) {
            if (action < 50) {
                logEvent(m);
            } else if (action < 58) {
                ++storms;
                for (unsigned i = 2 + chance(30); i > 0; --i) logEvent(m);
            } else if (action < 62) {
                ++jumps;
                m.sel.frozenClock = uint32_t(int64_t(m.sel.frozenClock) + (chance(2) ? 3600 : -3600));
            } else if (action < 63) {
                clearLog(m);  // another client
            } else if (action < 64) {
                m.sel.circular = !m.sel.circular;
            } else if (action < 65) {
                ++restarts;  // reservations lost, the clock back to an early value
                m.sel.reservation = 0;
                m.sel.frozenClock = 0x10000000 + chance(1000);
            }
            if (chance(4) == 0) m.sel.frozenClock += 1;
        });
        if (action >= 65 && action < 69) {
            ++faults;
            static const Sim::Fault kinds[] = {Sim::Fault::completionCode(cc::nodeBusy),
                                               Sim::Fault::of(Sim::FaultKind::NoAnswer),
                                               Sim::Fault::completionCode(cc::reservationCancelled)};
            sim().addFault(netfn::storage, chance(3) ? cmd::getSelEntry : cmd::getSelInfo, kinds[chance(3)]);
        }
        if (action == 69) clearsAsked = 1;
        if (action == 70) IpmiIfc::registerSelEventHandler(churning, &churn);
        if (action == 71) IpmiIfc::unRegisterSelEventHandler(churning);
        if (chance(3) == 0) IpmiIfcSelGetInfo(0, nullptr);
    }
    sim().clearFaults();
    for (int i = 0; i < 4; ++i) IpmiIfcSelGetInfo(0, nullptr);  // read what is left

    const auto expected = deliverable(start);
    const Tally ta = tally(a.got, expected), tb = tally(b.got, expected), tc = tally(churn.got, {});
    printf("soak: %u events (%u storms, %u clears, %u overwrites, %u clock jumps, %u restarts, %u faults), "
           "%zu deliverable, %zu dropped unread by the controller; %.2f exchanges per event\n",
           events, storms, clears, overwrites, jumps, restarts, faults, expected.size(), droppedUnread.size(),
           double(sim().totalExchanges()) / events);
    printf("soak: handler A delivered %zu, lost %zu, repeated %zu; handler B (throws) delivered %zu, lost %zu, "
           "repeated %zu; churning handler delivered %zu\n",
           ta.delivered, ta.lost, ta.repeated, tb.delivered, tb.lost, tb.repeated, tc.delivered);
    EXPECT_GT(clears, 0u);
    EXPECT_GT(overwrites, 0u);
    EXPECT_EQ(ta.lost + ta.repeated + tb.lost + tb.repeated, 0u);
    EXPECT_EQ(std::set<Bytes>(churn.got.begin(), churn.got.end()).size(), churn.got.size());
    EXPECT_TRUE(ta.inOrder && tb.inOrder);
}

}  // namespace
