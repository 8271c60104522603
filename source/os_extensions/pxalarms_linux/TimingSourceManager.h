// TimingSourceManager.h - the process-wide registry of named timing sources.
//
// Maps a name (exact bytes) to a source and the number of references held on
// it: one per creation by the host, one per structure active on it.  The
// last release destroys the source and frees the name.  registryMutex (PI)
// guards the map; a source's abort() and destructor run under it and never
// call back into the registry.  Lock order: registryMutex, then a source's
// own mutex.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>

#include "Mutex.h"
#include "TimingSource.h"
#include "pxAssert.h"

namespace pxalarms {

class TimingSourceManager {
public:
    TimingSourceManager() = default;
    ~TimingSourceManager();
    TimingSourceManager(const TimingSourceManager&) = delete;
    TimingSourceManager& operator=(const TimingSourceManager&) = delete;

    // Registers a new source with one reference; the name must be free.
    void addTSrc(const std::string& name, TimingSource* tSrc);
    // One more reference on a registered source, or null.
    TimingSource* acquireTSrc(const std::string& name);
    // Acquires the source registered under `name`, or registers the one
    // `create` builds, in one step under the lock, so two threads creating
    // the same name get one source with two references.
    template <class Create>
    TimingSource* acquireOrAddTSrc(const std::string& name, Create&& create)
    {
        MutexLock lock(registryMutex);
        auto it = sources_.lower_bound(name);
        if (it != sources_.end() && it->first == name) {
            ++it->second.refCount;
            return it->second.tSrc;
        }
        // Either step may throw bad_alloc; the source stays owned here until
        // the map holds it, so nothing is left half-registered.
        std::unique_ptr<TimingSource> source = create();
        PX_ASSERT(source.get() != NULL);
        sources_.emplace_hint(it, name, TSrcEntry{source.get(), 1});
        return source.release();
    }
    // Drop one reference; false when the name is not registered.
    bool releaseTSrc(const std::string& name) { return removeTSrcCommon(name, false); }
    // The same, and a source still in use afterwards is aborted.
    bool removeTSrc(const std::string& name) { return removeTSrcCommon(name, true); }

    // References held on `name`; 0 when it is not registered.
    uint32_t referenceCount(const std::string& name);

private:
    struct TSrcEntry {
        TimingSource* tSrc;
        uint32_t refCount;
    };

    bool removeTSrcCommon(const std::string& name, bool abortInUse);

    std::map<std::string, TSrcEntry> sources_;  // guarded by registryMutex
    Mutex registryMutex;
};

}  // namespace pxalarms
