#ifndef TAV_IPMI_IPMIIFC_H
#define TAV_IPMI_IPMIIFC_H

/// @file
/// The library's entry points, in the order a caller meets them: lifecycle,
/// sensors, entities, FRU inventory, system event log, LAN, identity, raw
/// commands. The rules every call follows (threads, blocking, lifetime,
/// exceptions, logging) are stated once on the main page of the reference
/// (docs/reference.md).

#include <stdint.h>

#include <memory>
#include <string>
#include <vector>

#include "CmpiStatus.h"
#include "IpmiEntity.h"
#include "IpmiFru.h"
#include "IpmiNode.h"
#include "IpmiSelData.h"
#include "IpmiWire.h"
#include "TavIpmiExport.h"

namespace Ipmi {

class IpmiLan;
class IpmiSensor;
class IpmiSel;
class IpmiSelData;

/// What a wake-up of the polling loop asks for (IpmiIfc::pollAll).
enum IPMI_POLL_TYPE {
    IPMI_POLL_NONE = 0,     ///< nothing: the loop goes back to sleep
    IPMI_POLL_NORMAL = 1,   ///< an ordinary pass, as after the period ends
    IPMI_POLL_FULL = 2,     ///< a full refresh (SDR repository, sensors, FRU, LAN) even without new SEL entries
    IPMI_POLL_SENSORS = 3,  ///< sensor readings are refreshed on this pass, whatever else it does
    IPMI_POLL_SEL = 4       ///< only the SEL is read; a periodic refresh due now waits for the next pass
};

/// The library's entry points, all static. Each per-node call has an
/// overload without the node for node 0 (the only node served).
///
/// Groups, in this order: lifecycle, sensors, entities, FRU inventory,
/// system event log, LAN, identity, raw commands, monitoring. See the
/// reference's main page for the contract every call follows: @ref contract-threads "threads",
/// @ref contract-blocking "blocking", @ref contract-lifetime "lifetime",
/// @ref contract-exceptions "exceptions", @ref contract-logging "logging".
class TAV_IPMI_API IpmiIfc {
public:
    /// @defgroup lifecycle Lifecycle
    /// A thread of the caller's runs start(), which returns only after
    /// stop(); other threads wait for IPMI_STATE_RUNNING with waitState() and
    /// then use the caches. One-shot tools use command-line mode instead
    /// (IpmiIfcInitForCLI). The state calls, doPoll() and the interval calls
    /// send nothing and never throw.
    /// @{

    /// Interface states; bit values, so that a wait can name several.
    enum IPMI_STATE {
        IPMI_STATE_INIT = 1,      ///< prepared, not started
        IPMI_STATE_STARTING = 2,  ///< start() is opening the device and asking for the controller's identity
        IPMI_STATE_RUNNING = 4,   ///< the caches are loaded and the polling loop runs
        IPMI_STATE_STOPPED = 8,   ///< the loop ended, start() failed, or the device could not be opened
        IPMI_STATE_CLI = 16       ///< prepared by IpmiIfcInitForCLI, no loop
    };

    /// The current IPMI_STATE.
    static int getState(int node);
    /// @overload
    static int getState();

    /// Waits until the state is one of the bits of `mask` and returns it.
    /// Blocks without limit: waitState(IPMI_STATE_RUNNING) in a process whose
    /// start() failed never returns, so wait for RUNNING | STOPPED.
    static int waitState(int node, int mask);
    /// @overload
    static int waitState(int mask);

    /// As waitState(): `sec` and `usec` only set how often the state is
    /// looked at again, not how long the call may take.
    static int timedWaitState(int node, int mask, long sec, long usec);
    /// @overload
    static int timedWaitState(int mask, long sec, long usec);

