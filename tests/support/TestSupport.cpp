#include "TestSupport.h"

#include <sys/stat.h>
#include <unistd.h>

namespace TestSupport {

LogCapture::LogCapture() { Ipmi::setLogSink(&LogCapture::sink, this); }

LogCapture::~LogCapture() { Ipmi::setLogSink(nullptr, nullptr); }

void LogCapture::sink(int priority, const char* text, void* self) {
    auto* c = static_cast<LogCapture*>(self);
    std::lock_guard<std::mutex> guard(c->mutex_);
    c->lines_.push_back(LogLine{priority, text});
}

std::vector<LogLine> LogCapture::lines() const {
    std::lock_guard<std::mutex> guard(mutex_);
    return lines_;
}

bool LogCapture::contains(int priority, const std::string& text) const {
    std::lock_guard<std::mutex> guard(mutex_);
    for (const auto& l : lines_)
        if (l.priority == priority && l.text == text) return true;
    return false;
}

size_t LogCapture::count(const std::string& text) const {
    std::lock_guard<std::mutex> guard(mutex_);
    size_t n = 0;
    for (const auto& l : lines_)
        if (l.text == text) ++n;
    return n;
}

size_t LogCapture::countAtPriority(int priority) const {
    std::lock_guard<std::mutex> guard(mutex_);
    size_t n = 0;
    for (const auto& l : lines_)
        if (l.priority == priority) ++n;
    return n;
}

void LogCapture::clear() {
    std::lock_guard<std::mutex> guard(mutex_);
    lines_.clear();
}

std::string LogCapture::dump() const {
    std::lock_guard<std::mutex> guard(mutex_);
    std::string out;
    for (const auto& l : lines_) out += "<" + std::to_string(l.priority) + "> " + l.text + "\n";
    return out;
}

void SimTest::SetUp() {
    bmc_ = std::make_shared<Sim::Bmc>();
    sim().install(bmc_, true);
    sim().clearFaults();
    sim().resetCounters();
    clockAtStart_ = sim().clock().offsetNs();
    Ipmi::InitIpmiNode(0);
    node().myAddress = 0x20;
    node().stopRequested = false;
    if (openDevice) {
        ASSERT_GE(Ipmi::IpmiIfcOpenIpmiOpen(0), 0);
    }
}

void SimTest::TearDown() {
    Ipmi::IpmiIfcOpenIpmiClose(0);
    sim().clearFaults();
    sim().uninstall();
}

void SimTest::useBmc(std::shared_ptr<Sim::Bmc> bmc) {
    bmc_ = std::move(bmc);
    sim().install(bmc_, true);
}

double SimTest::virtualSecondsElapsed() const {
    return static_cast<double>(Sim::Simulator::instance().clock().offsetNs() - clockAtStart_) / 1e9;
}

std::string realDataPath(const std::string& relative) {
    std::string path = std::string(TAV_IPMI_REAL_DATA_DIR) + "/" + relative;
    struct stat st;
    if (stat(path.c_str(), &st) != 0) return std::string();
    return path;
}

}  // namespace TestSupport
