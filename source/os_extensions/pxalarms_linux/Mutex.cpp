// Mutex.cpp - priority-inheritance mutex.
#include "Mutex.h"

#include "pxAssert.h"

namespace pxalarms {

Mutex::Mutex()
{
    pthread_mutexattr_t attr;
    pthread_mutexattr_init(&attr);
    pthread_mutexattr_setprotocol(&attr, PTHREAD_PRIO_INHERIT);
    const int rc = pthread_mutex_init(&mutex_, &attr);
    pthread_mutexattr_destroy(&attr);
    PX_ASSERT(rc == 0);
}

Mutex::~Mutex()
{
    pthread_mutex_destroy(&mutex_);
}

void Mutex::lock()
{
    // A failing lock of a valid mutex means the registry is corrupt; carrying
    // on unlocked would corrupt it further.
    const int rc = pthread_mutex_lock(&mutex_);
    PX_ASSERT(rc == 0);
}

void Mutex::unlock()
{
    pthread_mutex_unlock(&mutex_);
}

}  // namespace pxalarms