    /// Opens the device, loads the caches and runs the polling loop on the
    /// calling thread until stop(); returns after the loop has ended.
    ///
    /// Before the loop: Get Device ID, the host OS name and version, Get Self
    /// Test Results, the SDR repository read whole (sensors and entities
    /// built from it, each sensor asked for its reading and thresholds) and
    /// Get SEL Allocation Info. The state then becomes IPMI_STATE_RUNNING, and
    /// the SEL, the LAN settings and the FRU inventory are read before the
    /// first sleep: right after the running state, getFrus() may still be
    /// empty.
    /// The loop wakes every 16 × `interval` seconds (`interval` ≤ 0: only when
    /// doPoll() or pollAll() wakes it) and reads the SEL's entry count; new
    /// records go to the SEL event handlers. One pass in eight, or at once on
    /// new SEL entries, refreshes sensor readings and thresholds and the LAN
    /// settings, and now and then (on news, or every 30 such passes) the
    /// SDR repository and the FRU inventory.
    ///
    /// Clears the node record, SEL event handlers included. A device that
    /// cannot be opened is logged, and start() returns with state
    /// IPMI_STATE_STOPPED. Exceptions of the loop's work are logged, not
    /// passed on.
    /// @throws kelInt::CmpiStatus rc 2 for a user other than root, rc 100
    ///         when the wake-up pipe cannot be made; the state is then
    ///         IPMI_STATE_STOPPED.
    static void start(int node, int interval);
    /// @overload
    static void start(int interval);

    /// Ends the polling loop and closes the device; returns once start() has
    /// left its loop. Any thread but the loop's and a SEL event handler's.
    /// An exchange in flight ends at once. Blocks while start() has not
    /// been called. Frees the SDR, entity and handler lists; sensor, FRU and
    /// SEL objects the caller holds stay valid. The library cannot be
    /// started again in the same process.
    /// @throws kelInt::CmpiStatus rc 200 when called a second time.
    static void stop(int node);
    /// @overload
    static void stop();

    /// The polling loop itself; start() runs it, callers do not.
    static void poll(int node);

    /// Wakes the polling loop for an ordinary pass. Does not wait for the
    /// pass; a wake-up while the loop is busy is lost (the loop then sleeps
    /// its full period).
    static void doPoll(int node);
    /// @overload
    static void doPoll();

    /// Sets the loop's period in units of 16 seconds (≤ 0: wait for doPoll())
    /// and wakes it for a pass.
    static void setPollingInterval(int node, int interval);
    /// @overload
    static void setPollingInterval(int interval);

    /// The period in units of 16 seconds.
    static int getPollingInterval(int node);
    /// @overload
    static int getPollingInterval();

    /// Asks nodes 0 to `nodeCount` - 1 for one pass of `type` each and waits
    /// until each has made it, looking once a second (`serial`: node by
    /// node) or every two seconds (all at once); call it with `nodeCount` 1.
    /// Waits, a second at a time, for a loop that has not started yet, and
    /// returns early once `*shutdown` becomes true. Not from a SEL event
    /// handler: the loop cannot make a pass while one runs. The first call
    /// multiplies the SDR and FRU reload steps by `nodeCount`.
    static void pollAll(int nodeCount, bool serial, IPMI_POLL_TYPE type, bool* shutdown);
    /// @}

    /// @defgroup sensors Sensors
    /// The sensor list is built from the SDR repository when start() or
    /// IpmiIfcSdrGetInfo reads it, and rebuilt whole when the repository
    /// changes; the loop refreshes readings and thresholds in place.
    /// @{

    /// A copy of the node's sensor list, from the cache, in no set order
    /// (IpmiSensor::getSensorRecordNumber gives the repository's); empty
    /// before the SDR repository was read.
    static std::vector<std::shared_ptr<IpmiSensor>> getSensors(int node);
    /// @overload
    static std::vector<std::shared_ptr<IpmiSensor>> getSensors();

    /// Always an empty pointer, as callers have always received; find a
    /// sensor by its number in getSensors().
    static std::shared_ptr<IpmiSensor> getSensor(int node, unsigned owner, unsigned number);
    /// @overload
    static std::shared_ptr<IpmiSensor> getSensor(unsigned owner, unsigned number);

    /// The last Get SDR Repository Info answer, from the cache; all zero
    /// before one. Waits while the SDR lists are being rebuilt.
    static ipmiifc_sdr_info getSdr(int node);

