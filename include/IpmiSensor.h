#ifndef TAV_IPMI_IPMISENSOR_H
#define TAV_IPMI_IPMISENSOR_H

#include <stddef.h>
#include <stdint.h>

#include <memory>
#include <string>

#include "IpmiEntity.h"
#include "IpmiSdrRecord.h"
#include "Mutex.h"
#include "TavIpmiExport.h"

namespace Ipmi {

// One sensor, built from its full, compact or event-only SDR, of which it
// keeps a copy. Record questions are answered from that copy; readings,
// thresholds and event settings are asked of the controller.
//
// The reading, poll bookkeeping, thresholds and hysteresis cache are guarded
// by the sensor's own lock: any thread may read them while the polling loop
// refreshes them.
//
// Value getters throw kelInt::CmpiStatus (CMPI_RC_ERR_FAILED); commands return
// the completion code, with 0xC1 (invalid command) and 0xCD (illegal for this
// sensor type) reported as 1.
class TAV_IPMI_API IpmiSensor {
public:
    IpmiSensor(int node, unsigned char* sdr, int len);
    virtual ~IpmiSensor();

    // Implemented by the two sensor classes, in this order.
    virtual bool isDiscrete() const = 0;
    virtual unsigned int getState(bool refresh) = 0;
    virtual bool getSensorState(int& state) = 0;
    virtual unsigned short getAssertionEventMask() const = 0;
    virtual unsigned short getDeassertionEventMask() const = 0;
    virtual int rearmEvents(unsigned short assertMask, unsigned short deassertMask) = 0;
    virtual int getEventEnable(unsigned char& flags, unsigned short& assertMask,
                               unsigned short& deassertMask) = 0;
    virtual int setEventEnable(unsigned char flags, unsigned short assertMask,
                               unsigned short deassertMask) = 0;

    // Record accessors.
    unsigned char getSensorNumber() const { return sensor_number; }
    unsigned short getSensorRecordNumber() const { return record_id; }
    unsigned char getOwnerId() const;
    unsigned char getLun() const;
    unsigned char getChannel() const;
    unsigned char getSensorType() const;
    unsigned char getEventReadingType() const;
    unsigned char getRateUnit() const;
    unsigned char getModifierUnitUse() const;
    unsigned char getBaseUnit() const;
    unsigned char getModifierUnit() const;
    unsigned char getSensorDirection() const;
    unsigned char getHysteresisSupport() const;
    unsigned char getThresholdAccessSupport() const;
    unsigned char getEventMessageSupport() const;
    unsigned short getFlags() const;
    bool isLinear() const;
    bool isAnalog() const;
    bool isConvertible() const;
    bool isNominalReadingSet() const;
    bool isNormalMaxSet() const;
    bool isNormalMinSet() const;
    bool readingStateUnavailable() const;
    bool scanningDisabled() const;
    bool hasReadingTime() const;
    const unsigned char* getSdr() const { return sdr.data; }
    void RawRecord(const unsigned char*& bytes, int& length) const;
    IpmiEntity getEntity() const;
    int getManufacturerId(unsigned char* id, unsigned char& count) const;

    // getFlags bits.
    enum {
        FLAG_INIT_SCANNING = 1 << 0,
        FLAG_INIT_EVENTS = 1 << 1,
        FLAG_INIT_HYSTERESIS = 1 << 3,
        FLAG_INIT_SENSOR_TYPE = 1 << 4,
        FLAG_SCANNING_ENABLED = 1 << 5,
        FLAG_EVENTS_ENABLED = 1 << 6,
        FLAG_IGNORE_SENSOR = 1 << 7,
        FLAG_AUTO_REARM = 1 << 8,
        FLAG_PERCENTAGE = 1 << 12
    };

    // Readings.
    void getSDReading();
    unsigned int getReading();
    unsigned int getReading(bool refresh);
    // Not const, so that a literal such as 100u picks this overload and not the bool one.
    double getReading(unsigned raw);
    void setReading(unsigned char* five_bytes);
    void setThresholdReading(unsigned char* eight_bytes);
    void getReadingTime(std::string& out) const;

    // What the discovery and refresh passes left in the object, copied at
    // once: safe from any thread while the polling loop refreshes the sensor,
    // and it sends nothing.
    struct CachedState {
        unsigned char reading[5];     // the Get Sensor Reading answer, completion code first
        unsigned char readingLength;  // valid bytes of `reading`
        bool readingValid;
        uint32_t lastPollResult;      // 0, a completion code, or -1 when nothing was sent
        uint64_t readingTime;         // microseconds since the epoch; 0: never read
        unsigned char thresholds[8];  // the Get Sensor Thresholds answer, completion code first
    };
    CachedState getCachedState() const;
    void dump() const;

    // Values in engineering units (full records only).
    double convertRawValue(unsigned raw) const;
    unsigned int convertToRawValue(double value) const;
    // The flag is accepted for callers' sake; every call asks the controller.
    double getLowerNonCriticalThreshold(bool cached = false);
    double getLowerCriticalThreshold(bool cached = false);
    double getLowerNonRecoverableThreshold(bool cached = false);
    double getUpperNonCriticalThreshold(bool cached = false);
    double getUpperCriticalThreshold(bool cached = false);
    double getUpperNonRecoverableThreshold(bool cached = false);
    double getMinReadable() const;
    double getMaxReadable() const;
    double getNormalMin() const;
    double getNormalMax() const;
    double getNominalReading() const;
    // A value of 0.0 leaves that threshold unchanged.
    int setThresholds(double lnc, double lc, double lnr, double unc, double uc, double unr);
    int restoreDefaultThresholds();
    int rearmEvents();

