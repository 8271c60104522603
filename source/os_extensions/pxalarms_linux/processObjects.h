// processObjects.h - the library's process-wide objects and their one owner.
//
// Each object lives in a ProcessWide<T> slot with constant initialisation, so
// no static-initialiser order decides anything.  loadProcessObjects() builds
// them in dependency order when the library is loaded and
// unloadProcessObjects() destroys them in reverse order at unload:
//   CPU pool, trace marker, alarm table, timing-source registry,
//   start-group manager, current-structure key, the two absolute clocks, priority mapper.
// Later subsystems add their objects to the same list.
#pragma once

#include <new>
#include <utility>

#include "AlarmStartGroupManager.h"
#include "ClockTimingSources.h"
#include "PerThreadData.h"
#include "TicketList.h"
#include "TimingSourceManager.h"
#include "cpuPoolAPI.h"
#include "priorityMapper.h"
#include "pxAssert.h"
#include "traceToolAPI.h"

namespace pxalarms {

template <class T>
class ProcessWide {
public:
    constexpr ProcessWide() = default;
    ProcessWide(const ProcessWide&) = delete;
    ProcessWide& operator=(const ProcessWide&) = delete;

    template <class... Args>
    void create(Args&&... args)
    {
        PX_ASSERT(!alive_);
        new (&storage_) T(std::forward<Args>(args)...);
        alive_ = true;
    }
    void destroy()
    {
        if (alive_) {
            get().~T();
            alive_ = false;
        }
    }
    T& get() { return *std::launder(reinterpret_cast<T*>(&storage_)); }
    T& operator*() { return get(); }
    T* operator->() { return &get(); }

private:
    alignas(T) unsigned char storage_[sizeof(T)]{};
    bool alive_ = false;
};

using AlarmTable = TicketList<short, PerThreadData>;
constexpr size_t kAlarmTableCapacity = 128;

extern ProcessWide<CpuPool> g_cpuPool;
extern ProcessWide<TraceMarker> g_traceMarker;
extern ProcessWide<AlarmTable> g_alarmTable;
extern ProcessWide<TimingSourceManager> g_timingSourceManager;
extern ProcessWide<AlarmStartGroupManager> g_startGroupManager;
extern ProcessWide<CurrentStructureKey> currentStructureKey;
extern ProcessWide<AbsoluteTimingSource> absoluteMsSource;
extern ProcessWide<AbsoluteTimingSource> absoluteUsSource;
extern ProcessWide<PriorityMapper> g_priorityMapper;

void loadProcessObjects();
void unloadProcessObjects();

}  // namespace pxalarms
