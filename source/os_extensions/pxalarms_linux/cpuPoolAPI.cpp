// cpuPoolAPI.cpp - the CPU pool and SetPoolAffinityMask.
#include "cpuPoolAPI.h"

#include <unistd.h>

#include <cstdio>
#include <string>

#include "ControlGroups.h"
#include "platformSeams.h"
#include "processObjects.h"
#include "pxalarms.h"

namespace pxalarms {

namespace {

// The root CPU set's "tasks" file: without it no placement under the fixed
// hierarchy can succeed, and every processor assignment would fail.
bool libraryHierarchyExists()
{
    const std::string tasks =
        std::string(kCGroupsBaseDir) + "/" + kCGroupsCPUSetName + "/" + kCGroupsTasksFile;
    return access(platformPath(tasks.c_str()).c_str(), F_OK) == 0;
}

}  // namespace

CpuPool::CpuPool() : cgroups_(nullptr), openStatus_(kCGroupsOK)
{
    int status = kCGroupsOK;
    cgroups_ = CGroupsOpen(&status);
    // Where cpuset is mounted elsewhere (the usual layout today) the library
    // behaves as if no control groups existed, so loops still start.
    if (cgroups_ != nullptr && !libraryHierarchyExists()) {
        CGroupsClose(cgroups_);
        cgroups_ = nullptr;
        status = kCGroupsNoSuchFile;
    }
    openStatus_ = status;
    if (openStatus_ != kCGroupsOK) {
        std::printf("pxalarms: unable to open cgroups, CPU pools will not be supported (%d)\n",
                    static_cast<int>(openStatus_));
        std::fflush(stdout);
    }
}

CpuPool::~CpuPool()
{
    if (cgroups_ != nullptr)
        CGroupsClose(cgroups_);
}

int CpuPool::addToTimedStructuresGroup(int threadId)
{
    if (cgroups_ == nullptr)
        return kCGroupsOK;
    return CGroupsCPUAcctAddTask(cgroups_, kTimedStructures_CPUAcct, threadId);
}

int CpuPool::moveToCpuSet(int cpuset, int threadId)
{
    if (cgroups_ == nullptr)
        return kCGroupsOK;
    return CGroupsCPUSetAddTask(cgroups_, cpuset, threadId);
}

int CpuPool::setCpuSetMask(int cpuset, unsigned int mask)
{
    return CGroupsCPUSetSetMask(cgroups_, cpuset, mask, nullptr);
}

}  // namespace pxalarms

extern "C" void SetPoolAffinityMask__DRAVICON_pxalarms(uint32_t pool, uint32_t mask)
{
    pxalarms::CpuPool& cpuPool = *pxalarms::g_cpuPool;
    if (cpuPool.openStatus() != kCGroupsOK)
        return;
    int status = kCGroupsNoSuchFile;
    // An unknown pool is the caller's mistake, but stopping a running control
    // system for it would be worse than refusing it with a message.
    if (pool == pxalarms::kSystemPool)
        status = cpuPool.setCpuSetMask(kSystem_CPUSet, mask);
    else if (pool == pxalarms::kTimedLoopPool)
        status = cpuPool.setCpuSetMask(kTimedLoop_CPUSet, mask);
    if (status != kCGroupsOK) {
        std::printf("pxalarms: unable to configure CPU pool (%d)\n", status);
        std::fflush(stdout);
    }
}
