// FRU inventory: Read FRU Data against a refusing, busy or lying controller;
// field and record decoding; the discovery pass on the simulated server.

#include <atomic>
#include <thread>

#include "FruLayout.h"
#include "SdrLayout.h"
#include "IpmiFru.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

using Bytes = std::vector<uint8_t>;
using Sim::Fault;
using Sim::FaultKind;
constexpr uint32_t kFailed = 0xFFFFFFFFu;
constexpr uint8_t st = netfn::storage;
Sim::Simulator& faults() { return Sim::Simulator::instance(); }
// Lets this many requests through untouched before the next fault rule applies.
Fault passThrough(int times) { return Fault::answerLength(FaultKind::CutAnswer, 255, times); }

class Fru : public TestSupport::SimTest {
protected:
    void SetUp() override {
        SimTest::SetUp();
        fru_max_req_size = 23;
        node().fruState = {};
        for (size_t i = 0; i < image.size(); ++i) image[i] = static_cast<uint8_t>(i * 7 + 1);
        bmc().fru.devices[1].data = image;
    }
    unsigned read(unsigned want, Bytes* out = nullptr, uint8_t word = 0) {
        Bytes buffer(want);
        unsigned length = want;
        const unsigned rc = IpmiIfcReadFru(0, 1, word, 0, &length, buffer.data());
        buffer.resize(length);
        if (out) *out = buffer;
        return rc;
    }
    void serveDefaultServer(const Bytes& extraRecord = {}) {
        useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
        if (!extraRecord.empty()) bmc().sdr.records.push_back(extraRecord);
        ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    }
    Bytes image = Bytes(64);
};

