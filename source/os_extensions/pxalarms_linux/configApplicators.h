// configApplicators.h - what a changed timing parameter does to the thread,
// and processor assignment.
//
// The period wait builds one ConfigApplicator per parameter on its stack and
// calls apply() only for a value that differs from the saved one
// (applyIfChanged), so an unchanged parameter costs a comparison and no
// system call.  PriorityApplicator remaps the thread (priorityMapper),
// AffinityApplicator assigns its processor, OffsetApplicator flags the
// schedule for recomputation, the NoOp applicators only accept.  All run on
// the structure's own thread; setThreadProcessor takes no lock.
#pragma once

#include <pthread.h>

#include <cstdint>

namespace pxalarms {

template <class T>
class ConfigApplicator {
public:
    virtual ~ConfigApplicator() = default;
    // 0 when the value was applied, else a host status code.
    virtual int32_t apply(T value) const = 0;
};

// Applies `value` only when it differs from `saved`, and saves it when the
// applicator accepts it.  Returns the applicator's status, 0 when unchanged.
template <class T>
inline int32_t applyIfChanged(const ConfigApplicator<T>& applicator, T value, T& saved)
{
    if (value == saved)
        return 0;
    const int32_t status = applicator.apply(value);
    if (status == 0)
        saved = value;
    return status;
}

class PriorityApplicator : public ConfigApplicator<int> {
public:
    PriorityApplicator(bool firstMapping, int32_t previousTlPrio)
        : firstMapping_(firstMapping), previousTlPrio_(previousTlPrio)
    {
    }
    // 0, -818 or -832 from the priority mapper.
    int32_t apply(int value) const override;

private:
    const bool firstMapping_;
    const int32_t previousTlPrio_;
};

class AffinityApplicator : public ConfigApplicator<int> {
public:
    explicit AffinityApplicator(int32_t threadId) : threadId_(threadId) {}
    // setThreadProcessor on the calling thread: 0 or -825.
    int32_t apply(int value) const override;

private:
    const int32_t threadId_;
};

class OffsetApplicator : public ConfigApplicator<long long> {
public:
    explicit OffsetApplicator(bool* offsetChanged);
    int32_t apply(long long value) const override;

private:
    bool* const offsetChanged_;
};

class NoOpApplicatorInt32 : public ConfigApplicator<int> {
public:
    int32_t apply(int) const override { return 0; }
};

class NoOpApplicatorUInt32 : public ConfigApplicator<unsigned int> {
public:
    int32_t apply(unsigned int) const override { return 0; }
};

class NoOpApplicatorInt64 : public ConfigApplicator<long long> {
public:
    int32_t apply(long long) const override { return 0; }
};

// Processor numbers.
constexpr int32_t kProcessorAutomatic = -2;
constexpr int32_t kProcessorUnset = -1;

// Places a thread: -2 lets it run on every online processor inside the
// timed-loop CPU set; 0..n-1 pins it to that processor in the root set.
// 0, or -825 for a processor at or above the online count (nothing changes),
// another negative number (moved to the root set, then refused), or a failed
// control-group move or affinity call.
int32_t setThreadProcessor(int32_t threadId, pthread_t thread, int32_t processor);

}  // namespace pxalarms
