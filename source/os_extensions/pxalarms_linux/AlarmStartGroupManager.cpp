// AlarmStartGroupManager.cpp - synchronization groups and their start barrier.
#include "AlarmStartGroupManager.h"

#include <errno.h>

#include <iterator>

#include "pxAssert.h"
#include "schedExceptions.h"

namespace pxalarms {

namespace {

constexpr int64_t kNsPerSecond = 1000000000;
constexpr int64_t kNsPerMs = 1000000;
constexpr int32_t kNoTimeLimit = -1;

// The barrier's own mutex has default attributes; this keeps it RAII too.
class BarrierLock {
public:
    explicit BarrierLock(pthread_mutex_t* mutex) : mutex_(mutex) { pthread_mutex_lock(mutex_); }
    ~BarrierLock() { pthread_mutex_unlock(mutex_); }
    BarrierLock(const BarrierLock&) = delete;
    BarrierLock& operator=(const BarrierLock&) = delete;

private:
    pthread_mutex_t* mutex_;
};

}  // namespace

timespec groupStartDeadline(const timespec& nowRealtime, int32_t timeoutMs)
{
    // Truncating division: the remainder keeps the sign of timeoutMs, and
    // the normalisation below borrows for it.
    int64_t seconds = static_cast<int64_t>(nowRealtime.tv_sec) + timeoutMs / 1000;
    int64_t nanoseconds = static_cast<int64_t>(nowRealtime.tv_nsec) + (timeoutMs % 1000) * kNsPerMs;
    if (nanoseconds >= kNsPerSecond) {
        nanoseconds -= kNsPerSecond;
        ++seconds;
    } else if (nanoseconds < 0) {
        nanoseconds += kNsPerSecond;
        --seconds;
    }
    timespec deadline{};
    deadline.tv_sec = static_cast<time_t>(seconds);
    deadline.tv_nsec = static_cast<long>(nanoseconds);
    return deadline;
}

// ---- GroupBarrier -----------------------------------------------------------

void GroupBarrier::init(uint32_t memberCount)
{
    // A member only enters through a group that holds it, so a group that
    // starts is never empty; count 0 would never release.
    PX_ASSERT(memberCount > 0);
    PX_ASSERT(!initialized);
    pthread_mutex_init(&mutex, nullptr);
    // Default attributes: timed waits measure against CLOCK_REALTIME.
    pthread_cond_init(&cond, nullptr);
    count = memberCount;
    total = kReleasing;
    abortEpoch_ = 0;
    initialized = true;
}

int GroupBarrier::condWait(const timespec* deadlineRealtime)
{
    if (deadlineRealtime != nullptr)
        return pthread_cond_timedwait(&cond, &mutex, deadlineRealtime);
    return pthread_cond_wait(&cond, &mutex);
}

int GroupBarrier::wait(const timespec* deadlineRealtime, uint32_t epoch)
{
    BarrierLock lock(&mutex);
    auto cancelled = [&] { return abortEpoch_ != epoch; };
    int rc = 0;

    // An earlier release is still leaving; arriving now would count this
    // member into that round.
    while (total > kReleasing && rc == 0 && !cancelled())
        rc = condWait(deadlineRealtime);
    if (cancelled())
        return ECANCELED;
    // A deadline that passed just as the drain ended still lets the member
    // arrive: it may be the one that completes the group.
    if (rc != 0 && (rc != ETIMEDOUT || total > kReleasing))
        return rc;

    if (total == kReleasing)
        total = 0;
    ++total;
    if (total == count) {
        // Releasing bit plus the other members that still have to leave.
        total += kReleasing - 1;
        pthread_cond_broadcast(&cond);
        return kCompleted;
    }

    while (total < kReleasing && rc == 0 && !cancelled())
        rc = condWait(deadlineRealtime);

    if (total > kReleasing) {
        // Released: leave whatever the wait reported, or the barrier never
        // drains; a deadline that passed at that very moment still counts.
        --total;
        if (total == kReleasing)
            pthread_cond_broadcast(&cond);  // the next round may enter
        return rc == ETIMEDOUT ? ETIMEDOUT : 0;
    }

    // Still filling: withdraw, so a later arrival does not release the
    // group one member short.
    PX_ASSERT(total > 0);
    --total;
    if (total == 0)
        total = kReleasing;
    return cancelled() ? ECANCELED : rc;
}

void GroupBarrier::cancelWaiters()
{
    BarrierLock lock(&mutex);
    ++abortEpoch_;
    pthread_cond_broadcast(&cond);
}

uint32_t GroupBarrier::abortEpoch()
{
    BarrierLock lock(&mutex);
    return abortEpoch_;
}

void GroupBarrier::destroy()
{
    PX_ASSERT(initialized);
    {
        BarrierLock lock(&mutex);
        int rc = 0;
        while (total > kReleasing && rc == 0)
            rc = pthread_cond_wait(&cond, &mutex);
    }
    pthread_cond_destroy(&cond);
    pthread_mutex_destroy(&mutex);
    initialized = false;
}

// ---- AlarmStartGroupManager -------------------------------------------------

AlarmStartGroupManager::AlarmStartGroupManager()
{
    pthread_cond_init(&leftCond_, nullptr);
}

AlarmStartGroupManager::~AlarmStartGroupManager()
{
    {
        MutexLock lock(mutex_);
        // Members waiting without limit would otherwise keep the library
        // from unloading; release them and wait until they are out.
        closing_ = true;
        for (auto& entry : groups_) {
            if (entry.second.refCount > 1)
                entry.second.startBarrier.cancelWaiters();
        }
        for (auto& entry : groups_) {
            while (entry.second.refCount > 1)
                pthread_cond_wait(&leftCond_, mutex_.native());
        }
        for (auto& entry : groups_) {
            StartGroup* g = &entry.second;
            PX_ASSERT(g->refCount == 1);
            if (g->startBarrier.initialized)
                g->startBarrier.destroy();
        }
        groups_.clear();
    }
    pthread_cond_destroy(&leftCond_);
}

StartGroup* AlarmStartGroupManager::findGroupOfAlarm(const std::string& alarmName)
{
    for (auto& entry : groups_) {
        if (entry.second.members.count(alarmName) != 0)
            return &entry.second;
    }
    return nullptr;
}

void AlarmStartGroupManager::addAlarm(const std::string& groupName, const std::string& alarmName,
                                      int32_t timeoutMs, bool allowMove)
{
    MutexLock lock(mutex_);
    StartGroup* current = findGroupOfAlarm(alarmName);
    auto found = groups_.find(groupName);
    StartGroup* target = found != groups_.end() ? &found->second : nullptr;
    if (current != nullptr && current == target)
        return;  // already there; the group's time-out stays as it was
    if (current != nullptr) {
        if (!allowMove)
            throw CTimedStructureException(kInOtherGroup, groupName);
        if (current->refCount > 1)
            throw CTimedStructureException(kGroupStarting, alarmName);
    }
    // Checked before the structure leaves its old group, so a refused move
    // leaves it where it was.
    if (target != nullptr && target->refCount > 1)
        throw CTimedStructureException(kGroupStarting, groupName);
    if (target == nullptr)
        target = &groups_.try_emplace(groupName).first->second;
    // Insert before erasing: running out of memory must not drop the
    // structure from every group.
    target->members.insert(alarmName);
    target->timeoutMs = timeoutMs;
    if (current != nullptr)
        current->members.erase(alarmName);
}

int32_t AlarmStartGroupManager::waitForGroupStart(const std::string& alarmName)
{
    StartGroup* group;
    int32_t timeoutMs;
    uint32_t epoch;
    {
        MutexLock lock(mutex_);
        if (closing_)
            return kGroupStartTimedOut;
        group = findGroupOfAlarm(alarmName);
        if (group == nullptr)
            return 0;
        if (group->refCount == 1)
            group->startBarrier.init(static_cast<uint32_t>(group->members.size()));
        ++group->refCount;
        // Read with the entry, under mutex_, so an abort that follows is
        // seen by this member even before it reaches the barrier.
        epoch = group->startBarrier.abortEpoch();
        timeoutMs = group->timeoutMs;
    }

    // The group record stays put: groups are never erased while the manager
    // lives, and the destructor waits for this member to leave.
    int rc;
    if (timeoutMs == kNoTimeLimit) {
        rc = group->startBarrier.wait(nullptr, epoch);
    } else {
        // Counted from this member's own arrival.
        timespec nowRealtime;
        clock_gettime(CLOCK_REALTIME, &nowRealtime);
        const timespec deadline = groupStartDeadline(nowRealtime, timeoutMs);
        rc = group->startBarrier.wait(&deadline, epoch);
    }

    {
        MutexLock lock(mutex_);
        leaveRendezvous(group);
    }
    // ETIMEDOUT, ECANCELED or a failed wait: the member did not start with
    // its group.
    return rc > 0 ? kGroupStartTimedOut : 0;
}

void AlarmStartGroupManager::leaveRendezvous(StartGroup* group)
{
    --group->refCount;
    if (group->refCount == 1)
        group->startBarrier.destroy();
    if (closing_)
        pthread_cond_broadcast(&leftCond_);
}

int32_t AlarmStartGroupManager::resetGroup(const std::string& groupName)
{
    MutexLock lock(mutex_);
    auto found = groups_.find(groupName);
    if (found == groups_.end())
        return 0;
    if (found->second.refCount >= 2)
        return kGroupStarting;
    found->second.members.clear();
    return 0;
}

int32_t AlarmStartGroupManager::getAlarmAt(const std::string& groupName, size_t index,
                                           std::string* alarmName)
{
    PX_ASSERT(alarmName != NULL);
    MutexLock lock(mutex_);
    auto found = groups_.find(groupName);
    if (found == groups_.end())
        return kNoSuchGroup;
    const std::set<std::string>& members = found->second.members;
    if (index >= members.size())
        return kNoSuchStructure;
    auto member = members.begin();
    std::advance(member, static_cast<std::ptrdiff_t>(index));
    *alarmName = *member;
    return 0;
}

void AlarmStartGroupManager::abortGroup(const std::string& groupName)
{
    MutexLock lock(mutex_);
    auto found = groups_.find(groupName);
    if (found != groups_.end() && found->second.refCount > 1)
        found->second.startBarrier.cancelWaiters();
}

int32_t AlarmStartGroupManager::refCountOf(const std::string& groupName)
{
    MutexLock lock(mutex_);
    auto found = groups_.find(groupName);
    return found != groups_.end() ? found->second.refCount : 0;
}

}  // namespace pxalarms
