#ifndef TAV_IPMI_TOOLS_METRICS_H
#define TAV_IPMI_TOOLS_METRICS_H

// The Prometheus text exposition of what the library has cached: `metrics`
// prints it once, `serve` answers GET /metrics with it. Building it sends
// nothing to the controller.

#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

namespace Tool {

using Labels = std::vector<std::pair<std::string, std::string>>;

// Samples grouped by metric family, each family under one HELP and TYPE line.
class MetricSet {
public:
    void add(const std::string& name, const char* type, const std::string& help, const Labels& labels, double value);
    std::string text() const;

private:
    struct Family {
        std::string type, help;
        std::vector<std::string> samples;
    };
    std::vector<std::string> order_;
    std::map<std::string, Family> families_;
};

// Further series (the SEL's and the FRU inventory's) register a source here.
using MetricSource = std::function<void(MetricSet&)>;
void addMetricSource(MetricSource source);

// Every series: controller identity, sensors, and the registered sources.
std::string metricsText();

// A reading (with its state bits and health state) taken longer ago than
// this many seconds is not current and is left out; thresholds stay. 0 (the
// default, for the one-shot `metrics`) publishes every reading.
void setReadingMaxAge(double seconds);

}  // namespace Tool

#endif
