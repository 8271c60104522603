// ClockTimingSources.cpp - clock timing sources.
#include "ClockTimingSources.h"

#include <linux/futex.h>
#include <sys/syscall.h>
#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>

#include "PerThreadData.h"
#include "TimingSourceManager.h"
#include "highResTiming.h"
#include "platformSeams.h"
#include "processObjects.h"
#include "pxAssert.h"
#include "schedExceptions.h"

namespace pxalarms {

namespace {

constexpr char kWakeUpSyscallPath[] = "/sys/kernel/dr_syscall_sched_wake_up";

// Written only while the library loads; read by aborting threads.
std::atomic<int32_t> g_wakeUpSyscallNumber{0};

void readWakeUpSyscallNumber()
{
    int32_t number = -1;
    if (FILE* file = std::fopen(platformPath(kWakeUpSyscallPath).c_str(), "r")) {
        if (std::fscanf(file, "%d", &number) != 1)
            number = -1;
        std::fclose(file);
    }
    g_wakeUpSyscallNumber.store(number, std::memory_order_release);
}

// 32-bit targets built with 64-bit time_t must use the time64 entry point,
// or the kernel would read half of the deadline.
long futexCall(std::atomic<int32_t>* word, int op, int32_t value, const timespec* deadline,
               uint32_t bitset)
{
#if defined(__NR_futex_time64)
    static_assert(sizeof(deadline->tv_sec) == 8, "ARM builds use 64-bit time_t");
    return syscall(__NR_futex_time64, word, op, value, deadline, nullptr, bitset);
#else
    return syscall(SYS_futex, word, op, value, deadline, nullptr, bitset);
#endif
}

// Sleeps while `state` still holds `expected`, until the absolute
// CLOCK_REALTIME deadline.  Returns 0 when woken or the word changed,
// ETIMEDOUT at the deadline, EINTR on a signal, another errno on failure.
int sleepOnState(std::atomic<int32_t>& state, int32_t expected, const timespec& deadline)
{
    const long rc = futexCall(&state, FUTEX_WAIT_BITSET | FUTEX_PRIVATE_FLAG | FUTEX_CLOCK_REALTIME,
                              expected, &deadline, FUTEX_BITSET_MATCH_ANY);
    if (rc == 0)
        return 0;
    return errno == EAGAIN ? 0 : errno;
}

}  // namespace

int32_t scaleUnits(Clock clock)
{
    switch (clock) {
    case Clock::kMilliseconds:
        return 1000000;
    case Clock::kMicroseconds:
        return 1000;
    }
    PX_ASSERT(0);
}

int32_t wakeUpSyscallNumber()
{
    return g_wakeUpSyscallNumber.load(std::memory_order_acquire);
}

void testing::forgetWakeUpSyscallNumber()
{
    g_wakeUpSyscallNumber.store(0, std::memory_order_release);
}

ClockTimingSource::ClockTimingSource(Clock clock, const std::string& name)
    : TimingSource(name), nsPerTick(scaleUnits(clock))
{
    if (g_wakeUpSyscallNumber.load(std::memory_order_acquire) == 0)
        readWakeUpSyscallNumber();
}

int64_t ClockTimingSource::startTimeStartingNow()
{
    int64_t start = startTime.load(std::memory_order_acquire);
    if (start == kNotStarted) {
        const int64_t now = nowNs(CLOCK_REALTIME);
        // Losing the race means another first waiter started the count.
        start = startTime.compare_exchange_strong(start, now, std::memory_order_acq_rel) ? now
                                                                                         : start;
    }
    return start;
}

int64_t ClockTimingSource::getTick(const int64_t& timeNs)
{
    const int64_t start = startTime.load(std::memory_order_acquire);
    if (start == kNotStarted)
        return 0;
    const int64_t t = timeNs == 0 ? nowNs(CLOCK_REALTIME) : timeNs;
    return (t - start) / nsPerTick;
}

int32_t ClockTimingSource::waitUntilTick(const int64_t& tick, int32_t timeoutMs)
{
    if (aborted.load(std::memory_order_acquire))
        return kSourceFailed;
    // Tick k begins at an absolute time fixed by startTime, so periods never
    // drift however late a wake-up was.
    const int64_t deadlineRealtimeNs = tick * nsPerTick + startTimeStartingNow();
    if (tick == 0)
        return kTickReached;

    PerThreadData* threadData = currentStructureKey->get();
    PX_ASSERT(threadData != NULL);
    std::atomic<int32_t>& state = threadData->state;
    const int32_t aborted = static_cast<int32_t>(StructureState::kAborted);

    int64_t wakeRealtimeNs = deadlineRealtimeNs;
    int32_t result = kTickReached;
    if (timeoutMs > 0) {
        const int64_t nowRealtimeNs = nowNs(CLOCK_REALTIME);
        const int64_t timeoutNs = static_cast<int64_t>(timeoutMs) * 1000000;
        if (timeoutNs < deadlineRealtimeNs - nowRealtimeNs) {
            wakeRealtimeNs = nowRealtimeNs + timeoutNs;
            result = kTimedOut;
        }
    }
    const timespec wake = toTimespec(wakeRealtimeNs);
    for (;;) {
        const int32_t seen = state.load(std::memory_order_acquire);
        if (seen == aborted)
            return kStructureWasAborted;
        const int rc = sleepOnState(state, seen, wake);
        if (rc == ETIMEDOUT)
            break;
        if (rc != 0 && rc != EINTR)
            return kSourceFailed;  // a deadline the kernel refuses
        // Woken or interrupted: the loop head tells an abort from a signal.
    }
    return state.load(std::memory_order_acquire) == aborted ? kStructureWasAborted : result;
}

void ClockTimingSource::wakeThread(PerThreadData* threadData)
{
    // The aborting thread stored the aborted state first; waking every
    // waiter on the word is enough, whatever kernel this is.
    const long rc =
        futexCall(&threadData->state, FUTEX_WAKE | FUTEX_PRIVATE_FLAG, INT_MAX, nullptr, 0);
    if (rc < 0)
        logMessage(LOG_ERR, "sched_wake_up system call failed (%d), cannot abort timed loop",
                   -errno);
}

void ClockTimingSource::release()
{
    g_timingSourceManager->releaseTSrc(name);
}

void ClockTimingSource::reportError(ErrorCluster* error)
{
    SetErrorCluster(error, CTimingSourceException(aborted.load(std::memory_order_acquire)
                                                      ? kNoSuchTimingSource
                                                      : kTimingSourceFailed,
                                                  name.c_str()));
}

AbsoluteTimingSource::AbsoluteTimingSource(Clock clock) : ClockTimingSource(clock, "<absolute>")
{
    startTime.store(kEpoch1904Ns, std::memory_order_release);
}

ResettableTimingSource::ResettableTimingSource(Clock clock)
    : ClockTimingSource(clock, "<resettable>")
{
}

}  // namespace pxalarms
