#ifndef TAV_IPMI_IPMIWIRE_H
#define TAV_IPMI_IPMIWIRE_H

/// @file
/// Controller answers as the library stores them, byte for byte, completion
/// code first. Multi-byte fields are little-endian, as IPMI sends them. Few
/// callers need these: the getters of Ipmi::IpmiIfc decode the same bytes.
/// IpmiIfc.h includes this header.

#include <stdint.h>

namespace Ipmi {

/// The stored Get Device ID answer (IpmiIfc::getManagementControllerInfo).
struct ipmiifc_device_id {
    uint8_t cc;                  ///< completion code
    uint8_t device_id;           ///< device ID
    uint8_t device_revision;     ///< bit 7: SDRs; bits 3:0: device revision
    uint8_t fw_rev1;             ///< bit 7: update in progress; bits 6:0: major firmware revision
    uint8_t fw_rev2;             ///< minor firmware revision, BCD
    uint8_t ipmi_version;        ///< BCD, low nibble major: 0x02 is 2.0, 0x51 is 1.5
    uint8_t additional_support;  ///< bit per optional function (SEL, SDR repository, FRU, ...)
    uint8_t manufacturer_id[3];  ///< IANA enterprise number, least significant byte first
    uint8_t product_id[2];       ///< least significant byte first
    uint8_t aux_fw_rev[4];       ///< auxiliary firmware revision, vendor-defined
} __attribute__((packed));

/// The stored Get SDR Repository Info answer (IpmiIfc::getSdr).
struct ipmiifc_sdr_info {
    uint8_t cc;                   ///< completion code
    uint8_t version;              ///< SDR version, 0x51 for IPMI 1.5 and 2.0
    uint16_t record_count;        ///< records in the repository
    uint16_t free_space;          ///< bytes
    uint32_t addition_timestamp;  ///< seconds, controller time, of the last addition
    uint32_t erase_timestamp;     ///< seconds, controller time, of the last erase
    uint8_t operation_support;    ///< bit 7: overflow; bits 3:0: supported commands
} __attribute__((packed));

/// The stored Get SEL Info answer (IpmiIfc::getRawSelHeader).
struct ipmiifc_sel_info {
    uint8_t cc;                   ///< completion code
    uint8_t version;              ///< 0x51 for IPMI 1.5 and 2.0
    uint16_t entries;             ///< records in the log
    uint16_t free_space;          ///< bytes
    uint32_t addition_timestamp;  ///< seconds, controller time, of the last addition
    uint32_t erase_timestamp;     ///< seconds, controller time, of the last erase
    uint8_t operation_support;    ///< bit 7: overflow; bits 3:0: supported commands
} __attribute__((packed));

/// The stored Get SEL Allocation Info answer.
struct ipmiifc_sel_alloc_info {
    uint8_t cc;                   ///< completion code
    uint16_t units;               ///< allocation units in the log
    uint16_t unit_size;           ///< bytes; 0 when the controller does not say
    uint16_t free_units;          ///< units not in use
    uint16_t largest_free_block;  ///< units
    uint8_t max_record_units;     ///< units one record can take
} __attribute__((packed));

/// The stored Get FRU Inventory Area Info answer and the FRU device it was
/// asked for (IpmiIfc::getFruDeviceHeader).
struct ipmiifc_fru_area_info {
    uint8_t cc;         ///< completion code
    uint16_t size;      ///< inventory area size in bytes
    uint8_t access;     ///< bit 0 set: the device is accessed by words
    uint8_t device_id;  ///< FRU device ID
} __attribute__((packed));

}  // namespace Ipmi

#endif
