#include "tools/tavrinctl/Results.h"

#include <gmock/gmock.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVReply.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {
namespace {

using platform::Value;
using testing::HasSubstr;

TAVBagAnswer bagOf(platform::Dictionary raw)
{
    return {std::make_shared<const TAVBag>(std::move(raw), "tavrinctl/1"), std::nullopt};
}

Exchange answered(std::shared_ptr<TAVReply> reply, std::optional<platform::Error> error = std::nullopt)
{
    Exchange exchange;
    exchange.query = "wea";
    exchange.answer = TAVAnswer{1, std::move(reply), std::move(error)};
    return exchange;
}

TEST(Results, AnEmptyAnswerIsSkippedOrOvertaken)
{
    EXPECT_EQ(answered(std::make_shared<TAVReply>()).outcome(), Outcome::Answered);
    EXPECT_EQ(answered(nullptr, makeTAVError(500, "no URL")).outcome(), Outcome::Failed);
    EXPECT_EQ(answered(std::make_shared<TAVReply>(), makeTAVError(500, "no JSON")).outcome(), Outcome::Failed);
    EXPECT_EQ(Exchange().outcome(), Outcome::Failed);

    Exchange empty = answered(nullptr);
    EXPECT_EQ(empty.outcome(), Outcome::Skipped);
    empty.overtaken = true;
    EXPECT_EQ(empty.outcome(), Outcome::Overtaken);
    empty.skipReason = "shorter than the bag's minimum of 4";
    EXPECT_EQ(empty.outcome(), Outcome::Skipped) << "would have been skipped in any case";
    EXPECT_EQ(describe(empty)["reason"], Value(empty.skipReason));
}

TEST(Results, SkipReasonsFollowTheBag)
{
    EXPECT_EQ(skipReason(bagOf({}), "w"), "");
    EXPECT_EQ(skipReason({}, "w"), "");
    EXPECT_EQ(skipReason(bagOf({{"minimumQueryLength", 2}}), "\U0001F326"), "") << "two UTF-16 units";
    EXPECT_THAT(skipReason(bagOf({{"minimumQueryLength", 3}}), "we"), HasSubstr("minimum of 3"));
    EXPECT_THAT(skipReason(bagOf({{"isEnabled", false}}), "weather"), HasSubstr("disables search"));
}

TEST(Results, ListsWhatIsThereOfAnAnswerOfAnyShape)
{
    const char* shapes[] = {"null",
                            "{}",
                            "[]",
                            "[1, null, {}]",
                            R"([{"results": 5, "suggestions": {"a": 1}}])",
                            R"([{"results": [1, {}, {"title": 7}], "suggestions": ["x", {"suggestion": 1}]}])"};
    for (const char* shape : shapes) {
        EXPECT_TRUE(resultsIn(*platform::parseJson(shape)).empty()) << shape;
        EXPECT_TRUE(suggestionsIn(*platform::parseJson(shape)).empty()) << shape;
    }

    auto reply = std::make_shared<TAVReply>();
    reply->rawResponse = platform::Bytes(
        R"([{"results": [{"title": "Zürich", "url": "https://a.example", "section_name": "Places"}, {"title": "B"}],
             "suggestions": [{"suggestion": "weather radar"}]}, {"results": [{"title": "C"}]}])");
    const Exchange exchange = answered(std::move(reply));
    const Value described = describe(exchange);
    ASSERT_EQ(described["results"].count(), 3u);
    EXPECT_EQ(described["results"][0]["section"], Value("Places"));
    EXPECT_EQ(described["results"][0]["url"], Value("https://a.example"));
    EXPECT_EQ(described["suggestions"], Value(Value::Array{"weather radar"}));
    EXPECT_THAT(summary(exchange), HasSubstr("3 results, 2 sets"));
}

TEST(Results, AServicesTextCantDriveTheTerminal)
{
    EXPECT_EQ(printable("a\033[31mb\r\n\x7f"), "a [31mb   ");
    EXPECT_EQ(printable("caf\u00e9 \u009b31m \u2028"), "caf\u00e9  31m \u2028");
    EXPECT_THAT(summary(answered(nullptr, makeTAVError(TAVErrorTimeout, "time\033out"))),
                testing::AllOf(HasSubstr("time out"), HasSubstr("TAVBagURL")));
}

} // namespace
} // namespace tavrin::ctl
