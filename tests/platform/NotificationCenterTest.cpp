#include "platform/run/NotificationCenter.h"

#include <latch>
#include <optional>
#include <thread>

#include <gtest/gtest.h>

namespace platform {
namespace {

using Token = NotificationCenter::Token;

struct NotificationCenterTest : testing::Test {
    auto note(int i)
    {
        return [this, i](const Notification&) { seen.push_back(i); };
    }
    std::vector<int> posted(const Notification& notification = {"name"})
    {
        seen.clear();
        center.post(notification);
        return seen;
    }

    NotificationCenter center;
    std::vector<int> seen;
};

TEST_F(NotificationCenterTest, ReachesThoseWhoAskedInTheirOrder)
{
    int one = 0, other = 0;
    const Token tokens[]{center.observe("name", note(1)), center.observe("other", note(2)),
                         center.observe("name", note(3), &one), center.observe("name", note(4))};
    EXPECT_EQ(posted({"name"}), (std::vector{1, 4}));
    EXPECT_EQ(posted({"name", &one}), (std::vector{1, 3, 4}));
    EXPECT_EQ(posted({"name", &other}), (std::vector{1, 4}));
    EXPECT_EQ(posted({"nobody"}), std::vector<int>());
}

TEST_F(NotificationCenterTest, TokensUnregisterWhenTheyGo)
{
    Token first = center.observe("name", note(1));
    Token second = center.observe("name", note(2));
    Token moved = std::move(first);
    EXPECT_FALSE(first);
    EXPECT_EQ(posted(), (std::vector{1, 2})) << "a move keeps the place";
    moved = std::move(second);
    EXPECT_EQ(posted(), std::vector{2});
    Token& same = moved;
    moved = std::move(same);
    EXPECT_EQ(posted(), std::vector{2});
    moved = {};
    EXPECT_EQ(posted(), std::vector<int>());

    Token survivor;
    {
        NotificationCenter brief;
        survivor = brief.observe("name", note(1));
    }
    survivor = {};
}

TEST_F(NotificationCenterTest, ATokenMayGoInsideItsOwnCallback)
{
    std::optional<Token> token;
    auto owned = std::make_shared<int>(7);
    token = center.observe("name", [&, owned](const Notification&) {
        token.reset();
        seen.push_back(*owned); // the callback outlives its token until it returns
    });
    const Token after = center.observe("name", note(2));
    EXPECT_EQ(posted(), (std::vector{7, 2}));
    EXPECT_EQ(posted(), std::vector{2});
    EXPECT_EQ(owned.use_count(), 1) << "and not longer";
}

TEST_F(NotificationCenterTest, PostsToASnapshotWithoutThoseWhoWentMeanwhile)
{
    std::optional<Token> late, gone;
    const Token first = center.observe("name", [&](const Notification& notification) {
        seen.push_back(1);
        if (late) return;
        late = center.observe("name", note(3));
        gone.reset();
        center.post(notification); // reaches the new one
        seen.push_back(-1);
    });
    gone = center.observe("name", note(2));
    EXPECT_EQ(posted(), (std::vector{1, 1, 3, -1})) << "the outer post doesn't know the new one";
}

TEST_F(NotificationCenterTest, DetailsOfAnotherTypeReadAsNothing)
{
    const Notification notification{"name", nullptr, {{"number", 5}, {"text", std::string("x")}}};
    EXPECT_EQ(notification.get<int>("number"), 5);
    EXPECT_EQ(notification.get<long>("number"), 0);
    EXPECT_EQ(notification.get<std::string>("text"), "x");
    EXPECT_EQ(notification.get<const char*>("none"), nullptr);
}

// A queue may destroy a token while the callback waits for that queue.
TEST_F(NotificationCenterTest, ATokenGoesWithoutWaitingForItsCallback)
{
    auto used = std::make_shared<int>(7);
    std::latch called{1}, mayReturn{1};
    Token token = center.observe("name", [&called, &mayReturn, used, this](const Notification&) {
        called.count_down();
        mayReturn.wait();
        seen.push_back(*used);
    });
    std::jthread poster([&] { center.post({"name"}); });
    called.wait();
    token = {};
    EXPECT_EQ(used.use_count(), 2) << "the callback lives until it returns";
    mayReturn.count_down();
    poster.join();
    EXPECT_EQ(seen, std::vector{7});
    EXPECT_EQ(used.use_count(), 1);
}

} // namespace
} // namespace platform
