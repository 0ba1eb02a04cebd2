#include <algorithm>
#include <set>

#include "platform/values/Archive.h"
#include "tavrind/ArchivedDataIterator.h"
#include "tavrind/ClientConnection.h"
#include "tavrind/ClientState.h"
#include "tavrind/ClientStateManager.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinService.h"
#include "tavrind/TavrinUserGUIDController.h"
#include "tests/support/FeedbackFixture.h"

namespace tavrin::test {
namespace {

struct ConnectionTest : DaemonTest {
    ConnectionTest()
    {
        start();
        deliverBag();
    }
    static Dictionary configuration(const char* identifier, const char* agent)
    {
        return {{"class", "TAVSessionConfiguration"}, {"identifier", identifier}, {"userAgent", agent}};
    }
    LogCapture log;
};

TEST_F(ConnectionTest, ConfigureAnswersTheEndpointThenPushesTheBag)
{
    auto connection = connect();
    auto call = configure(*connection, "com.quorvane.vistrel", "Vistrel/4");
    EXPECT_EQ(call->argument(0), Value(assembly().clientStateManager->endpoint()));
    auto pushes = connection->takePushes();
    ASSERT_EQ(pushes.size(), 1u);
    EXPECT_EQ(pushes[0].signal, "BagDidLoad");

    device.clock.setWall(device.clock.wallNow() + 14400s);
    (void)connection->call("Bag");
    (void)search(*connection, 1, "weat");
    connection->call("ListSessions");
    auto warm = connect(5);
    (void)configure(*warm, "com.quorvane.wendral", "Wendral/1");
    report(*warm, "ZRSearchViewAppearFeedback", {{"viewAppearEvent", 5}});
    deliverBag();
    EXPECT_EQ(connection->takePushes().size(), 1u) << "every later bag is pushed";
}

TEST_F(ConnectionTest, AnInvalidConfigurationClosesTheConnection)
{
    const std::string incomplete = "configuration requires identifier and agent";
    for (const auto& [invalid, text] : std::vector<std::pair<Dictionary, std::string>>{
             {{}, "configuration must not be nil"},
             {Dictionary{{"class", "TAVSessionConfiguration"}}, incomplete},
             {Dictionary{{"class", "TAVSessionConfiguration"}, {"identifier", "id"}}, incomplete},
             {configuration("", "A/1"), "client session identifier cannot be nil or empty"}}) {
        const LogCapture log;
        auto connection = connect();
        EXPECT_TRUE(call(*connection, "Configure", {invalid})->abandoned());
        EXPECT_TRUE(connection->invalidated());
        EXPECT_TRUE(log.has(platform::LogLevel::Fault, "Tavrin_Session", text));
        EXPECT_TRUE(log.has(platform::LogLevel::Fault, "Tavrin_Session", "invalid configuration, closing connection"));
        EXPECT_EQ(session->takeClasses(), Strings{"ZRErrorFeedback"});
    }
}

TEST_F(ConnectionTest, AClientWithoutANameHasNoBag)
{
    auto connection = connect();
    EXPECT_TRUE(configure(*connection, "com.quorvane.vistrel", "")->answered());
    const auto pushes = connection->takePushes();
    ASSERT_EQ(pushes.size(), 1u) << "the error alone";
    EXPECT_EQ(pushes[0].message.args[1]["userInfo"]["reason"], Value("no UserAgent"));

    auto call = configure(*connect(), std::string(5000, 'x'), "A/1");
    EXPECT_FALSE(call->take()) << "a name of any length would be kept, counted by and sent along";
}

TEST_F(ConnectionTest, ASecondIdentifierKeepsTheFirstState)
{
    auto connection = client("com.quorvane.vistrel");
    EXPECT_TRUE(configure(*connection, "com.quorvane.news", "news/1")->answered());
    EXPECT_TRUE(log.has(platform::LogLevel::Fault, "Tavrin_Session", "session identifier must match"));
    EXPECT_EQ(assembly().clientStateManager->sessions().size(), 1u);
}

TEST_F(ConnectionTest, AnUnconfiguredConnectionIsServedWhatNeedsNoClient)
{
    auto connection = connect();
    EXPECT_EQ(reasonOf(*search(*connection, 1, "weat")), "client state nil");
    for (const char* member : {"ListSessions", "ListenToFlusher"})
        EXPECT_TRUE(call(*connection, member)->answered()) << member;
    EXPECT_TRUE(call(*connection, "Feedback", {""})->answered());
    EXPECT_EQ(call(*connection, "FileHandleAndAttributesForResource", {"TAVQIFeatures"})->argument(2)["code"],
              Value(404));
    EXPECT_EQ(call(*connection, "Status")->argument(0)["bag"]["version"], Value("9"));
    report(*connection, "ZRClearInputFeedback");
    end(*connection);
    EXPECT_TRUE(daemon->service->getClientConnections().empty());
}

TEST_F(ConnectionTest, ACallerWithOneCallIntroducesItselfInsideItsRequest)
{
    const auto ask = [&](FakeConnection& connection, Dictionary introduction) {
        return call(connection, "Request",
                    {Dictionary{{"class", "TAVSearchRequest"},
                                {"queryString", "weat"},
                                {"queryId", 1},
                                {"configuration", std::move(introduction)}}});
    };
    auto answered = ask(*connect(), configuration("com.quorvane.vistrel", "Vistrel/4"));
    respond("[]");
    EXPECT_EQ(answered->argument(1)["class"], Value("TAVReply"));

    const auto refused = connect();
    (void)ask(*refused, {{"class", "TAVSessionConfiguration"}});
    EXPECT_TRUE(refused->invalidated());
}

TEST_F(ConnectionTest, CallsWithoutARecordAreNotAnsweredAndMalformedOnesAreRefused)
{
    for (auto connection : {connect(), client()}) {
        EXPECT_TRUE(call(*connection, "Request", {Dictionary()})->abandoned());
        EXPECT_TRUE(call(*connection, "Request", {Dictionary{{"class", "TAVRequest"}}})->abandoned());
        EXPECT_TRUE(call(*connection, "ReportEvent", {"event", 1, Dictionary()})->answered());
        const Dictionary unknown{{"class", "TAVOfTomorrow"}};
        const std::tuple<const char*, Value::Array, const char*> malformed[]{
            {"Request", {Dictionary{{"class", "TAVSearchRequest"}, {"queryId", "one"}}}, "queryId: "},
            {"Request",
             {Dictionary{{"class", "TAVSearchRequest"}, {"queryItems", Value::Array{unknown}}}},
             "queryItems[0]: "},
            {"ReportEvent",
             {"", 1, Dictionary{{"class", "ZRCardSectionEngagementFeedback"}, {"cardSection", unknown}}},
             "cardSection: "},
        };
        for (const auto& [name, arguments, field] : malformed) {
            const auto refused = call(*connection, name, arguments)->take();
            ASSERT_FALSE(refused) << field;
            EXPECT_TRUE(refused.error().message.contains(field)) << refused.error().message;
        }
        EXPECT_FALSE(connection->invalidated());
    }
}

TEST_F(ConnectionTest, MissingDefaultsAreCompletedFromTheDevice)
{
    device.profile.current.screenScale = 3;
    auto connection = client();
    (void)search(*connection, 1, "weat", {{"scale", 0.0}, {"keyboardInputMode", ""}});
    EXPECT_EQ(*lastTask()->originalRequest().headers.find("X-Quorvane-UI-Scale"), "3.0");
    EXPECT_EQ(lastTask()->originalRequest().url.queryValue("kb_ime"), "en_US@layout=default");
    EXPECT_TRUE(log.has(platform::LogLevel::Error, "Tavrin_Request", "keyboardInputMode property not set, using "));
    device.locale.inputMode = "fr";
    (void)search(*connection, 2, "weat", {{"keyboardInputMode", ""}});
    EXPECT_EQ(lastTask()->originalRequest().url.queryValue("kb_ime"), "fr");
}

TEST_F(ConnectionTest, TheRegistryPersistsOnlyWhenAskedTo)
{
    (void)client();
    EXPECT_TRUE(device.userDefaults.value("sessions").isNull());
    device.userDefaults.set("TAVPersistSessions", true);
    start();
    (void)client("com.quorvane.vistrel", "Vistrel/4");
    (void)assembly().clientStateManager->stateForClientIdentifier("nobody");
    start();
    EXPECT_EQ(assembly().clientStateManager->sessions(),
              (Value::Array{Value::dictionaryOf({{"identifier", "com.quorvane.vistrel"}, {"agent", "Vistrel/4"}})}));
    device.userDefaults.set(
        "sessions", Value::Array{3, Value::dictionaryOf({{"agent", "x"}}), Value::dictionaryOf({{"identifier", "i"}})});
    start();
    EXPECT_TRUE(assembly().clientStateManager->sessions().empty());
    EXPECT_TRUE(assembly().clientStateManager->stateForClientIdentifier("i")->sessionManager())
        << "restored before there was one";

    Value::Array many{Value::dictionaryOf({{"identifier", std::string(1025, 'i')}, {"agent", "x"}})};
    for (int i = 0; i < 1025; ++i)
        many.emplace_back(Value::dictionaryOf({{"identifier", "i" + std::to_string(i)}, {"agent", "x"}}));
    many[1].mutableDictionary().set("agent", std::string(1025, 'x'));
    device.userDefaults.set("sessions", std::move(many));
    start();
    const Value::Array restored = assembly().clientStateManager->sessions();
    EXPECT_EQ(restored.size(), 1023u) << "1,024 clients, one without its agent";
    EXPECT_EQ(restored.front()["identifier"], Value("i1"));
}

TEST_F(ConnectionTest, TheEndpointServesMoreResultsAndCardsAlone)
{
    auto main = client();
    auto endpoint = device.ipc.connect(assembly().clientStateManager->endpoint());
    const auto ask = [&](const char* className, const char* identifier = "com.quorvane.vistrel") {
        return call(*endpoint, "Request",
                    {Dictionary{{"class", className},
                                {"queryId", 4},
                                {"moreResultsURL", "https://m.example/x"},
                                {"cardURL", "https://m.example/x"}},
                     Dictionary{{"class", "TAVSessionConfiguration"}, {"identifier", identifier}}});
    };
    auto more = ask("TAVMoreResultsRequest");
    respond("[]");
    EXPECT_GT(more->argument(1).count(), 0u);
    EXPECT_TRUE(ask("TAVCardRequest")->pending());
    for (const char* other :
         {"TAVZeroKeywordRequest", "TAVSearchRequest", "TAVLookupRequest", "TAVFlightSearchRequest"})
        EXPECT_TRUE(ask(other)->abandoned()) << other;
    auto nobody = ask("TAVMoreResultsRequest", "");
    EXPECT_EQ(nobody->argument(0), Value(4));
    EXPECT_TRUE(reasonOf(*nobody).starts_with("invalid configuration "));
    EXPECT_TRUE(call(*endpoint, "LoadImages", {Value::Array{}, 0u})->answered());
}

TEST_F(ConnectionTest, EveryIdentifierHasAStateButNotWithoutEnd)
{
    auto& manager = *assembly().clientStateManager;
    EXPECT_FALSE(manager.stateForClientIdentifier("") || manager.stateForClientIdentifier(std::nullopt));
    EXPECT_NE(manager.stateForClientIdentifier("a"), manager.stateForClientIdentifier("b"));
    EXPECT_TRUE(manager.sessions().empty()) << "none has a user agent yet";
    const auto early = manager.stateForClientIdentifier("early");
    for (int i = 0; i < 1024; ++i) (void)manager.stateForClientIdentifier("com.example." + std::to_string(i));
    EXPECT_TRUE(client("com.example.late")->invalidated());
    EXPECT_EQ(manager.stateForClientIdentifier("early"), early);
}

TEST_F(ConnectionTest, CountsConnectionsAndTheirEnds)
{
    auto first = client("com.quorvane.vistrel", "Vistrel/4", 90);
    EXPECT_EQ(log.count("too many connections"), 0);
    auto second = connect(90);
    EXPECT_TRUE(log.has(platform::LogLevel::Error, "Tavrin_Connection", "too many connections 2 from pid 90"));
    EXPECT_TRUE(second->resumed()) << "it is accepted all the same";
    EXPECT_EQ(counter("clientconnection"), 2);
    EXPECT_EQ(counter("launch"), 1);
    end(*first);
    EXPECT_EQ(counter("vistrel.xcpinvalidation"), 1);
    EXPECT_EQ(log.count("session not flushed on invalidation"), 1);
    EXPECT_EQ(daemon->service->getClientConnections().size(), 1u);
}

TEST_F(ConnectionTest, NamesItsPeer)
{
    device.processes.applications[1] = "org.example.Browser";
    device.processes.paths[2] = "/usr/lib/search screen";
    EXPECT_EQ(TavrinService::clientIDForConnection(device.processes, 1), "org.example.Browser");
    EXPECT_EQ(TavrinService::clientIDForConnection(device.processes, 2), "search screen");
    EXPECT_EQ(TavrinService::clientIDForConnection(device.processes, 3), std::nullopt);
    EXPECT_TRUE(log.has(platform::LogLevel::Error, "Tavrin_Connection", "error getting path for pid [3] "));
    EXPECT_TRUE(connect(3)->resumed());
}

TEST_F(ConnectionTest, EventsReachTheSessionWithTheirQuery)
{
    auto connection = client();
    report(*connection, "ZRResultEngagementFeedback",
           {{"result", Dictionary{{"class", "ZRSearchResult"}, {"queryId", 12}, {"type", 1}, {"topHit", 2}}}}, 3);
    ASSERT_EQ(session->records.size(), 1u);
    const TavrinFeedback& record = *session->records[0];
    EXPECT_EQ(record.queryId, 3);
    EXPECT_EQ(record.clientQueryId, 12u);
    EXPECT_EQ(record.userAgent, "Vistrel/4");
    EXPECT_EQ(record.feedback()->timestamp, device.clock.hostTicks()) << "stamped on arrival";

    report(*connection, "ZRClearInputFeedback", {{"timestamp", 5}});
    EXPECT_EQ(session->records[1]->feedback()->timestamp, 5u);
    for (const int type : {0, 1, 2, 3, 9}) report(*connection, "ZRCustomFeedback", {{"feedbackType", type}});
    EXPECT_EQ(session->records.size(), 2u) << "custom records take their own road";
    EXPECT_EQ(counter("dp.submit"), 1);
    report(*connection, "TavrinConnectionInvalidated");
    report(*connection, "ZRSearchResult");
    EXPECT_EQ(session->records.size(), 2u) << "not a client's to send";
}

TEST_F(ConnectionTest, EngagementsOfTopHitsAndOfTheServicesResultsAreCounted)
{
    const auto named = client();
    const auto nameless = client("org.example.app", "Example/1", 78);
    const struct {
        FakeConnection& from;
        const char* record;
        int topHit, type;
        std::int64_t topHits, ofService; ///< counted so far
    } cases[]{
        {*named, "ZRResultEngagementFeedback", 0, 0, 0, 0},
        {*named, "ZRResultEngagementFeedback", 2, 2, 1, 0},
        {*named, "ZRResultEngagementFeedback", 1, 9, 2, 0},
        {*named, "ZRResultEngagementFeedback", 0, 1, 2, 1},
        {*named, "ZRResultEngagementFeedback", 2, 1, 3, 2},
        {*named, "ZRResultRankingFeedback", 2, 1, 3, 2}, // no engagement
        {*nameless, "ZRResultEngagementFeedback", 2, 1, 3, 2},
    };
    for (const auto& c : cases) {
        report(c.from, c.record,
               {{"result", Dictionary{{"class", "ZRSearchResult"}, {"type", c.type}, {"topHit", c.topHit}}}});
        report(c.from, c.record); // without a result
        EXPECT_EQ(counter("vistrel.tophit.engagements"), c.topHits) << c.record << c.topHit << c.type;
        EXPECT_EQ(counter("vistrel.tavrin.engagements"), c.ofService) << c.record << c.topHit << c.type;
    }
}

TEST_F(ConnectionTest, WarmsTheConnectionWhenASearchViewAppears)
{
    startWithoutBag();
    auto connection = client();
    deliverBag();
    const auto warmed = [&](int event, bool lockScreen) {
        const std::size_t before = tasks().size();
        report(*connection, "ZRSearchViewAppearFeedback", {{"viewAppearEvent", event}, {"isOnLockScreen", lockScreen}});
        return tasks().size() > before;
    };
    EXPECT_FALSE(warmed(2, false)) << "the bag has been asked for just now";
    device.advance(31s);
    const std::set<int> warming{2, 5, 6, 9, 10, 11, 22, 23, 24};
    for (int event = -1; event <= 27; ++event) {
        EXPECT_FALSE(warmed(event, true)) << event;
        EXPECT_EQ(warmed(event, false), warming.contains(event)) << event;
        if (warming.contains(event)) {
            EXPECT_EQ(lastTask()->originalRequest().url.string(), "https://s.example/warm");
            device.advance(29s);
            EXPECT_FALSE(warmed(event, false)) << "still warm";
        }
        device.advance(31s);
    }
}

using RecordedConnectionTest = FeedbackTest;

TEST_F(RecordedConnectionTest, TheDaemonsOwnRequestsAreRecordedAsItsOwn)
{
    device.userDefaults.set("TAVSharedSession", false);
    start();
    deliverBag();
    connection = client();
    device.advance(31s);
    report("ZRSearchViewAppearFeedback", {{"viewAppearEvent", 2}});
    std::map<std::string, Value> starts; // in the session files on disk, by their URL's path
    for (const std::string& name : sessionFiles()) {
        ArchivedDataIterator records{platform::Bytes(device.files.files.at("/caches/com.quorvane.tavrind/" + name))};
        while (const auto archive = records.readNextObject()) {
            const Value record = platform::valueFromArchive(*archive).value();
            if (record["feedback"]["class"] == Value("ZRStartNetworkSearchFeedback"))
                starts[platform::Url::parse(*record["feedback"]["url"].asString())->path()] = record;
        }
    }
    const struct {
        const char* path;
        int trigger, endpoint;
    } expected[]{{"/bag", 16, 10}, {"/warm", 19, 12}};
    for (const auto& [path, trigger, endpoint] : expected) {
        const Value& record = starts[path];
        EXPECT_EQ(record["feedback"]["triggerEvent"], Value(trigger)) << path;
        EXPECT_EQ(record["feedback"]["endpoint"], Value(endpoint)) << path;
        EXPECT_EQ(record["feedback"]["input"], Value("")) << path;
        EXPECT_EQ(record["user_agent"], Value(ClientSessionManager::tavrindUserAgent())) << path;
        EXPECT_EQ(record["query_id"].asDouble().value_or(0), 0) << path;
        EXPECT_EQ(record["user_guid"], Value(assembly().guidController->currentUserGUID().string()))
            << path << ": the daemon's, while the client has one of its own";
    }
}

TEST_F(RecordedConnectionTest, EveryEventAndEverySearchNoticesAStaleBag)
{
    begin();
    const auto fetches = [&] {
        return std::ranges::count_if(
            tasks(), [](const auto& task) { return !task->finished && task->originalRequest().url.path() == "/bag"; });
    };
    std::int64_t id = 0;
    for (const bool byTime : {true, false}) {
        for (const bool byEvent : {true, false}) {
            SCOPED_TRACE(fmt::format("stale by {}, read by {}", byTime ? "time" : "URL", byEvent ? "event" : "search"));
            const auto read = [&] { byEvent ? appear() : (void)search(*connection, ++id, "weat"); };
            for (int i = 0; i < 2; ++i) {
                read();
                EXPECT_EQ(fetches(), 0) << "the bag is fresh";
            }
            if (byTime)
                device.clock.setWall(device.clock.wallNow() + 14400s - 599s);
            else
                device.userDefaults.set("TAVBagURL", fmt::format("https://b{}.example/bag", ++id));
            read();
            ASSERT_EQ(fetches(), 1);
            deliverBag(kFeedbackBag);
        }
    }
}

TEST(Logging, CategoriesHaveTheirNamesAndOneOutOfRangeIsAProgrammingError)
{
    EXPECT_EQ(TavrinLogForCategory(kLogGeneral).category(), "Tavrin");
    EXPECT_EQ(TavrinLogForCategory(kLogFeedbackStorage).category(), "Tavrin_Feedback_Storage");
    EXPECT_DEATH((void)TavrinLogForCategory(19), "category < TavrinLoggingCategoryCount");
}

} // namespace
} // namespace tavrin::test
