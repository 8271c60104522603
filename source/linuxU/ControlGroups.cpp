// ControlGroups.cpp - discovery of the control-group subsystems and writes
// into the library's fixed hierarchy.
#include "ControlGroups.h"

#include <errno.h>
#include <mntent.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <atomic>
#include <map>
#include <new>
#include <string>

#include "platformSeams.h"
#include "pxAssert.h"

const char* const kCGroupsBaseDir = "/dev/cgroup";
const char* const kCGroupsTasksFile = "tasks";
const char* const kCGroupsCpusFile = "cpus";
const char* const kCGroupsCPUAcctName = "cpuacct";
const char* const kCGroupsUsageFile = "cpuacct.usage_percpu";
const char* const kCGroupsCPUSetName = "cpuset";
const char* const kCGroupsSubsysList = "/proc/cgroups";
const char* const kCGroupsMountTable = "/proc/mounts";
const char* const kCGroupsMountType = "cgroup";

namespace {

struct CGroupsSubsysInfo {
    int32_t hierarchy;
    int32_t numCgroups;
    int32_t enabled;
};

struct CGroups {
    std::map<std::string, std::string> mounts;
    std::map<std::string, CGroupsSubsysInfo> subsystems;
};

const char* const kCPUSetGroups[kNum_CPUSets] = {"", "system_set", "Plexavo_tl_set"};
const char* const kCPUAcctGroups[kNum_CPUAccts] = {
    "other_group", "Plexavo_Timed-Structures_group", "Plexavo_Time-Critical_group", "ISR_group"};

// Written by whichever thread asks first; every writer stores the same value.
std::atomic<int> numCPUsCache{0};

CGroups* handleOf(void* cgroups)
{
    return static_cast<CGroups*>(cgroups);
}

// base/subsystem/group/file, an empty group and its slash left out.  The
// directory the subsystem is really mounted on is deliberately not used:
// the library's hierarchy is always the fixed one.
std::string groupFilePath(const char* subsystem, const char* group, const char* file)
{
    std::string path(kCGroupsBaseDir);
    path += '/';
    path += subsystem;
    if (group[0] != '\0') {
        path += '/';
        path += group;
    }
    path += '/';
    path += file;
    return pxalarms::platformPath(path.c_str());
}

int openFailureCode(int error)
{
    if (error == EPERM)
        return kCGroupsPermissionDenied;
    if (error == ENOENT)
        return kCGroupsNoSuchFile;
    return kCGroupsFailed;
}

// Control-group files take the whole value in one write(), and the kernel
// refuses a bad thread id or processor list only there; with stdio that
// happens at fflush/fclose, so their results count as the write's.
int writeAndClose(FILE* file, const char* text)
{
    int code = fprintf(file, "%s", text) < 0 ? kCGroupsFailed : kCGroupsOK;
    if (fflush(file) != 0)
        code = kCGroupsFailed;
    if (fclose(file) != 0)
        code = kCGroupsFailed;
    return code;
}

int addTask(void* cgroups, const char* subsystem, const char* group, int threadId)
{
    CGroups* handle = handleOf(cgroups);
    PX_ASSERT(handle != NULL);
    if (handle->mounts.count(subsystem) == 0)
        return kCGroupsNotMounted;
    if (handle->subsystems.count(subsystem) == 0)
        return kCGroupsNotListed;
    const std::string path = groupFilePath(subsystem, group, kCGroupsTasksFile);
    FILE* file = fopen(path.c_str(), "w");
    if (file == NULL)
        return openFailureCode(errno);
    char text[16];
    snprintf(text, sizeof text, "%d", threadId);
    return writeAndClose(file, text);
}

bool readSubsystems(CGroups& handle)
{
    FILE* file = fopen(pxalarms::platformPath(kCGroupsSubsysList).c_str(), "r");
    if (file == NULL)
        return false;
    char* header = NULL;
    size_t headerSize = 0;
    const bool haveHeader = getline(&header, &headerSize, file) >= 0;
    free(header);
    if (!haveHeader) {
        fclose(file);
        return false;
    }
    for (;;) {
        char* name = NULL;
        CGroupsSubsysInfo info{0, 0, 0};
        const int fields =
            fscanf(file, "%ms %d %d %d", &name, &info.hierarchy, &info.numCgroups, &info.enabled);
        if (fields == EOF) {
            free(name);
            break;
        }
        // A record whose numbers do not parse proves nothing about the
        // subsystem; %ms always consumes a word, so the loop moves on.
        if (fields == 4)
            handle.subsystems[name] = info;
        free(name);
    }
    fclose(file);
    return true;
}

bool readMounts(CGroups& handle)
{
    FILE* file = setmntent(pxalarms::platformPath(kCGroupsMountTable).c_str(), "r");
    if (file == NULL)
        return false;
    mntent entry;
    char buffer[4096];
    // getmntent_r skips lines it cannot split into fields.
    while (getmntent_r(file, &entry, buffer, sizeof buffer) != NULL) {
        if (strcmp(entry.mnt_type, kCGroupsMountType) != 0)
            continue;
        for (const auto& subsystem : handle.subsystems) {
            if (hasmntopt(&entry, subsystem.first.c_str()) != NULL)
                handle.mounts[subsystem.first] = entry.mnt_dir;
        }
    }
    endmntent(file);
    return true;
}

}  // namespace

