// Clock timing sources: tick arithmetic, sleeps, time-outs and aborts.
#include <gtest/gtest.h>
#include <pthread.h>

#include <atomic>
#include <chrono>
#include <random>
#include <thread>

#include "ClockTimingSources.h"
#include "highResTiming.h"
#include "processObjects.h"
#include "testSupport.h"

using namespace pxalarms;

namespace {

constexpr int64_t kMs = 1000000;

int64_t realtimeNs()
{
    return nowNs(CLOCK_REALTIME);
}

// Gives the calling thread a structure record, as activation would.
struct CurrentRecord {
    PerThreadData record;
    CurrentRecord()
    {
        record.setState(StructureState::kRunning);
        currentStructureKey->set(&record);
    }
    ~CurrentRecord() { currentStructureKey->set(nullptr); }
};

void abortStructure(PerThreadData& record, TimingSource& source)
{
    record.setState(StructureState::kAborted);
    source.wakeThread(&record);
}

}  // namespace

TEST(ClockTimingSource, TicksCountFromStartAndTruncateTowardZero)
{
    ResettableTimingSource ms(Clock::kMilliseconds);
    EXPECT_EQ(ms.getTick(12345), 0) << "a source that has not started is at tick 0";

    const int64_t start = 1700000000LL * kNsPerSecond;
    ms.reset(start);
    EXPECT_EQ(ms.getTick(start + 2999999), 2);
    EXPECT_EQ(ms.getTick(start - 1), 0) << "just before tick 0 is not tick -1";
    EXPECT_EQ(ms.getTick(start + 3000000), 3);
    const int64_t nowTick = ms.getTick(0);  // 0 means now
    EXPECT_EQ(nowTick, (realtimeNs() - start) / kMs);

    ResettableTimingSource us(Clock::kMicroseconds);
    us.reset(start);
    EXPECT_EQ(us.getTick(start + 2999), 2);

    EXPECT_EQ(absoluteMsSource->getTick(1), 2082844800000LL) << "1970 in ms since 1904";
    EXPECT_EQ(absoluteUsSource->getTick(1), 2082844800000000LL);
    EXPECT_EQ(absoluteMsSource->getName(), "<absolute>");
    EXPECT_EQ(us.getName(), "<resettable>");
}

TEST(ClockTimingSource, FirstWaitStartsTheCountAndPastTicksReturnAtOnce)
{
    CurrentRecord current;
    ResettableTimingSource source(Clock::kMilliseconds);
    const int64_t before = realtimeNs();
    EXPECT_EQ(source.waitUntilTick(0, 0), kTickReached);
    EXPECT_TRUE(source.started());
    EXPECT_LE(source.getTick(before), 0);

    // A tick that has passed returns at once, with or without a time-out.
    source.reset(realtimeNs() - 1000 * kMs);
    const auto t0 = std::chrono::steady_clock::now();
    EXPECT_EQ(source.waitUntilTick(10, 0), kTickReached);
    EXPECT_EQ(source.waitUntilTick(10, 5), kTickReached);
    EXPECT_LT(std::chrono::steady_clock::now() - t0, std::chrono::milliseconds(500));
}

TEST(ClockTimingSource, WaitsUntilTheTickOrTheTimeout)
{
    CurrentRecord current;
    ResettableTimingSource source(Clock::kMilliseconds);
    source.reset(realtimeNs());

    // A time-out shorter than the remaining time ends the wait early with 5.
    int64_t t0 = realtimeNs();
    EXPECT_EQ(source.waitUntilTick(source.getTick(0) + 50, 10), kTimedOut);
    int64_t slept = realtimeNs() - t0;
    EXPECT_GE(slept, 10 * kMs);
    EXPECT_LT(slept, 45 * kMs);

    // A longer time-out, or none at all, waits exactly until the tick begins.
    for (int32_t timeoutMs : {1000, 0, -3}) {
        const int64_t tick = source.getTick(0) + 20;
        EXPECT_EQ(source.waitUntilTick(tick, timeoutMs), kTickReached) << timeoutMs;
        EXPECT_GE(source.getTick(0), tick) << "woke before its tick, timeout " << timeoutMs;
    }
}

TEST(ClockTimingSource, AbortedSourceFailsEveryWaitAndReportsItself)
{
    CurrentRecord current;
    ClockTimingSource source(Clock::kMicroseconds, "line 3");
    testsupport::HostError before;
    source.reportError(before.get());
    EXPECT_EQ(before.cluster.code, kTimingSourceFailed);
    EXPECT_EQ(before.text(), std::string("<append>\n\r<b>Timing source:</b> line 3", 38) + '\0');

    source.abort();
    EXPECT_EQ(source.waitUntilTick(0, 0), kSourceFailed);
    EXPECT_EQ(source.waitUntilTick(5, 10), kSourceFailed);
    testsupport::HostError after;
    source.reportError(after.get());
    EXPECT_EQ(after.cluster.status, 1);
    EXPECT_EQ(after.cluster.code, kNoSuchTimingSource);
    EXPECT_EQ(after.text(), before.text());
}

