// SEL event handlers: the list callers register into (node 0's serves every
// node), and the walks that call them with the list's mutex released, so a
// handler may call back into the library, unregister itself or others.

#include <cxxabi.h>
#include <pthread.h>

#include <vector>

#include "IpmiIfcInternal.h"
#include "IpmiIfcSel.h"

namespace Ipmi {

namespace {

// Results of registering and unregistering a handler.
constexpr int kHandlerOk = 0;
constexpr int kHandlerNotRegistered = 2;
constexpr int kHandlerMissing = 5;

// Handler walks of node 0's list. Entries unlinked while a walk runs get a
// null function at once, so no walk calls them after unRegister returns, and
// are freed only when no walk runs, so a walk standing on one goes on safely.
struct HandlerWalks {
    int walks = 0;
    std::vector<ipmiifc_sel_handler*> retired;
    struct Call {
        const ipmiifc_sel_handler* entry;
        pthread_t thread;
    };
    std::vector<Call> calls;  // handler calls running now
    pthread_cond_t callEnded = PTHREAD_COND_INITIALIZER;
};

HandlerWalks& handlerWalks() {
    static HandlerWalks* walks = new HandlerWalks();  // never destroyed: may run during exit
    return *walks;
}

// Takes an entry out of use; selMutex held.
void retire(HandlerWalks& w, ipmiifc_sel_handler* e) {
    e->handler = nullptr;
    if (w.walks > 0)
        w.retired.push_back(e);
    else
        delete e;
}

bool runningElsewhere(const HandlerWalks& w, const ipmiifc_sel_handler* e) {
    for (const auto& c : w.calls)
        if (c.entry == e && !pthread_equal(c.thread, pthread_self())) return true;
    return false;
}

// Scope of one walk, and of one handler call within it; both run with
// selMutex held at construction and destruction.
class WalkScope {
public:
    explicit WalkScope(HandlerWalks& w) : w_(w) { ++w_.walks; }
    ~WalkScope() {
        if (--w_.walks > 0) return;
        for (ipmiifc_sel_handler* e : w_.retired) delete e;
        w_.retired.clear();
    }
    WalkScope(const WalkScope&) = delete;
    WalkScope& operator=(const WalkScope&) = delete;

private:
    HandlerWalks& w_;
};

class CallScope {
public:
    CallScope(HandlerWalks& w, const ipmiifc_sel_handler* e) : w_(w), e_(e) {
        w_.calls.push_back(HandlerWalks::Call{e, pthread_self()});
    }
    ~CallScope() {
        for (auto it = w_.calls.begin(); it != w_.calls.end(); ++it) {
            if (it->entry == e_ && pthread_equal(it->thread, pthread_self())) {
                w_.calls.erase(it);
                break;
            }
        }
        pthread_cond_broadcast(&w_.callEnded);
    }
    CallScope(const CallScope&) = delete;
    CallScope& operator=(const CallScope&) = delete;

private:
    HandlerWalks& w_;
    const ipmiifc_sel_handler* e_;
};

// Releases a held mutex for a scope.
class Unlocked {
public:
    explicit Unlocked(TAV::Mutex& m) : m_(m) { pthread_mutex_unlock(m_.native()); }
    ~Unlocked() { pthread_mutex_lock(m_.native()); }
    Unlocked(const Unlocked&) = delete;
    Unlocked& operator=(const Unlocked&) = delete;

private:
    TAV::Mutex& m_;
};

// One handler call whose failure stays its own: logged, and the walk goes
// on, so a broken handler costs no other handler a record. Thread
// cancellation passes on.
void callIsolated(IpmiSelEventHandler handler, void* context, IpmiSelData* record) {
    try {
        handler(context, record);
    } catch (abi::__forced_unwind&) {
        throw;
    } catch (const kelInt::CmpiStatus& s) {
        ipmiLog(LOG_DEBUG, "Event handler ran into issues: %s(%d)", s.msg(), static_cast<int>(s.rc()));
    } catch (...) {
        ipmiLog(LOG_DEBUG, "Event handler ran into issues");
    }
}

void walkHandlers(IpmiSelData* record, bool isolate) {
    IpmiNode& n = g_IpmiNode[0];
    HandlerWalks& w = handlerWalks();
    TAV::MutexLock guard(n.selMutex);
    WalkScope walk(w);
    for (ipmiifc_sel_handler* e = n.work.sel_handlers; e; e = e->next) {
        const IpmiSelEventHandler handler = e->handler;
        if (handler == nullptr) continue;
        void* const context = e->context;
        CallScope call(w, e);
        Unlocked unlocked(n.selMutex);
        if (isolate)
            callIsolated(handler, context, record);
        else
            handler(context, record);
    }
}

}  // namespace

void IpmiIfcSelCallHandlers(IpmiSelData* record) { walkHandlers(record, false); }

void IpmiIfcSelDeliverToHandlers(IpmiSelData* record) { walkHandlers(record, true); }

bool IpmiIfcSelHasHandlers() {
    IpmiNode& n = g_IpmiNode[0];
    TAV::MutexLock guard(n.selMutex);
    for (const ipmiifc_sel_handler* e = n.work.sel_handlers; e; e = e->next)
        if (e->handler != nullptr) return true;
    return false;
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
// Returns once no other thread runs the handler any more, so the caller may
// free its context; a handler that unregisters itself does not wait for itself.
int IpmiIfc::unRegisterSelEventHandler(int, IpmiSelEventHandler handler) {
    if (handler == nullptr) return kHandlerMissing;
    IpmiNode& n = g_IpmiNode[0];
    HandlerWalks& w = handlerWalks();
    TAV::MutexLock guard(n.selMutex);
    ipmiifc_sel_handler* head = n.work.sel_handlers;
    if (head == nullptr) return kHandlerNotRegistered;
    ipmiifc_sel_handler* match = nullptr;
    if (head->handler == handler) {
        match = head;
        n.work.sel_handlers = head->next;
    } else {
        for (ipmiifc_sel_handler* e = head->next; e; e = e->next) {
            if (e->handler != handler) continue;
            match = e;
            for (ipmiifc_sel_handler* cut = head->next; cut != e;) {
                ipmiifc_sel_handler* following = cut->next;
                retire(w, cut);
                cut = following;
            }
            head->next = e->next;
            break;
        }
    }
    if (match == nullptr) return kHandlerNotRegistered;
    match->handler = nullptr;  // a walk standing before it no longer calls it
    while (runningElsewhere(w, match)) pthread_cond_wait(&w.callEnded, n.selMutex.native());
    retire(w, match);
    return kHandlerOk;
}

int IpmiIfc::unRegisterSelEventHandler(IpmiSelEventHandler handler) { return unRegisterSelEventHandler(0, handler); }

void IpmiIfcSelCleanUpEventHandlers(int node) {
    IpmiNode& n = g_IpmiNode[(node >= 0 && node < IPMI_NODE_COUNT) ? node : 0];
    HandlerWalks& w = handlerWalks();
    TAV::MutexLock guard(n.selMutex);
    while (ipmiifc_sel_handler* e = n.work.sel_handlers) {
        n.work.sel_handlers = e->next;
        retire(w, e);
    }
}

}  // namespace Ipmi
