#ifndef TAV_IPMI_IPMIFRU_H
#define TAV_IPMI_IPMIFRU_H

#include <stdint.h>

#include <array>
#include <memory>
#include <string>

#include "IpmiEntity.h"
#include "IpmiFruOptional.h"
#include "TavIpmiExport.h"

namespace Ipmi {

// FRU common header: the first 8 bytes of a FRU device's inventory. Area
// offsets count in multiples of 8 bytes; 0 means the area is absent.
struct fru_header {
    uint8_t version;  // 1
    uint8_t internal_offset;
    uint8_t chassis_offset;
    uint8_t board_offset;
    uint8_t product_offset;
    uint8_t multi_offset;
    uint8_t pad;
    uint8_t checksum;
};
static_assert(sizeof(fru_header) == 8, "the common header is read into this structure as it is");

// One FRU device that answered a discovery pass: where it is, what its
// locator record calls it, and the areas that were read whole and passed
// their checksums. Built complete by the discovery pass, then published
// through a shared pointer and never changed; safe to read from any thread.
class TAV_IPMI_API IpmiFru {
public:
    // Slots of the optional area array.
    enum AreaKind { FRU_AREA_CHASSIS = 0, FRU_AREA_BOARD, FRU_AREA_PRODUCT, FRU_AREA_MULTI, FRU_AREA_COUNT };
    using OptionalRefArray = std::array<std::shared_ptr<const IpmiFruOptional>, FRU_AREA_COUNT>;

    IpmiFru(int node, uint8_t deviceId, const std::string& name, const IpmiEntity& entity, const fru_header& header);

    int getNode() const { return node_; }
    // FRU device ID on the local controller.
    uint8_t getDeviceId() const { return deviceId_; }
    // The ID string of the device's FRU device locator record.
    const std::string& getName() const { return name_; }
    // The entity the locator record places the device in.
    const IpmiEntity& getEntity() const { return entity_; }
    const fru_header& getHeader() const { return header_; }

    // Replaces the areas; each slot holds the area of its AreaKind or null.
    void setOptionalRefArray(const OptionalRefArray& areas) { areas_ = areas; }
    const OptionalRefArray& getOptionalRefArray() const { return areas_; }
    // One area, or null when the device has none (or it failed to read).
    std::shared_ptr<const IpmiFruOptional> getArea(AreaKind kind) const;
    std::shared_ptr<const IpmiFruChassis> getChassis() const;
    std::shared_ptr<const IpmiFruBoard> getBoard() const;
    std::shared_ptr<const IpmiFruProduct> getProduct() const;
    std::shared_ptr<const IpmiFruMulti> getMulti() const;

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