    /// Turns the persistent SDR cache on in `dir`, or off with an empty
    /// string; this call wins over the environment variable
    /// TAV_IPMI_SDR_CACHE_DIR, and the cache is off without either. Sends
    /// nothing; any thread, best before start(). After every whole read of
    /// the repository the node's records are written to "sdr<node>.cache"
    /// in `dir` (the directory created for its owner alone, the file
    /// readable by its owner alone, written whole and renamed). An accepted
    /// Get SDR Repository Info answer whose record count and addition and
    /// erase stamps equal the file's, from a controller whose Get Device ID
    /// answer (device ID and revision, firmware and auxiliary firmware
    /// revision, manufacturer, product) and Get System GUID answer (where
    /// the file holds one) equal the file's, fills the record lists from the
    /// file without Reserve SDR Repository or Get SDR; Get Device ID is then
    /// asked once more. Any other file is ignored with one debug line and
    /// replaced after the read; a directory that cannot be written costs the
    /// cache, never the read.
    static void setSdrCacheDir(const std::string& dir);
    /// The cache directory in use, "" when the cache is off. Any thread.
    static std::string getSdrCacheDir();
    /// @}

    /// @defgroup entities Entities
    /// The entity list and the containment tree are rebuilt with the sensor
    /// list; both calls answer from the cache.
    /// @{

    /// A copy of the entities the SDR repository names, containers before
    /// what they contain.
    static std::vector<IpmiEntity> getEntities(int node);
    /// @overload
    static std::vector<IpmiEntity> getEntities();

    /// The entity that contains (`id`, `instance`), or an entity of ID 0 when
    /// none does.
    static IpmiEntity getEntityParent(int node, unsigned int id, unsigned int instance);
    /// @overload
    static IpmiEntity getEntityParent(unsigned int id, unsigned int instance);
    /// @}

    /// @defgroup fru FRU inventory
    /// Every FRU device that a FRU device locator record names on the local
    /// controller, read whole at start and after SDR changes (or every 30
    /// periodic passes), and by IpmiIfcFruInstantiateAll. The list is
    /// replaced whole; devices and areas never change once handed out.
    /// @{

    /// A copy of the FRU device list, from the cache, in repository order.
    static std::vector<std::shared_ptr<IpmiFru>> getFrus(int node);
    /// @overload
    static std::vector<std::shared_ptr<IpmiFru>> getFrus();

    /// One area of one FRU device, from the cache; null when the device or
    /// the area is absent, or the area failed to read or to pass its checksum.
    static std::shared_ptr<const IpmiFruOptional> getFruPart(int node, uint8_t deviceId, IpmiFru::AreaKind kind);
    /// @overload
    static std::shared_ptr<const IpmiFruOptional> getFruPart(uint8_t deviceId, IpmiFru::AreaKind kind);

    /// The last Get FRU Inventory Area Info answer of the node, from the cache.
    static ipmiifc_fru_area_info getFruDeviceHeader(int node);
    /// @}

    /// @defgroup sel System event log
    /// The loop reads the SEL's entry count on every pass; when the log grew
    /// it reads the new records (after an erase, the whole log) and hands
    /// each new event record once to every registered handler, oldest first.
    /// Records present when start() runs are loaded but not handed over. The
    /// getters answer from the cache.
    /// Ipmi::sync_device_eventlog reads the log without the loop.
    /// @{

    /// Results of clearSel().
    enum SEL_CLEAR_RESULT {
        SEL_CLEAR_OK = 0,             ///< the erase was accepted
        SEL_CLEAR_NOT_CONFIRMED = 2,  ///< busy five times, or an unexpected erasure status
        SEL_CLEAR_NO_ANSWER = 4,      ///< no answer
        SEL_CLEAR_REFUSED = 5         ///< another completion code (logged)
    };

    /// Adds a handler called on the polling loop's thread with each new SEL
    /// record, and with null once every periodic pass (see the @ref
    /// contract-threads "threads" rules for what a handler may call). Node
    /// 0's list serves every node; a handler already in the list is not added
    /// again (its context is not replaced). start() clears the list: register
    /// once waitState() reports IPMI_STATE_RUNNING. Returns 0, or 5 for a
    /// null handler.
    static int registerSelEventHandler(int node, IpmiSelEventHandler handler, void* context);
    /// @overload
    static int registerSelEventHandler(IpmiSelEventHandler handler, void* context);

    /// Removes a handler; returns once no other thread runs it, so its
    /// context may then be freed (a handler removing itself does not wait for
    /// itself). Handlers registered after it (they stand before it in the
    /// list) leave the list with it, as callers have always seen. Returns 0,
    /// 2 for a handler not in the list, 5 for null.
    static int unRegisterSelEventHandler(int node, IpmiSelEventHandler handler);
    /// @overload
    static int unRegisterSelEventHandler(IpmiSelEventHandler handler);

