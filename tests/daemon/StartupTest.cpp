#include <cstdlib>

#include "tavrind/TAVTracing.h"
#include "tests/support/DaemonFixture.h"

namespace tavrin::test {
namespace {

using StartupTest = DaemonTest;

TEST_F(StartupTest, EachSessionLoadsWithinItsLimits)
{
    start();
    ASSERT_EQ(device.loader.sessions.size(), 2u) << "for searches, and for the bag";
    for (const auto& session : device.loader.sessions) {
        const auto& configuration = session->configuration;
        const bool forSearches = configuration.cache.has_value();
        EXPECT_EQ(configuration.network, &device.network);
        EXPECT_EQ(configuration.meteredPurgeTimeout, std::optional<platform::Duration>(10s));
        EXPECT_EQ(configuration.totalTimeout, 5min);
        EXPECT_EQ(configuration.maximumResponseSize, 8u << 20);
        EXPECT_EQ(configuration.allowFastOpenAndTickets, forSearches);
        EXPECT_EQ(configuration.pipelining, forSearches);
        if (!forSearches) continue;
        EXPECT_EQ(configuration.cache->memoryCapacity, 1u << 20);
        EXPECT_EQ(configuration.cache->diskCapacity, 100u << 20);
        EXPECT_EQ(configuration.cache->minimumMappedSize, 16u << 10);
    }

    for (const auto& [identifier, loads] : device.background.loads)
        EXPECT_EQ(loads->configuration.totalTimeout, device.background.configurations.at(identifier).resourceTimeout)
            << "a slow transfer has until then";
}

TEST_F(StartupTest, SettingsAreReadAtStart)
{
    const std::string file = "/caches/com.quorvane.tavrind/session.7";
    start();
    EXPECT_TRUE(device.loader.sessions[0]->configuration.allowFastOpenAndTickets);
    const bool privateData = platform::Log::privateData.exchange(false);
    start();
    EXPECT_FALSE(platform::Log::privateData);
    device.userDefaults.set("TAVNoParallax", true);
    device.userDefaults.set("TAVLogPrivateData", true);
    start();
    EXPECT_FALSE(device.loader.sessions[0]->configuration.allowFastOpenAndTickets);
    EXPECT_TRUE(platform::Log::privateData);
    platform::Log::privateData = privateData;

    for (const auto& [age, kept] : {std::pair(7200.0, true), {3600.0, false}}) {
        device.userDefaults.set("TAVSessionMaxAge", age);
        device.files.directories.insert("/caches/com.quorvane.tavrind");
        device.files.files[file] = "";
        device.files.created[file] = device.clock.wallNow() - 5400s;
        start();
        EXPECT_EQ(device.files.files.contains(file), kept) << age;
    }
}

TEST(TracingDeathTest, IsSwitchedByItsSettingOncePerProcess)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // in processes of their own, which have read nothing yet
    for (const bool enabled : {false, true})
        EXPECT_EXIT(
            {
                platform::test::TestDevice device;
                device.userDefaults.set("TraceEnabled", enabled);
                TAVTracingSetup(device.userDefaults);
                device.userDefaults.set("TraceEnabled", !enabled);
                TAVTracingSetup(device.userDefaults);
                std::exit(TAVTraceEnabled ? 7 : 8);
            },
            testing::ExitedWithCode(enabled ? 7 : 8), "");
}

TEST_F(StartupTest, WhatStartedTheDaemonIsLogged)
{
    const LogCapture log;
    device.device.launchEvents = {"due.timer", "daemon.socket"};
    start();
    EXPECT_EQ(log.count("launch event for due.timer"), 1);
    EXPECT_EQ(log.count("launch event for daemon.socket"), 1);
}

} // namespace
} // namespace tavrin::test
