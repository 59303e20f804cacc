#ifndef TAV_IPMI_IPMIIFC_H
#define TAV_IPMI_IPMIIFC_H

#include <stdint.h>

#include <memory>
#include <string>
#include <vector>

#include "CmpiStatus.h"
#include "IpmiEntity.h"
#include "IpmiFru.h"
#include "IpmiNode.h"
#include "TavIpmiExport.h"

namespace Ipmi {

class IpmiLan;
class IpmiSensor;
class IpmiSel;
class IpmiSelData;

// What a wake-up of the polling loop asks for.
enum IPMI_POLL_TYPE {
    IPMI_POLL_NONE = 0,
    IPMI_POLL_NORMAL = 1,
    IPMI_POLL_FULL = 2,
    IPMI_POLL_SENSORS = 3,
    IPMI_POLL_SEL = 4
};

// The stored Get Device ID answer, completion code first.
struct ipmiifc_device_id {
    uint8_t cc;
    uint8_t device_id;
    uint8_t device_revision;
    uint8_t fw_rev1;
    uint8_t fw_rev2;
    uint8_t ipmi_version;
    uint8_t additional_support;
    uint8_t manufacturer_id[3];  // least significant byte first
    uint8_t product_id[2];
    uint8_t aux_fw_rev[4];
} __attribute__((packed));

// The stored Get SDR Repository Info answer, completion code first.
struct ipmiifc_sdr_info {
    uint8_t cc;
    uint8_t version;
    uint16_t record_count;
    uint16_t free_space;
    uint32_t addition_timestamp;
    uint32_t erase_timestamp;
    uint8_t operation_support;
} __attribute__((packed));

// The stored Get SEL Info answer, completion code first.
struct ipmiifc_sel_info {
    uint8_t cc;
    uint8_t version;             // 0x51 for IPMI 1.5 and 2.0
    uint16_t entries;
    uint16_t free_space;         // bytes
    uint32_t addition_timestamp;
    uint32_t erase_timestamp;
    uint8_t operation_support;   // bit 7: overflow
} __attribute__((packed));

// The stored Get SEL Allocation Info answer, completion code first.
struct ipmiifc_sel_alloc_info {
    uint8_t cc;
    uint16_t units;
    uint16_t unit_size;  // bytes; 0 when the controller does not say
    uint16_t free_units;
    uint16_t largest_free_block;
    uint8_t max_record_units;
} __attribute__((packed));

// The stored Get FRU Inventory Area Info answer, completion code first, and
// the FRU device it was asked for.
struct ipmiifc_fru_area_info {
    uint8_t cc;
    uint16_t size;  // inventory area size in bytes
    uint8_t access;  // bit 0 set: the device is accessed by words
    uint8_t device_id;
} __attribute__((packed));

// Public entry points; every per-node operation has an overload for node 0.
class TAV_IPMI_API IpmiIfc {
public:
    enum IPMI_STATE {
        IPMI_STATE_INIT = 1,
        IPMI_STATE_STARTING = 2,
        IPMI_STATE_RUNNING = 4,
        IPMI_STATE_STOPPED = 8,
        IPMI_STATE_CLI = 16
    };

    // Interface states.
    static int getState(int node);
    static int getState();
    static int waitState(int node, int mask);
    static int waitState(int mask);
    static int timedWaitState(int node, int mask, long sec, long usec);
    static int timedWaitState(int mask, long sec, long usec);

    // Life cycle and polling.
    static void start(int node, int interval);
    static void start(int interval);
    static void stop(int node);
    static void stop();
    static void poll(int node);
    static void doPoll(int node);
    static void doPoll();
    static void setPollingInterval(int node, int interval);
    static void setPollingInterval(int interval);
    static int getPollingInterval(int node);
    static int getPollingInterval();
    static void pollAll(int nodeCount, bool serial, IPMI_POLL_TYPE type, bool* shutdown);

    // Raw commands. resp_buf[0] is the completion code.
    static uint8_t sendCmd(int node, uint8_t cmd, uint8_t netfn, uint16_t data_len, uint8_t* data,
                           uint16_t* resp_len, uint8_t* resp_buf);
    static uint8_t sendCmd(uint8_t cmd, uint8_t netfn, uint16_t data_len, uint8_t* data,
                           uint16_t* resp_len, uint8_t* resp_buf);

