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

/// One sensor, built from its full, compact or event-only SDR, of which it
/// keeps a copy. The library builds sensors (IpmiIfc::getSensors hands them
/// out); callers do not.
///
/// Three kinds of calls:
/// - *record* calls answer from the record copy (its fields as IPMI defines
///   them, 0 or false where the record type has no such field) and the
///   library's tables: they send nothing, never block, never throw unless
///   they say so, and never change (getSensorNumber(), getSensorType(), the
///   unit and text calls, convertRawValue(), ...);
/// - *cached* calls answer from what the loop's last pass stored
///   (getCachedState(), getReadingTime(), getLastPollResult(), and
///   getState(false)): they send nothing and wait only for the sensor's own
///   lock;
/// - *controller* calls send one Sensor/Event command (one exchange, see
///   @ref contract-blocking "blocking"): readings, thresholds, hysteresis,
///   event enables and re-arming.
///
/// Any thread may call any of them while the loop refreshes the sensor: the
/// reading, thresholds, hysteresis and poll bookkeeping are guarded by the
/// sensor's own lock. A sensor from a list the loop has since replaced stays
/// valid; its cached values no longer change.
///
/// Value calls throw kelInt::CmpiStatus rc 1 where they say so; commands
/// return the completion code, with 0xC1 (invalid command) and 0xCD
/// (illegal for this sensor type) reported as 1, and 255 without an answer.
class TAV_IPMI_API IpmiSensor {
public:
    /// Keeps a copy of the `len` bytes of `sdr` (at most 64) for `node`.
    IpmiSensor(int node, unsigned char* sdr, int len);
    virtual ~IpmiSensor();

    /// False for a threshold sensor (IpmiThresholdSensor), true for a
    /// discrete one (IpmiDiscreteSensor).
    virtual bool isDiscrete() const = 0;
    /// The state bits of the reading: threshold sensors the thresholds
    /// crossed (bit 0 lower non-critical ... bit 5 upper non-recoverable),
    /// discrete sensors the asserted states (bit n: offset n). `refresh`
    /// asks the controller first (one exchange); otherwise the cached reading
    /// answers.
    /// @throws kelInt::CmpiStatus rc 1 when the reading is not available or
    ///         its request failed.
    virtual unsigned int getState(bool refresh) = 0;
    /// Asks the controller for the reading (one exchange) and sets `state` to
    /// its CIM health state (Ipmi::IpmiHealthState: threshold sensors 5, 10
    /// or 25 by the thresholds crossed; discrete ones by the health rules).
    /// False when the sensor is not present (or the rules could not map it);
    /// true otherwise, with `state` 0 when no valid reading came.
    virtual bool getSensorState(int& state) = 0;
    /// The record's assertion event mask (bit n: offset n).
    virtual unsigned short getAssertionEventMask() const = 0;
    /// The record's deassertion event mask (bit n: offset n).
    virtual unsigned short getDeassertionEventMask() const = 0;
    /// Re-arm Sensor Events for the offsets in the masks; one exchange.
    virtual int rearmEvents(unsigned short assertMask, unsigned short deassertMask) = 0;
    /// Get Sensor Event Enable, one exchange: `flags` bit 7 all events, bit 6
    /// scanning; the masks per offset.
    virtual int getEventEnable(unsigned char& flags, unsigned short& assertMask,
                               unsigned short& deassertMask) = 0;
    /// Set Sensor Event Enable, one exchange, with the flags and masks as
    /// getEventEnable() reads them.
    virtual int setEventEnable(unsigned char flags, unsigned short assertMask,
                               unsigned short deassertMask) = 0;