    /// Whether a sensor of the last discovery generates memory events.
    static bool generatesMemoryEvents(int node);
    /// Hands a restarted caller, once, the records it missed while it was not
    /// running. Sends nothing itself; call it before `start`. The first pass
    /// then delivers the records that follow `after` in the log (found by ID
    /// and digest; when that record is gone, cleared or overwritten, those
    /// stamped later than it) instead of none, and records wait for the first
    /// registered handler. A cursor with digest 0 changes nothing. Any thread.
    static void resumeSelDelivery(int node, const IpmiSelCursor& after);

    /// The summary built from the last Get SEL Info answer; null before one.
    static std::shared_ptr<IpmiSel> getSel(int node);
    /// @overload
    static std::shared_ptr<IpmiSel> getSel();

    /// A copy of the records read so far, oldest first.
    static std::vector<std::shared_ptr<IpmiSelData>> getSelData(int node);
    /// @overload
    static std::vector<std::shared_ptr<IpmiSelData>> getSelData();

    /// The last Get SEL Info answer as received; all zero before one.
    static ipmiifc_sel_info getRawSelHeader(int node);
    /// @overload
    static ipmiifc_sel_info getRawSelHeader();

    /// Erases the controller's SEL and reads its info again; one of
    /// SEL_CLEAR_RESULT. A Reserve SEL, then Clear SEL until it is accepted
    /// (a busy controller is asked again five seconds later, five times at
    /// most; a cancelled reservation is renewed), then Get SEL Info: three
    /// exchanges when all goes well.
    static int clearSel(int node);
    /// @overload
    static int clearSel();

    /// The record ID software last processed, as the controller keeps it for
    /// platform event filtering; one exchange; 0 when unknown or unanswered.
    static uint16_t getLastProcessedSELEntry(int node);
    /// @overload
    static uint16_t getLastProcessedSELEntry();

    /// Stores the record ID software last processed; one exchange; failures
    /// are logged at debug priority only.
    static void setLastProcessedSELEntry(int node, uint16_t id);
    /// @overload
    static void setLastProcessedSELEntry(uint16_t id);

    /// The controller's SEL clock in seconds, 0 when it cannot be read. One
    /// exchange on a descriptor of its own (an answer is waited for at most
    /// 20 seconds), so
    /// it works with or without the polling loop and never waits for it.
    static uint32_t GetSelClock();
    /// @copydoc GetSelClock()
    static uint32_t selGetClock(int node);
    /// @}

    /// @defgroup lan LAN
    /// The controller's LAN settings live in one process-wide Ipmi::IpmiLan
    /// per node, refreshed by the loop on every periodic pass.
    /// @{

    /// The node's LAN settings object; valid for the life of the process.
    /// Sends nothing.
    static IpmiLan* getLan(int node);
    /// @overload
    static IpmiLan* getLan();

    /// Reads the LAN settings and the controller's identity and host name
    /// for a process without the polling loop: opens the device, sends six
    /// to thirteen LAN exchanges and three identity exchanges, closes the
    /// device and returns getLan(0). Not while the loop runs. A standard
    /// exception on the way is logged and passed on.
    static IpmiLan* GetBMCNetworking();
    /// @}

    /// @defgroup identity Identity
    /// What start() (or GetBMCNetworking()) asked the controller once: its
    /// Get Device ID answer and the host OS name and version stored in it.
    /// These calls answer from the stored bytes, send nothing and never
    /// throw, except identifyChassis() and SetOSInfo().
    /// @{

    /// The controller's manufacturer name, "n/a" before an answer.
    static std::string GetBmcManufacturer();
    /// The firmware revision as "major.minor", the minor in hexadecimal
    /// ("2.10" for 0x02 0x10), as ipmitool prints it.
    static std::string GetBmcFWVersion();
    /// The IPMI version, "2.0" or "1.5".
    static std::string GetBmcIpmiVersion();
    /// The host OS name stored in the controller; empty when it has none.
    static std::string GetBmcReportedOSName();
    /// The host OS version stored in the controller; empty when it has none.
    static std::string GetBmcReportedOSVersion();