    // Controller identity and host properties.
    static int identifyChassis(int node, unsigned char interval, unsigned char force);
    static int identifyChassis(unsigned char interval, unsigned char force);
    static int convertToGeneratorId(int address, int channel, int lun);
    static int getManufacturerId(int node, unsigned char* id, unsigned char& count);
    static int getManufacturerId(unsigned char* id, unsigned char& count);
    static int getManagementControllerInfo(int node, ipmiifc_device_id& out);
    static const char* getManufacturerName(unsigned int id);
    static std::string GetBmcManufacturer();
    static std::string GetBmcFWVersion();
    static std::string GetBmcIpmiVersion();
    static std::string GetBmcReportedOSName();
    static std::string GetBmcReportedOSVersion();
    static bool SetOSInfo(const std::string& osName, const std::string& osVersion);
    static IpmiLan* GetBMCNetworking();
    static bool hpe_bmc;

    // SDR repository.
    static ipmiifc_sdr_info getSdr(int node);

    // Sensors.
    static std::vector<std::shared_ptr<IpmiSensor>> getSensors(int node);
    static std::vector<std::shared_ptr<IpmiSensor>> getSensors();
    static std::shared_ptr<IpmiSensor> getSensor(int node, unsigned owner, unsigned number);
    static std::shared_ptr<IpmiSensor> getSensor(unsigned owner, unsigned number);

    // Entities.
    static std::vector<IpmiEntity> getEntities(int node);
    static std::vector<IpmiEntity> getEntities();
    static IpmiEntity getEntityParent(int node, unsigned int id, unsigned int instance);
    static IpmiEntity getEntityParent(unsigned int id, unsigned int instance);

    // FRU inventory, as the last discovery pass found it. The list is
    // replaced whole, so a caller never sees a half-built one; the objects
    // stay valid for as long as the caller holds them.
    static std::vector<std::shared_ptr<IpmiFru>> getFrus(int node);
    static std::vector<std::shared_ptr<IpmiFru>> getFrus();
    // One area of one FRU device, or null when the device or the area is
    // absent (or the area failed to read or to pass its checksum).
    static std::shared_ptr<const IpmiFruOptional> getFruPart(int node, uint8_t deviceId, IpmiFru::AreaKind kind);
    static std::shared_ptr<const IpmiFruOptional> getFruPart(uint8_t deviceId, IpmiFru::AreaKind kind);
    // The last Get FRU Inventory Area Info answer of the node.
    static ipmiifc_fru_area_info getFruDeviceHeader(int node);

    // SEL event handlers: called on the polling loop's thread with each new
    // event record, and with null once every periodic pass. Node 0's list
    // serves every node. `start` clears the list, so register once
    // waitState reports the running state. Returns 0, or 5 for a null handler;
    // unregistering returns 2 for a handler not in the list, and returns only
    // once no other thread still runs the handler.
    static int registerSelEventHandler(int node, IpmiSelEventHandler handler, void* context);
    static int registerSelEventHandler(IpmiSelEventHandler handler, void* context);
    static int unRegisterSelEventHandler(int node, IpmiSelEventHandler handler);
    static int unRegisterSelEventHandler(IpmiSelEventHandler handler);
    static bool generatesMemoryEvents(int node);

    // System event log. Results of clearSel.
    enum SEL_CLEAR_RESULT {
        SEL_CLEAR_OK = 0,
        SEL_CLEAR_NOT_CONFIRMED = 2,  // busy five times, or an unexpected erasure status
        SEL_CLEAR_NO_ANSWER = 4,
        SEL_CLEAR_REFUSED = 5         // another completion code (logged)
    };
    // The summary built from the last Get SEL Info answer; empty before one.
    static std::shared_ptr<IpmiSel> getSel(int node);
    static std::shared_ptr<IpmiSel> getSel();
    // The records read so far, oldest first.
    static std::vector<std::shared_ptr<IpmiSelData>> getSelData(int node);
    static std::vector<std::shared_ptr<IpmiSelData>> getSelData();
    static ipmiifc_sel_info getRawSelHeader(int node);
    static ipmiifc_sel_info getRawSelHeader();
    // Erases the controller's SEL; one of SEL_CLEAR_RESULT.
    static int clearSel(int node);
    static int clearSel();
    // The record ID software last processed (PEF); 0 when unknown.
    static uint16_t getLastProcessedSELEntry(int node);
    static uint16_t getLastProcessedSELEntry();
    static void setLastProcessedSELEntry(int node, uint16_t id);
    static void setLastProcessedSELEntry(uint16_t id);
    // The controller's SEL clock in seconds, 0 when it cannot be read. Uses a
    // descriptor of its own, so it works with or without the polling loop.
    static uint32_t GetSelClock();
    static uint32_t selGetClock(int node);

