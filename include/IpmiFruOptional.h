#ifndef TAV_IPMI_IPMIFRUOPTIONAL_H
#define TAV_IPMI_IPMIFRUOPTIONAL_H

#include <string>

#include "TavIpmiExport.h"

namespace Ipmi {

/// @file
/// Decoded FRU areas: chassis, board, product and multi-record, as
/// IpmiFru::getArea and IpmiIfc::getFruPart hand them out.

/// Every printable character stays, every other one becomes a blank; then
/// whatever follows the last character that is neither blank nor tab is cut.
/// A string made only of blanks and tabs is left as it is. Returns `s`.
TAV_IPMI_API std::string& toAsciiAndTrim(std::string& s);

/// The fields IpmiFruMulti::getValue and the per-type decoders can answer.
/// Values come back as decimal text without units, in the unit named here;
/// flags as "true"/"false" (power supply) or "yes"/"no" (DC records); "n/a"
/// when the record lacks the field, marks it as not specified, or the key
/// belongs to another record type.
enum class FruKey {
    // Power supply information record (type 0x00).
    PsOverallCapacity,       ///< watts
    PsPeakVa,                ///< volt-amperes
    PsInrushCurrent,         ///< amperes
    PsInrushInterval,        ///< milliseconds
    PsLowInputVoltage1,      ///< volts, two decimals
    PsHighInputVoltage1,     ///< volts
    PsLowInputVoltage2,      ///< volts; "n/a" for a single-range supply
    PsHighInputVoltage2,     ///< volts
    PsLowInputFrequency,     ///< hertz
    PsHighInputFrequency,    ///< hertz
    PsDropoutTolerance,      ///< milliseconds
    PsPredictiveFailSupport, ///< flag
    PsPowerFactorCorrection, ///< flag
    PsAutoSwitch,            ///< flag
    PsHotSwap,               ///< flag
    PsPredictiveFailMode,    ///< "One pulse per rotation", "Two pulses per rotation",
                             ///< "Failure on pin assertion" or "Failure on pin de-assertion"
    PsPeakWattage,           ///< watts
    PsHoldUpTime,            ///< seconds
    PsCombinedVoltage1,      ///< "12 V", "-12 V", "5 V" or "3.3 V"
    PsCombinedVoltage2,      ///< second combined voltage, as PsCombinedVoltage1
    PsTotalCombinedWattage,  ///< watts
    PsTachometerThreshold,   ///< rotations per second
    // DC output (type 0x01) and DC load (type 0x02) records.
    DcOutputNumber,          ///< output number
    DcStandby,               ///< DC output only: "yes"/"no"
    DcNominalVoltage,        ///< volts, two decimals
    DcLowVoltage,            ///< output: max negative deviation; load: min specified voltage
    DcHighVoltage,           ///< output: max positive deviation; load: max specified voltage
    DcRippleNoise,           ///< millivolts peak to peak
    DcMinimumCurrent,        ///< milliamperes
    DcMaximumCurrent,        ///< milliamperes
    // Management access record (type 0x03).
    MgmtSubRecordType,       ///< 1..7 as a number
    MgmtValue,               ///< the record's text
    // Base and extended compatibility records (types 0x04, 0x05).
    CompatManufacturerId,    ///< manufacturer ID
    CompatEntityId,          ///< entity ID
    CompatBase,              ///< compatibility base
    CompatCodeStart,         ///< first code number
    CompatCodeRangeMask,     ///< hexadecimal bytes
    // OEM records (types 0xC0-0xFF).
    OemManufacturerId,       ///< manufacturer ID
    OemData                  ///< hexadecimal bytes
};

/// A decoded FRU area: a copy of the area's bytes, starting with its format
/// version byte, and getters that decode fields from them. Getters send
/// nothing, never throw and never read outside the bytes held, whatever
/// lengths the area claims; a wrong format version, a missing field or an
/// encoding that is not decoded gives the getter's default. The library
/// publishes area objects through shared pointers to const and never changes
/// them afterwards, so any thread may read them.
class TAV_IPMI_API IpmiFruOptional {
public:
    /// An empty area.
    IpmiFruOptional();
    /// Copies `size` bytes.
    IpmiFruOptional(unsigned int size, const unsigned char* bytes);
    ///@{
    /// Copies the other area's bytes.
    IpmiFruOptional(const IpmiFruOptional& other);
    IpmiFruOptional& operator=(const IpmiFruOptional& other);
    ///@}
    virtual ~IpmiFruOptional();

    /// Replaces the bytes with a copy of `size` bytes.
    void set(unsigned int size, const unsigned char* bytes);
    unsigned int getSize() const { return size; }                 ///< bytes held
    const unsigned char* getData() const { return data; }         ///< the bytes, format version first

