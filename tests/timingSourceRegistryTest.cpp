// Named timing sources: the registry's reference counts and the exported
// creation and deletion functions.
#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "ClockTimingSources.h"
#include "hostSubstitute.h"
#include "processObjects.h"
#include "testSupport.h"

using namespace pxalarms;

namespace {

uint32_t refs(const std::string& name)
{
    return g_timingSourceManager->referenceCount(name);
}

void create(const std::string& name, bool microseconds = false)
{
    testsupport::HostError error;
    TSrcRef ref{0, 0, 0};
    if (microseconds)
        TSrcNewTSC__DRAVICON_pxalarms(name.c_str(), &ref, error.get());
    else
        TSrcNewTickTimer__DRAVICON_pxalarms(name.c_str(), &ref, error.get());
    ASSERT_EQ(error.cluster.status, 0);
}

// Deletes once; returns the code written (0 when the record stayed clean).
int32_t deleteSource(const std::string& name, bool abortUsers = false)
{
    testsupport::HostError error;
    TSrcRef ref{0, 0, abortUsers ? 1 : 0};
    TSrcDeleteName__DRAVICON_pxalarms(name.c_str(), &ref, error.get());
    return error.cluster.code;
}

// Counts live instances so a test can see each source destroyed once.
struct CountedSource : ClockTimingSource {
    static std::atomic<int> live;
    explicit CountedSource(const std::string& name) : ClockTimingSource(Clock::kMilliseconds, name)
    {
        ++live;
    }
    ~CountedSource() override { --live; }
};
std::atomic<int> CountedSource::live{0};

}  // namespace

TEST(TimingSourceRegistry, CreatingAnExistingNameAddsAReference)
{
    create("A");
    create("A", true);
    EXPECT_EQ(refs("A"), 2u);
    TimingSource* source = g_timingSourceManager->acquireTSrc("A");
    auto* clock = dynamic_cast<ClockTimingSource*>(source);
    ASSERT_NE(clock, nullptr);
    EXPECT_EQ(clock->nsPerTickValue(), 1000000) << "the first creation's clock stays";
    clock->release();

    EXPECT_EQ(deleteSource("A"), 0);
    EXPECT_EQ(refs("A"), 1u);
    EXPECT_EQ(deleteSource("A"), 0);
    EXPECT_EQ(refs("A"), 0u);
    EXPECT_EQ(g_timingSourceManager->acquireTSrc("A"), nullptr);
}

TEST(TimingSourceRegistry, DeletingAnUnknownNameReportsIt)
{
    create("B");
    EXPECT_EQ(deleteSource("B"), 0);

    testsupport::HostError error;
    TSrcRef ref{0, 0, 0};
    TSrcDeleteName__DRAVICON_pxalarms("B", &ref, error.get());
    EXPECT_EQ(error.cluster.status, 1);
    EXPECT_EQ(error.cluster.code, -805);
    EXPECT_EQ(error.text(), std::string("<append>\n\r<b>Timing source:</b> B\0", 34));
    EXPECT_EQ(error.cluster.source[0]->cnt, 34);

    // Without a record the failure is simply not reported.
    TSrcDeleteName__DRAVICON_pxalarms("B", &ref, nullptr);
}

TEST(TimingSourceRegistry, NamesAreMatchedByteForByte)
{
    const std::string long1k(1024, 'x');
    const std::string high = "\xc3\xa9t\xff";
    const std::vector<std::string> names{"", "A", "A ", "a", long1k, high};
    for (const auto& name : names)
        create(name);
    for (const auto& name : names)
        EXPECT_EQ(refs(name), 1u) << name.size();
    EXPECT_EQ(refs(std::string(1023, 'x')), 0u);
    for (const auto& name : names)
        EXPECT_EQ(deleteSource(name), 0) << name.size();
    for (const auto& name : names)
        EXPECT_EQ(refs(name), 0u);
}

TEST(TimingSourceRegistry, DeleteWithAbortStopsUsersUntilTheLastLetsGo)
{
    create("C");
    TimingSource* user = g_timingSourceManager->acquireTSrc("C");  // an active structure
    ASSERT_NE(user, nullptr);

    EXPECT_EQ(deleteSource("C", true), 0);
    EXPECT_EQ(refs("C"), 1u) << "still registered while in use";
    PerThreadData record;
    record.setState(StructureState::kRunning);
    currentStructureKey->set(&record);
    EXPECT_EQ(user->waitUntilTick(1, 0), kSourceFailed);
    testsupport::HostError error;
    user->reportError(error.get());
    EXPECT_EQ(error.cluster.code, -805);
    EXPECT_EQ(g_timingSourceManager->acquireTSrc("C"), user) << "the aborted source keeps its name";
    user->release();
    user->release();  // the structure deactivates: last reference
    EXPECT_EQ(refs("C"), 0u);

    // Without abort the user runs on normally.
    create("C");
    user = g_timingSourceManager->acquireTSrc("C");
    EXPECT_EQ(deleteSource("C"), 0);
    EXPECT_EQ(user->waitUntilTick(0, 0), kTickReached);
    EXPECT_EQ(user->waitUntilTick(1, 0), kTickReached);
    user->release();
    EXPECT_EQ(refs("C"), 0u);
    currentStructureKey->set(nullptr);
}

