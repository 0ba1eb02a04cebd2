#include "platform/net/BackgroundPolicy.h"

#include <cerrno>

#include <gtest/gtest.h>

#include "platform/net/NetworkStatus.h"
#include "platform/net/NetworkStatusNetworkManager.h"
#include "platform/net/UrlSession.h"
#include "platform/run/LivedTime.h"
#include "tests/support/ManualClock.h"

namespace platform {
namespace {

using namespace std::chrono_literals;

TEST(BackgroundPolicy, DelaysSpreadDevicesThatFailedTogether)
{
    const struct {
        unsigned failures;
        Duration shortest, longest;
    } cases[]{{0, 15s, 30s}, {1, 15s, 30s}, {2, 30min, 2h}, {3, 1h, 4h}, {4'000'000'000u, 1h, 4h}};
    for (const auto& c : cases) {
        EXPECT_EQ(retryDelay(c.failures, 0), c.shortest) << c.failures;
        EXPECT_EQ(retryDelay(c.failures, 1), c.longest) << c.failures;
        EXPECT_EQ(retryDelay(c.failures, 0.5), (c.shortest + c.longest) / 2) << c.failures;
    }
    EXPECT_EQ(startDelay(1h, 0.25), 15min);
}

TEST(BackgroundPolicy, OnlyWhatMayGetBetterIsTriedAgain)
{
    const auto better = [](std::string_view domain, std::int64_t code) {
        return isTransient(Error(std::string(domain), code));
    };
    for (const auto code : {kUrlTimedOut, kUrlConnectionLost, kUrlTlsFailed, kUrlBadResponse, kUrlCannotConnect,
                            kUrlCannotFindHost, kUrlNotConnected})
        EXPECT_TRUE(better(kUrlErrorDomain, code)) << code;
    for (const auto code :
         {kUrlBadUrl, kUrlForbiddenRedirect, kUrlTooLarge, kUrlTooManyRedirects, kUrlUnsupported, kUrlCancelled})
        EXPECT_FALSE(better(kUrlErrorDomain, code)) << code;
    for (const int code : {ENOSPC, EDQUOT, EROFS, EIO, EMFILE, ENOMEM})
        EXPECT_TRUE(better(kPosixErrorDomain, code)) << code;
    EXPECT_FALSE(better(kPosixErrorDomain, ENOENT) || better(kPosixErrorDomain, EBADMSG) || better("other", 1));
}

TEST(BackgroundPolicy, RetryAfterIsSecondsOrADate)
{
    const Date now = dateFromSecondsSince1970(784111777); // Sun, 06 Nov 1994 08:49:37 GMT
    const struct {
        std::string_view field;
        std::optional<Duration> shortest, longest;
    } cases[]{
        {"0", 0s, 0s},
        {"120", 120s, 180s},
        {"80000", 80000s, 24h},
        {"86401", 24h, 24h},
        {"99999999999999999999999", 24h, 24h},
        {"Sun, 06 Nov 1994 08:59:37 GMT", 10min, 40min},
        {"Sunday, 06-Nov-94 08:59:37 GMT", 10min, 40min},
        {"Sun, 06 Nov 1994 08:49:37 GMT", 0s, 0s},
        {"Sun, 06 Nov 2094 08:49:37 GMT", 24h, 24h},
        {"", {}, {}},
        {"-5", {}, {}},
        {"1.5", {}, {}},
        {"soon", {}, {}},
        {"Sun, 06 Nov 1994 08:59:37 GMT                                            x", {}, {}},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(retryAfter(c.field, now, 0), c.shortest) << c.field;
        EXPECT_EQ(retryAfter(c.field, now, 1), c.longest) << c.field;
    }
}

TEST(LivedTime, CountsAbsenceAndSuspendButNoLeaps)
{
    const Date then = dateFromSecondsSince1970(1767225600);
    const struct {
        const char* name;
        Duration wall, bootTicks; ///< at the second reading; at the first the ticks are an hour
        const char* boot;         ///< at the second reading; at the first "a"
        Duration passed;
    } cases[]{
        {"nothing", 0s, 1h, "a", 0s},
        {"running, or suspended", 5s, 1h + 5s, "a", 5s},
        {"clock set ahead", 8 * 24h, 1h + 5s, "a", 5s},
        {"clock set back", -10h, 1h + 5s, "a", 5s},
        {"ticks of a damaged file", 5s, 0s, "a", 0s},
        {"off for a day", 24h, 10s, "b", 24h},
        {"off for a moment", 10s, 10s, "b", 10s},
        {"off, and the clock set back", -1h, 10s, "b", 10s},
        {"off for ten months", 24h * 300, 0s, "b", 24h * 300},
        {"off, and the clock set far ahead", 24h * 400, 5s, "b", 5s},
        {"off, and a date beyond all", Duration::max(), 5s, "b", 5s},
        {"unknown starts", 24h, 10s, "", 24h},
    };
    for (const auto& c : cases) {
        const Date wall = c.wall == Duration::max() ? Date::max() : then + c.wall;
        const std::string boot = *c.boot ? "a" : "";
        EXPECT_EQ(timePassed({then, static_cast<std::uint64_t>(Duration(1h).count()), boot},
                             {wall, static_cast<std::uint64_t>(c.bootTicks.count()), c.boot}),
                  c.passed)
            << c.name;
    }
}

TEST(LivedTime, AMarkReadsBackAndOneFromADamagedFileStillCounts)
{
    test::ManualClock clock;
    LivedTime running(clock);
    clock.suspend(1h);
    const LivedTime::Mark mark = running.mark();
    EXPECT_EQ(mark.lived, 1h);
    clock.hasBootId = false;
    clock.suspend(5s);
    EXPECT_EQ(running.now(), 1h + 5s) << "a process lives in one boot";
    clock.hasBootId = true;
    EXPECT_EQ(LivedTime::Mark::parse(mark.text()), mark);
    for (const char* broken : {"", "1", "1 2", "1 2 3", "x 2 3 b", "1 2 -3 b"})
        EXPECT_FALSE(LivedTime::Mark::parse(broken)) << broken;
    for (const char* text : {"9223372036854775807 9223372036854775807 18446744073709551615 boot 1",
                             "-9223372036854775808 -9223372036854775808 0 boot 1", "-1 0 0 ", "3600 0 0 other"}) {
        LivedTime time(clock, LivedTime::Mark::parse(text).value());
        const Duration before = time.now();
        EXPECT_GE(before, 0s) << text;
        clock.advance(1min, [] {});
        EXPECT_EQ(time.now() - before, 1min) << text;
    }
}

TEST(NetworkStatusTest, TellsChangesToWhoeverStillListens)
{
    int asked = 0;
    NetworkStatus status([&] { ++asked; });
    EXPECT_EQ(asked, 0);
    EXPECT_EQ(status.current(), std::nullopt) << "not known before the source has answered";
    int one = 0, two = 0;
    auto first = status.observe([&](const NetworkState&) { ++one; });
    const auto second = status.observe([&](const NetworkState& state) { two += state.metered ? 10 : 1; });
    status.set({});
    status.set({});
    first.reset();
    status.set({.metered = true});
    EXPECT_EQ(asked, 1);
    EXPECT_EQ(one, 1);
    EXPECT_EQ(two, 11);
}

TEST(NetworkStatusTest, ReadsNetworkManagersNumbers)
{
    const struct {
        std::uint32_t state, metered;
        NetworkState expected;
    } cases[]{
        {70, 2, {true, false}}, {70, 1, {true, true}},   {70, 3, {true, true}},  {70, 4, {true, false}},
        {60, 0, {true, false}}, {50, 0, {false, false}}, {20, 1, {false, true}}, {10, 0, {false, false}},
        {0, 0, {true, false}},  {99, 99, {true, false}},
    };
    for (const auto& c : cases)
        EXPECT_EQ(networkStateOf(c.state, c.metered), c.expected) << c.state << " " << c.metered;
}

} // namespace
} // namespace platform
