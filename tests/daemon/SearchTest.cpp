#include "CoreTavrin/TAVFeedback.h"
#include "platform/base/Trace.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TAVTracing.h"
#include "tests/support/DaemonFixture.h"

namespace tavrin::test {
namespace {

constexpr const char* kAnswer =
    R"([{"status": "OK", "fbq": "f1", "duration": 12.5, "partial_client_ip": "10.0.x", "query": "weather"}])";

struct SearchTest : DaemonTest {
    SearchTest()
    {
        start();
        deliverBag();
        connection = client();
    }

    std::shared_ptr<FakeConnection> connection;
};

TEST_F(SearchTest, TravelsToTheServiceAndBack)
{
    auto call = search(*connection, 1, "weat", {{"clientQueryId", 5}, {"triggerEvent", 1}});
    EXPECT_TRUE(call->pending());
    EXPECT_EQ(lastTask()->originalRequest().url.queryValue("q"), "weat");
    EXPECT_EQ(session->takeClasses(), Strings{"ZRStartNetworkSearchFeedback"});
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
    EXPECT_EQ(end->partialClientIp, "10.0.x");
    EXPECT_EQ(end->tavrinDuration, 12.5);
    EXPECT_EQ(end->statusCode, 200);
    EXPECT_EQ(end->responseSize, static_cast<std::int64_t>(std::string_view(kAnswer).size()));
    EXPECT_EQ(end->networkTimingData["mark"], Value(1));
    EXPECT_EQ(counter("vistrel.keystrokes"), 1);
    EXPECT_EQ(counter("search"), 1);
    EXPECT_EQ(counter("Vistrel/4.fedapicall.serverstatus.200"), 1);

    call = search(*connection, 2, "sun", {{"verboseReply", true}});
    respond(kAnswer, 200, {{"X-A", "1"}});
    EXPECT_TRUE(call->argument(1)["httpRequest"]["url"].asString()->starts_with("https://s.example/search?"));
    EXPECT_EQ(call->argument(1)["httpResponse"]["headers"]["X-A"], Value("1"));
    EXPECT_EQ(call->argument(1)["httpResponse"]["statusCode"], Value(200));
}

TEST_F(SearchTest, AnOvertakenAnswerIsNeverDelivered)
{
    auto five = search(*connection, 5, "weat");
    auto slow = lastTask();
    auto six = search(*connection, 6, "weath");
    auto same = search(*connection, 6, "weath");
    auto older = search(*connection, 4, "wea");
    EXPECT_TRUE(isEmptyAnswer(*same) && isEmptyAnswer(*older)) << "not above the last id: answered at once";
    respond(kAnswer);
    answer(*slow, kAnswer);
    EXPECT_TRUE(isEmptyAnswer(*five));
    EXPECT_GT(six->argument(1).count(), 0u);

    auto other = client("com.quorvane.vistrel", "Vistrel/4", 78);
    EXPECT_TRUE(search(*other, 1, "we")->pending()) << "each connection counts for itself";
}

TEST_F(SearchTest, SkipsWhatNeedsNoSearch)
{
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
}

TEST_F(SearchTest, EveryAnswerOfTheServiceIsAnswered)
{
    const struct {
        const char* name;
        std::string body;
        bool read;       // the reply has a raw response, else an error
        const char* end; // the record after the start record
        int status = 200;
    } answers[]{
        {"error status with JSON", R"([{"status": "ERROR"}])", true, "TAVEndNetworkSearchFeedback", 500},
        {"empty array", "[]", true, "ZREndNetworkSearchFeedback"},
        {"object", R"({"status": "OK"})", true, "ZREndNetworkSearchFeedback"},
        {"array of numbers", "[1]", true, "TAVEndNetworkSearchFeedback"},
        {"wrong types", R"([{"status": 3, "fbq": [], "duration": "x"}])", true, "TAVEndNetworkSearchFeedback"},
        {"no JSON", "<html>", false, "ZREndNetworkSearchFeedback"},
        {"nothing", "", false, "ZREndNetworkSearchFeedback"},
        {"deep", std::string(200, '['), false, "ZREndNetworkSearchFeedback"},
        {"invalid UTF-8", "[\"\xff\"]", false, "ZREndNetworkSearchFeedback"},
    };
    std::int64_t id = 0;
    for (const auto& answer : answers) {
        SCOPED_TRACE(answer.name);
        auto call = search(*connection, ++id, "weat");
        session->takeClasses();
        respond(answer.body, answer.status);
        ASSERT_TRUE(call->answered());
        EXPECT_GT(call->argument(1).count(), 0u);
        EXPECT_EQ(!call->argument(1)["rawResponse"].isNull(), answer.read);
        EXPECT_EQ(call->argument(2).count() > 0, !answer.read);
        EXPECT_EQ(session->takeClasses(), Strings{answer.end});
    }
}

TEST_F(SearchTest, TransportErrorsReachTheClientAndTheSession)
{
    auto call = search(*connection, 1, "weat");
    lastTask()->fail(platform::Error::withReason("UrlErrorDomain", -1004, "refused"));
    device.drain();
    EXPECT_EQ(call->argument(1).count(), 0u);
    EXPECT_EQ(reasonOf(*call), "refused");
    EXPECT_EQ(counter("Vistrel/4.noconnection"), 1);
    EXPECT_EQ(counter("Vistrel/4.fedapicall.serverstatus.0"), 0);

    call = search(*connection, 2, "weat");
    lastTask()->finish(platform::Bytes("[]"), platform::UrlResponse{.isHttp = false}, std::nullopt);
    device.drain();
    EXPECT_EQ(reasonOf(*call), "invalid response class");
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

TEST_F(SearchTest, RequestsNameTheGuidOfTheirClient)
{
    for (const bool shared : {true, false}) {
        device.userDefaults.set("TAVSharedSession", shared);
        startWithoutBag();
        deliverBag();
        std::set<std::string> guids;
        for (const char* identifier : {"com.quorvane.vistrel", "com.quorvane.wendral"}) {
            (void)search(*client(identifier), 1, "weat");
            guids.insert(*lastTask()->originalRequest().headers.find("X-Quorvane-UserGuid"));
        }
        EXPECT_EQ(guids.size(), shared ? 1u : 2u);
    }
}

TEST_F(SearchTest, TheServiceMayForceANewBag)
{
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
    LogCapture log;
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
    connection = client();
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
    deliverBag();
    EXPECT_TRUE(first->pending() && second->pending());
    EXPECT_EQ(tasks().size(), 3u) << "the bag and both searches";
}

TEST_F(SearchTest, TheLogDoesNotTellWhatTheUserTypesAndSees)
{
    using platform::LogLevel;
    platform::Log::privateData = false;
    LogCapture log;
    connection = client();
    (void)search(*connection, 1, "secret");
    respond(R"([{"query": "secret words", "icon": {"url": "https://a.example/secret"}}, {"query": "secr"}])");
    respond("pixels"); // the image's
    (void)search(*connection, 2, "secret w");
    (void)search(*connection, 3, "secret", {{"queryItems", Value::Array{Dictionary{{"class", "TAVQueryItem"}}}}});
    lastTask()->finish(platform::Bytes("[]"), platform::UrlResponse{.isHttp = false}, std::nullopt);
    device.drain();
    for (unsigned category = 0; category < TavrinLoggingCategoryCount; ++category)
        for (const auto level : {LogLevel::Info, LogLevel::Default, LogLevel::Error, LogLevel::Fault})
            EXPECT_FALSE(log.has(level, TavrinLogForCategory(category).category(), "secret")) << category;
    EXPECT_GT(log.count("<private>"), 8);
    platform::Log::privateData = true;
}

struct Kind {
    const char* className;
    Dictionary fields;
    const char* url;  // where it is sent
    const char* name; // in the log
    int endpoint = 6; // of its start record, like the next two
    const char* input = "";
    const char* startClass = "ZRStartNetworkSearchFeedback";
    std::vector<std::uint32_t> trace = {};
    std::size_t attempts = 1;  // that a service that never answers sees
    bool needsBag = true;      // else it is performed without one, or with a disabled one
    Strings whenDisabled = {}; // the records that a disabled bag leaves
};

const Kind kKinds[]{
    {.className = "TAVSearchRequest",
     .fields = {{"queryString", "weat"}},
     .url = "https://s.example/search?",
     .name = "(id, query): (7, weat)",
     .input = "weat",
     .trace = {0x2b000004, 0x2b000008},
     .whenDisabled = {"TAVSkipSearchFeedback"}},
    {.className = "TAVZeroKeywordRequest",
     .url = "https://s.example/search?",
     .name = "zkw query",
     .trace = {0x2b00001c, 0x2b000020}},
    {.className = "TAVMoreResultsRequest",
     .fields = {{"moreResultsURL", "https://m.example/more?p=2&q=weat"}, {"queryString", "other"}},
     .url = "https://m.example/more?",
     .name = "more results query",
     .input = "weat",
     .needsBag = false},
    {.className = "TAVCardRequest",
     .fields = {{"cardURL", "https://c.example/card"}, {"queryString", "weat"}},
     .url = "https://c.example/card?",
     .name = "card query",
     .endpoint = 11,
     .input = "weat",
     .trace = {0x2b00000c, 0x2b000010}},
    {.className = "TAVLookupRequest",
     .fields = {{"queryString", "tree"}, {"selectionType", 2}},
     .url = "https://s.example/search?",
     .name = "lookup query",
     .input = "tree",
     .startClass = "TAVLookupStartNetworkSearchFeedback",
     .trace = {0x2b00002c, 0x2b000030},
     .attempts = 4,
     .whenDisabled = {"TAVSkipSearchFeedback"}},
    {.className = "TAVFlightSearchRequest",
     .fields = {{"queryString", "AB1"}},
     .url = "https://s.example/flight?",
     .name = "flight query",
     .input = "AB1"},
    {.className = "TAVFlightLookupRequest",
     .fields = {{"queryString", "AB1"}},
     .url = "https://s.example/flight?",
     .name = "flight query",
     .input = "AB1"},
};

/// What was traced, taken out.
std::vector<std::uint32_t> tracePoints;

struct KindsTest : SearchTest {
    KindsTest() { TAVTraceEnabled = true; }
    ~KindsTest() override { TAVTraceEnabled = false; }

    std::shared_ptr<FakeCall> ask(FakeConnection& connection, const Kind& kind)
    {
        session->records.clear();
        tracePoints.clear();
        Dictionary fields = kind.fields;
        fields.set("clientQueryId", 9);
        fields.set("triggerEvent", 4);
        return request(connection, kind.className, 7, std::move(fields));
    }
};

TEST_F(KindsTest, EachTakesItsRoad)
{
    for (const Kind& kind : kKinds) {
        SCOPED_TRACE(kind.className);
        connection = client();
        device.advance(31s); // the connection is no longer warm
        LogCapture log;
        auto call = ask(*connection, kind);
        EXPECT_TRUE(lastTask()->originalRequest().url.string().starts_with(kind.url));
        const auto start = session->last<ZRStartNetworkSearchFeedback>();
        ASSERT_TRUE(start);
        EXPECT_EQ(start->className(), kind.startClass);
        EXPECT_EQ(start->input, kind.input);
        EXPECT_EQ(static_cast<int>(start->endpoint), kind.endpoint);
        EXPECT_EQ(static_cast<int>(start->triggerEvent), 4);
        const auto lookup = session->last<TAVLookupStartNetworkSearchFeedback>();
        EXPECT_EQ(lookup ? lookup->selectionType : LookupSelectionType::HintTap, LookupSelectionType::HintTap);
        EXPECT_EQ(session->records.back()->clientQueryId, 9u);
        EXPECT_EQ(session->records.back()->userAgent, "Vistrel/4");

        const std::size_t sent = tasks().size();
        report(*connection, "ZRSearchViewAppearFeedback", {{"viewAppearEvent", 2}});
        EXPECT_EQ(tasks().size(), sent) << "any request keeps the connection warm";

        const std::size_t half = kind.trace.size() / 2;
        EXPECT_EQ(tracePoints, std::vector(kind.trace.begin(), kind.trace.begin() + static_cast<int>(half)));
        respond(kAnswer);
        EXPECT_EQ(tracePoints, kind.trace);
        EXPECT_GT(call->argument(1).count(), 0u);
        EXPECT_EQ(log.count(std::string("Got network response for ") + kind.name), 1);
        EXPECT_EQ(session->records.back()->clientQueryId, 0u) << "the end names its start";
        EXPECT_EQ(session->takeClasses().back(), "TAVEndNetworkSearchFeedback");
    }
    EXPECT_EQ(counter("search"), 1);
    EXPECT_EQ(counter("vistrel.keystrokes"), 1);

    connection = client();
    tracePoints.clear();
    (void)call(*connection, "Feedback", {""});
    EXPECT_EQ(tracePoints, (std::vector<std::uint32_t>{0x2b000024, 0x2b000028}));
    for (const char* unserved : {"TAVRequest", "ZRClearInputFeedback", "Unheard"})
        EXPECT_TRUE(request(*connection, unserved, 1)->abandoned()) << unserved;
}

TEST_F(KindsTest, EachFailsWithItsQuery)
{
    for (const Kind& kind : kKinds) {
        SCOPED_TRACE(kind.className);
        connection = client();
        const std::size_t before = tasks().size();
        auto call = ask(*connection, kind);
        for (std::size_t i = 0; i < kind.attempts; ++i) {
            EXPECT_TRUE(call->pending());
            lastTask()->fail(platform::Error::withReason("UrlErrorDomain", -1004, "refused"));
            device.advance(0s);
        }
        EXPECT_EQ(tasks().size(), before + kind.attempts);
        EXPECT_EQ(reasonOf(*call), "refused");
        ASSERT_EQ(session->records.size(), 3u);
        for (const auto& record : session->records) EXPECT_EQ(record->clientQueryId, 9u);
        EXPECT_EQ(session->takeClasses(), (Strings{kind.startClass, "ZRErrorFeedback", "ZREndNetworkSearchFeedback"}));
    }
}

TEST_F(KindsTest, ALookupIsNotRepeatedAfterTheClientsTimeOut)
{
    for (const auto& [timeout, limit] : {std::pair(0.0, 60s), {5.0, 5s}}) {
        connection = connect();
        configure(*connection, "com.quorvane.vistrel", "Vistrel/4", {{"timeoutIntervalForRequest", timeout}});
        for (const platform::Duration late : {platform::Duration(limit), limit + 1ns}) {
            auto call = ask(*connection, kKinds[4]);
            device.advance(late);
            lastTask()->fail(platform::Error("X", 1));
            device.advance(0s);
            EXPECT_EQ(call->pending(), late == limit) << timeout;
            while (device.loader.cancelAll()) device.advance(0s); // its repetitions, too
        }
    }
}

TEST_F(KindsTest, WithoutAUrlThereIsNoRequest)
{
    startWithoutBag();
    deliverBag("{}");
    connection = client();
    const std::size_t before = tasks().size();
    for (Kind kind : kKinds) {
        SCOPED_TRACE(kind.className);
        kind.fields = {{"queryString", "weat"}};
        auto call = ask(*connection, kind);
        EXPECT_EQ(reasonOf(*call), "no URL");
        EXPECT_EQ(call->argument(2)["code"], Value(500));
        ASSERT_EQ(session->records.size(), 1u);
        EXPECT_EQ(session->records[0]->clientQueryId, 9u);
        EXPECT_EQ(session->takeClasses(), Strings{"ZRErrorFeedback"});
    }
    EXPECT_EQ(tasks().size(), before);
}

TEST_F(KindsTest, ADisabledBagSkipsThem)
{
    auto news = client("com.quorvane.news", "news/1", 80);
    const std::size_t before = tasks().size();
    for (const Kind& kind : kKinds) {
        SCOPED_TRACE(kind.className);
        auto call = ask(*news, kind);
        if (!kind.needsBag) {
            EXPECT_TRUE(call->pending());
            lastTask()->cancel();
            device.drain();
            continue;
        }
        EXPECT_TRUE(isEmptyAnswer(*call));
        if (const auto skip = session->last<TAVSkipSearchFeedback>()) {
            EXPECT_EQ(skip->triggerEvent, SkipSearchTrigger::BagDisabled);
            EXPECT_EQ(skip->input, kind.input);
        }
        EXPECT_EQ(session->takeClasses(), kind.whenDisabled);
    }
    EXPECT_EQ(tasks().size(), before + 1);
    EXPECT_EQ(counter("search"), 0);
    EXPECT_EQ(counter("news.keystrokes"), 1) << "every search counts, sent or not";
}

// A fetch that fails ends the wait for the first bag at once.
TEST_F(KindsTest, AFailedBagFailsThem)
{
    startWithoutBag();
    int failures = 0;
    const auto token = device.notifications.observe("TAVBagChangeNotification", [&](const auto& notification) {
        EXPECT_EQ(notification.template get<platform::Error>("bagError").code, 2);
        ++failures;
    });
    connection = client();
    respond("", 500);
    EXPECT_EQ(connection->takePushes().size(), 1u) << "the error, and nothing that waits for its second";
    for (const Kind& kind : kKinds) {
        SCOPED_TRACE(kind.className);
        auto call = ask(*connection, kind);
        EXPECT_TRUE(call->pending());
        if (!kind.needsBag) {
            EXPECT_TRUE(lastTask()->originalRequest().url.string().starts_with(kind.url));
            lastTask()->cancel();
            continue;
        }
        EXPECT_EQ(lastTask()->originalRequest().url.path(), "/bag") << "each tries once more";
        respond("", 500);
        EXPECT_EQ(reasonOf(*call), "timeout");
        const auto skip = session->last<TAVSkipSearchFeedback>();
        ASSERT_TRUE(skip);
        EXPECT_EQ(skip->triggerEvent, SkipSearchTrigger::BagFetchFailed);
        EXPECT_EQ(session->records.back()->clientQueryId, 9u);
    }
    EXPECT_EQ(failures, 7);
}

} // namespace
} // namespace tavrin::test

/// Stands in for the probe of the library, which no test could see.
void platform::tracePoint(std::uint32_t code, std::uint64_t)
{
    tavrin::test::tracePoints.push_back(code);
}
