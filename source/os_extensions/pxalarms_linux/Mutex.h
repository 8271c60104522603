// Mutex.h - the priority-inheritance mutex every registry uses.
//
// Mutex wraps a POSIX mutex with PTHREAD_PRIO_INHERIT, so a low-priority
// thread holding a registry lock is boosted while a timed loop waits for it.
// MutexLock holds it for a scope; an exception leaving the scope unlocks.
#pragma once

#include <pthread.h>

namespace pxalarms {

class Mutex {
public:
    Mutex();
    ~Mutex();
    Mutex(const Mutex&) = delete;
    Mutex& operator=(const Mutex&) = delete;

    void lock();
    void unlock();
    pthread_mutex_t* native() { return &mutex_; }

private:
    pthread_mutex_t mutex_;
};

class MutexLock {
public:
    explicit MutexLock(Mutex& mutex) : mutex_(mutex) { mutex_.lock(); }
    ~MutexLock() { mutex_.unlock(); }
    MutexLock(const MutexLock&) = delete;
    MutexLock& operator=(const MutexLock&) = delete;

private:
    Mutex& mutex_;
};

}  // namespace pxalarms
