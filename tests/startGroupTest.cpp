// Synchronization groups: the start rendezvous on real threads, membership
// rules, and the exported group functions.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <future>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "AlarmStartGroupManager.h"
#include "convertLStr.h"
#include "highResTiming.h"
#include "hostSubstitute.h"
#include "processObjects.h"
#include "schedExceptions.h"
#include "testSupport.h"

using namespace pxalarms;

namespace {

constexpr int32_t kNoLimit = -1;

const std::string kStructureLabel = "<append>\n\r<b>Timed structure(s):</b> ";
const std::string kGroupLabel = "<append>\n\r<b>Synchronization group:</b> ";

std::string memberName(int i)
{
    char name[16];
    std::snprintf(name, sizeof name, "loop%02d", i);
    return name;
}

// Polls until `done` holds; members enter the rendezvous on their own
// threads, and their arrival is seen only through the group's refCount.
template <class Done>
bool eventually(Done done)
{
    const auto giveUp = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    while (!done()) {
        if (std::chrono::steady_clock::now() > giveUp)
            return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}

int32_t expectThrows(const std::function<void()>& work, std::string* message)
{
    try {
        work();
    } catch (const CTimedStructureException& e) {
        *message = e.message;
        return e.code;
    }
    return 0;
}

// A host string handle made through the host's own handle functions.
class HostString {
public:
    explicit HostString(const std::string& text) { EXPECT_NE(StringToLStr(&handle_, text), nullptr); }
    HostString() = default;
    ~HostString() { hostsub::disposeHandle(handle_); }
    HostString(const HostString&) = delete;
    HostString& operator=(const HostString&) = delete;
    LStr** get() { return handle_; }
    LStr*** out() { return &handle_; }
    std::string text() { return hostsub::text(handle_); }

private:
    LStr** handle_ = nullptr;
};

}  // namespace

TEST(GroupStartDeadline, NormalisesNanosecondsBothWays)
{
    auto at = [](time_t s, long ns, int32_t ms) {
        const timespec d = groupStartDeadline(timespec{s, ns}, ms);
        return std::make_pair(static_cast<int64_t>(d.tv_sec), static_cast<int64_t>(d.tv_nsec));
    };
    EXPECT_EQ(at(10, 999000000, 1), std::make_pair(int64_t{11}, int64_t{0}));
    EXPECT_EQ(at(10, 500000000, 2500), std::make_pair(int64_t{13}, int64_t{0}));
    EXPECT_EQ(at(10, 600000000, 999), std::make_pair(int64_t{11}, int64_t{599000000}));
    EXPECT_EQ(at(10, 0, 0), std::make_pair(int64_t{10}, int64_t{0}));
    // Negative time-outs borrow instead of leaving negative nanoseconds.
    EXPECT_EQ(at(10, 0, -1), std::make_pair(int64_t{9}, int64_t{999000000}));
    EXPECT_EQ(at(10, 0, -1500), std::make_pair(int64_t{8}, int64_t{500000000}));
    // Past 2038 on the 32-bit build the seconds must not wrap.
    EXPECT_EQ(at(4102444800, 999999999, 1000),
              std::make_pair(int64_t{4102444801}, int64_t{999999999}));
}

TEST(StartGroup, AllMembersAreReleasedOnlyAfterTheLastArrives)
{
    for (int members : {2, 3, 16}) {
        SCOPED_TRACE(members);
        AlarmStartGroupManager manager;
        for (int i = 0; i < members; ++i)
            manager.addAlarm("cell", memberName(i), kNoLimit, false);

        // Two rounds: the group must be reusable once everybody has left.
        for (int round = 0; round < 2; ++round) {
            std::atomic<int> released{0};
            std::vector<int64_t> releaseNs(members);
            std::vector<int32_t> results(members, 1);
            std::vector<std::thread> threads;
            for (int i = 0; i < members - 1; ++i) {
                threads.emplace_back([&, i] {
                    results[i] = manager.waitForGroupStart(memberName(i));
                    releaseNs[i] = nowNs(CLOCK_MONOTONIC);
                    released.fetch_add(1);
                });
            }
            ASSERT_TRUE(eventually([&] { return manager.refCountOf("cell") == members; }));
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
            EXPECT_EQ(released.load(), 0) << "a member started before the group was complete";

            const int last = members - 1;
            results[last] = manager.waitForGroupStart(memberName(last));
            releaseNs[last] = nowNs(CLOCK_MONOTONIC);
            for (auto& t : threads)
                t.join();

            EXPECT_EQ(std::count(results.begin(), results.end(), 0), members);
            EXPECT_EQ(manager.refCountOf("cell"), 1);
            const auto spread = std::minmax_element(releaseNs.begin(), releaseNs.end());
            std::printf("group of %d, round %d: release spread %.1f us\n", members, round,
                        static_cast<double>(*spread.second - *spread.first) / 1e3);
        }
    }
}

TEST(StartGroup, LoneMemberAndStructureOutsideAnyGroupStartAtOnce)
{
    AlarmStartGroupManager manager;
    manager.addAlarm("solo", "only", kNoLimit, false);
    EXPECT_EQ(manager.waitForGroupStart("only"), 0);
    EXPECT_EQ(manager.waitForGroupStart("nobody's"), 0);
    EXPECT_EQ(manager.refCountOf("solo"), 1);
}

TEST(StartGroup, MemberWhoseWaitExpiresReports821AndWithdrawsItsArrival)
{
    AlarmStartGroupManager manager;
    constexpr int32_t kTimeoutMs = 1000;
    for (const char* name : {"a", "b", "c"})
        manager.addAlarm("trio", name, kTimeoutMs, false);

    // a arrives first and gives up; b arrived later and is still waiting
    // when c comes.  Had a's arrival stayed counted, c would release the
    // group one member short.
    auto a = std::async(std::launch::async, [&] { return manager.waitForGroupStart("a"); });
    ASSERT_TRUE(eventually([&] { return manager.refCountOf("trio") == 2; }));
    std::this_thread::sleep_for(std::chrono::milliseconds(400));
    auto b = std::async(std::launch::async, [&] { return manager.waitForGroupStart("b"); });
    ASSERT_TRUE(eventually([&] { return manager.refCountOf("trio") == 3; }));
    EXPECT_EQ(a.get(), kGroupStartTimedOut);
    auto c = std::async(std::launch::async, [&] { return manager.waitForGroupStart("c"); });
    EXPECT_EQ(b.get(), kGroupStartTimedOut);
    EXPECT_EQ(c.get(), kGroupStartTimedOut);
    EXPECT_EQ(manager.refCountOf("trio"), 1);

    // The group is idle and whole again: all three together start.
    std::vector<std::future<int32_t>> all;
    for (const char* name : {"a", "b", "c"})
        all.push_back(std::async(std::launch::async, [&manager, name] {
            return manager.waitForGroupStart(name);
        }));
    for (auto& f : all)
        EXPECT_EQ(f.get(), 0);
    EXPECT_EQ(manager.refCountOf("trio"), 1);
}

TEST(StartGroup, MembershipOfAStartingGroupIsFrozenUntilItIsAborted)
{
    AlarmStartGroupManager manager;
    manager.addAlarm("G", "waiter", kNoLimit, false);
    manager.addAlarm("G", "absent", kNoLimit, false);
    manager.addAlarm("H", "other", kNoLimit, false);

    auto waiter = std::async(std::launch::async, [&] { return manager.waitForGroupStart("waiter"); });
    ASSERT_TRUE(eventually([&] { return manager.refCountOf("G") == 2; }));

    std::string message;
    EXPECT_EQ(expectThrows([&] { manager.addAlarm("G", "late", kNoLimit, true); }, &message),
              kGroupStarting);
    EXPECT_EQ(message, kStructureLabel + "G");
    EXPECT_EQ(expectThrows([&] { manager.addAlarm("H", "absent", kNoLimit, true); }, &message),
              kGroupStarting);
    EXPECT_EQ(message, kStructureLabel + "absent");
    // A refused move into the starting group keeps the structure where it was.
    EXPECT_EQ(expectThrows([&] { manager.addAlarm("G", "other", kNoLimit, true); }, &message),
              kGroupStarting);
    std::string name;
    EXPECT_EQ(manager.getAlarmAt("H", 0, &name), 0);
    EXPECT_EQ(name, "other");
    EXPECT_EQ(manager.resetGroup("G"), kGroupStarting);
    // Re-adding a member already in the group is no change, so no refusal.
    manager.addAlarm("G", "waiter", 5, false);

    // Without the abort the waiter would wait for "absent" forever.
    manager.abortGroup("G");
    EXPECT_EQ(waiter.get(), kGroupStartTimedOut);
    EXPECT_EQ(manager.refCountOf("G"), 1);
    EXPECT_EQ(manager.resetGroup("G"), 0);
    EXPECT_EQ(manager.getAlarmAt("G", 0, &name), kNoSuchStructure);
    // Aborting an idle or unknown group touches nothing.
    manager.abortGroup("G");
    manager.abortGroup("unknown");
    EXPECT_EQ(manager.refCountOf("unknown"), 0);
}

TEST(StartGroup, MovingBetweenGroupsNeedsTheMoveFlagAndKeepsTheOldGroup)
{
    AlarmStartGroupManager manager;
    manager.addAlarm("X", "s", 100, false);
    std::string message;
    EXPECT_EQ(expectThrows([&] { manager.addAlarm("Y", "s", 100, false); }, &message),
              kInOtherGroup);
    EXPECT_EQ(message, kStructureLabel + "Y");
    std::string name;
    EXPECT_EQ(manager.getAlarmAt("X", 0, &name), 0);
    EXPECT_EQ(manager.getAlarmAt("Y", 0, &name), kNoSuchGroup);

    manager.addAlarm("Y", "s", 100, true);
    EXPECT_EQ(manager.getAlarmAt("Y", 0, &name), 0);
    EXPECT_EQ(name, "s");
    // X is empty but still a group.
    EXPECT_EQ(manager.getAlarmAt("X", 0, &name), kNoSuchStructure);
    // Only one group holds a structure: it starts with Y alone.
    EXPECT_EQ(manager.waitForGroupStart("s"), 0);
}

TEST(StartGroup, MembersAreListedInByteOrderAndNamesAreExactBytes)
{
    AlarmStartGroupManager manager;
    for (const char* name : {"b", "a", "c"})
        manager.addAlarm("abc", name, kNoLimit, false);
    std::string name;
    for (size_t i = 0; i < 3; ++i) {
        ASSERT_EQ(manager.getAlarmAt("abc", i, &name), 0);
        EXPECT_EQ(name, std::string(1, static_cast<char>('a' + i)));
    }
    EXPECT_EQ(manager.getAlarmAt("abc", 3, &name), kNoSuchStructure);
    EXPECT_EQ(manager.getAlarmAt("ab", 0, &name), kNoSuchGroup);

    // High bytes sort after ASCII, as unsigned characters.
    manager.addAlarm("bytes", "\xe9t\xe9", kNoLimit, false);
    manager.addAlarm("bytes", "zz", kNoLimit, false);
    ASSERT_EQ(manager.getAlarmAt("bytes", 0, &name), 0);
    EXPECT_EQ(name, "zz");

    // The empty name and a name holding a NUL are groups of their own.
    const std::string withNul("g\0h", 3);
    manager.addAlarm("", "e", kNoLimit, false);
    manager.addAlarm(withNul, "n", kNoLimit, false);
    ASSERT_EQ(manager.getAlarmAt("", 0, &name), 0);
    EXPECT_EQ(name, "e");
    ASSERT_EQ(manager.getAlarmAt(withNul, 0, &name), 0);
    EXPECT_EQ(name, "n");
    EXPECT_EQ(manager.getAlarmAt("g", 0, &name), kNoSuchGroup);

    // Resetting an unknown group creates nothing.
    EXPECT_EQ(manager.resetGroup("ghost"), 0);
    EXPECT_EQ(manager.getAlarmAt("ghost", 0, &name), kNoSuchGroup);
}

TEST(StartGroup, DestroyingTheManagerReleasesMembersWaitingWithoutLimit)
{
    auto manager = std::make_unique<AlarmStartGroupManager>();
    manager->addAlarm("G", "waiting", kNoLimit, false);
    manager->addAlarm("G", "never", kNoLimit, false);
    auto waiter = std::async(std::launch::async, [&] { return manager->waitForGroupStart("waiting"); });
    ASSERT_TRUE(eventually([&] { return manager->refCountOf("G") == 2; }));
    manager.reset();
    EXPECT_EQ(waiter.get(), kGroupStartTimedOut);
}

TEST(StartGroup, RepeatedRendezvousRoundsNeverLoseARelease)
{
    AlarmStartGroupManager manager;
    constexpr int kMembers = 3;
    constexpr int kRounds = 1000;
    // A lost release shows up as a time-out instead of hanging the test.
    for (int i = 0; i < kMembers; ++i)
        manager.addAlarm("ring", memberName(i), 20000, false);

    std::atomic<int> failures{0};
    std::atomic<bool> membersDone{false};
    std::vector<std::thread> members;
    for (int i = 0; i < kMembers; ++i) {
        members.emplace_back([&, i] {
            for (int round = 0; round < kRounds; ++round) {
                if (manager.waitForGroupStart(memberName(i)) != 0)
                    failures.fetch_add(1);
            }
        });
    }
    // The group API stays usable while members come and go.
    std::thread reader([&] {
        std::string name;
        while (!membersDone.load()) {
            if (manager.getAlarmAt("ring", 1, &name) != 0 || name != memberName(1))
                failures.fetch_add(1);
            manager.addAlarm("ring", memberName(0), 20000, false);
        }
    });
    for (auto& t : members)
        t.join();
    membersDone.store(true);
    reader.join();
    EXPECT_EQ(failures.load(), 0);
    EXPECT_EQ(manager.refCountOf("ring"), 1);
}

// ---- the exported functions ------------------------------------------------

class GroupAPI : public ::testing::Test {
protected:
    void TearDown() override
    {
        for (const char* group : {"api", "api2", ""}) {
            HostString name(group);
            ResetGroup__DRAVICON_pxalarms(name.get(), nullptr);
        }
    }
};

TEST_F(GroupAPI, AddListAndWalkPastTheEnd)
{
    HostString group("api");
    PXBoolean noMove = 0;
    testsupport::HostError error;
    AlarmAddToGroup__DRAVICON_pxalarms("zeta", group.get(), kNoLimit, &noMove, error.get());
    AlarmAddToGroup__DRAVICON_pxalarms("alpha", group.get(), kNoLimit, &noMove, error.get());
    // The same group again: nothing to report.
    AlarmAddToGroup__DRAVICON_pxalarms("zeta", group.get(), 10, &noMove, error.get());
    EXPECT_EQ(error.cluster.status, 0);

    std::vector<std::string> walked;
    HostString member;
    for (int32_t index = 0; index >= 0 && walked.size() < 5; ++index) {
        GetGroupMember__DRAVICON_pxalarms(group.get(), &index, member.out(), error.get());
        if (index < 0)
            break;
        walked.push_back(member.text());
    }
    EXPECT_EQ(walked, (std::vector<std::string>{"alpha", "zeta"}));
    EXPECT_EQ(error.cluster.status, 0);

    // Null handle: the group with the empty name.
    AlarmAddToGroup__DRAVICON_pxalarms("blank", nullptr, kNoLimit, &noMove, error.get());
    HostString empty("");
    int32_t index = 0;
    GetGroupMember__DRAVICON_pxalarms(empty.get(), &index, member.out(), error.get());
    EXPECT_EQ(member.text(), "blank");
    EXPECT_EQ(error.cluster.status, 0);
}

TEST_F(GroupAPI, FailuresCarryTheirCodeAndTheNameConcerned)
{
    HostString group("api");
    HostString group2("api2");
    PXBoolean noMove = 0;
    {
        testsupport::HostError error;
        AlarmAddToGroup__DRAVICON_pxalarms("mover", group.get(), kNoLimit, &noMove, error.get());
        AlarmAddToGroup__DRAVICON_pxalarms("mover", group2.get(), kNoLimit, &noMove, error.get());
        EXPECT_EQ(error.cluster.status, 1);
        EXPECT_EQ(error.cluster.code, kInOtherGroup);
        EXPECT_EQ(error.text(), kStructureLabel + "api2" + std::string(1, '\0'));
    }
    {
        // No such group: index and name handle untouched.
        testsupport::HostError error;
        HostString missing("missing");
        HostString member("previous");
        int32_t index = 0;
        GetGroupMember__DRAVICON_pxalarms(missing.get(), &index, member.out(), error.get());
        EXPECT_EQ(error.cluster.code, kNoSuchGroup);
        EXPECT_EQ(error.text(), kGroupLabel + "missing" + std::string(1, '\0'));
        EXPECT_EQ(index, 0);
        EXPECT_EQ(member.text(), "previous");
    }
    {
        // Abort always reports -810, for any group.
        testsupport::HostError error;
        HostString unknown("nowhere");
        AbortGroup__DRAVICON_pxalarms(unknown.get(), nullptr, error.get());
        EXPECT_EQ(error.cluster.status, 1);
        EXPECT_EQ(error.cluster.code, kGroupAborted);
        EXPECT_EQ(error.text(), kGroupLabel + "nowhere" + std::string(1, '\0'));
    }
    {
        // Resetting a group nobody made is no error and makes nothing.
        testsupport::HostError error;
        HostString ghost("ghost");
        ResetGroup__DRAVICON_pxalarms(ghost.get(), error.get());
        EXPECT_EQ(error.cluster.status, 0);
        int32_t index = 0;
        HostString member;
        GetGroupMember__DRAVICON_pxalarms(ghost.get(), &index, member.out(), error.get());
        EXPECT_EQ(error.cluster.code, kNoSuchGroup);
    }
}

TEST_F(GroupAPI, BadArgumentsAreReportedNotDereferenced)
{
    HostString group("api");
    PXBoolean noMove = 0;
    testsupport::HostError seed;
    AlarmAddToGroup__DRAVICON_pxalarms("one", group.get(), kNoLimit, &noMove, seed.get());
    {
        testsupport::HostError error;
        AlarmAddToGroup__DRAVICON_pxalarms("two", group.get(), kNoLimit, nullptr, error.get());
        EXPECT_EQ(error.cluster.code, kOtherFailure);
        AlarmAddToGroup__DRAVICON_pxalarms(nullptr, group.get(), kNoLimit, &noMove, error.get());
        EXPECT_EQ(error.cluster.code, kOtherFailure);
    }
    {
        testsupport::HostError error;
        HostString member("kept");
        int32_t index = -3;
        GetGroupMember__DRAVICON_pxalarms(group.get(), &index, member.out(), error.get());
        EXPECT_EQ(error.cluster.code, kNoSuchStructure);
        EXPECT_EQ(index, -3);
        EXPECT_EQ(member.text(), "kept");
    }
    {
        testsupport::HostError error;
        int32_t index = 0;
        GetGroupMember__DRAVICON_pxalarms(group.get(), &index, nullptr, error.get());
        EXPECT_EQ(error.cluster.code, kOtherFailure);
        GetGroupMember__DRAVICON_pxalarms(group.get(), nullptr, nullptr, error.get());
        EXPECT_EQ(error.cluster.code, kOtherFailure);
    }
    {
        // The host cannot hold the name: reported, and the handle is as it was.
        testsupport::HostError error;
        HostString member("kept");
        int32_t index = 0;
        hostsub::failNext(hostsub::HostCall::kDSSetHandleSize, 1);
        GetGroupMember__DRAVICON_pxalarms(group.get(), &index, member.out(), error.get());
        hostsub::reset();
        EXPECT_EQ(error.cluster.code, kOutOfMemory);
        EXPECT_EQ(member.text(), "kept");
    }
    // Only "one" went in.
    int32_t index = 1;
    HostString member;
    GetGroupMember__DRAVICON_pxalarms(group.get(), &index, member.out(), seed.get());
    EXPECT_EQ(index, -1);
    EXPECT_EQ(seed.cluster.status, 0);
}

TEST_F(GroupAPI, MissingReportRecordStopsNamingIt)
{
    HostString group("api");
    int32_t index = 0;
    HostString member;
    EXPECT_DEATH(GetGroupMember__DRAVICON_pxalarms(group.get(), nullptr, member.out(), nullptr),
                 "GetGroupMember__DRAVICON_pxalarms: Assertion `alarmIndex' failed");
    HostString missing("never made");
    EXPECT_DEATH(GetGroupMember__DRAVICON_pxalarms(missing.get(), &index, member.out(), nullptr),
                 "GetGroupMember__DRAVICON_pxalarms: Assertion `errorOut' failed");
    EXPECT_DEATH(AbortGroup__DRAVICON_pxalarms(group.get(), nullptr, nullptr),
                 "AbortGroup__DRAVICON_pxalarms: Assertion `errorOut' failed");
    PXBoolean noMove = 0;
    EXPECT_DEATH(AlarmAddToGroup__DRAVICON_pxalarms("x", group.get(), 0, nullptr, nullptr),
                 "AlarmAddToGroup__DRAVICON_pxalarms: Assertion `allowMove' failed");
    AlarmAddToGroup__DRAVICON_pxalarms("x", group.get(), 0, &noMove, nullptr);
    HostString group2("api2");
    EXPECT_DEATH(AlarmAddToGroup__DRAVICON_pxalarms("x", group2.get(), 0, &noMove, nullptr),
                 "AlarmAddToGroup__DRAVICON_pxalarms: Assertion `\\(error\\) != __null' failed");
}

TEST_F(GroupAPI, AbortReleasesMembersWaitingAtThatGroup)
{
    HostString group("api");
    PXBoolean noMove = 0;
    testsupport::HostError error;
    AlarmAddToGroup__DRAVICON_pxalarms("early", group.get(), kNoLimit, &noMove, error.get());
    AlarmAddToGroup__DRAVICON_pxalarms("missing", group.get(), kNoLimit, &noMove, error.get());
    auto early = std::async(std::launch::async,
                            [] { return g_startGroupManager->waitForGroupStart("early"); });
    ASSERT_TRUE(eventually([] { return g_startGroupManager->refCountOf("api") == 2; }));

    testsupport::HostError busy;
    ResetGroup__DRAVICON_pxalarms(group.get(), busy.get());
    EXPECT_EQ(busy.cluster.code, kGroupStarting);
    EXPECT_EQ(busy.text(), kGroupLabel + "api" + std::string(1, '\0'));

    testsupport::HostError aborted;
    AbortGroup__DRAVICON_pxalarms(group.get(), nullptr, aborted.get());
    EXPECT_EQ(aborted.cluster.code, kGroupAborted);
    EXPECT_EQ(early.get(), kGroupStartTimedOut);
    EXPECT_EQ(g_startGroupManager->refCountOf("api"), 1);
}
