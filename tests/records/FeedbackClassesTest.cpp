#include "tavrind/FeedbackClasses.h"

#include <set>

#include <gtest/gtest.h>

#include "searchrecords/ZRRecords.h"
#include "tests/records/FeedbackExamples.h"
#include "tests/records/RecordFilling.h"

namespace tavrin {
namespace {

struct Event {
    int index;
    std::string_view name;
    std::vector<std::string_view> classes;
    bool withQueryIds = true;
};

const std::vector<Event> kEvents{
    {0, "visible_results", {"ZRVisibleResultsFeedback"}},
    {1, "network_search_start", {"ZRStartNetworkSearchFeedback", "TAVLookupStartNetworkSearchFeedback"}},
    {2, "network_search_end", {"ZREndNetworkSearchFeedback", "TAVEndNetworkSearchFeedback"}, false},
    {3, "local_search_start", {"ZRStartLocalSearchFeedback"}},
    {4, "local_search_end", {"ZREndLocalSearchFeedback"}, false},
    {5, "search_view_appear", {"ZRSearchViewAppearFeedback"}},
    {6, "search_view_disappear", {"ZRSearchViewDisappearFeedback"}},
    {7, "rank_sections", {"ZRRankingFeedback", "TAVRankerFeedback"}},
    {8, "result_engagement", {"ZRResultEngagementFeedback"}},
    {9, "visible_card", {}},
    {10,
     "card_engagement",
     {"ZRCardSectionEngagementFeedback", "ZRMapsCardSectionEngagementFeedback",
      "ZRStoreCardSectionEngagementFeedback"}},
    {11, "error", {"ZRErrorFeedback"}},
    {12, "suggestion_engagement", {"ZRSuggestionEngagementFeedback"}},
    {13, "card_view_disappear", {"ZRCardViewDisappearFeedback"}},
    {14, "search_start", {"ZRStartSearchFeedback"}},
    {15, "search_end", {"ZREndSearchFeedback"}},
    {16, "visible_suggestions", {"ZRVisibleSuggestionsFeedback"}},
    {17, "custom_unknown", {"ZRCustomFeedback"}},
    {18, "custom_crowdsourcing", {}},
    {19, "custom_wendral_autofill", {}},
    {20, "custom_vistrel_result_features", {}, false},
    {21, "unknown", {"ZRFeedback", "TAVCacheHitFeedback", "ZRResultRankingFeedback", "ZRSectionRankingFeedback"}},
    {22, "results_received_after_timeout", {"ZRResultsReceivedAfterTimeoutFeedback"}},
    {23, "late_sections_appended", {"ZRLateSectionsAppendedFeedback"}},
    {24, "clear_input", {"ZRClearInputFeedback"}},
    {25, "session_end", {"TavrinSessionEndFeedback"}, false},
    {26, "skip_tavrin_search", {"TAVSkipSearchFeedback"}},
    {27, "section_engagement", {"ZRSectionEngagementFeedback"}},
    {28, "visible_section_header", {"ZRVisibleSectionHeaderFeedback"}},
    {29, "session_missing_results", {"TavrinSessionMissingResults"}, false},
    {30, "session_missing_suggestions", {"TavrinSessionMissingSuggestions"}, false},
    {31, "did_go_to_site", {"ZRDidGoToSiteFeedback"}},
    {32, "connection_invalidated", {"TavrinConnectionInvalidated"}, false},
};

TEST(FeedbackClasses, EveryRecordReportsItsEvent)
{
    std::set<std::string_view> checked;
    EXPECT_EQ(eventTypes().size(), kEvents.size());
    for (const Event& event : kEvents) {
        const auto type = static_cast<EventType>(event.index);
        EXPECT_EQ(eventTypeToString(type), event.name);
        EXPECT_EQ(eventTypes()[static_cast<std::size_t>(event.index)], event.name);
        EXPECT_EQ(requiresQueryId(type), event.withQueryIds) << event.name;
        for (const std::string_view name : event.classes) {
            const auto record = std::dynamic_pointer_cast<ZRFeedback>(tavrindRecordClasses().make(name));
            ASSERT_TRUE(record) << name;
            EXPECT_EQ(feedbackClassOf(*record).name, name);
            EXPECT_EQ(TavrinFeedback(record, 1, "", "").type(), type) << name;
            checked.insert(name);
        }
    }
    for (const auto& [name, make] : tavrindRecordClasses()) {
        if (std::dynamic_pointer_cast<ZRFeedback>(make())) {
            EXPECT_TRUE(checked.contains(name)) << name << " has no event type";
        }
    }
    EXPECT_EQ(TavrinFeedback().type(), EventType::Unknown);
}

TEST(FeedbackClasses, CustomRecordsReportWhatTheirTypeSays)
{
    const std::pair<std::int64_t, int> cases[] = {{0, 17}, {1, 19}, {2, 18}, {3, 20}, {4, 17}, {-1, 17}};
    for (const auto& [type, index] : cases) {
        ZRCustomFeedback record;
        record.feedbackType = static_cast<CustomFeedbackType>(type);
        EXPECT_EQ(static_cast<int>(feedbackClassOf(record).eventType(record)), index) << type;
    }
}

TEST(FeedbackClasses, EveryRecordNamesTheQueryOfItsFirstResult)
{
    constexpr const char* kResults = R"("results":[{"class":"ZRSearchResult","queryId":7},{"class":"ZRSearchResult"}])";
    const std::string section = std::string(R"({"class":"ZRResultSection",)") + kResults + "}";
    const std::string ranking = R"({"class":"ZRSectionRankingFeedback","section":)" + section + "}";
    const std::pair<std::string_view, std::string> cases[] = {
        {"ZRStartSearchFeedback", R"("queryId":7)"},
        {"ZRStartLocalSearchFeedback", R"("queryId":7)"},
        {"ZRStartNetworkSearchFeedback", R"("queryId":7)"},
        {"TAVLookupStartNetworkSearchFeedback", R"("queryId":7)"},
        {"ZRRankingFeedback", R"("sections":[)" + ranking + "]"},
        {"TAVRankerFeedback", R"("sections":[)" + ranking + "]"},
        {"ZRLateSectionsAppendedFeedback", R"("sections":[)" + section + "]"},
        {"ZRResultEngagementFeedback", R"("result":{"class":"ZRSearchResult","queryId":7})"},
        {"ZRVisibleResultsFeedback", kResults},
        {"ZRResultsReceivedAfterTimeoutFeedback", kResults},
        {"ZRSectionEngagementFeedback", R"("section":)" + section},
        {"ZRVisibleSectionHeaderFeedback", R"("section":)" + section},
    };
    const auto clientQueryId = [](const ZRFeedback& record) { return feedbackClassOf(record).clientQueryId(record); };
    std::set<std::string_view> checked;
    for (const auto& [name, fields] : cases) {
        const std::string empty = R"({"class":")" + std::string(name) + '"';
        EXPECT_EQ(clientQueryId(*feedbackFrom(empty + "," + fields + "}")), 7u) << name;
        EXPECT_EQ(clientQueryId(*feedbackFrom(empty + "}")), 0u) << name;
        checked.insert(name);
    }
    ZRVisibleResultsFeedback missing;
    missing.results.emplace(1, nullptr);
    EXPECT_EQ(clientQueryId(missing), 0u);
    for (const auto& [name, make] : tavrindRecordClasses()) {
        const auto record = std::dynamic_pointer_cast<ZRFeedback>(make());
        if (!record || checked.contains(name)) continue;
        fill(*record, tavrindRecordClasses());
        EXPECT_EQ(clientQueryId(*record), 0u) << name;
    }
}

TEST(TavrinFeedback, EventsSortByTheirRecordsTimestamps)
{
    const auto at = [](std::uint64_t timestamp) {
        auto record = std::make_shared<ZRFeedback>();
        record->timestamp = timestamp;
        return TavrinFeedback(record, 1, "", "");
    };
    const TavrinFeedback early = at(5);
    const TavrinFeedback late = at(UINT64_MAX);
    EXPECT_TRUE(TavrinFeedback::timeStampComparator(early, late) < 0);
    EXPECT_TRUE(TavrinFeedback::timeStampComparator(late, early) > 0);
    EXPECT_TRUE(TavrinFeedback::timeStampComparator(early, at(5)) == 0);
    EXPECT_TRUE(TavrinFeedback::timeStampComparator(TavrinFeedback(), early) < 0);
}

} // namespace
} // namespace tavrin
