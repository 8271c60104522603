// ClockTimingSources.h - timing sources paced by CLOCK_REALTIME.
//
//   ClockTimingSource       a named clock, owned by the registry
//   AbsoluteTimingSource    the two process-wide clocks counting from 1904
//   ResettableTimingSource  a private clock owned by one structure
//
// A sleeping thread waits on its record's `state` word with an absolute
// CLOCK_REALTIME deadline (futex).  The kernel compares the word atomically
// with the sleep, so an abort stored before the sleep makes it return at
// once and one stored during it wakes it: no abort is ever slept through.
// The waits hold no lock and allocate nothing.
#pragma once

#include <atomic>
#include <cstdint>
#include <limits>
#include <string>

#include "TimingSource.h"

namespace pxalarms {

enum class Clock : int32_t {
    kMilliseconds = 0,
    kMicroseconds = 1,
};

class ClockTimingSource : public TimingSource {
public:
    ClockTimingSource(Clock clock, const std::string& name);

    void wakeThread(PerThreadData* threadData) override;
    void attachThread() override {}
    void abort() override { aborted.store(true, std::memory_order_release); }
    void release() override;
    void reportError(ErrorCluster* error) override;
    int64_t getTick(const int64_t& timeNs) override;
    int32_t waitUntilTick(const int64_t& tick, int32_t timeoutMs) override;

    bool started() const { return startTime.load(std::memory_order_acquire) != kNotStarted; }
    int64_t nsPerTickValue() const { return nsPerTick; }

protected:
    static constexpr int64_t kNotStarted = std::numeric_limits<int64_t>::min();

    const int64_t nsPerTick;
    // CLOCK_REALTIME ns of tick 0, or kNotStarted.  The first waiter on a
    // shared source publishes it with one compare-and-swap, so every other
    // thread sees either nothing or the whole value.
    std::atomic<int64_t> startTime{kNotStarted};
    // Set by the registry's thread, read by every waiter on entry.
    std::atomic<bool> aborted{false};

private:
    int64_t startTimeStartingNow();
};

class AbsoluteTimingSource final : public ClockTimingSource {
public:
    // 1904-01-01 00:00:00 UTC in CLOCK_REALTIME nanoseconds.
    static constexpr int64_t kEpoch1904Ns = -2082844800LL * 1000000000LL;

    explicit AbsoluteTimingSource(Clock clock);
    void release() override {}
    virtual bool isAbsolute() const { return true; }
};

class ResettableTimingSource final : public ClockTimingSource {
public:
    explicit ResettableTimingSource(Clock clock);
    void release() override { delete this; }
    void reset(const int64_t& timeNs) override
    {
        startTime.store(timeNs, std::memory_order_release);
    }
};

// Nanoseconds per tick of a clock; an unknown clock stops the process.
int32_t scaleUnits(Clock clock);

// Number of the kernel's wake-up system call: 0 not read, -1 unavailable.
// Read once, while the first clock source is built at load.
int32_t wakeUpSyscallNumber();

namespace testing {
// Forgets the number so the next clock source reads it again.
void forgetWakeUpSyscallNumber();
}  // namespace testing

}  // namespace pxalarms
