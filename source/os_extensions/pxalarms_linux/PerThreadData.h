// PerThreadData.h - the record of one timed structure, and the key that
// points a structure's thread at its record.
//
// The structure's own thread writes every field without a lock.  The one
// exception is `state`, which an aborting thread stores before waking the
// structure; it is atomic and also read by the alarm table's name lookup.
#pragma once

#include <pthread.h>

#include <atomic>
#include <cstdint>
#include <string>

namespace pxalarms {

class TimingSource;

enum class StructureState : int32_t {
    kIdle = 0,
    kActivated = 1,
    kRunning = 2,
    kAborted = 3,
    kFinished = 4,
};

struct PerThreadData {
    int32_t structType = 0;
    std::string name;
    // Null until activation chooses them, so that an abort or deactivation of
    // a never-activated structure touches nothing.
    TimingSource* timingSource = nullptr;
    TimingSource* frameTimingSource = nullptr;
    TimingSource* lastTimingSource = nullptr;
    int64_t period = -1;
    uint32_t mode = 0;
    int32_t processor = -1;
    int32_t priority = -1;
    int64_t offset = -1;
    int64_t deadline = -1;
    int32_t timeout = 0;
    int32_t threadId = 0;
    // Written by the structure's thread and by an aborting thread (a store of
    // kAborted followed by a wake-up); read after every wake-up.  A plain
    // 32-bit word so a sleeping thread can wait on it.
    std::atomic<int32_t> state{0};
    // Tick a thread waits for on a user-mode source; guarded by waitMutex.
    int64_t awaitedTick = -1;
    pthread_mutex_t waitMutex;
    pthread_cond_t waitCond;

    StructureState currentState() const
    {
        return static_cast<StructureState>(state.load(std::memory_order_acquire));
    }
    void setState(StructureState s) { state.store(static_cast<int32_t>(s), std::memory_order_release); }
};

static_assert(sizeof(std::atomic<int32_t>) == sizeof(int32_t) &&
                  std::atomic<int32_t>::is_always_lock_free,
              "state must be a plain 32-bit word");

// The thread-specific key; created at load, deleted at unload.
class CurrentStructureKey {
public:
    CurrentStructureKey();
    ~CurrentStructureKey();
    CurrentStructureKey(const CurrentStructureKey&) = delete;
    CurrentStructureKey& operator=(const CurrentStructureKey&) = delete;

    void set(PerThreadData* record) { pthread_setspecific(key_, record); }
    PerThreadData* get() const { return static_cast<PerThreadData*>(pthread_getspecific(key_)); }

private:
    pthread_key_t key_;
};

}  // namespace pxalarms
