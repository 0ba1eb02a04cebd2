#pragma once

#include <compare>
#include <cstdint>
#include <memory>
#include <string>

#include "platform/values/Dictionary.h"
#include "searchrecords/ZRFeedback.h"

namespace tavrin {

class SessionProcessingHelper;
struct FeedbackClass;
enum class EventType : std::int64_t;

/// Nanoseconds that make a tick of the host's clock, as a fraction.
struct HostTimebase {
    std::uint32_t numerator = 1;
    std::uint32_t denominator = 1;
};
/// Converts a duration in host ticks to whole milliseconds, rounding down. Returns 0 if the denominator is 0.
[[nodiscard]] std::uint64_t mach_duration_to_milliseconds(std::uint64_t duration, HostTimebase timebase = {});

/// One event as session files hold it: a record, who sent it, for which query, and when. The fields may be written by
/// one thread at a time.
struct TavrinFeedback : platform::RecordOf<TavrinFeedback> {
    static constexpr std::string_view kClass = "TavrinFeedback";

    std::int64_t queryId = 0;        ///< the daemon's query that the event belongs to
    std::uint64_t relTimestamp = 0;  ///< milliseconds since the session's first event; set on the way out
    std::string userGuid;            ///< in force when the event was recorded; empty before the session sets it
    std::string userAgent;           ///< of the client
    std::uint64_t clientQueryId = 0; ///< the client's own query id; 0 for none

    TavrinFeedback();
    TavrinFeedback(std::shared_ptr<ZRFeedback> feedback_, std::int64_t queryId_, std::string userGuid_,
                   std::string userAgent_, std::uint64_t clientQueryId_ = 0);

    /// The client's record, or one of the daemon's own. Null only if an archive lacks it.
    [[nodiscard]] const std::shared_ptr<ZRFeedback>& feedback() const { return _feedback; }
    /// The event that the record reports; unknown without a record.
    [[nodiscard]] EventType type() const;
    /// The record's own timestamp, in host ticks; 0 without a record.
    [[nodiscard]] std::uint64_t timestamp() const { return _feedback ? _feedback->timestamp : 0; }

    /// Orders events by their records' timestamps, oldest first.
    [[nodiscard]] static std::strong_ordering timeStampComparator(const TavrinFeedback& a, const TavrinFeedback& b)
    {
        return a.timestamp() <=> b.timestamp();
    }

    /// The event as it is uploaded; docs/feedback.md shows one of each type. Headers, features and ready-made JSON are
    /// shared with the record.
    [[nodiscard]] platform::Dictionary dictionary() const;
    /// The event as one line of JSON for logs and listeners. Its "timestamp" is the record's own, in milliseconds of
    /// the host's clock.
    [[nodiscard]] std::string description() const;
    /// Replaces the identifiers in the record before it leaves the device. Call it once: see `FeedbackClass::process`.
    void process(SessionProcessingHelper& helper);

    static constexpr auto fields()
    {
        using Self = TavrinFeedback;
        return std::tuple{
            platform::field("feedback", &Self::_feedback),     platform::field("query_id", &Self::queryId),
            platform::field("timestamp", &Self::relTimestamp), platform::field("user_guid", &Self::userGuid),
            platform::field("user_agent", &Self::userAgent),   platform::field("_clientQueryId", &Self::clientQueryId)};
    }
    /// Reads "feedback" as null if it holds anything but an event's record.
    bool decodeField(std::string_view key, platform::Decoder& decoder, std::size_t& next) override;

private:
    /// All of `dictionary()` but the timestamp, which comes last.
    [[nodiscard]] platform::Dictionary _commonDictionary() const;
    /// The record, or an empty one.
    [[nodiscard]] const ZRFeedback& _record() const;
    void _setFeedback(std::shared_ptr<ZRFeedback> feedback);

    std::shared_ptr<ZRFeedback> _feedback;
    const FeedbackClass* _class; ///< of the record, looked up once
};

/// Every record that a session file may hold: the daemon's own and those that cross IPC. Clients can't send the
/// daemon's own. Any thread.
[[nodiscard]] const platform::RecordClasses& tavrindRecordClasses();

} // namespace tavrin
