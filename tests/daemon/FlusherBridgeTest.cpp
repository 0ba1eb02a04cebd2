#include <algorithm>

#include "tavrind/TavrinFlusherXPC.h"
#include "tests/support/FeedbackFixture.h"

namespace tavrin::test {
namespace {

struct BridgeTest : FeedbackTest {
    BridgeTest() { begin(); }

    std::shared_ptr<FakeConnection> tool()
    {
        auto connected = device.ipc.connect(*call(*connection, "ListenToFlusher")->argument(0).asString());
        device.drain();
        return connected;
    }
    void intent(FakeConnection& tool, std::uint64_t number)
    {
        (void)call(tool, "InitiateConnectionWithIntent", {Value(number)});
    }
    static Strings signals(FakeConnection& tool)
    {
        Strings names;
        for (const auto& push : tool.takePushes()) names.push_back(push.signal);
        return names;
    }
};

TEST_F(BridgeTest, EventsAreShownLive)
{
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
    flushSession();
    (void)watcher->takePushes();
    failOn("create", ENOSPC);
    appear();
    EXPECT_EQ(booked(FeedbackFate::NoContainer), 1);
    EXPECT_EQ(signals(*watcher), Strings{"ReceivedFeedbackDescription"}) << "in no file, but shown";
}

TEST_F(BridgeTest, DumpEndsSessionsAndShowsTheBodies)
{
    const auto dumper = tool();
    intent(*dumper, 2);
    EXPECT_EQ(signals(*dumper), Strings{"WorkDone"});
    EXPECT_TRUE(assembly().backgroundFlusher->stopFlushing());
    appear();
    intent(*dumper, 3);
    auto pushes = dumper->takePushes();
    ASSERT_EQ(pushes.size(), 2u);
    EXPECT_EQ(pushes[0].signal, "FlushedData");
    EXPECT_EQ(pushes[1].signal, "WorkDone");
    const auto body = tools::inflateRaw(pushes[0].message.args[0].asBytes()->view(), 1u << 20);
    EXPECT_EQ(typesIn(platform::parseJson(*body).value()), (Strings{"search_view_appear", "session_end"}));
    EXPECT_EQ(uploads().size(), 1u) << "it is uploaded, too";
    EXPECT_FALSE(assembly().backgroundFlusher->stopFlushing());

    intent(*dumper, 3);
    EXPECT_EQ(signals(*dumper), Strings{"WorkDone"}) << "nothing left";
}

TEST_F(BridgeTest, AToolThatLeavesLosesEveryRoleThatItHeld)
{
    const Strings all{"receiving stream", "sending stream", "remote"};
    const struct {
        std::vector<std::uint64_t> intents;
        Strings removed;
        bool othersFollow = false; // the last to connect is the remote one
    } cases[]{{{}, {"remote"}},
              {{0}, {"sending stream", "remote"}},
              {{1}, {"receiving stream", "remote"}},
              {{3}, {"sending stream", "remote"}},
              {{1, 0}, all},
              {{7}, {}, true}}; // no such command
    for (const auto& each : cases) {
        const auto leaving = tool();
        const auto later = each.othersFollow ? tool() : nullptr;
        for (const std::uint64_t number : each.intents) intent(*leaving, number);
        EXPECT_EQ(leaving->takePushes().empty(), !std::ranges::count(each.intents, 3u));
        LogCapture removals;
        end(*leaving);
        for (const std::string& role : all)
            EXPECT_EQ(removals.count("Removed " + role + " listener"), std::ranges::count(each.removed, role)) << role;
        if (later) later->end();
    }
}

TEST_F(BridgeTest, BodiesAreShownEvenIfTheBagNamesNoEndpoint)
{
    fetchBag(R"({"version": "1001", "searchURL": "https://s.example/search"})");
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
    const auto bodies = tool();
    const auto events = tool();
    intent(*bodies, 0); // the other one connected last
    intent(*events, 1);
    appear();
    EXPECT_EQ(signals(*events), Strings{"ReceivedFeedbackDescription"});
    intent(*events, 3);
    EXPECT_EQ(signals(*events), (Strings{"ReceivedFeedbackDescription", "WorkDone"}))
        << "the session's end, and its own";
    EXPECT_EQ(signals(*bodies), Strings{"FlushedData"});
}

TEST_F(BridgeTest, APreviewIsWhatLeavesByteForByte)
{
    appear();
    report("ZRCustomFeedback", {{"feedbackType", 2}, {"jsonFeedback", Dictionary{{"domain", "example.org"}}}});
    const auto preview = [this] {
        Value::Array all;
        assembly().backgroundFlusher->previewUploads(
            platform::Reply<Value::Array>([&](Value::Array uploads) { all = std::move(uploads); }));
        device.drain();
        return all;
    };
    const Value::Array open = preview();
    ASSERT_EQ(open.size(), 2u);
    EXPECT_EQ(open[0]["open"], Value(true)) << "the session goes on";
    flushSession();
    const auto books = assembly().feedbackBooks.description();
    const Value::Array closed = preview();
    EXPECT_EQ(preview(), closed) << "a preview changes nothing";
    EXPECT_EQ(assembly().feedbackBooks.description(), books);
    ASSERT_EQ(closed.size(), 2u);
    EXPECT_TRUE(closed[0]["open"].isNull());

    upload();
    ASSERT_EQ(uploads().size(), 2u);
    for (std::size_t i = 0; i < closed.size(); ++i) {
        EXPECT_EQ(closed[i]["body"].asBytes()->view(), bodyOf(*uploads()[i])) << i;
        EXPECT_EQ(closed[i]["url"], Value(uploads()[i]->originalRequest().url.string())) << i;
        for (const auto& [name, value] : *closed[i]["headers"].asDictionary())
            EXPECT_EQ(*uploads()[i]->originalRequest().headers.find(name), *value.asString()) << name;
    }
    EXPECT_TRUE(preview().empty()) << "nothing left";
}

TEST_F(BridgeTest, AToolThatIsReplacedIsTold)
{
    const auto first = tool();
    const auto second = tool();
    intent(*first, 1);
    intent(*first, 1);
    intent(*second, 0);
    EXPECT_TRUE(first->takePushes().empty()) << "by itself, or in another role";
    intent(*second, 1);
    const auto pushes = first->takePushes();
    ASSERT_EQ(pushes.size(), 1u);
    EXPECT_EQ(pushes[0].signal, "Replaced");
    EXPECT_EQ(pushes[0].message.args, (std::vector<Value>{Value(1u), Value(second->peer().pid)}));
    const Value pid(second->peer().pid);
    EXPECT_EQ(assembly().flusherXPCListener->watchers(), Value(Dictionary{{"events", pid}, {"flushes", pid}}));
    end(*second);
    EXPECT_EQ(assembly().flusherXPCListener->watchers(), Value(Dictionary()));
}

} // namespace
} // namespace tavrin::test
