#include <gtest/gtest.h>

#include "searchrecords/ZRSearchResult.h"
#include "tavrind/SessionProcessingHelper.h"
#include "tavrind/TavrinSessionFeedback.h"
#include "tests/records/FeedbackExamples.h"
#include "tests/records/RecordFilling.h"

namespace tavrin {
namespace {

/// "r:ID" is a result and "s:ID" a suggestion. "r:-" has no identifier.
std::string recordNamed(const std::string& name)
{
    const std::string id = name.substr(2);
    return std::string(R"({"class":")") + (name[0] == 'r' ? "ZRSearchResult" : "TAVSearchSuggestion") + '"' +
           (id == "-" ? "" : R"(,"identifier":")" + id + '"') + "}";
}

/// A record in JSON, with ⟨r:ID⟩ for what `recordNamed` makes.
std::string spelledOut(std::string text)
{
    for (std::size_t at; (at = text.find('<')) != std::string::npos;) {
        const std::size_t end = text.find('>', at);
        text.replace(at, end - at + 1, recordNamed(text.substr(at + 1, end - at - 1)));
    }
    return text;
}

/// Adds what stands under "id" in a value to `ids`, level by level from the left.
void collectIds(const Value& value, std::vector<std::string>& ids)
{
    if (const Value::Array* array = value.asArray())
        for (const Value& element : *array) collectIds(element, ids);
    if (const Dictionary* dictionary = value.asDictionary())
        for (const auto& [key, entry] : *dictionary) {
            if (key == "id") ids.push_back(entry.asString() ? *entry.asString() : "null");
            collectIds(entry, ids);
        }
}

template <class T> std::vector<std::string> idsOf(const std::vector<std::shared_ptr<T>>& records)
{
    std::vector<std::string> ids;
    for (const auto& record : records) ids.push_back(record->identifier.value_or("null"));
    return ids;
}

using Ids = std::vector<std::string>;

constexpr const char* kVisible = R"({"class":"ZRVisibleResultsFeedback","results":[<r:a>,<r:b>,<r:a>]})";
constexpr const char* kEngagedA = R"({"class":"ZRResultEngagementFeedback","result":<r:a>})";
constexpr const char* kLateA = R"({"class":"ZRResultsReceivedAfterTimeoutFeedback","results":[<r:a>]})";
constexpr const char* kSectionA =
    R"({"class":"ZRLateSectionsAppendedFeedback","sections":[{"class":"ZRResultSection","identifier":"kept","results":[<r:a>]}]})";
constexpr const char* kSuggestedA = R"({"class":"ZRVisibleSuggestionsFeedback","suggestions":[<s:a>]})";
constexpr const char* kChosenA = R"({"class":"ZRSuggestionEngagementFeedback","suggestion":<s:a>})";
constexpr const char* kRanked =
    R"({"class":"TAVRankerFeedback","sections":[{"class":"ZRSectionRankingFeedback",
        "section":{"class":"ZRResultSection","results":[<r:b>]},"results":[{"class":"ZRResultRankingFeedback",
        "result":<r:a>,"hiddenResults":[<r:c>],"duplicateResults":[<r:d>]}]}]})";

