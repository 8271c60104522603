// gencodeCallbacks.cpp - exported functions called by generated code:
// the alarm table's entry points.
#include "gencodeCallbacks.h"

#include "catchFrames.h"
#include "processObjects.h"
#include "pxAssert.h"
#include "schedExceptions.h"

using namespace pxalarms;

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

}  // extern "C"
