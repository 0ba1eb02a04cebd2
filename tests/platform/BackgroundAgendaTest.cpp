#include "platform/net/BackgroundAgenda.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

using namespace std::chrono_literals;
using Tasks = std::vector<BackgroundAgenda::TaskId>;

TEST(BackgroundAgenda, SaysWhatMayBeginWhatIsOverAndWhenToLookAgain)
{
    using Plan = BackgroundAgenda::Plan;
    const struct {
        const char* name;
        std::vector<Plan> plans; ///< of the tasks 1, 2, …, put at 0
        std::vector<std::pair<std::string, Duration>> holds;
        Duration now;
        Tasks expired;
        Tasks begun; ///< in this order, each put under way at once
        std::optional<Duration> due;
    } cases[]{
        {"ready", {{"a", 0s, 90s}}, {}, 0s, {}, {1}, 90s},
        {"waits", {{"a", 10s, 90s}}, {}, 9s, {}, {}, 10s},
        {"has waited", {{"a", 10s, 90s}}, {}, 10s, {}, {1}, 90s},
        {"deadline before the wait ends", {{"a", 95s, 90s}}, {}, 89s, {}, {}, 90s},
        {"out of time while it waits", {{"a", 95s, 90s}}, {}, 90s, {1}, {}, {}},
        {"out of time, under way", {{"a", 0s, 90s, true}}, {}, 90s, {1}, {}, {}},
        {"under way begins once", {{"a", 0s, 90s, true}}, {}, 0s, {}, {}, 90s},
        {"two at once, in order", {{"a", 0s, 90s}, {"a", 5s, 80s}, {"a", 0s, 70s}}, {}, 6s, {}, {1, 2}, 70s},
        {"one place left", {{"a", 0s, 90s, true}, {"a", 0s, 90s}, {"a", 0s, 90s}}, {}, 0s, {}, {2}, 90s},
        {"an ended one makes room", {{"a", 0s, 5s, true}, {"a", 0s, 90s, true}, {"a", 0s, 90s}}, {}, 5s, {1}, {3}, 90s},
        {"earliest deadline first", {{"a", 0s, 6s}, {"a", 0s, 5s}}, {}, 9s, {2, 1}, {}, {}},
        {"host on hold", {{"a", 0s, 90s}, {"b", 0s, 90s}}, {{"a", 20s}}, 0s, {}, {2}, 20s},
        {"hold is over", {{"a", 0s, 90s}}, {{"a", 20s}}, 20s, {}, {1}, 90s},
        {"hold beyond the deadline", {{"a", 0s, 90s}}, {{"a", 200s}}, 0s, {}, {}, 90s},
        {"hold and wait", {{"a", 30s, 90s}}, {{"a", 40s}}, 31s, {}, {}, 40s},
        {"a later hold replaces", {{"a", 0s, 90s}}, {{"a", 40s}, {"a", 5s}}, 5s, {}, {1}, 90s},
        {"hold doesn't stop what is under way", {{"a", 0s, 90s, true}}, {{"a", 40s}}, 0s, {}, {}, 90s},
    };
    for (const auto& c : cases) {
        BackgroundAgenda agenda(2);
        for (std::size_t i = 0; i < c.plans.size(); ++i) agenda.put(i + 1, c.plans[i], 0s);
        for (const auto& [host, until] : c.holds) agenda.hold(host, until);
        EXPECT_EQ(agenda.takeExpired(c.now), c.expired) << c.name;
        Tasks begun;
        while (const auto task = agenda.next(c.now)) {
            begun.push_back(*task);
            Plan plan = c.plans[*task - 1];
            plan.underWay = true;
            agenda.put(*task, plan, c.now);
        }
        EXPECT_EQ(begun, c.begun) << c.name;
        EXPECT_EQ(agenda.nextDue(), c.due) << c.name;
    }
}

TEST(BackgroundAgenda, ARemovedTaskGivesItsPlaceBack)
{
    BackgroundAgenda agenda(1);
    agenda.put(1, {"a", 0s, 90s, true}, 0s);
    agenda.put(2, {"a", 0s, 80s}, 0s);
    EXPECT_FALSE(agenda.next(0s));
    agenda.put(1, {"a", 30s, 90s}, 0s); // failed, tried again later
    EXPECT_EQ(agenda.next(0s), 2u);
    agenda.remove(1);
    agenda.remove(1);
    agenda.remove(2);
    EXPECT_FALSE(agenda.next(0s));
    EXPECT_FALSE(agenda.nextDue());
}

} // namespace
} // namespace platform
