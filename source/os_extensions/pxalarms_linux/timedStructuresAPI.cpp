// timedStructuresAPI.cpp - exported functions called by diagram nodes:
// the timing-source creation functions that register a host cleanup.
#include <memory>
#include <string>

#include "ClockTimingSources.h"
#include "catchFrames.h"
#include "gencodeCallbacks.h"
#include "pxAssert.h"

using namespace pxalarms;

namespace {

constexpr int32_t kCleanupMode = 2;

// The host calls this once with the pointer given at registration: it drops
// the reference that registration stood for, reporting nothing.
int32_t releaseOnCleanup(std::string* name)
{
    TSrcRef ref{0, 0, 0};
    TSrcDeleteName__DRAVICON_pxalarms(name->c_str(), &ref, nullptr);
    delete name;
    return 0;
}

int32_t releaseOnCleanupTrampoline(void* context)
{
    return releaseOnCleanup(static_cast<std::string*>(context));
}

// True when the host took the registration.  A refused registration frees
// its copy of the name at once instead of leaking it.
bool registerCleanup(const char* name)
{
    auto copy = std::make_unique<std::string>(name);
    if (RTSetCleanupProc(&releaseOnCleanupTrampoline, copy.get(), kCleanupMode) == 0)
        return false;
    copy.release();
    return true;
}

void createWithCleanup(const char* name, Clock clock, int32_t cleanupFlag, ErrorCluster* error)
{
    PX_ASSERT(error != NULL);
    PX_ASSERT(name != NULL);
    errorClusterFrame(error, [&] {
        acquireOrCreateClockSource(name, clock);
        PX_ASSERT(cleanupFlag == 1);
        registerCleanup(name);
    });
}

}  // namespace

extern "C" {

void TSrcNewTickTimerPX__DRAVICON_pxalarms(char* name, TSrcRef*, int32_t cleanupFlag,
                                           ErrorCluster* error)
{
    createWithCleanup(name, Clock::kMilliseconds, cleanupFlag, error);
}

void TSrcNewTSCPX__DRAVICON_pxalarms(char* name, TSrcRef*, int32_t cleanupFlag,
                                     ErrorCluster* error)
{
    createWithCleanup(name, Clock::kMicroseconds, cleanupFlag, error);
}

}  // extern "C"
