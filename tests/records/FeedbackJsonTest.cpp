#include <regex>
#include <set>

#include <gtest/gtest.h>

#include "tavrind/FeedbackJson.h"
#include "tavrind/FeedbackTypes.h"
#include "tests/records/FeedbackExamples.h"

namespace tavrin {
namespace {

using platform::Value;

/// What the examples add to every event with query ids.
constexpr const char* kIds = R"("query_id":12,"client_query_id":3,)";

TEST(FeedbackJson, EventsAreAsThePageShowsThem)
{
    static const std::regex kExample("```json\n([^`]*)\n```\n```json\n([^`]*)\n```|\n### (\\w+)");
    const std::string page = feedbackPage();
    std::set<std::string> shown;
    std::set<std::string> classes;
    std::string type;
    for (std::sregex_iterator match(page.begin(), page.end(), kExample), end; match != end; ++match) {
        if ((*match)[3].matched) {
            type = (*match)[3];
            continue;
        }
        const std::string record = (*match)[1];
        const Value event = parsed((*match)[2].str());
        EXPECT_EQ(eventFor(record), platform::toJson(event)) << record;
        EXPECT_EQ(event["type"], Value(type));
        shown.insert(type);
        classes.insert(*parsed(record)["class"].asString());
    }
    EXPECT_EQ(shown.size(), eventTypes().size() - 1) << "all but visible_card";
    for (const auto& [name, make] : tavrindRecordClasses()) {
        const auto record = std::dynamic_pointer_cast<ZRFeedback>(make());
        const bool isPart = name == "ZRResultRankingFeedback" || name == "ZRSectionRankingFeedback";
        if (record && !isPart) {
            EXPECT_TRUE(classes.contains(std::string(name))) << name << " has no example";
        }
    }
}

/// `record` in JSON, and what its event says of it.
struct Case {
    const char* record;
    const char* fields;
    const char* type;
    bool hasQueryIds = true;
};

const Case kCases[] = {
    {R"({"class":"ZRStartSearchFeedback","triggerEvent":99})", R"("trigger_event":"unknown","input":null,"uuid":null,)",
     "search_start"},
    {R"({"class":"ZRVisibleResultsFeedback","triggerEvent":-1})", R"("trigger_event":"unknown","results":null,)",
     "visible_results"},
    {R"({"class":"ZRVisibleResultsFeedback","results":[]})", R"("trigger_event":"unknown","results":[],)",
     "visible_results"},
    {R"({"class":"ZRRankingFeedback","sections":[{"class":"ZRSectionRankingFeedback"}]})",
     R"("blending_duration":0,"sections":[{"local_section_position":0,"results":null}],)", "rank_sections"},
    {R"({"class":"ZRLateSectionsAppendedFeedback","sections":[{"class":"ZRResultSection"}]})",
     R"("sections":[{"id":null,"score":0,"bundle_id":null,"results":null}],)", "late_sections_appended"},
    // Network searches
    {R"({"class":"ZRStartNetworkSearchFeedback","headers":["Accept"]})",
     R"("headers":null,"url":null,"endpoint_type":"unknown",)", "network_search_start"},
    {R"({"class":"ZREndNetworkSearchFeedback","networkTimingData":{"_kCFNTimingDataFetchStart":0.0,
         "_kCFNTimingDataConnectionInterfaceIdentifier":""}})",
     R"("uuid":null,"response_size":0,"status_code":0,"network_timing_data":[],"connection_reused":false,)",
     "network_search_end", false},
    {R"({"class":"ZREndNetworkSearchFeedback","networkTimingData":"none"})",
     R"("uuid":null,"response_size":0,"status_code":0,"network_timing_data":null,"connection_reused":false,)",
     "network_search_end", false},
    // Results
    {R"({"class":"ZRResultsReceivedAfterTimeoutFeedback","results":[{"class":"ZRSearchResult","resultBundleId":"r",
         "applicationBundleIdentifier":"a","staticCorrection":true,"customProperties":{"class":"TAVCustomSearchResult"}},
         {"class":"ZRSearchResult","isLocalApplicationResult":true,"type":1,"customProperties":{"class":"ZRText"}}]})",
     R"("results":[{"id":null,"score":0,"result_type":"unknown","top_hit":"tophit_no","section_bundle_id":null,)"
     R"("bundle_id":"r","fbr":null,"static_correction":true},)"
     R"({"id":null,"score":0,"result_type":"tavrin","top_hit":"tophit_no","section_bundle_id":null,)"
     R"("bundle_id":null,"fbr":null,"static_correction":false}],)",
     "results_received_after_timeout"},
    // Engagements
    {R"({"class":"ZRResultEngagementFeedback"})",
     R"("trigger_event":"unknown","destination":"unknown","result":null,"action_destination":"non_tavrin_result",)",
     "result_engagement"},
    {R"({"class":"ZRResultEngagementFeedback","result":{"class":"ZRSearchResult","type":14,"title":{"class":"ZRText"}}})",
     R"("trigger_event":"unknown","destination":"unknown","result":{"id":null,"third_party_suggestion":null},)"
     R"("action_destination":"non_tavrin_result",)",
     "result_engagement"},
    {R"({"class":"ZRResultEngagementFeedback","destination":1,"result":{"class":"ZRSearchResult","type":1,
         "title":{"class":"ZRText","text":"t"},"punchout":{"class":"ZRPunchout","urls":["https://a.example/"]}}})",
     R"("trigger_event":"unknown","destination":"card","result":{"id":null},"action_destination":null,)",
     "result_engagement"},
    {R"({"class":"ZRResultEngagementFeedback","destination":2,"result":{"class":"ZRSearchResult","type":1,
         "punchout":{"class":"ZRPunchout","urls":["https://a.example/"]}},"actionTarget":2,"actionEngaged":
         {"class":"ZRActionItem","punchout":{"class":"ZRPunchout","urls":["tel:1","https://b.example/"]}}})",
     R"("trigger_event":"unknown","destination":"punchout","result":{"id":null},"action_target":"call",)"
     R"("action_destination":"tel:1",)",
     "result_engagement"},
    {R"({"class":"ZRCardSectionEngagementFeedback","cardSection":{"class":"ZRCardSection"},
         "destination":{"class":"TAVPunchout"}})",
     R"("trigger_event":"unknown","card_type":"unknown","action_target":"unknown","action_destination":null,)",
     "card_engagement"},
    {R"({"class":"ZRCardSectionEngagementFeedback","destination":{"class":"ZRPunchout","urls":["a:","b:"]}})",
     R"("trigger_event":"unknown","card_type":"unknown","action_target":"unknown","action_destination":"a:",)",
     "card_engagement"},
    {R"({"class":"ZRSuggestionEngagementFeedback"})", R"("id":null,)", "suggestion_engagement"},
    {R"({"class":"ZRSectionEngagementFeedback"})", R"("id":null,"trigger_event":"unknown",)", "section_engagement"},
    {R"({"class":"ZRVisibleSectionHeaderFeedback"})", R"("section_id":null,"section_header_type":"unknown",)",
     "visible_section_header"},
    {R"({"class":"ZRVisibleSuggestionsFeedback","suggestions":[]})", R"("suggestions":[],)", "visible_suggestions"},
    {R"({"class":"ZRVisibleSuggestionsFeedback"})", R"("suggestions":null,)", "visible_suggestions"},
    {R"({"class":"ZRVisibleSuggestionsFeedback","suggestions":[{"class":"TAVSearchSuggestion"}]})",
     R"("suggestions":[{"id":null,"suggestion":null,"score":0,"suggestion_type":"unknown","fbr":null}],)"
     R"("suggestion_query":null,)",
     "visible_suggestions"},
    // Errors, custom records, and records without an event
    {R"({"class":"ZRErrorFeedback"})", R"("error":null,)", "error"},
    {R"({"class":"ZRErrorFeedback","error":{"domain":"","code":-1,"userInfo":{"reason":5}}})",
     R"("error":{"code":-1,"domain":null,"reason":null},)", "error"},
    {R"({"class":"ZRCustomFeedback","feedbackType":2,"jsonFeedback":[1]})", "", "custom_crowdsourcing"},
    {R"({"class":"ZRSectionRankingFeedback","localSectionPosition":4})",
     R"("local_section_position":4,"results":null,)", "unknown"},
    {R"({"class":"ZRResultRankingFeedback","localResultPosition":5})",
     R"("local_result_position":5,"hidden_results":[],"duplicate_results":[],)", "unknown"},
};

