// Priority mapper: placement on real SCHED_FIFO threads, room-making moves,
// failures, and a randomized model check with concurrent registrations.
#include <gtest/gtest.h>
#include <linux/capability.h>
#include <pthread.h>
#include <sched.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <climits>
#include <condition_variable>
#include <mutex>
#include <map>
#include <memory>
#include <random>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "priorityMapper.h"
#include "schedExceptions.h"
#include "testSupport.h"
#include "threadRunner.h"

using namespace pxalarms;
using testsupport::ThreadRunner;

namespace {

constexpr int kLinBase = 30;

int32_t registerFirst(PriorityMapper& mapper, ThreadRunner& thread, int32_t tlPrio)
{
    return thread.run([&] { return mapper.setThreadPriority(tlPrio, true, -1); });
}

void release(PriorityMapper& mapper, ThreadRunner& thread, int32_t tlPrio)
{
    thread.run([&] { mapper.releaseThreadPriority(tlPrio); });
}

// tlPrio of every slot, -1 for free ones.
std::vector<int32_t> slotPriorities(PriorityMapper& mapper)
{
    std::vector<int32_t> prios;
    mapper.inspect([&](const tPrioSlot(&slots)[kNumPrioSlots]) {
        for (const tPrioSlot& slot : slots)
            prios.push_back(slot.tlPrio);
    });
    return prios;
}

int timesListed(PriorityMapper& mapper, pthread_t thread)
{
    int count = 0;
    mapper.inspect([&](const tPrioSlot(&slots)[kNumPrioSlots]) {
        for (const tPrioSlot& slot : slots)
            for (pthread_t listed : slot.threads)
                count += pthread_equal(listed, thread) ? 1 : 0;
    });
    return count;
}

// Capabilities are per thread on Linux: without CAP_SYS_NICE (and with
// RLIMIT_RTPRIO 0) a thread may lower real-time priorities but not raise
// them, which makes the mapper's scheduling calls fail for real.
bool dropSysNice()
{
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct data[2]{};
    if (syscall(SYS_capget, &header, data) != 0)
        return false;
    data[0].effective &= ~(1u << CAP_SYS_NICE);
    return syscall(SYS_capset, &header, data) == 0;
}

bool rtPriorityLimitIsZero()
{
    rlimit limit{};
    return getrlimit(RLIMIT_RTPRIO, &limit) == 0 && limit.rlim_cur == 0;
}

bool canUseRealTime()
{
    ThreadRunner probe;
    return probe.run([] {
        sched_param param{};
        param.sched_priority = 31;
        return pthread_setschedparam(pthread_self(), SCHED_FIFO, &param) == 0;
    });
}

class PriorityMapperTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        if (!canUseRealTime())
            GTEST_SKIP() << "this process may not use SCHED_FIFO priorities";
    }
    // Declared before the threads of a test, so it outlives them.
    PriorityMapper mapper;
};

// A reusable barrier; a worker that stops early leaves it.
class Rounds {
public:
    explicit Rounds(int parties) : parties_(parties) {}
    void arriveAndWait()
    {
        std::unique_lock<std::mutex> lock(mutex_);
        const long generation = generation_;
        if (++arrived_ >= parties_)
            next();
        else
            cv_.wait(lock, [&] { return generation_ != generation; });
    }
    void leave()
    {
        std::lock_guard<std::mutex> lock(mutex_);
        --parties_;
        if (parties_ > 0 && arrived_ >= parties_)
            next();
    }

private:
    void next()
    {
        arrived_ = 0;
        ++generation_;
        cv_.notify_all();
    }
    std::mutex mutex_;
    std::condition_variable cv_;
    int parties_;
    int arrived_ = 0;
    long generation_ = 0;
};

}  // namespace

