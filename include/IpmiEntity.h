#ifndef TAV_IPMI_IPMIENTITY_H
#define TAV_IPMI_IPMIENTITY_H

#include <string>

#include "TavIpmiExport.h"

namespace Ipmi {

/// @file
/// Platform entities: what sensors and FRU devices belong to.

/// A physical or logical platform part, named by IPMI entity ID and instance.
/// A value type: nothing here sends or throws, except getParent(), which
/// reads the entity cache (IpmiIfc::getEntityParent).
class TAV_IPMI_API IpmiEntity {
public:
    /// Entity 0 (unspecified), instance 0, node 0.
    IpmiEntity() : id(0), instance(0), reserved(0), node(0) {}
    /// The entity `id_`.`instance_` of `node_`.
    IpmiEntity(unsigned int id_, unsigned int instance_, unsigned int reserved_, int node_)
        : id(id_), instance(instance_), reserved(reserved_), node(node_) {}

    ///@{
    /// The entity ID's name ("System Board", "Power Supply"); "Other" for
    /// IDs the library does not know.
    static std::string getName(unsigned int id);
    std::string getName() const { return getName(id); }
    ///@}
    /// The CIM alert indication class for the entity
    /// ("TAV_IpmiAlertIndication" or a per-entity variant).
    std::string getAlertClassName() const;
    /// The containing entity, from the entity cache; entity 0 when none.
    IpmiEntity getParent() const;

    unsigned int getId() const { return id; }              ///< IPMI entity ID
    unsigned int getInstance() const { return instance; }  ///< entity instance
    int getNode() const { return node; }                   ///< the node

    /// All four fields equal.
    bool operator==(const IpmiEntity& o) const {
        return id == o.id && instance == o.instance && reserved == o.reserved && node == o.node;
    }

    unsigned int id;        ///< IPMI entity ID
    unsigned int instance;  ///< entity instance
    unsigned int reserved;  ///< 0 for every entity the library builds
    int node;               ///< the node

    /// One row of the entity table.
    struct Mapping {
        const char* name;        ///< the entity's name
        const char* alertClass;  ///< its CIM alert indication class
    };
    /// The entity table, by entity ID.
    static const Mapping _mapping[55];
};

}  // namespace Ipmi

#endif
