// Profiles of simulated servers: ipmi_sim emulator command files (as OpenIPMI
// and InfraSIM publish them) read into a controller model, or a raw
// `ipmitool sdr dump` file that stands in for one.
//
// The language, as ipmi_sim 2.0 reads it: one command per line; a line that
// ends in a backslash goes on on the next one; a line whose first non-blank
// character is '#' is a comment (also inside a continued command); "..."
// quotes a word; `define NAME "value"` makes $NAME expand outside quotes;
// `include "file"` reads another file (relative to the including one).
// Numbers follow C conventions: 0x hexadecimal, a leading 0 octal, otherwise
// decimal (ipmi_sim's manual calls them all hexadecimal, but its parser and
// the published profiles do not: `mc_add 0x20 32 ...` is device ID 0x20).
//
// Commands of the language that the model has no place for are skipped; a
// word that is not a command, a missing argument or a bad number fails the
// load with "file:line: message", as ipmi_sim stops at the first bad line.

#include <dlfcn.h>
#include <errno.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <fstream>
#include <map>
#include <set>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "Bmc.h"
#include "GeneratedServer.h"
#include "IpmiCommands.h"
#include "SdrLayout.h"

namespace Sim {

namespace {

using namespace Ipmi;

constexpr uint8_t kBmcAddress = 0x20;
// Includes nest at most this deep, so a file that includes itself fails.
constexpr int kMaxIncludeDepth = 8;
// Event state bits a sensor has (Get Sensor Reading bytes 3 and 4).
constexpr unsigned kStateBits = 15;
constexpr unsigned kThresholdCount = 6;
constexpr uint8_t kEventMessagesEnabled = 0x80;
constexpr uint8_t kScanningEnabled = 0x40;
constexpr uint32_t kMaxManufacturerId = 0xFFFFF;  // 20 bits
constexpr uint32_t kMaxFruSize = 0xFFFF;
constexpr size_t kSelAddBytes = 13;  // a SEL record after its ID and type

// Threshold access and hysteresis support codes of the SDR capabilities byte.
const std::map<std::string, uint8_t> kSupportNames = {{"none", 0}, {"readable", 1}, {"settable", 2}, {"fixed", 3}};
// Event message control support codes of the SDR capabilities byte.
const std::map<std::string, uint8_t> kEventSupportNames = {
    {"per-state", 0}, {"entire-sensor", 1}, {"global", 2}, {"none", 3}};

// ipmi_sim commands that the model has no place for: read and skipped.
const std::set<std::string> kSkippedCommands = {
    "quit",         "sleep",           "debug",         "read_cmds",       "set_working_mc",
    "mc_set_guid",  "mc_dump_fru_data", "mc_set_power", "mc_set_num_leds", "mc_new_event",
    "device_sdr_add",  "atca_enable",   "atca_set_site"};

struct Command {
    std::string file;
    int line = 0;
    std::vector<std::string> words;  // words[0] is the command
};

class SyntaxError : public std::runtime_error {
public:
    SyntaxError(const Command& c, const std::string& message)
        : std::runtime_error(c.file + ":" + std::to_string(c.line) + ": " + message) {}
};

std::string directoryOf(const std::string& path) {
    size_t slash = path.rfind('/');
    return slash == std::string::npos ? std::string() : path.substr(0, slash + 1);
}

bool isNameChar(char c) { return std::isalnum(static_cast<unsigned char>(c)) || c == '_'; }

// Digits of `text` in `base`, or false when one is not a digit of it or the value passes 32 bits.
bool digitsValue(const std::string& text, size_t from, unsigned base, uint32_t& out) {
    if (from >= text.size()) return false;
    uint64_t v = 0;
    for (size_t i = from; i < text.size(); ++i) {
        char c = static_cast<char>(std::tolower(static_cast<unsigned char>(text[i])));
        unsigned d;
        if (c >= '0' && c <= '9')
            d = static_cast<unsigned>(c - '0');
        else if (c >= 'a' && c <= 'f')
            d = static_cast<unsigned>(c - 'a' + 10);
        else
            return false;
        if (d >= base) return false;
        v = v * base + d;
        if (v > 0xFFFFFFFFull) return false;
    }
    out = static_cast<uint32_t>(v);
    return true;
}

class ProfileReader {
public:
    explicit ProfileReader(Bmc& bmc) : bmc_(bmc) {}

