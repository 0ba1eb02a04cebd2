#include "platform/device/SubscriptionServices.h"

#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/run/RunLoop.h"
#include "platform/values/Json.h"
#include "tests/support/LogCapture.h"
#include "tests/support/ManualClock.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
using test::writeFile;

TEST(Subscriptions, CountForListedProvidersUntilTheyExpireOrAreNoLongerTrusted)
{
    const Date now = dateFromSecondsSince1970(1'000'000);
    const SubscriptionQuery query{
        .bundleIdentifiers = {"org.example.Daily"}, .domains = {"daily.example"}, .maximumExpiration = 1h};
    const struct {
        const char* json;
        Duration age;
        bool active;
    } cases[]{
        {R"({"bundleIdentifier": "org.example.Daily"})", 0s, true},
        {R"({"domains": ["other.example", "Daily.EXAMPLE"]})", 0s, true},
        {R"({"bundleIdentifier": "org.example.daily", "domains": "daily.example"})", 0s, false},
        {R"({"domains": [1, "sub.daily.example"]})", 0s, false},
        {R"({})", 0s, false},
        {R"({"bundleIdentifier": "org.example.Daily", "active": false})", 0s, false},
        {R"({"bundleIdentifier": "org.example.Daily", "active": "no"})", 0s, true},
        {R"({"bundleIdentifier": "org.example.Daily", "expires": 1000000})", 0s, false},
        {R"({"bundleIdentifier": "org.example.Daily", "expires": 1000000.5})", 0s, true},
        {R"({"bundleIdentifier": "org.example.Daily", "expires": 1e300})", 1h - 1ns, true},
        {R"({"bundleIdentifier": "org.example.Daily", "expires": 1e300})", 1h, false},
    };
    for (const auto& c : cases)
        EXPECT_EQ(isActiveSubscription(*parseJson(c.json), now - c.age, query, now), c.active) << c.json;
}

TEST(Subscriptions, AreReadFromSoundFilesAndWatched)
{
    test::LogCapture log;
    test::TemporaryDirectory directory;
    const auto files = makeSystemFiles();
    test::ManualClock clock;
    RunLoop loop;
    const auto subscriptions = makeSubscriptionServices(*files, directory / "app/subscriptions.d", loop, clock);
    int told = 0;
    subscriptions->onChange([&] { ++told; });
    const SubscriptionQuery query{.bundleIdentifiers = {"a"}, .maximumExpiration = 24h * 36500};
    EXPECT_TRUE(subscriptions->activeServices(query)->empty()) << "no directory";
    loop.runOnce(Duration::zero()); // the watch is there now
    EXPECT_EQ(std::exchange(told, 0), 1) << "for what changed before";

    const auto write = [&](const std::string& name, std::string_view contents) {
        std::filesystem::create_directories(directory / "app/subscriptions.d");
        writeFile(directory / "app/subscriptions.d" / name, contents);
    };
    write("10-daily.json", R"({"provider": "daily", "bundleIdentifier": "a", "type": "old"})");
    write("20-daily.json", R"({"provider": "daily", "bundleIdentifier": "a", "type": "new"})");
    write("weekly.json", R"({"provider": "weekly", "bundleIdentifier": "a"})");
    write("weekly2.json", R"({"provider": "weekly", "bundleIdentifier": "a", "active": false})");
    write("broken.json", "{");
    write("nobody.json", R"({"provider": "", "bundleIdentifier": "a"})");
    write("array.json", "[]");
    write("long.json", R"({"provider": "x", "bundleIdentifier": "a", "y": ")" + std::string(5000, 'y') + "\"}");
    write("notes.txt", R"({"provider": "z", "bundleIdentifier": "a"})");
    const auto services = subscriptions->activeServices(query);
    ASSERT_TRUE(services);
    EXPECT_EQ(services->size(), 1u);
    EXPECT_EQ(services->at("daily")["type"], Value("new"));
    EXPECT_EQ(log.count("can't be read"), 2);
    EXPECT_EQ(log.count("has no \"provider\""), 2);
    EXPECT_TRUE(test::runUntil(loop, [&] { return told > 0; }));

    for (int i = 0; i < 100; ++i) write(fmt::format("many-{}.json", i), "{}");
    EXPECT_TRUE(subscriptions->activeServices(query));
    EXPECT_TRUE(log.count("subscription files, 64 are read"));
    const auto notThere = makeSubscriptionServices(*files, directory / "app/subscriptions.d/notes.txt", loop, clock);
    EXPECT_FALSE(notThere->activeServices(query)) << "a file in place of the directory";
}

} // namespace
} // namespace platform
