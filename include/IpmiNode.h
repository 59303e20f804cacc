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

/// @file
/// The node table: every cache, lock and counter of a node in one record.
/// Callers use the IpmiIfc calls, which take the right locks; the record is
/// public for the library's own parts and for tests. Reading or changing its
/// fields directly is outside the library's contract.

/// Everything of the library but the exception type (kelInt) and the lock
/// types (TAV).
namespace Ipmi {

class IpmiSensor;
class IpmiFru;
class IpmiSel;
class IpmiSelData;

/// Ends of the wake-up pipe (IpmiNode::signalCmdPipeFds).
enum {
    FD_READ = 0,  ///< read end
    FD_WRITE = 1  ///< write end
};

/// Slots of the node table; only node 0 is served.
enum { IPMI_NODE_COUNT = 4 };

/// One SDR in a node's per-type record list.
struct ipmiifc_sdr_list {
    ipmiifc_sdr_list* next;  ///< next record of the group
    IpmiSensor* sensor;  ///< back-reference from the object built from it
    uint16_t record_id;      ///< record ID
    uint8_t record_type;     ///< record type code
    uint8_t length;  ///< whole record, header included, modulo 256
    uint8_t* data;   ///< `length` bytes, owned by the element
};

/// Record groups of the SDR lists, by record type.
enum IpmiSdrGroup {
    SDR_GROUP_FULL = 0,         ///< full sensor records (0x01)
    SDR_GROUP_COMPACT,          ///< compact sensor records (0x02)
    SDR_GROUP_EVENT_ONLY,       ///< event-only records (0x03)
    SDR_GROUP_ENTITY_ASSOC,     ///< entity association records (0x08, 0x09)
    SDR_GROUP_GENERIC_LOCATOR,  ///< generic device locator records (0x10)
    SDR_GROUP_FRU_LOCATOR,      ///< FRU device locator records (0x11)
    SDR_GROUP_MC_LOCATOR,       ///< management controller locator records (0x12)
    SDR_GROUP_OEM,              ///< OEM records (0xC0)
    SDR_GROUP_OTHER,            ///< every other type
    SDR_GROUP_COUNT             ///< number of groups
};

/// SDR repository bookkeeping of one node; guarded by the node's cacheLock.
struct ipmiifc_sdr_state {
    uint8_t info[15];        ///< Get SDR Repository Info answer, completion code first
    uint8_t reservation[3];  ///< completion code, reservation id (LE)
    uint8_t* headers;        ///< 5-byte record headers in walk order
    uint32_t header_cnt;     ///< headers held
    uint8_t headers_valid;   ///< the headers belong to the current repository
    ipmiifc_sdr_list* lists[SDR_GROUP_COUNT];  ///< the records by IpmiSdrGroup, newest first
};

/// SEL bookkeeping of one node; guarded by the node's selMutex.
struct ipmiifc_sel_state {
    uint8_t header[15];     ///< Get SEL Info answer, completion code first
    uint8_t alloc_info[10]; ///< Get SEL Allocation Info answer, completion code first
    uint16_t reservation;     ///< the last SEL reservation
    uint16_t last_record_id;  ///< the last record read
};

/// A SEL event handler (IpmiIfc::registerSelEventHandler): called on the
/// polling loop's thread with the context it was registered with and a new
/// record, valid during the call only, or null once every periodic pass.
typedef void (*IpmiSelEventHandler)(void* context, IpmiSelData* data);

/// One entry of the handler list.
struct ipmiifc_sel_handler {
    ipmiifc_sel_handler* next;    ///< the entry registered before it
    IpmiSelEventHandler handler;  ///< null once unregistered
    void* context;                ///< handed to the handler
};

struct ipmiifc_entity_list;

/// FRU device access of one node; guarded by the node's fruMutex.
struct ipmiifc_fru_state {
    uint8_t area_info[5];  ///< last Get FRU Inventory Area Info: cc, size (LE), access type, FRU device ID
    uint8_t header[8];     ///< common header of the device last read
    uint32_t header_len;   ///< valid bytes of `header`
};

/// Everything InitIpmiNode clears besides the identity bytes.
struct ipmiifc_node_work {
    ipmiifc_sdr_state sdr;              ///< SDR repository bookkeeping
    ipmiifc_sel_state sel;              ///< SEL bookkeeping
    ipmiifc_sel_handler* sel_handlers;  ///< newest first
    ipmiifc_entity_list* entity_tree;   ///< top-level entity list
    uint8_t memory_events;              ///< see IpmiIfc::generatesMemoryEvents
};

/// The per-node record: every cache, lock and counter of one node.
/// Member order matters: construction follows it, destruction reverses it.
/// Lock order: pollMutex, then a refresh's own locks, then devInfoMutex,
/// then transportMutex.
class TAV_IPMI_API IpmiNode {
public:
    IpmiNode();
    ~IpmiNode();
    IpmiNode(const IpmiNode&) = delete;
    IpmiNode& operator=(const IpmiNode&) = delete;