    void readFile(const std::string& path, int depth);
    void finish();

private:
    void run(const Command& c);
    std::vector<std::string> words(const Command& where, const std::string& text) const;

    // Argument access with the checks every command shares.
    void needArgs(const Command& c, size_t count, const char* usage) const;
    uint32_t number(const Command& c, size_t i, uint32_t max, const char* what) const;
    uint8_t byte(const Command& c, size_t i, const char* what) const {
        return static_cast<uint8_t>(number(c, i, 0xFF, what));
    }
    // An address given to mc_add before (ipmi_sim knows no other controller).
    uint8_t controller(const Command& c, size_t i) const;
    uint8_t named(const Command& c, size_t i, const std::map<std::string, uint8_t>& names, uint8_t max,
                  const char* what) const;
    bool flag(const Command& c, size_t i, const char* on, const char* off, const char* what) const;
    uint16_t bitmask(const Command& c, size_t i, size_t width, const char* what) const;
    SensorModel& sensor(const Command& c);
    // The full or compact record of a sensor, or null.
    const std::vector<uint8_t>* sensorRecord(const SensorModel& s) const;

    void mcAdd(const Command& c);
    void mcAddFruData(const Command& c);
    void selEnable(const Command& c);
    void selAdd(const Command& c);
    void mainSdrAdd(const Command& c);
    void sensorAdd(const Command& c);
    void sensorSetValue(const Command& c);
    void sensorSetBit(const Command& c, bool clearRest);
    void sensorSetThreshold(const Command& c);
    void sensorSetHysteresis(const Command& c);
    void sensorSetEventSupport(const Command& c);

