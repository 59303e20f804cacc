#include <stdio.h>
#include <strings.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "IpmiIfc.h"
#include "IpmiSensor.h"
#include "SensorFacts.h"
#include "Views.h"

namespace {

using Tool::Json;

std::vector<std::string> typeFilter;
std::vector<std::string> chosenSensors;

Json optional(const std::optional<double>& v) { return v ? Json(*v) : Json(); }

std::string readingText(const Tool::SensorFacts& f) {
    if (!f.reading) return Tool::kNoValue;
    std::string text = Tool::cellText(*f.reading);
    return f.unit.empty() ? text : text + " " + f.unit;
}

std::string stateText(const Tool::SensorFacts& f) {
    if (f.eventOnly) return "event only";
    if (!f.present) return "not present";
    return f.state;
}

// The fields the sensors list and the threshold detail share.
Json sensorRecord(const Tool::SensorFacts& f) {
    Json r;
    r["number"] = f.number;
    r["entity"] = f.entity;
    r["entity_name"] = f.entityName;
    r["name"] = f.name;
    r["type"] = f.type;
    r["reading_text"] = readingText(f);
    r["reading"] = optional(f.reading);
    r["unit"] = f.unit.empty() ? Json() : Json(f.unit);
    const std::string state = stateText(f);
    r["state"] = state.empty() ? Json() : Json(state);
    for (int t = 0; t < Tool::kThresholds; ++t) r[Tool::kThresholdKeys[t]] = optional(f.threshold[t]);
    r["health"] = f.health ? Json(Tool::healthText(*f.health)) : Json();
    r["health_state"] = f.health ? Json(*f.health) : Json();
    return r;
}

std::vector<Tool::Column> sensorColumns(bool detail) {
    std::vector<Tool::Column> c = {
        {"name", detail ? "Sensor ID" : "Name"},
        {"number", detail ? "Sensor number" : "Num"},
        {"entity", "Entity"},
        {"entity_name", "Entity name", detail ? Tool::Column::Everywhere : Tool::Column::DataOnly},
        {"type", detail ? "Sensor type" : "Type"},
        {"reading_text", detail ? "Sensor reading" : "Reading", Tool::Column::TableOnly},
        {"reading", "Reading", Tool::Column::DataOnly},
        {"unit", "Unit", Tool::Column::DataOnly},
        {"state", detail ? "Status" : "State"},
    };
    for (int t = 0; t < Tool::kThresholds; ++t) {
        std::string label = Tool::kThresholdKeys[t];
        for (auto& ch : label) ch = static_cast<char>(toupper(ch));
        c.push_back({Tool::kThresholdKeys[t], detail ? Tool::kThresholdLabels[t] : label});
    }
    c.push_back({"health", "Health"});
    c.push_back({"health_state", "Health state", Tool::Column::DataOnly});
    return c;
}

bool typeMatches(const Tool::SensorFacts& f) {
    if (typeFilter.empty()) return true;
    for (const auto& t : typeFilter) {
        if (strcasecmp(t.c_str(), f.type.c_str()) == 0) return true;
        char* end = nullptr;
        const unsigned long code = strtoul(t.c_str(), &end, 0);
        if (!t.empty() && *end == '\0' && code == f.typeCode) return true;
    }
    return false;
}

void sensorOptions(CLI::App& sub) {
    sub.add_option("-t,--type", typeFilter, "only sensors of this type (name such as Temperature, or code)");
}

// Every sensor callers get, in SDR order: number, entity, name, type, reading
// in units (threshold sensors), state, thresholds and health.
int sensors(std::vector<Tool::Section>& out) {
    // Without a polling loop nothing has read the repository yet: the refresh
    // chain reads it and builds the sensors with their first readings.
    if (Ipmi::IpmiIfcSdrGetInfo(0) != 0) fprintf(stderr, "tavipmi: could not read the SDR repository\n");
    Tool::Section s;
    s.name = "sensors";
    s.title = "Sensors";
    s.columns = sensorColumns(false);
    for (const auto& f : Tool::sensorFacts(true))
        if (typeMatches(f)) s.records.push_back(sensorRecord(f));
    out.push_back(std::move(s));
    return 0;
}

void thresholdOptions(CLI::App& sub) {
    sub.add_option("SENSOR", chosenSensors, "sensor names or numbers (default: every threshold sensor)");
}

bool chosen(const Tool::SensorFacts& f) {
    if (chosenSensors.empty()) return !f.discrete;
    for (const auto& c : chosenSensors) {
        char* end = nullptr;
        const unsigned long number = strtoul(c.c_str(), &end, 0);
        if (c == f.name || (!c.empty() && *end == '\0' && number == f.number)) return true;
    }
    return false;
}

// Hysteresis is a distance, converted without the record's offset.
Json hysteresis(Ipmi::IpmiSensor& s, bool positive) {
    auto* t = dynamic_cast<Ipmi::IpmiThresholdSensor*>(&s);
    unsigned char p = 0, n = 0;
    if (t == nullptr || !s.isConvertible() || s.getHysteresisSupport() == 0 || t->getHysteresis(p, n, false) != 0)
        return Json();
    return s.convertRawValue(positive ? p : n) - s.convertRawValue(0);
}

// The record's own range values, for full records that carry them.
void addRange(Ipmi::IpmiSensor& s, Json& r) {
    if (!s.isConvertible()) return;
    if (s.isNominalReadingSet()) r["nominal"] = s.getNominalReading();
    if (s.isNormalMinSet()) r["normal_min"] = s.getNormalMin();
    if (s.isNormalMaxSet()) r["normal_max"] = s.getNormalMax();
    r["min_readable"] = s.getMinReadable();
    r["max_readable"] = s.getMaxReadable();
}

// One block per threshold sensor, as `ipmitool sensor get` shows it.
int thresholds(std::vector<Tool::Section>& out) {
    if (Ipmi::IpmiIfcSdrGetInfo(0) != 0) fprintf(stderr, "tavipmi: could not read the SDR repository\n");
    auto objects = Ipmi::IpmiIfc::getSensors(0);
    std::stable_sort(objects.begin(), objects.end(), [](const auto& a, const auto& b) {
        return a->getSensorRecordNumber() < b->getSensorRecordNumber();
    });
    const auto facts = Tool::sensorFacts(true);
    Tool::Section s;
    s.name = "thresholds";
    s.title = "Thresholds";
    s.layout = Tool::Section::Fields;
    s.columns = sensorColumns(true);
    for (const auto& extra : std::vector<Tool::Column>{{"positive_hysteresis", "Positive hysteresis"},
                                                       {"negative_hysteresis", "Negative hysteresis"},
                                                       {"nominal", "Nominal reading"},
                                                       {"normal_min", "Normal minimum"},
                                                       {"normal_max", "Normal maximum"},
                                                       {"min_readable", "Minimum readable"},
                                                       {"max_readable", "Maximum readable"}})
        s.columns.push_back(extra);
    for (size_t i = 0; i < facts.size() && i < objects.size(); ++i) {
        if (!chosen(facts[i])) continue;
        Json r = sensorRecord(facts[i]);
        r["positive_hysteresis"] = hysteresis(*objects[i], true);
        r["negative_hysteresis"] = hysteresis(*objects[i], false);
        addRange(*objects[i], r);
        s.records.push_back(std::move(r));
    }
    if (!chosenSensors.empty() && s.records.empty()) {
        fprintf(stderr, "tavipmi: no such sensor\n");
        return 1;
    }
    out.push_back(std::move(s));
    return 0;
}

Tool::ViewRegistrar regSensors("sensors", Tool::View{"sensors with readings, states, thresholds and health",
                                                     sensorOptions, sensors, 30, true});
Tool::ViewRegistrar regThresholds("thresholds", Tool::View{"[SENSOR...]: threshold sensors in detail, as ipmitool "
                                                           "sensor get shows them",
                                                           thresholdOptions, thresholds, 35, false});

}  // namespace
