// Exhausted memory in the creation paths: every allocation is made to fail
// in turn; the host must see code 2 and nothing may be half-registered or
// leaked (AddressSanitizer checks the leaks at exit).
#include <gtest/gtest.h>

#include <atomic>
#include <cstdlib>
#include <new>

#include "hostSubstitute.h"
#include "processObjects.h"
#include "testSupport.h"

namespace {
// Allocations left before one fails; negative means never.
std::atomic<long> allocationsBeforeFailure{-1};

void* allocate(size_t size)
{
    long left = allocationsBeforeFailure.load(std::memory_order_relaxed);
    while (left >= 0) {
        if (allocationsBeforeFailure.compare_exchange_weak(left, left - 1)) {
            if (left == 0)
                throw std::bad_alloc();
            break;
        }
    }
    if (void* p = std::malloc(size == 0 ? 1 : size))
        return p;
    throw std::bad_alloc();
}

// Fails the n-th allocation from now while it lives.
struct FailingAllocation {
    explicit FailingAllocation(long n) { allocationsBeforeFailure.store(n); }
    ~FailingAllocation() { allocationsBeforeFailure.store(-1); }
};

uint32_t refs(const char* name)
{
    return pxalarms::g_timingSourceManager->referenceCount(name);
}

void deleteSource(const char* name)
{
    TSrcRef ref{0, 0, 0};
    TSrcDeleteName__DRAVICON_pxalarms(name, &ref, nullptr);
}
}  // namespace

void* operator new(size_t size)
{
    return allocate(size);
}
void* operator new[](size_t size)
{
    return allocate(size);
}
void operator delete(void* p) noexcept
{
    std::free(p);
}
void operator delete[](void* p) noexcept
{
    std::free(p);
}
void operator delete(void* p, size_t) noexcept
{
    std::free(p);
}
void operator delete[](void* p, size_t) noexcept
{
    std::free(p);
}

TEST(OutOfMemory, FailedCreationRegistersNothing)
{
    const char* name = "a name long enough to need its own heap block";
    bool completed = false;
    for (long n = 0; n < 50 && !completed; ++n) {
        testsupport::HostError error;
        TSrcRef ref{0, 0, 0};
        {
            FailingAllocation failing(n);
            TSrcNewTickTimer__DRAVICON_pxalarms(name, &ref, error.get());
        }
        if (error.cluster.status == 0) {
            completed = true;
            EXPECT_EQ(refs(name), 1u);
            deleteSource(name);
        } else {
            EXPECT_EQ(error.cluster.code, 2) << "allocation " << n;
            EXPECT_EQ(error.cluster.source, nullptr) << "no text on exhausted memory";
            EXPECT_EQ(refs(name), 0u) << "half-registered after failing allocation " << n;
        }
    }
    EXPECT_TRUE(completed);
}

TEST(OutOfMemory, FailedCleanupRegistrationKeepsTheSource)
{
    char name[] = "a cleanup name long enough to need its own heap block";
    bool completed = false;
    for (long n = 0; n < 50 && !completed; ++n) {
        testsupport::HostError error;
        {
            FailingAllocation failing(n);
            TSrcNewTSCPX__DRAVICON_pxalarms(name, nullptr, 1, error.get());
        }
        const int pending = hostsub::pendingCleanupProcs();
        if (error.cluster.status == 0) {
            completed = true;
            EXPECT_EQ(pending, 1);
        } else {
            EXPECT_EQ(error.cluster.code, 2) << "allocation " << n;
            EXPECT_EQ(pending, 0);
        }
        hostsub::runCleanupProcs();
        // Without a registered cleanup the program still holds its reference.
        if (refs(name) == 1)
            deleteSource(name);
        EXPECT_EQ(refs(name), 0u);
    }
    EXPECT_TRUE(completed);
}

TEST(OutOfMemoryDeathTest, FailureWithoutARecordStops)
{
    EXPECT_DEATH(
        {
            FailingAllocation failing(0);
            TSrcNewTickTimer__DRAVICON_pxalarms("oom", nullptr, nullptr);
        },
        "TSrcNewTickTimer__DRAVICON_pxalarms: Assertion `\\(error\\) != __null' failed");
}
