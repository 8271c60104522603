// highResTiming.cpp - time conversions and the exported CLOCK_MONOTONIC waits.
#include "highResTiming.h"

#include <cerrno>
#include <cstdlib>

#include "pxAssert.h"
#include "pxalarms.h"

namespace pxalarms {

namespace {
// Returned by a sleep the kernel cut short (ERESTARTNOHAND).
constexpr int kRestartNoHand = 514;
}  // namespace

timespec toTimespec(const int64_t& ns)
{
    const lldiv_t parts = lldiv(ns, kNsPerSecond);
    timespec ts;
    ts.tv_sec = static_cast<time_t>(parts.quot);
    ts.tv_nsec = static_cast<long>(parts.rem);
    return ts;
}

int64_t nowNs(clockid_t clock)
{
    timespec ts;
    clock_gettime(clock, &ts);
    return toNanoseconds(ts);
}

int64_t relWaitNS(const uint64_t& ns, bool toNextMultiple)
{
    uint64_t target;
    if (toNextMultiple) {
        if (ns == 0)
            return 0;
        const uint64_t now = static_cast<uint64_t>(nowNs(CLOCK_MONOTONIC));
        target = (now + ns - 1) / ns * ns;
    } else {
        target = static_cast<uint64_t>(nowNs(CLOCK_MONOTONIC)) + ns;
        if (ns == 0)
            return static_cast<int64_t>(target);
    }
    const timespec wake = toTimespec(static_cast<int64_t>(target));
    int retval;
    do {
        retval = clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &wake, nullptr);
    } while (retval == EINTR || retval == kRestartNoHand);
    PX_ASSERT(retval == 0);
    return static_cast<int64_t>(target);
}

}  // namespace pxalarms

using pxalarms::microsecondsToNanoseconds;
using pxalarms::relWaitNS;

extern "C" {

int32_t SupportsTSC__DRAVICON_pxalarms(void)
{
    timespec res;
    if (clock_getres(CLOCK_MONOTONIC, &res) != 0)
        return 0;
    return res.tv_nsec == 1 ? 1 : 0;
}

int64_t iTSC_WaitUntilNextMultipleMicroSeconds_C(uint32_t intervalUs)
{
    return relWaitNS(microsecondsToNanoseconds(intervalUs), true) / pxalarms::kNsPerUs;
}

int64_t iTSC_WaitUntilNextMultipleClocks_C(uint32_t intervalNs)
{
    return relWaitNS(intervalNs, true);
}

int64_t iTSC_WaitMicroSeconds_C(uint32_t durationUs)
{
    return relWaitNS(microsecondsToNanoseconds(durationUs), false) / pxalarms::kNsPerUs;
}

int64_t iTSC_WaitClocks_C(uint32_t durationNs)
{
    return relWaitNS(durationNs, false);
}

}  // extern "C"
