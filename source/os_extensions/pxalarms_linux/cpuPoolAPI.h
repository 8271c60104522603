// cpuPoolAPI.h - the CPU pool: the library's one door to the control groups.
//
// CpuPool (process-wide g_cpuPool, the first object created at load) opens
// the control groups once and keeps the handle; activation puts threads into
// the timed-structures accounting group, processor assignment moves them
// between CPU sets, and SetPoolAffinityMask__DRAVICON_pxalarms sets a pool's
// processors.  Where the groups could not be opened, or the library's
// hierarchy under "/dev/cgroup" does not exist, a message says so once at
// load and every placement is skipped with success, so processor assignment
// is affinity alone.  The handle is read-only after load: no lock.
#pragma once

#include <cstdint>

namespace pxalarms {

// The host's names for the two pools.
constexpr uint32_t kSystemPool = 0x12345402;
constexpr uint32_t kTimedLoopPool = 0x12345403;

class CpuPool {
public:
    CpuPool();
    ~CpuPool();
    CpuPool(const CpuPool&) = delete;
    CpuPool& operator=(const CpuPool&) = delete;

    int32_t openStatus() const { return openStatus_; }
    // Both return 0 without doing anything while the pool is not open.
    int addToTimedStructuresGroup(int threadId);
    int moveToCpuSet(int cpuset, int threadId);
    int setCpuSetMask(int cpuset, unsigned int mask);

private:
    void* cgroups_;
    int32_t openStatus_;
};

}  // namespace pxalarms