    // Record fields, as IPMI defines them; 0 (or false) where the record
    // type has no such field.
    unsigned char getSensorNumber() const { return sensor_number; }  ///< sensor number on its owner
    unsigned short getSensorRecordNumber() const { return record_id; }  ///< record ID in the SDR repository
    unsigned char getOwnerId() const;               ///< owner's IPMB address or software ID
    unsigned char getLun() const;                   ///< owner's LUN
    unsigned char getChannel() const;               ///< owner's channel
    unsigned char getSensorType() const;            ///< IPMI sensor type code (0x01 temperature, ...)
    unsigned char getEventReadingType() const;      ///< 0x01 threshold, 0x02-0x0C generic, 0x6F sensor-specific
    unsigned char getRateUnit() const;              ///< rate unit code (0 none)
    unsigned char getModifierUnitUse() const;       ///< 0 none, 1 divide by, 2 multiply by the modifier unit
    unsigned char getBaseUnit() const;              ///< unit type code (1 degrees C, 4 volts, 18 RPM, ...)
    unsigned char getModifierUnit() const;          ///< unit type code of the modifier unit
    unsigned char getSensorDirection() const;       ///< 0 unspecified, 1 input, 2 output
    unsigned char getHysteresisSupport() const;     ///< 0 none, 1 readable, 2 readable and settable, 3 fixed
    unsigned char getThresholdAccessSupport() const;  ///< 0 none, 1 readable, 2 readable and settable, 3 fixed
    unsigned char getEventMessageSupport() const;   ///< 0 per threshold, 1 whole sensor, 2 global only, 3 none
    unsigned short getFlags() const;                ///< initialisation and capability bits: the FLAG_ values
    /// True for records that are not full (they carry no conversion), false
    /// for full ones whatever their linearisation, as callers have always seen.
    bool isLinear() const;
    bool isAnalog() const;                          ///< the reading is a number (not a state)
    bool isConvertible() const;                     ///< convertRawValue() applies: a full record with a numeric reading
    bool isNominalReadingSet() const;               ///< the record gives a nominal reading
    bool isNormalMaxSet() const;                    ///< the record gives a normal maximum
    bool isNormalMinSet() const;                    ///< the record gives a normal minimum
    bool readingStateUnavailable() const;           ///< no valid cached reading, or it says "unavailable"
    bool scanningDisabled() const;                  ///< the cached reading says scanning is off
    bool hasReadingTime() const;                    ///< a reading was ever stored
    const unsigned char* getSdr() const { return sdr.data; }  ///< the record copy, header included
    /// The record copy and its readable length.
    void RawRecord(const unsigned char*& bytes, int& length) const;
    /// The entity the sensor monitors.
    IpmiEntity getEntity() const;
    /// The controller's manufacturer ID (IpmiIfc::getManufacturerId).
    int getManufacturerId(unsigned char* id, unsigned char& count) const;

    /// getFlags() bits.
    enum {
        FLAG_INIT_SCANNING = 1 << 0,     ///< the controller initialises scanning
        FLAG_INIT_EVENTS = 1 << 1,       ///< the controller initialises event generation
        FLAG_INIT_HYSTERESIS = 1 << 3,   ///< the controller initialises hysteresis
        FLAG_INIT_SENSOR_TYPE = 1 << 4,  ///< the controller initialises the sensor type
        FLAG_SCANNING_ENABLED = 1 << 5,  ///< scanning enabled at start
        FLAG_EVENTS_ENABLED = 1 << 6,    ///< events enabled at start
        FLAG_IGNORE_SENSOR = 1 << 7,     ///< ignore the sensor when its entity is absent
        FLAG_AUTO_REARM = 1 << 8,        ///< the sensor re-arms itself
        FLAG_PERCENTAGE = 1 << 12        ///< the reading is a percentage
    };

    /// Asks the controller for the reading (one Get Sensor Reading, to the
    /// sensor's owner) and stores it; failures are logged and stored.
    void getSDReading();
    ///@{
    /// Asks for the reading (one exchange), stores it, and returns its raw
    /// value: the reading byte of a threshold sensor, the state bits of a
    /// discrete one; 0 without a valid reading. The flag is ignored.
    unsigned int getReading();
    unsigned int getReading(bool refresh);
    ///@}
    /// The raw value in the sensor's unit, as convertRawValue(). Not const,
    /// so that a literal such as 100u picks this overload and not the bool one.
    double getReading(unsigned raw);
    /// Stores a Get Sensor Reading answer (completion code first), as the
    /// loop's passes do.
    void setReading(unsigned char* five_bytes);
    /// Stores a Get Sensor Thresholds answer (completion code first), as the
    /// loop's passes do.
    void setThresholdReading(unsigned char* eight_bytes);
    /// The time of the stored reading, UTC, as 2024-05-01T12:00:00Z.
    void getReadingTime(std::string& out) const;

    /// What the discovery and refresh passes left in the object.
    struct CachedState {
        unsigned char reading[5];     ///< the Get Sensor Reading answer, completion code first
        unsigned char readingLength;  ///< valid bytes of `reading`
        bool readingValid;            ///< `reading` holds an answer
        uint32_t lastPollResult;      ///< 0, a completion code, or -1 when nothing was sent
        uint64_t readingTime;         ///< microseconds since the epoch; 0: never read
        unsigned char thresholds[8];  ///< the Get Sensor Thresholds answer, completion code first
    };
    /// A consistent copy of the cached reading and thresholds; sends nothing.
    CachedState getCachedState() const;
    /// Prints the record's bytes on standard output.
    void dump() const;

