// The simulated controller's sensor commands answer as a real BMC does.

#include <gtest/gtest.h>

#include "Bmc.h"
#include "IpmiCommands.h"

namespace {

using namespace Ipmi;
using Sim::Request;
using Sim::Response;

constexpr uint8_t kThreshold = 0x05;
constexpr uint8_t kDiscrete = 0x06;

class SimSensor : public ::testing::Test {
protected:
    void SetUp() override {
        Sim::SensorModel t;
        t.number = kThreshold;
        t.eventReadingType = 0x01;
        t.reading = 0x42;
        t.states = 0x08;
        t.readableMask = 0x12;
        t.settableMask = 0x10;
        t.thresholds[1] = 10;
        t.thresholds[4] = 90;
        Sim::SensorModel d;
        d.number = kDiscrete;
        d.eventReadingType = 0x6F;
        d.states = 0x4001;
        Sim::SensorModel remote;
        remote.owner = 0x2C;
        remote.channel = 6;
        remote.number = 0x10;
        remote.eventReadingType = 0x01;
        remote.reading = 7;
        bmc.sensors = {t, d, remote};
    }
    Response ask(uint8_t cmd, std::vector<uint8_t> data) {
        Request r;
        r.netfn = netfn::sensorEvent;
        r.cmd = cmd;
        r.data = std::move(data);
        return bmc.handle(r);
    }
    Sim::SensorModel& sensor(size_t i) { return bmc.sensors[i]; }
    Sim::Bmc bmc;
};

TEST_F(SimSensor, ReadingsByKindAndAbsence) {
    EXPECT_EQ((Response{0x00, 0x42, 0xC0, 0x08}), ask(cmd::getSensorReading, {kThreshold}));
    EXPECT_EQ((Response{0x00, 0x00, 0xC0, 0x01, 0x40}), ask(cmd::getSensorReading, {kDiscrete}));
    EXPECT_EQ(Response{cc::requestedSensorNotPresent}, ask(cmd::getSensorReading, {0x77}));
    sensor(0).present = false;
    EXPECT_EQ(Response{cc::requestedSensorNotPresent}, ask(cmd::getSensorReading, {kThreshold}));
    EXPECT_EQ(Response{cc::requestDataLengthInvalid}, ask(cmd::getSensorReading, {}));
}

TEST_F(SimSensor, IpmbRequestsReachOnlyControllersThatExist) {
    Request r;
    r.netfn = netfn::sensorEvent;
    r.cmd = cmd::getSensorReading;
    r.viaIpmb = true;
    r.address = 0x2C;
    r.channel = 6;
    r.data = {0x10};
    EXPECT_EQ((Response{0x00, 7, 0xC0, 0x00}), bmc.handle(r));
    r.data = {kThreshold};
    EXPECT_EQ(Response{cc::requestedSensorNotPresent}, bmc.handle(r)) << "the satellite has no such sensor";
    r.channel = 0;
    EXPECT_EQ(Response{cc::timeout}, bmc.handle(r)) << "nothing lives at 0x2C on channel 0";
    r.address = 0x20;
    EXPECT_EQ((Response{0x00, 0x42, 0xC0, 0x08}), bmc.handle(r)) << "the BMC itself on IPMB";
}

TEST_F(SimSensor, ThresholdsOnlyForThresholdSensorsAndOnlySettableOnes) {
    EXPECT_EQ((Response{0x00, 0x12, 0, 10, 0, 0, 90, 0}), ask(cmd::getSensorThresholds, {kThreshold}));
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorThresholds, {kDiscrete}));
    EXPECT_EQ(Response{cc::invalidDataField}, ask(cmd::setSensorThresholds, {kThreshold, 0x12, 0, 11, 0, 0, 91, 0}));
    EXPECT_EQ(10, sensor(0).thresholds[1]) << "a refused request changes nothing";
    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorThresholds, {kThreshold, 0x10, 0, 0, 0, 0, 91, 0}));
    EXPECT_EQ(91, sensor(0).thresholds[4]);
    EXPECT_EQ(Response{cc::requestDataLengthInvalid}, ask(cmd::setSensorThresholds, {kThreshold, 0x10}));
}

TEST_F(SimSensor, HysteresisFollowsItsSupport) {
    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorHysteresis, {kThreshold, 0xFF, 4, 5}));
    EXPECT_EQ((Response{0x00, 4, 5}), ask(cmd::getSensorHysteresis, {kThreshold, 0xFF}));
    sensor(0).hysteresisSupport = 1;  // readable only
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::setSensorHysteresis, {kThreshold, 0xFF, 1, 1}));
    sensor(0).hysteresisSupport = 0;
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorHysteresis, {kThreshold, 0xFF}));
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorHysteresis, {kDiscrete, 0xFF}));
}

TEST_F(SimSensor, EventEnablesAreSetSelectivelyAndShowInTheReadingStatus) {
    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorEventEnable, {kDiscrete, 0x90, 0x03, 0xC0}));
    EXPECT_EQ((Response{0x00, 0x80, 0x03, 0x40, 0x00, 0x00}), ask(cmd::getSensorEventEnable, {kDiscrete}));
    EXPECT_EQ(0x80, ask(cmd::getSensorReading, {kDiscrete})[2]) << "scanning off shows in the status bits";
    EXPECT_EQ(Response{cc::ok}, ask(cmd::setSensorEventEnable, {kDiscrete, 0xE0, 0x01}));  // disable selected
    EXPECT_EQ((Response{0x00, 0xC0, 0x02, 0x40, 0x00, 0x00}), ask(cmd::getSensorEventEnable, {kDiscrete}));
    EXPECT_EQ(Response{cc::invalidDataField}, ask(cmd::setSensorEventEnable, {kDiscrete, 0xB0}));

    sensor(1).eventSupport = 1;  // entire sensor only
    EXPECT_EQ((Response{0x00, 0xC0}), ask(cmd::getSensorEventEnable, {kDiscrete}));
    sensor(1).eventSupport = 3;  // no events
    EXPECT_EQ(Response{cc::illegalForSensorType}, ask(cmd::getSensorEventEnable, {kDiscrete}));
}

TEST_F(SimSensor, RearmRemembersWhatWasAskedFor) {
    EXPECT_EQ(Response{cc::ok}, ask(cmd::rearmSensorEvents, {kThreshold, 0x00}));
    EXPECT_EQ(0xFFFF, sensor(0).rearmedAssert);
    EXPECT_EQ(Response{cc::ok}, ask(cmd::rearmSensorEvents, {kThreshold, 0x80, 0x01, 0x02}));
    EXPECT_EQ(0x0201, sensor(0).rearmedAssert);
    EXPECT_EQ(0x0000, sensor(0).rearmedDeassert);
    EXPECT_EQ(2u, sensor(0).rearmCount);
    EXPECT_EQ(Response{cc::requestDataLengthInvalid}, ask(cmd::rearmSensorEvents, {kThreshold}));
}

}  // namespace
