// A monitoring agent: runs the library's polling loop on a thread of its own,
// prints every sensor with its reading and health once the loop runs, prints
// an alert line for each new system event log (SEL) record the loop finds,
// and stops cleanly on SIGTERM or SIGINT.
//
//   monitoring_agent [RULES_FILE]
//
// RULES_FILE is the sensor health rules file when it is not installed at
// /etc/sfcb/tav/sensor_health. The library needs root and /dev/ipmi0.

#include <signal.h>
#include <stdio.h>

#include <string>
#include <thread>

#include <IpmiIfc.h>
#include <IpmiMapper.h>
#include <IpmiSelData.h>
#include <IpmiSensor.h>

namespace {

// Called on the polling loop's thread with each new SEL record, and with null
// once every periodic pass. It must return quickly and must not call stop():
// the loop waits for it.
void onSelRecord(void* /*context*/, Ipmi::IpmiSelData* record) {
    if (record == nullptr) return;
    const std::string description = record->description();
    printf("ALERT record %u severity %d: %s%s%s\n", record->recordId(), record->severity(), record->caption().c_str(),
           description.empty() ? "" : ": ", description.c_str());
    fflush(stdout);
}

void printSensors() {
    // A copy of the sensor list: the shared pointers stay valid even when the
    // loop rebuilds its list meanwhile.
    for (const auto& sensor : Ipmi::IpmiIfc::getSensors()) {
        int health = Ipmi::HEALTH_UNKNOWN;
        // One Get Sensor Reading; the answer also lands in the sensor's cache.
        if (!sensor->getSensorState(health)) continue;  // not present on this machine
        const Ipmi::IpmiSensor::CachedState cached = sensor->getCachedState();
        printf("%-16s ", sensor->getSensorIdString().c_str());
        if (!sensor->isDiscrete() && sensor->isConvertible() && cached.readingValid && cached.reading[0] == 0)
            printf("%10.2f %-10s", sensor->convertRawValue(cached.reading[1]), sensor->getBaseUnitString().c_str());
        else
            printf("%10s %-10s", "-", "");
        printf(" health %d\n", health);
    }
    fflush(stdout);
}

}  // namespace

int main(int argc, char** argv) {
    if (argc > 1)
        Ipmi::LoadSensorHealthDataFile(argv[1]);
    else
        Ipmi::LoadSensorHealthDataFile();

    // Block the stop signals before any thread starts, so every thread
    // inherits the mask and only sigwait below receives them.
    sigset_t stopSignals;
    sigemptyset(&stopSignals);
    sigaddset(&stopSignals, SIGTERM);
    sigaddset(&stopSignals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &stopSignals, nullptr);

    // start() runs the loop on the calling thread until stop(); interval 1 is
    // a pass every 16 seconds.
    std::thread loop([] {
        try {
            Ipmi::IpmiIfc::start(1);
        } catch (const kelInt::CmpiStatus& e) {
            fprintf(stderr, "monitoring_agent: the interface did not start (rc %d)\n", static_cast<int>(e.rc()));
        }
    });

    if (Ipmi::IpmiIfc::waitState(Ipmi::IpmiIfc::IPMI_STATE_RUNNING | Ipmi::IpmiIfc::IPMI_STATE_STOPPED) !=
        Ipmi::IpmiIfc::IPMI_STATE_RUNNING) {
        fprintf(stderr, "monitoring_agent: no controller\n");
        loop.join();
        return 1;
    }
    // start() clears the handler list, so register only once it runs.
    Ipmi::IpmiIfc::registerSelEventHandler(onSelRecord, nullptr);
    printSensors();
    printf("monitoring; SIGTERM stops\n");
    fflush(stdout);

    int signal = 0;
    sigwait(&stopSignals, &signal);
    Ipmi::IpmiIfc::unRegisterSelEventHandler(onSelRecord);  // returns once no call runs
    Ipmi::IpmiIfc::stop();  // returns once the loop has ended
    loop.join();
    printf("stopped\n");
    return 0;
}
