#include "tavrind/FeedbackClasses.h"

#include <regex>
#include <set>

#include <gtest/gtest.h>

#include "searchrecords/ZRRecords.h"
#include "tavrind/FeedbackJson.h"
#include "tavrind/FeedbackTypes.h"
#include "tests/records/FeedbackExamples.h"
#include "tests/records/RecordFilling.h"

namespace tavrin {
namespace {

/// Counts the keys in an event and the objects in it, which must be of the shared set.
int knownKeysIn(const Value& value)
{
    int keys = 0;
    if (const auto* elements = value.asArray())
        for (const Value& element : *elements) keys += knownKeysIn(element);
    if (const auto* object = value.asDictionary()) {
        for (const auto& [key, entry] : *object) {
            EXPECT_TRUE(sharedKeySet().contains(key)) << key;
            const bool isForeign = key == "headers" || key == "local_features" || key == "network_timing_data";
            keys += 1 + (isForeign ? 0 : knownKeysIn(entry));
        }
    }
    return keys;
}

TEST(FeedbackJson, EventsAreAsThePageShowsThem)
{
    static const std::regex kExample("```json\n([^`]*)\n```\n```json\n([^`]*)\n```|\n### (\\w+)");
    const std::string page = feedbackPage();
    std::set<std::string> shown;
    std::set<std::string> classes;
    std::string type;
    int keys = 0;
    for (std::sregex_iterator match(page.begin(), page.end(), kExample), end; match != end; ++match) {
        if ((*match)[3].matched) {
            type = (*match)[3];
            continue;
        }
        const std::string record = (*match)[1];
        const Value event = parsed((*match)[2].str());
        EXPECT_EQ(eventFor(record), platform::toJson(event)) << record;
        EXPECT_EQ(event["type"], Value(type));
        keys += type.starts_with("custom_") ? 0 : knownKeysIn(event);
        shown.insert(type);
        classes.insert(*parsed(record)["class"].asString());
    }
    EXPECT_EQ(shown.size(), eventTypes().size() - 1) << "all but visible_card";
    EXPECT_EQ(sharedKeySet().size(), 99u);
    EXPECT_GT(keys, 200);
    for (const auto& [name, make] : tavrindRecordClasses()) {
        const auto record = std::dynamic_pointer_cast<ZRFeedback>(make());
        const bool isPart = name == "ZRResultRankingFeedback" || name == "ZRSectionRankingFeedback";
        if (isPart) {
            EXPECT_EQ(TavrinFeedback(record, 1, "", "").type(), EventType::Unknown) << name;
        } else if (record) {
            EXPECT_TRUE(classes.contains(std::string(name))) << name << " has no example";
        }
    }
}

TEST(FeedbackJson, WhatIsMissingIsNullOrLeftOut)
{
    struct {
        const char* name;
        const char* given; ///< fields of the record
        const char* told;  ///< what its event begins with, up to the keys of every event
    } const cases[] = {
        {"ZRStartSearchFeedback", R"("triggerEvent":99)", R"("trigger_event":null,"input":null,"uuid":null,)"},
        {"ZRVisibleResultsFeedback", R"("triggerEvent":-1)", R"("trigger_event":null,"results":null,)"},
        {"ZRVisibleResultsFeedback", R"("results":[])", R"("trigger_event":"unknown","results":[],)"},
        {"ZRRankingFeedback", R"("sections":[{"class":"ZRSectionRankingFeedback"}])",
         R"("blending_duration":0,"sections":[{"local_section_position":0,"results":null}],)"},
        {"ZRLateSectionsAppendedFeedback", R"("sections":[{"class":"ZRResultSection"}])",
         R"("sections":[{"id":null,"score":0,"bundle_id":null,"results":null}],)"},
        {"ZRStartNetworkSearchFeedback", R"("headers":["Accept"])",
         R"("headers":null,"url":null,"endpoint_type":"unknown",)"},
        {"ZREndNetworkSearchFeedback", R"("networkTimingData":{"_kCFNTimingDataConnectionInterfaceIdentifier":""})",
         R"("uuid":null,"response_size":0,"status_code":0,"network_timing_data":[],"connection_reused":false,)"},
        {"ZREndNetworkSearchFeedback", R"("networkTimingData":"none")",
         R"("uuid":null,"response_size":0,"status_code":0,"network_timing_data":null,"connection_reused":false,)"},
        {"ZRResultsReceivedAfterTimeoutFeedback",
         R"("results":[{"class":"ZRSearchResult","resultBundleId":"r","applicationBundleIdentifier":"a",
                        "staticCorrection":true,"customProperties":{"class":"TAVCustomSearchResult"}},
                       {"class":"ZRSearchResult","isLocalApplicationResult":true,"type":1}])",
         R"("results":[{"id":null,"score":0,"result_type":"unknown","top_hit":"tophit_no","section_bundle_id":null,)"
         R"("bundle_id":"r","fbr":null,"static_correction":true},{"id":null,"score":0,"result_type":"tavrin",)"
         R"("top_hit":"tophit_no","section_bundle_id":null,"bundle_id":null,"fbr":null,"static_correction":false}],)"},
        {"ZRResultEngagementFeedback", R"("destination":1)",
         R"("trigger_event":"unknown","destination":"card","result":null,"action_destination":"non_tavrin_result",)"},
        {"ZRResultEngagementFeedback", R"("result":{"class":"ZRSearchResult","type":14,"title":{"class":"ZRText"}})",
         R"("trigger_event":"unknown","destination":"unknown","result":{"id":null,"third_party_suggestion":null},)"
         R"("action_destination":"non_tavrin_result",)"},
        {"ZRResultEngagementFeedback",
         R"("destination":1,"result":{"class":"ZRSearchResult","type":1,"title":{"class":"ZRText","text":"t"},
            "punchout":{"class":"ZRPunchout","urls":["https://a.example/"]}})",
         R"("trigger_event":"unknown","destination":"card","result":{"id":null},"action_destination":null,)"},
        {"ZRResultEngagementFeedback",
         R"("destination":2,"actionTarget":2,"result":{"class":"ZRSearchResult","type":1,"punchout":
            {"class":"ZRPunchout","urls":["https://a.example/"]}},"actionEngaged":{"class":"ZRActionItem",
            "punchout":{"class":"ZRPunchout","urls":["tel:1","https://b.example/"]}})",
         R"("trigger_event":"unknown","destination":"punchout","result":{"id":null},"action_target":"call",)"
         R"("action_destination":"tel:1",)"},
        {"ZRCardSectionEngagementFeedback",
         R"("cardSection":{"class":"ZRCardSection"},"destination":{"class":"TAVPunchout"})",
         R"("trigger_event":"unknown","card_type":"unknown","action_target":"unknown","action_destination":null,)"},
        {"ZRCardSectionEngagementFeedback", R"("destination":{"class":"ZRPunchout","urls":["a:","b:"]})",
         R"("trigger_event":"unknown","card_type":"unknown","action_target":"unknown","action_destination":"a:",)"},
        {"ZRSuggestionEngagementFeedback", R"("timestamp":1)", R"("id":null,)"},
        {"ZRSectionEngagementFeedback", R"("timestamp":1)", R"("id":null,"trigger_event":"unknown",)"},
        {"ZRVisibleSectionHeaderFeedback", R"("headerType":9)", R"("section_id":null,"section_header_type":null,)"},
        {"ZRVisibleSuggestionsFeedback", R"("suggestions":[])", R"("suggestions":[],)"},
        {"ZRVisibleSuggestionsFeedback", R"("timestamp":1)", R"("suggestions":null,)"},
        {"ZRVisibleSuggestionsFeedback", R"("suggestions":[{"class":"TAVSearchSuggestion"}])",
         R"("suggestions":[{"id":null,"suggestion":null,"score":0,"suggestion_type":"unknown","fbr":null}],)"
         R"("suggestion_query":null,)"},
        {"ZRErrorFeedback", R"("timestamp":1)", R"("error":null,)"},
        {"ZRErrorFeedback", R"("error":{"domain":"","code":-1,"userInfo":{"reason":5}})",
         R"("error":{"code":-1,"domain":null,"reason":null},)"},
        {"ZRCustomFeedback", R"("jsonFeedback":[1])", ""},
        {"ZRSectionRankingFeedback", R"("localSectionPosition":4)", R"("local_section_position":4,"results":null,)"},
        {"ZRResultRankingFeedback", R"("localResultPosition":5)",
         R"("local_result_position":5,"hidden_results":[],"duplicate_results":[],)"},
    };
    for (const auto& c : cases) {
        const std::string record = std::string(R"({"class":")") + c.name + R"(",)" + c.given + "}";
        const std::string event = eventFor(record);
        const bool hasIds = event.contains(R"("query_id")");
        EXPECT_EQ(event.substr(0, event.find(hasIds ? R"("query_id")" : R"("type":)")), std::string("{") + c.told)
            << record;
    }
}

