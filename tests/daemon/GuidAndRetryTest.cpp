#include "tavrind/TAVRetryableNetworkRequest.h"
#include "tavrind/TavrinUserGUIDController.h"
#include "tests/support/AssemblyFixture.h"

namespace tavrin {
namespace {

using UserGUIDTest = test::AssemblyTest;

TEST_F(UserGUIDTest, RollsAfterFifteenMinutesOrOnResetAndTellsOnce)
{
    int told = 0;
    const auto token = device.notifications.observe(TAVUserGUIDChangeNotification, [&](const auto&) { ++told; });
    const auto controller = std::make_shared<TavrinUserGUIDController>(assembly);

    const auto first = controller->currentUserGUID();
    device.advance(899s);
    EXPECT_EQ(controller->currentUserGUID(), first);
    device.drain();
    EXPECT_EQ(told, 0);

    device.advance(1s);
    EXPECT_EQ(told, 0) << "nothing fires by itself";
    const auto second = controller->currentUserGUID();
    EXPECT_NE(second, first);
    EXPECT_EQ(told, 0) << "never while a caller waits";
    device.drain();
    EXPECT_EQ(told, 1);

    controller->reset();
    EXPECT_NE(controller->currentUserGUID(), second) << "a reading after a reset sees it";
    device.drain();
    EXPECT_EQ(told, 2);
    EXPECT_EQ(device.counters.value("com.quorvane.tavrind.userguid"), 2);
    device.advance(899s);
    (void)controller->currentUserGUID();
    device.drain();
    EXPECT_EQ(told, 2) << "a roll begins the fifteen minutes anew";
    const auto third = controller->currentUserGUID();
    device.clock.setWall(device.clock.wallNow() - 24h);
    EXPECT_NE(controller->currentUserGUID(), third) << "else it would last for a day";
}

TEST(RetryableRequest, RepeatsFailuresUntilItsDeadlineOrItsRetriesEnd)
{
    const platform::Date now = platform::test::ManualClock().wallNow();
    const struct {
        std::optional<platform::Date> expire;
        bool delayOnFail;
        unsigned retries;
        int sent; // attempts that a service that always fails sees
        platform::Duration apart;
        int status = 0; // which is an answer
    } cases[]{
        {now + 1min, true, 3, 4, 1500ms}, {now + 1min, false, 3, 4, 0ms},     {now + 1min, true, 0, 1, 1500ms},
        {now + 2s, true, 3, 3, 1500ms},   {std::nullopt, true, 5, 1, 1500ms}, {now + 1min, false, 3, 1, 0ms, 500},
    };
    for (const auto& attempts : cases) {
        platform::test::TestDevice device;
        auto session = device.loader.makeSession({}, device.device.globalQueue(platform::Priority::Default));
        auto& tasks = device.loader.sessions[0]->tasks;
        int completions = 0;
        platform::UrlRequest request;
        request.url = *Url::parse("https://s.example/");
        dataTaskWithRetryableRequest(device.device, session, {request, attempts.expire, attempts.delayOnFail}, 1,
                                     attempts.retries,
                                     [&](auto, auto response, auto error, Value timing) {
                                         ++completions;
                                         EXPECT_EQ(error.has_value(), attempts.status == 0);
                                         EXPECT_EQ(response ? response->statusCode : 0, attempts.status);
                                         EXPECT_EQ(timing, Value(attempts.sent)) << "the last attempt's";
                                     })
            ->resume();
        for (std::size_t i = 0; i < tasks.size(); ++i) {
            ASSERT_TRUE(tasks[i]->resumed);
            tasks[i]->timing = i + 1;
            attempts.status > 0 ? tasks[i]->respond(attempts.status) : tasks[i]->fail(platform::Error("X", 1));
            device.drain();
            if (attempts.apart > 0ms) {
                EXPECT_EQ(tasks.size(), i + 1) << "waits before it repeats";
                device.advance(attempts.apart - 1ns);
                EXPECT_EQ(tasks.size(), i + 1);
            }
            device.advance(attempts.apart > 0ms ? 1ns : 0ns);
        }
        EXPECT_EQ(static_cast<int>(tasks.size()), attempts.sent);
        EXPECT_EQ(completions, 1);
    }
}

} // namespace
} // namespace tavrin
