// processObjects.cpp - creation and destruction of the process-wide objects.
#include "processObjects.h"

namespace pxalarms {

ProcessWide<CpuPool> g_cpuPool;
ProcessWide<TraceMarker> g_traceMarker;
ProcessWide<AlarmTable> g_alarmTable;
ProcessWide<TimingSourceManager> g_timingSourceManager;
ProcessWide<AlarmStartGroupManager> g_startGroupManager;
ProcessWide<CurrentStructureKey> currentStructureKey;
ProcessWide<AbsoluteTimingSource> absoluteMsSource;
ProcessWide<AbsoluteTimingSource> absoluteUsSource;
ProcessWide<PriorityMapper> g_priorityMapper;

void loadProcessObjects()
{
    // Opens the control groups and says so once when they are unusable.
    g_cpuPool.create();
    g_traceMarker.create();
    g_alarmTable.create(kAlarmTableCapacity);
    g_timingSourceManager.create();
    g_startGroupManager.create();
    currentStructureKey.create();
    // The first clock source reads the wake-up system call number.
    absoluteMsSource.create(Clock::kMilliseconds);
    absoluteUsSource.create(Clock::kMicroseconds);
    g_priorityMapper.create();
}

void unloadProcessObjects()
{
    // Thread priorities stay as they are.
    g_priorityMapper.destroy();
    absoluteUsSource.destroy();
    absoluteMsSource.destroy();
    // A later load reads the wake-up system call number afresh.
    testing::forgetWakeUpSyscallNumber();
    currentStructureKey.destroy();
    // Members still waiting to start are released with a failure.
    g_startGroupManager.destroy();
    g_timingSourceManager.destroy();
    g_alarmTable.destroy();
    g_traceMarker.destroy();
    g_cpuPool.destroy();
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
