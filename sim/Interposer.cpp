// The C-library boundary: calls on /dev/ipmi0 go to the simulated driver,
// sleeps and time-outs run in virtual time; everything else passes through.

#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <sched.h>
#include <stdarg.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/select.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <time.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "Sim.h"

extern "C" {
__attribute__((weak)) extern const int tavIpmiSimPreloaded;
}

namespace {

// The next definition of a C-library function: a sanitizer's interceptor when
// one is loaded (so it keeps its bookkeeping), else the C library's own.
// In the preload library (Preload.cpp defines this) a sanitizer runtime
// comes first in the lookup order, so its interceptors already call these
// functions as their "next" one: from there they go straight to the C library.
//
// Nothing here allocates: preloaded into a sanitized program, the first call
// can come from inside the sanitizer's allocator (its clock_gettime) while it
// holds its lock.
void* nextSymbol(const char* name) {
    static const char kPrefix[] = "__interceptor_";
    char intercepted[64];
    size_t length = strlen(name);
    void* fn = nullptr;
    if (&tavIpmiSimPreloaded == nullptr && length < sizeof intercepted - (sizeof kPrefix - 1)) {
        memcpy(intercepted, kPrefix, sizeof kPrefix - 1);
        memcpy(intercepted + sizeof kPrefix - 1, name, length + 1);
        fn = dlsym(RTLD_DEFAULT, intercepted);
    }
    if (fn == nullptr) fn = dlsym(RTLD_NEXT, name);
    return fn;
}

template <typename Fn>
Fn real(const char* name) {
    return reinterpret_cast<Fn>(nextSymbol(name));
}

#define REAL(fn) (*[]() { static auto p = real<decltype(&::fn)>(#fn); return p; }())

Sim::Simulator& sim() { return Sim::Simulator::instance(); }

bool virtualTime() { return sim().clock().enabled(); }

int64_t toNs(const struct timespec& ts) { return static_cast<int64_t>(ts.tv_sec) * 1000000000 + ts.tv_nsec; }

struct timespec fromNs(int64_t ns) {
    struct timespec ts;
    ts.tv_sec = static_cast<time_t>(ns / 1000000000);
    ts.tv_nsec = static_cast<long>(ns % 1000000000);
    return ts;
}

int openPath(const char* path, int flags, mode_t mode, int (*passThrough)(const char*, int, ...)) {
    if (sim().isDevicePath(path) && sim().installed()) return sim().openDevice();
    if (sim().isDevicePath(path)) {
        errno = ENOENT;
        return -1;
    }
    return passThrough(path, flags, mode);
}

// Virtual wait: returns at once with the clock moved on by `timeoutMs`.
void advanceVirtual(int timeoutMs) {
    if (timeoutMs > 0) sim().clock().advanceNs(static_cast<int64_t>(timeoutMs) * 1000000);
    sched_yield();
}

}  // namespace

namespace Sim {

int64_t realNowNs() {
    struct timespec ts;
    REAL(clock_gettime)(CLOCK_REALTIME, &ts);
    return toNs(ts);
}

void realSleepNs(int64_t ns) {
    struct timespec ts = fromNs(ns);
    REAL(nanosleep)(&ts, nullptr);
}

}  // namespace Sim

