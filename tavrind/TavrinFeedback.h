#pragma once

#include <compare>
#include <cstdint>
#include <memory>
#include <string>

#include "platform/values/ArchivedRecord.h"
#include "searchrecords/ZRFeedback.h"

namespace tavrin {

class SessionProcessingHelper;
struct FeedbackClass;
enum class EventType : std::int64_t;

/// The length of a tick of the host's clock in nanoseconds, as a fraction.
struct HostTimebase {
    std::uint32_t numerator = 1;
    std::uint32_t denominator = 1;
};
/// Converts a duration in host ticks to whole milliseconds, rounding down. Returns 0 if the denominator is 0.
[[nodiscard]] std::uint64_t mach_duration_to_milliseconds(std::uint64_t duration, HostTimebase timebase = {});

/// One event in the form of session files: a record with its sender, query and time. Only one thread at a time may
/// write the fields.
struct TavrinFeedback : platform::RecordOf<TavrinFeedback> {
    static constexpr std::string_view kClass = "TavrinFeedback";

    std::int64_t queryId = 0;        ///< the daemon's query that the event belongs to
    std::uint64_t relTimestamp = 0;  ///< milliseconds since the session's first event; set before the upload
    std::string userGuid;            ///< current when the event was recorded; empty until the session manager sets it
    std::string userAgent;           ///< of the client
    std::uint64_t clientQueryId = 0; ///< the client's own query id; 0 for none

    TavrinFeedback();
    TavrinFeedback(std::shared_ptr<ZRFeedback> feedback_, std::int64_t queryId_, std::string userGuid_,
                   std::string userAgent_, std::uint64_t clientQueryId_ = 0);

    /// Returns the record of the client or the daemon. Null only if an archive lacks it.
    [[nodiscard]] const std::shared_ptr<ZRFeedback>& feedback() const { return _feedback; }
    /// Returns the type of the event; `Unknown` without a record.
    [[nodiscard]] EventType type() const;
    /// Returns the record's timestamp, in host ticks; 0 without a record.
    [[nodiscard]] std::uint64_t timestamp() const { return _feedback ? _feedback->timestamp : 0; }

    /// Orders events by their records' timestamps, oldest first.
    [[nodiscard]] static std::strong_ordering timeStampComparator(const TavrinFeedback& a, const TavrinFeedback& b)
    {
        return a.timestamp() <=> b.timestamp();
    }

    /// Returns the event in its uploaded form, a dictionary; docs/feedback.md shows one of each type.
    [[nodiscard]] platform::Value dictionary() const;
    /// Returns the event as one line of JSON for logs and listeners. Its "timestamp" is that of the record, in
    /// milliseconds of the host's clock.
    [[nodiscard]] std::string description() const;

    /// An event in a session file.
    using Archived = platform::ArchivedRecord<TavrinFeedback>;
    /// Assigns replacements to the identifiers in an event before it leaves the device.
    static void process(const Archived& event, SessionProcessingHelper& helper);
    /// Writes an event in its uploaded form. With `identifiers`, which has processed it, those are replaced.
    static void write(platform::JsonSink& sink, const Archived& event, std::uint64_t timestamp,
                      const SessionProcessingHelper* identifiers = nullptr);

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
    /// Writes this event by way of its archive.
    void _writeTo(platform::JsonSink& sink, std::uint64_t timestamp) const;
    /// Returns the record, or an empty one.
    [[nodiscard]] const ZRFeedback& _record() const;
    void _setFeedback(std::shared_ptr<ZRFeedback> feedback);

    std::shared_ptr<ZRFeedback> _feedback;
    const FeedbackClass* _class; ///< of the record, looked up once
};

/// Returns the classes of all records that a session file may hold: those that cross IPC, and the daemon's own, which
/// clients can't send. Any thread.
[[nodiscard]] const platform::RecordClasses& tavrindRecordClasses();

} // namespace tavrin