    int32_t node;                 ///< this record's node number
    uint32_t msgCounter;          ///< next message ID to stamp on a request
    TAV::Mutex stateMutex;        ///< guards `state`
    pthread_cond_t stateCond;     ///< broadcast on every state change
    int32_t state;                ///< IpmiIfc::IPMI_STATE
    TAV::Mutex transportMutex;    ///< held for one exchange on the device
    int32_t signalCmdPipeFds[2];  ///< the wake-up pipe that ends a transport wait at stop; -1 when closed
    TAV::Mutex pollMutex;         ///< held by the polling loop for a whole pass
    pthread_cond_t pollCond;      ///< wakes the polling loop
    int32_t pollInterval;  ///< units of 16 seconds; <= 0: wait for a signal
    std::atomic<bool> stopRequested;  ///< set by stop() while the loop and senders test it
    int32_t pollCount;            ///< passes begun; 0 until the loop runs
    int32_t pollType;             ///< IPMI_POLL_TYPE of the next wake-up
    pthread_rwlock_t cacheLock;   ///< guards the sensor and FRU lists and the SDR lists
    TAV::Mutex devInfoMutex;      ///< serialises senders; guards `deviceId` and `selfTest`
    uint8_t deviceId[16];         ///< the Get Device ID answer (ipmiifc_device_id)
    uint8_t selfTest[3];          ///< the Get Self Test Results answer
    ipmiifc_node_work work;       ///< SDR and SEL bookkeeping, handler list, entity tree
    int32_t fd;                   ///< the device's descriptor; -1 when closed
    int32_t isOpen;               ///< 1 after a successful open
    uint32_t myAddress;           ///< own IPMB address handed to the driver
    uint32_t targetAddress;  ///< 0 or myAddress: the local system interface
    uint8_t targetLun;            ///< LUN when addressing over IPMB
    uint8_t targetChannel;        ///< channel when addressing over IPMB
    TAV::Mutex entityMutex;       ///< guards `entities` and the entity tree
    std::vector<IpmiEntity> entities;  ///< flat entity list, pre-order
    TAV::Mutex fruMutex;          ///< guards FRU device access and `fruState`
    std::vector<std::shared_ptr<IpmiFru>> frus;  ///< replaced whole under cacheLock
    ipmiifc_fru_state fruState{};  ///< FRU device access bookkeeping
    TAV::Mutex selMutex;  ///< SEL state, records and handler list
    std::shared_ptr<IpmiSel> sel;  ///< the SEL summary
    std::vector<std::shared_ptr<IpmiSelData>> selRecords;  ///< the records read, oldest first
    std::vector<std::shared_ptr<IpmiSensor>> sensors;      ///< the sensor list, replaced whole under cacheLock
    IpmiLan lan;                  ///< the LAN settings (IpmiIfc::getLan)
};

/// The node table.
TAV_IPMI_API extern IpmiNode g_IpmiNode[IPMI_NODE_COUNT];

/// Resets a slot's identity, state and working data (start() and
/// IpmiIfcInitForCLI do); locks and caches keep their contents.
TAV_IPMI_API void InitIpmiNode(int node);

/// Holds a node's cacheLock shared for its scope.
class CacheReadLock {
public:
    /// Takes `l` shared.
    explicit CacheReadLock(pthread_rwlock_t& l) : lock_(l) { pthread_rwlock_rdlock(&lock_); }
    ~CacheReadLock() { pthread_rwlock_unlock(&lock_); }
    CacheReadLock(const CacheReadLock&) = delete;
    CacheReadLock& operator=(const CacheReadLock&) = delete;

private:
    pthread_rwlock_t& lock_;
};

/// Holds a node's cacheLock exclusively for its scope.
class CacheWriteLock {
public:
    /// Takes `l` exclusively.
    explicit CacheWriteLock(pthread_rwlock_t& l) : lock_(l) { pthread_rwlock_wrlock(&lock_); }
    ~CacheWriteLock() { pthread_rwlock_unlock(&lock_); }
    CacheWriteLock(const CacheWriteLock&) = delete;
    CacheWriteLock& operator=(const CacheWriteLock&) = delete;

private:
    pthread_rwlock_t& lock_;
};

}  // namespace Ipmi

#endif
