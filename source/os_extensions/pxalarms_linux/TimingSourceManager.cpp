// TimingSourceManager.cpp - registry of named timing sources.
#include "TimingSourceManager.h"

#include "pxAssert.h"

namespace pxalarms {

TimingSourceManager::~TimingSourceManager()
{
    // At unload no structure runs any more; the sources left are the host's
    // undeleted ones, destroyed here so nothing leaks.
    for (auto& entry : sources_)
        delete entry.second.tSrc;
}

void TimingSourceManager::addTSrc(const std::string& name, TimingSource* tSrc)
{
    PX_ASSERT(tSrc != NULL);
    MutexLock lock(registryMutex);
    const bool inserted = sources_.emplace(name, TSrcEntry{tSrc, 1}).second;
    PX_ASSERT(inserted);
}

TimingSource* TimingSourceManager::acquireTSrc(const std::string& name)
{
    MutexLock lock(registryMutex);
    auto it = sources_.find(name);
    if (it == sources_.end())
        return nullptr;
    ++it->second.refCount;
    return it->second.tSrc;
}

bool TimingSourceManager::removeTSrcCommon(const std::string& name, bool abortInUse)
{
    MutexLock lock(registryMutex);
    auto it = sources_.find(name);
    if (it == sources_.end())
        return false;
    PX_ASSERT(it->second.refCount > 0);
    if (--it->second.refCount > 0) {
        if (abortInUse)
            it->second.tSrc->abort();
        return true;
    }
    delete it->second.tSrc;
    sources_.erase(it);
    return true;
}

uint32_t TimingSourceManager::referenceCount(const std::string& name)
{
    MutexLock lock(registryMutex);
    auto it = sources_.find(name);
    return it == sources_.end() ? 0 : it->second.refCount;
}

}  // namespace pxalarms