TEST(FeedbackJson, AnEventsOwnKeysReplaceThoseOfACustomRecordWhereTheyStand)
{
    for (const std::string unheardOf : {"-1", "4"})
        EXPECT_EQ(
            eventFor(R"({"class":"ZRCustomFeedback","feedbackType":)" + unheardOf +
                     R"(,"jsonFeedback":{"timestamp":"t","type":8,"x":{"type":"mine"}}})"),
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
    event.feedback()->timestamp = 7'000'999'999;
    event.relTimestamp = 5;
    EXPECT_EQ(event.description(), R"({"input":"a\nb","query_id":2,"type":"did_go_to_site","timestamp":7000})");
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
    TavrinFeedback early(std::make_shared<ZRFeedback>(), 1, "", "");
    TavrinFeedback late(std::make_shared<ZRFeedback>(), 1, "", "");
    early.feedback()->timestamp = 5;
    late.feedback()->timestamp = UINT64_MAX;
    EXPECT_TRUE(TavrinFeedback::timeStampComparator(early, late) < 0);
    EXPECT_TRUE(TavrinFeedback::timeStampComparator(late, early) > 0);
    EXPECT_TRUE(TavrinFeedback::timeStampComparator(early, early) == 0);
    EXPECT_TRUE(TavrinFeedback::timeStampComparator(TavrinFeedback(), early) < 0);
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
