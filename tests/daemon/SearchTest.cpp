#include "CoreTavrin/TAVFeedback.h"
#include "platform/values/Dictionary.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "tests/support/DaemonFixture.h"

namespace tavrin::test {
namespace {

using namespace std::chrono_literals;
using Classes = std::vector<std::string>;
constexpr const char* kAnswer =
    R"([{"status": "OK", "fbq": "f1", "duration": 12.5, "partial_client_ip": "10.0.x", "query": "weather"}])";

struct SearchTest : DaemonTest {
    SearchTest()
    {
        start();
        deliverBag();
    }
};

TEST_F(SearchTest, TravelsToTheServiceAndBack)
{
    auto connection = client();
    auto call = search(*connection, 1, "weat", {{"clientQueryId", 5}, {"triggerEvent", 1}});
    EXPECT_TRUE(call->pending());
    EXPECT_EQ(lastTask()->originalRequest().url.queryValue("q"), "weat");
    EXPECT_EQ(session->takeClasses(), Classes{"ZRStartNetworkSearchFeedback"});
    lastTask()->timing = Value::dictionaryOf({{"mark", 1}});
    respond(kAnswer);

    ASSERT_TRUE(call->answered());
    EXPECT_EQ(call->argument(0), Value(1));
    EXPECT_EQ(call->argument(1)["rawResponse"].asBytes()->view(), kAnswer);
    EXPECT_TRUE(call->argument(1)["httpRequest"].isNull()) << "only verbose replies have it";
    EXPECT_EQ(call->argument(2).count(), 0u);

    const auto end = session->last<TAVEndNetworkSearchFeedback>();
    ASSERT_TRUE(end);
    EXPECT_EQ(end->tavrinStatus, "OK");
    EXPECT_EQ(end->fbq, "f1");
    EXPECT_EQ(end->tavrinDuration, 12.5);
    EXPECT_EQ(end->statusCode, 200);
    EXPECT_EQ(end->responseSize, static_cast<std::int64_t>(std::string_view(kAnswer).size()));
    EXPECT_EQ(end->networkTimingData["mark"], Value(1));
    EXPECT_EQ(counter("vistrel.keystrokes"), 1);
    EXPECT_EQ(counter("search"), 1);
    EXPECT_EQ(counter("Vistrel/4.fedapicall.serverstatus.200"), 1);
}

TEST_F(SearchTest, VerboseRepliesShowTheExchange)
{
    auto connection = client();
    auto call = search(*connection, 1, "weat", {{"verboseReply", true}});
    respond(kAnswer, 200, {{"X-A", "1"}});
    EXPECT_TRUE(call->argument(1)["httpRequest"]["url"].asString()->starts_with("https://s.example/search?"));
    EXPECT_EQ(call->argument(1)["httpResponse"]["headers"]["X-A"], Value("1"));
    EXPECT_EQ(call->argument(1)["httpResponse"]["statusCode"], Value(200));
}

TEST_F(SearchTest, AnOvertakenAnswerIsNeverDelivered)
{
    auto connection = client();
    auto five = search(*connection, 5, "weat");
    auto slow = lastTask();
    auto six = search(*connection, 6, "weath");
    auto same = search(*connection, 6, "weath");
    auto older = search(*connection, 4, "wea");
    EXPECT_TRUE(isEmptyAnswer(*same) && isEmptyAnswer(*older)) << "not above the last id: answered at once";
    respond(kAnswer);
    slow->respond(200, kAnswer);
    device.drain();
    EXPECT_TRUE(isEmptyAnswer(*five));
    EXPECT_GT(six->argument(1).count(), 0u);

    auto other = client("com.quorvane.vistrel", "Vistrel/4", 78);
    EXPECT_TRUE(search(*other, 1, "we")->pending()) << "each connection counts for itself";
}

TEST_F(SearchTest, SkipsWhatNeedsNoSearch)
{
    auto connection = client();
    const std::size_t before = tasks().size();
    EXPECT_TRUE(isEmptyAnswer(*search(*connection, 1, "w")));
    EXPECT_EQ(session->last<TAVSkipSearchFeedback>()->triggerEvent, SkipSearchTrigger::LessThanMinimumQueryLength);
    EXPECT_TRUE(isEmptyAnswer(*search(*connection, 2, "")));
    EXPECT_EQ(session->last<TAVSkipSearchFeedback>()->input, "");
    EXPECT_TRUE(isEmptyAnswer(*search(*connection, 3, "é")));
    EXPECT_EQ(tasks().size(), before);
    EXPECT_TRUE(search(*connection, 4, "日本")->pending()) << "as long as the minimum";
    EXPECT_TRUE(search(*connection, 5, "😀")->pending()) << "two UTF-16 units";
    EXPECT_EQ(tasks().size(), before + 2);

    auto news = client("com.quorvane.news", "news/1", 80);
    EXPECT_TRUE(isEmptyAnswer(*search(*news, 1, "weather")));
    EXPECT_EQ(session->last<TAVSkipSearchFeedback>()->triggerEvent, SkipSearchTrigger::BagDisabled);
    EXPECT_EQ(counter("news.keystrokes"), 1) << "every search counts, sent or not";
    EXPECT_EQ(counter("search"), 2);
}

// What the service may answer, and what the client and the session then get.
struct Answer {
    const char* name;
    int status;
    std::string body;
    bool record; // the reply has a raw response
    bool error;
    Classes feedback; // after the start record
};

TEST_F(SearchTest, EveryAnswerOfTheServiceIsAnswered)
{
    const Answer answers[]{
        {"error status with JSON", 500, R"([{"status": "ERROR"}])", true, false, {"TAVEndNetworkSearchFeedback"}},
        {"empty array", 200, "[]", true, false, {"ZREndNetworkSearchFeedback"}},
        {"object", 200, R"({"status": "OK"})", true, false, {"ZREndNetworkSearchFeedback"}},
        {"array of numbers", 200, "[1]", true, false, {"TAVEndNetworkSearchFeedback"}},
        {"wrong types",
         200,
         R"([{"status": 3, "fbq": [], "duration": "x"}])",
         true,
         false,
         {"TAVEndNetworkSearchFeedback"}},
        {"no JSON", 200, "<html>", false, true, {"ZREndNetworkSearchFeedback"}},
        {"nothing", 200, "", false, true, {"ZREndNetworkSearchFeedback"}},
        {"deep", 200, std::string(200, '['), false, true, {"ZREndNetworkSearchFeedback"}},
        {"invalid UTF-8", 200, "[\"\xff\"]", false, true, {"ZREndNetworkSearchFeedback"}},
    };
    auto connection = client();
    std::int64_t id = 0;
    for (const Answer& answer : answers) {
        auto call = search(*connection, ++id, "weat");
        session->takeClasses();
        respond(answer.body, answer.status);
        ASSERT_TRUE(call->answered()) << answer.name;
        EXPECT_GT(call->argument(1).count(), 0u) << answer.name;
        EXPECT_EQ(!call->argument(1)["rawResponse"].isNull(), answer.record) << answer.name;
        EXPECT_EQ(call->argument(2).count() > 0, answer.error) << answer.name;
        EXPECT_EQ(session->takeClasses(), answer.feedback) << answer.name;
    }
}

TEST_F(SearchTest, TransportErrorsReachTheClientAndTheSession)
{
    auto connection = client();
    auto call = search(*connection, 1, "weat", {{"clientQueryId", 9}});
    session->takeClasses();
    lastTask()->fail(platform::Error::withReason("UrlErrorDomain", -1004, "refused"));
    device.drain();
    EXPECT_EQ(call->argument(1).count(), 0u);
    EXPECT_EQ(reasonOf(*call), "refused");
    EXPECT_EQ(session->records.at(1)->clientQueryId, 9u);
    EXPECT_EQ(session->takeClasses(), (Classes{"ZRErrorFeedback", "ZREndNetworkSearchFeedback"}));
    EXPECT_EQ(counter("Vistrel/4.noconnection"), 1);
    EXPECT_EQ(counter("Vistrel/4.fedapicall.serverstatus.0"), 0);

    call = search(*connection, 2, "weat");
    lastTask()->finish(platform::Bytes("[]"), platform::UrlResponse{.isHttp = false}, std::nullopt);
    device.drain();
    EXPECT_EQ(reasonOf(*call), "invalid response class");
}

TEST_F(SearchTest, ABagWithoutSearchUrlIsAnError)
{
    startWithoutBag();
    deliverBag("{}");
    auto connection = client();
    auto call = search(*connection, 1, "weat");
    EXPECT_EQ(reasonOf(*call), "no URL");
    EXPECT_EQ(session->takeClasses(), Classes{"ZRErrorFeedback"});
}

TEST_F(SearchTest, MessagesKeepTheirPlaceToThemselves)
{
    device.location.allowed = {"wifi"};
    startWithoutBag();
    deliverBag(R"({"searchURL": "https://s.example/", "supportedGeoLocationSources": ["wifi"]})");
    device.location.moveTo(platform::Location{1, 2, "wifi"});
    auto messages = client("com.quorvane.messages", "MESSAGES/1");
    auto browser = client("com.quorvane.wendral", "Wendral/1", 78);
    device.drain();
    (void)search(*messages, 1, "weat");
    EXPECT_FALSE(lastTask()->originalRequest().url.queryValue("latlng"));
    (void)search(*browser, 1, "weat");
    EXPECT_TRUE(lastTask()->originalRequest().url.queryValue("latlng"));
}

TEST_F(SearchTest, TheServiceMayForceANewBag)
{
    auto connection = client();
    const auto fetchesAfter = [&](const char* header) {
        static std::int64_t id = 0;
        (void)search(*connection, ++id, "weat");
        const std::size_t before = tasks().size();
        respond("[]", 200, {{"x-quorvane-forcefetch", header}});
        return tasks().size() - before;
    };
    EXPECT_EQ(fetchesAfter(R"({"bag": 9})"), 0u);
    EXPECT_EQ(fetchesAfter(R"({"bag": "10"})"), 0u) << "not a number";
    EXPECT_EQ(fetchesAfter(R"({"other": 1})"), 0u);
    platform::test::LogCapture log;
    EXPECT_EQ(fetchesAfter("[1]"), 0u);
    EXPECT_EQ(fetchesAfter("{"), 0u);
    EXPECT_EQ(log.count("Failed to deserialize X-Quorvane-ForceFetch"), 2);
    EXPECT_EQ(fetchesAfter(R"({"bag": 10})"), 1u);
    EXPECT_EQ(lastTask()->originalRequest().url.queryValue("version"), "10");
}

// Before there is a bag, a connection's requests wait for it, in their order, one second at most.
TEST_F(SearchTest, WaitsASecondForTheFirstBag)
{
    startWithoutBag();
    auto connection = client();
    auto first = search(*connection, 1, "weat");
    auto bag = connection->call("Bag");
    device.advance(999ms);
    EXPECT_TRUE(first->pending() && bag->pending());
    EXPECT_TRUE(connection->takePushes().empty());
    device.advance(1ms);
    EXPECT_EQ(connection->takePushes().size(), 1u) << "the configuration's bag is late: an error is pushed";
    EXPECT_TRUE(first->pending()) << "the search has a second of its own";
    device.advance(1s);
    EXPECT_EQ(reasonOf(*first), "timeout");
    EXPECT_EQ(session->last<TAVSkipSearchFeedback>()->triggerEvent, SkipSearchTrigger::BagFetchFailed);
    deliverBag();
    ASSERT_TRUE(bag->answered());
    EXPECT_EQ(bag->argument(1).count(), 0u);
    EXPECT_GT(bag->argument(0).count(), 0u);
    EXPECT_TRUE(search(*connection, 2, "weat")->pending());
}

TEST_F(SearchTest, TheBagsArrivalWakesEveryWaiterOfAClient)
{
    startWithoutBag();
    auto one = client("com.quorvane.vistrel", "Vistrel/4", 1);
    auto two = client("com.quorvane.vistrel", "Vistrel/4", 2);
    auto first = search(*one, 1, "weat");
    auto second = search(*two, 1, "weat");
    const auto bagTask = lastTask();
    bagTask->respond(200, kBag);
    device.drain();
    EXPECT_TRUE(first->pending() && second->pending());
    EXPECT_EQ(tasks().size(), 3u) << "the bag and both searches";
}

TEST_F(SearchTest, OtherKindsTakeTheirOwnRoad)
{
    auto connection = client();
    struct Kind {
        const char* className;
        Dictionary fields;
        const char* urlStart;
        const char* log;
    };
    const Kind kinds[]{
        {"TAVZeroKeywordRequest", {}, "https://s.example/search?", "Got network response for zkw query"},
        {"TAVMoreResultsRequest",
         {{"moreResultsURL", "https://m.example/more?q=weat"}},
         "https://m.example/more?",
         "Got network response for more results query"},
        {"TAVCardRequest",
         {{"cardURL", "https://c.example/card"}},
         "https://c.example/card?",
         "Got network response for card query"},
        {"TAVLookupRequest",
         {{"queryString", "tree"}},
         "https://s.example/search?",
         "Got network response for lookup query"},
        {"TAVFlightSearchRequest",
         {{"queryString", "AB1"}},
         "https://s.example/flight?",
         "Got network response for flight query"},
        {"TAVFlightLookupRequest",
         {{"queryString", "AB1"}},
         "https://s.example/flight?",
         "Got network response for flight query"},
    };
    for (const Kind& kind : kinds) {
        platform::test::LogCapture log;
        auto call = request(*connection, kind.className, 1, kind.fields);
        EXPECT_TRUE(lastTask()->originalRequest().url.string().starts_with(kind.urlStart)) << kind.className;
        respond(kAnswer);
        EXPECT_GT(call->argument(1).count(), 0u) << kind.className;
        EXPECT_EQ(log.count(kind.log), 1) << kind.className;
    }
    EXPECT_EQ(counter("search"), 0);
    EXPECT_EQ(counter("vistrel.keystrokes"), 0);
    EXPECT_TRUE(request(*connection, "TAVRequest", 1)->abandoned()) << "of no kind";
    EXPECT_TRUE(request(*connection, "ZRClearInputFeedback", 1)->abandoned());
    EXPECT_TRUE(request(*connection, "Unheard", 1)->abandoned());
}

TEST_F(SearchTest, LookupsAreRepeatedOthersAreNot)
{
    auto connection = client();
    auto lookup = request(*connection, "TAVLookupRequest", 1, {{"queryString", "tree"}});
    const std::size_t before = tasks().size();
    for (int i = 0; i < 4; ++i) {
        lastTask()->fail(platform::Error("X", 1));
        device.advance(0s);
    }
    EXPECT_EQ(tasks().size(), before + 3);
    EXPECT_TRUE(lookup->answered());
    auto card = request(*connection, "TAVCardRequest", 2, {{"cardURL", "https://c.example/card"}});
    lastTask()->fail(platform::Error("X", 1));
    device.advance(0s);
    EXPECT_TRUE(card->answered());
    EXPECT_EQ(tasks().size(), before + 4);
}

} // namespace
} // namespace tavrin::test