TEST_F(PriorityMapperTest, EmptyTablePlacesByDistanceToVirtualNeighbours)
{
    ThreadRunner thread;
    const std::map<int32_t, int> examples = {{1, 31},     {28, 58},    {29, 59},   {100, 59},
                                             {65506, 59}, {65507, 60}, {65535, 88}};
    for (const auto& example : examples) {
        ASSERT_EQ(registerFirst(mapper, thread, example.first), 0);
        EXPECT_EQ(thread.policy(), SCHED_FIFO);
        EXPECT_EQ(thread.linuxPriority(), example.second) << "priority " << example.first;
        release(mapper, thread, example.first);
    }

    // Every priority, each into an empty table (a release leaves it empty).
#ifdef __arm__
    const int32_t stride = 97;  // emulated system calls are slow
#else
    const int32_t stride = 1;
#endif
    const std::string mismatch = thread.run([&] {
        for (int32_t tlPrio = 1; tlPrio <= 65535; tlPrio += stride) {
            const int expected =
                tlPrio <= 28 ? tlPrio + 30 : tlPrio <= 65506 ? 59 : tlPrio - 65507 + 60;
            const int32_t rc = mapper.setThreadPriority(tlPrio, true, -1);
            int policy = 0;
            sched_param param{};
            pthread_getschedparam(pthread_self(), &policy, &param);
            mapper.releaseThreadPriority(tlPrio);
            if (rc != 0 || policy != SCHED_FIFO || param.sched_priority != expected)
                return "priority " + std::to_string(tlPrio) + " got Linux " +
                       std::to_string(param.sched_priority) + ", status " + std::to_string(rc);
        }
        return std::string();
    });
    EXPECT_EQ(mismatch, "");
    ASSERT_EQ(registerFirst(mapper, thread, 65535), 0);
    EXPECT_EQ(thread.linuxPriority(), 88) << "Linux 89 is never given";
}

TEST_F(PriorityMapperTest, FallingPrioritiesLandInTheMiddleOfTheShrinkingGap)
{
    const std::vector<std::pair<int32_t, int>> steps = {
        {100, 59}, {50, 44}, {20, 36}, {10, 32}, {5, 30}};
    std::vector<std::unique_ptr<ThreadRunner>> threads;
    for (const auto& step : steps) {
        threads.push_back(std::make_unique<ThreadRunner>());
        ASSERT_EQ(registerFirst(mapper, *threads.back(), step.first), 0);
    }
    for (size_t i = 0; i < steps.size(); ++i)
        EXPECT_EQ(threads[i]->linuxPriority(), steps[i].second) << "priority " << steps[i].first;
    EXPECT_EQ(slotPriorities(mapper)[0], 5) << "the last one in slot 0";
}

TEST_F(PriorityMapperTest, NearPrioritiesTakeAdjacentSlotsWithoutMovingAnyThread)
{
    const std::vector<std::pair<int32_t, int>> steps = {{100, 59}, {101, 60}, {200, 74}, {150, 67},
                                                        {99, 58},  {1000, 81}, {102, 61}};
    std::vector<std::unique_ptr<ThreadRunner>> threads;
    for (const auto& step : steps) {
        threads.push_back(std::make_unique<ThreadRunner>());
        ASSERT_EQ(registerFirst(mapper, *threads.back(), step.first), 0);
        for (size_t i = 0; i < threads.size(); ++i)
            EXPECT_EQ(threads[i]->linuxPriority(), steps[i].second)
                << "priority " << steps[i].first << " after registering " << step.first;
    }

    // A second thread at a mapped priority shares the slot; nothing moves.
    ThreadRunner second;
    ASSERT_EQ(registerFirst(mapper, second, 150), 0);
    EXPECT_EQ(second.linuxPriority(), 67);
    for (size_t i = 0; i < threads.size(); ++i)
        EXPECT_EQ(threads[i]->linuxPriority(), steps[i].second);
    mapper.inspect([&](const tPrioSlot(&slots)[kNumPrioSlots]) {
        ASSERT_EQ(slots[67 - kLinBase].threads.size(), 2u);
        EXPECT_TRUE(pthread_equal(slots[67 - kLinBase].threads.back(), second.handle()));
    });
}

