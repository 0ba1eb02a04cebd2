#include "platform/net/HttpCachePolicy.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

using std::chrono::seconds;

/// 1 January 2026, 00:00:00.
const Date kReceived = dateFromSecondsSince1970(1767225600);
constexpr const char* kNowText = "Thu, 01 Jan 2026 00:00:00 GMT";
constexpr const char* kTenDaysAgo = "Mon, 22 Dec 2025 00:00:00 GMT";
constexpr const char* kInAnHour = "Thu, 01 Jan 2026 01:00:00 GMT";

UrlRequest get(HttpHeaders headers = {})
{
    return {.url = *Url::parse("https://example.com/a"), .headers = std::move(headers)};
}

UrlResponse answer(HttpHeaders headers, int status = 200)
{
    return {.url = *Url::parse("https://example.com/a"), .statusCode = status, .headers = std::move(headers)};
}

StoredResponse stored(HttpHeaders headers, const UrlRequest& request = get())
{
    StoredResponse kept;
    kept.response = answer(std::move(headers));
    kept.body = Bytes("body");
    kept.selecting = selectingFields(kept.response, request).value_or("*");
    kept.requested = kept.received = kReceived;
    return kept;
}

TEST(HttpCachePolicyTest, OnlyPlainRequestsHaveToDoWithACache)
{
    using enum CacheUse;
    const auto with = [](const char* method, HttpHeaders headers = {}, const char* body = "") {
        UrlRequest request = get(std::move(headers));
        request.method = method;
        request.body = Bytes(body);
        return cacheUse(request);
    };
    EXPECT_EQ(with("GET"), Ask);
    EXPECT_EQ(with("GET", {{"Cache-Control", "no-cache"}}), Ask);
    EXPECT_EQ(with("GET", {{"cache-control", "No-Store"}}), None);
    EXPECT_EQ(with("GET", {{"authorization", "Basic x"}}), None);
    EXPECT_EQ(with("GET", {{"Range", "bytes=0-1"}}), None);
    EXPECT_EQ(with("GET", {{"If-None-Match", "\"a\""}}), None);
    EXPECT_EQ(with("GET", {}, "a body"), None);
    EXPECT_EQ(with("HEAD"), None);
    EXPECT_EQ(with("get"), Invalidate) << "methods are told apart by case";
    for (const char* method : {"POST", "PUT", "DELETE", "PATCH", "PURGE"}) EXPECT_EQ(with(method), Invalidate);
    UrlRequest reload = get();
    reload.cachePolicy = UrlRequest::CachePolicy::ReloadIgnoringCache;
    EXPECT_EQ(cacheUse(reload), Fill);
    EXPECT_EQ(cacheUse({.url = *Url::parse("file:///etc/hostname")}), None);
    EXPECT_EQ(cacheKey(*Url::parse("http://a/b?c#d")), "http://a/b?c");
}

TEST(HttpCachePolicyTest, LifetimesComeFromTheBestSourceAndWrongOnesAreNone)
{
    const std::pair<HttpHeaders, std::int64_t> cases[]{
        {{}, 0},
        {{{"Cache-Control", "max-age=60"}}, 60},
        {{{"Cache-Control", "public, Max-Age=\"60\" , must-revalidate"}}, 60},
        {{{"Cache-Control", "private"}, {"cache-control", "max-age=7"}}, 7},
        {{{"Cache-Control", "max-age=60, max-age=5"}}, 5},
        {{{"Cache-Control", "max-age=60, no-cache"}}, 0},
        {{{"Cache-Control", "no-cache=\"Set-Cookie, X\", max-age=60"}}, 0},
        {{{"Cache-Control", "ext=\"a, max-age=1\", max-age=60"}}, 60},
        {{{"Cache-Control", "ext=\"a\\\", max-age=1\", max-age=60"}}, 60},
        {{{"Cache-Control", "max-age=-1"}}, 0},
        {{{"Cache-Control", "max-age=1.5"}}, 0},
        {{{"Cache-Control", "max-age"}}, 0},
        {{{"Cache-Control", "max-age=99999999999999999999999"}}, std::int64_t{1} << 31},
        {{{"Cache-Control", "s-maxage=60"}}, 0},
        {{{"Cache-Control", "max-age=60"}, {"Expires", kInAnHour}}, 60},
        {{{"Expires", kInAnHour}}, 3600},
        {{{"Expires", kInAnHour}, {"Date", "Wed, 31 Dec 2025 23:00:00 GMT"}}, 7200},
        {{{"Expires", kTenDaysAgo}}, 0},
        {{{"Expires", "0"}, {"Last-Modified", kTenDaysAgo}}, 0},
        {{{"Last-Modified", kTenDaysAgo}}, 86400},
        {{{"Last-Modified", kInAnHour}}, 0},
        {{{"Last-Modified", "yesterday or so"}}, 0},
        {{{"Expires", "Thursday, 01-Jan-26 01:00:00 GMT"}}, 3600},
        {{{"Expires", "Thu Jan  1 01:00:00 2026"}}, 3600},
    };
    for (const auto& [headers, lifetime] : cases) {
        std::string fields;
        for (const auto& [name, value] : headers) fields += name + ": " + value + "; ";
        EXPECT_EQ(freshnessLifetime(answer(headers), kReceived).count(), lifetime) << fields;
    }
    EXPECT_EQ(freshnessLifetime(answer({{"Last-Modified", kTenDaysAgo}}, 500), kReceived).count(), 0);
}

