#include <algorithm>

#include "tavrind/ClientSession.h"
#include "tavrind/ClientSessionShared.h"
#include "tavrind/TavrinUserGUIDController.h"
#include "tests/support/FeedbackFixture.h"

namespace tavrin::test {
namespace {

struct SessionTest : FeedbackTest {
    SessionTest() { begin(); }

    SessionState state() { return manager()->currentState(); }
    /// Ends what is open, uploads everything, and returns the clients' sessions, first to last; a fetch of a stale bag
    /// is a session of the daemon's own.
    std::vector<Value> sessions()
    {
        flushSession();
        upload();
        std::vector<Value> all;
        for (const auto& task : uploads())
            if (Value session = decoded(*task); session["agent"] != Value(ClientSessionManager::tavrindUserAgent()))
                all.push_back(std::move(session));
        return all;
    }
    static std::string reason(const Value& session)
    {
        const Value last = session["fb"][session["fb"].count() - 1];
        return last["reason"].asString() ? *last["reason"].asString() : "";
    }
};

TEST_F(SessionTest, SessionsEndAtTheirLimits)
{
    using enum SessionState;
    using Steps = std::vector<std::pair<std::chrono::seconds, const char*>>;
    constexpr const char *kOther = "ZRClearInputFeedback", *kEngaged = "ZRResultEngagementFeedback";
    const struct {
        const char* what;
        Steps steps; ///< after one event: time, then an event
        const char* endReason;
        Strings events;                           ///< between the first one and the session's end
        bool rolls = true;                        ///< another GUID follows
        std::optional<SessionState> stateAtEnd{}; ///< of the steps
        bool resets = false;                      ///< the GUID, before the event
    } cases[]{
        {"asked to end", {}, "external request", {}, false},
        {"15 minutes", {{900s, nullptr}}, "max session time passed", {}},
        {"busy beyond 10 minutes, not beyond 15", Steps(8, {119s, kOther}), "max session time passed",
         Strings(7, "clear_input")},
        {"engaged behind 10 minutes", {{601s, kEngaged}}, "engagement received", {"result_engagement"}, true, None},
        {"a card's, too", {{601s, "ZRCardSectionEngagementFeedback"}}, "engagement received", {"card_engagement"}},
        {"3 idle minutes behind 10", {{599s, kOther}, {180s, kOther}}, "session idle", {"clear_input"}, true, Open},
        {"3 idle minutes alone don't end it", {{300s, kOther}}, "external request", {"clear_input"}, false},
        {"an engagement alone doesn't", {{0s, kEngaged}}, "external request", {"result_engagement"}, false},
        {"another GUID", {{0s, kOther}}, "guid changed", {}, true, {}, true},
        {"another GUID counts before an engagement", {{601s, kEngaged}}, "guid changed", {}, true, Open, true},
    };
    std::string previous = "no previous session";
    for (const auto& each : cases) {
        SCOPED_TRACE(each.what);
        const std::size_t before = sessions().size();
        appear();
        EXPECT_EQ(state(), SessionState::Open);
        auto& guids = *assembly().guidController;
        const platform::Uuid guid = guids.currentUserGUID();
        for (const auto& [time, event] : each.steps) {
            device.advance(time);
            if (each.resets) guids.reset();
            device.drain();
            if (event) report(event);
        }
        EXPECT_EQ(state(), each.stateAtEnd.value_or(state()));
        const Value session = sessions().at(before);
        EXPECT_EQ(guids.currentUserGUID() != guid, each.rolls);
        Strings types{"search_view_appear"};
        types.insert(types.end(), each.events.begin(), each.events.end());
        types.emplace_back("session_end");
        EXPECT_EQ(typesIn(session), types);
        EXPECT_EQ(reason(session), each.endReason);
        EXPECT_EQ(session["previous_session_end_reason"], Value(previous));
        previous = sessions().size() == before + 1 ? each.endReason : "external request";
        device.advance(1h);
    }
    expectBooksClose();
}

TEST_F(SessionTest, ClientsShareAGuidButNoSession)
{
    for (const bool shared : {true, false}) {
        SCOPED_TRACE(shared);
        begin(shared);
        const std::int64_t before = counter("Vistrel/4.sessions");
        appear();
        auto other = client("com.quorvane.wendral", "Wendral/7", 78);
        report(*other, "ZRClearInputFeedback");
        if (!shared) connection->end();
        if (!shared) other->end();
        const auto all = sessions();
        ASSERT_EQ(all.size(), 2u);
        EXPECT_EQ(all[0]["agent"], Value("Vistrel/4"));
        EXPECT_EQ(all[1]["agent"], Value("Wendral/7"));
        EXPECT_EQ(typesIn(all[1]), (Strings{"clear_input", "session_end"}));
        EXPECT_NE(all[0]["user_guid"], Value(""));
        EXPECT_EQ(all[0]["user_guid"] == all[1]["user_guid"], shared);
        EXPECT_EQ(counter("Vistrel/4.sessions") - before, 1);
    }
}

TEST_F(SessionTest, TimersOfAnEarlierSessionDoNothing)
{
    appear();
    device.advance(500s);
    flushSession();
    appear();
    device.advance(120s); // the first one's ten minutes are over
    EXPECT_EQ(state(), SessionState::Open);
    device.advance(481s);
    EXPECT_EQ(state(), SessionState::SoftLimit); // five minutes are left
    flushSession();
    appear();
    LogCapture late;
    device.advance(300s);
    EXPECT_EQ(late.count("max timer expired expected"), 1);
    EXPECT_EQ(state(), SessionState::Open);
}

TEST_F(SessionTest, EventsFromOutsideByNumber)
{
    const auto post = [this](unsigned number) {
        manager()->externalEvent(static_cast<SessionEvent>(number));
        device.drain();
    };
    appear();
    flushSession();
    appear();
    for (const unsigned unused : {4u, 11u}) post(unused);
    EXPECT_EQ(log.count("External event received 4") + log.count("External event received 11"), 2);
    EXPECT_EQ(sessionFiles().size(), 2u);
    post(5); // a warning
    EXPECT_EQ(sessionFiles().size(), 1u) << "the closed one is uploaded";
    EXPECT_EQ(state(), SessionState::Open);
    post(6); // critical
    EXPECT_EQ(state(), SessionState::None);
    ASSERT_EQ(uploads().size(), 2u);
    EXPECT_EQ(reason(decoded(*uploads()[1])), "critical memory");
}

TEST_F(SessionTest, EndOfAConnection)
{
    appear();
    end(*connection);
    EXPECT_EQ(state(), SessionState::Open) << "a shared session goes on";
    EXPECT_TRUE(log.has(platform::LogLevel::Debug, "Tavrin_Session", "session not flushed on invalidation"));
    EXPECT_EQ(typesIn(sessions().at(0)), (Strings{"search_view_appear", "connection_invalidated", "session_end"}));

    begin(false);
    appear();
    EXPECT_EQ(manager()->session(), nullptr) << "the client's own manager has it";
    end(*connection);
    EXPECT_TRUE(log.has(platform::LogLevel::Debug, "Tavrin_Session", "session flushed on invalidation"));
    upload();
    EXPECT_EQ(typesIn(decoded(*uploads().at(0))), (Strings{"search_view_appear", "session_end"}));
}

TEST_F(SessionTest, BagSwitchesFeedbackOffByUserAgent)
{
    connection = client("com.quorvane.news", "News/1", 79);
    appear();
    EXPECT_TRUE(sessionFiles().empty());
    EXPECT_EQ(booked(FeedbackFate::FeedbackOff), 1);
    expectBooksClose();
}

TEST_F(SessionTest, WithoutABagFeedbackIsKept)
{
    startWithoutBag();
    connection = client();
    device.advance(2s);
    const std::size_t before = sessionFiles().size();
    appear();
    EXPECT_EQ(sessionFiles().size(), before + 1);
}

TEST_F(SessionTest, FirstUseOfTheDayByTheLocalCalendar)
{
    const auto firstUse = [this] {
        appear();
        return sessions().back()["first_use"];
    };
    EXPECT_EQ(firstUse(), Value(true)) << "2026-01-01 01:00 in Zurich";
    EXPECT_EQ(firstUse(), Value(false));
    device.advance(22h + 58min);
    EXPECT_EQ(firstUse(), Value(false)) << "still the first of January there";
    device.advance(2min);
    EXPECT_EQ(firstUse(), Value(true)) << "midnight there, 23:00 in UTC";
    restart();
    connection = client();
    EXPECT_EQ(firstUse(), Value(false)) << "remembered";
    EXPECT_EQ(counter("vistrel.dailyactiveusers"), 2);
    connection = client("org.example", "Example/1", 80);
    EXPECT_EQ(firstUse(), Value(false)) << "nobody follows this client";
}

TEST(FirstUse, ClientsByTheirAgent)
{
    EXPECT_EQ(firstUseKey("Vistrel/4 Wendral"), "TavrinFirstUseOfTheDay_wendral") << "the first of the list counts";
    EXPECT_EQ(firstUseKey("KIVO/1"), "TavrinFirstUseOfTheDay_kivo");
    EXPECT_EQ(firstUseKey("Lookup in News"), "TavrinFirstUseOfTheDay_lookup");
    EXPECT_EQ(firstUseKey(""), std::nullopt);
}

TEST_F(SessionTest, OneOffSessions)
{
    const Dictionary json{{"features", Value::Array{1, 2}}};
    report("ZRCustomFeedback", {{"feedbackType", 3}, {"jsonFeedback", json}});
    report("ZRCustomFeedback", {{"feedbackType", 1}, {"jsonFeedback", json}});
    report("ZRCustomFeedback", {{"feedbackType", 9}, {"jsonFeedback", json}}); // dropped
    upload();
    ASSERT_EQ(uploads().size(), 2u);
    const Value features = decoded(*uploads()[0]);
    EXPECT_EQ(features["fb"][0]["features"], Value(Value::Array{1, 2}));
    EXPECT_EQ(features["base_time"], Value(0)) << "nobody shall know when these were";
    EXPECT_EQ(features["fb"][0]["query_id"], Value());
    EXPECT_EQ(features["user_guid"], Value(""));
    EXPECT_EQ(features["agent"], Value("Vistrel/4"));
    EXPECT_EQ(typesIn(features), Strings{"custom_vistrel_result_features"});
    EXPECT_EQ(typesIn(decoded(*uploads()[1])), Strings{"custom_wendral_autofill"});
    EXPECT_GT(decoded(*uploads()[1])["base_time"].asInt().value_or(0), 0);

    auto stranger = connect(99); // has not configured
    for (int i = 0; i < 3; ++i) report(*stranger, "ZRClearInputFeedback");
    EXPECT_EQ(sessionFiles().size(), 1u) << "one error for a connection";
    upload();
    const Value error = decoded(*uploads().at(2));
    EXPECT_EQ(typesIn(error), Strings{"error"});
    EXPECT_EQ(error["agent"], Value(ClientSessionManager::tavrindUserAgent()));
    EXPECT_EQ(error["fb"][0]["error"]["reason"], Value("client state nil"));
    expectBooksClose();
}

TEST_F(SessionTest, AForeignGuidIsReportedInTheSession)
{
    ClientSession session(assembly(), std::make_shared<TavrinFeedback>(std::make_shared<ZRClearInputFeedback>(), 1,
                                                                       platform::Uuid::random().string(), "A/1"));
    session.addFeedback(std::make_shared<TavrinFeedback>(std::make_shared<ZRClearInputFeedback>(), 2,
                                                         platform::Uuid::random().string(), "A/1"));
    session.addFeedback(nullptr);
    session.sessionComplete();
    device.drain();
    upload();
    const Value uploaded = decoded(*uploads().at(0));
    ASSERT_EQ(uploaded["fb"].count(), 3u);
    const auto isError = [](const Value& event) { return event["type"] == Value("error"); };
    EXPECT_EQ(std::ranges::count_if(*uploaded["fb"].asArray(), isError), 1);
    expectBooksClose();
}

TEST_F(SessionTest, SharedSessionsAreBounded)
{
    const auto of = [](int agent) {
        return std::make_shared<TavrinFeedback>(std::make_shared<ZRFeedback>(), 0, "", std::to_string(agent));
    };
    const auto shared = std::make_shared<ClientSessionShared>(assembly(), of(0), 0, nullptr);
    for (int agent = 1; agent <= 2001; ++agent) shared->addFeedback(of(agent), nullptr);
    device.drain();
    int sessions = 0;
    shared->enumerateSessions([&](auto&, bool) { ++sessions; });
    EXPECT_EQ(sessions, 2000);
    EXPECT_EQ(booked(FeedbackFate::NoContainer), 2);
    expectBooksClose();
}

TEST_F(SessionTest, FeedbackInMemoryIsAnsweredWithTimesSinceTheFirst)
{
    begin(false);
    assembly().testFeedbacks = true;
    report("ZRClearInputFeedback", {{"timestamp", 5'000'000'000}}, 7);
    report("ZRDidGoToSiteFeedback", {{"timestamp", 5'001'999'999}}, 8);
    report("ZRSearchViewDisappearFeedback", {{"timestamp", 4'000'000'000}}, 6);
    const Value events = call(*connection, "Feedback", {""})->argument(0);
    ASSERT_EQ(events.count(), 3u);
    EXPECT_EQ(events[0]["type"], Value("search_view_disappear"));
    EXPECT_EQ(events[0]["timestamp"], Value(0));
    EXPECT_EQ(events[1]["timestamp"], Value(1000));
    EXPECT_EQ(events[2]["timestamp"], Value(1001)) << "whole milliseconds, cut";
    EXPECT_EQ(events[2]["query_id"], Value(8));
}

TEST_F(SessionTest, SharedFeedbackInMemoryIsOneAgentsBehindAnothers)
{
    assembly().testFeedbacks = true;
    const auto second = client("com.quorvane.wendral", "Wendral/7", 78);
    for (const auto& [from, timestamp] : {std::pair(second, 5'000'000), {connection, 6'000'000}, {second, 8'000'000}})
        report(*from, "ZRClearInputFeedback", {{"timestamp", timestamp}});
    const Value events = call(*connection, "Feedback", {""})->argument(0);
    Value::Array times;
    for (std::size_t i = 0; i < events.count(); ++i) times.push_back(events[i]["timestamp"]);
    EXPECT_EQ(times, (Value::Array{0, 0, 3})) << "Vistrel's, then Wendral's, each since its own first";
}

} // namespace
} // namespace tavrin::test
