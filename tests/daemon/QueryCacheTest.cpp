#include "tavrind/QueryCache.h"

#include <algorithm>

#include "CoreTavrin/TAVFeedback.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/values/Json.h"
#include "tavrind/TavrinUserGUIDController.h"
#include "tests/support/DaemonFixture.h"

namespace tavrin::test {
namespace {

using platform::Date;
constexpr Date kNow{};

std::shared_ptr<const CachedResultSet> makeSet(std::string_view input, Dictionary resultSet, double scale = 0,
                                               Date now = kNow)
{
    auto request = std::make_shared<platform::UrlRequest>();
    if (scale > 0) request->headers.set("X-Quorvane-UI-Scale", fmt::format("{:.1f}", scale));
    const auto document = platform::JsonDocument::parse(platform::toJson(std::move(resultSet))).value();
    return std::make_shared<const CachedResultSet>(input, std::move(request), document.root(), "uuid", now);
}

TEST(CachedResultSet, ReadsWhatItIsMadeFrom)
{
    const auto set = makeSet("WÉA", {{"query", "WÉATHER 😀"}, {"max_age", 60}, {"completion_score", 0.5}}, 2);
    EXPECT_EQ(set->input, "wéa");
    EXPECT_EQ(set->query, "wéather 😀");
    EXPECT_EQ(set->inputLength, 3u);
    EXPECT_EQ(set->queryLength, 10u);
    EXPECT_EQ(set->expireTime, kNow + 60s);
    EXPECT_EQ(set->completionScore, 0.5f);
    EXPECT_EQ(set->uiScale, 2.0f);
    EXPECT_FALSE(set->userGuid());
    EXPECT_EQ(set->answer.view(), R"([{"query":"WÉATHER 😀","max_age":60,"completion_score":0.5}])");
    EXPECT_EQ(set->resultSet()["query"], Value("WÉATHER 😀"));
    EXPECT_EQ(set->resultSetSize(), platform::jsonSize(set->resultSet()));

    const auto odd = makeSet("w", {{"query", 3}, {"max_age", "60"}, {"completion_score", "high"}});
    EXPECT_TRUE(odd->query.empty() && !odd->expireTime && odd->completionScore == 0 && odd->uiScale == 0);
    EXPECT_FALSE(makeSet("w", {{"max_age", 0}})->expireTime);
    for (const double longAge : {1e300, 1e18, 2e9}) EXPECT_GT(makeSet("w", {{"max_age", longAge}})->expireTime, kNow);
    EXPECT_LT(makeSet("w", {{"max_age", -1e300}})->expireTime, kNow);
}

TEST(CachedResultSet, IsUsedWhereAgeScaleAndInputFit)
{
    const auto set = makeSet("wea", {{"query", "weather"}, {"max_age", 60}}, 3);
    const struct {
        std::size_t typed;
        double scale;
        Date now;
        CachedUse use;
    } cases[]{
        {4, 3, kNow, CachedUse::Candidate},     {3, 3, kNow, CachedUse::Candidate},
        {2, 3, kNow, CachedUse::OtherInput},    {4, 0, kNow, CachedUse::Candidate},
        {4, 2, kNow, CachedUse::OtherScale},    {4, 3.04, kNow, CachedUse::Candidate},
        {4, 3.1, kNow, CachedUse::OtherScale},  {4, 3, kNow + 59s, CachedUse::Candidate},
        {4, 3, kNow + 60s, CachedUse::Expired}, {2, 2, kNow + 60s, CachedUse::Expired},
        {4, 3, kNow - 1s, CachedUse::Expired}, // the clock was set back
    };
    for (const auto& c : cases)
        EXPECT_EQ(useOf(*set, c.typed, scaleAsSent(c.scale), c.now), c.use) << c.typed << " " << c.scale;
}

TEST(CachedResultSet, TheShortestThenTheBestThenTheFirstIsPicked)
{
    const auto pick = [](const std::vector<std::pair<const char*, double>>& sets) {
        std::vector<std::shared_ptr<const CachedResultSet>> kept;
        std::vector<const CachedResultSet*> candidates;
        for (const auto& [query, score] : sets) {
            kept.push_back(makeSet("w", {{"query", query}, {"completion_score", score}}));
            candidates.push_back(kept.back().get());
        }
        const auto found = std::ranges::find(candidates, pickCompletion(candidates));
        return found - candidates.begin();
    };
    EXPECT_EQ(pickCompletion({}), nullptr);
    EXPECT_EQ(pick({{"weather", 1}, {"weather today", 9}}), 0);
    EXPECT_EQ(pick({{"weather today", 9}, {"weather", 0}}), 1);
    EXPECT_EQ(pick({{"wea", 1}, {"web", 2}, {"wed", 2}}), 1);
    EXPECT_EQ(pick({{"wea", 0}, {"web", 0}}), 0);
    EXPECT_EQ(pick({{"wea", -2}, {"web", -1}}), 0) << "only a positive score counts";
    EXPECT_EQ(pick({{"wea", -2}, {"web", 1}}), 1);
    EXPECT_EQ(pick({{"zzzzz", 1}, {"w😀w", 2}, {"wéww", 2}, {"日本語日", 3}}), 3) << "lengths are in UTF-16 units";
}

struct QueryCacheTest : DaemonTest {
    QueryCacheTest()
    {
        start();
        deliverBag();
        connection = client();
        cache = QueryCache::make(assembly());
    }
    void put(std::string_view input, Dictionary resultSet, double scale = 0)
    {
        cache->set(makeSet(input, std::move(resultSet), scale, device.clock.wallNow()));
        device.drain();
    }
    /// The query of the set that answers; empty for none.
    std::string get(std::string text, double scale = 0)
    {
        TAVSearchRequest request;
        request.queryString = std::move(text);
        request.scale = scale;
        const auto set = cache->getRequest(request);
        return set ? set->query : "";
    }
    /// A set whose JSON has this many bytes.
    static Dictionary sized(std::string query, std::size_t size)
    {
        Dictionary set{{"query", std::move(query)}, {"text", ""}};
        set.set("text", std::string(size - platform::jsonSize(set), 'x'));
        return set;
    }
    /// What may change on the device, by name.
    std::vector<std::pair<const char*, std::function<void()>>> changes()
    {
        using Change = platform::LocaleSource::Change;
        return {{"locale", [this] { device.locale.handler(Change::Locale); }},
                {"time zone", [this] { device.locale.handler(Change::TimeZone); }},
                {"settings", [this] { device.profile.change({.storefront = "1"}); }},
                {"country", [this] { device.profile.change({.countryCode = "CN"}); }},
                {"GUID", [this] { assembly().guidController->reset(); }}};
    }
    std::shared_ptr<FakeConnection> connection;
    std::shared_ptr<QueryCache> cache;
};

TEST_F(QueryCacheTest, AnswersWhoTypesOn)
{
    put("wea", {{"query", "Weather"}});
    for (const char* text : {"wea", "WEAT", "weather"}) EXPECT_EQ(get(text), "weather") << text;
    for (const char* text : {"we", "weather ", "wet", ""}) EXPECT_EQ(get(text), "") << text;
    EXPECT_EQ(cache->get("weat")->input, "wea");
    put("weath", {{"query", "weather"}});
    EXPECT_EQ(get("weat"), "") << "the newer set took the place of the other, and more had been typed for it";
    EXPECT_EQ(cache->count(), 1u);
}

TEST_F(QueryCacheTest, TakesOnlyWhatCanBeFound)
{
    LogCapture log;
    put("weather in", {{"query", "weather"}});
    EXPECT_TRUE(log.has(platform::LogLevel::Error, "Tavrin_Caching",
                        "BUG: NOT caching 'weather in' because input is longer than completed query 'weather'"));
    put("a", {{"query", ""}});
    put("a", {});
    put("a", {{"query", std::string("a\0b", 3)}});
    EXPECT_EQ(cache->count(), 0u);
    EXPECT_EQ(device.memoryPressure.watchers, 0);
    EXPECT_EQ(get(std::string("a\0", 2)), "");
}

TEST_F(QueryCacheTest, ExpiredSetsAreDroppedWhenTheyAreFound)
{
    put("w", {{"query", "weather"}, {"max_age", 60}});
    put("w", {{"query", "web"}});
    device.advance(59s);
    EXPECT_EQ(get("weat"), "weather");
    device.advance(1s);
    EXPECT_EQ(get("weat"), "");
    EXPECT_EQ(cache->count(), 1u);
    device.advance(24h * 365);
    EXPECT_EQ(get("we"), "web");
}

TEST_F(QueryCacheTest, ScalesAreComparedAsTheyAreSent)
{
    put("wea", {{"query", "weather"}}, 1.7);
    EXPECT_EQ(get("weat", 1.75), "") << "sent as 1.8";
    put("wea", {{"query", "weather"}}, 1.75);
    EXPECT_EQ(get("weat", 1.7), "");
    for (const double scale : {1.75, 1.8}) EXPECT_EQ(get("weat", scale), "weather") << scale;
}

TEST_F(QueryCacheTest, KeepsToItsCost)
{
    LogCapture log;
    put("a", sized("a", 1398102)); // and half as much again is 2 MiB and one
    EXPECT_TRUE(log.has(platform::LogLevel::Error, "Tavrin_Caching", "NOT caching 'a' with cost 2097153"));
    put("b", sized("b", 1398101));
    EXPECT_EQ(get("b"), "b");

    put("c", sized("c", 699051)); // 1 MiB
    EXPECT_EQ(get("b"), "") << "cleared for c";
    put("d", sized("d", 699051));
    EXPECT_TRUE(get("c").empty() && get("d") == "d");
    put("e", sized("e", 699050));
    EXPECT_TRUE(get("d") == "d" && get("e") == "e") << "one byte less than 2 MiB";
    EXPECT_EQ(log.count("!!! exceeded max cost, flushing cache !!!"), 2);

    cache->removeAllObjects();
    for (int i = 0; i < 3; ++i) put("f", sized("f", 600'000));
    EXPECT_EQ(log.count("!!! exceeded max cost, flushing cache !!!"), 3) << "what was replaced still counts";
}

TEST_F(QueryCacheTest, ChangesOfTheDeviceClearIt)
{
    auto all = changes();
    all.emplace_back("country alone", [&] { device.notifications.post({.name = "TAVCountryCodeChangeNotification"}); });
    all.emplace_back("its owner", [&] { cache->removeAllObjects(); });
    all.emplace_back("memory pressure", [&] { device.memoryPressure.raise(); });
    int countries = 0;
    const auto token = device.notifications.observe("TAVCountryCodeChangeNotification", [&](auto&) { ++countries; });
    for (const auto& [name, change] : all) {
        put("w", {{"query", "weather"}});
        ASSERT_EQ(cache->count(), 1u) << name;
        ASSERT_EQ(device.memoryPressure.watchers, 1) << name;
        change();
        device.drain();
        EXPECT_EQ(cache->count(), 0u) << name;
        EXPECT_EQ(device.memoryPressure.watchers, 0) << name;
    }
    EXPECT_EQ(countries, 2) << "the country changed once, and was said to once";
}

// An answer that was asked for under the old GUID, country, locale or agent comes too late for the new one.
TEST_F(QueryCacheTest, AnswersOfBeforeAChangeAreNotStored)
{
    auto all = changes();
    all.emplace_back("none", [] {});
    all.emplace_back("agent", [&] { configure(*connection, "com.quorvane.vistrel", "Vistrel/5"); });
    std::int64_t id = 0;
    for (const auto& [name, change] : all) {
        (void)search(*connection, ++id, name);
        const auto asked = lastTask();
        change();
        device.drain();
        answer(*asked, platform::toJson(Value::Array{Dictionary{{"query", std::string(name) + "!"}}}));
        const bool fromMemory = search(*connection, ++id, std::string(name) + "!")->answered();
        EXPECT_EQ(fromMemory, name == std::string_view("none")) << name;
        lastTask()->cancel();
    }
}

TEST_F(QueryCacheTest, TheAnswerToTheSearchThatReplacesTheGuidIsStored)
{
    device.advance(15min);
    (void)search(*connection, 1, "weat");
    respond(R"([{"query": "weather"}])");
    EXPECT_TRUE(search(*connection, 2, "weathe")->answered());
}

TEST_F(QueryCacheTest, ASearchIsAnsweredFromIt)
{
    (void)search(*connection, 1, "weat");
    const auto uuid = session->last<ZRStartNetworkSearchFeedback>()->uuid;
    respond(R"([{"status": "OK", "query": "weather"}, {"status": "ERROR", "query": "weathers"}, 7])");
    const std::size_t before = tasks().size();

    auto hit = search(*connection, 2, "Weathe", {{"verboseReply", true}});
    ASSERT_TRUE(hit->answered());
    EXPECT_EQ(hit->argument(1)["rawResponse"].asBytes()->view(), R"([{"status":"OK","query":"weather"}])");
    EXPECT_NE(hit->argument(1)["httpRequest"]["url"].asString()->find("q=weat&"), std::string::npos);
    EXPECT_EQ(counter("vistrel.ondevicecachehits"), 1);
    EXPECT_EQ(session->last<TAVSkipSearchFeedback>()->triggerEvent, SkipSearchTrigger::CacheHit);
    EXPECT_EQ(session->last<TAVSkipSearchFeedback>()->input, "Weathe");
    EXPECT_EQ(session->last<TAVSkipSearchFeedback>()->uuid, uuid);
    const Value further = search(*connection, 3, "weather")->argument(1)["rawResponse"];
    EXPECT_EQ(further.asBytes()->data(), hit->argument(1)["rawResponse"].asBytes()->data())
        << "shared, not written anew";
    EXPECT_EQ(tasks().size(), before);

    const Value item = Value::dictionaryOf({{"class", "TAVQueryItem"}, {"name", "x"}, {"value", "y"}});
    EXPECT_TRUE(search(*connection, 4, "weathe", {{"queryItems", Value::Array{item}}})->pending())
        << "items of its own";
    EXPECT_TRUE(search(*connection, 5, "weathe", {{"scale", 3.0}})->pending()) << "another screen";
    EXPECT_TRUE(search(*connection, 6, "weathers")->pending()) << "errors aren't kept";

    configure(*connection, "com.quorvane.vistrel", "Vistrel/5");
    EXPECT_TRUE(search(*connection, 7, "weathe")->pending()) << "a new version of the client asks anew";
}

TEST_F(QueryCacheTest, CanBeSwitchedOff)
{
    device.userDefaults.set("TAVNoQueryCache", true);
    connection = client("com.quorvane.wendral", "Wendral/1");
    (void)search(*connection, 1, "weat");
    respond(R"([{"query": "weather"}])");
    EXPECT_TRUE(search(*connection, 2, "weathe")->pending());
}

} // namespace
} // namespace tavrin::test