TEST(TimingSourceRegistry, CreationLeavesTheReferenceRecordAlone)
{
    TSrcRef ref{0xdeadbeef, 0xabcd, 77};
    testsupport::HostError error;
    TSrcNewTSCPX__DRAVICON_pxalarms(const_cast<char*>("D"), &ref, 1, error.get());
    TSrcNewTSC__DRAVICON_pxalarms("D", &ref, error.get());
    EXPECT_EQ(ref.hostWord0, 0xdeadbeefu);
    EXPECT_EQ(ref.hostWord1, 0xabcd);
    EXPECT_EQ(ref.abortUsers, 77);
    EXPECT_EQ(error.cluster.status, 0);
    EXPECT_EQ(refs("D"), 2u);
    EXPECT_EQ(hostsub::runCleanupProcs(), 1);
    EXPECT_EQ(refs("D"), 1u);
    EXPECT_EQ(deleteSource("D"), 0);
}

TEST(TimingSourceRegistry, EachCleanupReleasesOneReferenceOfWhateverHoldsTheName)
{
    testsupport::HostError error;
    TSrcNewTickTimerPX__DRAVICON_pxalarms(const_cast<char*>("E"), nullptr, 1, error.get());
    TSrcNewTickTimerPX__DRAVICON_pxalarms(const_cast<char*>("E"), nullptr, 1, error.get());
    EXPECT_EQ(refs("E"), 2u);
    EXPECT_EQ(hostsub::pendingCleanupProcs(), 2);

    // The program deletes its sources itself and makes a new one by that name.
    EXPECT_EQ(deleteSource("E"), 0);
    EXPECT_EQ(deleteSource("E"), 0);
    create("E");
    EXPECT_EQ(hostsub::runCleanupProcs(), 2);
    EXPECT_EQ(refs("E"), 0u) << "the new source lost one reference, the free name nothing";
    EXPECT_EQ(error.cluster.status, 0);

    // A refused registration keeps the source and frees its name copy.
    hostsub::failNext(hostsub::HostCall::kRTSetCleanupProc, 1);
    TSrcNewTSCPX__DRAVICON_pxalarms(const_cast<char*>("F"), nullptr, 1, error.get());
    EXPECT_EQ(refs("F"), 1u);
    EXPECT_EQ(hostsub::pendingCleanupProcs(), 0);
    EXPECT_EQ(deleteSource("F"), 0);
}

TEST(TimingSourceRegistry, ConcurrentUseKeepsCountsExact)
{
#ifdef __arm__
    constexpr int kIterations = 300;
#else
    constexpr int kIterations = 3000;
#endif
    const std::vector<std::string> names{"shared0", "shared1", "shared2"};
    std::vector<std::thread> threads;
    std::atomic<int> created{0};
    for (int t = 0; t < 6; ++t) {
        threads.emplace_back([&, t] {
            for (int i = 0; i < kIterations; ++i) {
                const std::string& name = names[(i + t) % names.size()];
                g_timingSourceManager->acquireOrAddTSrc(name, [&] {
                    ++created;
                    return std::make_unique<CountedSource>(name);
                });
                if (TimingSource* again = g_timingSourceManager->acquireTSrc(name))
                    again->release();
                if (i % 2 == 0)
                    g_timingSourceManager->releaseTSrc(name);
                else
                    g_timingSourceManager->removeTSrc(name);
            }
        });
    }
    for (auto& thread : threads)
        thread.join();
    for (const auto& name : names)
        EXPECT_EQ(refs(name), 0u);
    EXPECT_EQ(CountedSource::live.load(), 0) << "a source was leaked or destroyed twice";
    EXPECT_GE(created.load(), 3);
}

TEST(TimingSourceRegistryDeathTest, ContractViolationsStop)
{
    testsupport::HostError error;
    EXPECT_DEATH(TSrcDeleteName__DRAVICON_pxalarms("G", nullptr, error.get()),
                 "TSrcDeleteName__DRAVICON_pxalarms: Assertion `ref != __null' failed");
    EXPECT_DEATH(TSrcNewTickTimerPX__DRAVICON_pxalarms(const_cast<char*>("G"), nullptr, 0,
                                                       error.get()),
                 "cleanupFlag == 1");
    EXPECT_DEATH(TSrcNewTSCPX__DRAVICON_pxalarms(const_cast<char*>("G"), nullptr, 1, nullptr),
                 "error != __null");
}
