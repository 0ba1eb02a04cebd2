#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string_view>
#include <vector>

#include "searchrecords/ZRFeedback.h"
#include "searchrecords/ZRSearchResult.h"

/// The daemon's own events: what happened to a session, and what it lacks.
namespace tavrin {

/// Why a session ended; the value of a session's "previous_session_end_reason".
enum class SessionEndReason : std::int64_t {
    NoPreviousSession, ///< none ended yet
    ExternalRequest,
    SessionIdle,
    MaxSessionTime,
    GuidChanged,
    CriticalMemory,
    EngagementReceived,
};

/// A session ended.
struct TavrinSessionEndFeedback : platform::RecordOf<TavrinSessionEndFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "TavrinSessionEndFeedback";
    SessionEndReason reason = SessionEndReason::NoPreviousSession;

    TavrinSessionEndFeedback() = default;
    explicit TavrinSessionEndFeedback(SessionEndReason reason_) : reason(reason_) {}

    /// The names of the reasons, by value.
    [[nodiscard]] static std::span<const std::string_view> eventTypes();
    /// A reason's name; that of the first for a number that is none, as a damaged session file may hold.
    [[nodiscard]] static std::string_view triggerEventEnumToString(SessionEndReason reason);

    static constexpr auto fields() { return std::tuple{platform::field("reason", &TavrinSessionEndFeedback::reason)}; }
};

/// Results that events of the session refer to and none showed. Nobody changes `results` once it is made.
struct TavrinSessionMissingResults : platform::RecordOf<TavrinSessionMissingResults, ZRFeedback> {
    static constexpr std::string_view kClass = "TavrinSessionMissingResults";
    std::vector<std::shared_ptr<ZRSearchResult>> results;

    TavrinSessionMissingResults() = default;
    explicit TavrinSessionMissingResults(std::vector<std::shared_ptr<ZRSearchResult>> missingResults)
        : results(std::move(missingResults))
    {}

    static constexpr auto fields()
    {
        return std::tuple{platform::field("results", &TavrinSessionMissingResults::results)};
    }
};

/// The same for suggestions.
struct TavrinSessionMissingSuggestions : platform::RecordOf<TavrinSessionMissingSuggestions, ZRFeedback> {
    static constexpr std::string_view kClass = "TavrinSessionMissingSuggestions";
    std::vector<std::shared_ptr<ZRSearchSuggestion>> suggestions;

    TavrinSessionMissingSuggestions() = default;
    explicit TavrinSessionMissingSuggestions(std::vector<std::shared_ptr<ZRSearchSuggestion>> missingSuggestions)
        : suggestions(std::move(missingSuggestions))
    {}

    static constexpr auto fields()
    {
        return std::tuple{platform::field("suggestions", &TavrinSessionMissingSuggestions::suggestions)};
    }
};

/// A client's connection ended while the session it shares went on.
struct TavrinConnectionInvalidated : platform::RecordOf<TavrinConnectionInvalidated, ZRFeedback> {
    static constexpr std::string_view kClass = "TavrinConnectionInvalidated";
    static constexpr auto fields() { return std::tuple<>{}; }
};

} // namespace tavrin
