#include "platform/device/ActivityScheduler.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "platform/device/ActivityPolicy.h"
#include "platform/device/DeviceUseLogind.h"
#include "tests/support/ByHand.h"
#include "tests/support/FakeActivities.h"
#include "tests/support/MemoryFiles.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
using enum ActivityState;

// ---- decisions ----

TEST(ActivityPolicy, CriteriaLookAtWhatTheyNameOnly)
{
    const DeviceUse busy{.onBattery = true, .screenInUse = true, .unlocked = false};
    const std::pair<ActivityCriteria, bool> cases[]{
        {{}, false},
        {{.allowBattery = false}, true},
        {{.requireScreenSleep = true}, true},
        {{.requireFirstUnlock = true}, true},
        {{.repeating = true, .delay = 1s, .maintenance = true}, false},
    };
    for (const auto& [criteria, depend] : cases) {
        EXPECT_EQ(dependOnUse(criteria), depend);
        EXPECT_EQ(criteriaHold(criteria, busy), !depend);
        EXPECT_TRUE(criteriaHold(criteria, {}));
    }
}

TEST(ActivityPolicy, WakesOnceForAllThatCanBeTogether)
{
    const std::pair<std::vector<ActivityWindow>, std::optional<Duration>> cases[]{
        {{}, std::nullopt},
        {{{100s, 300s}}, 100s},
        {{{100s, 300s}, {250s, 0s}}, 250s},
        {{{100s, 300s}, {400s, 0s}}, 400s},
        {{{100s, 300s}, {401s, 0s}}, 100s},
        {{{100s, 0s}, {50s, 20s}}, 50s},
        {{{100s, 300s}, {200s, 50s}, {240s, 100s}, {260s, 0s}}, 240s},
        {{{-5s, 0s}, {10s, 0s}}, -5s},
    };
    for (const auto& [windows, wake] : cases) EXPECT_EQ(wakeTime(windows), wake) << windows.size();
}

TEST(ActivityPolicy, TheFirstRunComesAfterTheDelayAndWhenAnEarlierProcessSaid)
{
    const ActivityCriteria repeating{.repeating = true, .delay = 300s, .interval = 600s};
    const std::pair<std::optional<Duration>, Duration> cases[]{{std::nullopt, 1300s}, {900s, 1300s},   {1400s, 1400s},
                                                               {1600s, 1600s},        {99999s, 1600s}, {-1s, 1300s}};
    for (const auto& [kept, due] : cases) EXPECT_EQ(firstDue(repeating, 1000s, kept), due);
    EXPECT_EQ(firstDue({.delay = 1s, .interval = 600s}, 1000s, 1500s), 1001s) << "no interval is kept to";
}

TEST(DeviceUseTest, PowerSuppliesSayWhatTheDeviceRunsOn)
{
    const std::pair<std::map<std::string, std::map<std::string, std::string>>, bool> cases[]{
        {{}, false},
        {{{"BAT0", {{"type", "Battery\n"}, {"present", "1\n"}}}}, true},
        {{{"BAT0", {{"type", "Battery\n"}}}, {"AC", {{"type", "Mains\n"}, {"online", "0\n"}}}}, true},
        {{{"BAT0", {{"type", "Battery\n"}}}, {"AC", {{"type", "Mains\n"}, {"online", "1\n"}}}}, false},
        {{{"BAT0", {{"type", "Battery\n"}}}, {"usb", {{"type", "USB\n"}, {"online", "1\n"}}}}, false},
        {{{"BAT0", {{"type", "Battery\n"}, {"present", "0\n"}}}}, false},
        {{{"hidpp", {{"type", "Battery\n"}, {"scope", "Device\n"}}}}, false},
        {{{"odd", {}}}, false},
    };
    for (const auto& [supplies, onBattery] : cases) {
        const test::TemporaryDirectory root;
        for (const auto& [name, lines] : supplies) {
            std::filesystem::create_directory(root / name);
            for (const auto& [file, line] : lines) test::writeFile(root / name / file, line);
        }
        EXPECT_EQ(isOnBattery(root.path), onBattery);
    }
    EXPECT_FALSE(isOnBattery("/nowhere"));
}

// ---- the scheduler ----

struct ActivitySchedulerTest : testing::Test, test::ByHand {
    ActivitySchedulerTest() { start(); }
    ~ActivitySchedulerTest() override { kill(); }

