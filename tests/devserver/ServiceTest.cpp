#include "tools/devserver/Service.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tools/devserver/Matching.h"

namespace devserver {
namespace {

using platform::Value;

class ServiceTest : public testing::Test {
protected:
    static Request request(std::string method, std::string_view target, std::string body = "")
    {
        const std::size_t mark = std::min(target.find('?'), target.size());
        return {.method = std::move(method),
                .path = std::string(target.substr(0, mark)),
                .query = std::string(target.substr(std::min(mark + 1, target.size()))),
                .body = std::move(body),
                .peer = "127.0.0.1"};
    }
    Answer get(std::string_view target) { return service.answer(request("GET", target)); }
    static Value json(const Answer& answer) { return platform::parseJson(answer.body).value_or(Value()); }

    Service service{"https://127.0.0.1:8443"};
};

TEST_F(ServiceTest, EveryUrlInAnAnswerIsServed)
{
    const Value set = json(get("/search?q=weat"))[0];
    const auto targetOf = [&](const Value& url) {
        return url.asString() ? url.asString()->substr(service.base.size()) : "no URL";
    };
    EXPECT_GT(json(get(targetOf(set["sections"][0]["more_results_url"])))[0]["results"].count(), 0u);
    const Value card = json(get(targetOf(set["results"][0]["card_url"])));
    EXPECT_EQ(card[0]["results"][0]["card"]["title"], set["results"][0]["title"]);
    EXPECT_TRUE(get(targetOf(set["results"][0]["thumbnail"]["url"])).body.starts_with("\x89PNG"));
    const Value bag = service.bag.document();
    for (const auto& [key, value] : *bag.asDictionary()) {
        if (const std::string* url = value.asString(); url && url->starts_with(service.base)) {
            EXPECT_NE(endpointOf(request("GET", targetOf(value))), "unknown") << key;
        }
    }
}

TEST_F(ServiceTest, EverySetIsFoundAgainByWhatWasTyped)
{
    // Sets are cached under "query" for inputs that it begins with.
    for (const char* typed : {"We", "weather", "zur", "ZÜR", "東", "ακρ", "برج", "weather l", " we"}) {
        const auto sets = SearchAnswers(Catalogue(), service.base).search(typed);
        ASSERT_GT(sets.count(), 0u) << typed;
        for (const auto& set : *sets.asArray())
            EXPECT_TRUE(set["query"].asString()->starts_with(lowerCased(typed))) << typed;
    }
}

TEST_F(ServiceTest, TheResourceAtHandIsNotSentAgainWhateverTheFault)
{
    Request call = request("GET", "/resources/TAVQIFeatures?version=1");
    call.headers = {{"If-None-Match", "1"}};
    for (const char* fault : {"delay:0", "cut", "notjson", "huge:10", "endless"}) {
        ASSERT_TRUE(service.faults.add("resource", fault, 1));
        const Answer answer = service.answer(call);
        EXPECT_EQ(answer.status, 304);
        EXPECT_TRUE(answer.body.empty() && answer.paddedTo == 0 && !answer.cut && !answer.more) << fault;
    }
    call.headers = {{"If-None-Match", "2"}};
    EXPECT_EQ(service.answer(call).status, 200);
}

TEST_F(ServiceTest, ControlRefusesWhatItDoesNotKnowAndStrangers)
{
    const std::pair<const char*, const char*> bad[] = {
        {"/control/faults", "{}"}, {"/control/faults", R"({"endpoint": "search", "fault": "cut", "count": -1})"},
        {"/control/faults", "{"},  {"/control/search", R"({"maxage": 1})"},
        {"/control/bag", "7"},     {"/control/resources/bump", R"({"name": "Nothing"})"},
    };
    for (const auto& [target, body] : bad)
        EXPECT_EQ(service.answer(request("POST", target, body)).status, 400) << target << body;
    EXPECT_EQ(get("/control/log?endpoint=serch").status, 400);
    EXPECT_EQ(get("/control/reset").status, 404) << "changes come by POST";
    Request call = request("GET", "/control/status");
    call.peer = "192.0.2.1";
    EXPECT_EQ(service.answer(call).status, 403);
    call.peer = "::1";
    call.secure = true;
    EXPECT_EQ(service.answer(call).status, 404) << "over plain HTTP only";
}

TEST_F(ServiceTest, OtherWebPagesControlNothing)
{
    const struct {
        Headers headers;
        int control, console;
    } cases[]{
        {{{"Host", "127.0.0.1:8080"}}, 200, 200},
        {{{"Host", "LOCALHOST"}, {"Origin", "http://LOCALHOST"}, {"Sec-Fetch-Site", "same-origin"}}, 200, 200},
        {{{"Host", "[::1]:8080"}, {"Sec-Fetch-Site", "none"}}, 200, 200},
        // Of another origin; links to the page are harmless.
        {{{"Host", "127.0.0.1:8080"}, {"Origin", "https://evil.example"}}, 403, 200},
        {{{"Host", "127.0.0.1:8080"}, {"Origin", "http://127.0.0.1:9090"}}, 403, 200},
        {{{"Host", "127.0.0.1:8080"}, {"Origin", "null"}}, 403, 200},
        {{{"Host", "127.0.0.1:8080"}, {"Sec-Fetch-Site", "cross-site"}}, 403, 200},
        {{{"Host", "127.0.0.1:8080"}, {"Sec-Fetch-Site", "same-site"}}, 403, 200},
        // Of a name that somebody has made to resolve to this machine.
        {{{"Host", "evil.example:8080"}, {"Origin", "http://evil.example:8080"}}, 403, 403},
        {{{"Host", "127.evil.example"}}, 403, 403},
        {{{"Host", "localhost.evil.example"}}, 403, 403},
        {{{"Host", "192.0.2.1"}}, 403, 403},
        {{{"Host", "[2001:db8::1]"}}, 403, 403},
        {{{"Host", ""}}, 403, 403},
    };
    for (const auto& c : cases) {
        for (const auto& [path, status] : {std::pair("/control/bag/bump", c.control), {"/console", c.console}}) {
            Request call = request(path[4] == 't' ? "POST" : "GET", path);
            call.headers = c.headers;
            const std::int64_t before = service.bag.version();
            EXPECT_EQ(service.answer(call).status, status) << path << c.headers[0].second << c.headers.back().second;
            EXPECT_TRUE(status == 200 || service.bag.version() == before);
        }
    }
}

TEST_F(ServiceTest, TheConsoleRunsOnlyItsOwnScripts)
{
    const Answer page = get("/console");
    EXPECT_TRUE(page.contentType.starts_with("text/html"));
    const std::string policy = *findHeader(page.headers, "Content-Security-Policy");
    EXPECT_TRUE(policy.starts_with("default-src 'none'; script-src 'self';") && !policy.contains("unsafe")) << policy;
    EXPECT_EQ(*findHeader(page.headers, "X-Content-Type-Options"), "nosniff");
    const std::string_view body = page.body;
    for (std::size_t at = 0; (at = body.find("/console/", at)) != body.npos; ++at) {
        const Answer file = get(body.substr(at, body.find('"', at) - at));
        EXPECT_TRUE(file.status == 200 && !file.body.empty()) << body.substr(at, 30);
    }
    for (const char* document : {"requests", "bag", "feedback", "devserver"})
        EXPECT_TRUE(get(fmt::format("/console/{}.md", document)).body.starts_with("# ")) << "explains what is shown";
    for (const char* path : {"/console/nothing.js", "/console/../../etc/passwd", "/console//etc/passwd", "/consoles"})
        EXPECT_EQ(get(path).status, 404) << path;
}

TEST_F(ServiceTest, TheStreamDeliversWhatChanged)
{
    (void)get("/bag");
    const Answer stream = get("/control/events");
    ASSERT_TRUE(stream.more);
    EXPECT_EQ(stream.contentType, "text/event-stream");
    const auto next = [&stream] {
        const std::string text = stream.more().value_or("");
        EXPECT_TRUE(text.starts_with("data: ") && text.ends_with("\n\n")) << text;
        return platform::parseJson(text.substr(std::min<std::size_t>(text.size(), 6))).value_or(Value());
    };
    const Value all = next();
    EXPECT_EQ(all["requests"].count(), 1u);
    EXPECT_EQ(all["state"]["status"]["requests"], Value(1));
    ASSERT_TRUE(service.faults.add("search", "delay:0,status:503", 1));
    EXPECT_EQ(next()["state"]["faults"][0]["fault"], Value("delay:0,status:503"));
    (void)get("/search?q=weather");
    const Value search = next()["requests"];
    EXPECT_EQ(search.count(), 1u);
    EXPECT_EQ(search[0]["endpoint"], Value("search"));
    EXPECT_EQ(search[0]["status"], Value(503));
    EXPECT_EQ(search[0]["faults"], Value("delay:0,status:503"));
    const std::uint64_t held = service.log.add("search", request("GET", "/search?q=par"));
    EXPECT_TRUE(next()["requests"][0]["status"].isNull());
    service.log.finish(held, Answer(), "", std::chrono::seconds(1));
    EXPECT_EQ(next()["requests"][0]["duration"].asDouble(), 1000) << "again, once it is answered";
    (void)service.answer(request("POST", "/control/bag", R"({"isEnabled": false})"));
    EXPECT_FALSE(next().asDictionary()->contains("requests"));
    (void)service.answer(request("POST", "/control/reset"));
    EXPECT_EQ(next()["first"], Value(4)) << "the requests before are gone";
    service.stop();
    EXPECT_EQ(stream.more(), std::nullopt);
}

TEST_F(ServiceTest, StreamsAreLimitedAndEndWithTheirConnections)
{
    std::vector<Answer> streams;
    while (streams.size() < 100 && (streams.empty() || streams.back().status == 200))
        streams.push_back(get("/control/events"));
    EXPECT_EQ(streams.back().status, 503);
    streams.clear();
    EXPECT_EQ(get("/control/events").status, 200);
}

TEST_F(ServiceTest, TheLogShowsRequestsButNoControlCallsAndNoSecrets)
{
    Request search = request("GET", "/search?q=weather&locale=de_CH");
    search.headers = {{"X-Quorvane-UserGuid", "G"}, {"authorization", "Bearer s3cret"}};
    (void)service.answer(search);
    (void)get("/bag");
    EXPECT_EQ(platform::toJson(json(get("/control/status"))["by_endpoint"]), R"({"bag":1,"search":1})");
    const Answer log = get("/control/log?endpoint=search");
    EXPECT_EQ(json(log)["requests"].count(), 1u);
    EXPECT_EQ(json(log)["requests"][0]["headers"]["X-Quorvane-UserGuid"], Value("G"));
    EXPECT_FALSE(log.body.contains("s3cret"));
    for (std::size_t i = 0; i < RequestLog::kKept; ++i) (void)get("/warm");
    EXPECT_EQ(json(get("/control/log"))["requests"].count(), RequestLog::kKept) << "bounded";
}

} // namespace
} // namespace devserver
