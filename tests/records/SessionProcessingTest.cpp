#include <regex>

#include <gtest/gtest.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"
#include "tavrind/SessionProcessingHelper.h"
#include "tavrind/TavrinSessionFeedback.h"
#include "tests/records/FeedbackExamples.h"
#include "tests/records/RecordFilling.h"

namespace tavrin {
namespace {

/// The JSON of a record, with "<r:ID>" for a result and "<s:ID>" for a suggestion in it.
std::string spelledOut(const std::string& text)
{
    static const std::regex kResult("<r:(\\w*)>");
    static const std::regex kSuggestion("<s:(\\w*)>");
    const std::string some = std::regex_replace(text, kResult, R"({"class":"ZRSearchResult","identifier":"$1"})");
    return std::regex_replace(some, kSuggestion, R"({"class":"TAVSearchSuggestion","identifier":"$1"})");
}

/// What stands under "id" in the JSON of an event, each with a blank behind it.
std::string idsIn(const TavrinFeedback& event)
{
    static const std::regex kId("\"id\":\"?(\\w+)");
    const std::string json = platform::toJson(event.dictionary());
    std::string ids;
    for (std::sregex_iterator match(json.begin(), json.end(), kId), end; match != end; ++match)
        ids += (*match)[1].str() + ' ';
    return ids;
}

TavrinFeedback processed(std::shared_ptr<ZRFeedback> record, SessionProcessingHelper& helper)
{
    TavrinFeedback event(std::move(record), 1, "", "");
    event.process(helper);
    return event;
}

template <class Missing, class T> std::string idsIn(const std::vector<std::shared_ptr<T>>& missing)
{
    return idsIn(TavrinFeedback(std::make_shared<Missing>(missing), 0, "", ""));
}

constexpr const char* kVisible = R"({"class":"ZRVisibleResultsFeedback","results":[<r:a>,<r:b>,<r:a>]})";
constexpr const char* kEngagedA = R"({"class":"ZRResultEngagementFeedback","result":<r:a>})";
constexpr const char* kEngaged2 = R"({"class":"ZRResultEngagementFeedback","result":<r:2>})";
constexpr const char* kLateA = R"({"class":"ZRResultsReceivedAfterTimeoutFeedback","results":[<r:a>]})";
constexpr const char* kSectionA =
    R"({"class":"ZRLateSectionsAppendedFeedback","sections":[{"class":"ZRResultSection","identifier":"kept","results":[<r:a>]}]})";
constexpr const char* kSuggestedA = R"({"class":"ZRVisibleSuggestionsFeedback","suggestions":[<s:a>]})";
constexpr const char* kChosenA = R"({"class":"ZRSuggestionEngagementFeedback","suggestion":<s:a>})";
constexpr const char* kRanked =
    R"({"class":"ZRRankingFeedback","sections":[{"class":"ZRSectionRankingFeedback",
        "section":{"class":"ZRResultSection","results":[<r:b>]},"results":[{"class":"ZRResultRankingFeedback",
        "result":<r:a>,"hiddenResults":[<r:c>],"duplicateResults":[<r:d>]}]}]})";
constexpr const char* kRanker =
    R"({"class":"TAVRankerFeedback","sections":[{"class":"ZRSectionRankingFeedback",
        "results":[{"class":"ZRResultRankingFeedback","hiddenResults":[<r:a>]}]}]})";

