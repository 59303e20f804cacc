#include "LoopHealth.h"

#include "IpmiIfc.h"

namespace Tool {

namespace {

using Ipmi::IpmiIfc;

struct Named {
    int value;
    const char* name;
};
const Named kCaches[] = {{IpmiIfc::IPMI_CACHE_SENSORS, "sensors"},
                         {IpmiIfc::IPMI_CACHE_SDR, "sdr"},
                         {IpmiIfc::IPMI_CACHE_SEL, "sel"},
                         {IpmiIfc::IPMI_CACHE_FRU, "fru"},
                         {IpmiIfc::IPMI_CACHE_LAN, "lan"}};
const Named kResults[] = {{IpmiIfc::IPMI_EXCHANGE_OK, "ok"},
                          {IpmiIfc::IPMI_EXCHANGE_COMPLETION_CODE, "completion_code"},
                          {IpmiIfc::IPMI_EXCHANGE_TIMEOUT, "timeout"},
                          {IpmiIfc::IPMI_EXCHANGE_ERROR, "error"}};

}  // namespace

void addLoopHealth(MetricSet& m, double maxAge) {
    const double lastPass = IpmiIfc::getLastPassTime(0);
    m.add("tavipmi_up", "gauge", "1 when the polling loop's last pass reached the controller, else 0.", {},
          lastPass > 0 && IpmiIfc::lastPassReachedController(0) ? 1 : 0);
    // A time that has never been is left out rather than published as 1970.
    if (lastPass > 0) {
        m.add("tavipmi_last_pass_timestamp_seconds", "gauge", "When the polling loop's last pass ended.", {},
              lastPass);
        m.add("tavipmi_last_pass_duration_seconds", "gauge", "How long the polling loop's last pass took.", {},
              IpmiIfc::getLastPassDuration(0));
    }
    if (const double t = IpmiIfc::getLastSuccessfulPassTime(0); t > 0)
        m.add("tavipmi_last_successful_pass_timestamp_seconds", "gauge",
              "When the last pass that reached the controller ended.", {}, t);
    for (const Named& c : kCaches) {
        const double t = IpmiIfc::getCacheRefreshTime(0, static_cast<IpmiIfc::IPMI_CACHE>(c.value));
        if (t > 0)
            m.add("tavipmi_last_refresh_timestamp_seconds", "gauge",
                  "When the polling loop last refreshed a cache (sensors, sdr, sel, fru, lan).", {{"cache", c.name}},
                  t);
    }
    for (const Named& r : kResults)
        m.add("tavipmi_exchanges_total", "counter",
              "Exchanges with the controller since the tool started, by result (ok, completion_code, timeout, "
              "error).",
              {{"result", r.name}},
              static_cast<double>(IpmiIfc::getExchangeCount(0, static_cast<IpmiIfc::IPMI_EXCHANGE_RESULT>(r.value))));
    m.add("tavipmi_max_age_seconds", "gauge",
          "Age past which a reading is not published as current (--max-age).", {}, maxAge);
}

}  // namespace Tool
