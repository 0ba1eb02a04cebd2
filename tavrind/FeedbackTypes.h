#pragma once

#include <cstdint>
#include <span>
#include <string_view>
#include <unordered_set>

namespace tavrin {

struct ZRFeedback;

/// The kinds of events in an upload. Values are positions in `eventTypes()`, and format like these names.
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

/// The names of the event types, by value.
[[nodiscard]] std::span<const std::string_view> eventTypes();
[[nodiscard]] std::string_view eventTypeToString(EventType type);

/// The keys that the daemon makes events of, and the objects in them. A client's own JSON, headers, features and timing
/// data have others.
[[nodiscard]] const std::unordered_set<std::string_view>& sharedKeySet();

/// The event that a record reports: that of its class, which is listed for every class. A custom record's follows from
/// its feedback type.
[[nodiscard]] EventType eventType(const ZRFeedback& record);

/// Whether events of a type, or of that record's, are uploaded with their query ids.
[[nodiscard]] bool requiresQueryId(EventType type);
[[nodiscard]] bool requiresQueryId(const ZRFeedback& record);

} // namespace tavrin