TEST_F(PriorityMapperTest, RisingPrioritiesFillTheTopThenShiftTheRunDownUntilFull)
{
    std::vector<std::unique_ptr<ThreadRunner>> threads;
    for (int n = 1; n <= kNumPrioSlots; ++n) {
        threads.push_back(std::make_unique<ThreadRunner>());
        ASSERT_EQ(registerFirst(mapper, *threads.back(), 100 + n - 1), 0);
        // Up to 30 they climb from slot 29; from the 31st on the newest sits
        // at 88 and the whole run below it has moved down.
        for (int j = 0; j < n; ++j) {
            const int expected = n <= 30 ? 59 + j : 88 - (n - 1 - j);
            ASSERT_EQ(threads[j]->linuxPriority(), expected) << "thread " << j << " of " << n;
        }
    }
    EXPECT_EQ(threads.front()->linuxPriority(), 30);
    EXPECT_EQ(threads.back()->linuxPriority(), 88);

    const std::vector<int32_t> full = slotPriorities(mapper);
    ThreadRunner sixtieth;
    EXPECT_EQ(registerFirst(mapper, sixtieth, 159), kPriorityFailed);
    EXPECT_EQ(registerFirst(mapper, sixtieth, 50), kPriorityFailed) << "below the run as well";
    EXPECT_EQ(sixtieth.policy(), SCHED_OTHER) << "its scheduling stays as it was";
    EXPECT_EQ(timesListed(mapper, sixtieth.handle()), 0);
    EXPECT_EQ(slotPriorities(mapper), full) << "a failed registration leaves the table unchanged";

    // A mapped priority still has room: the table is full of slots, not threads.
    EXPECT_EQ(registerFirst(mapper, sixtieth, 130), 0);
    EXPECT_EQ(sixtieth.linuxPriority(), 60);
}

TEST_F(PriorityMapperTest, EqualRunsMoveTheUpperRunUp)
{
    const std::vector<std::pair<int32_t, int>> steps = {
        {109, 59}, {50840, 74}, {45378, 66}, {28902, 62}, {297, 60}};
    std::vector<std::unique_ptr<ThreadRunner>> threads;
    for (const auto& step : steps) {
        threads.push_back(std::make_unique<ThreadRunner>());
        ASSERT_EQ(registerFirst(mapper, *threads.back(), step.first), 0);
    }
    for (size_t i = 0; i < steps.size(); ++i)
        ASSERT_EQ(threads[i]->linuxPriority(), steps[i].second);

    ThreadRunner between;
    ASSERT_EQ(registerFirst(mapper, between, 290), 0);
    EXPECT_EQ(between.linuxPriority(), 60);
    EXPECT_EQ(threads[4]->linuxPriority(), 61) << "the thread of 297 moved up";
    EXPECT_EQ(threads[0]->linuxPriority(), 59) << "109 stays";
    EXPECT_EQ(threads[3]->linuxPriority(), 62);
    EXPECT_EQ(slotPriorities(mapper)[31], 297);
}

TEST_F(PriorityMapperTest, FreedSlotWidensTheGapAndTheNextRegistrationIsPlacedAnew)
{
    ThreadRunner fifty;
    ThreadRunner twenty;
    ASSERT_EQ(registerFirst(mapper, fifty, 50), 0);
    ASSERT_EQ(registerFirst(mapper, twenty, 20), 0);
    ASSERT_EQ(fifty.linuxPriority(), 59);
    ASSERT_EQ(twenty.linuxPriority(), 44);

    release(mapper, fifty, 50);
    EXPECT_EQ(twenty.linuxPriority(), 44) << "no other slot moves";
    EXPECT_EQ(slotPriorities(mapper)[29], -1);
    EXPECT_EQ(fifty.policy(), SCHED_FIFO) << "release leaves the thread's scheduling alone";

    // Now 50 lies between 20 (slot 14) and the top: the middle of 15..58.
    ASSERT_EQ(registerFirst(mapper, fifty, 50), 0);
    EXPECT_EQ(fifty.linuxPriority(), 66);
}

TEST_F(PriorityMapperTest, RepeatedRegistrationIsListedTwiceAndOneReleaseRemovesBoth)
{
    ThreadRunner thread;
    ASSERT_EQ(registerFirst(mapper, thread, 100), 0);
    ASSERT_EQ(registerFirst(mapper, thread, 100), 0);
    EXPECT_EQ(timesListed(mapper, thread.handle()), 2);

    const std::vector<int32_t> before = slotPriorities(mapper);
    release(mapper, thread, 4242);
    EXPECT_EQ(slotPriorities(mapper), before) << "an unmapped priority is ignored";
    EXPECT_EQ(timesListed(mapper, thread.handle()), 2);

    release(mapper, thread, 100);
    EXPECT_EQ(timesListed(mapper, thread.handle()), 0);
    EXPECT_EQ(slotPriorities(mapper), std::vector<int32_t>(kNumPrioSlots, -1));
}

