#include <math.h>
#include <stdio.h>

#include <exception>
#include <memory>
#include <string>
#include <vector>

#include "IpmiIfc.h"
#include "IpmiMapper.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "Views.h"

namespace {

// Threshold comparison bits of a reading, with the short names ipmitool
// users know.
const struct {
    unsigned bit;
    const char* name;
} kThresholdStates[] = {
    {0x20, "unr"}, {0x10, "ucr"}, {0x08, "unc"}, {0x04, "lnr"}, {0x02, "lcr"}, {0x01, "lnc"},
};

std::string thresholdStateText(unsigned bits) {
    if (bits == 0) return "ok";
    std::string out;
    for (const auto& s : kThresholdStates) {
        if ((bits & s.bit) == 0) continue;
        if (!out.empty()) out += ",";
        out += s.name;
    }
    return out;
}

std::string healthText(Ipmi::IpmiSensor& sensor) {
    int state = 0;
    if (!sensor.getSensorState(state)) return "na";
    switch (state) {
    case Ipmi::HEALTH_OK: return "OK";
    case Ipmi::HEALTH_DEGRADED: return "Degraded";
    case Ipmi::HEALTH_MINOR_FAILURE: return "Minor failure";
    case Ipmi::HEALTH_MAJOR_FAILURE: return "Major failure";
    case Ipmi::HEALTH_CRITICAL_FAILURE: return "Critical failure";
    case Ipmi::HEALTH_NON_RECOVERABLE: return "Non-recoverable";
    default: return "Unknown";
    }
}

// Whole values print without decimals, as the controller's own tools do.
std::string valueText(double v) {
    char text[48];
    if (v == floor(v) && fabs(v) < 1e9)
        snprintf(text, sizeof text, "%.0f", v);
    else
        snprintf(text, sizeof text, "%.2f", v);
    return text;
}

struct Row {
    std::string name, type, reading, status, health;
};

Row thresholdRow(Ipmi::IpmiSensor& sensor) {
    Row row;
    const unsigned raw = sensor.getReading();  // asks the controller
    if (sensor.readingStateUnavailable() || sensor.scanningDisabled() || !sensor.isConvertible()) {
        row.reading = "na";
    } else {
        row.reading = valueText(sensor.convertRawValue(raw));
        const std::string unit = sensor.getBaseUnitString();
        if (!unit.empty()) row.reading += " " + unit;
    }
    // An absent sensor's state reads as "ok" from its empty answer: say nothing instead.
    row.status = "na";
    if (!sensor.readingStateUnavailable()) {
        try {
            row.status = thresholdStateText(sensor.getState(false));
        } catch (const std::exception&) {
        }
    }
    row.health = healthText(sensor);
    return row;
}

Row discreteRow(Ipmi::IpmiSensor& sensor) {
    Row row;
    row.health = healthText(sensor);  // asks the controller; the state text reads that answer
    row.reading = sensor.convertToEnumeration();
    row.status = "-";
    return row;
}

bool isEventOnly(const Ipmi::IpmiSensor& sensor) {
    const unsigned char* record = nullptr;
    int length = 0;
    sensor.RawRecord(record, length);
    return Ipmi::sdr::SdrView(record, length > 0 ? static_cast<size_t>(length) : 0).isEventOnly();
}

// Every sensor callers get: its name, type, reading (in units for threshold
// sensors, the state text for discrete ones), threshold state and health.
int showSensors(const std::vector<std::string>&) {
    // Without a polling loop nothing has read the repository yet: the refresh
    // chain reads it and builds the sensors with their first readings.
    if (Ipmi::IpmiIfcSdrGetInfo(0) != 0) fprintf(stderr, "tavipmi: could not read the SDR repository\n");
    const std::vector<std::shared_ptr<Ipmi::IpmiSensor>> sensors = Ipmi::IpmiIfc::getSensors(0);

    printf("Sensors\n");
    if (sensors.empty()) {
        printf("  (none)\n");
        return 0;
    }
    printf("  %-16s | %-24s | %-24s | %-7s | %s\n", "Name", "Type", "Reading", "Status", "Health");
    for (const auto& sensor : sensors) {
        Row row;
        if (isEventOnly(*sensor)) {
            row.reading = "event only";
            row.status = "-";
            row.health = "na";
        } else {
            row = sensor->isDiscrete() ? discreteRow(*sensor) : thresholdRow(*sensor);
        }
        row.name = sensor->getSensorIdString();
        row.type = sensor->getSensorTypeString();
        printf("  %-16s | %-24s | %-24s | %-7s | %s\n", row.name.c_str(), row.type.c_str(), row.reading.c_str(),
               row.status.c_str(), row.health.c_str());
    }
    return 0;
}

Tool::ViewRegistrar reg("sensors", Tool::View{"sensors with readings, states and health", showSensors, 30, true});

}  // namespace
