#include <algorithm>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinFlusherXPC.h"
#include "tests/support/FeedbackFixture.h"

namespace tavrin::test {
namespace {

using Types = std::vector<std::string>;
using platform::test::LogCapture;

struct BridgeTest : FeedbackTest {
    std::shared_ptr<FakeConnection> tool()
    {
        const auto call = connection->call("ListenToFlusher");
        device.drain();
        auto connected = device.ipc.connect(*call->argument(0).asString());
        device.drain();
        return connected;
    }
    void intent(FakeConnection& tool, std::uint64_t number)
    {
        tool.call("InitiateConnectionWithIntent", {Value(number)});
        device.drain();
    }
    static Types signals(FakeConnection& tool)
    {
        Types names;
        for (const auto& push : tool.takePushes()) names.push_back(push.signal);
        return names;
    }
};

TEST_F(BridgeTest, EventsAreShownLive)
{
    begin();
    const auto watcher = tool();
    appear();
    EXPECT_TRUE(watcher->takePushes().empty()) << "before it asked";
    intent(*watcher, 1);
    report("ZRDidGoToSiteFeedback", {{"input", "example.org"}, {"timestamp", 7'654'321'000}}, 4);
    auto pushes = watcher->takePushes();
    ASSERT_EQ(pushes.size(), 1u);
    EXPECT_EQ(pushes[0].signal, "ReceivedFeedbackDescription");
    const auto event = platform::parseJson(*pushes[0].message.args[0].asString());
    EXPECT_EQ(*event,
              (Value(Dictionary{
                  {"input", "example.org"}, {"query_id", 4}, {"type", "did_go_to_site"}, {"timestamp", 7654}})));
    intent(*watcher, 7);
    EXPECT_TRUE(watcher->takePushes().empty()) << "no such command";
    watcher->end();
    device.drain();
    appear();
    const auto next = tool();
    intent(*next, 1);
    appear();
    EXPECT_EQ(signals(*next), Types{"ReceivedFeedbackDescription"});
}

TEST_F(BridgeTest, DumpEndsSessionsAndShowsTheBodies)
{
    begin();
    const auto dumper = tool();
    intent(*dumper, 2);
    EXPECT_EQ(signals(*dumper), Types{"WorkDone"});
    EXPECT_TRUE(assembly().backgroundFlusher->stopFlushing());
    appear();
    intent(*dumper, 3);
    auto pushes = dumper->takePushes();
    ASSERT_EQ(pushes.size(), 2u);
    EXPECT_EQ(pushes[0].signal, "FlushedData");
    EXPECT_EQ(pushes[1].signal, "WorkDone");
    const auto body = tools::inflateRaw(pushes[0].message.args[0].asBytes()->view(), 1u << 20);
    EXPECT_EQ(typesIn(platform::parseJson(*body).value()), (Types{"search_view_appear", "session_end"}));
    EXPECT_EQ(uploads().size(), 1u) << "it is uploaded, too";
    EXPECT_FALSE(assembly().backgroundFlusher->stopFlushing());

    intent(*dumper, 3);
    EXPECT_EQ(signals(*dumper), Types{"WorkDone"}) << "nothing left";
}

TEST_F(BridgeTest, EventsOfASessionWithoutAFileAreShownToo)
{
    begin();
    const auto watcher = tool();
    intent(*watcher, 1);
    device.files.fault = [](std::string_view operation, const auto&) { return operation == "create" ? ENOSPC : 0; };
    appear();
    EXPECT_EQ(signals(*watcher), Types{"ReceivedFeedbackDescription"});
    EXPECT_EQ(booked(FeedbackFate::NoContainer), 1);
}

TEST_F(BridgeTest, AToolThatLeavesLosesEveryRoleThatItHeld)
{
    begin();
    struct Case {
        std::vector<std::uint64_t> intents;
        Types removed;
    };
    const Types all{"receiving stream", "sending stream", "remote"};
    for (const Case& each : {Case{{}, {"remote"}},
                             {{0}, {"sending stream", "remote"}},
                             {{1}, {"receiving stream", "remote"}},
                             {{3}, {"sending stream", "remote"}},
                             {{1, 0}, all}}) {
        const auto leaving = tool();
        for (const std::uint64_t number : each.intents) intent(*leaving, number);
        LogCapture log;
        leaving->end();
        device.drain();
        for (const std::string& role : all)
            EXPECT_EQ(log.count("Removed " + role + " listener"), std::ranges::count(each.removed, role)) << role;
        (void)leaving->takePushes();
        appear();
        flushSession();
        upload();
        EXPECT_TRUE(leaving->takePushes().empty());
    }
}

TEST_F(BridgeTest, AnUnknownCommandChangesNothing)
{
    begin();
    const auto earlier = tool();
    const auto last = tool();
    intent(*earlier, 7);
    LogCapture log;
    earlier->end();
    device.drain();
    EXPECT_EQ(log.count("Removed remote listener"), 0) << "that is the last one to connect";
    last->end();
    device.drain();
    EXPECT_EQ(log.count("Removed remote listener"), 1);
}

TEST_F(BridgeTest, BodiesAreShownEvenIfTheBagNamesNoEndpoint)
{
    begin();
    assembly().bagController->forceFetchBag(Value::dictionaryOf({{"bag", 1000}}));
    device.drain();
    respond(R"({"version": "1001", "searchURL": "https://s.example/search"})");
    const auto dumper = tool();
    intent(*dumper, 2);
    (void)dumper->takePushes();
    appear();
    intent(*dumper, 3);
    EXPECT_GT(std::ranges::count(signals(*dumper), "FlushedData"), 0);
    EXPECT_TRUE(uploads().empty());
}

TEST_F(BridgeTest, EachToolGetsWhatItAskedFor)
{
    begin();
    const auto bodies = tool();
    const auto events = tool();
    intent(*bodies, 0); // the other one connected last
    intent(*events, 1);
    appear();
    EXPECT_EQ(signals(*events), Types{"ReceivedFeedbackDescription"});
    intent(*events, 3);
    EXPECT_EQ(signals(*events), (Types{"ReceivedFeedbackDescription", "WorkDone"})) << "the session's end, and its own";
    EXPECT_EQ(signals(*bodies), Types{"FlushedData"});
}

} // namespace
} // namespace tavrin::test
