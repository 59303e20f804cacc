#ifndef TAV_IPMI_MUTEX_H
#define TAV_IPMI_MUTEX_H

#include <pthread.h>

#include "TavIpmiExport.h"

/// @file
/// The mutex the library's objects carry.

/// The library's lock types.
namespace TAV {

/// Non-recursive POSIX mutex with default attributes.
class TAV_IPMI_API Mutex {
public:
    Mutex() { pthread_mutex_init(&mutex_, nullptr); }
    ~Mutex() { pthread_mutex_destroy(&mutex_); }
    Mutex(const Mutex&) = delete;
    Mutex& operator=(const Mutex&) = delete;

    void lock() { pthread_mutex_lock(&mutex_); }      ///< blocks until the mutex is had
    void unlock() { pthread_mutex_unlock(&mutex_); }  ///< by the thread that locked it
    pthread_mutex_t* native() { return &mutex_; }     ///< for condition waits

private:
    pthread_mutex_t mutex_;
};

/// Scope guard: an exception never leaves the mutex held.
class MutexLock {
public:
    /// Locks `m` until the guard goes out of scope.
    explicit MutexLock(Mutex& m) : mutex_(m) { mutex_.lock(); }
    ~MutexLock() { mutex_.unlock(); }
    MutexLock(const MutexLock&) = delete;
    MutexLock& operator=(const MutexLock&) = delete;

private:
    Mutex& mutex_;
};

}  // namespace TAV

#endif