TEST_F(PriorityMapperTest, ChangeOfPriorityLeavesTheOldSlot)
{
    ThreadRunner thread;
    ASSERT_EQ(registerFirst(mapper, thread, 100), 0);
    ASSERT_EQ(registerFirst(mapper, thread, 100), 0);
    ASSERT_EQ(thread.run([&] { return mapper.setThreadPriority(65535, false, 100); }), 0);
    EXPECT_EQ(thread.linuxPriority(), 88);
    EXPECT_EQ(timesListed(mapper, thread.handle()), 1);
    std::vector<int32_t> expected(kNumPrioSlots, -1);
    expected[58] = 65535;
    EXPECT_EQ(slotPriorities(mapper), expected);
}

TEST_F(PriorityMapperTest, OutOfRangePriorityIsRefusedAndChangesNothing)
{
    ThreadRunner thread;
    ASSERT_EQ(registerFirst(mapper, thread, 100), 0);
    const std::vector<int32_t> before = slotPriorities(mapper);
    for (const int32_t bad : {0, -5, -1, 65536, INT32_MIN, INT32_MAX}) {
        EXPECT_EQ(registerFirst(mapper, thread, bad), kBadPriority) << bad;
        // Not even the old mapping is released.
        EXPECT_EQ(thread.run([&] { return mapper.setThreadPriority(bad, false, 100); }), kBadPriority)
            << bad;
        EXPECT_EQ(slotPriorities(mapper), before);
        EXPECT_EQ(timesListed(mapper, thread.handle()), 1);
        EXPECT_EQ(thread.linuxPriority(), 59);
    }
}

TEST_F(PriorityMapperTest, ThreadWhosePriorityCannotBeSetLeavesTheSlot)
{
    if (!rtPriorityLimitIsZero())
        GTEST_SKIP() << "RLIMIT_RTPRIO is not 0, so dropping CAP_SYS_NICE does not stop raising";
    ThreadRunner thread;
    ASSERT_EQ(registerFirst(mapper, thread, 100), 0);
    ASSERT_TRUE(thread.run(dropSysNice)) << "capset failed";

    // Raising to 88 is refused: the old slot is gone and the new one is not
    // kept, so no slot lists a thread that does not run at its priority.
    EXPECT_EQ(thread.run([&] { return mapper.setThreadPriority(65535, false, 100); }),
              kPriorityFailed);
    EXPECT_EQ(timesListed(mapper, thread.handle()), 0);
    EXPECT_EQ(slotPriorities(mapper), std::vector<int32_t>(kNumPrioSlots, -1));
    EXPECT_EQ(thread.linuxPriority(), 59) << "keeps its old Linux priority outside the mapping";

    ThreadRunner unprivileged;
    ASSERT_TRUE(unprivileged.run(dropSysNice));
    EXPECT_EQ(registerFirst(mapper, unprivileged, 100), kPriorityFailed);
    EXPECT_EQ(unprivileged.policy(), SCHED_OTHER);
    EXPECT_EQ(timesListed(mapper, unprivileged.handle()), 0);
}

