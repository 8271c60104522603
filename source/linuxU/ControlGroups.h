// ControlGroups.h - a small C-style interface over the cpuset and cpuacct
// control-group file systems.
//
// CGroupsOpen discovers which subsystems the kernel lists and where they are
// mounted; the other calls write thread ids into a group's "tasks" file or a
// processor list into a CPU set's "cpus" file under the library's fixed
// hierarchy "/dev/cgroup" (noprefix file names).  The groups themselves are
// made by the system.  The maps are filled once by CGroupsOpen and only read
// afterwards, so no call takes a lock; every write opens, writes and closes
// its own file.  Fixed paths go through pxalarms::platformPath.
#pragma once

#include <stdint.h>

// Control-group status codes (the module's own, not the host's).
enum {
    kCGroupsOK = 0,
    kCGroupsFailed = 2,
    kCGroupsNotListed = 3,
    kCGroupsNotMounted = 8,
    kCGroupsPermissionDenied = 9,
    kCGroupsNoSuchFile = 10,
    kCGroupsBadMask = 11,
};

// CPU sets, by index.
enum { kRoot_CPUSet = 0, kSystem_CPUSet = 1, kTimedLoop_CPUSet = 2, kNum_CPUSets = 3 };

// CPU-accounting groups, by index.
enum {
    kOther_CPUAcct = 0,
    kTimedStructures_CPUAcct = 1,
    kTimeCritical_CPUAcct = 2,
    kISR_CPUAcct = 3,
    kNum_CPUAccts = 4
};

extern const char* const kCGroupsBaseDir;      // "/dev/cgroup"
extern const char* const kCGroupsTasksFile;    // "tasks"
extern const char* const kCGroupsCpusFile;     // "cpus"
extern const char* const kCGroupsCPUAcctName;  // "cpuacct"
extern const char* const kCGroupsUsageFile;    // "cpuacct.usage_percpu"
extern const char* const kCGroupsCPUSetName;   // "cpuset"
extern const char* const kCGroupsSubsysList;   // "/proc/cgroups"
extern const char* const kCGroupsMountTable;   // "/proc/mounts"
extern const char* const kCGroupsMountType;    // "cgroup"

// Returns the handle, or null with *status 2 when "/proc/cgroups" or
// "/proc/mounts" cannot be read.  status may be null.
void* CGroupsOpen(int* status);
// Null is accepted.
void CGroupsClose(void* cgroups);

int CGroupsCPUSetAddTask(void* cgroups, int cpuset, int threadId);
int CGroupsCPUAcctAddTask(void* cgroups, int group, int threadId);
// Never for kRoot_CPUSet (assertion): the root set's processors are the
// system's.  The mask is checked before any file is touched.
int CGroupsCPUSetSetMask(void* cgroups, int cpuset, unsigned int mask, unsigned int* out);
// Reads `count` per-processor usage values (ns) of an accounting group.
int CGroupsCPUAcctUsageGet(void* cgroups, int group, int count, uint64_t* usage);

// Online processors, read once and kept.
int CGroupsNumCPUs(void);

// Test seam: pretend the machine has `count` online processors (0 reads the
// real number again).  Only while no other thread uses the module.
void CGroupsSetNumCPUsForTesting(int count);

// Test seam: whether a subsystem is listed / mounted in an open handle.
int CGroupsIsListed(void* cgroups, const char* subsystem);
int CGroupsIsMounted(void* cgroups, const char* subsystem);
