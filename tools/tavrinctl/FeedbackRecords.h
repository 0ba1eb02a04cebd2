#pragma once

#include <cstdint>
#include <expected>
#include <memory>
#include <string>
#include <vector>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"
#include "searchrecords/ZRFeedback.h"

/// Feedback records that somebody wrote as JSON.
namespace tavrin::ctl {

struct ReportedEvent {
    std::int64_t queryId = 0; ///< the daemon's query that the event belongs to; 0 is none
    std::shared_ptr<ZRFeedback> feedback;
};

/// One record, {"class": "ZR…Feedback", fields…}, or an array of them. "queryId" beside the fields is the event's; a
/// record that has a field of that name gets it, too. Otherwise all that is wrong: each line says where.
[[nodiscard]] std::expected<std::vector<ReportedEvent>, std::vector<std::string>> eventsIn(const platform::Value& json);

/// What a client may report: {class: [fields]}, by class.
[[nodiscard]] platform::Dictionary reportableRecords();

} // namespace tavrin::ctl