    // LAN configuration.
    static IpmiLan* getLan(int node);
    static IpmiLan* getLan();

    // Observation of the polling loop, for monitoring. Observing sends
    // nothing: every getter reads values the loop and the transport store
    // atomically, from any thread, while the loop runs. Node 0 serves every
    // node. Times are Unix seconds of the time of day, 0 when never.

    // The caches the loop refreshes.
    enum IPMI_CACHE {
        IPMI_CACHE_SENSORS = 0,  // sensor readings and thresholds
        IPMI_CACHE_SDR = 1,      // SDR repository (and the sensors and entities built from it)
        IPMI_CACHE_SEL = 2,      // SEL info and records
        IPMI_CACHE_FRU = 3,      // FRU inventory
        IPMI_CACHE_LAN = 4,      // LAN settings
        IPMI_CACHE_COUNT = 5
    };
    // How an exchange with the controller ended.
    enum IPMI_EXCHANGE_RESULT {
        IPMI_EXCHANGE_OK = 0,               // answered with completion code 0
        IPMI_EXCHANGE_COMPLETION_CODE = 1,  // answered with another completion code, time-out excepted
        IPMI_EXCHANGE_TIMEOUT = 2,          // no answer in time, or the driver's time-out code 0xC3
        IPMI_EXCHANGE_ERROR = 3,            // the device failed (send, wait or receive), or is not open
        IPMI_EXCHANGE_RESULT_COUNT = 4
    };
    // When the loop's last pass ended (the set-up reads before the first
    // wait count as a pass).
    static double getLastPassTime(int node);
    static double getLastPassTime();
    // Whether the last pass reached the controller: at least one of its
    // exchanges was answered by the controller (time-outs are not answers).
    static bool lastPassReachedController(int node);
    static bool lastPassReachedController();
    // When the last pass that reached the controller ended.
    static double getLastSuccessfulPassTime(int node);
    static double getLastSuccessfulPassTime();
    // How long the last pass took, in seconds.
    static double getLastPassDuration(int node);
    static double getLastPassDuration();
    // When the loop last refreshed a cache: the refresh succeeded and none of
    // its exchanges timed out or failed. 0 for an unknown cache.
    static double getCacheRefreshTime(int node, IPMI_CACHE cache);
    static double getCacheRefreshTime(IPMI_CACHE cache);
    // Exchanges with the controller since the process started, by result;
    // every thread's exchanges count, the loop's and callers' own.
    static uint64_t getExchangeCount(int node, IPMI_EXCHANGE_RESULT result);
    static uint64_t getExchangeCount(IPMI_EXCHANGE_RESULT result);
};

// Command-line mode: no polling loop; the caller opens the device first.
TAV_IPMI_API int IpmiIfcInitForCLI(int node);
TAV_IPMI_API void IpmiIfcCloseForCLI(int node);
TAV_IPMI_API int IpmiIfcOpenIpmiOpen(int node);
TAV_IPMI_API void IpmiIfcOpenIpmiClose(int node);
// Reads the SDR repository when it changed and rebuilds sensors and entities
// from it (the polling loop does this by itself; one-shot tools call it).
TAV_IPMI_API uint32_t IpmiIfcSdrGetInfo(int node);
// Asks for the SEL info and follows a change: reads new records or reloads
// the log (one-shot tools call it to load the SEL). `count` may be null.
TAV_IPMI_API uint32_t IpmiIfcSelGetInfo(int node, uint16_t* count);
// Reads every FRU device that the node's FRU device locator records name and
// replaces the node's FRU list (the polling loop does this by itself).
TAV_IPMI_API int IpmiIfcFruInstantiateAll(int node);

}  // namespace Ipmi

#endif