    /// Writes the host OS name and version into the controller's system
    /// information parameters: one Set System Info Parameters exchange per
    /// 14 to 16 bytes of each. A controller without the version parameter gets
    /// "name version" as the name. Opens the device and leaves it open: for
    /// a process without the polling loop. False when a write failed.
    static bool SetOSInfo(const std::string& osName, const std::string& osVersion);

    /// Copies the stored Get Device ID answer into `out`; 0, or 1 when the
    /// stored answer is not a success.
    static int getManagementControllerInfo(int node, ipmiifc_device_id& out);

    /// Writes the 3-byte manufacturer ID (least significant byte first) to
    /// `id` and sets `count` to 1 (one ID); 0, or 1 when there is no
    /// successful Get Device ID answer.
    static int getManufacturerId(int node, unsigned char* id, unsigned char& count);
    /// @overload
    static int getManufacturerId(unsigned char* id, unsigned char& count);

    /// The name of an IANA enterprise number, "Unknown" for numbers the
    /// library does not know. The string is static.
    static const char* getManufacturerName(unsigned int id);

    /// The 16-bit generator ID that SEL records carry for a controller at
    /// `address` on `channel` and `lun`.
    static int convertToGeneratorId(int address, int channel, int lun);

    /// Chassis Identify, one exchange: the identify light on for `interval`
    /// seconds (0 off), or on until switched off when bit 0 of `force` is
    /// set. 0, 1 when the controller does not support it, another
    /// completion code, or 255 without an answer.
    static int identifyChassis(int node, unsigned char interval, unsigned char force);
    /// @overload
    static int identifyChassis(unsigned char interval, unsigned char force);

    /// Set when the manufacturer's name contains "Hewlett": the entity tree
    /// then leaves out power supply bays without a power sensor.
    static bool hpe_bmc;
    /// @}

    /// @defgroup raw Raw commands
    /// Commands the library has no call for, through the same transport: one
    /// request at a time on the device, with the loop's and other threads'.
    /// @{

    /// Sends one command and copies the answer, completion code first, into
    /// `resp_buf`: one exchange. `*resp_len` is the buffer's size on entry
    /// and the bytes copied on return. Returns 0; 0x10 when the answer was
    /// longer than the buffer (which holds its start); the controller's
    /// completion code, with nothing copied and `*resp_len` unchanged; or
    /// 255 without an answer. Answers longer than 32 bytes are cut there.
    static uint8_t sendCmd(int node, uint8_t cmd, uint8_t netfn, uint16_t data_len, uint8_t* data,
                           uint16_t* resp_len, uint8_t* resp_buf);
    /// @overload
    static uint8_t sendCmd(uint8_t cmd, uint8_t netfn, uint16_t data_len, uint8_t* data,
                           uint16_t* resp_len, uint8_t* resp_buf);
    /// @}

    /// @defgroup monitoring Monitoring
    /// What the polling loop and the transport observe, for an exporter or a
    /// provider that must tell fresh data from stale. Observing sends
    /// nothing and never throws: every call reads values stored atomically,
    /// from any thread, while the loop runs. Node 0 serves every node. Times
    /// are Unix seconds of the time of day, 0 when never.
    /// @{

    /// The caches the loop refreshes.
    enum IPMI_CACHE {
        IPMI_CACHE_SENSORS = 0,  ///< sensor readings and thresholds
        IPMI_CACHE_SDR = 1,      ///< the SDR repository, with the sensors and entities built from it
        IPMI_CACHE_SEL = 2,      ///< SEL info and records
        IPMI_CACHE_FRU = 3,      ///< the FRU inventory
        IPMI_CACHE_LAN = 4,      ///< the LAN settings
        IPMI_CACHE_COUNT = 5     ///< the number of caches
    };
    /// How an exchange with the controller ended.
    enum IPMI_EXCHANGE_RESULT {
        IPMI_EXCHANGE_OK = 0,               ///< answered with completion code 0
        IPMI_EXCHANGE_COMPLETION_CODE = 1,  ///< answered with another completion code, 0xC3 excepted
        IPMI_EXCHANGE_TIMEOUT = 2,          ///< no answer in time, or the driver's time-out code 0xC3
        IPMI_EXCHANGE_ERROR = 3,            ///< the device failed (send, wait or receive) or is not open
        IPMI_EXCHANGE_RESULT_COUNT = 4      ///< the number of results
    };

