#ifndef TAV_IPMI_IPMIENTITY_H
#define TAV_IPMI_IPMIENTITY_H

#include <string>

#include "TavIpmiExport.h"

namespace Ipmi {

// A physical or logical platform part, named by IPMI entity ID and instance.
class TAV_IPMI_API IpmiEntity {
public:
    IpmiEntity() : id(0), instance(0), reserved(0), node(0) {}
    IpmiEntity(unsigned int id_, unsigned int instance_, unsigned int reserved_, int node_)
        : id(id_), instance(instance_), reserved(reserved_), node(node_) {}

    static std::string getName(unsigned int id);
    std::string getName() const { return getName(id); }
    std::string getAlertClassName() const;
    IpmiEntity getParent() const;

    unsigned int getId() const { return id; }
    unsigned int getInstance() const { return instance; }
    int getNode() const { return node; }

    bool operator==(const IpmiEntity& o) const {
        return id == o.id && instance == o.instance && reserved == o.reserved && node == o.node;
    }

    unsigned int id;
    unsigned int instance;
    unsigned int reserved;  // 0 for every entity the library builds
    int node;

    struct Mapping {
        const char* name;
        const char* alertClass;
    };
    static const Mapping _mapping[55];
};

}  // namespace Ipmi

#endif
