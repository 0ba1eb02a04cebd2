#pragma once

#include <cstdint>
#include <span>
#include <string_view>
#include <unordered_set>

#include "searchrecords/ZREnums.h"

namespace tavrin {

/// The types of events in an upload. Values and texts are part of the format. No record reports `VisibleCard`; it only
/// keeps the values of later types.
enum class EventType : std::int64_t {
    VisibleResults,
    NetworkSearchStart,
    NetworkSearchEnd,
    LocalSearchStart,
    LocalSearchEnd,
    SearchViewAppear,
    SearchViewDisappear,
    RankSections,
    ResultEngagement,
    VisibleCard,
    CardEngagement,
    Error,
    SuggestionEngagement,
    CardViewDisappear,
    SearchStart,
    SearchEnd,
    VisibleSuggestions,
    CustomUnknown,
    CustomCrowdsourcing,
    CustomWendralAutofill,
    CustomVistrelResultFeatures,
    Unknown,
    ResultsReceivedAfterTimeout,
    LateSectionsAppended,
    ClearInput,
    SessionEnd,
    SkipTavrinSearch,
    SectionEngagement,
    VisibleSectionHeader,
    SessionMissingResults,
    SessionMissingSuggestions,
    DidGoToSite,
    ConnectionInvalidated,
};

template <>
inline constexpr auto kTexts<EventType> =
    texts("visible_results", "network_search_start", "network_search_end", "local_search_start", "local_search_end",
          "search_view_appear", "search_view_disappear", "rank_sections", "result_engagement", "visible_card",
          "card_engagement", "error", "suggestion_engagement", "card_view_disappear", "search_start", "search_end",
          "visible_suggestions", "custom_unknown", "custom_crowdsourcing", "custom_wendral_autofill",
          "custom_vistrel_result_features", "unknown", "results_received_after_timeout", "late_sections_appended",
          "clear_input", "session_end", "skip_tavrin_search", "section_engagement", "visible_section_header",
          "session_missing_results", "session_missing_suggestions", "did_go_to_site", "connection_invalidated");

/// Returns the texts of the event types, by value.
[[nodiscard]] constexpr std::span<const std::string_view> eventTypes()
{
    return kTexts<EventType>;
}
/// Returns the text of a type, which must be an enumerator.
[[nodiscard]] std::string_view eventTypeToString(EventType type);

/// Returns the keys that the daemon writes into events and the objects in them. A client's own JSON, headers, features
/// and timing data use other keys.
[[nodiscard]] const std::unordered_set<std::string_view>& sharedKeySet();

/// Returns whether events of a type are uploaded with their query ids.
[[nodiscard]] bool requiresQueryId(EventType type);

} // namespace tavrin
