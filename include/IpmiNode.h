#ifndef TAV_IPMI_IPMINODE_H
#define TAV_IPMI_IPMINODE_H

#include <pthread.h>
#include <stdint.h>

#include <atomic>
#include <list>
#include <memory>
#include <vector>

#include "IpmiEntity.h"
#include "IpmiLan.h"
#include "Mutex.h"
#include "TavIpmiExport.h"

namespace Ipmi {

class IpmiSensor;
class IpmiFru;
class IpmiSel;
class IpmiSelData;

enum { FD_READ = 0, FD_WRITE = 1 };

enum { IPMI_NODE_COUNT = 4 };

// One SDR in a node's per-type record list.
struct ipmiifc_sdr_list {
    ipmiifc_sdr_list* next;
    IpmiSensor* sensor;  // back-reference from the object built from it
    uint16_t record_id;
    uint8_t record_type;
    uint8_t length;  // whole record, header included, modulo 256
    uint8_t* data;   // `length` bytes, owned by the element
};

// Record groups of the SDR lists, by record type.
enum IpmiSdrGroup {
    SDR_GROUP_FULL = 0,
    SDR_GROUP_COMPACT,
    SDR_GROUP_EVENT_ONLY,
    SDR_GROUP_ENTITY_ASSOC,
    SDR_GROUP_GENERIC_LOCATOR,
    SDR_GROUP_FRU_LOCATOR,
    SDR_GROUP_MC_LOCATOR,
    SDR_GROUP_OEM,
    SDR_GROUP_OTHER,
    SDR_GROUP_COUNT
};

// SDR repository bookkeeping of one node; guarded by the node's cacheLock.
struct ipmiifc_sdr_state {
    uint8_t info[15];        // Get SDR Repository Info answer, completion code first
    uint8_t reservation[3];  // completion code, reservation id (LE)
    uint8_t* headers;        // 5-byte record headers in walk order
    uint32_t header_cnt;
    uint8_t headers_valid;
    ipmiifc_sdr_list* lists[SDR_GROUP_COUNT];
};

// SEL bookkeeping of one node.
struct ipmiifc_sel_state {
    uint8_t header[15];     // Get SEL Info answer, completion code first
    uint8_t alloc_info[10]; // Get SEL Allocation Info answer, completion code first
    uint16_t reservation;
    uint16_t last_record_id;
};

typedef void (*IpmiSelEventHandler)(void* context, IpmiSelData* data);

struct ipmiifc_sel_handler {
    ipmiifc_sel_handler* next;
    IpmiSelEventHandler handler;
    void* context;
};

struct ipmiifc_entity_list;

// FRU device access of one node; guarded by the node's fruMutex.
struct ipmiifc_fru_state {
    uint8_t area_info[5];  // last Get FRU Inventory Area Info: cc, size (LE), access type, FRU device ID
    uint8_t header[8];     // common header of the device last read
    uint32_t header_len;
};

// Everything InitIpmiNode clears besides the identity bytes.
struct ipmiifc_node_work {
    ipmiifc_sdr_state sdr;
    ipmiifc_sel_state sel;
    ipmiifc_sel_handler* sel_handlers;  // newest first
    ipmiifc_entity_list* entity_tree;   // top-level entity list
    uint8_t memory_events;
};

// The per-node record: every cache, lock and counter of one node.
// Member order matters: construction follows it, destruction reverses it.
class TAV_IPMI_API IpmiNode {
public:
    IpmiNode();
    ~IpmiNode();
    IpmiNode(const IpmiNode&) = delete;
    IpmiNode& operator=(const IpmiNode&) = delete;

    int32_t node;
    uint32_t msgCounter;
    TAV::Mutex stateMutex;
    pthread_cond_t stateCond;
    int32_t state;
    TAV::Mutex transportMutex;
    int32_t signalCmdPipeFds[2];
    TAV::Mutex pollMutex;
    pthread_cond_t pollCond;
    int32_t pollInterval;  // units of 16 seconds; <= 0: wait for a signal
    std::atomic<bool> stopRequested;  // set by stop() while the loop and senders test it
    int32_t pollCount;
    int32_t pollType;
    pthread_rwlock_t cacheLock;
    TAV::Mutex devInfoMutex;
    uint8_t deviceId[16];
    uint8_t selfTest[3];
    ipmiifc_node_work work;
    int32_t fd;
    int32_t isOpen;
    uint32_t myAddress;
    uint32_t targetAddress;  // 0 or myAddress: the local system interface
    uint8_t targetLun;
    uint8_t targetChannel;
    TAV::Mutex entityMutex;
    std::vector<IpmiEntity> entities;  // flat entity list, pre-order
    TAV::Mutex fruMutex;
    std::vector<std::shared_ptr<IpmiFru>> frus;  // replaced whole under cacheLock
    ipmiifc_fru_state fruState{};
    TAV::Mutex selMutex;  // SEL state, records and handler list
    std::shared_ptr<IpmiSel> sel;
    std::vector<std::shared_ptr<IpmiSelData>> selRecords;
    std::vector<std::shared_ptr<IpmiSensor>> sensors;
    IpmiLan lan;
};

TAV_IPMI_API extern IpmiNode g_IpmiNode[IPMI_NODE_COUNT];

TAV_IPMI_API void InitIpmiNode(int node);

// Read and write guards for a node's cacheLock.
class CacheReadLock {
public:
    explicit CacheReadLock(pthread_rwlock_t& l) : lock_(l) { pthread_rwlock_rdlock(&lock_); }
    ~CacheReadLock() { pthread_rwlock_unlock(&lock_); }
    CacheReadLock(const CacheReadLock&) = delete;
    CacheReadLock& operator=(const CacheReadLock&) = delete;

private:
    pthread_rwlock_t& lock_;
};

class CacheWriteLock {
public:
    explicit CacheWriteLock(pthread_rwlock_t& l) : lock_(l) { pthread_rwlock_wrlock(&lock_); }
    ~CacheWriteLock() { pthread_rwlock_unlock(&lock_); }
    CacheWriteLock(const CacheWriteLock&) = delete;
    CacheWriteLock& operator=(const CacheWriteLock&) = delete;

private:
    pthread_rwlock_t& lock_;
};

}  // namespace Ipmi

#endif
