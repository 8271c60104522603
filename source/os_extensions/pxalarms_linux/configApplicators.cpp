// configApplicators.cpp - the applicators and processor assignment.
#include "configApplicators.h"

#include <sched.h>
#include <unistd.h>

#include "ControlGroups.h"
#include "priorityMapper.h"
#include "processObjects.h"
#include "pxAssert.h"
#include "schedExceptions.h"

namespace pxalarms {

namespace {

// cpu_set_t is glibc's 128-byte mask: 1024 processors.
constexpr int32_t kMaskProcessors = static_cast<int32_t>(sizeof(cpu_set_t) * 8);

int32_t onlineProcessors()
{
    return static_cast<int32_t>(sysconf(_SC_NPROCESSORS_ONLN));
}

}  // namespace

int32_t PriorityApplicator::apply(int value) const
{
    return setThreadPriority(value, firstMapping_, previousTlPrio_);
}

int32_t AffinityApplicator::apply(int value) const
{
    return setThreadProcessor(threadId_, pthread_self(), value);
}

OffsetApplicator::OffsetApplicator(bool* offsetChanged) : offsetChanged_(offsetChanged)
{
    PX_ASSERT(offsetChanged != NULL);
}

int32_t OffsetApplicator::apply(long long) const
{
    *offsetChanged_ = true;
    return 0;
}

int32_t setThreadProcessor(int32_t threadId, pthread_t thread, int32_t processor)
{
    cpu_set_t mask;
    CPU_ZERO(&mask);
    if (processor == kProcessorAutomatic) {
        const int32_t online = onlineProcessors();
        for (int32_t k = 0; k < online && k < kMaskProcessors; ++k)
            CPU_SET(k, &mask);
        // Affinity first, then confine to the timed-loop set.
        if (pthread_setaffinity_np(thread, sizeof mask, &mask) != 0)
            return kProcessorFailed;
        if (g_cpuPool->moveToCpuSet(kTimedLoop_CPUSet, threadId) != kCGroupsOK)
            return kProcessorFailed;
        return 0;
    }

    if (processor >= onlineProcessors())
        return kProcessorFailed;
    if (static_cast<uint32_t>(processor) < static_cast<uint32_t>(kMaskProcessors))
        CPU_SET(processor, &mask);
    // Into the root set first, so the chosen processor is allowed there.
    if (g_cpuPool->moveToCpuSet(kRoot_CPUSet, threadId) != kCGroupsOK)
        return kProcessorFailed;
    // An empty mask (a negative processor) is refused by the kernel.
    if (pthread_setaffinity_np(thread, sizeof mask, &mask) != 0)
        return kProcessorFailed;
    return 0;
}

}  // namespace pxalarms
