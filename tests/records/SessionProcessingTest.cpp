#include <deque>
#include <regex>

#include <gtest/gtest.h>

#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"
#include "platform/values/JsonSink.h"
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

/// A session's pass: events are processed and written one by one.
struct Pass {
    SessionProcessingHelper helper;

    /// The JSON of a record's event.
    std::string written(std::shared_ptr<ZRFeedback> record)
    {
        const TavrinFeedback feedback(std::move(record), 1, "", "");
        EXPECT_TRUE(_open.open(_archives.emplace_back(platform::archive(feedback))));
        const auto event = _open.root().as<TavrinFeedback>();
        TavrinFeedback::process(event, helper);
        platform::JsonTextSink json;
        TavrinFeedback::write(json, event, 0, &helper);
        return json.text();
    }

private:
    std::deque<std::string> _archives; // the helper refers to them
    platform::OpenArchive _open{tavrindRecordClasses()};
};

/// What stands under "id" in the JSON of an event, each with a blank behind it.
std::string idsIn(const std::string& json)
{
    static const std::regex kId("\"id\":\"?(\\w+)");
    std::string ids;
    for (std::sregex_iterator match(json.begin(), json.end(), kId), end; match != end; ++match)
        ids += (*match)[1].str() + ' ';
    return ids;
}

/// The numbers of missing records, each with a blank behind it.
std::string numbersOf(const SessionProcessingHelper::Archives& missing)
{
    std::string numbers;
    for (const auto& [number, archive] : missing) numbers += std::to_string(number) + ' ';
    return numbers;
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
        Pass pass;
        std::string ids;
        for (const char* record : c.records) ids += idsIn(pass.written(feedbackFrom(spelledOut(record))));
        EXPECT_EQ(ids, c.ids);
        EXPECT_EQ(numbersOf(pass.helper.missingResults()), c.missingResults);
        EXPECT_EQ(numbersOf(pass.helper.missingSuggestions()), c.missingSuggestions);
    }
}

TEST(SessionProcessing, MissingResultsAreThoseFirstReferredToInOrder)
{
    Pass pass;
    for (int i = 0; i < 24; ++i) {
        const auto engagement = std::make_shared<ZRResultEngagementFeedback>();
        engagement->result = std::make_shared<ZRSearchResult>();
        engagement->result->identifier = "private " + std::to_string(i % 12);
        engagement->result->rankingScore = i;
        pass.written(engagement);
    }
    const auto& missing = pass.helper.missingResults();
    ASSERT_EQ(missing.size(), 12u);
    for (const auto& [number, archive] : missing) {
        const auto result =
            platform::castRecord<ZRSearchResult>(platform::unarchive(archive, tavrindRecordClasses())).value();
        EXPECT_EQ(result->rankingScore, static_cast<double>(number - 1));
    }
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
    Pass pass;
    for (const auto& [name, make] : tavrindRecordClasses()) {
        // The daemon's own records are made of what was processed before.
        if (!std::dynamic_pointer_cast<ZRFeedback>(make()) || name.starts_with("Tavrin")) continue;
        const auto record = platform::recordFromValue(filled(std::string(name), 4, number), tavrindRecordClasses());
        const std::string event = pass.written(std::dynamic_pointer_cast<ZRFeedback>(record.value()));
        EXPECT_EQ(event.find("private"), std::string::npos) << name;
    }
    EXPECT_GT(number, 20);
}

} // namespace
} // namespace tavrin