TEST(FeedbackJson, WhatIsMissingIsNullOrLeftOut)
{
    for (const Case& c : kCases) {
        EXPECT_EQ(eventFor(c.record), std::string("{") + c.fields + (c.hasQueryIds ? kIds : "") + R"("type":")" +
                                          c.type + R"(","timestamp":1500})")
            << c.record;
    }
}

TEST(FeedbackJson, AnEventsOwnKeysReplaceThoseOfACustomRecordWhereTheyStand)
{
    EXPECT_EQ(eventFor(R"({"class":"ZRCustomFeedback","jsonFeedback":{"timestamp":"t","type":8,"x":{"type":"mine"}}})"),
              R"({"timestamp":1500,"type":"custom_unknown","x":{"type":"mine"},"query_id":12,"client_query_id":3})");
}

TEST(FeedbackJson, IdsOfQueriesAreSignedAndTheClientsIsLeftOutIfItHasNone)
{
    TavrinFeedback event(std::make_shared<ZRFeedback>(), -1, "", "", UINT64_MAX);
    event.relTimestamp = UINT64_MAX;
    EXPECT_EQ(platform::toJson(event.dictionary()),
              R"({"query_id":-1,"client_query_id":18446744073709551615,"type":"unknown",)"
              R"("timestamp":18446744073709551615})");
    EXPECT_EQ(platform::toJson(TavrinFeedback().dictionary()), R"({"query_id":0,"type":"unknown","timestamp":0})");
}

TEST(FeedbackJson, DescriptionsTellTheRecordsOwnTime)
{
    TavrinFeedback event(feedbackFrom(R"({"class":"ZRDidGoToSiteFeedback","input":"a\nb"})"), 2, "", "");
    event.feedback->timestamp = 7'000'999'999;
    event.relTimestamp = 5;
    EXPECT_EQ(event.description(), R"({"input":"a\nb","query_id":2,"type":"did_go_to_site","timestamp":7000})");
}

TEST(HostTime, TicksBecomeWholeMilliseconds)
{
    struct {
        std::uint64_t ticks;
        HostTimebase timebase;
        std::uint64_t milliseconds;
    } const cases[] = {
        {0, {}, 0},
        {999'999, {}, 0},
        {1'000'000, {}, 1},
        {24'000'000, {125, 3}, 1000},
        {1'000'001, {1, 2}, 0},
        {1'000'000, {1, 0}, 0},
        {UINT64_MAX, {}, 18'446'744'073'709},
        {UINT64_MAX, {2, 1}, 18'446'744'073'709}, // 64 bits, whatever falls out of them
    };
    for (const auto& c : cases)
        EXPECT_EQ(mach_duration_to_milliseconds(c.ticks, c.timebase), c.milliseconds) << c.ticks;
}

} // namespace
} // namespace tavrin
