// tav-ipmi-ops: the library's side of bench/peers.sh. A client program like
// any other, linked to the shared library and run under the simulator's
// preload library as ipmitool and FreeIPMI are. It does, in one process:
//
//   cold     from nothing to a populated sensor list with first readings, as
//            the tool's sensors view gets there in command-line mode (open
//            the device, command-line mode, repository read and discovery)
//   refresh  one Get Sensor Reading of every sensor the polling loop reads
//            each period, through the sensors' own public call
//   cached   every sensor's cached reading: must cost no exchange
//   sel      the SEL loaded
//   fru      the FRU inventory discovered
//
// and prints one line per operation: "op exchanges wall_ms". The exchanges
// are the simulator's own count, read before and after the operation.

#include <dlfcn.h>
#include <errno.h>
#include <stdio.h>
#include <string.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "IpmiIfc.h"
#include "IpmiSel.h"
#include "IpmiSelData.h"
#include "IpmiSensor.h"

namespace {

using TotalExchanges = unsigned (*)();

// Completion codes after which the polling loop stops reading a sensor.
constexpr uint32_t kNotPresent = 0xCB;
constexpr uint32_t kIllegalForType = 0xCD;
// SDR record types that carry a reading.
constexpr unsigned char kFullSensor = 0x01;
constexpr unsigned char kCompactSensor = 0x02;
constexpr int kRecordTypeAt = 3;

bool readable(const Ipmi::IpmiSensor& s) {
    const unsigned char* record = nullptr;
    int length = 0;
    s.RawRecord(record, length);
    if (record == nullptr || length <= kRecordTypeAt) return false;
    if (record[kRecordTypeAt] != kFullSensor && record[kRecordTypeAt] != kCompactSensor) return false;
    const uint32_t last = s.getLastPollResult();
    return last != kNotPresent && last != kIllegalForType;
}

// Runs one operation and prints its line; false (with the reason on stderr)
// when it failed.
bool measure(TotalExchanges total, const char* name, const std::function<std::string()>& op) {
    const unsigned before = total();
    const auto start = std::chrono::steady_clock::now();
    const std::string failure = op();
    const double ms = std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start).count();
    const unsigned exchanges = total() - before;
    printf("%s %u %.1f\n", name, exchanges, ms);
    fflush(stdout);
    if (!failure.empty()) fprintf(stderr, "tav-ipmi-ops: %s: %s\n", name, failure.c_str());
    return failure.empty();
}

std::string cold() {
    if (Ipmi::IpmiIfcOpenIpmiOpen(0) < 0) return std::string("cannot open /dev/ipmi0: ") + strerror(errno);
    if (Ipmi::IpmiIfcInitForCLI(0) < 0) return "cannot prepare the IPMI interface";
    if (Ipmi::IpmiIfcSdrGetInfo(0) != 0) return "could not read the SDR repository";
    if (Ipmi::IpmiIfc::getSensors(0).empty()) return "no sensor discovered";
    return "";
}

std::string refresh() {
    size_t read = 0, valid = 0;
    for (const auto& s : Ipmi::IpmiIfc::getSensors(0)) {
        if (!readable(*s)) continue;
        s->getSDReading();
        ++read;
        if (s->getCachedState().readingValid) ++valid;
    }
    if (read == 0) return "no sensor to read";
    if (valid == 0) return "no reading came back";
    return "";
}

std::string cached() {
    size_t valid = 0;
    for (const auto& s : Ipmi::IpmiIfc::getSensors(0))
        if (s->getCachedState().readingValid) ++valid;
    return valid == 0 ? "no cached reading" : "";
}

std::string sel() {
    if (Ipmi::IpmiIfcSelGetInfo(0, nullptr) != 0) return "the system event log could not be read";
    const auto info = Ipmi::IpmiIfc::getSel(0);
    const size_t records = Ipmi::IpmiIfc::getSelData(0).size();
    if (info && records != info->getCurrentNumberOfRecords())
        return std::to_string(records) + " records read of " + std::to_string(info->getCurrentNumberOfRecords());
    return "";
}

std::string fru() {
    if (Ipmi::IpmiIfcFruInstantiateAll(0) != 0) return "the FRU inventory could not be read";
    (void)Ipmi::IpmiIfc::getFrus(0);
    return "";
}

}  // namespace

int main(int argc, char**) {
    if (argc != 1) {
        fprintf(stderr, "usage: LD_PRELOAD=libtav-ipmi-sim-preload.so TAV_IPMI_SIM_PROFILE=NAME tav-ipmi-ops\n");
        return 2;
    }
    auto total = reinterpret_cast<TotalExchanges>(dlsym(RTLD_DEFAULT, "tavIpmiSimTotalExchanges"));
    if (total == nullptr) {
        fprintf(stderr, "tav-ipmi-ops: runs only under the simulator's preload library (no tavIpmiSimTotalExchanges)\n");
        return 2;
    }
    bool ok = measure(total, "cold", cold);
    // Each later operation needs the sensors or the open device of the first.
    if (ok) {
        ok = measure(total, "refresh", refresh) && ok;
        const unsigned before = total();
        ok = measure(total, "cached", cached) && ok;
        if (total() != before) {
            fprintf(stderr, "tav-ipmi-ops: cached: the cached readings cost exchanges\n");
            ok = false;
        }
        ok = measure(total, "sel", sel) && ok;
        ok = measure(total, "fru", fru) && ok;
    }
    Ipmi::IpmiIfcCloseForCLI(0);
    Ipmi::IpmiIfcOpenIpmiClose(0);
    return ok ? 0 : 1;
}
