#include <gtest/gtest.h>

#include "platform/net/UrlSession.h"
#include "tests/support/DaemonFixture.h"

namespace tavrin::test {
namespace {

using namespace std::chrono_literals;
using UrlSessionsTest = DaemonTest;

TEST_F(UrlSessionsTest, EachSessionLoadsWithinItsLimits)
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
        EXPECT_EQ(configuration.cache->minimumMappedSize, 16384u);
    }

    const auto& downloads = device.background.configurations.at("com.quorvane.tavrind");
    EXPECT_FALSE(downloads.allowsMetered);
    EXPECT_EQ(downloads.resourceTimeout, 24h);
    const auto& uploads = device.background.configurations.at("com.quorvane.tavrind.flusher.nsurlsession");
    EXPECT_TRUE(uploads.allowsMetered);
    EXPECT_EQ(uploads.requestTimeout, 300s);
    EXPECT_EQ(uploads.resourceTimeout, 24h * 7);
    for (const auto& [identifier, loads] : device.background.loads)
        EXPECT_EQ(loads->configuration.totalTimeout, device.background.configurations.at(identifier).resourceTimeout)
            << "a slow transfer has until then";
}

} // namespace
} // namespace tavrin::test
