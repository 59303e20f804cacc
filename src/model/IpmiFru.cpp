// One discovered FRU device and its decoded areas.

#include "IpmiFru.h"

namespace Ipmi {

IpmiFru::IpmiFru(int node, uint8_t deviceId, const std::string& name, const IpmiEntity& entity,
                 const fru_header& header)
    : node_(node), deviceId_(deviceId), name_(name), entity_(entity), header_(header) {}

std::shared_ptr<const IpmiFruOptional> IpmiFru::getArea(AreaKind kind) const {
    return kind >= 0 && kind < FRU_AREA_COUNT ? areas_[kind] : nullptr;
}

// A slot set with another kind of area reads as absent.
std::shared_ptr<const IpmiFruChassis> IpmiFru::getChassis() const {
    return std::dynamic_pointer_cast<const IpmiFruChassis>(areas_[FRU_AREA_CHASSIS]);
}
std::shared_ptr<const IpmiFruBoard> IpmiFru::getBoard() const {
    return std::dynamic_pointer_cast<const IpmiFruBoard>(areas_[FRU_AREA_BOARD]);
}
std::shared_ptr<const IpmiFruProduct> IpmiFru::getProduct() const {
    return std::dynamic_pointer_cast<const IpmiFruProduct>(areas_[FRU_AREA_PRODUCT]);
}
std::shared_ptr<const IpmiFruMulti> IpmiFru::getMulti() const {
    return std::dynamic_pointer_cast<const IpmiFruMulti>(areas_[FRU_AREA_MULTI]);
}

}  // namespace Ipmi