TEST_F(Fru, ReadFruDataShrinksRetriesAndGivesUp) {
    const struct {
        const char* name;
        std::function<void(Sim::Bmc&)> scene;
        unsigned rc;
        int sizeAfter;
        double seconds;  // virtual time the read took
        std::vector<std::string> lines;
    } cases[] = {
        {"0xCA above 16 bytes: the size steps down to 16", [](Sim::Bmc& b) { b.fru.devices[1].maxReadBytes = 16; },
         0, 16, 0, {"IpmiIfcReadFru: Command failed with 0xca, retrying with smaller buffer (0x10)"}},
        {"0xCA even at 9: ends at 8 with the code",
         [](Sim::Bmc&) { faults().addFault(st, cmd::readFruData, Fault::completionCode(cc::cannotReturnRequestedBytes, -1)); },
         cc::cannotReturnRequestedBytes, 8, 0,
         {"IpmiIfcReadFru: Command failed with 0xca, retrying with smaller buffer (0x8)",
          "IpmiIfcReadFru: deviceID = 0x1, bytes left to read = 64", "IpmiIfcReadFru: Failed during send cc = 0xca"}},
        {"a time-out on the first chunk returns at once",
         [](Sim::Bmc&) { faults().addFault(st, cmd::readFruData, Fault::completionCode(cc::timeout)); }, cc::timeout, 23, 0,
         {"IpmiIfcReadFru: Failed during send cc = 0xc3"}},
        {"time-outs after a good chunk: retried after 1, 2, 3, 4 seconds",
         [](Sim::Bmc&) {
             faults().addFault(st, cmd::readFruData, passThrough(1));
             faults().addFault(st, cmd::readFruData, Fault::completionCode(cc::nodeBusy, 4));
         },
         0, 23, 10, {"IpmiIfcReadFru: Timeout on 0x1 cc=0xc0 after reading some data... retrying 4"}},
        {"a fifth time-out ends the read",
         [](Sim::Bmc&) {
             faults().addFault(st, cmd::readFruData, passThrough(1));
             faults().addFault(st, cmd::readFruData, Fault::completionCode(cc::timeout, 5));
         },
         cc::timeout, 23, 10, {"IpmiIfcReadFru: deviceID = 0x1, bytes left to read = 41"}},
        {"a count above the chunk fails the read",
         [](Sim::Bmc& b) { b.on(st, cmd::readFruData, [](Sim::Bmc&, const Sim::Request&) {
                          Sim::Response r{0, 24};
                          r.resize(26, 0x55);
                          return r;
                      }); },
         kFailed, 23, 0,
         {"IpmiIfcReadFru: Response payload larger than expected (corrupt?) datalen: 0x1a, data[1]: 0x18 > 0x17"}},
        {"an answer shorter than its own count fails the read",
         [](Sim::Bmc& b) { b.on(st, cmd::readFruData, [](Sim::Bmc&, const Sim::Request&) {
                          return Sim::Response{0, 5, 1, 2};
                      }); },
         kFailed, 23, 0, {"IpmiIfcReadFru: Response shorter than its count (corrupt?) datalen: 0x4, data[1]: 0x5"}},
        {"answers without data end the read",
         [](Sim::Bmc& b) { b.on(st, cmd::readFruData, [](Sim::Bmc&, const Sim::Request&) {
                          return Sim::Response{0, 0};
                      }); },
         kFailed, 23, 0, {"IpmiIfcReadFru: deviceID = 0x1 returned no data at offset 0"}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        log.clear();
        c.scene(bmc());
        const double before = virtualSecondsElapsed();
        Bytes got;
        EXPECT_EQ(read(64, &got), c.rc);
        EXPECT_EQ(fru_max_req_size, c.sizeAfter);
        EXPECT_NEAR(virtualSecondsElapsed() - before, c.seconds, 0.5);
        if (c.rc == 0) {
            EXPECT_EQ(got, image);
        }
        for (const auto& line : c.lines) EXPECT_TRUE(log.contains(LOG_INFO, line)) << log.dump();
        TearDown();
        SetUp();
    }
}

TEST_F(Fru, AMultiRecordChainWithoutEndStopsAtTheInventoryEnd) {
    // Seven 8-byte records from offset 8, none marked last, fill the device.
    for (size_t at = 8; at < image.size(); at += 8) {
        const Bytes record{0xC0, 0x02, 3, 0, static_cast<uint8_t>(0x100 - 0xC5), 1, 2, 3};
        std::copy(record.begin(), record.end(), image.begin() + static_cast<long>(at));
    }
    bmc().fru.devices[1].data = image;
    node().fruState.area_info[1] = 64;
    EXPECT_EQ(IpmiIfcFruMultiLength(0, 1, 8), 56u);
    EXPECT_EQ(sim().exchanges(st, cmd::readFruData), 7u);
    EXPECT_TRUE(log.contains(LOG_INFO, "IpmiIfcFruMultiLength: no end of list before offset 0x40"));
}

TEST_F(Fru, AChainOfTinyRecordsEndsAfterABoundedNumber) {
    image.assign(8 + 6 * 300, 0);
    for (size_t at = 8; at + 6 <= image.size(); at += 6) {
        const Bytes record{0xC0, 0x02, 1, 0xFF, static_cast<uint8_t>(0x100 - 0xC3), 1};
        std::copy(record.begin(), record.end(), image.begin() + static_cast<long>(at));
    }
    bmc().fru.devices[1].data = image;
    node().fruState.area_info[1] = static_cast<uint8_t>(image.size() & 0xFF);
    node().fruState.area_info[2] = static_cast<uint8_t>(image.size() >> 8);
    EXPECT_EQ(IpmiIfcFruMultiLength(0, 1, 8), 255u * 6);
    EXPECT_EQ(sim().exchanges(st, cmd::readFruData), 255u);
}

TEST_F(Fru, WordAccessAsksForWords) {
    bmc().fru.devices[1].wordAccess = true;
    read(23, nullptr, 1);
    ASSERT_FALSE(sim().requests().empty());
    EXPECT_EQ(sim().requests()[0].data, (Bytes{1, 0, 0, 12}));
}

// The k-th character of a 6-bit packed field: bits 6k..6k+5 of the bytes read
// as one little-endian bit stream, plus 0x20.
std::string sixBitReference(const Bytes& packed, unsigned chars) {
    std::string s;
    for (unsigned k = 0; k < chars; ++k) {
        unsigned v = 0;
        for (unsigned b = 0; b < 6; ++b) {
            const unsigned bit = 6 * k + b;
            if (packed[bit / 8] & (1u << (bit % 8))) v |= 1u << b;
        }
        s += static_cast<char>(v + 0x20);
    }
    return s + '\0';
}

TEST(FruArea, SixBitFieldsOfEveryLength) {
    for (unsigned length = 0; length < 64; ++length) {
        Bytes area{1, 0, 0, static_cast<uint8_t>(0x80 | length)};
        for (unsigned i = 0; i < length; ++i) area.push_back(static_cast<uint8_t>(i * 37 + 11));
        const IpmiFruProduct product(static_cast<unsigned>(area.size()), area.data());
        const Bytes packed(area.begin() + 4, area.end());
        EXPECT_EQ(product.getFruAreaString(3), sixBitReference(packed, length * 4 / 3)) << length;
    }
    // "DELL" as Dell packs it: the NUL after it goes with trimming.
    const Bytes dell{1, 2, 0, 0x83, 0x64, 0xC9, 0xB2, 0xC1, 0, 0, 0, 0, 0, 0, 0, 0};
    EXPECT_EQ(IpmiFruProduct(16, dell.data()).getManufacturer(), "DELL");
}

TEST(FruArea, GettersFallBackToTheirDefaults) {
    // Board: manufacturer's type/length byte is the end mark; date 0 minutes.
    const Bytes board{1, 1, 0, 0, 0, 0, 0xC1, 0};
    const IpmiFruBoard b(8, board.data());
    EXPECT_EQ(b.getManufacturer(), "n/a");
    EXPECT_EQ(b.getName(), "");
    EXPECT_EQ(b.getSerialNumber(), "n/a");
    EXPECT_EQ(b.getPartNumber(), "");
    EXPECT_EQ(b.getMfgDateTime8601(), "1996-01-01T00:00:00");
    const Bytes oldBoard{2, 1, 0, 0, 0, 0, 0xC1, 0};
    EXPECT_EQ(IpmiFruBoard(8, oldBoard.data()).getMfgDateTime8601(), "N/A");

    // Chassis: the serial number is read from the part number's last byte on.
    Bytes chassis{1, 2, 23, 0xC2, 'A', 0xC3, 0xC3, 'S', 'N', '1', 0xC1, 0, 0, 0, 0, 0};
    const IpmiFruChassis c(16, chassis.data());
    EXPECT_EQ(c.getPartNumber(), "A");
    EXPECT_EQ(c.getSerialNumber(), " SN");
    EXPECT_EQ(c.getManufacturer(), "n/a");
    TestSupport::LogCapture log;
    const struct {
        uint8_t version, type;
        const char* name;
    } types[] = {{1, 23, "Rack Mount Chassis"}, {1, 37, "unknown"}, {1, 38, "Unknown"}, {0, 3, ""}, {2, 3, "unknown"}};
    for (const auto& t : types) {
        chassis[0] = t.version;
        chassis[2] = t.type;
        EXPECT_EQ(IpmiFruChassis(16, chassis.data()).getType(), t.name) << int(t.type);
    }
    EXPECT_EQ(log.count("getType: return unknown, fru format not handled (area_ver = 0x2"), 1u);
    c.dump();
    EXPECT_TRUE(log.contains(LOG_DEBUG, "Chassis Info Area : 0x10\nData 0x00: 0x01 0x02 0x17 0xc2 0x41 0xc3 0xc3 0x53 "
                                        "0x4e 0x31 0xc1 0x00 0x00 0x00 0x00 0x00"));
    // A field that claims more bytes than the area holds yields what is there.
    const Bytes cut{1, 1, 0, 0xFF, 'x', 'y'};
    EXPECT_EQ(IpmiFruProduct(6, cut.data()).getManufacturer(), "xy");
}

TEST(FruArea, MultiRecordsDecodeByType) {
    // Power supply (hot swap off, tachometer threshold set), DC output
    // (standby), then a zero-length record that ends every walk.
    Bytes area{0x00, 0x02, 24, 0, 0};
    const Bytes ps{0x26, 0x02, 0xd0, 0x06, 55, 5, 0x28, 0x23, 0x9c, 0x31, 0, 0, 0, 0,
                   47, 63, 12, 0x19, 0x52, 0xc3, 0x40, 0, 0, 1};
    area.insert(area.end(), ps.begin(), ps.end());
    const Bytes dc{0x81, 0xb0, 0x04, 0x74, 0x04, 0xec, 0x04, 0x78, 0, 0, 0, 0x10, 0x27};
    area.insert(area.end(), {0x01, 0x02, 13, 0, 0});
    area.insert(area.end(), dc.begin(), dc.end());
    area.insert(area.end(), {0xC0, 0x82, 0, 0, 0});
    const IpmiFruMulti m(static_cast<unsigned>(area.size()), area.data());
    const struct {
        uint8_t type;
        FruKey key;
        const char* value;
    } values[] = {
        {0x00, FruKey::PsOverallCapacity, "550"},        {0x00, FruKey::PsPeakVa, "1744"},
        {0x00, FruKey::PsLowInputVoltage1, "90.00"},     {0x00, FruKey::PsLowInputVoltage2, "n/a"},
        {0x00, FruKey::PsHotSwap, "fase"},               {0x00, FruKey::PsAutoSwitch, "false"},
        {0x00, FruKey::PsPredictiveFailSupport, "true"}, {0x00, FruKey::PsPredictiveFailMode, "Two pulses per rotation"},
        {0x00, FruKey::PsPeakWattage, "850"},            {0x00, FruKey::PsHoldUpTime, "12"},
        {0x00, FruKey::PsCombinedVoltage1, "n/a"},       {0x00, FruKey::PsCombinedVoltage2, "12 V"},
        {0x01, FruKey::DcStandby, "yes"},                {0x01, FruKey::DcOutputNumber, "1"},
        {0x01, FruKey::DcNominalVoltage, "12.00"},       {0x01, FruKey::DcMaximumCurrent, "10000"},
        {0x01, FruKey::PsOverallCapacity, "n/a"},        {0x02, FruKey::DcNominalVoltage, "n/a"},
    };
    TestSupport::LogCapture log;
    for (const auto& v : values) EXPECT_EQ(m.getValue(v.type, v.key), v.value) << int(v.type) << " " << int(v.key);
    EXPECT_FALSE(m.isMultiRecordTypePresent(0xC1));
    EXPECT_TRUE(log.contains(LOG_INFO, "isMultiRecordTypePresent: Multi FRU record len is equal to zero, not valid."));
    EXPECT_TRUE(log.contains(LOG_INFO, "getValue: Multi FRU record len is equal to zero, not valid."));
    const Bytes load{0x02, 0x0a, 0, 0x12, 0, 0x12, 0, 0, 0, 0, 0, 0, 0};
    EXPECT_EQ(IpmiFruMulti::getDCLoad(load.data(), 13, FruKey::DcStandby), "n/a");
    EXPECT_EQ(IpmiFruMulti::getDCLoad(load.data(), 13, FruKey::DcNominalVoltage), "0.10");
}

TEST_F(Fru, DiscoveryBuildsOneFruPerAnsweringDevice) {
    // A locator of another controller's device is no business of this pass.
    serveDefaultServer(TestSupport::SdrBuilder::of(sdr::type::fruDeviceLocator, 0x99)
                           .set(fru::locator::deviceAccessAddress, 0x2C)
                           .set(fru::locator::deviceId, 5)
                           .set(fru::locator::accessFlags, fru::locator::logical));
    ASSERT_EQ(IpmiIfcFruInstantiateAll(0), 0);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcFruInstantiateAll: FRU 0x5 at address 0x2c channel 0 skipped: not a "
                                        "logical device of this controller"));
    const auto frus = IpmiIfc::getFrus(0);
    ASSERT_EQ(frus.size(), 2u);
    EXPECT_EQ(frus[0]->getName(), "System Board");
    EXPECT_EQ(frus[1]->getName(), "PS1");
    EXPECT_EQ(frus[1]->getEntity(), IpmiEntity(10, 1, 0, 0));
    EXPECT_EQ(frus[1]->getBoard()->getName(), "PWR SPLY,550W,RDNT");
    EXPECT_EQ(IpmiIfc::getFruPart(1, IpmiFru::FRU_AREA_MULTI), frus[1]->getMulti());
    EXPECT_EQ(IpmiIfc::getFruPart(1, IpmiFru::FRU_AREA_CHASSIS), nullptr);
    const ipmiifc_fru_area_info info = IpmiIfc::getFruDeviceHeader(0);
    EXPECT_EQ(info.cc, 0);
    EXPECT_EQ(info.size, 256);
    EXPECT_EQ(info.device_id, 1);

    // A broken board checksum drops that area; a device that vanishes while
    // it is read keeps the areas read before; a shrunk request size starts again at 23.
    bmc().fru.devices[0].data[0x3A] ^= 0xFF;
    fru_max_req_size = 8;
    const auto before = frus[1];
    sim().resetCounters();
    // Device 0 takes 14 reads, device 1 would take 13.
    sim().addFault(st, cmd::readFruData, passThrough(20));
    sim().addFault(st, cmd::readFruData, Fault::completionCode(cc::requestedSensorNotPresent, -1));
    ASSERT_EQ(IpmiIfcFruInstantiateAll(0), 0);
    const auto after = IpmiIfc::getFrus(0);
    ASSERT_EQ(after.size(), 2u);
    EXPECT_EQ(after[0]->getBoard(), nullptr);
    EXPECT_NE(after[0]->getProduct(), nullptr);
    EXPECT_NE(after[1]->getBoard(), nullptr);  // read before the device went
    EXPECT_EQ(after[1]->getProduct(), nullptr);
    EXPECT_EQ(after[1]->getMulti(), nullptr);
    unsigned largest = 0;
    for (const auto& r : sim().requests())
        if (r.cmd == cmd::readFruData) largest = std::max<unsigned>(largest, r.data[fru::readRequest::count]);
    EXPECT_EQ(largest, 23u);
    EXPECT_TRUE(log.contains(LOG_WARNING, "IpmiIfcFruInstantiateAll: FRU 0x0 board area checksum invalid"));
    EXPECT_EQ(before->getBoard()->getName(), "PWR SPLY,550W,RDNT");  // what a caller holds stays whole
}