TEST(SessionProcessing, IdentifiersBecomeNumbersAndWhatNoEventShowedIsMissing)
{
    struct {
        const char* what;
        std::vector<const char*> records;
        Ids ids; ///< in the JSON of the events
        Ids missingResults;
        Ids missingSuggestions;
    } const cases[] = {
        {"visible results are only referred to", {kVisible}, {"1", "2", "1"}, {"1", "2"}, {}},
        {"engaged, never shown, and engaged again", {kEngagedA, kEngagedA}, {"1", "1"}, {"1"}, {}},
        {"engaged, then shown", {kEngagedA, kLateA}, {"1", "1"}, {}, {}},
        {"shown, then engaged", {kLateA, kEngagedA}, {"1", "1"}, {}, {}},
        {"shown in a section, whose identifier stays", {kEngagedA, kSectionA}, {"1", "kept", "1"}, {}, {}},
        {"a ranking shows its section, then hidden, duplicate and ranked results",
         {kRanked, kVisible},
         {"2", "3", "4", "1", "4"},
         {},
         {}},
        {"a suggestion chosen, never shown", {kChosenA}, {"1"}, {}, {"1"}},
        {"a suggestion chosen, then shown", {kChosenA, kSuggestedA}, {"1", "1"}, {}, {}},
        {"a suggestion shown, then chosen", {kSuggestedA, kChosenA}, {"1", "1"}, {}, {}},
        {"a result and a suggestion of one identifier: showing it takes the result first",
         {kEngagedA, kChosenA, kSuggestedA},
         {"1", "1", "1"},
         {},
         {"1"}},
        {"the first identifier of a session may look like a replacement",
         {R"({"class":"ZRResultEngagementFeedback","result":<r:2>})", kEngagedA},
         {"1", "2"},
         {"1", "2"},
         {}},
        {"no identifier", {R"({"class":"ZRResultEngagementFeedback","result":<r:->})"}, {"null"}, {}, {}},
        {"an empty identifier is one", {R"({"class":"ZRResultEngagementFeedback","result":<r:>})"}, {"1"}, {"1"}, {}},
        {"nothing to engage, nothing in it",
         {R"({"class":"ZRResultEngagementFeedback"})", R"({"class":"ZRRankingFeedback"})",
          R"({"class":"ZRVisibleResultsFeedback"})", R"({"class":"ZRSuggestionEngagementFeedback"})"},
         {"null"},
         {},
         {}},
        {"other records keep what they hold",
         {R"({"class":"ZRCustomFeedback","jsonFeedback":{"id":"mine"}})",
          R"({"class":"TavrinSessionMissingResults","results":[<r:7>]})"},
         {"mine", "7"},
         {},
         {}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        SessionProcessingHelper helper;
        Ids ids;
        for (const char* record : c.records) {
            const TavrinFeedback event(feedbackFrom(spelledOut(record)), 1, "", "");
            collectIds(event.processed(helper)->dictionary(), ids);
        }
        EXPECT_EQ(ids, c.ids);
        EXPECT_EQ(idsOf(helper.missingResults()), c.missingResults);
        EXPECT_EQ(idsOf(helper.missingSuggestions()), c.missingSuggestions);
    }
}

TEST(SessionProcessing, MissingResultsAreWholeAsFirstReferredToAndInOrder)
{
    SessionProcessingHelper helper;
    for (int i = 1; i <= 12; ++i) {
        for (const char* title : {"first", "later"}) {
            const std::string id = "private " + std::to_string(i);
            const TavrinFeedback event(
                feedbackFrom(
                    R"({"class":"ZRResultEngagementFeedback","result":{"class":"ZRSearchResult","identifier":")" + id +
                    R"(","correctedQuery":")" + title + R"("}})"),
                1, "", "");
            (void)event.processed(helper);
        }
    }
    const auto missing = helper.missingResults();
    ASSERT_EQ(missing.size(), 12u);
    for (std::size_t i = 0; i < missing.size(); ++i) {
        EXPECT_EQ(missing[i]->identifier, std::to_string(i + 1));
        EXPECT_EQ(missing[i]->correctedQuery, "first");
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

TEST(SessionProcessing, NoIdentifierOfAClientIsInTheJsonAndStoredRecordsStayAsTheyAre)
{
    int number = 0;
    SessionProcessingHelper helper;
    for (const auto& [name, make] : tavrindRecordClasses()) {
        // The daemon's own records are made of what was processed before.
        if (!std::dynamic_pointer_cast<ZRFeedback>(make()) || name.starts_with("Tavrin")) continue;
        const auto record = platform::recordFromValue(filled(std::string(name), 4, number), tavrindRecordClasses());
        const TavrinFeedback event(std::dynamic_pointer_cast<ZRFeedback>(record.value()), 1, "", "");
        const std::string stored = platform::archive(event);
        EXPECT_EQ(platform::toJson(event.processed(helper)->dictionary()).find("private"), std::string::npos) << name;
        EXPECT_EQ(platform::archive(event), stored) << name;
    }
    EXPECT_GT(number, 20);
    const TavrinFeedback missing(std::make_shared<TavrinSessionMissingResults>(helper.missingResults()), 0, "", "");
    EXPECT_NE(missing.description().find("\"id\":"), std::string::npos);
    EXPECT_EQ(missing.description().find("private"), std::string::npos);
}

} // namespace
} // namespace tavrin
