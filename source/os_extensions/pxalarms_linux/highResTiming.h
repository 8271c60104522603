// highResTiming.h - time conversions shared by every timing source, and the
// plain waits on CLOCK_MONOTONIC exported to generated code.
//
// All internal times are signed 64-bit nanoseconds.  The waits sleep to an
// absolute time, so repeated waits for the next multiple never drift.
#pragma once

#include <time.h>

#include <cstdint>

namespace pxalarms {

constexpr int64_t kNsPerSecond = 1000000000;
constexpr int64_t kNsPerUs = 1000;

inline int64_t toNanoseconds(const timespec& ts)
{
    return static_cast<int64_t>(ts.tv_sec) * kNsPerSecond + static_cast<int64_t>(ts.tv_nsec);
}

// Keeps the full 64-bit seconds where time_t has them, so deadlines after
// 2038 survive on 32-bit targets built with 64-bit time_t.
timespec toTimespec(const int64_t& ns);

// The microsecond waits widen before multiplying: 5,000,000 us is 5 s, not
// 5 s modulo 2^32 ns.
inline uint64_t microsecondsToNanoseconds(uint32_t us)
{
    return static_cast<uint64_t>(us) * kNsPerUs;
}

// Current time of the given clock in nanoseconds.
int64_t nowNs(clockid_t clock);

// Sleeps until now + ns, or until the next multiple of ns on CLOCK_MONOTONIC,
// and returns the absolute target.  Signals do not shorten the wait.
int64_t relWaitNS(const uint64_t& ns, bool toNextMultiple);

}  // namespace pxalarms
