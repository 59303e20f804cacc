#ifndef TAV_IPMI_IPMIFRU_H
#define TAV_IPMI_IPMIFRU_H

#include <stdint.h>

#include <array>
#include <memory>
#include <string>

#include "IpmiEntity.h"
#include "IpmiFruOptional.h"
#include "TavIpmiExport.h"

/// @file
/// FRU devices as the discovery pass found them.

namespace Ipmi {

/// FRU common header: the first 8 bytes of a FRU device's inventory. Area
/// offsets count in multiples of 8 bytes; 0 means the area is absent.
struct fru_header {
    uint8_t version;          ///< format version, 1
    uint8_t internal_offset;  ///< internal use area
    uint8_t chassis_offset;   ///< chassis info area
    uint8_t board_offset;     ///< board info area
    uint8_t product_offset;   ///< product info area
    uint8_t multi_offset;     ///< multi-record area
    uint8_t pad;              ///< 0
    uint8_t checksum;         ///< makes the eight bytes sum to zero
};
static_assert(sizeof(fru_header) == 8, "the common header is read into this structure as it is");

/// One FRU device that answered a discovery pass: where it is, what its
/// locator record calls it, and the areas that were read whole and passed
/// their checksums. Built complete by the discovery pass, then published
/// through a shared pointer and never changed; any thread may read it, and
/// nothing here sends or throws. IpmiIfc::getFrus hands them out.
class TAV_IPMI_API IpmiFru {
public:
    /// Slots of the optional area array.
    enum AreaKind {
        FRU_AREA_CHASSIS = 0,  ///< chassis info area (IpmiFruChassis)
        FRU_AREA_BOARD,        ///< board info area (IpmiFruBoard)
        FRU_AREA_PRODUCT,      ///< product info area (IpmiFruProduct)
        FRU_AREA_MULTI,        ///< multi-record area (IpmiFruMulti)
        FRU_AREA_COUNT         ///< number of slots
    };
    /// The areas by AreaKind; null where the device has none.
    using OptionalRefArray = std::array<std::shared_ptr<const IpmiFruOptional>, FRU_AREA_COUNT>;

    /// A device without areas, as the discovery pass starts it.
    IpmiFru(int node, uint8_t deviceId, const std::string& name, const IpmiEntity& entity, const fru_header& header);

    /// The node the device belongs to.
    int getNode() const { return node_; }
    /// FRU device ID on the local controller.
    uint8_t getDeviceId() const { return deviceId_; }
    /// The ID string of the device's FRU device locator record.
    const std::string& getName() const { return name_; }
    /// The entity the locator record places the device in.
    const IpmiEntity& getEntity() const { return entity_; }
    /// The device's common header as read.
    const fru_header& getHeader() const { return header_; }

    /// Replaces the areas; each slot holds the area of its AreaKind or null.
    /// Only the discovery pass calls it, before the device is published.
    void setOptionalRefArray(const OptionalRefArray& areas) { areas_ = areas; }
    /// All areas by AreaKind.
    const OptionalRefArray& getOptionalRefArray() const { return areas_; }
    /// One area, or null when the device has none (or it failed to read).
    std::shared_ptr<const IpmiFruOptional> getArea(AreaKind kind) const;
    ///@{
    /// One area as its own type, or null when the device has none (or it
    /// failed to read or to pass its checksum).
    std::shared_ptr<const IpmiFruChassis> getChassis() const;
    std::shared_ptr<const IpmiFruBoard> getBoard() const;
    std::shared_ptr<const IpmiFruProduct> getProduct() const;
    std::shared_ptr<const IpmiFruMulti> getMulti() const;
    ///@}

private:
    int node_;
    uint8_t deviceId_;
    std::string name_;
    IpmiEntity entity_;
    fru_header header_;
    OptionalRefArray areas_;
};

}  // namespace Ipmi

#endif
