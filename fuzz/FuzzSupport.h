#ifndef TAV_IPMI_FUZZ_FUZZSUPPORT_H
#define TAV_IPMI_FUZZ_FUZZSUPPORT_H

// Shared by the fuzz targets: splitting an input into SDR records, a quiet
// log, and node 0 talking to a simulated controller for the length of one input.

#include <stddef.h>
#include <stdint.h>

#include <memory>
#include <vector>

#include "Bmc.h"
#include "IpmiIfcInternal.h"
#include "IpmiLog.h"
#include "Sim.h"

namespace FuzzSupport {

// Lines are formatted but go nowhere: syslog would make every input slow.
inline void quietLog() {
    Ipmi::setLogSink([](int, const char*, void*) {}, nullptr);
}

// Whole records (5-byte header + body, as `ipmitool sdr dump` writes them)
// from the start of the input, at most `limit`; `rest` gets what is left.
inline std::vector<std::vector<uint8_t>> records(const uint8_t* data, size_t size, size_t limit, size_t* rest) {
    std::vector<std::vector<uint8_t>> out;
    size_t at = 0;
    while (out.size() < limit && size - at >= 5 && size - at >= 5u + data[at + 4]) {
        const size_t length = 5u + data[at + 4];
        out.emplace_back(data + at, data + at + length);
        at += length;
    }
    if (rest) *rest = at;
    return out;
}

// Node 0 with its device open on `bmc`, in virtual time so that the input's
// back-offs and time-outs cost nothing. libFuzzer's own clock is real again
// after end(): its -rss_limit_mb=0 leaves it no thread that sleeps meanwhile.
inline void begin(std::shared_ptr<Sim::Bmc> bmc) {
    Sim::Simulator& sim = Sim::Simulator::instance();
    sim.install(std::move(bmc), true);
    sim.clearFaults();
    sim.resetCounters();
    Ipmi::InitIpmiNode(0);
    Ipmi::g_IpmiNode[0].myAddress = 0x20;
    Ipmi::g_IpmiNode[0].stopRequested = false;
    Ipmi::IpmiIfcOpenIpmiOpen(0);
}

inline void end() {
    Sim::Simulator& sim = Sim::Simulator::instance();
    Ipmi::IpmiIfcOpenIpmiClose(0);
    sim.resetCounters();
    sim.uninstall();
    sim.clock().reset();
}

// Answers taken from the input in order, each a length byte (up to 32) and
// that many bytes, completion code first; once they run out, `fallback` answers.
class AnswerScript {
public:
    AnswerScript(const uint8_t* data, size_t size) : data_(data), size_(size) {}
    bool next(Sim::Response* out) {
        if (at_ >= size_) return false;
        size_t length = data_[at_++] % 33;
        if (length > size_ - at_) length = size_ - at_;
        out->assign(data_ + at_, data_ + at_ + length);
        at_ += length;
        return true;
    }
    // Puts the script in front of one command; the plain controller answers the rest.
    void answer(Sim::Bmc& bmc, uint8_t netfn, uint8_t cmd) {
        auto plain = std::make_shared<Sim::Bmc>();
        plain->lan = bmc.lan;
        plain->identity = bmc.identity;
        bmc.on(netfn, cmd, [this, plain](Sim::Bmc&, const Sim::Request& r) {
            Sim::Response scripted;
            return next(&scripted) ? scripted : plain->handle(r);
        });
    }

private:
    const uint8_t* data_;
    size_t size_;
    size_t at_ = 0;
};

}  // namespace FuzzSupport

#endif
