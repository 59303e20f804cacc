#include "Metrics.h"

#include <stdio.h>
#include <time.h>

#include <atomic>
#include <cctype>

#include "IpmiIfc.h"
#include "Identity.h"
#include "SensorFacts.h"

namespace Tool {

namespace {

std::atomic<double> readingMaxAge{0};

// Whether a reading taken at `readingTimeUs` (0: never) is current now.
bool current(uint64_t readingTimeUs, double nowSeconds) {
    const double maxAge = readingMaxAge.load();
    return maxAge <= 0 || (readingTimeUs != 0 && nowSeconds - static_cast<double>(readingTimeUs) / 1e6 <= maxAge);
}

std::vector<MetricSource>& sources() {
    static std::vector<MetricSource> all;
    return all;
}

std::string escapeLabel(const std::string& v) {
    std::string out;
    for (char c : v) {
        if (c == '\\') out += "\\\\";
        else if (c == '"') out += "\\\"";
        else if (c == '\n') out += "\\n";
        else out += c;
    }
    return out;
}

std::string number(double v) {
    char text[40];
    snprintf(text, sizeof text, "%.17g", v);  // round-trips: scraped values equal the tool's JSON
    return text;
}

// Base unit names as Prometheus spells them; other units are named as the
// record names them, in snake case.
std::string unitSuffix(const std::string& unit) {
    static const std::map<std::string, std::string> known = {
        {"degrees C", "celsius"}, {"degrees F", "fahrenheit"}, {"degrees K", "kelvin"}, {"Volts", "volts"},
        {"Amps", "amperes"},      {"Watts", "watts"},          {"Joules", "joules"},    {"RPM", "rpm"},
        {"Hz", "hertz"},          {"percent", "percent"},      {"second", "seconds"},
    };
    auto it = known.find(unit);
    if (it != known.end()) return it->second;
    if (unit.empty()) return "value";
    std::string out;
    for (char c : unit) {
        const bool word = isalnum(static_cast<unsigned char>(c)) != 0;
        if (word) out += static_cast<char>(tolower(static_cast<unsigned char>(c)));
        else if (!out.empty() && out.back() != '_') out += '_';
    }
    while (!out.empty() && out.back() == '_') out.pop_back();
    return out.empty() ? "value" : out;
}

void addIdentity(MetricSet& m) {
    Ipmi::ipmiifc_device_id id;
    if (Ipmi::IpmiIfc::getManagementControllerInfo(0, id) != 0) return;
    m.add("tavipmi_bmc_info", "gauge", "Identity of the baseboard management controller.",
          {{"manufacturer", Ipmi::IpmiIfc::GetBmcManufacturer()},
           {"manufacturer_id", std::to_string(manufacturerId(id))},
           {"device_id", std::to_string(id.device_id)},
           {"device_revision", std::to_string(id.device_revision & 0x0F)},
           {"firmware_revision", firmwareRevision(id)},
           {"ipmi_version", Ipmi::IpmiIfc::GetBmcIpmiVersion()},
           {"product_id", std::to_string(id.product_id[0] | (id.product_id[1] << 8))}},
          1);
}

void addSensors(MetricSet& m) {
    struct timespec now;
    clock_gettime(CLOCK_REALTIME, &now);
    const double nowSeconds = static_cast<double>(now.tv_sec) + now.tv_nsec / 1e9;
    for (const auto& f : sensorFacts(false)) {
        const bool fresh = current(f.readingTime, nowSeconds);
        const Labels labels = {
            {"name", f.name}, {"number", std::to_string(f.number)}, {"entity", f.entity}, {"type", f.type}};
        const std::string suffix = unitSuffix(f.unit);
        if (f.reading && fresh)
            m.add("tavipmi_sensor_" + suffix, "gauge", "Sensor reading in " + (f.unit.empty() ? "raw units" : f.unit) + ".",
                  labels, *f.reading);
        for (int t = 0; t < kThresholds; ++t) {
            if (!f.threshold[t]) continue;
            Labels withThreshold = labels;
            withThreshold.emplace_back("threshold", kThresholdKeys[t]);
            m.add("tavipmi_sensor_threshold_" + suffix, "gauge",
                  "Sensor threshold in " + (f.unit.empty() ? "raw units" : f.unit) + ".", withThreshold,
                  *f.threshold[t]);
        }
        if (f.stateBits && fresh)
            m.add("tavipmi_sensor_state", "gauge",
                  "State bits of the last reading: thresholds crossed (bit 0 lnc to bit 5 unr) or discrete states.",
                  labels, *f.stateBits);
        if (f.health && fresh)
            m.add("tavipmi_sensor_health_state", "gauge",
                  "CIM HealthState of the sensor: 0 unknown, 5 OK, 10 degraded, 25 critical failure.", labels,
                  *f.health);
    }
}

}  // namespace

void MetricSet::add(const std::string& name, const char* type, const std::string& help, const Labels& labels,
                    double value) {
    auto it = families_.find(name);
    if (it == families_.end()) {
        order_.push_back(name);
        it = families_.emplace(name, Family{type, help, {}}).first;
    }
    std::string sample = name;
    if (!labels.empty()) {
        sample += "{";
        for (size_t i = 0; i < labels.size(); ++i)
            sample += (i ? "," : "") + labels[i].first + "=\"" + escapeLabel(labels[i].second) + "\"";
        sample += "}";
    }
    it->second.samples.push_back(sample + " " + number(value));
}

std::string MetricSet::text() const {
    std::string out;
    for (const auto& name : order_) {
        const Family& f = families_.at(name);
        out += "# HELP " + name + " " + f.help + "\n# TYPE " + name + " " + f.type + "\n";
        for (const auto& s : f.samples) out += s + "\n";
    }
    return out;
}

void addMetricSource(MetricSource source) { sources().push_back(std::move(source)); }

void setReadingMaxAge(double seconds) { readingMaxAge.store(seconds); }

std::string metricsText() {
    MetricSet m;
    addIdentity(m);
    addSensors(m);
    for (const auto& s : sources()) s(m);
    return m.text();
}

}  // namespace Tool
