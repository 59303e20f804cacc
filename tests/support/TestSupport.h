#ifndef TAV_IPMI_TESTS_TESTSUPPORT_H
#define TAV_IPMI_TESTS_TESTSUPPORT_H

#include <gtest/gtest.h>

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "Bmc.h"
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

// Path of a file under ../shared/data/real, or empty (and the test skips) when absent.
std::string realDataPath(const std::string& relative);

#define SKIP_WITHOUT_REAL_DATA(path)                                       \
    do {                                                                   \
        if ((path).empty()) GTEST_SKIP() << "real server data not present"; \
    } while (0)

}  // namespace TestSupport

#endif
