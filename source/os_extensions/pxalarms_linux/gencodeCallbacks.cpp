// gencodeCallbacks.cpp - exported functions called by generated code:
// the alarm table's entry points and the named clock sources.
#include "gencodeCallbacks.h"

#include <memory>

#include "ClockTimingSources.h"
#include "catchFrames.h"
#include "processObjects.h"
#include "pxAssert.h"
#include "schedExceptions.h"

using namespace pxalarms;

void pxalarms::acquireOrCreateClockSource(const char* name, Clock clock)
{
    const std::string key(name);
    g_timingSourceManager->acquireOrAddTSrc(
        key, [&] { return std::make_unique<ClockTimingSource>(clock, key); });
}

extern "C" {

void AlarmNew__DRAVICON_pxalarms(const char* name, int32_t, AlarmRef* ref, ErrorCluster* error)
{
    PX_ASSERT(error != NULL);
    if (error->status)
        return;
    PX_ASSERT(ref != NULL);
    errorClusterFrame(error, [&] {
        const short ticket = g_alarmTable->buyTicketNoThrow();
        ref->ticket = ticket;
        if (ticket < 0)
            SetErrorCluster(error, CTimedStructureException(kTableFull, name));
    });
}

void AlarmDeleteRef__DRAVICON_pxalarms(AlarmRef* ref, ErrorCluster* error)
{
    PX_ASSERT(ref != NULL);
    if (g_alarmTable->returnTicket(ticketOf(ref)))
        return;
    PX_ASSERT(error != NULL);
    errorClusterFrame(error, [&] {
        SetErrorCluster(error, CTimedStructureException(kNoSuchStructure, "unknown"));
    });
}

void TSrcNewTickTimer__DRAVICON_pxalarms(const char* name, TSrcRef*, ErrorCluster* error)
{
    PX_ASSERT(name != NULL);
    errorClusterFrameRequiringReport(
        error, __func__, [&] { acquireOrCreateClockSource(name, Clock::kMilliseconds); });
}

void TSrcNewTSC__DRAVICON_pxalarms(const char* name, TSrcRef*, ErrorCluster* error)
{
    PX_ASSERT(name != NULL);
    errorClusterFrameRequiringReport(
        error, __func__, [&] { acquireOrCreateClockSource(name, Clock::kMicroseconds); });
}

void TSrcDeleteName__DRAVICON_pxalarms(const char* name, TSrcRef* ref, ErrorCluster* error)
{
    PX_ASSERT(ref != NULL);
    PX_ASSERT(name != NULL);
    errorClusterFrame(error, [&] {
        const std::string key(name);
        const bool found = ref->abortUsers != 0 ? g_timingSourceManager->removeTSrc(key)
                                                : g_timingSourceManager->releaseTSrc(key);
        if (!found && error != nullptr)
            SetErrorCluster(error, CTimingSourceException(kNoSuchTimingSource, name));
    });
}

}  // extern "C"
