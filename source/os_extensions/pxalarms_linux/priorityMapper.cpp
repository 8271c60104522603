// priorityMapper.cpp - slot search, placement, room-making and the
// priority changes that go with them.
#include "priorityMapper.h"

#include <sched.h>
#include <syslog.h>

#include "platformSeams.h"
#include "processObjects.h"
#include "schedExceptions.h"

namespace pxalarms {

namespace {

constexpr int32_t kLastSlot = kNumPrioSlots - 1;
// Virtual neighbours below slot 0 and above slot 58.
constexpr int32_t kBelowAllTlPrio = -1;
constexpr int32_t kAboveAllTlPrio = static_cast<int32_t>(0xffff + 1);

// Internal results; they never leave this unit.
constexpr int32_t kNoSlot = -2;
constexpr int32_t kInconsistent = -3;
constexpr int32_t kNotMapped = -4;
constexpr int32_t kOwnPriorityFailed = -5;

// The mapper runs inside a control system: a broken invariant is logged and
// the operation fails with a code rather than stopping the process.
bool checkHolds(bool holds, const char* expression, const char* function)
{
    if (!holds)
        logMessage(LOG_LOCAL0 | LOG_ERR, "priorityMapper: internal check \"%s\" failed in %s\n",
                   expression, function);
    return holds;
}
#define MAPPER_CHECK(...) checkHolds(static_cast<bool>(__VA_ARGS__), #__VA_ARGS__, __func__)

int32_t getIndexLinPrio(int32_t index)
{
    if (!MAPPER_CHECK(index < (89 - 30) && index >= 0))
        return -1;
    return index + kMinMappedLinPrio;
}

bool isOccupied(const tPrioSlot& slot)
{
    return slot.tlPrio >= 0;
}

bool isFree(const tPrioSlot& slot)
{
    return slot.tlPrio < 0 && slot.threads.empty();
}

// Binary search over the sparse, ordered table.  Returns the slot holding
// tlPrio, or -1 with the free gap between its would-be neighbours in
// lowerIndex..upperIndex (empty, lowerIndex == upperIndex + 1, when the
// neighbours are adjacent).
int32_t findTLPriorityIndex(const tPrioSlot* slots, int32_t tlPrio, int32_t& lowerIndex,
                            int32_t& upperIndex)
{
    int32_t lo = 0;
    int32_t hi = kLastSlot;
    lowerIndex = 0;
    upperIndex = kLastSlot;
    for (;;) {
        const int32_t mid = (lo + hi) / 2;
        int32_t j = mid;
        while (j <= hi && !isOccupied(slots[j]))
            ++j;
        if (j > hi) {
            if (lo >= mid)
                return -1;
            hi = mid - 1;
            continue;
        }
        if (tlPrio == slots[j].tlPrio)
            return j;
        if (tlPrio > slots[j].tlPrio) {
            lo = j + 1;
            lowerIndex = j + 1;
            if (hi > j)
                continue;
            return -1;
        }
        upperIndex = j - 1;
        if (lo >= mid)
            return -1;
        hi = mid - 1;
    }
}

// Chooses a slot in a non-empty gap: next to a neighbour whose priority is
// close, else the middle, leaving room on both sides for later priorities.
// -1 when the gap's neighbours are inconsistent.
int32_t determineTLPriorityIndex(const tPrioSlot* slots, int32_t tlPrio, int32_t lowerIndex,
                                 int32_t upperIndex)
{
    if (lowerIndex == upperIndex)
        return lowerIndex;
    const int32_t lowerTlPrio = lowerIndex <= 0 ? kBelowAllTlPrio : slots[lowerIndex - 1].tlPrio;
    const int32_t upperTlPrio = upperIndex >= kLastSlot ? kAboveAllTlPrio : slots[upperIndex + 1].tlPrio;
    if (!MAPPER_CHECK(lowerTlPrio >= -1 && upperTlPrio <= (int32_t)(0xffff + 1) &&
                      lowerTlPrio < upperTlPrio))
        return -1;
    int32_t candidate = (lowerIndex + upperIndex) / 2;
    if (upperTlPrio - tlPrio <= upperIndex - candidate)
        candidate = (upperIndex + 1) - (upperTlPrio - tlPrio);
    if (tlPrio - lowerTlPrio <= candidate - lowerIndex)
        return (lowerIndex - 1) + (tlPrio - lowerTlPrio);
    return candidate;
}

// Moves a slot's thread list into another slot without allocating.
void moveSlot(tPrioSlot& from, tPrioSlot& to)
{
    to.tlPrio = from.tlPrio;
    to.threads.clear();
    to.threads.splice(to.threads.end(), from.threads);
    from.tlPrio = -1;
}

}  // namespace

int32_t PriorityMapper::setThreadPriority(int32_t tlPrio, bool firstMapping, int32_t previousTlPrio)
{
    // Unsigned, so INT32_MIN does not overflow on the way.
    if (static_cast<uint32_t>(tlPrio) - 1u > static_cast<uint32_t>(kMaxTlPrio - kMinTlPrio))
        return kBadPriority;
    if (!firstMapping)
        releaseThreadPriority(previousTlPrio);
    return addThreadToMapping(tlPrio) == 0 ? 0 : kPriorityFailed;
}

void PriorityMapper::releaseThreadPriority(int32_t tlPrio)
{
    MutexLock lock(mapperMutex_);
    removeThreadFromMapping(tlPrio, pthread_self());
}

int32_t PriorityMapper::addThreadToMapping(int32_t tlPrio)
{
    MutexLock lock(mapperMutex_);
    int32_t lowerIndex = 0;
    int32_t upperIndex = 0;
    int32_t index = findTLPriorityIndex(prioSlots_, tlPrio, lowerIndex, upperIndex);
    if (index < 0) {
        if (lowerIndex <= upperIndex)
            index = determineTLPriorityIndex(prioSlots_, tlPrio, lowerIndex, upperIndex);
        else
            index = makeRoom(lowerIndex, upperIndex);
        if (index < 0)
            return kNoSlot;
    }
    const int32_t linPrio = getIndexLinPrio(index);
    if (linPrio < 0)
        return kInconsistent;

    tPrioSlot& slot = prioSlots_[index];
    slot.tlPrio = tlPrio;
    slot.threads.push_back(pthread_self());

    // Set before the mutex is released, so a move of this slot by another
    // thread never meets a listed thread that is not yet at its priority.
    sched_param param{};
    param.sched_priority = linPrio;
    if (pthread_setschedparam(pthread_self(), SCHED_FIFO, &param) != 0) {
        // An earlier entry of this thread here means it already runs at
        // linPrio, so only the new entry has to go.
        slot.threads.pop_back();
        if (slot.threads.empty())
            slot.tlPrio = -1;
        return kOwnPriorityFailed;
    }
    return 0;
}

// The neighbours of the new priority are adjacent (lowerIndex ==
// upperIndex + 1): moves the shorter run beside it one slot away, the
// upper run on a tie.  Returns the freed slot, or -1 with the table
// unchanged when every slot is taken.
int32_t PriorityMapper::makeRoom(int32_t lowerIndex, int32_t upperIndex)
{
    int32_t upCount = kNumPrioSlots;
    bool upRoom = false;
    for (int32_t i = lowerIndex; i <= kLastSlot; ++i) {
        if (isFree(prioSlots_[i])) {
            upRoom = true;
            upCount = i - lowerIndex;
            break;
        }
    }
    bool downRoom = false;
    int32_t downCount = 0;
    for (int32_t i = upperIndex; i >= 0 && upperIndex - i < upCount; --i) {
        if (isFree(prioSlots_[i])) {
            downRoom = true;
            downCount = upperIndex - i;
            break;
        }
    }

    // From the free slot toward the insertion point, so every move goes into
    // a slot that is free or has just been moved away.
    if (downRoom) {
        for (int32_t k = downCount; k >= 1; --k) {
            moveSlot(prioSlots_[upperIndex - k + 1], prioSlots_[upperIndex - k]);
            adjustLinPriorities(prioSlots_[upperIndex - k].threads, -1, upperIndex - k);
        }
        return upperIndex;
    }
    if (upRoom) {
        for (int32_t k = upCount; k >= 1; --k) {
            moveSlot(prioSlots_[lowerIndex + k - 1], prioSlots_[lowerIndex + k]);
            adjustLinPriorities(prioSlots_[lowerIndex + k].threads, +1, lowerIndex + k);
        }
        return lowerIndex;
    }
    return -1;
}

void PriorityMapper::adjustLinPriorities(const tLinThreadList& threads, int32_t delta,
                                         int32_t newIndex)
{
    if (threads.empty())
        return;
    const int32_t linPrio = getIndexLinPrio(newIndex);
    if (linPrio < 0)
        return;
    int policy = 0;
    sched_param tparams{};
    const int ret = pthread_getschedparam(threads.front(), &policy, &tparams);
    // The first thread should be one step away from the new priority; when
    // it is not, the invariant was broken before, and the slot's new index,
    // not the first thread, says where the threads belong.
    MAPPER_CHECK(!ret && tparams.sched_priority + delta == linPrio);

    sched_param param{};
    param.sched_priority = linPrio;
    for (const pthread_t thread : threads) {
        const int rc = pthread_setschedparam(thread, SCHED_FIFO, &param);
        if (rc != 0)
            logMessage(LOG_LOCAL0 | LOG_ERR, "priorityMapper: Set prio for thread %lu returned [%d]\n",
                       static_cast<unsigned long>(thread), rc);
    }
}

int32_t PriorityMapper::removeThreadFromMapping(int32_t tlPrio, pthread_t threadid)
{
    int32_t lowerIndex = 0;
    int32_t upperIndex = 0;
    const int32_t index = findTLPriorityIndex(prioSlots_, tlPrio, lowerIndex, upperIndex);
    if (index < 0)
        return kNotMapped;
    tPrioSlot& slot = prioSlots_[index];
    int32_t result = 0;
    bool listed = false;
    for (const pthread_t thread : slot.threads)
        listed = listed || pthread_equal(thread, threadid);
    if (listed) {
        int policy = 0;
        sched_param tparams{};
        // Removed even when the check fails: a thread that stayed listed
        // would be moved by later room-making after it may have ended.
        if (!MAPPER_CHECK(!pthread_getschedparam(threadid, &policy, &tparams) &&
                          tparams.sched_priority == getIndexLinPrio(index)))
            result = kInconsistent;
        slot.threads.remove_if([&](pthread_t thread) { return pthread_equal(thread, threadid); });
    }
    if (slot.threads.empty())
        slot.tlPrio = -1;
    return result;
}

int32_t setThreadPriority(int32_t tlPrio, bool firstMapping, int32_t previousTlPrio)
{
    return g_priorityMapper->setThreadPriority(tlPrio, firstMapping, previousTlPrio);
}

void releaseThreadPriority(int32_t tlPrio)
{
    g_priorityMapper->releaseThreadPriority(tlPrio);
}

}  // namespace pxalarms