TEST(ClockTimingSource, AbortedStructureDoesNotSleep)
{
    CurrentRecord current;
    current.record.setState(StructureState::kAborted);
    const auto t0 = std::chrono::steady_clock::now();
    EXPECT_EQ(absoluteMsSource->waitUntilTick(absoluteMsSource->getTick(0) + 10000, 0),
              kStructureWasAborted);
    EXPECT_LT(std::chrono::steady_clock::now() - t0, std::chrono::seconds(1));
}

TEST(ClockTimingSource, AbortWakesSleepingClockLoop)
{
    PerThreadData* sleeper = nullptr;
    std::atomic<bool> asleep{false};
    std::atomic<int32_t> result{-1};
    std::thread loop([&] {
        CurrentRecord current;
        sleeper = &current.record;
        asleep.store(true);
        result = absoluteMsSource->waitUntilTick(absoluteMsSource->getTick(0) + 10000, 0);
    });
    while (!asleep.load())
        std::this_thread::yield();
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    const auto t0 = std::chrono::steady_clock::now();
    abortStructure(*sleeper, *absoluteMsSource);
    loop.join();
    EXPECT_EQ(result.load(), kStructureWasAborted);
    EXPECT_LT(std::chrono::steady_clock::now() - t0, std::chrono::seconds(2))
        << "the 10 s sleep was not cut short";
}

TEST(ClockTimingSource, AbortAtAnyMomentIsNeverSleptThrough)
{
#ifdef __arm__
    constexpr int kRounds = 60;
#else
    constexpr int kRounds = 400;
#endif
    std::mt19937 random(20261206);
    std::uniform_int_distribution<int> delayUs(0, 300);
    for (int round = 0; round < kRounds; ++round) {
        PerThreadData record;
        record.setState(StructureState::kRunning);
        std::atomic<bool> ready{false};
        std::atomic<int32_t> result{-1};
        std::thread loop([&] {
            currentStructureKey->set(&record);
            ready.store(true);
            result = absoluteUsSource->waitUntilTick(absoluteUsSource->getTick(0) + 10000000, 0);
            currentStructureKey->set(nullptr);
        });
        while (!ready.load())
            std::this_thread::yield();
        const int delay = delayUs(random);
        if (delay > 0)
            std::this_thread::sleep_for(std::chrono::microseconds(delay));
        const auto t0 = std::chrono::steady_clock::now();
        abortStructure(record, *absoluteUsSource);
        loop.join();
        ASSERT_EQ(result.load(), kStructureWasAborted) << "round " << round;
        ASSERT_LT(std::chrono::steady_clock::now() - t0, std::chrono::seconds(5))
            << "round " << round << " slept through its abort";
    }
}

TEST(ClockTimingSource, SignalDoesNotEndTheSleepEarly)
{
    struct sigaction action {};
    action.sa_handler = [](int) {};
    sigaction(SIGUSR2, &action, nullptr);  // no SA_RESTART
    std::atomic<bool> ready{false};
    int64_t tick = 0;
    int64_t wokeAtTick = 0;
    int32_t result = -1;
    ResettableTimingSource source(Clock::kMilliseconds);
    source.reset(realtimeNs());
    std::thread loop([&] {
        CurrentRecord current;
        tick = source.getTick(0) + 60;
        ready.store(true);
        result = source.waitUntilTick(tick, 0);
        wokeAtTick = source.getTick(0);
    });
    while (!ready.load())
        std::this_thread::yield();
    std::this_thread::sleep_for(std::chrono::milliseconds(15));
    pthread_kill(loop.native_handle(), SIGUSR2);
    loop.join();
    EXPECT_EQ(result, kTickReached);
    EXPECT_GE(wokeAtTick, tick);
}

TEST(ClockTimingSource, WakeUpSyscallNumberIsReadOnceAtLoad)
{
    {
        testsupport::TempTree tree;
        tree.write("/sys/kernel/dr_syscall_sched_wake_up", "451\n");
        testsupport::ReloadedLibrary library(tree.root());
        EXPECT_EQ(wakeUpSyscallNumber(), 451);
        tree.write("/sys/kernel/dr_syscall_sched_wake_up", "452\n");
        ClockTimingSource later(Clock::kMilliseconds, "later");
        EXPECT_EQ(wakeUpSyscallNumber(), 451) << "the file is read only once";
    }
    for (const char* content : {"", "none\n"}) {
        testsupport::TempTree tree;
        tree.write("/sys/kernel/dr_syscall_sched_wake_up", content);
        testsupport::ReloadedLibrary library(tree.root());
        EXPECT_EQ(wakeUpSyscallNumber(), -1) << '"' << content << '"';
    }
    testsupport::TempTree empty;
    testsupport::ReloadedLibrary library(empty.root());
    EXPECT_EQ(wakeUpSyscallNumber(), -1);
}

TEST(ClockTimingSourceDeathTest, UnknownClockStops)
{
    EXPECT_DEATH(scaleUnits(static_cast<Clock>(7)), "Assertion `0' failed");
}