    // Descriptive text.
    std::string getSensorTypeString() const;
    std::string getSensorDirectionString() const;
    std::string getModifierUnitString() const;
    std::string getBaseUnitString() const;
    std::string convertToEnumeration() const;
    std::string getSensorIdString() const;
    std::string getName() const;
    std::string getDescription() const;
    std::string getDeviceId() const;
    static std::string DescFromType(unsigned char type);
    static std::string DescFromDirection(unsigned char direction);

    // Poll bookkeeping of the discovery and refresh passes.
    uint32_t getLastPollResult() const;
    int32_t getPollRepeatCount() const;
    // Counts how often the same result came back in a row.
    void recordPollResult(uint32_t result);

    int getNode() const { return node; }

protected:
    // The last Get Sensor Hysteresis answer: completion code, positive- and
    // negative-going hysteresis. A code of 0 means the values may be used.
    struct HysteresisCache {
        uint8_t cc;
        uint8_t positive;
        uint8_t negative;
    };

    // One consistent view of the last reading.
    struct ReadingSnapshot {
        unsigned char bytes[5];
        unsigned char length;
        bool valid;
        bool present;
        uint64_t time;
    };
    // The reading as it stands, copied under the lock.
    ReadingSnapshot currentReading() const;
    // Asks the controller (as getSDReading), stores the outcome and returns it,
    // so that the caller works on its own reading whatever other threads store.
    ReadingSnapshot refreshReading();
    // Clears not_available_pending (true) or request_failed_pending (false).
    void clearPending(bool notAvailable);

    // The stored record and how many of its bytes may be read: the stored
    // length can exceed the buffer when an over-long record was refused.
    const unsigned char* recordBytes() const { return sdr.data; }
    size_t readableLength() const;

    // Completion codes as the commands report them.
    static int commandResult(uint8_t cc);
    // Sends one Sensor/Event command for this sensor's node with a zeroed answer
    // buffer of `capacity` bytes; bytes the controller did not send stay 0.
    uint8_t sendSensorCommand(uint8_t cmd, const uint8_t* request, uint16_t requestLength,
                              uint8_t* answer, uint16_t capacity);

    IpmiSdrRecord sdr;
    unsigned char reading[5];
    uint32_t last_poll_result;
    int32_t poll_repeat_count;
    uint64_t reading_time;
    bool reading_valid;
    bool sensor_present;
    bool not_available_pending;
    bool request_failed_pending;
    unsigned char threshold_reading[8];
    HysteresisCache hysteresis;
    int32_t node;
    unsigned char sensor_number;
    unsigned short record_id;
    unsigned char reading_length;
    // Guards everything above from `reading` to `hysteresis`; the record and
    // the key fields never change after construction.
    mutable TAV::Mutex state_mutex;

    // Event-enable and re-arm commands; the classes differ only in how many
    // bits of each mask's high byte they pass on.
    int getEventEnableMasked(uint8_t highMask, unsigned char& flags, unsigned short& assertMask,
                             unsigned short& deassertMask);
    int setEventEnableMasked(uint8_t highMask, unsigned char flags, unsigned short assertMask,
                             unsigned short deassertMask);
    int rearmEventsMasked(uint8_t highMask, unsigned short assertMask, unsigned short deassertMask);

private:
    double getThreshold(unsigned bit, unsigned answerByte, const char* notReadable);
    int sendSetThresholds(const unsigned char* request);
};

class TAV_IPMI_API IpmiThresholdSensor : public IpmiSensor {
public:
    IpmiThresholdSensor(int node, unsigned char* sdr, int len) : IpmiSensor(node, sdr, len) {}
    ~IpmiThresholdSensor() override;

    bool isDiscrete() const override { return false; }
    unsigned int getState(bool refresh) override;
    bool getSensorState(int& state) override;
    unsigned short getAssertionEventMask() const override;
    unsigned short getDeassertionEventMask() const override;
    using IpmiSensor::rearmEvents;
    int rearmEvents(unsigned short assertMask, unsigned short deassertMask) override;
    int getEventEnable(unsigned char& flags, unsigned short& assertMask,
                       unsigned short& deassertMask) override;
    int setEventEnable(unsigned char flags, unsigned short assertMask,
                       unsigned short deassertMask) override;

    unsigned char getLowerThresholdReadingMask() const;
    unsigned char getUpperThresholdReadingMask() const;
    unsigned char getReadableMask() const;
    unsigned char getSettableMask() const;

    // With `fresh` the controller is asked first; otherwise the cache answers.
    int getHysteresis(unsigned char& positive, unsigned char& negative, bool fresh);
    int setHysteresis(unsigned char positive, unsigned char negative);
    void cacheHysteresis();
    void cacheHysteresis(unsigned char positive, unsigned char negative);
};

class TAV_IPMI_API IpmiDiscreteSensor : public IpmiSensor {
public:
    IpmiDiscreteSensor(int node, unsigned char* sdr, int len) : IpmiSensor(node, sdr, len) {}
    ~IpmiDiscreteSensor() override;

    bool isDiscrete() const override { return true; }
    unsigned int getState(bool refresh) override;
    bool getSensorState(int& state) override;
    unsigned short getAssertionEventMask() const override;
    unsigned short getDeassertionEventMask() const override;
    using IpmiSensor::rearmEvents;
    int rearmEvents(unsigned short assertMask, unsigned short deassertMask) override;
    int getEventEnable(unsigned char& flags, unsigned short& assertMask,
                       unsigned short& deassertMask) override;
    int setEventEnable(unsigned char flags, unsigned short assertMask,
                       unsigned short deassertMask) override;

    unsigned short getReadingMask() const;
};

}  // namespace Ipmi

#endif
