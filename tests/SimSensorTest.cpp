// The simulated controller's sensor commands answer as a real BMC does where
// the library's own sensor tests do not take them.

#include <gtest/gtest.h>

#include "IpmiCommands.h"
#include "TestSupport.h"

namespace {

using namespace Ipmi;
using Sim::Response;

constexpr uint8_t kThreshold = 0x05, kDiscrete = 0x06, kRemote = 0x10;

class SimSensor : public ::testing::Test {
protected:
    void SetUp() override {
        bmc.sensors.resize(3);
        threshold().number = kThreshold;
        threshold().eventReadingType = 0x01;
        threshold().reading = 0x42;
        discrete().number = kDiscrete;
        discrete().eventReadingType = 0x6F;
        discrete().states = 0x4001;
        bmc.sensors[2].owner = 0x2C;  // on a satellite controller, IPMB channel 6
        bmc.sensors[2].channel = 6;
        bmc.sensors[2].number = kRemote;
    }
    Response ask(uint8_t cmd, std::vector<uint8_t> data, uint8_t address = 0, uint8_t channel = 0) {
        return TestSupport::ask(bmc, netfn::sensorEvent, cmd, std::move(data), address, channel);
    }
    Sim::SensorModel& threshold() { return bmc.sensors[0]; }
    Sim::SensorModel& discrete() { return bmc.sensors[1]; }
    Sim::Bmc bmc;
};

TEST_F(SimSensor, RequestsReachOnlySensorsThatExistWhereTheyAreAsked) {
    EXPECT_EQ(Response{cc::requestedSensorNotPresent}, ask(cmd::getSensorReading, {0x77}));
    EXPECT_EQ(Response{cc::requestDataLengthInvalid}, ask(cmd::getSensorReading, {}));
    EXPECT_EQ(Response{cc::requestedSensorNotPresent}, ask(cmd::getSensorReading, {kThreshold}, 0x2C, 6));
    EXPECT_EQ(Response{cc::timeout}, ask(cmd::getSensorReading, {kRemote}, 0x2C, 0)) << "nothing at 0x2C on channel 0";
    EXPECT_EQ(0x42, ask(cmd::getSensorReading, {kThreshold}, 0x20).at(1)) << "the BMC itself on IPMB";
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorThresholds, {kDiscrete}));
    EXPECT_EQ(Response{cc::requestDataLengthInvalid}, ask(cmd::setSensorThresholds, {kThreshold, 0x10}));
    EXPECT_EQ(Response{cc::requestDataLengthInvalid}, ask(cmd::rearmSensorEvents, {kThreshold}));
}

TEST_F(SimSensor, HysteresisAndEventEnablesFollowTheSensorsSupport) {
    threshold().hysteresisSupport = 1;  // readable only
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::setSensorHysteresis, {kThreshold, 0xFF, 1, 1}));
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorHysteresis, {kDiscrete, 0xFF}));

    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorEventEnable, {kDiscrete, 0x90, 0x03, 0xC0}));
    EXPECT_EQ(0x80, ask(cmd::getSensorReading, {kDiscrete}).at(2)) << "scanning off shows in the status bits";
    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorEventEnable, {kDiscrete, 0xE0, 0x01}));  // disable selected
    EXPECT_EQ((Response{0x00, 0xC0, 0x02, 0x40, 0x00, 0x00}), ask(cmd::getSensorEventEnable, {kDiscrete}));
    EXPECT_EQ(Response{cc::invalidDataField}, ask(cmd::setSensorEventEnable, {kDiscrete, 0xB0}));
    discrete().eventSupport = 1;  // entire sensor only
    EXPECT_EQ((Response{0x00, 0xC0}), ask(cmd::getSensorEventEnable, {kDiscrete}));
    discrete().eventSupport = 3;  // no events
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorEventEnable, {kDiscrete}));

    EXPECT_EQ(Response{cc::ok}, ask(cmd::rearmSensorEvents, {kThreshold, 0x00}));
    EXPECT_EQ(0xFFFF, threshold().rearmedAssert) << "all events";
    EXPECT_EQ(1u, threshold().rearmCount);
}

}  // namespace