// What fails on the way (busy, time-out, no answer) says nothing of a
// device: it keeps the objects of the last pass, the whole device or the
// areas not reached. The locator's instance byte loses its bit 7.
TEST_F(Fru, AnUnreachableDeviceKeepsItsLastInventory) {
    auto server = Sim::loadProfile(Sim::defaultProfilePath());
    for (auto& r : server->sdr.records)
        if (r.size() > fru::locator::entityInstance && r[3] == sdr::type::fruDeviceLocator &&
            r[fru::locator::deviceId] == 1)
            r[fru::locator::entityInstance] |= 0x80;
    useBmc(server);
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    ASSERT_EQ(IpmiIfcFruInstantiateAll(0), 0);
    ASSERT_EQ(IpmiIfc::getFrus(0).size(), 2u);
    EXPECT_EQ(IpmiIfc::getFrus(0)[1]->getEntity(), IpmiEntity(10, 1, 0, 0));
    const struct {
        const char* what;
        std::function<void()> fault;
        bool device0Same, device1AreasSame;
    } scenes[] = {
        {"Get FRU Inventory Area Info busy", [] { faults().addFault(st, cmd::getFruInventoryAreaInfo, Fault::completionCode(cc::nodeBusy)); }, true, false},
        {"no answer to the common header", [] { faults().addFault(st, cmd::readFruData, Fault::of(FaultKind::NoAnswer)); }, true, false},
        {"time-outs once device 1's header is read",
         [] {
             faults().addFault(st, cmd::readFruData, passThrough(15));
             faults().addFault(st, cmd::readFruData, Fault::completionCode(cc::timeout, -1));
         },
         false, true},
    };
    for (const auto& s : scenes) {
        SCOPED_TRACE(s.what);
        faults().clearFaults();
        const auto before = IpmiIfc::getFrus(0);
        s.fault();
        ASSERT_EQ(IpmiIfcFruInstantiateAll(0), 0);
        const auto now = IpmiIfc::getFrus(0);
        ASSERT_EQ(now.size(), 2u);
        EXPECT_EQ(now[0] == before[0], s.device0Same);
        if (s.device1AreasSame) {
            EXPECT_NE(now[1], before[1]);
            EXPECT_EQ(now[1]->getOptionalRefArray(), before[1]->getOptionalRefArray());
        }
    }
}

TEST_F(Fru, ReadersNeverSeeAHalfBuiltList) {
    serveDefaultServer();
    ASSERT_EQ(IpmiIfcFruInstantiateAll(0), 0);
    std::atomic<bool> done{false};
    std::atomic<unsigned> seen{0};
    auto reader = [&] {
        while (!done) {
            for (const auto& f : IpmiIfc::getFrus(0)) {
                auto p = f->getProduct();
                if (p && !p->getName().empty() && !f->getBoard()->getMfgDateTime8601().empty()) ++seen;
            }
            EXPECT_EQ(IpmiIfc::getFrus(0).size(), 2u);
        }
    };
    std::thread a(reader), b(reader);
    for (int pass = 0; pass < 20; ++pass) IpmiIfcFruInstantiateAll(0);
    done = true;
    a.join();
    b.join();
    EXPECT_GT(seen.load(), 0u);
}

}  // namespace
