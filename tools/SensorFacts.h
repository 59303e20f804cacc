#ifndef TAV_IPMI_TOOLS_SENSORFACTS_H
#define TAV_IPMI_TOOLS_SENSORFACTS_H

// What the tool shows of one sensor, taken from the library's caches alone:
// the views, `metrics` and `serve` read the same facts, and taking them sends
// nothing to the controller.

#include <optional>
#include <string>
#include <vector>

namespace Tool {

// The six thresholds in the order ipmitool lists them.
enum Threshold { Lnr, Lcr, Lnc, Unc, Ucr, Unr, kThresholds };
extern const char* const kThresholdKeys[kThresholds];    // "lnr", ...
extern const char* const kThresholdLabels[kThresholds];  // "Lower Non-Recoverable", ...

struct SensorFacts {
    unsigned number = 0;
    std::string entity;  // "id.instance", as ipmitool shows it
    std::string entityName;
    std::string name;
    std::string type;
    unsigned typeCode = 0;
    unsigned eventReadingType = 0;
    bool discrete = false;
    bool eventOnly = false;
    bool present = true;                  // false: the controller says it has no such sensor
    std::optional<double> reading;        // threshold sensors with a reading
    std::string unit;                     // "" when the record names none
    std::optional<double> threshold[kThresholds];
    std::optional<unsigned> stateBits;    // comparison bits or discrete states of the last reading
    std::string state;                    // "ok", "ucr", the discrete state's text; "" when unknown
    std::optional<int> health;            // CIM HealthState
    uint64_t readingTime = 0;             // microseconds since the epoch; 0: never read
};

// Every sensor in SDR (record ID) order. `describe` adds the discrete states' text, which
// asks the controller for each discrete sensor's state: only for one-shot views, never beside a
// running polling loop.
std::vector<SensorFacts> sensorFacts(bool describe);

std::string healthText(int state);

}  // namespace Tool

#endif
