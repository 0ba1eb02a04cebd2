#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "searchrecords/ZRFeedback.h"
#include "searchrecords/ZRSearchResult.h"
#include "tavrind/FeedbackEnumerations.h"

/// The daemon's own events: what happened to a session, and which results and suggestions it lacks.
namespace tavrin {

/// Why a session ended; the value of a session's "previous_session_end_reason".
enum class SessionEndReason : std::int64_t {
    NoPreviousSession, ///< no session has ended yet
    ExternalRequest,
    SessionIdle,
    MaxSessionTime,
    GuidChanged,
    CriticalMemory,
    EngagementReceived,
};
template <>
inline constexpr auto kTexts<SessionEndReason> =
    texts("no previous session", "external request", "session idle", "max session time passed", "guid changed",
          "critical memory", "engagement received");

/// A session ended.
struct TavrinSessionEndFeedback : platform::RecordOf<TavrinSessionEndFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "TavrinSessionEndFeedback";
    SessionEndReason reason = SessionEndReason::NoPreviousSession;

    TavrinSessionEndFeedback() = default;
    explicit TavrinSessionEndFeedback(SessionEndReason reason_) : reason(reason_) {}

    /// Returns the texts of the reasons, by value.
    [[nodiscard]] static constexpr std::span<const std::string_view> eventTypes() { return kTexts<SessionEndReason>; }
    /// Returns the text of a reason; nothing for a number without one, which a damaged session file may hold.
    [[nodiscard]] static std::optional<std::string_view> triggerEventEnumToString(SessionEndReason reason)
    {
        return enumToString(reason);
    }

    static constexpr auto fields() { return std::tuple{platform::field("reason", &TavrinSessionEndFeedback::reason)}; }
};

/// Results that events of the session refer to but none shows. `results` does not change after construction.
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

/// Suggestions that events of the session refer to but none shows.
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

/// A client's connection ended; the shared session continues.
struct TavrinConnectionInvalidated : platform::RecordOf<TavrinConnectionInvalidated, ZRFeedback> {
    static constexpr std::string_view kClass = "TavrinConnectionInvalidated";
    static constexpr auto fields() { return std::tuple<>{}; }
};

} // namespace tavrin
