// timedStructuresAPI.cpp - exported functions called by diagram nodes:
// the timing-source creation functions that register a host cleanup, and
// the synchronization-group functions (thin wrappers around the process-wide
// AlarmStartGroupManager, which takes its own lock).
#include <memory>
#include <new>
#include <stdexcept>
#include <string>

#include "ClockTimingSources.h"
#include "catchFrames.h"
#include "convertLStr.h"
#include "gencodeCallbacks.h"
#include "processObjects.h"
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

// A null argument is reported as code 42 where a record can carry the
// report; without one the assertion names the argument.
bool rejectedNull(const void* argument, const char* argumentName, ErrorCluster* error,
                  const char* function)
{
    if (argument != nullptr)
        return false;
    if (error == nullptr)
        assertionFailed(argumentName, __FILE__, __LINE__, function);
    error->status = 1;
    error->code = kOtherFailure;
    return true;
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

void AlarmAddToGroup__DRAVICON_pxalarms(const char* alarmName, LStr** groupName,
                                        int32_t timeoutMs, PXBoolean* allowMove,
                                        ErrorCluster* error)
{
    if (rejectedNull(alarmName, "alarmName", error, __func__) ||
        rejectedNull(allowMove, "allowMove", error, __func__))
        return;
    errorClusterFrameRequiringReport(error, __func__, [&] {
        g_startGroupManager->addAlarm(LStrToString(groupName), alarmName, timeoutMs,
                                      *allowMove != 0);
    });
}

void GetGroupMember__DRAVICON_pxalarms(LStr** groupName, int32_t* alarmIndex,
                                       LStr*** alarmNameOut, ErrorCluster* errorOut)
{
    if (rejectedNull(alarmIndex, "alarmIndex", errorOut, __func__) ||
        rejectedNull(alarmNameOut, "alarmNameOut", errorOut, __func__))
        return;
    errorClusterFrameRequiringReport(errorOut, "errorOut", __func__, [&] {
        const std::string group = LStrToString(groupName);
        if (*alarmIndex < 0)
            throw CSyncGroupException(kNoSuchStructure, group);
        std::string member;
        const int32_t result =
            g_startGroupManager->getAlarmAt(group, static_cast<size_t>(*alarmIndex), &member);
        if (result == kNoSuchStructure) {
            *alarmIndex = -1;  // the walk through the group is over
            return;
        }
        if (result != 0)
            throw CSyncGroupException(result, group);
        // A caller walking the group must not take the previous name for
        // this index.
        if (StringToLStr(alarmNameOut, member) == nullptr)
            throw std::bad_alloc();
    });
}

void ResetGroup__DRAVICON_pxalarms(LStr** groupName, ErrorCluster* errorOut)
{
    errorClusterFrameRequiringReport(errorOut, "errorOut", __func__, [&] {
        const std::string group = LStrToString(groupName);
        if (g_startGroupManager->resetGroup(group) == kGroupStarting)
            throw CSyncGroupException(kGroupStarting, group);
    });
}

void AbortGroup__DRAVICON_pxalarms(LStr** groupName, PXBoolean*, ErrorCluster* errorOut)
{
    PX_ASSERT(errorOut);
    errorClusterFrame(errorOut, [&] {
        const std::string group = LStrToString(groupName);
        // Members waiting without limit for a peer that will not come would
        // otherwise hang until the library is unloaded.
        g_startGroupManager->abortGroup(group);
        throw CSyncGroupException(kGroupAborted, group);
    });
}

}  // extern "C"
