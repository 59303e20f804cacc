#include "IpmiIfc.h"

namespace Ipmi {

// IpmiEntity::getParent needs the entity tree's lookup, which lives with the tree
// in IpmiIfcEntity.cpp. Until that lookup is linked in, this weak definition keeps
// the library linking (it is built with --no-undefined) and answers "no parent";
// the tree's own definition replaces it at link time.
__attribute__((weak)) IpmiEntity IpmiIfc::getEntityParent(int, unsigned int, unsigned int) {
    return IpmiEntity();
}

}  // namespace Ipmi
