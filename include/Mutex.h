#ifndef TAV_IPMI_MUTEX_H
#define TAV_IPMI_MUTEX_H

#include <pthread.h>

#include "TavIpmiExport.h"

namespace TAV {

// Non-recursive POSIX mutex with default attributes.
class TAV_IPMI_API Mutex {
public:
    Mutex() { pthread_mutex_init(&mutex_, nullptr); }
    ~Mutex() { pthread_mutex_destroy(&mutex_); }
    Mutex(const Mutex&) = delete;
    Mutex& operator=(const Mutex&) = delete;

    void lock() { pthread_mutex_lock(&mutex_); }
    void unlock() { pthread_mutex_unlock(&mutex_); }
    pthread_mutex_t* native() { return &mutex_; }

private:
    pthread_mutex_t mutex_;
};

// Scope guard: an exception never leaves the mutex held.
class MutexLock {
public:
    explicit MutexLock(Mutex& m) : mutex_(m) { mutex_.lock(); }
    ~MutexLock() { mutex_.unlock(); }
    MutexLock(const MutexLock&) = delete;
    MutexLock& operator=(const MutexLock&) = delete;

private:
    Mutex& mutex_;
};

}  // namespace TAV

#endif