TEST(SessionProcessing, IdentifiersBecomeNumbersAndWhatNoEventShowedIsMissing)
{
    struct {
        const char* what;
        std::vector<const char*> records;
        std::string ids; ///< in the JSON of the events
        std::string missingResults;
        std::string missingSuggestions;
    } const cases[] = {
        {"visible results are only referred to", {kVisible}, "1 2 1 ", "1 2 ", ""},
        {"engaged, never shown, and engaged again", {kEngagedA, kEngagedA}, "1 1 ", "1 ", ""},
        {"engaged, then shown", {kEngagedA, kLateA}, "1 1 ", "", ""},
        {"shown, then engaged", {kLateA, kEngagedA}, "1 1 ", "", ""},
        {"shown in a section, whose identifier stays", {kEngagedA, kSectionA}, "1 kept 1 ", "", ""},
        {"a ranking shows its section, hidden, duplicate, ranked", {kRanked, kVisible}, "2 3 4 1 4 ", "", ""},
        {"a ranker's record shows what its event leaves out", {kEngagedA, kRanker}, "1 ", "", ""},
        {"a suggestion chosen, never shown", {kChosenA}, "1 ", "", "1 "},
        {"a suggestion chosen, then shown", {kChosenA, kSuggestedA}, "1 1 ", "", ""},
        {"a suggestion shown, then chosen", {kSuggestedA, kChosenA}, "1 1 ", "", ""},
        {"one identifier for both: the result is found first", {kEngagedA, kChosenA, kSuggestedA}, "1 1 1 ", "", "1 "},
        {"an identifier like a replacement", {kEngaged2, kEngagedA}, "1 2 ", "1 2 ", ""},
        {"an empty identifier is one", {R"({"class":"ZRResultEngagementFeedback","result":<r:>})"}, "1 ", "1 ", ""},
        {"no identifier",
         {R"({"class":"ZRResultEngagementFeedback","result":{"class":"ZRSearchResult"}})",
          R"({"class":"ZRResultEngagementFeedback"})", R"({"class":"ZRRankingFeedback"})",
          R"({"class":"ZRVisibleResultsFeedback"})", R"({"class":"ZRSuggestionEngagementFeedback"})"},
         "null null ",
         "",
         ""},
        {"other records keep what they hold",
         {R"({"class":"ZRCustomFeedback","jsonFeedback":{"id":"mine"}})",
          R"({"class":"TavrinSessionMissingResults","results":[<r:7>]})"},
         "mine 7 ",
         "",
         ""},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        SessionProcessingHelper helper;
        std::string ids;
        for (const char* record : c.records) ids += idsIn(processed(feedbackFrom(spelledOut(record)), helper));
        EXPECT_EQ(ids, c.ids);
        EXPECT_EQ(idsIn<TavrinSessionMissingResults>(helper.missingResults()), c.missingResults);
        EXPECT_EQ(idsIn<TavrinSessionMissingSuggestions>(helper.missingSuggestions()), c.missingSuggestions);
    }
}

TEST(SessionProcessing, MissingResultsAreThoseFirstReferredToInOrder)
{
    SessionProcessingHelper helper;
    for (int i = 0; i < 24; ++i) {
        const auto result = std::make_shared<ZRSearchResult>();
        result->identifier = "private " + std::to_string(i % 12);
        result->rankingScore = i;
        helper.refer(result);
    }
    const auto missing = helper.missingResults();
    ASSERT_EQ(missing.size(), 12u);
    for (std::size_t i = 0; i < missing.size(); ++i) EXPECT_EQ(missing[i]->rankingScore, static_cast<double>(i));
}

/// A record of a class in its IPC form, filled to the given depth; results and suggestions are called "private N".
Value filled(const std::string& className, int depth, int& number)
{
    const auto record = tavrindRecordClasses().make(className);
    fill(*record, tavrindRecordClasses());
    Value value = platform::toValue(*record);
    const auto inner = [&](const Value& nested) {
        return depth > 0 && nested["class"].asString() ? filled(*nested["class"].asString(), depth - 1, number)
                                                       : nested;
    };
    for (const auto& [key, entry] : Dictionary(*value.asDictionary())) {
        Value changed = inner(entry);
        if (changed.asArray())
            for (Value& element : changed.mutableArray()) element = inner(element);
        value.mutableDictionary().set(key, changed);
    }
    if (className == "ZRSearchResult" || className.ends_with("SearchSuggestion"))
        value.mutableDictionary().set("identifier", "private " + std::to_string(++number));
    return value;
}

TEST(SessionProcessing, NoIdentifierOfAClientIsInTheJson)
{
    int number = 0;
    SessionProcessingHelper helper;
    for (const auto& [name, make] : tavrindRecordClasses()) {
        // The daemon's own records are made of what was processed before.
        if (!std::dynamic_pointer_cast<ZRFeedback>(make()) || name.starts_with("Tavrin")) continue;
        const auto record = platform::recordFromValue(filled(std::string(name), 4, number), tavrindRecordClasses());
        const auto event = processed(std::dynamic_pointer_cast<ZRFeedback>(record.value()), helper);
        EXPECT_EQ(platform::toJson(event.dictionary()).find("private"), std::string::npos) << name;
    }
    EXPECT_GT(number, 20);
    const TavrinFeedback missing(std::make_shared<TavrinSessionMissingResults>(helper.missingResults()), 0, "", "");
    EXPECT_NE(missing.description().find("\"id\":"), std::string::npos);
    EXPECT_EQ(missing.description().find("private"), std::string::npos);
}

} // namespace
} // namespace tavrin
