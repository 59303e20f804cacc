// Direct SEL synchroniser: reads the controller's event log into a flat
// array for clients that do not use the polling loop, with a transaction
// layer of its own on a descriptor of its own (the node's device stays with
// the polling loop). Process-wide counter, greeting flag and reservation are
// kept without locks: calls must not overlap.

#include <errno.h>
#include <fcntl.h>
#include <linux/ipmi.h>
#include <poll.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include "IpmiIfcInternal.h"
#include "IpmiIfcSel.h"
#include "IpmiSel.h"
#include "SelLayout.h"

namespace Ipmi {

namespace {

constexpr int kReplyWaitMs = 20000;
constexpr int kWrongIdLimit = 10;
constexpr int kExtraRecords = 10;
constexpr int kCallRecords = 4096;
constexpr int kCallFailures = 16;
constexpr size_t kAnswerMax = IPMI_MAX_MSG_LENGTH;
constexpr size_t kEntryAnswerSize = sel::entryAnswer::data + sel::recordSize;  // 19
constexpr size_t kDeviceIdAnswerMin = 6;

uint32_t msg_id = 1;
bool mc_init = false;
uint16_t mc_reservation = 0;

bool send_cmd(int fd, uint8_t netfn, uint8_t cmd, const uint8_t* data, size_t len, long id) {
    struct ipmi_system_interface_addr si;
    memset(&si, 0, sizeof si);
    si.addr_type = IPMI_SYSTEM_INTERFACE_ADDR_TYPE;
    si.channel = IPMI_BMC_CHANNEL;
    si.lun = 0;
    uint8_t body[IPMI_MAX_MSG_LENGTH];
    const size_t bodyLen = len < sizeof body ? len : sizeof body;
    if (bodyLen) memcpy(body, data, bodyLen);
    struct ipmi_req req;
    memset(&req, 0, sizeof req);
    req.addr = reinterpret_cast<unsigned char*>(&si);
    req.addr_len = sizeof si;
    req.msgid = id;
    req.msg.netfn = netfn;
    req.msg.cmd = cmd;
    req.msg.data = body;
    req.msg.data_len = static_cast<unsigned short>(bodyLen);
    int rc;
    do {
        rc = ioctl(fd, IPMICTL_SEND_COMMAND, &req);
    } while (rc < 0 && errno == EINTR);
    if (rc < 0) {
        const int err = errno;
        ipmiLog(LOG_ERR, "%s: ioctl(%d, IPMICTL_SEND_COMMAND(%x)) failed %d %s", "send_cmd", fd,
                static_cast<unsigned>(IPMICTL_SEND_COMMAND), err, strerror(err));
        return false;
    }
    return true;
}

int64_t nowMs() {
    struct timespec t;
    clock_gettime(CLOCK_MONOTONIC, &t);
    return static_cast<int64_t>(t.tv_sec) * 1000 + t.tv_nsec / 1000000;
}

// Waits for the next response message; other message types are skipped and
// start a fresh wait. A device that reports an error has no answer to give:
// polling it again would only spin.
bool recv_reply(int fd, long* id, uint8_t* answer, size_t* answerLen) {
    int64_t deadline = nowMs() + kReplyWaitMs;
    for (;;) {
        struct pollfd p = {fd, POLLIN, 0};
        const int64_t left = deadline - nowMs();
        const int ready = left > 0 ? ::poll(&p, 1, static_cast<int>(left)) : 0;
        if (ready < 0) {
            if (errno == EINTR) continue;
            const int err = errno;
            ipmiLog(LOG_ERR, "%s: poll(%d), failed %d %s", "recv_reply", fd, err, strerror(err));
            return false;
        }
        if (ready == 0) {
            ipmiLog(LOG_ERR, "%s: bmc timeout after %d millisconds", "recv_reply", kReplyWaitMs);
            return false;
        }
        if (!(p.revents & POLLIN)) {
            if (p.revents & (POLLERR | POLLHUP | POLLNVAL)) {
                ipmiLog(LOG_ERR, "%s: poll(%d) reports a device error (revents 0x%x)", "recv_reply", fd,
                        static_cast<unsigned>(p.revents));
                return false;
            }
            continue;
        }
        struct ipmi_system_interface_addr addr;
        struct ipmi_recv recv;
        memset(&recv, 0, sizeof recv);
        recv.addr = reinterpret_cast<unsigned char*>(&addr);
        recv.addr_len = sizeof addr;
        recv.msg.data = answer;
        recv.msg.data_len = static_cast<unsigned short>(*answerLen);
        int rc;
        do {
            rc = ioctl(fd, IPMICTL_RECEIVE_MSG_TRUNC, &recv);
        } while (rc < 0 && errno == EINTR);
        if (rc < 0 && errno == EMSGSIZE) {
            ipmiLog(LOG_DEBUG, "%s: ioctl(%d, IPMICTL_RECEIVE_MSG_TRUNC) rc = truncated message", "recv_reply", fd);
        } else if (rc < 0) {
            const int err = errno;
            ipmiLog(LOG_ERR, "%s: ioctl(%d, IPMICTL_RECEIVE_MSG_TRUNC) failed %d %s", "recv_reply", fd, err,
                    strerror(err));
            return false;
        }
        if (recv.recv_type != IPMI_RESPONSE_RECV_TYPE) {
            ipmiLog(LOG_DEBUG, "%s:skipping msg type %d", "recv_reply", recv.recv_type);
            deadline = nowMs() + kReplyWaitMs;
            continue;
        }
        *id = recv.msgid;
        *answerLen = recv.msg.data_len <= *answerLen ? recv.msg.data_len : *answerLen;
        return true;
    }
}

// One request and its answer, matched by message ID; other answers are dropped.
bool run_transaction(int fd, uint8_t netfn, uint8_t cmd, const uint8_t* data, size_t len, uint8_t* answer,
                     size_t* answerLen) {
    const long id = static_cast<long>(msg_id++);
    if (!send_cmd(fd, netfn, cmd, data, len, id)) {
        ipmiLog(LOG_ERR, "%s: failed to communicate with bmc", "run_transaction");
        return false;
    }
    const size_t room = *answerLen;
    for (int i = 0; i < kWrongIdLimit; ++i) {
        long got = 0;
        *answerLen = room;
        if (!recv_reply(fd, &got, answer, answerLen)) {
            ipmiLog(LOG_ERR, "%s: no reply, failed to communicate with bmc", "run_transaction");
            return false;
        }
        if (got == id) return true;
        ipmiLog(LOG_DEBUG, "%s: ignoring msg id: %ld", "run_transaction", got);
    }
    return false;
}

bool hello_mc(int fd) {
    ipmiLog(LOG_DEBUG, "%s: starting communication with bmc over ipmi driver", "hello_mc");
    uint8_t a[kAnswerMax];
    size_t len = sizeof a;
    if (!run_transaction(fd, netfn::app, cmd::getDeviceId, nullptr, 0, a, &len)) return false;
    if (len == 0 || a[0] != 0 || len < kDeviceIdAnswerMin) {
        ipmiLog(LOG_DEBUG, "%s: ipmi returned invalid data block: data_len: %d ccode %u", "hello_mc",
                static_cast<int>(len), len ? a[0] : 0u);
        return true;
    }
    ipmiLog(LOG_INFO, "%s: established communication with bmc {device_revision %d, fw_rev1 %d, fw_rev2 %d, ipmi %d}",
            "hello_mc", a[2], a[3], a[4], a[5]);
    return true;
}

// Greets the controller once per process; a failed greeting is not repeated.
bool greetOnce(int fd) {
    if (mc_init) return true;
    mc_init = true;
    return hello_mc(fd);
}

void logSelInfo(const char* caller, const uint8_t* a) {
    ipmiLog(LOG_DEBUG,
            "%s: GET_SEL_REPO_INFO returned {version: 0x%x, count %u, free %u,add_stamp %u, erase_stamp %u "
            "op_support %u}",
            caller, a[sel::info::version], sel::le16(a + sel::info::entries), sel::le16(a + sel::info::freeSpace),
            sel::le32(a + sel::info::additionTimestamp), sel::le32(a + sel::info::eraseTimestamp),
            a[sel::info::operationSupport]);
}

bool readSelInfo(int fd, const char* caller, uint8_t* a, size_t* len) {
    if (!run_transaction(fd, netfn::storage, cmd::getSelInfo, nullptr, 0, a, len)) return false;
    if (*len == 0 || a[0] != 0 || *len < sel::info::size) {
        ipmiLog(LOG_ERR, "%s: ipmi returned invalid data block: data_len: %d ccode %u", caller,
                static_cast<int>(*len), *len ? a[0] : 0u);
        return false;
    }
    logSelInfo(caller, a);
    return true;
}

bool count_events(int fd, int* newCount, sel_state* state) {
    uint8_t a[kAnswerMax];
    size_t len = sizeof a;
    if (!readSelInfo(fd, "count_events", a, &len)) return false;
    const uint16_t count = sel::le16(a + sel::info::entries);
    const uint16_t freeBytes = sel::le16(a + sel::info::freeSpace);
    const uint32_t addStamp = sel::le32(a + sel::info::additionTimestamp);
    const uint32_t eraseStamp = sel::le32(a + sel::info::eraseTimestamp);
    const uint8_t version = a[sel::info::version];
    if (count == 0) ipmiLog(LOG_DEBUG, "%s: sel is empty", "count_events");
    if (version != sel::supportedVersion) {
        ipmiLog(LOG_WARNING, "%s: unknown sel version 0x%x", "count_events", version);
        return true;
    }
    state->polls++;
    if (state->version != sel::supportedVersion && state->version != 0)
        ipmiLog(LOG_INFO, "Detected a firmware version change in IPMI SEL, reloading");
    state->version = sel::supportedVersion;
    state->opSupport = a[sel::info::operationSupport] & 0x7F;
    state->overflow = a[sel::info::operationSupport] & sel::overflowFlag;
    if (freeBytes != 0 || addStamp == state->addStamp) {
        if (state->count > count || eraseStamp != state->eraseStamp) {
            *newCount = count;
            state->lastRecordId = 0;
        } else {
            *newCount = static_cast<int>(count) - static_cast<int>(state->count);
        }
    } else {
        ipmiLog(LOG_INFO, "%s: Full SEL, add timestamp changed, full load req'd", "count_events");
        *newCount = count;
        state->lastRecordId = 0;
    }
    state->count = count;
    state->freeBytes = freeBytes;
    state->addStamp = addStamp;
    state->eraseStamp = eraseStamp;
    return true;
}

bool get_sel_reservation(int fd) {
    uint8_t a[kAnswerMax];
    size_t len = sizeof a;
    if (!run_transaction(fd, netfn::storage, cmd::reserveSel, nullptr, 0, a, &len)) {
        ipmiLog(LOG_ERR, "%s: IPMI_NETFN_STORAGE/GET_SEL_RESERVE_REPO failed", "get_sel_reservation");
        return false;
    }
    if (len > 0 && a[0] == cc::eraseInProgress) {
        ipmiLog(LOG_DEBUG, "%s: clear sel in progress, no reservation granted", "get_sel_reservation");
        return false;
    }
    if (len <= 2 || a[0] != 0) return false;
    mc_reservation = sel::le16(a + sel::reserveAnswer::reservation);
    ipmiLog(LOG_DEBUG, "%s: reservation 0x%x retrieved", "get_sel_reservation", mc_reservation);
    ipmiLog(LOG_DEBUG, "%s: got reservation %u", "get_sel_reservation", mc_reservation);
    return true;
}

// Record IDs are taken as consecutive from the last one seen; at most n + 1
// requests, so IDs with gaps end the load early rather than never. A call
// also stops after kCallRecords records or kCallFailures answers without a
// record: what a controller claims beyond that waits for the next call.
bool load_events(int fd, Event_log* out, int* n, uint16_t* lastRecordId) {
    if (*n < 0) {
        *n = 0;
        *lastRecordId = 0;
        return true;
    }
    uint16_t id = static_cast<uint16_t>(*lastRecordId + 1);
    ipmiLog(LOG_DEBUG, "%s: polling from record id %d", "load_events", id + 1);
    const int capacity = *n;
    int loaded = 0;
    uint16_t last = *lastRecordId;
    int failures = 0;
    for (int request = 0; request <= capacity && loaded < kCallRecords && failures < kCallFailures; ++request) {
        uint8_t req[sel::entryRequest::size];
        sel::putLe16(req + sel::entryRequest::reservation, mc_reservation);
        sel::putLe16(req + sel::entryRequest::recordId, id);
        req[sel::entryRequest::offset] = 0;
        req[sel::entryRequest::count] = sel::wholeRecord;
        uint8_t a[kAnswerMax];
        size_t len = sizeof a;
        if (!run_transaction(fd, netfn::storage, cmd::getSelEntry, req, sizeof req, a, &len)) return false;
        if (len >= kEntryAnswerSize) {  // an 18-byte answer lacks the record's last byte
            const uint16_t next = sel::le16(a + sel::entryAnswer::nextRecordId);
            if (a[0] != 0) {
                ++failures;
                ipmiLog(LOG_ERR, "%s: GET_SEL(size %d), failed ccode = 0x%x,", "load_events", 255, a[0]);
            } else if (loaded < capacity + kExtraRecords) {
                memcpy(&out[loaded++], a + sel::entryAnswer::data, sel::recordSize);
                last = sel::le16(a + sel::entryAnswer::data);
            }
            if (next == sel::lastRecord) break;
            id = next;
        } else if (len == 1 && a[0] == cc::reservationCancelled) {
            ipmiLog(LOG_INFO, "%s: lost reservation %u", "load_events", mc_reservation);
            return false;
        } else {
            ++failures;
        }
    }
    *n = loaded;
    *lastRecordId = last;
    return true;
}

}  // namespace

int IpmiSelDirectOpen() {
    char path[32];
    snprintf(path, sizeof path, "/dev/ipmi%d", 0);
    const int fd = open(path, O_RDWR | O_CLOEXEC);
    if (fd < 0) ipmiLog(LOG_ERR, "%s: open(%s, RDWR) failed %d %m", "IpmiIfcOpenIpmiOpen", path, errno);
    return fd;
}

void IpmiSelDirectClose(int fd) {
    if (fd >= 0) close(fd);
}

bool IpmiSelDirectTransaction(int fd, uint8_t netfn, uint8_t cmd, const uint8_t* data, size_t dataLen,
                              uint8_t* answer, size_t* answerLen) {
    return run_transaction(fd, netfn, cmd, data, dataLen, answer, answerLen);
}

bool sync_device_eventlog(Event_log** records, int* n, sel_state* state) {
    const time_t started = time(nullptr);
    *records = nullptr;
    *n = 0;
    const int fd = IpmiSelDirectOpen();
    if (fd < 0) return false;
    bool ok = false;
    Event_log* out = nullptr;
    int loaded = 0;
    const sel_state saved = *state;
    int newCount = 0;
    if (!greetOnce(fd) || !count_events(fd, &newCount, state)) {
        ipmiLog(LOG_ERR, "%s: communicate with bmc failed, no hardware sel data", "sync_device_eventlog");
        *state = saved;
    } else if (newCount <= 0) {
        ok = true;
    } else if (state->addStamp == saved.addStamp) {
        ipmiLog(LOG_DEBUG, "%s: no changes since last poll ts=%u", "fetch_main_sel", state->addStamp);
        ok = true;
    } else {
        out = static_cast<Event_log*>(calloc(static_cast<size_t>(newCount) + kExtraRecords, sizeof(Event_log)));
        if (out == nullptr) {
            ipmiLog(LOG_ERR, "%s: out of memory", "fetch_main_sel");
        } else {
            loaded = newCount;
            uint16_t last = state->lastRecordId;
            // Reading on with an old reservation would only be refused.
            if (!get_sel_reservation(fd)) {
                loaded = 0;
            } else if (load_events(fd, out, &loaded, &last)) {
                const bool fromStart = state->lastRecordId == 0;
                state->lastRecordId = last;
                ok = true;
                // Cut short: the next call asks for the rest, as if only the
                // records read had been there (a full log reloads anyway).
                if (loaded >= kCallRecords && state->freeBytes != 0) {
                    state->addStamp = saved.addStamp;
                    state->count = static_cast<uint16_t>((fromStart ? 0 : saved.count) + loaded);
                }
            } else {
                ipmiLog(LOG_ERR, "%s: retrieve %d out of %d SEL events failed, try %d of %d", "fetch_main_sel",
                        newCount, state->count, 1, 1);
                sleep(1);
                ipmiLog(LOG_ERR, "%s: load sel failed, giving up", "fetch_main_sel");
            }
        }
        if (!ok) {
            free(out);
            out = nullptr;
            loaded = 0;
            *state = saved;
            ipmiLog(LOG_ERR, "%s: communicate with bmc failed, no hardware sel data", "sync_device_eventlog");
        }
    }
    if (ok && loaded > 0) {
        *records = out;
        *n = loaded;
    } else {
        free(out);
    }
    IpmiSelDirectClose(fd);
    ipmiLog(LOG_INFO, "IPMI SEL sync took %lu seconds %d sel records, last %d",
            static_cast<unsigned long>(time(nullptr) - started), *n, state->lastRecordId);
    return ok;
}

std::shared_ptr<IpmiSel> GetSelInfo() {
    const int fd = IpmiSelDirectOpen();
    if (fd < 0) return nullptr;
    std::shared_ptr<IpmiSel> result;
    uint8_t a[kAnswerMax];
    size_t len = sizeof a;
    if (greetOnce(fd) && run_transaction(fd, netfn::storage, cmd::getSelInfo, nullptr, 0, a, &len) && len > 0) {
        {
            TAV::MutexLock guard(g_IpmiNode[0].selMutex);
            g_IpmiNode[0].work.sel.header[0] = a[0];
        }
        if (a[0] == 0 && len >= sel::info::size) {
            logSelInfo("GetSelInfo", a);
            ipmiifc_sel_info info;
            memcpy(&info, a, sizeof info);
            result = std::make_shared<IpmiSel>(&info, nullptr, 0);
        }
    }
    IpmiSelDirectClose(fd);
    return result;
}

void SetLogLevel(LogLvl) { setlogmask(0xFF); }

}  // namespace Ipmi