    /// When the loop's last pass ended; the reads before its first sleep
    /// count as a pass.
    static double getLastPassTime(int node);
    /// @overload
    static double getLastPassTime();

    /// Whether the last pass reached the controller: at least one of its
    /// exchanges was answered (time-outs are not answers).
    static bool lastPassReachedController(int node);
    /// @overload
    static bool lastPassReachedController();

    /// When the last pass that reached the controller ended.
    static double getLastSuccessfulPassTime(int node);
    /// @overload
    static double getLastSuccessfulPassTime();

    /// How long the last pass took, in seconds (monotonic clock).
    static double getLastPassDuration(int node);
    /// @overload
    static double getLastPassDuration();

    /// When the loop last refreshed `cache`: the refresh succeeded, and none
    /// of its exchanges timed out or failed. 0 for an unknown cache.
    static double getCacheRefreshTime(int node, IPMI_CACHE cache);
    /// @overload
    static double getCacheRefreshTime(IPMI_CACHE cache);

    /// Exchanges with the controller since the process started, by result;
    /// every thread's count, the loop's and callers' own. 0 for an unknown result.
    static uint64_t getExchangeCount(int node, IPMI_EXCHANGE_RESULT result);
    /// @overload
    static uint64_t getExchangeCount(IPMI_EXCHANGE_RESULT result);
    /// @}
};

/// @defgroup cli Command-line mode
/// One-shot tools use the caches without the polling loop: open the device,
/// prepare the node, load what the tool needs, read it with the IpmiIfc
/// getters, and close. Calls of one tool run on one thread.
/// @{

/// Prepares node 0 for command-line use (state IPMI_STATE_CLI) and loads the
/// health rules; the device must already be open (IpmiIfcOpenIpmiOpen).
/// Sends nothing. 0, or a negative number when the wake-up pipe or the
/// driver's address setting failed.
TAV_IPMI_API int IpmiIfcInitForCLI(int node);
/// Frees the SDR and entity lists; the device stays open.
TAV_IPMI_API void IpmiIfcCloseForCLI(int node);
/// Opens /dev/ipmi0; the descriptor, or -1 with errno set (logged).
TAV_IPMI_API int IpmiIfcOpenIpmiOpen(int node);
/// Closes the device.
TAV_IPMI_API void IpmiIfcOpenIpmiClose(int node);
/// Asks for the SDR repository info and, when the repository changed (or was
/// never read), reads it whole and rebuilds sensors (asking each for its
/// reading and thresholds) and entities: two exchanges and more per record
/// and sensor. 0, or 0xFFFFFFFF when the controller did not answer. The
/// polling loop calls it by itself.
TAV_IPMI_API uint32_t IpmiIfcSdrGetInfo(int node);
/// Reads the SDR repository (or the SDR cache, see IpmiIfc::setSdrCacheDir)
/// into the node's record lists as IpmiIfcSdrGetInfo does, but builds neither
/// sensors nor entities: for tools that need only the records, such as FRU
/// discovery (IpmiIfcFruInstantiateAll) or sensor names
/// (IpmiIfcSensorDescribeAll). 0, or 0xFFFFFFFF when the controller did not answer.
TAV_IPMI_API uint32_t IpmiIfcSdrReadRecords(int node);
/// Builds the node's sensor list from its record lists as discovery does,
/// without asking the controller anything: the sensors have their records,
/// names, entities and types, but no reading and no thresholds. 0, or -1
/// for a node out of range.
TAV_IPMI_API int IpmiIfcSensorDescribeAll(int node);
/// Asks for the SEL info (one exchange) and follows a change: reads the new
/// records (one exchange each, plus a reservation) or reloads the log, and
/// hands new records to the handlers while the loop runs. `count`, when not
/// null, receives the entry count. 0, or 0xFFFFFFFF without a usable answer.
TAV_IPMI_API uint32_t IpmiIfcSelGetInfo(int node, uint16_t* count);
/// Reads every FRU device that the node's FRU device locator records name
/// (the SDR repository must have been read) and replaces the node's FRU list:
/// one Get FRU Inventory Area Info and a Read FRU Data per 8 to 23 bytes of
/// each device. 0, or -1 for a node out of range.
TAV_IPMI_API int IpmiIfcFruInstantiateAll(int node);
/// @}

}  // namespace Ipmi

#endif
