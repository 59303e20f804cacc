#ifndef TAV_IPMI_IPMIIFCINTERNAL_H
#define TAV_IPMI_IPMIIFCINTERNAL_H

// Interface code shared by the library's subsystems; not installed.

#include <stdint.h>

#include <memory>
#include <string>

#include "IpmiCommands.h"
#include "IpmiIfc.h"
#include "IpmiLog.h"
#include "IpmiNode.h"

namespace Ipmi {

class IpmiSensor;

// One request as callers build it, usually on their stack.
struct ipmiifc_req {
    uint64_t reserved0;
    uint32_t reserved1;
    uint32_t msgid;
    uint8_t netfn;
    uint8_t cmd;
    uint16_t data_len;
    uint32_t reserved2;
    uint8_t* data;
};

enum { IPMIIFC_RESP_MAX = 32 };

// One response; data[0] is the completion code. Freed with IpmiIfcRespDel.
struct ipmiifc_resp {
    uint32_t data_len;
    uint8_t data[IPMIIFC_RESP_MAX];
    int32_t node;
    uint8_t* req_addr;
    uint32_t req_addr_len;
    int64_t req_msgid;
    uint8_t* req_data;
    uint8_t cc;  // copy of data[0], or 255 when the exchange failed
};

enum { IPMIIFC_FLAG_ECHO_REQUEST = 1 };

// Node state (lifecycle guarded transitions).
void _setState(int node, IpmiIfc::IPMI_STATE s);
int _getState(int node);
void _changeState(int node, IpmiIfc::IPMI_STATE from, IpmiIfc::IPMI_STATE to);

// Driver transport.
void ReopenPort(int node);
void IpmiIfcSetTimingParms(int node);
int IpmiIfcOpenIpmiEventEnable(int node, int* flag);
int IpmiIfcOpenIpmiAddressSet(int node);
int IpmiIfcRespNew(ipmiifc_resp** out);
int IpmiIfcRespReuse(ipmiifc_resp* r);
int IpmiIfcRespDel(ipmiifc_resp** r);
ipmiifc_resp* IpmiIfcSendWresponse(int node, ipmiifc_req* req, int flags, ipmiifc_resp* reuse);
ipmiifc_resp* IpmiIfcSend(int node, ipmiifc_req* req, int flags);
// Takes the node's next message id. Ids need not be unique, but requests are
// stamped from several threads, so the counter moves atomically.
inline uint32_t IpmiIfcNextMsgId(int node) {
    return __atomic_fetch_add(&g_IpmiNode[node].msgCounter, 1u, __ATOMIC_RELAXED);
}
// Sends a Sensor/Event command carrying the sensor number alone to the
// sensor's owner (IPMB address, channel, LUN) instead of node 0's current
// target. The switch and the request happen under the senders' lock, so no
// other request leaves for that owner; only the address is put back.
ipmiifc_resp* IpmiIfcSendToOwner(int node, uint8_t command, uint8_t sensorNumber, uint8_t owner, uint8_t channel,
                                 uint8_t lun);
// The raw command's answer rules (IpmiIfc::sendCmd): copies at most *resp_len
// bytes of a successful answer and returns its code, 0x10 for a short buffer,
// or 255 without an answer.
uint8_t IpmiIfcCopyAnswer(const ipmiifc_resp* resp, uint16_t* resp_len, uint8_t* resp_buf);
ipmiifc_resp* IpmiIfcSendCmd(int node, uint8_t cmd, uint8_t netfn, long ignored, uint16_t data_len,
                             uint8_t* data, int flags);

// Frees a transport response when it goes out of scope.
class RespHolder {
public:
    explicit RespHolder(ipmiifc_resp* r = nullptr) : resp_(r) {}
    ~RespHolder() {
        if (resp_) IpmiIfcRespDel(&resp_);
    }
    RespHolder(const RespHolder&) = delete;
    RespHolder& operator=(const RespHolder&) = delete;
    ipmiifc_resp* get() const { return resp_; }
    ipmiifc_resp* operator->() const { return resp_; }
    explicit operator bool() const { return resp_ != nullptr; }
    ipmiifc_resp* release() {
        ipmiifc_resp* r = resp_;
        resp_ = nullptr;
        return r;
    }
    void reset(ipmiifc_resp* r) {
        if (resp_) IpmiIfcRespDel(&resp_);
        resp_ = r;
    }

private:
    ipmiifc_resp* resp_;
};

// Controller identity (one-shot commands and their handlers).
int IpmiIfcDataGet(int count);
int IpmiIfcRhGetDeviceId(ipmiifc_resp* r);
int IpmiIfcRhGetSelfTest(ipmiifc_resp* r);
int IpmiIfcRhGetOS_Name(ipmiifc_resp* r);
int IpmiIfcRhGetOS_Version(ipmiifc_resp* r);
bool set_bmc_prop(const char* value, unsigned int length, unsigned char parameter, unsigned char* ccOut);

// Guards the one-time fill of the manufacturer-name table and pollAll's
// one-time scaling of the skip steps.
extern pthread_mutex_t manNameInitMut;

// Scope guard for a plain, statically initialised pthread mutex.
class PlainMutexLock {
public:
    explicit PlainMutexLock(pthread_mutex_t& m) : mutex_(m) { pthread_mutex_lock(&mutex_); }
    ~PlainMutexLock() { pthread_mutex_unlock(&mutex_); }
    PlainMutexLock(const PlainMutexLock&) = delete;
    PlainMutexLock& operator=(const PlainMutexLock&) = delete;

private:
    pthread_mutex_t& mutex_;
};

// Polling rhythm tunables.
extern int SKIP_SDR_STEP;
extern int SKIP_FRU_STEP;

// What the polling loop keeps from pass to pass.
struct IpmiLoopState {
    uint16_t entryCount = 0;
    uint16_t lastEntryCount = 0;
    int sdrCycle = 2;
    bool fullRefresh = false;
};

// One pass of the polling loop after a wake-up, with pollMutex held and
// pollCount already advanced. False: the node is stopping.
bool IpmiIfcPollPass(int node, IpmiLoopState& s);

// SDR repository. sdr_mutex serialises the refresh chain of every node.
extern TAV::Mutex sdr_mutex;
uint32_t IpmiIfcRhGetSdrInfo(ipmiifc_resp* resp);
uint32_t IpmiIfcSdrReserve(int node);
uint32_t IpmiIfcSdrGetHeaders(int node);
uint32_t IpmiIfcSdrReadRecordId(int node, uint16_t record_id, uint8_t* buffer, uint8_t length);
uint32_t IpmiIfcSdrListAdd(int node, ipmiifc_sdr_list* element);
uint32_t IpmiIfcSdrReadAll(int node);
uint32_t IpmiIfcSdrGetAll(int node);
void IpmiIfcSdrCleanUpHeaders(int node);
void IpmiIfcSdrCleanUpAll(int node);

// Sensors.
struct ipmiifc_sensor_reading_list {
    ipmiifc_sensor_reading_list* next;
    ipmiifc_sdr_list* sdr;
    uint8_t reading[5];
};
int IpmiIfcSensorInstantiateAll(int node);
int IpmiIfcSensorGetThresholds(int node, ipmiifc_sdr_list* sdr, std::shared_ptr<IpmiSensor> sensor);
int IpmiIfcSensorGetReading(int node, ipmiifc_sensor_reading_list* r);
int IpmiIfcSensorUpdateReading(int node);

// Entities.
uint32_t IpmiIfcEntityListCreate(int node);
uint32_t IpmiIfcEntityInstantiateAll(int node);
void IpmiIfcEntityCleanUpAll(int node);

// SEL.
uint32_t IpmiIfcSelGetInfo(int node, uint16_t* count);
uint32_t IpmiIfcRhSelInfo(ipmiifc_resp* resp, uint16_t* count);
int IpmiIfcRhSelInfoNoCount(ipmiifc_resp* resp);
int IpmiIfcRhSelGetAllocInfo(ipmiifc_resp* resp);
void IpmiIfcSelCleanUpEventHandlers(int node);
// Drops every SEL record held (the next Get SEL Info answer reads the log again
// only if its stamps changed).
void IpmiIfcSelDropRecords(int node);

// FRU inventory.
extern int fru_max_req_size;
int IpmiIfcFruInstantiateAll(int node);
int IpmiIfcRhFruInv(ipmiifc_resp* resp, uint8_t deviceId);
unsigned int IpmiIfcReadFru(int node, unsigned char deviceId, unsigned char wordAccess, int offset,
                            unsigned int* length, unsigned char* buffer);
unsigned int IpmiIfruInfoAreaLength(int node, unsigned char deviceId, unsigned char wordAccess, unsigned int offset);
bool IpmiIfcFruChecksum(unsigned char* data, unsigned char* sum, unsigned int length);
unsigned int IpmiIfcFruMultiLength(int node, unsigned char deviceId, unsigned int offset);

}  // namespace Ipmi

#endif