extern "C" {

int open(const char* path, int flags, ...) {
    mode_t mode = 0;
    if (flags & (O_CREAT | O_TMPFILE)) {
        va_list ap;
        va_start(ap, flags);
        mode = static_cast<mode_t>(va_arg(ap, int));
        va_end(ap);
    }
    return openPath(path, flags, mode, REAL(open));
}

int open64(const char* path, int flags, ...) {
    mode_t mode = 0;
    if (flags & (O_CREAT | O_TMPFILE)) {
        va_list ap;
        va_start(ap, flags);
        mode = static_cast<mode_t>(va_arg(ap, int));
        va_end(ap);
    }
    return openPath(path, flags, mode, REAL(open64));
}

int __open_2(const char* path, int flags) { return openPath(path, flags, 0, REAL(open)); }
int __open64_2(const char* path, int flags) { return openPath(path, flags, 0, REAL(open64)); }

static int openatPath(int dirfd, const char* path, int flags, mode_t mode, bool large) {
    if (path && path[0] == '/' && sim().isDevicePath(path)) return openPath(path, flags, mode, REAL(open));
    return large ? REAL(openat64)(dirfd, path, flags, mode) : REAL(openat)(dirfd, path, flags, mode);
}

int openat(int dirfd, const char* path, int flags, ...) {
    mode_t mode = 0;
    if (flags & (O_CREAT | O_TMPFILE)) {
        va_list ap;
        va_start(ap, flags);
        mode = static_cast<mode_t>(va_arg(ap, int));
        va_end(ap);
    }
    return openatPath(dirfd, path, flags, mode, false);
}

int openat64(int dirfd, const char* path, int flags, ...) {
    mode_t mode = 0;
    if (flags & (O_CREAT | O_TMPFILE)) {
        va_list ap;
        va_start(ap, flags);
        mode = static_cast<mode_t>(va_arg(ap, int));
        va_end(ap);
    }
    return openatPath(dirfd, path, flags, mode, true);
}

int __openat_2(int dirfd, const char* path, int flags) { return openatPath(dirfd, path, flags, 0, false); }
int __openat64_2(int dirfd, const char* path, int flags) { return openatPath(dirfd, path, flags, 0, true); }

int close(int fd) {
    if (sim().isDevice(fd)) sim().closeDevice(fd);
    return REAL(close)(fd);
}

int ioctl(int fd, unsigned long request, ...) noexcept {
    va_list ap;
    va_start(ap, request);
    void* arg = va_arg(ap, void*);
    va_end(ap);
    if (sim().isDevice(fd)) return sim().ioctlDevice(fd, request, arg);
    return REAL(ioctl)(fd, request, arg);
}

int poll(struct pollfd* fds, nfds_t nfds, int timeout) {
    if (nfds > 0 && fds != nullptr) {
        int errors = 0;
        for (nfds_t i = 0; i < nfds; ++i) {
            fds[i].revents = sim().reportsPollError(fds[i].fd) ? POLLERR : 0;
            errors += fds[i].revents != 0;
        }
        if (errors > 0) {
            sim().countPollError();
            return errors;
        }
        std::vector<int> list;
        for (nfds_t i = 0; i < nfds; ++i) list.push_back(fds[i].fd);
        if (sim().waitTimesOutVirtually(list.data(), list.size())) {
            int ready = REAL(poll)(fds, nfds, 0);
            if (ready != 0) return ready;
            advanceVirtual(timeout);
            return 0;
        }
    }
    return REAL(poll)(fds, nfds, timeout);
}

int __poll_chk(struct pollfd* fds, nfds_t nfds, int timeout, size_t) { return poll(fds, nfds, timeout); }

int select(int nfds, fd_set* readfds, fd_set* writefds, fd_set* exceptfds, struct timeval* timeout) {
    if (readfds != nullptr) {
        std::vector<int> list;
        for (int fd = 0; fd < nfds && fd < FD_SETSIZE; ++fd)
            if (FD_ISSET(fd, readfds)) list.push_back(fd);
        if (sim().waitTimesOutVirtually(list.data(), list.size())) {
            fd_set r = *readfds;
            struct timeval zero = {0, 0};
            int ready = REAL(select)(nfds, &r, writefds, exceptfds, &zero);
            if (ready != 0) {
                *readfds = r;
                return ready;
            }
            int ms = timeout ? static_cast<int>(timeout->tv_sec * 1000 + timeout->tv_usec / 1000) : 0;
            advanceVirtual(ms);
            FD_ZERO(readfds);
            if (timeout) *timeout = {0, 0};
            return 0;
        }
    }
    return REAL(select)(nfds, readfds, writefds, exceptfds, timeout);
}

unsigned int sleep(unsigned int seconds) {
    if (!virtualTime()) return REAL(sleep)(seconds);
    sim().clock().advanceNs(static_cast<int64_t>(seconds) * 1000000000);
    sched_yield();
    return 0;
}

int usleep(useconds_t usec) {
    if (!virtualTime()) return REAL(usleep)(usec);
    sim().clock().advanceNs(static_cast<int64_t>(usec) * 1000);
    sched_yield();
    return 0;
}

int nanosleep(const struct timespec* req, struct timespec* rem) {
    if (!virtualTime() || req == nullptr) return REAL(nanosleep)(req, rem);
    sim().clock().advanceNs(toNs(*req));
    if (rem) *rem = {0, 0};
    sched_yield();
    return 0;
}

time_t time(time_t* out) noexcept {
    time_t now = static_cast<time_t>(sim().clock().nowNs(Sim::realNowNs()) / 1000000000);
    if (out) *out = now;
    return now;
}

int gettimeofday(struct timeval* tv, void*) noexcept {
    int64_t ns = sim().clock().nowNs(Sim::realNowNs());
    tv->tv_sec = static_cast<time_t>(ns / 1000000000);
    tv->tv_usec = static_cast<suseconds_t>((ns % 1000000000) / 1000);
    return 0;
}

int clock_gettime(clockid_t clk, struct timespec* ts) noexcept {
    int rc = REAL(clock_gettime)(clk, ts);
    if (rc == 0 && clk == CLOCK_REALTIME && virtualTime()) *ts = fromNs(toNs(*ts) + sim().clock().offsetNs());
    return rc;
}

// Timed condition waits (the polling loop's sleep, state re-checks) are
// deadlines in virtual time: a short real wait stands for the whole span.
int pthread_cond_timedwait(pthread_cond_t* cond, pthread_mutex_t* mutex, const struct timespec* abstime) {
    static auto next = real<int (*)(pthread_cond_t*, pthread_mutex_t*, const struct timespec*)>(
        "pthread_cond_timedwait");
    if (!virtualTime()) return next(cond, mutex, abstime);
    int64_t realNow = Sim::realNowNs();
    int64_t remaining = toNs(*abstime) - sim().clock().nowNs(realNow);
    if (remaining <= 0) {
        struct timespec past = fromNs(realNow);
        return next(cond, mutex, &past);
    }
    struct timespec realDeadline = fromNs(realNow + remaining / Sim::VirtualClock::kScale + 1000);
    int rc = next(cond, mutex, &realDeadline);
    if (rc == ETIMEDOUT) sim().clock().advanceToNs(toNs(*abstime), Sim::realNowNs());
    return rc;
}

}  // extern "C"