void* CGroupsOpen(int* status)
{
    CGroups* handle = NULL;
    bool opened = false;
    // Runs at library load: exhausted memory means no control groups, not
    // an exception escaping a load-time constructor.
    try {
        handle = new CGroups;
        opened = readSubsystems(*handle) && readMounts(*handle);
    } catch (const std::bad_alloc&) {
        opened = false;
    }
    if (!opened) {
        delete handle;
        handle = NULL;
    }
    if (status != NULL)
        *status = opened ? kCGroupsOK : kCGroupsFailed;
    return handle;
}

void CGroupsClose(void* cgroups)
{
    delete handleOf(cgroups);
}

int CGroupsCPUSetAddTask(void* cgroups, int cpuset, int threadId)
{
    if (cpuset < 0 || cpuset >= kNum_CPUSets)
        return kCGroupsNoSuchFile;
    return addTask(cgroups, kCGroupsCPUSetName, kCPUSetGroups[cpuset], threadId);
}

int CGroupsCPUAcctAddTask(void* cgroups, int group, int threadId)
{
    if (group < 0 || group >= kNum_CPUAccts)
        return kCGroupsNoSuchFile;
    return addTask(cgroups, kCGroupsCPUAcctName, kCPUAcctGroups[group], threadId);
}

int CGroupsCPUSetSetMask(void*, int cpuset, unsigned int mask, unsigned int* out)
{
    PX_ASSERT(cpuset != kRoot_CPUSet);
    const int n = CGroupsNumCPUs();
    if (mask == 0 || n > 32 || (n < 32 && (mask >> n) != 0))
        return kCGroupsBadMask;

    // 32 entries of at most "31," fit easily.
    char text[128];
    size_t length = 0;
    text[0] = '\0';
    for (int i = 0; i < n; ++i) {
        if ((mask >> i) & 1u)
            length += static_cast<size_t>(
                snprintf(text + length, sizeof text - length, "%d,", i));
    }

    if (cpuset < 0 || cpuset >= kNum_CPUSets)
        return kCGroupsNoSuchFile;
    const std::string path = groupFilePath(kCGroupsCPUSetName, kCPUSetGroups[cpuset], kCGroupsCpusFile);
    FILE* file = fopen(path.c_str(), "w");
    if (file == NULL)
        return openFailureCode(errno);
    if (out != NULL)
        *out = 0;
    return writeAndClose(file, text);
}

int CGroupsCPUAcctUsageGet(void*, int group, int count, uint64_t* usage)
{
    if (group < 0 || group >= kNum_CPUAccts)
        return kCGroupsNoSuchFile;
    PX_ASSERT(count >= 0 && (count == 0 || usage != NULL));
    const std::string path = groupFilePath(kCGroupsCPUAcctName, kCPUAcctGroups[group], kCGroupsUsageFile);
    FILE* file = fopen(path.c_str(), "r");
    if (file == NULL) {
        perror("CGroupsCPUAcctUsageGet failed to open file");
        return kCGroupsFailed;
    }
    int code = kCGroupsOK;
    for (int i = 0; i < count; ++i) {
        unsigned long long value = 0;
        if (fscanf(file, "%llu ", &value) != 1) {
            // Fewer values than asked for: the caller's array is not filled.
            code = kCGroupsFailed;
            break;
        }
        usage[i] = value;
    }
    fclose(file);
    return code;
}

int CGroupsNumCPUs(void)
{
    int count = numCPUsCache.load(std::memory_order_relaxed);
    if (count == 0) {
        count = static_cast<int>(sysconf(_SC_NPROCESSORS_ONLN));
        numCPUsCache.store(count, std::memory_order_relaxed);
    }
    return count;
}

void CGroupsSetNumCPUsForTesting(int count)
{
    numCPUsCache.store(count, std::memory_order_relaxed);
}

int CGroupsIsListed(void* cgroups, const char* subsystem)
{
    return handleOf(cgroups)->subsystems.count(subsystem) != 0;
}

int CGroupsIsMounted(void* cgroups, const char* subsystem)
{
    return handleOf(cgroups)->mounts.count(subsystem) != 0;
}
