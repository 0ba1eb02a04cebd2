#pragma once

#include <cstdint>
#include <string>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

namespace platform {
struct Error;
}

namespace tavrin {

enum class EventType : std::int64_t;
enum class ResultEngagementDestination : std::int64_t;
struct ZRActionItem;
struct ZRFeedback;
struct ZRSearchResult;

// The form in which records are uploaded. docs/feedback.md shows one event of each type.

/// What a record says of itself, for an event of its `type` (which is `eventType(record)`); empty for a plain record.
[[nodiscard]] platform::Dictionary feedbackDictionary(const ZRFeedback& record, EventType type);

/// An error by its code, its domain and its reason.
[[nodiscard]] platform::Dictionary encodeErrorForJSON(const platform::Error& error);

/// The URL that the engagement of a result opened, or null. An engaged action leads where its punchout says; the result
/// itself leads to its own where `destination` says that it was left for it.
[[nodiscard]] const std::string* actionDestinationFromResult(const ZRSearchResult& result,
                                                             const ZRActionItem* actionEngaged,
                                                             ResultEngagementDestination destination);

} // namespace tavrin
