// processObjects.cpp - creation and destruction of the process-wide objects.
#include "processObjects.h"

namespace pxalarms {

ProcessWide<TraceMarker> g_traceMarker;
ProcessWide<AlarmTable> g_alarmTable;
ProcessWide<CurrentStructureKey> currentStructureKey;

void loadProcessObjects()
{
    g_traceMarker.create();
    g_alarmTable.create(kAlarmTableCapacity);
    currentStructureKey.create();
}

void unloadProcessObjects()
{
    currentStructureKey.destroy();
    g_alarmTable.destroy();
    g_traceMarker.destroy();
}

namespace {
// Priority 101 runs before any default-priority constructor of the host
// process that could call into the library.
__attribute__((constructor(101))) void onLibraryLoad()
{
    loadProcessObjects();
}
__attribute__((destructor(101))) void onLibraryUnload()
{
    unloadProcessObjects();
}
}  // namespace

}  // namespace pxalarms