TEST_F(PriorityMapperTest, FailedMoveIsLoggedAndLaterReleaseReportsTheBrokenInvariant)
{
    if (!rtPriorityLimitIsZero())
        GTEST_SKIP() << "RLIMIT_RTPRIO is not 0, so dropping CAP_SYS_NICE does not stop raising";
    std::vector<std::unique_ptr<ThreadRunner>> threads;
    for (const int32_t tlPrio : {109, 50840, 45378, 28902, 297}) {
        threads.push_back(std::make_unique<ThreadRunner>());
        ASSERT_EQ(registerFirst(mapper, *threads.back(), tlPrio), 0);
    }
    ThreadRunner& of297 = *threads[4];

    testsupport::LogCapture log;
    // The registrar of 290 may not raise priorities: moving 297 up to 61 fails
    // (logged, the move goes on), and so does its own 60.
    ThreadRunner unprivileged;
    ASSERT_TRUE(unprivileged.run(dropSysNice));
    EXPECT_EQ(registerFirst(mapper, unprivileged, 290), kPriorityFailed);
    EXPECT_EQ(of297.linuxPriority(), 60) << "the failed move left it where it was";
    const std::vector<int32_t> prios = slotPriorities(mapper);
    EXPECT_EQ(prios[31], 297) << "the table still records the move";
    EXPECT_EQ(prios[30], -1) << "290 left the slot it could not run at";

    std::vector<testsupport::LogCapture::Line> lines = log.lines();
    ASSERT_EQ(lines.size(), 1u);
    std::ostringstream expected;
    expected << "priorityMapper: Set prio for thread " << static_cast<unsigned long>(of297.handle())
             << " returned [1]\n";
    EXPECT_EQ(lines[0].text, expected.str());
    EXPECT_EQ(lines[0].priority, LOG_LOCAL0 | LOG_ERR);

    // Its release meets the broken invariant: logged, and still removed, so
    // no later move touches a thread that may have ended.
    release(mapper, of297, 297);
    lines = log.lines();
    ASSERT_EQ(lines.size(), 2u);
    EXPECT_NE(lines[1].text.find("priorityMapper: internal check"), std::string::npos) << lines[1].text;
    EXPECT_EQ(lines[1].priority, LOG_LOCAL0 | LOG_ERR);
    EXPECT_EQ(timesListed(mapper, of297.handle()), 0);
    EXPECT_EQ(slotPriorities(mapper)[31], -1);
}

