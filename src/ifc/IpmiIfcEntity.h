#ifndef TAV_IPMI_IPMIIFCENTITY_H
#define TAV_IPMI_IPMIIFCENTITY_H

// The entity association tree of a node: containers from entity association
// records and the entities they contain, plus sensor entities that no record
// names. Two levels only: children never get children of their own.

#include <stdint.h>

#include "IpmiEntity.h"

namespace Ipmi {

// An entity as it stands in an SDR. Bit 7 of the instance (device-relative)
// is ignored by every comparison.
struct entity_id {
    uint8_t id;
    uint8_t instance;
};

enum { ENTITY_INSTANCE_MASK = 0x7F };

enum { ENTITY_FLAG_PRESENCE_ACCESSIBLE = 0x01 };

// One tree element, allocated zeroed.
struct ipmiifc_entity_list {
    ipmiifc_entity_list* next;      // next sibling
    ipmiifc_entity_list* parent;    // container; for a top-level element the one added before it
    ipmiifc_entity_list* children;  // first contained element
    entity_id entity;
    uint8_t spare;
    uint8_t flags;  // ENTITY_FLAG_PRESENCE_ACCESSIBLE
};

// Adders and the membership test take the node's entityMutex themselves.
uint32_t IpmiIfcEntityAddParent(int node, const entity_id* entity, uint8_t flag);
uint32_t IpmiIfcEntityAddChild(int node, const entity_id* container, uint8_t childId, uint8_t childInstance);
uint32_t IpmiIfcEntityOnList(int node, const entity_id* entity);
IpmiEntity IpmiIfcEntityFindParent(int node, const entity_id* entity);
void IpmiIfcEntityDumpAll(int node);

// Walkers of one sibling list; callers hold the node's entityMutex.
uint32_t IpmiIfcEntityOnChildList(const ipmiifc_entity_list* list, const entity_id* entity);
uint32_t IpmiIfcEntityInstantiate(int node, const ipmiifc_entity_list* element);
const ipmiifc_entity_list* IpmiIfcEntityFindParentFromChild(const ipmiifc_entity_list* list,
                                                            const entity_id* entity);
void IpmiIfcEntityCleanupChild(ipmiifc_entity_list* list);
void IpmiIfcEntityDump(const ipmiifc_entity_list* list);

}  // namespace Ipmi

#endif
