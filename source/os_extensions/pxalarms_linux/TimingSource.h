// TimingSource.h - the interface every timing source implements.
//
// A timing source numbers its ticks from 0, says which tick a moment falls
// in, and sleeps a structure's thread until a tick.  waitUntilTick, attach
// and release run on the structure's own thread (its record is found through
// currentStructureKey); wakeThread runs on an aborting thread after it stored
// the aborted state; abort() runs under the registry's mutex.
#pragma once

#include <cstdint>
#include <string>

#include "pxalarms.h"

namespace pxalarms {

struct PerThreadData;

// Results of waitUntilTick, shared by every timing source.
enum WaitResult : int32_t {
    kTickReached = 0,
    kStructureWasAborted = 1,
    kSourceFailed = 3,
    kTimedOut = 5,
};

class TimingSource {
public:
    explicit TimingSource(const std::string& name) : name(name) {}
    virtual ~TimingSource() = default;
    TimingSource(const TimingSource&) = delete;
    TimingSource& operator=(const TimingSource&) = delete;

    virtual void wakeThread(PerThreadData* threadData) = 0;
    virtual void attachThread() = 0;
    virtual void abort() = 0;
    virtual void release() = 0;
    virtual void reportError(ErrorCluster* error) = 0;
    virtual const std::string& getName() const { return name; }
    virtual int64_t getTick(const int64_t& timeNs) = 0;
    virtual int32_t waitUntilTick(const int64_t& tick, int32_t timeoutMs) = 0;
    virtual void reset(const int64_t&) {}
    virtual bool ignoresOffset() const { return false; }
    virtual bool deadlineMissed(const int64_t&, const int64_t&) { return false; }

protected:
    const std::string name;
};

}  // namespace pxalarms
