#ifndef TAV_IPMI_TESTS_TESTSUPPORT_H
#define TAV_IPMI_TESTS_TESTSUPPORT_H

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "Bmc.h"
#include "IpmiSelData.h"
#include "IpmiIfcInternal.h"
#include "Sim.h"

namespace TestSupport {

struct LogLine {
    int priority;
    std::string text;
};

// Collects what the library logs while it lives.
class LogCapture {
public:
    LogCapture();
    ~LogCapture();
    std::vector<LogLine> lines() const;
    bool contains(int priority, const std::string& text) const;
    size_t count(const std::string& text) const;
    size_t countAtPriority(int priority) const;
    void clear();
    std::string dump() const;

private:
    static void sink(int priority, const char* text, void* self);
    mutable std::mutex mutex_;
    std::vector<LogLine> lines_;
};

// A test with a simulated controller behind /dev/ipmi0 and virtual time.
// Node 0 is initialised and its device open (as IpmiIfc::start would leave it).
class SimTest : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;
    // Replaces the controller, e.g. with one loaded from a profile.
    void useBmc(std::shared_ptr<Sim::Bmc> bmc);
    Sim::Simulator& sim() { return Sim::Simulator::instance(); }
    Sim::Bmc& bmc() { return *bmc_; }
    Ipmi::IpmiNode& node() { return Ipmi::g_IpmiNode[0]; }
    // Virtual seconds passed since the test began.
    double virtualSecondsElapsed() const;

    std::shared_ptr<Sim::Bmc> bmc_;
    LogCapture log;
    bool openDevice = true;
    int64_t clockAtStart_ = 0;
};

// A sensor data record built field by field. Every record starts with version
// 0x51 and the sensor key of owner 0x20, sensor number 1 and entity 0x07 (system
// board) instance 1, and an empty ID string; every other byte is 0. of() makes
// records of types other than full, compact and event-only 17 bytes long.
class SdrBuilder {
public:
    SdrBuilder(uint8_t recordType, size_t idStringAt, uint16_t recordId = 1);
    static SdrBuilder of(uint8_t recordType, uint16_t recordId = 1);  // ID string where the type keeps it
    static SdrBuilder full(uint16_t recordId = 1);
    static SdrBuilder compact(uint16_t recordId = 1);
    static SdrBuilder eventOnly(uint16_t recordId = 1);
    SdrBuilder& set(size_t offset, uint8_t value);  // grows the record when needed
    SdrBuilder& word(size_t offset, uint16_t value);  // little-endian
    // Sensor type and event/reading type where this kind of record keeps them.
    SdrBuilder& types(uint8_t sensorType, uint8_t eventReadingType);
    SdrBuilder& id(const std::string& text);  // 8-bit characters
    SdrBuilder& idCoded(uint8_t typeLength, const std::string& bytes);
    // The record with its remaining-length byte filled in.
    std::vector<uint8_t> bytes() const;
    operator std::vector<uint8_t>() const { return bytes(); }

private:
    std::vector<uint8_t> bytes_;
    size_t idAt_;
};

// The simulated controller's own answer, without the transport; over IPMB
// when an address is given.
Sim::Response ask(Sim::Bmc& bmc, uint8_t netfn, uint8_t command, std::vector<uint8_t> data = {},
                  uint8_t ipmbAddress = 0, uint8_t ipmbChannel = 0);

// A system event record 0x0102 from the BMC (0x20), sensor 0x30, stamped
// 0x5F000000; event data 2 and 3 default to "unspecified".
Ipmi::sel_event_record eventRecord(uint8_t sensorType, uint8_t dirType, uint8_t data1, uint8_t data2 = 0xFF,
                             uint8_t data3 = 0xFF, uint8_t recordType = 0x02, uint8_t evmRev = 4);

// IpmiIfc::start(0, interval) on a thread of its own, as a host process runs
// it. Destruction stops the interface (unless stop() was called) and joins.
class LoopThread {
public:
    explicit LoopThread(int interval);
    ~LoopThread();
    void stop();

private:
    bool stopped_ = false;
    std::thread thread_;
};

// Re-checks `done` every real millisecond until it holds. The wait itself
// leaves virtual time alone, so what it moves is the library's own waiting.
void waitUntil(const std::function<bool()>& done);

// Path of a file under ../shared/data/real, or empty (and the test skips) when absent.
std::string realDataPath(const std::string& relative);
// Paths of the files in that directory whose names end in `suffix`, sorted; none when absent.
std::vector<std::string> realDataFiles(const std::string& dir, const std::string& suffix);

// A parameterised test's name for a profile path: its file name, other
// characters than letters and digits as '_'.
std::string profileTestName(const ::testing::TestParamInfo<std::string>& info);

#define SKIP_WITHOUT_REAL_DATA(path)                                       \
    do {                                                                   \
        if ((path).empty()) GTEST_SKIP() << "real server data not present"; \
    } while (0)

}  // namespace TestSupport

#endif
