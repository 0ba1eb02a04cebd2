#pragma once

#include <compare>
#include <cstdint>
#include <memory>
#include <string>

#include "platform/values/Dictionary.h"
#include "searchrecords/ZRFeedback.h"

namespace tavrin {

class SessionProcessingHelper;
enum class EventType : std::int64_t;

/// Nanoseconds that make a tick of the host's clock, as a fraction.
struct HostTimebase {
    std::uint32_t numerator = 1;
    std::uint32_t denominator = 1;
};
/// A distance of host ticks as whole milliseconds, the rest dropped. 0 for a timebase without a denominator.
[[nodiscard]] std::uint64_t mach_duration_to_milliseconds(std::uint64_t duration, HostTimebase timebase = {});

/// One event as the daemon keeps it: the record, and who sent it, for which query, and when. It is what session files
/// hold. Plain data: its holder sees to it that one thread at a time writes it.
struct TavrinFeedback : platform::RecordOf<TavrinFeedback> {
    static constexpr std::string_view kClass = "TavrinFeedback";

    /// The client's record, or one of the daemon's own. Null only where an archive lacks it.
    std::shared_ptr<ZRFeedback> feedback;
    std::int64_t queryId = 0;       ///< the daemon's query that the event belongs to
    std::uint64_t relTimestamp = 0; ///< milliseconds after the first event; set as the session hands its events out
    std::string userGuid;           ///< in force when the event was recorded; empty before the session fills it in
    std::string userAgent;          ///< the client's
    /// The call that reported the event, answered when the last copy of this goes; null for most. Not stored.
    std::shared_ptr<void> call;
    std::uint64_t clientQueryId = 0; ///< the client's own query id; 0 is none

    TavrinFeedback() = default;
    TavrinFeedback(std::shared_ptr<ZRFeedback> feedback_, std::int64_t queryId_, std::string userGuid_,
                   std::string userAgent_, std::uint64_t clientQueryId_ = 0);

    /// The event that the record reports; unknown without a record.
    [[nodiscard]] EventType type() const;
    /// The record's own timestamp, in host ticks; 0 without a record.
    [[nodiscard]] std::uint64_t timestamp() const { return feedback ? feedback->timestamp : 0; }

    /// Orders events by their records' timestamps, oldest first.
    [[nodiscard]] static std::strong_ordering timeStampComparator(const TavrinFeedback& a, const TavrinFeedback& b)
    {
        return a.timestamp() <=> b.timestamp();
    }

    /// The event as it is uploaded; docs/feedback.md shows one of each type. Values are shared with the record where
    /// they are of its own making (headers, features, ready-made JSON).
    [[nodiscard]] platform::Dictionary dictionary() const;
    /// The event as one line of JSON for logs and listeners, its "timestamp" the record's own, in milliseconds of the
    /// host's clock.
    [[nodiscard]] std::string description() const;
    /// Makes the event fit to leave the device, once: see `tavrin::process`.
    void process(SessionProcessingHelper& helper);

    static constexpr auto fields()
    {
        using Self = TavrinFeedback;
        return std::tuple{
            platform::field("feedback", &Self::feedback),      platform::field("query_id", &Self::queryId),
            platform::field("timestamp", &Self::relTimestamp), platform::field("user_guid", &Self::userGuid),
            platform::field("user_agent", &Self::userAgent),   platform::field("_clientQueryId", &Self::clientQueryId)};
    }
    /// As for any record, but whatever is in "feedback" that is no event's record reads as null.
    bool decodeField(std::string_view key, platform::Decoder& decoder, std::size_t& next) override;

private:
    /// All of `dictionary()` but the timestamp, which comes last.
    [[nodiscard]] platform::Dictionary _commonDictionary() const;
};

/// Every record that a session file may hold: the daemon's own and those that cross IPC. Clients can't send the
/// daemon's own. Any thread.
[[nodiscard]] const platform::RecordClasses& tavrindRecordClasses();

} // namespace tavrin
