// tav-vm-check: the library on the kernel's IPMI driver (ipmi_si KCS,
// ipmi_devintf) in the test guest, checked against ipmitool on the same BMC.
//   tav-vm-check normal   every tool view, sensors, entities, LAN, SEL, FRU
//   tav-vm-check faults   a slow and a lossy BMC (through the host's proxy)
// Ends with "N passed, N failed" and exits 1 when anything failed.

#include "VmCheck.h"

#include <math.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/utsname.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <map>
#include <set>
#include <sstream>
#include <thread>

#include "CmpiStatus.h"
#include "IpmiIfc.h"
#include "IpmiLan.h"
#include "IpmiSensor.h"

using Ipmi::IpmiIfc;

namespace VmCheck {

void Checks::expect(bool ok, const std::string& what, const std::string& detail) {
    ++(ok ? passed_ : failed_);
    printf("%s %s%s%s\n", ok ? "PASS" : "FAIL", what.c_str(), detail.empty() ? "" : ": ", detail.c_str());
    fflush(stdout);
}

void Checks::skip(const std::string& what, const std::string& why) {
    ++skipped_;
    printf("SKIP %s: %s\n", what.c_str(), why.c_str());
}

void Checks::summary() const {
    if (skipped_ != 0) printf("%d skipped\n", skipped_);
    printf("%d passed, %d failed\n", passed_, failed_);
    fflush(stdout);
}

Run run(const std::string& command) {
    Run result;
    FILE* pipe = popen((command + " 2>&1").c_str(), "r");
    if (pipe == nullptr) return result;
    char buffer[4096];
    size_t n;
    while ((n = fread(buffer, 1, sizeof buffer, pipe)) > 0) result.out.append(buffer, n);
    int status = pclose(pipe);
    result.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    return result;
}

std::vector<std::string> cells(const std::string& row) {
    std::vector<std::string> out;
    std::stringstream in(row);
    std::string cell;
    while (std::getline(in, cell, '|')) out.push_back(trim(cell));
    return out;
}

bool proxy(std::vector<uint8_t> request) {
    uint8_t answer[32];
    uint16_t length = sizeof answer;
    return IpmiIfc::sendCmd(0xF0, 0x30, static_cast<uint16_t>(request.size()), request.data(), &length, answer) == 0;
}

void fullPass() {
    bool shutdown = false;
    IpmiIfc::pollAll(1, true, Ipmi::IPMI_POLL_FULL, &shutdown);
}

namespace {

const char* kIpmitool = "ipmitool -I open ";
const uint8_t kNetfnApp = 0x06, kGetDeviceId = 0x01, kNetfnStorage = 0x0A, kGetSelInfo = 0x40;

bool logged(const std::string& text) { return TestSupport::readFile("/tmp/messages").find(text) != std::string::npos; }

uint8_t getDeviceId() {
    uint8_t answer[32];
    uint16_t length = sizeof answer;
    return IpmiIfc::sendCmd(kGetDeviceId, kNetfnApp, 0, nullptr, &length, answer);
}

std::string number(double v) {
    char text[32];
    snprintf(text, sizeof text, "%.3f", v);
    return text;
}

// Readings and thresholds agree when they are one conversion step apart at most.
bool near(double ours, const std::string& theirs) {
    char* end = nullptr;
    double v = strtod(theirs.c_str(), &end);
    return end != theirs.c_str() && fabs(ours - v) <= 0.011 + fabs(v) * 0.01;
}

// ipmitool's one-word threshold status of a reading's comparison bits.
std::string thresholdStatus(unsigned bits) {
    if (bits & 0x24) return "nr";
    if (bits & 0x12) return "cr";
    if (bits & 0x09) return "nc";
    return "ok";
}

// Every view `tavipmi --help` lists. A view that takes arguments gets
// placeholders and only has to end without a crash; one that runs until
// stopped (a watch) is stopped after a while.
void checkViews(Checks& checks) {
    Run help = run("tavipmi --help");
    bool inViews = false;
    int seen = 0;
    for (const std::string& line : lines(help.out)) {
        if (line == "Subcommands:") {
            inViews = true;
            continue;
        }
        std::string entry = trim(line);
        if (!inViews || entry.empty()) continue;
        const std::string name = entry.substr(0, entry.find(' '));
        if (name == "serve") continue;  // a server: the Prometheus test runs it
        const std::string about = trim(entry.substr(name.size()));
        std::string args;
        size_t colon = about.find(':');
        if (colon != std::string::npos && about.substr(0, colon).find_first_of("abcdefghijklmnopqrstuvwxyz") ==
                                              std::string::npos) {
            std::stringstream words(about.substr(0, colon));
            std::string w;
            while (words >> w) args += " TavVm" + std::to_string(args.size());
        }
        Run view = run("timeout -s INT 20 tavipmi " + name + args);
        printf("---- tavipmi %s%s (exit %d)\n%s", name.c_str(), args.c_str(), view.status, view.out.c_str());
        const bool stopped = view.status == 130 || view.status == 128 + 2;
        const bool crashed = view.status > 128 && !stopped;
        ++seen;
        if (!args.empty())
            checks.expect(!crashed, "view " + name + " with arguments ends without a crash");
        else
            checks.expect(view.status == 0 || (stopped && !view.out.empty()), "view " + name,
                          "exit " + std::to_string(view.status));
    }
    checks.expect(seen >= 4, "tavipmi --help lists the views", std::to_string(seen) + " views");
}

// Threshold sensors: reading, status and each threshold ipmitool shows;
// discrete sensors: the state bits. A sensor is matched through `sdr elist`
// by number, entity and name (a shared record shows only its first sensor
// there); names that `sensor` shows more than once are left out.
struct Shown {
    std::string name;
    std::pair<unsigned, unsigned> entity;
};

void checkSensors(Checks& checks) {
    std::map<std::string, std::vector<std::string>> rowOf;
    std::map<std::string, int> rowsNamed;
    for (const std::string& line : lines(run(std::string(kIpmitool) + "sensor").out)) {
        std::vector<std::string> c = cells(line);
        if (c.size() < 10) continue;
        rowOf[c[0]] = c;
        ++rowsNamed[c[0]];
    }
    std::multimap<unsigned, Shown> shown;
    std::set<std::pair<unsigned, unsigned>> entitiesShown;
    for (const std::string& line : lines(run(std::string(kIpmitool) + "sdr elist all").out)) {
        std::vector<std::string> c = cells(line);
        Shown s;
        if (c.size() < 5 || !rowOf.count(c[0]) || sscanf(c[3].c_str(), "%u.%u", &s.entity.first, &s.entity.second) != 2)
            continue;
        s.name = c[0];
        shown.emplace(static_cast<unsigned>(strtoul(c[1].c_str(), nullptr, 16)), s);
        entitiesShown.insert(s.entity);
    }

    const auto sensors = IpmiIfc::getSensors(0);
    checks.expect(!sensors.empty() && !shown.empty(), "sensors found by the library and by ipmitool",
                  std::to_string(sensors.size()) + " and " + std::to_string(shown.size()));
    int compared = 0, ambiguous = 0;
    for (const auto& s : sensors) {
        const Ipmi::IpmiEntity entity = s->getEntity();
        const std::string ourName = s->getSensorIdString();
        const Shown* match = nullptr;
        for (auto it = shown.equal_range(s->getSensorNumber()); it.first != it.second; ++it.first)
            if (it.first->second.entity == std::make_pair(entity.id, entity.instance) &&
                ourName.compare(0, it.first->second.name.size(), it.first->second.name) == 0)
                match = &it.first->second;
        if (match == nullptr) continue;
        if (rowsNamed[match->name] != 1) {
            ++ambiguous;
            continue;
        }
        const std::vector<std::string>& row = rowOf[match->name];
        const std::string what = "sensor " + match->name;
        ++compared;
        const unsigned raw = s->getReading(true);
        if (row[1] == "na") {
            checks.expect(s->readingStateUnavailable() || s->scanningDisabled(), what + " has no reading");
            continue;
        }
        if (s->isDiscrete()) {
            unsigned state = s->getState(false) & 0x7FFF;
            unsigned theirs = static_cast<unsigned>(strtoul(row[3].c_str(), nullptr, 16));
            theirs = ((theirs >> 8) | ((theirs & 0xFF) << 8)) & 0x7FFF;
            char detail[64];
            snprintf(detail, sizeof detail, "state 0x%04x, ipmitool 0x%04x", state, theirs);
            checks.expect(state == theirs, what, detail);
            continue;
        }
        const double value = s->convertRawValue(raw);
        std::string status = "?";
        try {
            status = thresholdStatus(s->getState(false));
        } catch (const kelInt::CmpiStatus&) {
        }
        checks.expect(near(value, row[1]) && status == row[3], what,
                      number(value) + " " + status + ", ipmitool " + row[1] + " " + row[3]);
        using Getter = double (Ipmi::IpmiSensor::*)(bool);
        const std::pair<int, Getter> thresholds[] = {{4, &Ipmi::IpmiSensor::getLowerNonRecoverableThreshold},
                                                     {5, &Ipmi::IpmiSensor::getLowerCriticalThreshold},
                                                     {6, &Ipmi::IpmiSensor::getLowerNonCriticalThreshold},
                                                     {7, &Ipmi::IpmiSensor::getUpperNonCriticalThreshold},
                                                     {8, &Ipmi::IpmiSensor::getUpperCriticalThreshold},
                                                     {9, &Ipmi::IpmiSensor::getUpperNonRecoverableThreshold}};
        std::string ours, theirs;
        bool same = true;
        for (const auto& t : thresholds) {
            if (row[t.first] == "na") continue;
            double v = NAN;
            try {
                v = ((*s).*(t.second))(false);
            } catch (const kelInt::CmpiStatus&) {
            }
            same = same && near(v, row[t.first]);
            ours += " " + number(v);
            theirs += " " + row[t.first];
        }
        if (!theirs.empty()) checks.expect(same, what + " thresholds", "ours" + ours + ", ipmitool" + theirs);
    }
    checks.expect(compared > 0, "sensors compared with ipmitool",
                  std::to_string(compared) + ", " + std::to_string(ambiguous) + " left out for a name shown twice");

    std::set<std::pair<unsigned, unsigned>> ours;
    for (const auto& e : IpmiIfc::getEntities(0)) ours.insert({e.id, e.instance});
    std::string missing;
    for (const auto& e : entitiesShown)
        if (!ours.count(e)) missing += " " + std::to_string(e.first) + "." + std::to_string(e.second);
    checks.expect(!ours.empty() && missing.empty(), "every entity ipmitool shows is in the entity list",
                  std::to_string(ours.size()) + " entities" + (missing.empty() ? "" : ", missing" + missing));
}

// A reading changed on the BMC's console reaches the cached sensor on the
// loop's next sensor pass.
void checkReadingChange(Checks& checks) {
    for (const auto& s : IpmiIfc::getSensors(0)) {
        if (s->isDiscrete() || s->getOwnerId() != 0x20 || s->getLun() != 0) continue;
        const unsigned before = s->getReading(true);
        if (s->readingStateUnavailable() || s->scanningDisabled()) continue;
        const unsigned changed = (before + 5) & 0xFF;
        char line[64];
        snprintf(line, sizeof line, "sensor_set_value 0x20 0 0x%02x 0x%02x 0", s->getSensorNumber(), changed);
        std::vector<uint8_t> request{kConsole};
        request.insert(request.end(), line, line + strlen(line));
        proxy(request);
        bool shutdown = false;
        IpmiIfc::pollAll(1, true, Ipmi::IPMI_POLL_SENSORS, &shutdown);
        const unsigned after = s->getReading(false);
        checks.expect(after == changed, "a reading changed on the BMC is refreshed by the loop",
                      s->getSensorIdString() + " raw " + std::to_string(before) + " -> " + std::to_string(after));
        return;
    }
    checks.skip("reading change", "no threshold sensor with a reading");
}

void checkLan(Checks& checks) {
    Ipmi::IpmiLan* lan = IpmiIfc::getLan(0);
    const int channel = lan->getChannel();
    auto field = TestSupport::fields(run(std::string(kIpmitool) + "lan print " + std::to_string(channel)).out);
    static const char* const kOrigins[] = {"unspecified", "static address", "dhcp address", "bios assigned address",
                                           "other"};
    const int origin = lan->getAddressOrigin();
    const std::pair<std::string, std::string> pairs[] = {
        {lan->getIPv4Address(), field["IP Address"]},
        {lan->getIPv4Netmask(), field["Subnet Mask"]},
        {lan->getIPv4DefaultGateway(), field["Default Gateway IP"]},
        {TestSupport::lower(lan->getMACAddress()), TestSupport::lower(field["MAC Address"])},
        {origin >= 0 && origin <= 4 ? kOrigins[origin] : "?", TestSupport::lower(field["IP Address Source"])}};
    for (const auto& p : pairs)
        checks.expect(p.first == p.second, "LAN channel " + std::to_string(channel),
                      "'" + p.first + "', ipmitool '" + p.second + "'");
}

// Starts the loop on a thread of its own; the caller stops and joins it.
std::thread startLoop(Checks& checks) {
    std::thread loop([] {
        try {
            IpmiIfc::start(0, 0);  // no periodic wake-ups: every pass is asked for
        } catch (const kelInt::CmpiStatus& e) {
            printf("start threw %d %s\n", e.rc(), e.msg());
        }
    });
    const int state = IpmiIfc::waitState(0, IpmiIfc::IPMI_STATE_RUNNING | IpmiIfc::IPMI_STATE_STOPPED);
    checks.expect(state == IpmiIfc::IPMI_STATE_RUNNING, "the loop reaches the running state");
    printf("BMC as the library reads it: %s, firmware %s, IPMI %s\n", IpmiIfc::GetBmcManufacturer().c_str(),
           IpmiIfc::GetBmcFWVersion().c_str(), IpmiIfc::GetBmcIpmiVersion().c_str());
    return loop;
}

// A stop that never returns is the failure this guards; the host's time
// limit is far longer, so a hang is named here rather than there.
void stopLoop(Checks& checks, std::thread& loop) {
    std::thread watchdog([] {
        std::this_thread::sleep_for(std::chrono::seconds(120));
        printf("FAIL stop did not return within 120 s\n");
        fflush(stdout);
        _exit(1);
    });
    watchdog.detach();
    IpmiIfc::stop(0);
    loop.join();
    checks.expect(IpmiIfc::getState(0) == IpmiIfc::IPMI_STATE_STOPPED, "stop ends the loop");
}

void normalPass(Checks& checks) {
    // Give the LAN channel something to report before the loop reads it.
    run(std::string(kIpmitool) + "lan set 1 ipsrc static; " + kIpmitool + "lan set 1 ipaddr 192.0.2.10; " +
        kIpmitool + "lan set 1 netmask 255.255.255.0; " + kIpmitool + "lan set 1 defgw ipaddr 192.0.2.1; " +
        kIpmitool + "lan set 1 macaddr 52:54:00:12:34:56");
    checkViews(checks);
    std::thread loop = startLoop(checks);
    prepareSel();  // start clears the node's handler list
    checkSensors(checks);
    checkReadingChange(checks);
    checkLan(checks);
    checkSel(checks);
    checkFru(checks);
    stopLoop(checks, loop);
}

// The driver's time-outs as the library meets them: a dropped request comes
// back as 0xC3 from the KCS layer, a slow controller is only slow, and a stop
// in the middle of a slow exchange still returns.
void faultPass(Checks& checks) {
    setenv("CIM_IPMI_RETRIES", "2", 1);
    setenv("CIM_IPMI_RETRY_TIME", "500", 1);
    std::thread loop = startLoop(checks);
    checks.expect(logged("IPMI timing parms have been set to: retries=2, retry_time=500(ms)."),
                  "the driver takes the retry settings");

    proxy({kDrop, 1, kNetfnApp, kGetDeviceId});
    const uint8_t dropped = getDeviceId();
    char detail[48];
    snprintf(detail, sizeof detail, "completion code 0x%02x", dropped);
    checks.expect(dropped == 0xC3, "a dropped request times out with 0xC3", detail);
    checks.expect(getDeviceId() == 0, "the next request is answered");

    proxy({kDrop, 2, kNetfnStorage, kGetSelInfo});
    fullPass();
    checks.expect(logged("Retrying IpmiIfcSelGetInfo"), "the loop retries Get SEL Info after time-outs");
    checks.expect(!IpmiIfc::getSensors(0).empty(), "sensors survive the lossy pass");

    proxy({kDelay, 0xDC, 0x05});  // 1.5 s per request, inside the KCS time-out
    checks.expect(getDeviceId() == 0, "a slow controller is still answered");
    auto sensors = IpmiIfc::getSensors(0);
    bool read = false;
    for (const auto& s : sensors)
        if (!s->isDiscrete() && s->getOwnerId() == 0x20) {
            s->getReading(true);
            read = !s->readingStateUnavailable();
            break;
        }
    checks.expect(read, "a slow controller still gives readings");
    IpmiIfc::doPoll(0);  // the loop is now busy with slow exchanges
    std::this_thread::sleep_for(std::chrono::seconds(2));
    stopLoop(checks, loop);
}

}  // namespace
}  // namespace VmCheck

int main(int argc, char** argv) {
    setvbuf(stdout, nullptr, _IOLBF, 0);
    const std::string mode = argc > 1 ? argv[1] : "normal";
    struct utsname uts;
    uname(&uts);
    printf("Guest kernel %s %s; driver ipmi_si (KCS) + ipmi_devintf; pass: %s\n", uts.sysname, uts.release,
           mode.c_str());
    VmCheck::Checks checks;
    if (mode == "faults")
        VmCheck::faultPass(checks);
    else
        VmCheck::normalPass(checks);
    checks.summary();
    return checks.failed() == 0 ? 0 : 1;
}
