// The SDR repository reader, and the sensor and entity rebuilds it starts,
// against a simulated controller whose repository is the input: whole records
// first (`ipmitool sdr dump` layout, so real repositories seed it), then, in
// the bytes that make no whole record, rules for the fault layer in front of
// it and the record count its repository info claims.

#include <stddef.h>
#include <stdint.h>

#include <errno.h>

#include "FuzzSupport.h"
#include "IpmiIfc.h"
#include "IpmiSensor.h"

namespace {

constexpr uint8_t kStorage = Ipmi::netfn::storage;

// Four bytes: command, kind, parameter, times.
void addFault(Sim::Simulator& sim, const uint8_t* rule, int* claimedCount) {
    static const int commands[] = {Ipmi::cmd::getSdrRepositoryInfo, Ipmi::cmd::reserveSdrRepository,
                                   Ipmi::cmd::getSdr, Sim::kAnyCommand};
    const int command = commands[rule[0] % 4];
    const int netfn = command == Sim::kAnyCommand ? Sim::kAnyCommand : kStorage;
    const uint8_t parameter = rule[2];
    const int times = 1 + rule[3] % 3;
    switch (rule[1] % 9) {
    case 0: sim.addFault(netfn, command, Sim::Fault::completionCode(parameter, times)); break;
    case 1: sim.addFault(netfn, command, Sim::Fault::of(Sim::FaultKind::NoAnswer, times)); break;
    case 2: sim.addFault(netfn, command, Sim::Fault::answerLength(Sim::FaultKind::LongAnswer, parameter % 64, times)); break;
    case 3: sim.addFault(netfn, command, Sim::Fault::answerLength(Sim::FaultKind::CutAnswer, parameter % 32, times)); break;
    case 4: sim.addFault(netfn, command, Sim::Fault::of(Sim::FaultKind::AsyncEventFirst, times)); break;
    case 5: sim.addFault(netfn, command, Sim::Fault::errnoFault(Sim::FaultKind::SendError, EIO, times)); break;
    case 6:
        sim.addFault(netfn, command,
                     Sim::Fault::errnoFault(Sim::FaultKind::ReceiveError, parameter & 1 ? EAGAIN : EIO, times));
        break;
    case 7: sim.addFault(netfn, command, Sim::Fault::of(Sim::FaultKind::DuplicateAnswer, times)); break;
    default: *claimedCount = parameter | rule[3] << 8; break;
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzSupport::quietLog();
    size_t used = 0;
    auto bmc = std::make_shared<Sim::Bmc>();
    bmc->sdr.records = FuzzSupport::records(data, size, 24, &used);
    FuzzSupport::begin(bmc);
    Sim::Simulator& sim = Sim::Simulator::instance();
    int claimedCount = -1;
    for (size_t at = used; at + 4 <= size && at < used + 4 * 8; at += 4) addFault(sim, data + at, &claimedCount);
    if (claimedCount >= 0) {
        auto plain = std::make_shared<Sim::Bmc>();
        bmc->on(kStorage, Ipmi::cmd::getSdrRepositoryInfo, [plain, claimedCount](Sim::Bmc& b, const Sim::Request& r) {
            plain->sdr = b.sdr;
            Sim::Response a = plain->handle(r);
            if (a.size() >= 4) {
                a[2] = static_cast<uint8_t>(claimedCount & 0xFF);
                a[3] = static_cast<uint8_t>(claimedCount >> 8);
            }
            return a;
        });
    }

    Ipmi::IpmiIfcSdrGetInfo(0);
    for (const auto& s : Ipmi::IpmiIfc::getSensors(0)) (void)s->getSensorIdString();
    (void)Ipmi::IpmiIfc::getEntities(0);

    Ipmi::IpmiIfcSdrCleanUpAll(0);
    Ipmi::IpmiIfcSdrCleanUpHeaders(0);
    Ipmi::IpmiIfcEntityCleanUpAll(0);
    Ipmi::IpmiIfcSensorInstantiateAll(0);
    FuzzSupport::end();
    return 0;
}