// Each worker is one timed structure's thread running a random life of
// activations, re-prioritisations and deactivations, all at once.  After
// every step the whole table is checked under the mapper's lock against the
// invariants, and the worker's own entries against its model.
TEST_F(PriorityMapperTest, RandomizedRegistrationsKeepTheTableOrderedAndEveryThreadAtItsSlot)
{
#ifdef __arm__
    constexpr int kWorkers = 16;
    constexpr int kStepsPerWorker = 40;  // system calls are emulated
#else
    constexpr int kWorkers = 80;  // well above 59, so the table fills up
    constexpr int kStepsPerWorker = 128;
#endif
    std::atomic<long> steps{0};
    std::atomic<long> fullTableRefusals{0};
    std::atomic<int> mostSlotsTaken{0};
    std::atomic<bool> failed{false};
    // Workers step in rounds: real-time workers would otherwise run their
    // whole life before lower ones got a processor, and few structures would
    // ever be mapped at the same time.
    Rounds round(kWorkers);
    std::mutex failureMutex;
    std::string failure;

    auto worker = [&](int id) {
        std::mt19937 random(20261206u + static_cast<unsigned>(id));
        const pthread_t self = pthread_self();
        int32_t current = -1;  // the model: mapped priority and entries
        int count = 0;
        auto fail = [&](const std::string& why) {
            std::lock_guard<std::mutex> lock(failureMutex);
            if (!failed.exchange(true))
                failure = "worker " + std::to_string(id) + ": " + why;
        };
        auto pick = [&]() -> int32_t {
            const unsigned kind = random() % 10;
            if (kind < 4)
                return 1000 + static_cast<int32_t>(random() % 40);  // dense: moves
            if (kind < 8)
                return 1 + static_cast<int32_t>(random() % 65535);
            if (kind < 9)
                return random() % 2 ? 1 + static_cast<int32_t>(random() % 3)
                                    : 65533 + static_cast<int32_t>(random() % 3);
            const int32_t bad[] = {0, -5, 65536, INT32_MIN, INT32_MAX};
            return bad[random() % 5];
        };
        auto check = [&](const char* step) {
            mapper.inspect([&](const tPrioSlot(&slots)[kNumPrioSlots]) {
                int32_t previous = 0;
                int mine = 0;
                for (int i = 0; i < kNumPrioSlots; ++i) {
                    const tPrioSlot& slot = slots[i];
                    if ((slot.tlPrio == -1) != slot.threads.empty())
                        return fail(std::string(step) + ": slot free but not empty");
                    if (slot.tlPrio == -1)
                        continue;
                    if (slot.tlPrio < 1 || slot.tlPrio > 65535 || slot.tlPrio <= previous)
                        return fail(std::string(step) + ": slots out of order at " + std::to_string(i));
                    previous = slot.tlPrio;
                    for (pthread_t thread : slot.threads) {
                        int policy = 0;
                        sched_param param{};
                        pthread_getschedparam(thread, &policy, &param);
                        if (policy != SCHED_FIFO || param.sched_priority != kLinBase + i)
                            return fail(std::string(step) + ": thread at " +
                                        std::to_string(param.sched_priority) + " in slot " +
                                        std::to_string(i));
                        if (pthread_equal(thread, self)) {
                            ++mine;
                            if (slot.tlPrio != current)
                                return fail(std::string(step) + ": listed under a wrong priority");
                        }
                    }
                }
                int taken = 0;
                for (const tPrioSlot& slot : slots)
                    taken += slot.tlPrio >= 0 ? 1 : 0;
                if (taken > mostSlotsTaken.load())
                    mostSlotsTaken.store(taken);
                if (mine != count)
                    return fail(std::string(step) + ": listed " + std::to_string(mine) +
                                " times, expected " + std::to_string(count));
            });
        };
        auto ownScheduling = [] {
            int policy = 0;
            sched_param param{};
            pthread_getschedparam(pthread_self(), &policy, &param);
            return std::make_pair(policy, param.sched_priority);
        };

        for (int step = 0; step < kStepsPerWorker && !failed; ++step) {
            const int32_t tlPrio = pick();
            const bool valid = tlPrio >= 1 && tlPrio <= 65535;
            const auto before = ownScheduling();
            const unsigned action = random() % 4;
            if (count == 0 || (action == 0 && count == 1)) {
                // Activation, or the first period wait's second registration.
                const int32_t target = count == 0 ? tlPrio : current;
                const int32_t rc = mapper.setThreadPriority(target, true, -1);
                if (target < 1 || target > 65535) {
                    if (rc != kBadPriority)
                        fail("out-of-range priority accepted");
                } else if (rc == 0) {
                    current = target;
                    ++count;
                } else if (rc != kPriorityFailed) {
                    fail("unexpected status " + std::to_string(rc));
                } else if (count == 0) {
                    fullTableRefusals.fetch_add(1);
                    if (ownScheduling() != before)
                        fail("a refused thread's scheduling changed");
                }
                check("register");
            } else if (action == 1) {
                mapper.releaseThreadPriority(current);
                current = -1;
                count = 0;
                check("release");
            } else {
                const int32_t rc = mapper.setThreadPriority(tlPrio, false, current);
                if (!valid) {
                    if (rc != kBadPriority)
                        fail("out-of-range change accepted");
                } else if (rc == 0) {
                    current = tlPrio;
                    count = 1;
                } else if (rc == kPriorityFailed) {
                    fullTableRefusals.fetch_add(1);
                    current = -1;
                    count = 0;
                } else {
                    fail("unexpected status " + std::to_string(rc));
                }
                check("change");
            }
            steps.fetch_add(1);
            round.arriveAndWait();
        }
        round.leave();
        if (count > 0)
            mapper.releaseThreadPriority(current);
        // As deactivation does; a real-time thread ending inside the
        // sanitizers' spin locks could starve the lower thread holding them.
        sched_param normal{};
        pthread_setschedparam(pthread_self(), SCHED_OTHER, &normal);
    };

    std::vector<std::thread> threads;
    for (int id = 0; id < kWorkers; ++id)
        threads.emplace_back(worker, id);
    for (std::thread& thread : threads)
        thread.join();

    EXPECT_FALSE(failed) << failure;
    EXPECT_EQ(steps.load(), static_cast<long>(kWorkers) * kStepsPerWorker);
    EXPECT_EQ(slotPriorities(mapper), std::vector<int32_t>(kNumPrioSlots, -1));
#ifndef __arm__
    EXPECT_GE(steps.load(), 10000);
#endif
    // How often the table was full depends on the interleaving; the full
    // table itself is pinned down by RisingPrioritiesFill...UntilFull.
    RecordProperty("fullTableRefusals", static_cast<int>(fullTableRefusals.load()));
    RecordProperty("mostSlotsTaken", mostSlotsTaken.load());
}
