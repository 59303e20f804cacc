// A sensor behind a satellite controller is read over IPMB while other
// threads send their own requests: each request must reach its own target.

#include <gtest/gtest.h>

#include <thread>

#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

constexpr uint8_t kSatellite = 0x2C;

class SensorOwner : public TestSupport::SimTest {};

TEST_F(SensorOwner, ReadingsOfASatelliteSensorNeverRedirectOtherThreadsRequests) {
    Sim::SensorModel model;
    model.owner = kSatellite;
    model.number = 7;
    model.eventReadingType = sdr::eventReadingTypeThreshold;
    model.reading = 0x42;
    bmc().sensors.push_back(model);

    std::vector<uint8_t> record = TestSupport::SdrBuilder::full()
                                      .set(sdr::key::ownerId, kSatellite)
                                      .set(sdr::key::sensorNumber, model.number)
                                      .types(0x01, sdr::eventReadingTypeThreshold);
    IpmiThresholdSensor sensor(0, record.data(), static_cast<int>(record.size()));

    constexpr int kRounds = 200;
    std::thread reader([&] {
        for (int i = 0; i < kRounds; ++i) EXPECT_EQ(sensor.getReading(), 0x42u);
    });
    for (int i = 0; i < kRounds; ++i) {
        uint8_t answer[16];
        uint16_t length = sizeof answer;
        EXPECT_EQ(IpmiIfc::sendCmd(0, cmd::getDeviceId, netfn::app, 0, nullptr, &length, answer), 0);
    }
    reader.join();

    unsigned readings = 0;
    for (const Sim::Request& r : sim().requests()) {
        if (r.cmd == cmd::getSensorReading) {
            ++readings;
            EXPECT_TRUE(r.viaIpmb);
            EXPECT_EQ(r.address, kSatellite);
        } else {
            EXPECT_FALSE(r.viaIpmb) << "request 0x" << std::hex << int(r.cmd) << " left for the satellite";
        }
    }
    EXPECT_EQ(readings, static_cast<unsigned>(kRounds));
    EXPECT_EQ(node().targetAddress, 0u);
}

}  // namespace
