// AlarmStartGroupManager.h - synchronization groups: named sets of timed
// structures whose threads start together.
//
// AlarmStartGroupManager (one process-wide instance) maps group names to
// StartGroup records; each group's members meet at its GroupBarrier when
// they are activated (waitForGroupStart, on each structure's own thread).
// The group API (timedStructuresAPI.cpp) fills, lists, empties and aborts
// groups from any host thread.  Lock order: the manager's mutex_, then a
// barrier's own mutex.  Members wait at a barrier with mutex_ released, so
// the group API stays usable; refCount keeps membership changes away from a
// starting group.
#pragma once

#include <pthread.h>
#include <time.h>

#include <cstddef>
#include <cstdint>
#include <map>
#include <set>
#include <string>

#include "Mutex.h"

namespace pxalarms {

// A reusable barrier whose arrival counter carries a releasing bit, so that
// members of a next round cannot enter before the released ones have left.
class GroupBarrier {
public:
    static constexpr uint32_t kReleasing = 0x80000000u;
    // wait() result of the member whose arrival completed the group.
    static constexpr int kCompleted = -1;

    GroupBarrier() = default;
    GroupBarrier(const GroupBarrier&) = delete;
    GroupBarrier& operator=(const GroupBarrier&) = delete;

    void init(uint32_t memberCount);
    // Blocks until the group is released.  deadlineRealtime (absolute,
    // CLOCK_REALTIME) may be null for no limit; epoch is abortEpoch() as read
    // when the member entered the rendezvous.  Returns 0, kCompleted,
    // ETIMEDOUT (the arrival is withdrawn unless the release came at that
    // moment), or ECANCELED when cancelWaiters() ran since epoch was read
    // and the group had not been released.
    int wait(const timespec* deadlineRealtime, uint32_t epoch);
    // Wakes every member waiting now; each withdraws its arrival.
    void cancelWaiters();
    uint32_t abortEpoch();
    // Waits for released members still leaving, then tears down.
    void destroy();

    bool initialized = false;
    uint32_t count = 0;  // members that must arrive; fixed at init
    uint32_t total = 0;  // guarded by mutex: arrivals, or kReleasing + leavers
    pthread_mutex_t mutex;
    pthread_cond_t cond;

private:
    // Caller holds mutex.
    int condWait(const timespec* deadlineRealtime);

    uint32_t abortEpoch_ = 0;  // guarded by mutex; bumped by cancelWaiters()
};

struct StartGroup {
    // 1 plus the number of members inside waitForGroupStart; guarded by the
    // manager's mutex_.  The barrier is initialised only while this is > 1.
    int32_t refCount = 1;
    GroupBarrier startBarrier;
    int32_t timeoutMs = 0;            // -1: no limit; the last add wins
    std::set<std::string> members;   // byte order of the names
};

// The absolute CLOCK_REALTIME deadline timeoutMs after nowRealtime, with the
// nanoseconds normalised into [0, 1e9).
timespec groupStartDeadline(const timespec& nowRealtime, int32_t timeoutMs);

class AlarmStartGroupManager {
public:
    AlarmStartGroupManager();
    // Releases members still waiting (they report -821) and waits until
    // they have left, so unloading never stops the process.
    ~AlarmStartGroupManager();
    AlarmStartGroupManager(const AlarmStartGroupManager&) = delete;
    AlarmStartGroupManager& operator=(const AlarmStartGroupManager&) = delete;

    // Throws CTimedStructureException -812 (in another group, no move) or
    // -814 (its current group or the target group is starting).
    void addAlarm(const std::string& groupName, const std::string& alarmName, int32_t timeoutMs,
                  bool allowMove);
    // On the structure's own thread: 0 once the whole group has arrived (or
    // at once for a structure in no group), -821 when the wait timed out,
    // was aborted or the library is being unloaded.
    int32_t waitForGroupStart(const std::string& alarmName);
    // 0, or -814 while the group is starting.
    int32_t resetGroup(const std::string& groupName);
    // 0; -806 for no such group; -804 for an index past the end.
    int32_t getAlarmAt(const std::string& groupName, size_t index, std::string* alarmName);
    // Releases the members waiting at the group's barrier now (they report
    // -821); membership stays.  A group that is idle or missing is untouched.
    void abortGroup(const std::string& groupName);

    // For tests: the group's refCount, 0 when there is no such group.
    int32_t refCountOf(const std::string& groupName);

private:
    using GroupMap = std::map<std::string, StartGroup>;

    // Caller holds mutex_.
    StartGroup* findGroupOfAlarm(const std::string& alarmName);
    void leaveRendezvous(StartGroup* group);

    GroupMap groups_;      // guarded by mutex_; groups are never erased
    bool closing_ = false;  // guarded by mutex_; set by the destructor
    pthread_cond_t leftCond_;  // with mutex_: a member left while closing_
    Mutex mutex_;
};

}  // namespace pxalarms
