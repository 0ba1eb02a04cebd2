#include <gmock/gmock.h>

#include "CoreTavrin/TAVRecordClasses.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "platform/values/Record.h"
#include "searchrecords/ZRRecords.h"
#include "tests/support/Encodings.h"
#include "tools/tavrinctl/Books.h"
#include "tools/tavrinctl/Events.h"
#include "tools/tavrinctl/FeedbackRecords.h"

namespace tavrin::ctl {
namespace {

using platform::Value;
using testing::ElementsAre;
using testing::HasSubstr;

std::vector<std::string> problemsIn(const char* json)
{
    const auto events = eventsIn(platform::parseJson(json).value());
    return events ? std::vector<std::string>{} : events.error();
}

TEST(FeedbackRecords, MistakesAreNamedWithTheirPlace)
{
    const std::pair<const char*, const char*> cases[] = {
        {"7", "the record: a record is an object"},
        {"{}", "the record: record without a class"},
        {R"({"class": "ZRNothing"})", "unknown class ZRNothing"},
        {R"({"class": "TAVSearchRequest"})", "TAVSearchRequest is no event"},
        {R"([{"class": "ZRFeedback"}, {"class": "ZRFeedback", "queryId": 1.5}])",
         "record 2 (ZRFeedback): queryId: expected"},
        {R"({"class": "ZRFeedback", "queryId": "5"})", "queryId: expected a whole number"},
        {R"({"class": "ZRFeedback", "inptu": 1})", "inptu: no such field"},
        {R"({"class": "ZRVisibleResultsFeedback", "results": [{"class": "ZRSearchResult", "rankingScore": "x"}]})",
         "results[0].rankingScore: expected a double, found a string"},
        {R"({"class": "ZRVisibleResultsFeedback", "results": [{"class": "ZRSearchResult"},
             {"class": "ZRSearchResult", "title": {"class": "ZRText", "txt": "a"}}]})",
         "results[1].title.txt: no such field"},
    };
    for (const auto& [json, problem] : cases) EXPECT_THAT(problemsIn(json), ElementsAre(HasSubstr(problem))) << json;
    EXPECT_EQ(problemsIn(R"([{"class": "ZRFeedback", "a": 1, "b": 2}, 7])").size(), 3u) << "all of them";
}

TEST(FeedbackRecords, ReadsRecordsAndWhatTheyBelongTo)
{
    const auto events = eventsIn(platform::parseJson(R"([
        {"class": "ZRStartSearchFeedback", "queryId": 7, "input": "weather", "triggerEvent": 1},
        {"class": "ZRSearchViewAppearFeedback", "queryId": -1, "viewAppearEvent": 5},
        {"class": "ZRCustomFeedback", "feedbackType": 3, "jsonFeedback": {"x": {"class": "ZRText", "any": 1}}},
        {"class": "ZRErrorFeedback", "error": {"domain": "D", "code": 3, "userInfo": {"reason": "r"}}}])")
                                     .value());
    ASSERT_TRUE(events && events->size() == 4u);
    EXPECT_EQ((*events)[0].queryId, 7);
    EXPECT_EQ(dynamic_cast<const ZRStartSearchFeedback&>(*(*events)[0].feedback).queryId, 7u) << "the field, too";
    EXPECT_EQ((*events)[1].queryId, -1) << "no field of this record";
    EXPECT_EQ((*events)[2].queryId, 0);
}

TEST(Events, ALineHasWhatMattersAndNothingThatDrivesTheTerminal)
{
    const auto line = [](const char* json) { return eventLine(platform::parseJson(json).value()); };
    EXPECT_EQ(
        line(R"({"trigger_event":"tap","input":"wea\u001bther","uuid":null,"top":false,"on_lock_screen":true,
                       "results":[1,2],"none":[],"result":{"id":"3"},"headers":{"a":1},"score":0.5,
                       "query_id":7,"type":"search_start","timestamp":12})"),
        "search_start             query 7    trigger_event=tap input=wea ther on_lock_screen results[2] result.id=3 "
        "headers{1} score=0.5");
    EXPECT_THAT(line("[1]"), HasSubstr("no event"));
    EXPECT_THAT(line(R"({"\u001b[0m": 1})"), HasSubstr("no type"));
    const std::string longText = line((R"({"type":"x","input":")" + std::string(59, 'a') + R"(üüü"})").c_str());
    EXPECT_THAT(longText, testing::EndsWith("input=" + std::string(59, 'a') + "…")) << "cut between characters";
}

TEST(Events, ABodyIsASessionARecordOrBroken)
{
    const auto packed = [](std::string_view text) { return platform::Bytes(platform::test::storedDeflate(text)); };
    const FlushedBody session = flushedBody(
        packed(R"({"fb":[{"type":"error"},{"type":"error"},{"type":"clear_input"}],"agent":"A/1","user_guid":"G"})"));
    EXPECT_EQ(summary(session), "A/1  3 events  95 bytes packed to 100  user G\n  error ×2, clear_input");
    EXPECT_THAT(summary(flushedBody(packed(R"({"a":1,"b":2})"))), HasSubstr("a, b"));
    EXPECT_THAT(summary(flushedBody(packed("[7]"))), HasSubstr("of its own"));
    EXPECT_THAT(summary(flushedBody(packed("{"))), HasSubstr("not JSON"));
    EXPECT_THAT(summary(flushedBody(platform::Bytes("\xff\xff"))), HasSubstr("no raw DEFLATE"));
}

TEST(Books, SayWhetherTheyClose)
{
    const auto lines = [](const char* json) { return bookLines(platform::parseJson(json).value()); };
    EXPECT_THAT(
        lines(R"({"recorded":21,"open":1,"closed":2,"uploading":3,"sent":4,"notSent":5,"unknown":0,
                          "dropped":{"tooOld":6,"noTask":0}})"),
        ElementsAre("21 recorded = 1 open + 2 closed + 3 uploading + 4 sent + 5 not sent + 0 unknown + 6 dropped",
                    "dropped: 6 tooOld", "the books close"));
    EXPECT_THAT(lines(R"({"recorded":3,"sent":1})").back(), HasSubstr("2 missing"));
    EXPECT_THAT(lines(R"({"recorded":3,"dropped":{"tooOld":4}})").back(), HasSubstr("1 too many"));
}

} // namespace
} // namespace tavrin::ctl
