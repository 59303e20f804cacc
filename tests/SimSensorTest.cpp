// The simulated controller's sensor commands answer as a real BMC does.

#include <gtest/gtest.h>

#include "Bmc.h"
#include "IpmiCommands.h"

namespace {

using namespace Ipmi;
using Sim::Response;

constexpr uint8_t kThreshold = 0x05, kDiscrete = 0x06;

class SimSensor : public ::testing::Test {
protected:
    void SetUp() override {
        bmc.sensors.resize(3);
        Sim::SensorModel& t = threshold();
        t.number = kThreshold;
        t.eventReadingType = 0x01;
        t.reading = 0x42;
        t.states = 0x08;
        t.readableMask = 0x12;
        t.settableMask = 0x10;
        t.thresholds[1] = 10;
        t.thresholds[4] = 90;
        discrete().number = kDiscrete;
        discrete().eventReadingType = 0x6F;
        discrete().states = 0x4001;
        Sim::SensorModel& remote = bmc.sensors[2];  // on a satellite controller, IPMB channel 6
        remote.owner = 0x2C;
        remote.channel = 6;
        remote.number = 0x10;
        remote.eventReadingType = 0x01;
        remote.reading = 7;
    }
    Response ask(uint8_t cmd, std::vector<uint8_t> data, uint8_t address = 0, uint8_t channel = 0) {
        Sim::Request r;
        r.netfn = netfn::sensorEvent;
        r.cmd = cmd;
        r.data = std::move(data);
        r.viaIpmb = address != 0;
        r.address = address;
        r.channel = channel;
        return bmc.handle(r);
    }
    Sim::SensorModel& threshold() { return bmc.sensors[0]; }
    Sim::SensorModel& discrete() { return bmc.sensors[1]; }
    Sim::Bmc bmc;
};

TEST_F(SimSensor, ReadingsReachOnlySensorsThatExistWhereTheyAreAsked) {
    EXPECT_EQ((Response{0x00, 0x42, 0xC0, 0x08}), ask(cmd::getSensorReading, {kThreshold}));
    EXPECT_EQ((Response{0x00, 0x00, 0xC0, 0x01, 0x40}), ask(cmd::getSensorReading, {kDiscrete}));
    EXPECT_EQ(Response{cc::requestedSensorNotPresent}, ask(cmd::getSensorReading, {0x77}));
    EXPECT_EQ(Response{cc::requestDataLengthInvalid}, ask(cmd::getSensorReading, {}));
    EXPECT_EQ((Response{0x00, 7, 0xC0, 0x00}), ask(cmd::getSensorReading, {0x10}, 0x2C, 6));
    EXPECT_EQ(Response{cc::requestedSensorNotPresent}, ask(cmd::getSensorReading, {kThreshold}, 0x2C, 6));
    EXPECT_EQ(Response{cc::timeout}, ask(cmd::getSensorReading, {0x10}, 0x2C, 0)) << "nothing at 0x2C on channel 0";
    EXPECT_EQ((Response{0x00, 0x42, 0xC0, 0x08}), ask(cmd::getSensorReading, {kThreshold}, 0x20)) << "the BMC on IPMB";
    threshold().present = false;
    EXPECT_EQ(Response{cc::requestedSensorNotPresent}, ask(cmd::getSensorReading, {kThreshold}));
}

TEST_F(SimSensor, ThresholdsAndHysteresisOnlyWhereTheSensorSupportsThem) {
    EXPECT_EQ((Response{0x00, 0x12, 0, 10, 0, 0, 90, 0}), ask(cmd::getSensorThresholds, {kThreshold}));
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorThresholds, {kDiscrete}));
    EXPECT_EQ(Response{cc::invalidDataField}, ask(cmd::setSensorThresholds, {kThreshold, 0x12, 0, 11, 0, 0, 91, 0}));
    EXPECT_EQ(10, threshold().thresholds[1]) << "a refused request changes nothing";
    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorThresholds, {kThreshold, 0x10, 0, 0, 0, 0, 91, 0}));
    EXPECT_EQ(91, threshold().thresholds[4]);
    EXPECT_EQ(Response{cc::requestDataLengthInvalid}, ask(cmd::setSensorThresholds, {kThreshold, 0x10}));

    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorHysteresis, {kThreshold, 0xFF, 4, 5}));
    EXPECT_EQ((Response{0x00, 4, 5}), ask(cmd::getSensorHysteresis, {kThreshold, 0xFF}));
    threshold().hysteresisSupport = 1;  // readable only
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::setSensorHysteresis, {kThreshold, 0xFF, 1, 1}));
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorHysteresis, {kDiscrete, 0xFF}));
}

TEST_F(SimSensor, EventEnablesAreSetSelectivelyAndRearmIsRemembered) {
    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorEventEnable, {kDiscrete, 0x90, 0x03, 0xC0}));
    EXPECT_EQ((Response{0x00, 0x80, 0x03, 0x40, 0x00, 0x00}), ask(cmd::getSensorEventEnable, {kDiscrete}));
    EXPECT_EQ(0x80, ask(cmd::getSensorReading, {kDiscrete})[2]) << "scanning off shows in the status bits";
    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorEventEnable, {kDiscrete, 0xE0, 0x01}));  // disable selected
    EXPECT_EQ((Response{0x00, 0xC0, 0x02, 0x40, 0x00, 0x00}), ask(cmd::getSensorEventEnable, {kDiscrete}));
    EXPECT_EQ(Response{cc::invalidDataField}, ask(cmd::setSensorEventEnable, {kDiscrete, 0xB0}));
    discrete().eventSupport = 1;  // entire sensor only
    EXPECT_EQ((Response{0x00, 0xC0}), ask(cmd::getSensorEventEnable, {kDiscrete}));
    discrete().eventSupport = 3;  // no events
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorEventEnable, {kDiscrete}));

    EXPECT_EQ(Response{cc::ok}, ask(cmd::rearmSensorEvents, {kThreshold, 0x00}));
    EXPECT_EQ(0xFFFF, threshold().rearmedAssert);
    EXPECT_EQ(Response{cc::ok}, ask(cmd::rearmSensorEvents, {kThreshold, 0x80, 0x01, 0x02}));
    EXPECT_EQ(0x0201, threshold().rearmedAssert);
    EXPECT_EQ(0x0000, threshold().rearmedDeassert);
    EXPECT_EQ(2u, threshold().rearmCount);
    EXPECT_EQ(Response{cc::requestDataLengthInvalid}, ask(cmd::rearmSensorEvents, {kThreshold}));
}

}  // namespace