TEST(HttpCachePolicyTest, OnlyWhatCouldBeUsedAgainIsKept)
{
    const struct {
        int status;
        HttpHeaders headers;
        bool storable;
    } cases[]{
        {200, {{"Cache-Control", "max-age=1"}}, true},
        {404, {{"Cache-Control", "max-age=1"}}, true},
        {200, {{"Cache-Control", "max-age=0"}}, false},
        {200, {{"ETag", "\"a\""}}, true},
        {200, {{"ETag", ""}}, false},
        {200, {}, false},
        {200, {{"Last-Modified", kTenDaysAgo}}, true},
        {206, {{"Cache-Control", "max-age=1"}}, false},
        {302, {{"Cache-Control", "max-age=1"}}, false},
        {304, {{"ETag", "\"a\""}}, false},
        {500, {{"Cache-Control", "max-age=1"}}, false},
        {200, {{"Vary", "a, *"}, {"ETag", "\"a\""}}, false},
        {200, {{"Vary", "Accept"}, {"ETag", "\"a\""}}, true},
        {200, {{"Cache-Control", "no-store"}, {"ETag", "\"a\""}}, false},
        {200, {{"Cache-Control", "private, no-cache"}, {"ETag", "\"a\""}}, true},
    };
    for (const auto& c : cases)
        EXPECT_EQ(isStorable(get(), answer(c.headers, c.status), kReceived), c.storable)
            << c.status << " " << (c.headers.empty() ? "" : c.headers.begin()->second);
    UrlResponse file = answer({{"ETag", "\"a\""}});
    file.isHttp = false;
    EXPECT_FALSE(isStorable(get(), file, kReceived));
}

TEST(HttpCachePolicyTest, AgeCountsWhatOthersKeptItAndTheWay)
{
    StoredResponse kept = stored({{"Age", "100"}, {"Date", kNowText}});
    EXPECT_EQ(currentAge(kept, kReceived).count(), 100);
    kept.requested = kReceived - seconds(5);
    EXPECT_EQ(currentAge(kept, kReceived + seconds(10)).count(), 115);
    EXPECT_EQ(currentAge(stored({{"Date", kTenDaysAgo}}), kReceived).count(), 864000)
        << "the server's clock, or a cache's delay";
    EXPECT_EQ(currentAge(stored({{"Date", kInAnHour}, {"Age", "soon"}}), kReceived).count(), 0);
}

