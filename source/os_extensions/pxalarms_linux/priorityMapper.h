// priorityMapper.h - maps timed-structure priorities (1..65535) onto the
// SCHED_FIFO priorities 30..88.
//
// PriorityMapper owns a fixed table of 59 slots, one per Linux priority,
// each holding the timed-structure priority mapped there and the threads
// registered at it.  Equal priorities share a slot, a larger priority always
// sits in a higher slot, and when two neighbours leave no room the shorter
// run of slots is moved by one, with the threads in it.  mapperMutex_ (PI)
// guards the table and every priority change the mapper makes, the calling
// thread's own included, so whenever the mutex is free every listed thread
// runs at its slot's priority.  No other lock is taken under it.
// The process-wide instance is g_priorityMapper (processObjects.h), the last
// object created at load; setThreadPriority/releaseThreadPriority use it.
#pragma once

#include <pthread.h>

#include <cstdint>
#include <list>

#include "Mutex.h"

namespace pxalarms {

constexpr int32_t kMinMappedLinPrio = 30;
constexpr int32_t kMaxMappedLinPrio = 88;
constexpr int32_t kNumPrioSlots = kMaxMappedLinPrio - kMinMappedLinPrio + 1;  // 59
constexpr int32_t kMinTlPrio = 1;
constexpr int32_t kMaxTlPrio = 0xffff;

using tLinThreadList = std::list<pthread_t>;

struct tPrioSlot {
    int32_t tlPrio = -1;     // -1: free
    tLinThreadList threads;  // registration order; a thread may repeat
};

class PriorityMapper {
public:
    PriorityMapper() = default;
    PriorityMapper(const PriorityMapper&) = delete;
    PriorityMapper& operator=(const PriorityMapper&) = delete;

    // Maps the calling thread at tlPrio and runs it under SCHED_FIFO at the
    // slot's priority.  Unless firstMapping, the thread first leaves
    // previousTlPrio.  0; -818 for tlPrio outside 1..65535 (nothing changes);
    // -832 when no slot is left or the priority could not be set, and then
    // the thread is in no slot and keeps its scheduling.
    int32_t setThreadPriority(int32_t tlPrio, bool firstMapping, int32_t previousTlPrio);
    // Removes every entry of the calling thread at tlPrio; an unmapped
    // priority is ignored.  The thread's scheduling is left as it is.
    void releaseThreadPriority(int32_t tlPrio);

    // Calls visit(const tPrioSlot (&)[59]) with mapperMutex_ held, so the
    // table and the listed threads' priorities can be read consistently.
    template <class Visit>
    void inspect(Visit&& visit)
    {
        MutexLock lock(mapperMutex_);
        const tPrioSlot(&slots)[kNumPrioSlots] = prioSlots_;
        visit(slots);
    }

private:
    // Take mapperMutex_ themselves.
    int32_t addThreadToMapping(int32_t tlPrio);
    // Called with mapperMutex_ held.
    int32_t removeThreadFromMapping(int32_t tlPrio, pthread_t threadid);
    int32_t makeRoom(int32_t lowerIndex, int32_t upperIndex);
    void adjustLinPriorities(const tLinThreadList& threads, int32_t delta, int32_t newIndex);

    Mutex mapperMutex_;
    tPrioSlot prioSlots_[kNumPrioSlots];  // guarded by mapperMutex_
};

// The process-wide mapper's operations.
int32_t setThreadPriority(int32_t tlPrio, bool firstMapping, int32_t previousTlPrio);
void releaseThreadPriority(int32_t tlPrio);

}  // namespace pxalarms
