// Wake-up lateness of a clock timing source's sleep against a bare
// clock_nanosleep(TIMER_ABSTIME) loop, measured in the same run, on the same
// thread and priority (SCHED_FIFO 80 when permitted), the two sleeps
// alternating period by period so both see the same machine.  Counters:
// median and 99th percentile lateness of each, and the ratios source/bare.
#include <benchmark/benchmark.h>
#include <pthread.h>
#include <sched.h>

#include <algorithm>
#include <vector>

#include "ClockTimingSources.h"
#include "highResTiming.h"
#include "processObjects.h"

using namespace pxalarms;

namespace {

constexpr int64_t kPeriodNs = 500000;  // 0.5 ms

double percentile(std::vector<int64_t> values, double p)
{
    std::sort(values.begin(), values.end());
    return static_cast<double>(values[static_cast<size_t>(p * static_cast<double>(values.size() - 1))]);
}

class RealTimePriority {
public:
    RealTimePriority()
    {
        sched_param param{};
        param.sched_priority = 80;
        active_ = pthread_setschedparam(pthread_self(), SCHED_FIFO, &param) == 0;
    }
    ~RealTimePriority()
    {
        sched_param param{};
        if (active_)
            pthread_setschedparam(pthread_self(), SCHED_OTHER, &param);
    }
    bool active() const { return active_; }

private:
    bool active_;
};

void BM_WakeUpLateness(benchmark::State& state)
{
    RealTimePriority priority;
    PerThreadData record;
    record.setState(StructureState::kRunning);
    currentStructureKey->set(&record);
    ResettableTimingSource source(Clock::kMicroseconds);
    const int64_t ticksPerPeriod = kPeriodNs / 1000;

    std::vector<int64_t> sourceLateNs;
    std::vector<int64_t> bareLateNs;
    sourceLateNs.reserve(100000);
    bareLateNs.reserve(100000);
    for (auto _ : state) {
        const int64_t sourceStartNs = nowNs(CLOCK_REALTIME);
        source.reset(sourceStartNs);
        source.waitUntilTick(ticksPerPeriod, 0);
        sourceLateNs.push_back(nowNs(CLOCK_REALTIME) - (sourceStartNs + kPeriodNs));

        const int64_t bareDeadlineNs = nowNs(CLOCK_REALTIME) + kPeriodNs;
        const timespec wake = toTimespec(bareDeadlineNs);
        while (clock_nanosleep(CLOCK_REALTIME, TIMER_ABSTIME, &wake, nullptr) != 0) {
        }
        bareLateNs.push_back(nowNs(CLOCK_REALTIME) - bareDeadlineNs);
    }
    currentStructureKey->set(nullptr);

    const double sourceMedian = percentile(sourceLateNs, 0.5);
    const double bareMedian = percentile(bareLateNs, 0.5);
    const double sourceP99 = percentile(sourceLateNs, 0.99);
    const double bareP99 = percentile(bareLateNs, 0.99);
    state.counters["source_median_ns"] = sourceMedian;
    state.counters["bare_median_ns"] = bareMedian;
    state.counters["source_p99_ns"] = sourceP99;
    state.counters["bare_p99_ns"] = bareP99;
    state.counters["median_ratio"] = sourceMedian / std::max(bareMedian, 1.0);
    state.counters["p99_ratio"] = sourceP99 / std::max(bareP99, 1.0);
    state.counters["sched_fifo"] = priority.active() ? 1 : 0;
}
BENCHMARK(BM_WakeUpLateness)->Iterations(4000)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
