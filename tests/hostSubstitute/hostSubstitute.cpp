// hostSubstitute.cpp - host runtime substitute.
#include "hostSubstitute.h"

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <vector>

namespace hostsub {

namespace {

constexpr int kCalls = 4;
std::atomic<int> failures[kCalls];
std::atomic<int> calls[kCalls];

struct Cleanup {
    int32_t (*proc)(void*);
    void* context;
};
std::mutex cleanupMutex;
std::vector<Cleanup>& cleanups()
{
    static std::vector<Cleanup>* list = new std::vector<Cleanup>;  // outlives static teardown
    return *list;
}

// Each block carries its usable size in front, like the host's allocator.
struct BlockHeader {
    size_t size;
    size_t pad;
};

bool shouldFail(HostCall call)
{
    const int i = static_cast<int>(call);
    calls[i].fetch_add(1, std::memory_order_relaxed);
    int left = failures[i].load(std::memory_order_relaxed);
    while (left > 0) {
        if (failures[i].compare_exchange_weak(left, left - 1, std::memory_order_relaxed))
            return true;
    }
    return false;
}

void* newBlock(size_t size)
{
    auto* header = static_cast<BlockHeader*>(std::malloc(sizeof(BlockHeader) + size));
    if (header == nullptr)
        return nullptr;
    header->size = size;
    return header + 1;
}

BlockHeader* headerOf(void* block)
{
    return static_cast<BlockHeader*>(block) - 1;
}

UHandle newHandle(size_t size)
{
    void* block = newBlock(size);
    if (block == nullptr)
        return nullptr;
    auto handle = static_cast<UHandle>(std::malloc(sizeof(void*)));
    if (handle == nullptr) {
        std::free(headerOf(block));
        return nullptr;
    }
    *handle = block;
    return handle;
}

int32_t resizeHandle(UHandle handle, size_t size)
{
    auto* header =
        static_cast<BlockHeader*>(std::realloc(headerOf(*handle), sizeof(BlockHeader) + size));
    if (header == nullptr)
        return 2;
    header->size = size;
    *handle = header + 1;
    return 0;
}

}  // namespace

void failNext(HostCall call, int count)
{
    failures[static_cast<int>(call)].store(count, std::memory_order_relaxed);
}

int callCount(HostCall call)
{
    return calls[static_cast<int>(call)].load(std::memory_order_relaxed);
}

void disposeHandle(UHandle handle)
{
    if (handle == nullptr)
        return;
    if (*handle != nullptr)
        std::free(headerOf(*handle));
    std::free(handle);
}

size_t handleSize(UHandle handle)
{
    return headerOf(*handle)->size;
}

int runCleanupProcs()
{
    std::vector<Cleanup> due;
    {
        std::lock_guard<std::mutex> lock(cleanupMutex);
        due.swap(cleanups());
    }
    for (const Cleanup& c : due)
        c.proc(c.context);
    return static_cast<int>(due.size());
}

int pendingCleanupProcs()
{
    std::lock_guard<std::mutex> lock(cleanupMutex);
    return static_cast<int>(cleanups().size());
}

void reset()
{
    for (int i = 0; i < kCalls; ++i) {
        failures[i].store(0);
        calls[i].store(0);
    }
}

std::string text(LStr** handle)
{
    if (handle == nullptr || *handle == nullptr)
        return std::string();
    return std::string(reinterpret_cast<const char*>((*handle)->str),
                       static_cast<size_t>((*handle)->cnt));
}

}  // namespace hostsub

using hostsub::HostCall;
using hostsub::shouldFail;

extern "C" {

int32_t NumericArrayResize(int32_t typeCode, int32_t numDims, UHandle* handle, size_t numElems)
{
    // Only one-dimensional byte arrays are ever asked for.
    if (shouldFail(HostCall::kNumericArrayResize) || typeCode != 5 || numDims != 1 ||
        handle == nullptr)
        return 1;
    const size_t bytes = sizeof(int32_t) + numElems;
    if (*handle == nullptr) {
        UHandle fresh = hostsub::newHandle(bytes);
        if (fresh == nullptr)
            return 2;
        *static_cast<int32_t*>(*fresh) = 0;
        *handle = fresh;
        return 0;
    }
    return hostsub::resizeHandle(*handle, bytes);
}

UHandle DSNewHandle(size_t size)
{
    if (shouldFail(HostCall::kDSNewHandle))
        return nullptr;
    UHandle handle = hostsub::newHandle(size);
    if (handle != nullptr)
        std::memset(*handle, 0, size);
    return handle;
}

int32_t DSSetHandleSize(UHandle handle, size_t size)
{
    if (shouldFail(HostCall::kDSSetHandleSize) || handle == nullptr || *handle == nullptr)
        return 1;
    return hostsub::resizeHandle(handle, size);
}

int32_t RTSetCleanupProc(int32_t (*proc)(void*), void* context, int32_t mode)
{
    if (shouldFail(HostCall::kRTSetCleanupProc) || proc == nullptr || mode != 2)
        return 0;
    std::lock_guard<std::mutex> lock(hostsub::cleanupMutex);
    hostsub::cleanups().push_back({proc, context});
    return 1;
}

}  // extern "C"