    /// The raw value in the sensor's unit by the record's conversion
    /// factors and linearisation; 0 (logged) for records that are not full.
    double convertRawValue(unsigned raw) const;
    /// The raw value nearest to `value`; 0 for 0.0 and for records that are
    /// not full.
    unsigned int convertToRawValue(double value) const;
    ///@{
    /// One threshold in the sensor's unit: one Get Sensor Thresholds
    /// exchange on every call, whatever `cached` says. A failed exchange
    /// other than 0xC1/0xCD gives 0 converted.
    /// @throws kelInt::CmpiStatus rc 1 when the sensor has no readable
    ///         thresholds or not this one, or the controller answers 0xC1 or
    ///         0xCD.
    double getLowerNonCriticalThreshold(bool cached = false);
    double getLowerCriticalThreshold(bool cached = false);
    double getLowerNonRecoverableThreshold(bool cached = false);
    double getUpperNonCriticalThreshold(bool cached = false);
    double getUpperCriticalThreshold(bool cached = false);
    double getUpperNonRecoverableThreshold(bool cached = false);
    ///@}
    ///@{
    /// A value of the record in the sensor's unit; sends nothing.
    /// @throws kelInt::CmpiStatus rc 1 for a record that is not full (the
    ///         normal and nominal values only when such a record claims them,
    ///         as callers have always seen).
    double getMinReadable() const;
    double getMaxReadable() const;
    double getNormalMin() const;
    double getNormalMax() const;
    double getNominalReading() const;
    ///@}
    /// Set Sensor Thresholds, one exchange: the settable thresholds given a
    /// value other than 0.0 (which leaves a threshold unchanged). 1 when the
    /// sensor's thresholds are not accessible.
    int setThresholds(double lnc, double lc, double lnr, double unc, double uc, double unr);
    /// Sets the settable thresholds back to the record's values; one
    /// exchange. 1 for a sensor without a full threshold record.
    int restoreDefaultThresholds();
    /// Re-arms every event of the sensor; one exchange.
    int rearmEvents();

    // Words for the sensor from its record and the library's tables.
    std::string getSensorTypeString() const;       ///< sensor type name ("Temperature")
    std::string getSensorDirectionString() const;  ///< "Unspecified", "input" or "output"
    std::string getModifierUnitString() const;     ///< the modifier unit's name, empty without one
    std::string getBaseUnitString() const;         ///< the unit's name ("degrees C", "Volts")
    /// The name of an asserted state of the cached reading (of several, the
    /// last in the event table: "Device Present"), or "N/A".
    std::string convertToEnumeration() const;
    /// The record's ID string ("CPU1 Temp"), with the instance of a shared record.
    std::string getSensorIdString() const;
    std::string getName() const;         ///< the ID string of a full or compact record, else empty
    std::string getDescription() const;  ///< entity name and instance, then the ID string
    std::string getDeviceId() const;     ///< "owner.channel*16+lun.number"
    /// The name of a sensor type code.
    static std::string DescFromType(unsigned char type);
    /// The name of a sensor direction code.
    static std::string DescFromDirection(unsigned char direction);

    /// The result of the loop's last request for this sensor: 0, a completion
    /// code, or 0xFFFFFFFF when nothing could be sent.
    uint32_t getLastPollResult() const;
    /// How often getLastPollResult() came back in a row.
    int32_t getPollRepeatCount() const;
    /// Stores a pass's result and counts repeats, as the loop's passes do.
    void recordPollResult(uint32_t result);

    /// The node the sensor belongs to.
    int getNode() const { return node; }

protected:
    /// The last Get Sensor Hysteresis answer.
    struct HysteresisCache {
        uint8_t cc;        ///< completion code; 0: the values may be used
        uint8_t positive;  ///< positive-going hysteresis, raw
        uint8_t negative;  ///< negative-going hysteresis, raw
    };

    /// One consistent view of the last reading.
    struct ReadingSnapshot {
        unsigned char bytes[5];  ///< the answer, completion code first
        unsigned char length;    ///< valid bytes
        bool valid;              ///< an answer of code 0 came
        bool present;            ///< the controller has the sensor
        uint64_t time;           ///< microseconds since the epoch; 0: never read
    };
    /// The reading as it stands, copied under the lock.
    ReadingSnapshot currentReading() const;
    /// Asks the controller (as getSDReading), stores the outcome and returns it,
    /// so that the caller works on its own reading whatever other threads store.
    ReadingSnapshot refreshReading();
    /// Clears not_available_pending (true) or request_failed_pending (false).
    void clearPending(bool notAvailable);