    void start()
    {
        scheduler = makeActivityScheduler(
            {.clock = clock, .executor = executor, .files = files, .use = use, .file = "/state/activities.json"});
    }
    void kill()
    {
        held.clear();
        scheduler.reset();
        executor.drain();
    }
    /// Registers an activity whose runs are noted, with their second; `act` is what its handler does.
    void add(const std::string& name, const ActivityCriteria& criteria,
             std::function<void(const std::shared_ptr<Activity>&)> act = {})
    {
        scheduler->registerActivity(name, criteria, [this, act](const std::shared_ptr<Activity>& activity) {
            if (activity->state() == ActivityState::Run)
                runs.push_back(
                    fmt::format("{} {}", activity->identifier(), (clock.hostTicks() - began) / 1'000'000'000));
            if (act) act(activity);
        });
        advance(0s);
    }
    std::vector<std::string> taken() { return std::exchange(runs, {}); }
    void expectOneRunAfter(Duration time)
    {
        advance(time - 1s);
        EXPECT_TRUE(taken().empty());
        advance(1s);
        EXPECT_EQ(taken().size(), 1u);
    }

    test::MemoryFiles files;
    test::FakeDeviceUse use{executor};
    std::unique_ptr<ActivityScheduler> scheduler;
    const std::uint64_t began = clock.hostTicks();
    std::vector<std::string> runs;
    std::vector<std::shared_ptr<Activity>> held;
    /// A handler whose runs go on until a test ends them.
    const std::function<void(const std::shared_ptr<Activity>&)> hold = [this](const auto& activity) {
        if (activity->setState(Continue)) held.push_back(activity);
    };
    using Runs = std::vector<std::string>;
    const ActivityCriteria flush{.repeating = true, .delay = 300s, .gracePeriod = 300s, .interval = 600s};
};

TEST_F(ActivitySchedulerTest, RunsAfterTheDelayAndThenAtTheInterval)
{
    add("a", flush);
    add("once", {.delay = 100s});
    advance(2000s);
    EXPECT_EQ(taken(), (Runs{"once 100", "a 300", "a 900", "a 1500"}));
    EXPECT_EQ(clock.pendingTimers(), 1u);
    EXPECT_EQ(use.asked, 0) << "nothing is asked that isn't needed";
    scheduler->unregister("a");
    executor.drain();
    EXPECT_EQ(clock.pendingTimers(), 0u);
    advance(1h);
    EXPECT_TRUE(taken().empty());
}

TEST_F(ActivitySchedulerTest, CompanyIsWaitedForWithinTheGrace)
{
    add("a", flush);
    add("b", {.delay = 450s});
    advance(1000s);
    EXPECT_EQ(taken(), (Runs{"a 450", "b 450"}));
}

TEST_F(ActivitySchedulerTest, AProcessThatIsKilledOftenRunsActivitiesAndNoneMoreOften)
{
    for (const Duration life : {301s, 400s, 1000s, 5000s}) {
        files.files.clear();
        taken();
        const auto from = clock.hostTicks();
        while (clock.hostTicks() - from < 86'400'000'000'000u) {
            start();
            add("a", flush);
            advance(life);
            kill();
            advance(10s); // until something starts it again
        }
        const auto count = taken().size();
        EXPECT_LE(count, 24u * 6 + 1) << toSeconds(life);
        EXPECT_GE(count, 24u * 4 - 1) << toSeconds(life);
    }
}

TEST_F(ActivitySchedulerTest, ARunThatTheProcessDoesntSurviveIsNotRepeatedAtOnce)
{
    add("a", flush, hold);
    advance(300s);
    EXPECT_EQ(taken().size(), 1u);
    const auto disk = files.files;
    kill();
    files.files = disk; // as it was while the run was under way
    start();
    add("a", {.repeating = true, .interval = 600s});
    advance(599s);
    EXPECT_TRUE(taken().empty());
    advance(2s);
    EXPECT_EQ(taken().size(), 1u);
}

TEST_F(ActivitySchedulerTest, LeapsOfTheClockNeitherHoldBackNorHurry)
{
    for (const Duration leap : {24h * 365 * 30, -24h * 365 * 30, -2h, 24h * 8}) {
        SCOPED_TRACE(toSeconds(leap));
        add("a", flush);
        expectOneRunAfter(300s);
        clock.setWall(clock.wallNow() + leap);
        expectOneRunAfter(600s);
        kill();
        clock.setWall(clock.wallNow() + leap);
        start();
        add("a", {.repeating = true, .interval = 600s});
        expectOneRunAfter(600s);
        scheduler->unregister("a");
    }
    kill();
    clock.suspend(24h); // or a day without the process
    start();
    add("a", {.repeating = true, .interval = 600s});
    EXPECT_EQ(taken().size(), 1u);
}

TEST_F(ActivitySchedulerTest, StatesMoveOnOnly)
{
    using Moves = std::vector<std::pair<ActivityState, bool>>; // and whether each is accepted
    const std::pair<Moves, Duration> cases[]{
        {{}, 600s},
        {{{Done, true}, {Done, false}, {Continue, false}}, 600s},
        {{{Wait, false},
          {ActivityState::Run, false},
          {CheckIn, false},
          {Continue, true},
          {Continue, false},
          {Done, true}},
         600s},
        {{{Defer, true}, {Done, false}}, 300s},
        {{{Continue, true}, {Defer, true}, {Done, false}}, 300s},
        {{{Continue, true}}, 600s}, // and let go of
    };
    for (const auto& [moves, again] : cases) {
        int calls = 0;
        add("a", {.repeating = true, .interval = 600s}, [&](const auto& activity) {
            if (activity->state() == CheckIn) {
                EXPECT_FALSE(activity->setState(ActivityState::Run) || activity->setState(Done));
                return;
            }
            if (++calls > 1) return;
            for (const auto& [state, accepted] : moves)
                EXPECT_EQ(activity->setState(state), accepted) << static_cast<int>(state);
        });
        EXPECT_EQ(calls, 1);
        advance(again - 1s);
        EXPECT_EQ(calls, 1);
        advance(1s);
        EXPECT_EQ(calls, 2);
        scheduler->unregister("a");
        executor.drain();
    }
}

TEST_F(ActivitySchedulerTest, ALongRunIsNotRepeatedBesideItself)
{
    add("a", {.repeating = true, .interval = 600s}, hold);
    advance(1h);
    EXPECT_EQ(taken(), (Runs{"a 0"}));
    EXPECT_TRUE(held.at(0)->setState(Done));
    advance(1s);
    EXPECT_EQ(taken(), (Runs{"a 3600"}));
}

TEST_F(ActivitySchedulerTest, CriteriaFromTheCheckInAreWaitedFor)
{
    add("a", {}, [](const auto& activity) {
        activity->setCriteria({.repeating = true, .interval = 12h, .maintenance = true, .requireScreenSleep = true});
    });
    advance(1s);
    use.now.screenInUse = true;
    advance(12h);
    EXPECT_EQ(taken(), (Runs{"a 0"}));
    use.now.screenInUse = false;
    advance(5min);
    EXPECT_EQ(taken().size(), 1u);
}

TEST_F(ActivitySchedulerTest, ARunHearsThatItHadBetterStop)
{
    add("a", {.allowBattery = false}, hold);
    ASSERT_EQ(held.size(), 1u);
    EXPECT_FALSE(held[0]->shouldDefer());
    use.now.onBattery = true;
    (void)held[0]->shouldDefer();
    executor.drain();
    EXPECT_TRUE(held[0]->shouldDefer());
}

TEST_F(ActivitySchedulerTest, ANewRegistrationTakesTheOldOnesPlace)
{
    add("a", flush, hold);
    advance(300s);
    add("a", {.repeating = true, .delay = 10s, .interval = 600s});
    EXPECT_TRUE(held.at(0)->setState(Done)) << "ends on its own";
    advance(700s);
    EXPECT_EQ(taken(), (Runs{"a 300", "a 900"})) << "what was due stays so";
}

TEST_F(ActivitySchedulerTest, WithoutAUsableFileActivitiesRunByTimer)
{
    for (const char* contents : {"", "{", "[]", R"({"time": 7})", R"({"time": "1 2 3 b", "due": {"a": "x"}})",
                                 R"({"time": "9223372036854775807 -9223372036854775808 0 b",
                                     "due": {"a": 9223372036854775807}})"}) {
        kill();
        files.files["/state/activities.json"] = contents;
        start();
        add("a", flush);
        advance(600s);
        EXPECT_EQ(taken().size(), 1u) << contents;
    }
    files.fault = [](std::string_view operation, const auto&) { return operation == "write" ? ENOSPC : 0; };
    advance(1200s);
    EXPECT_EQ(taken().size(), 2u) << "a full disk loses the due times only";
}

} // namespace
} // namespace platform