    Bmc& bmc_;
    std::map<std::string, std::string> names_;
    std::map<uint8_t, Identity> controllers_;  // other controllers, by IPMB address
    static uint32_t keyOf(const SensorModel& s) { return uint32_t(s.owner) << 16 | uint32_t(s.lun) << 8 | s.number; }
    // Thresholds each sensor compares against, readable or not (the model keeps readable ones).
    std::map<uint32_t, uint8_t> thresholdsEnabled_;
    std::set<uint8_t> added_;
    std::set<uint8_t> enabled_;
};

void ProfileReader::readFile(const std::string& path, int depth) {
    // Refused with the system's reason, once: a directory opens as a stream
    // but reads as nothing.
    struct stat st;
    if (stat(path.c_str(), &st) != 0) throw std::runtime_error(path + ": " + strerror(errno));
    if (S_ISDIR(st.st_mode)) throw std::runtime_error(path + ": " + strerror(EISDIR));
    std::ifstream in(path);
    if (!in) throw std::runtime_error(path + ": " + strerror(errno));
    std::string physical;
    std::string joined;
    int lineNo = 0;
    int startLine = 0;
    bool continued = false;
    auto flush = [&]() {
        Command c;
        c.file = path;
        c.line = startLine;
        c.words = words(c, joined);
        joined.clear();
        continued = false;
        if (c.words.empty()) return;
        if (c.words[0] == "include") {
            needArgs(c, 2, "include \"file\"");
            if (depth >= kMaxIncludeDepth)
                throw SyntaxError(c, "includes nested more than " + std::to_string(kMaxIncludeDepth) + " deep");
            std::string target = c.words[1];
            if (target.empty() || target[0] != '/') target = directoryOf(path) + target;
            std::ifstream probe(target);
            if (!probe) throw SyntaxError(c, "cannot open include file " + target);
            readFile(target, depth + 1);
            return;
        }
        if (c.words[0] == "define") {
            needArgs(c, 3, "define name \"value\"");
            const std::string& name = c.words[1];
            if (name.empty() || !std::all_of(name.begin(), name.end(), isNameChar))
                throw SyntaxError(c, "bad name '" + name + "'");
            names_[name] = c.words[2];
            return;
        }
        run(c);
    };
    while (std::getline(in, physical)) {
        ++lineNo;
        while (!physical.empty() && std::isspace(static_cast<unsigned char>(physical.back()))) physical.pop_back();
        size_t first = physical.find_first_not_of(" \t");
        if (first != std::string::npos && physical[first] == '#') continue;
        if (!continued) startLine = lineNo;
        bool goesOn = !physical.empty() && physical.back() == '\\';
        if (goesOn) physical.pop_back();
        joined += physical;
        joined += ' ';
        continued = goesOn;
        if (!goesOn) flush();
    }
    if (continued) flush();
}

// Splits a command into words: blanks separate, "..." keeps blanks, $NAME
// expands outside quotes; pieces written next to each other form one word.
std::vector<std::string> ProfileReader::words(const Command& where, const std::string& text) const {
    std::vector<std::string> out;
    std::string word;
    bool inWord = false;
    for (size_t i = 0; i < text.size();) {
        char ch = text[i];
        if (ch == ' ' || ch == '\t' || ch == '\r') {
            if (inWord) out.push_back(word);
            word.clear();
            inWord = false;
            ++i;
        } else if (ch == '"') {
            size_t close = text.find('"', i + 1);
            if (close == std::string::npos) throw SyntaxError(where, "unterminated quote");
            word += text.substr(i + 1, close - i - 1);
            inWord = true;
            i = close + 1;
        } else if (ch == '$') {
            size_t end = i + 1;
            while (end < text.size() && isNameChar(text[end])) ++end;
            std::string name = text.substr(i + 1, end - i - 1);
            auto it = names_.find(name);
            if (name.empty() || it == names_.end()) throw SyntaxError(where, "undefined name $" + name);
            word += it->second;
            inWord = true;
            i = end;
        } else {
            word += ch;
            inWord = true;
            ++i;
        }
    }
    if (inWord) out.push_back(word);
    return out;
}

void ProfileReader::needArgs(const Command& c, size_t count, const char* usage) const {
    if (c.words.size() < count) throw SyntaxError(c, std::string("missing arguments, expected: ") + usage);
}

uint32_t ProfileReader::number(const Command& c, size_t i, uint32_t max, const char* what) const {
    if (i >= c.words.size()) throw SyntaxError(c, std::string("missing ") + what);
    const std::string& w = c.words[i];
    uint32_t v = 0;
    bool ok;
    if (w.size() > 2 && w[0] == '0' && (w[1] == 'x' || w[1] == 'X'))
        ok = digitsValue(w, 2, 16, v);
    else if (w.size() > 1 && w[0] == '0')
        ok = digitsValue(w, 1, 8, v);
    else
        ok = digitsValue(w, 0, 10, v);
    if (!ok) throw SyntaxError(c, "bad number '" + w + "' for " + what);
    if (v > max) throw SyntaxError(c, std::string(what) + " " + w + " is out of range");
    return v;
}

uint8_t ProfileReader::controller(const Command& c, size_t i) const {
    uint8_t addr = byte(c, i, "controller address");
    if (!added_.count(addr)) {
        std::ostringstream m;
        m << "no controller at 0x" << std::hex << unsigned(addr) << " (mc_add it first)";
        throw SyntaxError(c, m.str());
    }
    return addr;
}

uint8_t ProfileReader::named(const Command& c, size_t i, const std::map<std::string, uint8_t>& names,
                             uint8_t max, const char* what) const {
    if (i < c.words.size()) {
        auto it = names.find(c.words[i]);
        if (it != names.end()) return it->second;
    }
    return static_cast<uint8_t>(number(c, i, max, what));
}

bool ProfileReader::flag(const Command& c, size_t i, const char* on, const char* off, const char* what) const {
    if (i < c.words.size() && c.words[i] == on) return true;
    if (i < c.words.size() && c.words[i] == off) return false;
    return number(c, i, 0xFF, what) != 0;
}

// A string of '0' and '1' characters, leftmost the highest bit.
uint16_t ProfileReader::bitmask(const Command& c, size_t i, size_t width, const char* what) const {
    if (i >= c.words.size()) throw SyntaxError(c, std::string("missing ") + what);
    const std::string& w = c.words[i];
    if (w.size() != width || w.find_first_not_of("01") != std::string::npos)
        throw SyntaxError(c, std::string("bad ") + what + " '" + w + "': expected " + std::to_string(width) +
                                 " digits 0 or 1");
    uint16_t v = 0;
    for (char ch : w) v = static_cast<uint16_t>((v << 1) | (ch == '1' ? 1 : 0));
    return v;
}

// The sensor a sensor_set_* command names (words 1-3: controller, LUN, number).
SensorModel& ProfileReader::sensor(const Command& c) {
    uint8_t owner = controller(c, 1);
    uint8_t lun = static_cast<uint8_t>(number(c, 2, 3, "LUN"));
    uint8_t num = byte(c, 3, "sensor number");
    SensorModel* s = bmc_.findSensor(owner, lun, num);
    if (s == nullptr) {
        std::ostringstream m;
        m << "no sensor 0x" << std::hex << unsigned(num) << " on LUN " << unsigned(lun) << " of controller 0x"
          << unsigned(owner) << " (sensor_add it first)";
        throw SyntaxError(c, m.str());
    }
    return *s;
}

void ProfileReader::run(const Command& c) {
    const std::string& name = c.words[0];
    if (name == "mc_add") return mcAdd(c);
    if (name == "mc_enable" || name == "mc_disable" || name == "mc_delete") {
        uint8_t addr = controller(c, 1);
        if (name == "mc_enable")
            enabled_.insert(addr);
        else
            enabled_.erase(addr);
        if (name == "mc_delete") {
            controllers_.erase(addr);
            added_.erase(addr);
        }
        return;
    }
    if (name == "mc_setbmc") {
        if (byte(c, 1, "BMC address") != kBmcAddress) throw SyntaxError(c, "only a BMC at address 0x20 is modelled");
        return;
    }
    if (name == "mc_add_fru_data") return mcAddFruData(c);
    if (name == "sel_enable") return selEnable(c);
    if (name == "sel_add") return selAdd(c);
    if (name == "main_sdr_add") return mainSdrAdd(c);
    if (name == "sensor_add") return sensorAdd(c);
    if (name == "sensor_set_value") return sensorSetValue(c);
    if (name == "sensor_set_bit") return sensorSetBit(c, false);
    if (name == "sensor_set_bit_clr_rest") return sensorSetBit(c, true);
    if (name == "sensor_set_threshold") return sensorSetThreshold(c);
    if (name == "sensor_set_hysteresis") return sensorSetHysteresis(c);
    if (name == "sensor_set_event_support") return sensorSetEventSupport(c);
    if (kSkippedCommands.count(name)) return;
    throw SyntaxError(c, "unknown command '" + name + "'");
}

void ProfileReader::mcAdd(const Command& c) {
    needArgs(c, 10, "mc_add address device-id has-device-sdrs revision fw-major fw-minor support manufacturer product");
    uint8_t addr = byte(c, 1, "controller address");
    Identity id;
    id.deviceId = byte(c, 2, "device ID");
    id.hasDeviceSdrs = flag(c, 3, "has-device-sdrs", "no-device-sdrs", "device SDR flag");
    id.deviceRevision = byte(c, 4, "device revision");
    id.fwMajor = byte(c, 5, "firmware major revision");
    id.fwMinor = byte(c, 6, "firmware minor revision");
    id.additionalSupport = byte(c, 7, "device support");
    id.manufacturerId = number(c, 8, kMaxManufacturerId, "manufacturer ID");
    id.productId = static_cast<uint16_t>(number(c, 9, 0xFFFF, "product ID"));
    for (size_t i = 10; i < c.words.size(); ++i)
        if (c.words[i] != "dynsens" && c.words[i] != "persist_sdr")
            throw SyntaxError(c, "unknown controller option '" + c.words[i] + "'");
    added_.insert(addr);
    if (addr == kBmcAddress)
        bmc_.identity = id;
    else
        controllers_[addr] = id;
}

void ProfileReader::mcAddFruData(const Command& c) {
    needArgs(c, 5, "mc_add_fru_data mc device-id size (data bytes... | file offset \"name\")");
    uint8_t addr = controller(c, 1);
    uint8_t device = byte(c, 2, "FRU device ID");
    uint32_t size = number(c, 3, kMaxFruSize, "FRU size");
    std::vector<uint8_t> image;
    if (c.words[4] == "data") {
        if (c.words.size() - 5 > size) throw SyntaxError(c, "more FRU data than the FRU size");
        for (size_t i = 5; i < c.words.size(); ++i) image.push_back(byte(c, i, "FRU data byte"));
    } else if (c.words[4] == "file") {
        needArgs(c, 7, "mc_add_fru_data mc device-id size file offset \"name\"");
        uint32_t offset = number(c, 5, 0xFFFFFFFF, "file offset");
        std::string path = c.words[6];
        if (path.empty() || path[0] != '/') path = directoryOf(c.file) + path;
        std::ifstream in(path, std::ios::binary);
        // ipmi_sim reads such a file (often a sysfs EEPROM) only when asked;
        // one that is absent here leaves the device absent.
        if (!in) return;
        in.seekg(offset);
        image.resize(size);
        in.read(reinterpret_cast<char*>(image.data()), static_cast<std::streamsize>(size));
        image.resize(static_cast<size_t>(std::max<std::streamsize>(in.gcount(), 0)));
    } else {
        throw SyntaxError(c, "expected 'data' or 'file', found '" + c.words[4] + "'");
    }
    // FRU devices of other controllers are not modelled.
    if (addr != kBmcAddress) return;
    image.resize(size, 0);
    bmc_.fru.devices[device].data = image;
}

void ProfileReader::selEnable(const Command& c) {
    needArgs(c, 4, "sel_enable mc max-entries flags");
    uint8_t addr = controller(c, 1);
    uint16_t maxEntries = static_cast<uint16_t>(number(c, 2, 0xFFFF, "SEL size"));
    uint8_t flags = byte(c, 3, "SEL flags");
    if (addr != kBmcAddress) return;
    SelModel& sel = bmc_.sel;
    sel.enabled = true;
    sel.operationSupport = flags;
    sel.allocationUnits = maxEntries;
}

// A record given with a time stamp keeps it; one with 0 gets the SEL clock.
void ProfileReader::selAdd(const Command& c) {
    needArgs(c, 3 + kSelAddBytes, "sel_add mc record-type byte1 ... byte13");
    uint8_t addr = controller(c, 1);
    uint8_t record[16] = {};
    record[2] = byte(c, 2, "SEL record type");
    for (size_t i = 0; i < kSelAddBytes; ++i) record[3 + i] = byte(c, 3 + i, "SEL record byte");
    if (addr != kBmcAddress) return;
    const bool stamped = record[3] | record[4] | record[5] | record[6];
    if (addSelRecord(bmc_, record, stamped) == 0) throw SyntaxError(c, "the SEL is full");
}

void ProfileReader::mainSdrAdd(const Command& c) {
    needArgs(c, 2 + sdr::header::length, "main_sdr_add mc byte1 byte2 ... (a whole record)");
    uint8_t addr = controller(c, 1);
    std::vector<uint8_t> record;
    for (size_t i = 2; i < c.words.size(); ++i) record.push_back(byte(c, i, "SDR byte"));
    size_t body = record.size() - sdr::header::length;
    if (record[sdr::header::remainingLength] != body)
        throw SyntaxError(c, "record length byte says " + std::to_string(record[sdr::header::remainingLength]) +
                                 " bytes follow the header, but " + std::to_string(body) + " do");
    // ipmi_sim keeps a main repository for every controller; only the BMC's is read.
    if (addr == kBmcAddress) bmc_.sdr.records.push_back(record);
}

void ProfileReader::sensorAdd(const Command& c) {
    needArgs(c, 6, "sensor_add mc lun sensor type event-reading-code [poll ...] [event-only]");
    SensorModel s;
    s.owner = controller(c, 1);
    s.lun = static_cast<uint8_t>(number(c, 2, 3, "LUN"));
    s.number = byte(c, 3, "sensor number");
    s.type = byte(c, 4, "sensor type");
    s.eventReadingType = byte(c, 5, "event/reading type code");
    size_t end = c.words.size();
    if (end > 6 && c.words[end - 1] == "event-only") {
        s.eventOnly = true;
        --end;
    }
    // A polled sensor reads its value from a file; here it keeps the value it is set to.
    if (end > 6 && c.words[6] != "poll") throw SyntaxError(c, "unknown sensor option '" + c.words[6] + "'");
    if (end > 6 && end < 9) throw SyntaxError(c, "missing arguments, expected: poll rate type [options]");
    if (bmc_.findSensor(s.owner, s.lun, s.number) != nullptr) throw SyntaxError(c, "sensor added twice");
    // Events and scanning stay off until sensor_set_event_support turns them on.
    s.statusBits = 0;
    s.eventFlags = 0;
    bmc_.sensors.push_back(s);
}

const std::vector<uint8_t>* ProfileReader::sensorRecord(const SensorModel& s) const {
    for (const auto& r : bmc_.sdr.records) {
        sdr::SensorRecordView v(r.data(), r.size());
        if (v.isFullOrCompact() && v.ownerId() == s.owner && v.ownerLun() == s.lun && v.sensorNumber() == s.number)
            return &r;
    }
    return nullptr;
}

// A reading as the number it stands for in an analog data format.
int signedValue(uint8_t raw, uint8_t format) {
    if (format == sdr::analogFormat::twosComplement) return static_cast<int8_t>(raw);
    if (format == sdr::analogFormat::onesComplement) return (raw & 0x80) ? -static_cast<int>(~raw & 0x7F) : raw;
    return raw;
}

// A new value of a threshold sensor sets its comparison status against the
// thresholds enabled so far, in the analog data format of its SDR (a signed
// sensor compares signed). Thresholds set later do not change the status, and
// sensor_set_bit overrides it: profiles captured from servers carry the
// status those servers reported.
void ProfileReader::sensorSetValue(const Command& c) {
    needArgs(c, 5, "sensor_set_value mc lun sensor value [generate-event]");
    SensorModel& s = sensor(c);
    s.reading = byte(c, 4, "sensor value");
    if (s.eventReadingType != sdr::eventReadingTypeThreshold) return;
    const std::vector<uint8_t>* record = sensorRecord(s);
    uint8_t format = sdr::analogFormat::unsignedValue;
    if (record != nullptr) format = sdr::SensorRecordView(record->data(), record->size()).analogDataFormat();
    if (format == sdr::analogFormat::noAnalogReading) return;
    const int reading = signedValue(s.reading, format);
    const uint8_t enabled = thresholdsEnabled_[keyOf(s)];
    for (unsigned i = 0; i < kThresholdCount; ++i) {
        if (!(enabled & (1u << i))) continue;
        const int threshold = signedValue(s.thresholds[i], format);
        const bool lower = i < 3;  // LNC, LC, LNR, then UNC, UC, UNR
        const uint16_t bit = static_cast<uint16_t>(1u << i);
        const bool crossed = lower ? reading <= threshold : reading >= threshold;
        s.states = crossed ? static_cast<uint16_t>(s.states | bit) : static_cast<uint16_t>(s.states & ~bit);
    }
}

void ProfileReader::sensorSetBit(const Command& c, bool clearRest) {
    needArgs(c, 6, "sensor_set_bit mc lun sensor bit value [generate-event]");
    SensorModel& s = sensor(c);
    unsigned bit = number(c, 4, kStateBits - 1, "state bit");
    bool on = number(c, 5, 1, "bit value") != 0;
    uint16_t mask = static_cast<uint16_t>(1u << bit);
    if (clearRest) s.states = 0;
    s.states = on ? static_cast<uint16_t>(s.states | mask) : static_cast<uint16_t>(s.states & ~mask);
}

void ProfileReader::sensorSetThreshold(const Command& c) {
    needArgs(c, 6, "sensor_set_threshold mc lun sensor support enabled [value5 ... value0]");
    SensorModel& s = sensor(c);
    uint8_t support = named(c, 4, kSupportNames, 3, "threshold support");
    uint8_t enabled = static_cast<uint8_t>(bitmask(c, 5, kThresholdCount, "threshold mask"));
    if (c.words.size() > 6 + kThresholdCount) throw SyntaxError(c, "more than 6 threshold values");
    // Values come highest threshold first: upper non-recoverable down to lower non-critical.
    for (size_t i = 6; i < c.words.size(); ++i)
        s.thresholds[kThresholdCount - 1 - (i - 6)] = byte(c, i, "threshold value");
    const bool readable = support == kSupportNames.at("readable") || support == kSupportNames.at("settable");
    thresholdsEnabled_[keyOf(s)] = enabled;
    s.readableMask = readable ? enabled : 0;
    s.settableMask = support == kSupportNames.at("settable") ? enabled : 0;
}

void ProfileReader::sensorSetHysteresis(const Command& c) {
    needArgs(c, 7, "sensor_set_hysteresis mc lun sensor support positive negative");
    SensorModel& s = sensor(c);
    s.hysteresisSupport = named(c, 4, kSupportNames, 3, "hysteresis support");
    s.hysteresisPositive = byte(c, 5, "positive hysteresis");
    s.hysteresisNegative = byte(c, 6, "negative hysteresis");
}

void ProfileReader::sensorSetEventSupport(const Command& c) {
    needArgs(c, 11,
             "sensor_set_event_support mc lun sensor events-enable scanning event-support "
             "assert-support deassert-support assert-enabled deassert-enabled");
    SensorModel& s = sensor(c);
    bool events = flag(c, 4, "enable", "disable", "events-enable");
    bool scanning = flag(c, 5, "scanning", "no-scanning", "scanning");
    s.eventSupport = named(c, 6, kEventSupportNames, 3, "event support");
    uint16_t assertSupport = bitmask(c, 7, kStateBits, "assertion support mask");
    uint16_t deassertSupport = bitmask(c, 8, kStateBits, "deassertion support mask");
    // A controller enables no event that the sensor cannot generate.
    s.assertEnables = bitmask(c, 9, kStateBits, "assertion enable mask") & assertSupport;
    s.deassertEnables = bitmask(c, 10, kStateBits, "deassertion enable mask") & deassertSupport;
    uint8_t flags = static_cast<uint8_t>((events ? kEventMessagesEnabled : 0) | (scanning ? kScanningEnabled : 0));
    s.eventFlags = flags;
    s.statusBits = static_cast<uint8_t>((s.statusBits & ~(kEventMessagesEnabled | kScanningEnabled)) | flags);
}

void ProfileReader::finish() {
    for (const auto& c : controllers_)
        if (enabled_.count(c.first)) bmc_.satellites[c.first] = c.second;
}

bool endsWith(const std::string& s, const std::string& tail) {
    return s.size() >= tail.size() && s.compare(s.size() - tail.size(), tail.size(), tail) == 0;
}

}  // namespace

std::shared_ptr<Bmc> loadProfile(const std::string& path) {
    size_t records = 0;
    if (generatedProfile(path, records)) return generatedServer(records);
    auto bmc = std::make_shared<Bmc>();
    if (endsWith(path, ".sdr")) {
        loadSdrDump(*bmc, path);
        return bmc;
    }
    if (endsWith(path, ".sel")) {  // a controller whose SEL holds these records
        loadSelDump(*bmc, path);
        return bmc;
    }
    // A profile has a SEL only if it enables one.
    bmc->sel.enabled = false;
    ProfileReader reader(*bmc);
    reader.readFile(path, 0);
    reader.finish();
    return bmc;
}

std::string defaultProfilePath() {
#ifdef TAV_IPMI_SIM_PROFILE_DIR
    return std::string(TAV_IPMI_SIM_PROFILE_DIR) + "/default.emu";
#else
    // The preload library: its profiles lie beside it in the build tree and
    // under the data directory once installed, so no build path is kept in it.
    Dl_info self;
    if (dladdr(reinterpret_cast<void*>(&defaultProfilePath), &self) == 0 || self.dli_fname == nullptr)
        return "default.emu";
    std::string dir = self.dli_fname;
    dir = dir.substr(0, dir.rfind('/') + 1);
    const std::string besideLibrary = dir + "profiles/default.emu";
    if (access(besideLibrary.c_str(), R_OK) == 0) return besideLibrary;
#ifdef TAV_IPMI_SIM_PROFILES_FROM_LIB
    return dir + TAV_IPMI_SIM_PROFILES_FROM_LIB + "/default.emu";
#else
    return besideLibrary;
#endif
#endif
}

}  // namespace Sim
