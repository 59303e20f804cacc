#include "TestSupport.h"

#include <ctype.h>
#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>

#include "SdrLayout.h"

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

// Leaves no cached record behind, whatever the test built: a leak check sees only the test's own.
void SimTest::TearDown() {
    Ipmi::IpmiIfcSdrCleanUpAll(0);
    Ipmi::IpmiIfcSdrCleanUpHeaders(0);
    Ipmi::IpmiIfcEntityCleanUpAll(0);
    Ipmi::IpmiIfcSensorInstantiateAll(0);  // no records left: empties the list
    node().frus.clear();
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

SdrBuilder::SdrBuilder(uint8_t recordType, size_t idStringAt, uint16_t recordId)
    : bytes_(idStringAt, 0), idAt_(idStringAt) {
    using namespace Ipmi::sdr;
    word(header::recordId, recordId);
    set(header::version, 0x51);
    set(header::recordType, recordType);
    set(key::ownerId, 0x20);
    set(key::sensorNumber, 1);
    set(key::entityId, 0x07);
    set(key::entityInstance, 1);
}

SdrBuilder SdrBuilder::of(uint8_t recordType, uint16_t recordId) {
    using namespace Ipmi::sdr;
    const size_t idAt = recordType == type::fullSensor      ? full::idString
                        : recordType == type::compactSensor ? compact::idString
                        : recordType == type::eventOnly     ? eventOnly::idString
                                                            : header::length + 12;
    return SdrBuilder(recordType, idAt, recordId);
}
SdrBuilder SdrBuilder::full(uint16_t recordId) { return of(Ipmi::sdr::type::fullSensor, recordId); }
SdrBuilder SdrBuilder::compact(uint16_t recordId) { return of(Ipmi::sdr::type::compactSensor, recordId); }
SdrBuilder SdrBuilder::eventOnly(uint16_t recordId) { return of(Ipmi::sdr::type::eventOnly, recordId); }

SdrBuilder& SdrBuilder::set(size_t offset, uint8_t value) {
    if (offset >= bytes_.size()) bytes_.resize(offset + 1, 0);
    bytes_[offset] = value;
    return *this;
}

SdrBuilder& SdrBuilder::word(size_t offset, uint16_t value) {
    set(offset, static_cast<uint8_t>(value & 0xFF));
    return set(offset + 1, static_cast<uint8_t>(value >> 8));
}

SdrBuilder& SdrBuilder::types(uint8_t sensorType, uint8_t eventReadingType) {
    using namespace Ipmi::sdr;
    const bool eventOnlyRecord = bytes_[header::recordType] == type::eventOnly;
    set(eventOnlyRecord ? eventOnly::sensorType : sensor::sensorType, sensorType);
    return set(eventOnlyRecord ? eventOnly::eventReadingType : sensor::eventReadingType, eventReadingType);
}

SdrBuilder& SdrBuilder::id(const std::string& text) {
    return idCoded(static_cast<uint8_t>(0xC0 | text.size()), text);
}

SdrBuilder& SdrBuilder::idCoded(uint8_t typeLength, const std::string& text) {
    bytes_.resize(idAt_);
    bytes_[idAt_ - 1] = typeLength;
    bytes_.insert(bytes_.end(), text.begin(), text.end());
    return *this;
}

std::vector<uint8_t> SdrBuilder::bytes() const {
    std::vector<uint8_t> out = bytes_;
    out[Ipmi::sdr::header::remainingLength] = static_cast<uint8_t>(out.size() - Ipmi::sdr::header::length);
    return out;
}

Sim::Response ask(Sim::Bmc& bmc, uint8_t netfn, uint8_t command, std::vector<uint8_t> data, uint8_t ipmbAddress,
                  uint8_t ipmbChannel) {
    Sim::Request r;
    r.netfn = netfn;
    r.cmd = command;
    r.data = std::move(data);
    if (ipmbAddress != 0) {
        r.viaIpmb = true;
        r.address = ipmbAddress;
        r.channel = ipmbChannel;
    }
    return bmc.handle(r);
}

Ipmi::sel_event_record eventRecord(uint8_t sensorType, uint8_t dirType, uint8_t data1, uint8_t data2, uint8_t data3,
                             uint8_t recordType, uint8_t evmRev) {
    return {{0x02, 0x01}, recordType, {0, 0, 0, 0x5F}, {0x20, 0x00}, evmRev, sensorType, 0x30, dirType,
            {data1, data2, data3}};
}

LoopThread::LoopThread(int interval)
    : thread_([interval] {
          try {
              Ipmi::IpmiIfc::start(0, interval);
          } catch (const kelInt::CmpiStatus&) {
          }
      }) {}

LoopThread::~LoopThread() {
    if (!stopped_) stop();
    thread_.join();
}

void LoopThread::stop() {
    stopped_ = true;
    Ipmi::IpmiIfc::stop();
}

void waitUntil(const std::function<bool()>& done) {
    while (!done()) Sim::realSleepNs(1000000);
}

std::string realDataPath(const std::string& relative) {
    std::string path = std::string(TAV_IPMI_REAL_DATA_DIR) + "/" + relative;
    struct stat st;
    if (stat(path.c_str(), &st) != 0) return std::string();
    return path;
}

std::vector<std::string> realDataFiles(const std::string& dir, const std::string& suffix) {
    std::vector<std::string> files;
    const std::string path = realDataPath(dir);
    DIR* d = path.empty() ? nullptr : opendir(path.c_str());
    while (dirent* e = d != nullptr ? readdir(d) : nullptr) {
        const std::string name = e->d_name;
        if (name.size() > suffix.size() && name.compare(name.size() - suffix.size(), suffix.size(), suffix) == 0)
            files.push_back(path + "/" + name);
    }
    if (d != nullptr) closedir(d);
    std::sort(files.begin(), files.end());
    return files;
}

std::string profileTestName(const ::testing::TestParamInfo<std::string>& info) {
    std::string name = info.param.substr(info.param.rfind('/') + 1);
    for (char& c : name)
        if (!isalnum(static_cast<unsigned char>(c))) c = '_';
    return name;
}

}  // namespace TestSupport
