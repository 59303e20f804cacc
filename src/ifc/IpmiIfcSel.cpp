// SEL access, first cut: the SEL info and allocation answers that the start-up
// and the polling loop ask for, and the list of SEL event handlers. Reading
// records and handing them to the handlers comes later, in selFollowChange.

#include <string.h>

#include <vector>

#include "IpmiIfcInternal.h"

namespace Ipmi {

namespace {

constexpr uint32_t kSelFailed = 0xFFFFFFFF;

// Results of registering and unregistering a handler.
constexpr int kHandlerOk = 0;
constexpr int kHandlerNotRegistered = 2;
constexpr int kHandlerMissing = 5;

// Get SEL Info answer, completion code first.
namespace selInfoByte {
constexpr size_t entriesLow = 2;  // entry count, least significant byte
constexpr size_t additionTimestamp = 6;
constexpr size_t eraseTimestamp = 10;
constexpr size_t size = 15;
}  // namespace selInfoByte

IpmiNode& slot(int node) { return g_IpmiNode[(node >= 0 && node < IPMI_NODE_COUNT) ? node : 0]; }

uint32_t le32(const uint8_t* b) {
    return static_cast<uint32_t>(b[0]) | (static_cast<uint32_t>(b[1]) << 8) | (static_cast<uint32_t>(b[2]) << 16) |
           (static_cast<uint32_t>(b[3]) << 24);
}

// Entries that unregistering cut out of the list together with the one asked
// for (see unRegisterSelEventHandler). They stay allocated until the list's
// clean-up, so that a walk of the list that reached one can still go on.
// Never destroyed: the clean-up may run during process exit.
std::vector<ipmiifc_sel_handler*>& droppedHandlers() {
    static auto* dropped = new std::vector<ipmiifc_sel_handler*>();
    return *dropped;
}

// Where new SEL records will be read and delivered to the handlers: called
// with the stored stamps before and after each accepted Get SEL Info answer.
// This first cut only keeps the header; nothing is read or delivered yet.
void selFollowChange(int node, uint32_t oldAddition, uint32_t oldErase, uint32_t newAddition, uint32_t newErase) {
    (void)node;
    (void)oldAddition;
    (void)oldErase;
    (void)newAddition;
    (void)newErase;
}

}  // namespace

uint32_t IpmiIfcSelGetInfo(int node, uint16_t* count) {
    RespHolder r(IpmiIfcSendCmd(node, cmd::getSelInfo, netfn::storage, 0, 0, nullptr, 0));
    if (!r) return kSelFailed;
    if (r->cc != 0) {
        // Busy, not present and erase in progress are normal while the controller starts.
        if (r->cc != cc::nodeBusy && r->cc != cc::requestedSensorNotPresent && r->cc != cc::eraseInProgress)
            ipmiLog(LOG_WARNING, "%s: IPMI_CMD_GET_SEL_INFO cc=0x%x", "IpmiIfcSelGetInfo", r->cc);
        return kSelFailed;
    }
    return IpmiIfcRhSelInfo(r.get(), count);
}

// `count` gets only the low byte of the entry count: a log of 300 entries
// reports 44. Callers compare counts from pass to pass and rely on this.
uint32_t IpmiIfcRhSelInfo(ipmiifc_resp* resp, uint16_t* count) {
    if (resp == nullptr || resp->cc != 0 || resp->data_len < selInfoByte::size) return kSelFailed;
    if (count) *count = resp->data[selInfoByte::entriesLow];
    IpmiNode& n = slot(resp->node);
    uint32_t oldAddition, oldErase;
    {
        TAV::MutexLock guard(n.selMutex);
        oldAddition = le32(n.work.sel.header + selInfoByte::additionTimestamp);
        oldErase = le32(n.work.sel.header + selInfoByte::eraseTimestamp);
        memcpy(n.work.sel.header, resp->data, selInfoByte::size);
    }
    selFollowChange(resp->node, oldAddition, oldErase, le32(resp->data + selInfoByte::additionTimestamp),
                    le32(resp->data + selInfoByte::eraseTimestamp));
    return 0;
}

int IpmiIfcRhSelInfoNoCount(ipmiifc_resp* resp) { return static_cast<int>(IpmiIfcRhSelInfo(resp, nullptr)); }

int IpmiIfcRhSelGetAllocInfo(ipmiifc_resp* resp) {
    if (resp == nullptr) return -1;
    if (resp->cc != 0) {
        ipmiLog(LOG_DEBUG, "%s: BMC returned cc=0x%x", "IpmiIfcRhSelGetAllocInfo", resp->cc);
        return -1;
    }
    IpmiNode& n = slot(resp->node);
    TAV::MutexLock guard(n.selMutex);
    uint8_t* store = n.work.sel.alloc_info;
    const size_t size = sizeof n.work.sel.alloc_info;
    memset(store, 0, size);
    memcpy(store, resp->data, resp->data_len < size ? resp->data_len : size);
    return 0;
}

// Registration always uses node 0's list, whatever node is named.
int IpmiIfc::registerSelEventHandler(int, IpmiSelEventHandler handler, void* context) {
    if (handler == nullptr) return kHandlerMissing;
    IpmiNode& n = g_IpmiNode[0];
    TAV::MutexLock guard(n.selMutex);
    for (ipmiifc_sel_handler* e = n.work.sel_handlers; e; e = e->next)
        if (e->handler == handler) return kHandlerOk;  // contexts are not compared
    n.work.sel_handlers = new ipmiifc_sel_handler{n.work.sel_handlers, handler, context};
    return kHandlerOk;
}

int IpmiIfc::registerSelEventHandler(IpmiSelEventHandler handler, void* context) {
    return registerSelEventHandler(0, handler, context);
}

// A match behind the head is unlinked by pointing the HEAD past it, so any
// entries between the head and the match leave the list too. Kept on purpose.
int IpmiIfc::unRegisterSelEventHandler(int, IpmiSelEventHandler handler) {
    if (handler == nullptr) return kHandlerMissing;
    IpmiNode& n = g_IpmiNode[0];
    TAV::MutexLock guard(n.selMutex);
    ipmiifc_sel_handler* head = n.work.sel_handlers;
    if (head == nullptr) return kHandlerNotRegistered;
    if (head->handler == handler) {
        n.work.sel_handlers = head->next;
        delete head;
        return kHandlerOk;
    }
    for (ipmiifc_sel_handler* e = head->next; e; e = e->next) {
        if (e->handler != handler) continue;
        for (ipmiifc_sel_handler* cut = head->next; cut != e; cut = cut->next) droppedHandlers().push_back(cut);
        head->next = e->next;
        delete e;
        return kHandlerOk;
    }
    return kHandlerNotRegistered;
}

int IpmiIfc::unRegisterSelEventHandler(IpmiSelEventHandler handler) { return unRegisterSelEventHandler(0, handler); }

void IpmiIfcSelCleanUpEventHandlers(int node) {
    IpmiNode& n = slot(node);
    TAV::MutexLock guard(n.selMutex);
    while (ipmiifc_sel_handler* e = n.work.sel_handlers) {
        n.work.sel_handlers = e->next;
        delete e;
    }
    if (&n == &g_IpmiNode[0]) {
        for (ipmiifc_sel_handler* e : droppedHandlers()) delete e;
        droppedHandlers().clear();
    }
}

bool IpmiIfc::generatesMemoryEvents(int node) {
    return __atomic_load_n(&slot(node).work.memory_events, __ATOMIC_ACQUIRE) != 0;
}

}  // namespace Ipmi
