#include "tavrind/FeedbackTypes.h"

#include <algorithm>
#include <array>
#include <utility>

#include "CoreTavrin/TAVFeedback.h"
#include "searchrecords/ZRRecords.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

namespace {

constexpr std::array<std::string_view, 33> kEventTypes{
    "visible_results",
    "network_search_start",
    "network_search_end",
    "local_search_start",
    "local_search_end",
    "search_view_appear",
    "search_view_disappear",
    "rank_sections",
    "result_engagement",
    "visible_card", // reported by nothing; it holds the place of an old event
    "card_engagement",
    "error",
    "suggestion_engagement",
    "card_view_disappear",
    "search_start",
    "search_end",
    "visible_suggestions",
    "custom_unknown",
    "custom_crowdsourcing",
    "custom_wendral_autofill",
    "custom_vistrel_result_features",
    "unknown",
    "results_received_after_timeout",
    "late_sections_appended",
    "clear_input",
    "session_end",
    "skip_tavrin_search",
    "section_engagement",
    "visible_section_header",
    "session_missing_results",
    "session_missing_suggestions",
    "did_go_to_site",
    "connection_invalidated",
};

/// By the custom record's feedback type. Autofill and crowdsourcing stand crosswise to the event types.
constexpr std::array kCustomTypes{EventType::CustomUnknown, EventType::CustomWendralAutofill,
                                  EventType::CustomCrowdsourcing, EventType::CustomVistrelResultFeatures};

using enum EventType;

constexpr std::pair<std::string_view, EventType> kClassTypes[] = {
    {ZRVisibleResultsFeedback::kClass, VisibleResults},
    {ZRStartNetworkSearchFeedback::kClass, NetworkSearchStart},
    {TAVLookupStartNetworkSearchFeedback::kClass, NetworkSearchStart},
    {ZREndNetworkSearchFeedback::kClass, NetworkSearchEnd},
    {TAVEndNetworkSearchFeedback::kClass, NetworkSearchEnd},
    {ZRStartLocalSearchFeedback::kClass, LocalSearchStart},
    {ZREndLocalSearchFeedback::kClass, LocalSearchEnd},
    {ZRSearchViewAppearFeedback::kClass, SearchViewAppear},
    {ZRSearchViewDisappearFeedback::kClass, SearchViewDisappear},
    {ZRRankingFeedback::kClass, RankSections},
    {TAVRankerFeedback::kClass, RankSections},
    {ZRResultEngagementFeedback::kClass, ResultEngagement},
    {ZRCardSectionEngagementFeedback::kClass, CardEngagement},
    {ZRMapsCardSectionEngagementFeedback::kClass, CardEngagement},
    {ZRStoreCardSectionEngagementFeedback::kClass, CardEngagement},
    {ZRErrorFeedback::kClass, EventType::Error},
    {ZRSuggestionEngagementFeedback::kClass, SuggestionEngagement},
    {ZRCardViewDisappearFeedback::kClass, CardViewDisappear},
    {ZRStartSearchFeedback::kClass, SearchStart},
    {ZREndSearchFeedback::kClass, SearchEnd},
    {ZRVisibleSuggestionsFeedback::kClass, VisibleSuggestions},
    {ZRResultsReceivedAfterTimeoutFeedback::kClass, ResultsReceivedAfterTimeout},
    {ZRLateSectionsAppendedFeedback::kClass, LateSectionsAppended},
    {ZRClearInputFeedback::kClass, ClearInput},
    {TavrinSessionEndFeedback::kClass, SessionEnd},
    {TAVSkipSearchFeedback::kClass, SkipTavrinSearch},
    {ZRSectionEngagementFeedback::kClass, SectionEngagement},
    {ZRVisibleSectionHeaderFeedback::kClass, VisibleSectionHeader},
    {TavrinSessionMissingResults::kClass, SessionMissingResults},
    {TavrinSessionMissingSuggestions::kClass, SessionMissingSuggestions},
    {ZRDidGoToSiteFeedback::kClass, DidGoToSite},
    {TavrinConnectionInvalidated::kClass, ConnectionInvalidated},
};

} // namespace

std::span<const std::string_view> eventTypes()
{
    return kEventTypes;
}

const std::unordered_set<std::string_view>& sharedKeySet()
{
    static const auto keys = [] {
        std::unordered_set<std::string_view> all{"type",
                                                 "id",
                                                 "name",
                                                 "query_id",
                                                 "client_query_id",
                                                 "timestamp",
                                                 "input",
                                                 "reason",
                                                 "trigger_event",
                                                 "headers",
                                                 "url",
                                                 "provider",
                                                 "response_size",
                                                 "status_code",
                                                 "network_timing_data",
                                                 "connection_reused",
                                                 "interface",
                                                 "peer_address",
                                                 "uuid",
                                                 "sections",
                                                 "results",
                                                 "result",
                                                 "ranking_score",
                                                 "top_hit",
                                                 "endpoint_type",
                                                 "blending_duration",
                                                 "local_section_position",
                                                 "local_result_position",
                                                 "fbr",
                                                 "hidden_results",
                                                 "duplicate_results",
                                                 "action_destination",
                                                 "code",
                                                 "domain",
                                                 "underlying_error",
                                                 "card_type",
                                                 "destination",
                                                 "bundle_id",
                                                 "action_target",
                                                 "suggestions",
                                                 "query",
                                                 "suggestion",
                                                 "score",
                                                 "index_type",
                                                 "on_lock_screen",
                                                 "is_over_app",
                                                 "section_bundle_id",
                                                 "tavrin_status",
                                                 "tavrin_duration",
                                                 "tavrin_partial_client_ip",
                                                 "corrected_query",
                                                 "static_correction",
                                                 "section_header_type",
                                                 "fbq",
                                                 "section_id",
                                                 "result_type",
                                                 "suggestion_type",
                                                 "suggestion_query",
                                                 "third_party_suggestion",
                                                 "ranker_did_rank",
                                                 "ranker_timeout",
                                                 "ranker_duration",
                                                 "ranker_results",
                                                 "publicly_indexable",
                                                 "local_features",
                                                 "tavrin"};
        all.insert(std::begin(kEventTypes), std::end(kEventTypes));
        return all;
    }();
    return keys;
}

std::string_view eventTypeToString(EventType type)
{
    return kEventTypes[static_cast<std::size_t>(type)];
}

EventType eventType(const ZRFeedback& record)
{
    const std::string_view className = record.className();
    if (className == ZRCustomFeedback::kClass) {
        const auto type = static_cast<std::uint64_t>(static_cast<const ZRCustomFeedback&>(record).feedbackType);
        return type < kCustomTypes.size() ? kCustomTypes[type] : CustomUnknown;
    }
    const auto* found = std::ranges::find(kClassTypes, className, &std::pair<std::string_view, EventType>::first);
    return found == std::end(kClassTypes) ? EventType::Unknown : found->second;
}

bool requiresQueryId(EventType type)
{
    switch (type) {
    case NetworkSearchEnd:
    case LocalSearchEnd:
    case CustomVistrelResultFeatures:
    case SessionEnd:
    case SessionMissingResults:
    case SessionMissingSuggestions:
    case ConnectionInvalidated: return false;
    default: return true;
    }
}

bool requiresQueryId(const ZRFeedback& record)
{
    return requiresQueryId(eventType(record));
}

} // namespace tavrin
