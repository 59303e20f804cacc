// The metrics text that `tavipmi serve` answers scrapes with, built on other
// threads while the polling loop refreshes the sensors it reads.

#ifdef TAV_IPMI_TOOL_CORE

#include <thread>

#include "IpmiIfc.h"
#include "Metrics.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;

class Metrics : public TestSupport::SimTest {
protected:
    Metrics() { openDevice = false; }
};

TEST_F(Metrics, ScrapesWhileTheLoopRefreshesReadTheCaches) {
    useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
    TestSupport::LoopThread loop(1);
    ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING);
    std::thread refresher([] {
        bool shutdown = false;
        for (int i = 0; i < 5; ++i) IpmiIfc::pollAll(1, true, IPMI_POLL_SENSORS, &shutdown);
    });
    const std::string reading = "tavipmi_sensor_watts{name=\"PS1 Input Power\",number=\"64\",entity=\"10.1\",type=\"Other\"} 232\n";
    for (int i = 0; i < 5; ++i) EXPECT_NE(Tool::metricsText().find(reading), std::string::npos);
    refresher.join();
    EXPECT_GT(sim().exchanges(netfn::sensorEvent, cmd::getSensorReading), 0u);
}

// `serve` leaves out a reading (with its state and health) older than its
// max age: not current any more. The thresholds stay.
TEST_F(Metrics, ReadingsOlderThanTheMaxAgeAreLeftOut) {
    useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
    ASSERT_EQ(IpmiIfcOpenIpmiOpen(0), node().fd);
    ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    const std::string labels = "{name=\"PS1 Input Power\",number=\"64\",entity=\"10.1\",type=\"Other\"}";
    const std::string series[] = {"tavipmi_sensor_watts" + labels + " 232\n", "tavipmi_sensor_state" + labels,
                                  "tavipmi_sensor_health_state" + labels};
    Tool::setReadingMaxAge(60);
    std::string text = Tool::metricsText();
    for (const auto& s : series) EXPECT_NE(text.find(s), std::string::npos) << s;
    sim().clock().advanceNs(61'000'000'000);
    text = Tool::metricsText();
    Tool::setReadingMaxAge(0);
    for (const auto& s : series) EXPECT_EQ(text.find(s), std::string::npos) << s;
    EXPECT_NE(text.find("tavipmi_sensor_threshold_celsius{name=\"Inlet Temp\""), std::string::npos);
}

}  // namespace

#endif
