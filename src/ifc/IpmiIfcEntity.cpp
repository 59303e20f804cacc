#include "IpmiIfcEntity.h"

#include <stddef.h>

#include <memory>
#include <new>
#include <vector>

#include "IpmiIfcInternal.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"

namespace Ipmi {

namespace {

const uint32_t kFail = 0xFFFFFFFFu;

// Entity association record (type 0x08; 0x09 is read through the same layout).
namespace assoc {
constexpr size_t containerId = 5;
constexpr size_t containerInstance = 6;
constexpr size_t flags = 7;
constexpr size_t contained = 8;  // four (ID, instance) pairs, or two ranges of two pairs each
constexpr size_t containedPairs = 4;
constexpr size_t pairSize = 2;
constexpr size_t rangeSize = 4;  // first ID, first instance, last ID, last instance
constexpr uint8_t flagRanges = 0x80;
constexpr uint8_t flagPresenceAccessible = 0x20;
}  // namespace assoc

// Only power supplies reported with a Watts power-supply sensor are real on
// HPE controllers; their repositories list empty bays as well.
constexpr uint8_t kEntityPowerSupply = 0x0A;
constexpr uint8_t kSensorTypePowerSupply = 0x08;
constexpr uint8_t kUnitWatts = 6;

bool validNode(int node) { return node >= 0 && node < IPMI_NODE_COUNT; }

bool sameInstance(uint8_t a, uint8_t b) { return ((a ^ b) & ENTITY_INSTANCE_MASK) == 0; }

bool sameEntity(const entity_id& a, const entity_id& b) {
    return a.id == b.id && sameInstance(a.instance, b.instance);
}

ipmiifc_entity_list* newElement() { return new (std::nothrow) ipmiifc_entity_list(); }

sdr::SdrView recordOf(const ipmiifc_sdr_list* element) {
    return sdr::SdrView(element->data, element->length);
}

void addContainedRange(int node, const entity_id& container, const sdr::SdrView& record, size_t at) {
    if (!record.has(at, assoc::rangeSize)) return;
    const uint8_t firstId = record.byteAt(at);
    const uint8_t firstInstance = record.byteAt(at + 1);
    const uint8_t lastId = record.byteAt(at + 2);
    const uint8_t lastInstance = record.byteAt(at + 3);
    if (firstId == 0 || firstId != lastId || firstInstance > lastInstance) return;
    for (unsigned instance = firstInstance; instance <= lastInstance; ++instance)
        IpmiIfcEntityAddChild(node, &container, firstId, static_cast<uint8_t>(instance));
}

void addAssociation(int node, const sdr::SdrView& record) {
    if (!record.has(assoc::containerId, 2)) return;
    const entity_id container = {record.byteAt(assoc::containerId), record.byteAt(assoc::containerInstance)};
    const uint8_t flags = record.byteAt(assoc::flags);  // 0 when the record ends before it
    // A container met before keeps its element; this record's entities join it.
    IpmiIfcEntityAddParent(node, &container, (flags & assoc::flagPresenceAccessible) ? 1 : 0);
    if (flags & assoc::flagRanges) {
        addContainedRange(node, container, record, assoc::contained);
        addContainedRange(node, container, record, assoc::contained + assoc::rangeSize);
        return;
    }
    for (size_t i = 0; i < assoc::containedPairs; ++i) {
        const size_t at = assoc::contained + i * assoc::pairSize;
        if (!record.has(at, assoc::pairSize)) break;
        if (record.byteAt(at) != 0) IpmiIfcEntityAddChild(node, &container, record.byteAt(at), record.byteAt(at + 1));
    }
}

bool hasWattsSensor(const std::vector<std::shared_ptr<IpmiSensor>>& sensors, unsigned instance) {
    for (const auto& s : sensors) {
        if (!s) continue;
        const IpmiEntity e = s->getEntity();
        if (e.id == kEntityPowerSupply && e.instance == instance && s->getSensorType() == kSensorTypePowerSupply &&
            s->getBaseUnit() == kUnitWatts)
            return true;
    }
    return false;
}

// Walks from the end so that removals do not move the entries still to be seen.
void stripPhantomPowerSupplies(const std::vector<std::shared_ptr<IpmiSensor>>& sensors,
                               std::vector<IpmiEntity>& entities) {
    ipmiLog(LOG_INFO, "%s: stripping out phantom power supply IPMI SDRs", "IpmiIfcEntityInstantiateAll");
    for (size_t i = entities.size(); i-- > 0;)
        if (entities[i].id == kEntityPowerSupply && !hasWattsSensor(sensors, entities[i].instance))
            entities.erase(entities.begin() + static_cast<std::ptrdiff_t>(i));
}

void addSensorEntity(int node, const sdr::SdrView& record) {
    if (!record.has(sdr::key::entityId, 2)) return;
    const sdr::SensorKeyView sensor(record);
    const entity_id entity = {sensor.entityId(), sensor.entityInstanceByte()};
    if (!IpmiIfcEntityOnList(node, &entity)) IpmiIfcEntityAddParent(node, &entity, 0);
}

}  // namespace

uint32_t IpmiIfcEntityAddParent(int node, const entity_id* entity, uint8_t flag) {
    if (!validNode(node) || entity == nullptr) return kFail;
    IpmiNode& n = g_IpmiNode[node];
    TAV::MutexLock guard(n.entityMutex);
    ipmiifc_entity_list* last = nullptr;
    for (ipmiifc_entity_list* e = n.work.entity_tree; e != nullptr; e = e->next) {
        if (sameEntity(e->entity, *entity)) return kFail;
        last = e;
    }
    ipmiifc_entity_list* element = newElement();
    if (element == nullptr) return kFail;
    element->entity = *entity;
    element->parent = last;
    element->flags = flag ? ENTITY_FLAG_PRESENCE_ACCESSIBLE : 0;
    if (last != nullptr)
        last->next = element;
    else
        n.work.entity_tree = element;
    return 0;
}

uint32_t IpmiIfcEntityAddChild(int node, const entity_id* container, uint8_t childId, uint8_t childInstance) {
    if (!validNode(node) || container == nullptr) return kFail;
    IpmiNode& n = g_IpmiNode[node];
    TAV::MutexLock guard(n.entityMutex);
    ipmiifc_entity_list* top = n.work.entity_tree;
    while (top != nullptr && !sameEntity(top->entity, *container)) top = top->next;
    if (top == nullptr) return kFail;
    ipmiifc_entity_list* last = nullptr;
    for (ipmiifc_entity_list* c = top->children; c != nullptr; c = c->next) {
        if (c->entity.id == childId && sameInstance(c->entity.instance, childInstance)) return kFail;
        last = c;
    }
    ipmiifc_entity_list* element = newElement();
    if (element == nullptr) return kFail;
    element->entity.id = childId;
    element->entity.instance = childInstance & ENTITY_INSTANCE_MASK;
    element->parent = top;
    element->flags = top->flags & ENTITY_FLAG_PRESENCE_ACCESSIBLE;
    if (last != nullptr)
        last->next = element;
    else
        top->children = element;
    return 0;
}

uint32_t IpmiIfcEntityOnChildList(const ipmiifc_entity_list* list, const entity_id* entity) {
    for (const ipmiifc_entity_list* e = list; e != nullptr; e = e->next) {
        if (sameEntity(e->entity, *entity)) return kFail;
        if (IpmiIfcEntityOnChildList(e->children, entity)) return kFail;
    }
    return 0;
}

uint32_t IpmiIfcEntityOnList(int node, const entity_id* entity) {
    if (!validNode(node) || entity == nullptr) return 0;
    IpmiNode& n = g_IpmiNode[node];
    TAV::MutexLock guard(n.entityMutex);
    return IpmiIfcEntityOnChildList(n.work.entity_tree, entity);
}

// Lock order: cacheLock, then the entity mutex (taken by each add).
uint32_t IpmiIfcEntityListCreate(int node) {
    if (!validNode(node)) return kFail;
    IpmiNode& n = g_IpmiNode[node];
    CacheReadLock guard(n.cacheLock);
    for (const ipmiifc_sdr_list* r = n.work.sdr.lists[SDR_GROUP_ENTITY_ASSOC]; r != nullptr; r = r->next)
        addAssociation(node, recordOf(r));
    for (int group : {SDR_GROUP_FULL, SDR_GROUP_COMPACT, SDR_GROUP_EVENT_ONLY})
        for (const ipmiifc_sdr_list* r = n.work.sdr.lists[group]; r != nullptr; r = r->next)
            addSensorEntity(node, recordOf(r));
    return 0;
}

uint32_t IpmiIfcEntityInstantiate(int node, const ipmiifc_entity_list* element) {
    g_IpmiNode[node].entities.emplace_back(element->entity.id, element->entity.instance & ENTITY_INSTANCE_MASK, 0,
                                           node);
    for (const ipmiifc_entity_list* c = element->children; c != nullptr; c = c->next) IpmiIfcEntityInstantiate(node, c);
    return 0;
}

// The sensor copy is taken before the entity mutex: the tree builder holds
// cacheLock while it takes the entity mutex, so the reverse nesting here would
// close a lock-order cycle (harmless while one thread runs both, but a trap).
uint32_t IpmiIfcEntityInstantiateAll(int node) {
    if (!validNode(node)) return kFail;
    IpmiNode& n = g_IpmiNode[node];
    try {
        const bool stripPhantoms = IpmiIfc::hpe_bmc;
        const std::vector<std::shared_ptr<IpmiSensor>> sensors =
            stripPhantoms ? IpmiIfc::getSensors(node) : std::vector<std::shared_ptr<IpmiSensor>>();
        TAV::MutexLock guard(n.entityMutex);
        n.entities.clear();
        for (const ipmiifc_entity_list* e = n.work.entity_tree; e != nullptr; e = e->next)
            IpmiIfcEntityInstantiate(node, e);
        if (stripPhantoms) stripPhantomPowerSupplies(sensors, n.entities);
    } catch (const std::bad_alloc&) {
        return kFail;
    }
    return 0;
}

const ipmiifc_entity_list* IpmiIfcEntityFindParentFromChild(const ipmiifc_entity_list* list, const entity_id* entity) {
    for (const ipmiifc_entity_list* e = list; e != nullptr; e = e->next) {
        if (sameEntity(e->entity, *entity)) return e;
        if (const ipmiifc_entity_list* found = IpmiIfcEntityFindParentFromChild(e->children, entity)) return found;
    }
    return nullptr;
}

IpmiEntity IpmiIfcEntityFindParent(int node, const entity_id* entity) {
    const IpmiEntity none;
    if (!validNode(node) || entity == nullptr) return none;
    IpmiNode& n = g_IpmiNode[node];
    TAV::MutexLock guard(n.entityMutex);
    for (const ipmiifc_entity_list* top = n.work.entity_tree; top != nullptr; top = top->next) {
        if (sameEntity(top->entity, *entity)) return none;  // a container has no container
        const ipmiifc_entity_list* found = IpmiIfcEntityFindParentFromChild(top->children, entity);
        if (found == nullptr) continue;
        if (found->parent == nullptr) return none;
        return IpmiEntity(found->parent->entity.id, found->parent->entity.instance & ENTITY_INSTANCE_MASK, 0, node);
    }
    return none;
}

IpmiEntity IpmiIfc::getEntityParent(int node, unsigned int id, unsigned int instance) {
    if (id > 0xFF) return IpmiEntity();  // no SDR can name it
    const entity_id entity = {static_cast<uint8_t>(id), static_cast<uint8_t>(instance & ENTITY_INSTANCE_MASK)};
    return IpmiIfcEntityFindParent(node, &entity);
}

IpmiEntity IpmiIfc::getEntityParent(unsigned int id, unsigned int instance) { return getEntityParent(0, id, instance); }

std::vector<IpmiEntity> IpmiIfc::getEntities(int node) {
    if (!validNode(node)) return std::vector<IpmiEntity>();
    IpmiNode& n = g_IpmiNode[node];
    TAV::MutexLock guard(n.entityMutex);
    return n.entities;
}

std::vector<IpmiEntity> IpmiIfc::getEntities() { return getEntities(0); }

void IpmiIfcEntityCleanupChild(ipmiifc_entity_list* list) {
    while (list != nullptr) {
        ipmiifc_entity_list* next = list->next;
        IpmiIfcEntityCleanupChild(list->children);
        delete list;
        list = next;
    }
}

// The flat list stays: callers keep seeing the last entities until the next rebuild.
void IpmiIfcEntityCleanUpAll(int node) {
    if (!validNode(node)) return;
    IpmiNode& n = g_IpmiNode[node];
    TAV::MutexLock guard(n.entityMutex);
    IpmiIfcEntityCleanupChild(n.work.entity_tree);
    n.work.entity_tree = nullptr;
}

void IpmiIfcEntityDump(const ipmiifc_entity_list* list) {
    for (const ipmiifc_entity_list* e = list; e != nullptr; e = e->next) IpmiIfcEntityDump(e->children);
}

void IpmiIfcEntityDumpAll(int node) {
    if (!validNode(node)) return;
    IpmiNode& n = g_IpmiNode[node];
    TAV::MutexLock guard(n.entityMutex);
    IpmiIfcEntityDump(n.work.entity_tree);
}

}  // namespace Ipmi
