#pragma once

#include <cstdint>
#include <expected>
#include <memory>
#include <string>
#include <vector>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"
#include "searchrecords/ZRFeedback.h"

/// Parses feedback records that a user wrote as JSON.
namespace tavrin::ctl {

struct ReportedEvent {
    std::int64_t queryId = 0; ///< the daemon's query that the event belongs to; 0 for none
    std::shared_ptr<ZRFeedback> feedback;
};

/// Parses one record, {"class": "ZR…Feedback", fields…}, or an array of them. "queryId" is the event's query id, and
/// also sets the record's field of that name if there is one. The error lists every problem with its place, a line
/// each.
[[nodiscard]] std::expected<std::vector<ReportedEvent>, std::vector<std::string>> eventsIn(const platform::Value& json);

/// The records that a client may report, each as {class: {field: type in words}}.
struct ReportableRecords {
    platform::Dictionary events;
    platform::Dictionary parts; ///< of events
};
[[nodiscard]] ReportableRecords reportableRecords();

} // namespace tavrin::ctl
