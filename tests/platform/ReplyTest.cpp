#include "platform/run/Reply.h"

#include <memory>
#include <string>

#include <gtest/gtest.h>

namespace platform {
namespace {

struct ReplyTest : testing::Test {
    Reply<int, std::string> make()
    {
        return Reply<int, std::string>(
            [this](int number, std::string text) { answers += std::to_string(number) + text + ";"; },
            [this] { answers += "abandoned;"; });
    }
    std::string answers;
};

TEST_F(ReplyTest, IsAnsweredOnceByWhoeverHoldsIt)
{
    auto reply = make();
    EXPECT_TRUE(reply);
    auto moved = std::move(reply);
    EXPECT_FALSE(reply);
    EXPECT_TRUE(moved);
    moved(1, "a");
    EXPECT_FALSE(moved);
    EXPECT_EQ(answers, "1a;") << "an answered reply isn't abandoned as well";
}

TEST_F(ReplyTest, AnAbandonedOneIsSilentAndFreesItsSlotOnce)
{
    {
        auto reply = make();
        reply.abandon();
        EXPECT_FALSE(reply);
        reply.abandon();
    }
    EXPECT_EQ(answers, "abandoned;");
    { // without a slot to free
        Reply<> reply([] { FAIL(); });
        reply.abandon();
    }
    Reply<> none;
    none.abandon();
    EXPECT_FALSE(none);
}

TEST_F(ReplyTest, WhatFollowsRunsAfterTheAnswerAlone)
{
    const auto followed = [this] { return make().andThen([this] { answers += "then;"; }); };
    followed().andThen([this] { answers += "last;"; })(1, "a");
    EXPECT_EQ(answers, "1a;then;last;");
    answers.clear();
    followed().abandon();
    EXPECT_EQ(answers, "abandoned;");
    EXPECT_FALSE(Reply<>().andThen([] { FAIL(); }));
}

TEST_F(ReplyTest, ItsOwnerMayGoWhileItAnswers)
{
    auto reply = std::make_unique<Reply<>>();
    bool answered = false;
    *reply = Reply<>([&] {
        reply.reset();
        answered = true;
    });
    (*reply)();
    EXPECT_TRUE(answered);
}

TEST_F(ReplyTest, ForgettingAndRepeatingAreLoud)
{
    using Misuse = void (*)(Reply<int, std::string>);
    const std::pair<Misuse, const char*> cases[]{
        {[](auto) {}, "dropped without an answer"},
        {[](auto reply) { reply = Reply<int, std::string>(); }, "dropped without an answer"},
        {[](auto reply) {
             reply(1, "a");
             reply(2, "b");
         },
         "answered twice"},
        {[](auto reply) {
             reply.abandon();
             reply(1, "late");
         },
         "answered twice"},
    };
    for (const auto& [misuse, complaint] : cases) {
        const auto run = [&, call = misuse] {
            failOnReplyMisuse();
            call(make());
        };
        EXPECT_DEATH(run(), complaint);
    }
}

} // namespace
} // namespace platform
