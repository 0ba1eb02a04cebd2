#include "tools/tavrinctl/Results.h"

#include <gmock/gmock.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVReply.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/SearchScreen.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {
namespace {

using testing::HasSubstr;

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
    EXPECT_EQ(answered(std::make_shared<TAVReply>(), makeTAVError(500, "no JSON")).outcome(), Outcome::Failed);
    EXPECT_EQ(Exchange().outcome(), Outcome::Failed);

    Exchange empty = answered(nullptr);
    EXPECT_EQ(empty.outcome(), Outcome::Skipped);
    empty.overtaken = true;
    EXPECT_EQ(empty.outcome(), Outcome::Overtaken);
    empty.skipReason = "shorter than the bag's minimum of 4";
    EXPECT_EQ(empty.outcome(), Outcome::Skipped) << "would have been skipped in any case";
}

TEST(Results, AStatusOfTheServiceIsTheReason)
{
    const auto reason = [](std::int64_t status, std::optional<platform::Error> error) {
        auto reply = std::make_shared<TAVReply>();
        reply->httpResponse = std::make_shared<TAVHTTPResponse>();
        reply->httpResponse->statusCode = status;
        const Exchange exchange = answered(std::move(reply), std::move(error));
        return std::pair(exchange.outcome(), explanation(exchange));
    };
    const platform::Error notJson = platform::malformed("an improper structure").error();
    EXPECT_EQ(reason(200, {}).first, Outcome::Answered);
    for (const auto& error : {std::optional<platform::Error>(), std::optional(notJson)})
        EXPECT_EQ(reason(503, error), std::pair(Outcome::Failed, std::string("the service answered 503")));
    EXPECT_EQ(reason(200, notJson).second, "the service's answer is not JSON: an improper structure");

    Exchange noBag = answered(nullptr, makeTAVError(TAVErrorTimeout, "timeout"));
    noBag.cause = "last fetch 3 s ago: self-signed certificate";
    EXPECT_THAT(explanation(noBag), HasSubstr("no bag (last fetch 3 s ago: self-signed certificate)"));
}

TEST(Results, ACardIsListed)
{
    const auto card = platform::parseJson(R"([{"results": [{"title": "Zürich", "card": {"title": "Zürich",
        "card_sections": [{"title": "About", "text": "A city"}, {"text": "on a\u001blake"}, 5]}}]}])");
    EXPECT_EQ(cardLines(*card),
              (std::vector<std::string>{"Zürich", "  About           A city", "                  on a lake"}));
    EXPECT_TRUE(cardLines(*platform::parseJson(R"([{"results": [{"card": 1}]}])")).empty());
}

TEST(Results, SkipReasonsFollowTheBag)
{
    const auto reason = [](platform::Dictionary raw, std::string_view query) {
        return skipReason({std::make_shared<const TAVBag>(std::move(raw), "tavrinctl/1"), {}}, query);
    };
    EXPECT_EQ(skipReason({}, "w"), "");
    EXPECT_EQ(reason({{"minimumQueryLength", 2}}, "\U0001F326"), "") << "two UTF-16 units";
    EXPECT_THAT(reason({{"minimumQueryLength", 3}}, "we"), HasSubstr("minimum of 3"));
    EXPECT_THAT(reason({{"isEnabled", false}}, "weather"), HasSubstr("disables search"));
}

TEST(Results, AnAnswerOfAnotherShapeHasNothingToList)
{
    for (const char* shape : {"{}", "[1, null, {}]", R"([{"results": 5, "suggestions": {"a": 1}}])",
                              R"([{"results": [1, {}, {"title": 7}], "suggestions": ["x", {"suggestion": 1}]}])"}) {
        EXPECT_TRUE(resultsIn(*platform::parseJson(shape)).empty()) << shape;
        EXPECT_TRUE(suggestionsIn(*platform::parseJson(shape)).empty()) << shape;
    }
}

TEST(Results, AServicesTextCantDriveTheTerminal)
{
    EXPECT_EQ(printable("a\033[31mb\r\n\x7f"), "a [31mb   ");
    EXPECT_EQ(printable("caf\u00e9 \u009b31m \u2028"), "caf\u00e9  31m \u2028");
    EXPECT_EQ(tools::printableJson("{\n  \"caf\u00e9\": \"\u009b\x7f\u0080\u00a0\"\n}"),
              "{\n  \"caf\u00e9\": \"\\u009b\\u007f\\u0080\u00a0\"\n}");
    auto reply = std::make_shared<TAVReply>();
    reply->rawResponse = platform::Bytes(R"([{"results": [{"title": "We\u001b[2J", "section_name": "A"}]}])");
    EXPECT_EQ(answerLines(answered(reply)), (std::vector<ScreenLine>{{"A", ScreenLine::Style::Bold}, {"  We [2J"}}));
    EXPECT_THAT(summary(answered(nullptr, makeTAVError(TAVErrorTimeout, "time\033out"))), HasSubstr("time out"));
}

} // namespace
} // namespace tavrin::ctl