    /// Logs the bytes at debug priority, in the area's own format.
    virtual void dump() const = 0;
    /// Logs the bytes in the base format.
    void testDump() const;

    /// The field whose type/length byte is at `offset`: 8-bit text as it is,
    /// 6-bit packed ASCII unpacked (followed by one NUL that trimming turns
    /// into a blank and removes), binary and BCD plus fields empty.
    std::string getFruAreaString(unsigned int offset) const;

protected:
    /// The format version nibble is 1.
    bool versionOk() const;
    /// Offset of the type/length byte of field `index` (0: the one at
    /// `first`), or 0 when an end-of-fields mark or the area's end comes first.
    unsigned int fieldOffset(unsigned int first, unsigned int index) const;
    /// Field `index` from `first` on, trimmed; `absent` when missing or empty.
    std::string field(unsigned int first, unsigned int index, const char* absent) const;
    /// Logs the bytes between the lines `head` and `leave`, `enter` first.
    void dumpAs(const char* head, const char* enter, const char* leave) const;

    unsigned int size;    ///< bytes held
    unsigned char* data;  ///< owned copy of the area
};

/// The chassis info area.
class TAV_IPMI_API IpmiFruChassis : public IpmiFruOptional {
public:
    using IpmiFruOptional::IpmiFruOptional;
    void dump() const override;
    /// Chassis type name ("Rack Mount Chassis"...); "Unknown" above the table,
    /// "unknown" for type 37 or a format the decoder does not handle, empty
    /// for format version 0.
    std::string getType() const;
    std::string getPartNumber() const;  ///< empty when absent
    /// Read one byte before the field that follows the part number, as
    /// deployed providers have always read it; "n/a" when absent or empty.
    std::string getSerialNumber() const;
    std::string getManufacturer() const;  ///< always "n/a": the area has none
};

/// The board info area.
class TAV_IPMI_API IpmiFruBoard : public IpmiFruOptional {
public:
    using IpmiFruOptional::IpmiFruOptional;
    void dump() const override;
    std::string getManufacturer() const;  ///< "n/a" when absent or empty
    std::string getName() const;          ///< product name of the board; empty when absent
    std::string getSerialNumber() const;  ///< "n/a" when absent or empty
    std::string getPartNumber() const;    ///< empty when absent
    /// Manufacturing date and time in UTC, as 2010-05-04T12:30:00; "N/A" for
    /// a format the decoder does not handle.
    std::string getMfgDateTime8601() const;
};

/// The product info area.
class TAV_IPMI_API IpmiFruProduct : public IpmiFruOptional {
public:
    using IpmiFruOptional::IpmiFruOptional;
    void dump() const override;
    std::string getManufacturer() const;  ///< "n/a" when absent or empty
    std::string getName() const;          ///< product name; empty when absent
    std::string getPartNumber() const;    ///< part/model number; empty when absent
    std::string getVersion() const;       ///< empty when absent
    std::string getSerialNumber() const;  ///< "n/a" when absent or empty
    std::string getAssetTag() const;      ///< empty when absent
};

/// The whole multi-record area: records of a 5-byte header and their data.
class TAV_IPMI_API IpmiFruMulti : public IpmiFruOptional {
public:
    using IpmiFruOptional::IpmiFruOptional;
    void dump() const override;
    /// True when a record of this type ID is in the area.
    bool isMultiRecordTypePresent(unsigned char type) const;
    /// `key` of the first record of type `type`, decoded by its type's decoder;
    /// "n/a" when there is no such record.
    std::string getValue(unsigned char type, FruKey key) const;

    ///@{
    /// Decoders of one record's data (without its header), `length` bytes:
    /// power supply (type 0x00), DC output (0x01), DC load (0x02), management
    /// access (0x03), base and extended compatibility (0x04, 0x05), OEM
    /// (0xC0-0xFF) records.
    static std::string getPowerSupplyValue(const unsigned char* record, unsigned int length, FruKey key);
    static std::string getDCOutputValue(const unsigned char* record, unsigned int length, FruKey key);
    static std::string getDCLoad(const unsigned char* record, unsigned int length, FruKey key);
    static std::string getManagementAccessValue(const unsigned char* record, unsigned int length, FruKey key);
    static std::string getExtendedCompatValue(const unsigned char* record, unsigned int length, FruKey key);
    static std::string getOEMValue(const unsigned char* record, unsigned int length, FruKey key);
    ///@}

private:
    // Offset of the header of the first record of `type`, or -1. `caller`
    // names the getter in the log line about a zero-length record.
    long findRecord(unsigned char type, const char* caller) const;
};

}  // namespace Ipmi

#endif