TEST(HttpCachePolicyTest, AnAnswerIsWorthWhatItsAgeAndTheRequestAllow)
{
    using enum Reuse;
    const HttpHeaders fresh{{"Cache-Control", "max-age=60"}, {"ETag", "\"a\""}};
    const struct {
        HttpHeaders kept, asked;
        std::int64_t later;
        Reuse worth;
    } cases[]{
        {fresh, {}, 59, Answer},
        {fresh, {}, 60, Confirm},
        {fresh, {}, -1, Confirm}, // the clock was set back
        {fresh, {{"Cache-Control", "no-cache"}}, 1, Confirm},
        {fresh, {{"Pragma", "no-cache"}}, 1, Confirm},
        {fresh, {{"Pragma", "no-cache"}, {"Cache-Control", "x"}}, 1, Answer},
        {fresh, {{"Cache-Control", "max-age=10"}}, 10, Answer},
        {fresh, {{"Cache-Control", "max-age=10"}}, 11, Confirm},
        {{{"Cache-Control", "max-age=60"}}, {}, 60, None},
        {{{"Cache-Control", "no-cache"}, {"Last-Modified", kTenDaysAgo}}, {}, 0, Confirm},
        {{{"Cache-Control", "max-age=60"}, {"Age", "60"}}, {}, 0, None},
    };
    for (const auto& c : cases)
        EXPECT_EQ(reuse(stored(c.kept), get(c.asked), kReceived + seconds(c.later)), c.worth)
            << c.kept.begin()->second << " after " << c.later;

    const UrlRequest german = get({{"Accept-Language", "de"}, {"X", "1"}});
    const StoredResponse varied =
        stored({{"Cache-Control", "max-age=60"}, {"Vary", "accept-language, X-Other"}, {"ETag", "\"a\""}}, german);
    EXPECT_EQ(reuse(varied, german, kReceived), Answer);
    EXPECT_EQ(reuse(varied, get({{"Accept-Language", "de"}, {"X", "2"}}), kReceived), Answer);
    EXPECT_EQ(reuse(varied, get({{"Accept-Language", "en"}}), kReceived), None);
    EXPECT_EQ(reuse(varied, get({{"Accept-Language", "de"}, {"X-Other", ""}, {"x-other", "1"}}), kReceived), None);
}

TEST(HttpCachePolicyTest, AConfirmationBringsFieldsUpToDateAndLeavesTheBodysOwn)
{
    const StoredResponse kept = stored({{"ETag", "W/\"a\""},
                                        {"Last-Modified", kTenDaysAgo},
                                        {"Age", "50"},
                                        {"Cache-Control", "max-age=60"},
                                        {"Content-Length", "4"},
                                        {"X-Kept", "1"}});
    const UrlRequest request = confirmationRequest(kept, get({{"X", "1"}}));
    EXPECT_EQ(*request.headers.find("If-None-Match"), "W/\"a\"");
    EXPECT_EQ(*request.headers.find("If-Modified-Since"), kTenDaysAgo);
    EXPECT_EQ(*request.headers.find("X"), "1");
    EXPECT_FALSE(confirmationRequest(stored({{"Last-Modified", "never"}}), get()).headers.find("If-Modified-Since"));

    EXPECT_TRUE(confirms(answer({}, 304), kept));
    EXPECT_TRUE(confirms(answer({{"ETag", "\"a\""}}, 304), kept));
    EXPECT_FALSE(confirms(answer({{"ETag", "\"b\""}}, 304), kept));
    EXPECT_FALSE(confirms(answer({{"ETag", "\"a\""}}, 304), stored({{"Last-Modified", kTenDaysAgo}})));

    const UrlResponse notModified = answer({{"Cache-Control", "max-age=5"},
                                            {"content-length", "0"},
                                            {"Set-Cookie", "a"},
                                            {"Set-Cookie", "b"},
                                            {"Transfer-Encoding", "chunked"}},
                                           304);
    const StoredResponse now = confirmed(kept, notModified, kReceived + seconds(101), kReceived + seconds(101));
    EXPECT_EQ(now.response.statusCode, 200);
    EXPECT_EQ(now.body.view(), "body");
    EXPECT_EQ(now.response.headers.list("Content-Length"), "4");
    EXPECT_EQ(now.response.headers.list("Set-Cookie"), "a, b");
    EXPECT_EQ(now.response.headers.list("X-Kept"), "1");
    EXPECT_FALSE(now.response.headers.find("Transfer-Encoding"));
    EXPECT_EQ(reuse(now, get(), kReceived + seconds(105)), Reuse::Answer);
    EXPECT_EQ(reuse(now, get(), kReceived + seconds(106)), Reuse::Confirm);
}

} // namespace
} // namespace platform