    /// The stored record; see readableLength().
    const unsigned char* recordBytes() const { return sdr.data; }
    /// How many record bytes may be read: the stored length can exceed the
    /// buffer when an over-long record was refused.
    size_t readableLength() const;

    /// A completion code as the commands report it (0xC1 and 0xCD as 1).
    static int commandResult(uint8_t cc);
    /// Sends one Sensor/Event command for this sensor's node with a zeroed answer
    /// buffer of `capacity` bytes; bytes the controller did not send stay 0.
    uint8_t sendSensorCommand(uint8_t cmd, const uint8_t* request, uint16_t requestLength,
                              uint8_t* answer, uint16_t capacity);

    IpmiSdrRecord sdr;                   ///< the record copy
    unsigned char reading[5];            ///< the last Get Sensor Reading answer
    uint32_t last_poll_result;           ///< see getLastPollResult()
    int32_t poll_repeat_count;           ///< see getPollRepeatCount()
    uint64_t reading_time;               ///< microseconds since the epoch
    bool reading_valid;                  ///< `reading` holds an answer
    bool sensor_present;                 ///< the controller has the sensor
    bool not_available_pending;          ///< an unavailable reading is yet to be reported
    bool request_failed_pending;         ///< a failed request is yet to be reported
    unsigned char threshold_reading[8];  ///< the last Get Sensor Thresholds answer
    HysteresisCache hysteresis;          ///< the last Get Sensor Hysteresis answer
    int32_t node;                        ///< the node
    unsigned char sensor_number;         ///< from the record
    unsigned short record_id;            ///< from the record
    unsigned char reading_length;        ///< valid bytes of `reading`
    /// Guards everything above from `reading` to `hysteresis`; the record and
    /// the key fields never change after construction.
    mutable TAV::Mutex state_mutex;

    ///@{
    /// Event-enable and re-arm commands; the classes differ only in how many
    /// bits of each mask's high byte (`highMask`) they pass on.
    int getEventEnableMasked(uint8_t highMask, unsigned char& flags, unsigned short& assertMask,
                             unsigned short& deassertMask);
    int setEventEnableMasked(uint8_t highMask, unsigned char flags, unsigned short assertMask,
                             unsigned short deassertMask);
    int rearmEventsMasked(uint8_t highMask, unsigned short assertMask, unsigned short deassertMask);
    ///@}

private:
    double getThreshold(unsigned bit, unsigned answerByte, const char* notReadable);
    int sendSetThresholds(const unsigned char* request);
};

/// A sensor whose reading is a number compared with thresholds (event/reading
/// type 0x01). The IpmiSensor rules apply.
class TAV_IPMI_API IpmiThresholdSensor : public IpmiSensor {
public:
    /// As IpmiSensor's.
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

    /// The record's lower threshold comparisons that readings report.
    unsigned char getLowerThresholdReadingMask() const;
    /// The record's upper threshold comparisons that readings report.
    unsigned char getUpperThresholdReadingMask() const;
    /// The record's readable thresholds (bit 0 lower non-critical ... bit 5
    /// upper non-recoverable).
    unsigned char getReadableMask() const;
    /// The record's settable thresholds, bits as getReadableMask().
    unsigned char getSettableMask() const;

    /// The raw hysteresis values. With `fresh` one Get Sensor Hysteresis
    /// exchange first (a failed one leaves the cache as it was and returns
    /// its code); otherwise the cache answers: 0, or the cached completion code.
    int getHysteresis(unsigned char& positive, unsigned char& negative, bool fresh);
    /// Set Sensor Hysteresis with raw values; one exchange.
    int setHysteresis(unsigned char positive, unsigned char negative);
    ///@{
    /// Fills the hysteresis cache: from the controller (one exchange, when
    /// the record says hysteresis is readable), or with the given values.
    void cacheHysteresis();
    void cacheHysteresis(unsigned char positive, unsigned char negative);
    ///@}
};

/// A sensor whose reading is a set of asserted states (generic or
/// sensor-specific event/reading types). The IpmiSensor rules apply.
class TAV_IPMI_API IpmiDiscreteSensor : public IpmiSensor {
public:
    /// As IpmiSensor's.
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

    /// The record's states that readings report (bit n: offset n).
    unsigned short getReadingMask() const;
};

}  // namespace Ipmi

#endif
