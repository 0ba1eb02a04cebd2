#pragma once

#include <cstdint>
#include <string_view>

#include "platform/values/ArchivedRecord.h"
#include "tavrind/FeedbackTypes.h"

namespace tavrin {

class JsonFields;
class SessionProcessingHelper;
struct ZRFeedback;

using ArchivedFeedback = platform::ArchivedRecord<ZRFeedback>;

/// What the daemon knows about a class of event records. FeedbackClasses.cpp lists all classes, one row each; nothing
/// else does. The functions accept only records of their class.
struct FeedbackClass {
    std::string_view name;
    /// Returns the type of the event that a record reports.
    EventType (*eventType)(const ZRFeedback& record);
    EventType (*archivedEventType)(const ArchivedFeedback& record);
    /// Returns the client's number of the query that a record refers to; 0 if it refers to none.
    std::uint64_t (*clientQueryId)(const ZRFeedback& record);
    /// Adds a record's own fields to its event.
    void (*addFields)(JsonFields& fields, const ArchivedFeedback& record);
    /// Assigns replacements to the identifiers of the results and suggestions that a record shows or refers to. Null if
    /// records of the class keep their identifiers.
    void (*process)(const ArchivedFeedback& record, SessionProcessingHelper& helper);
};

/// Return the row of a record's class, or the row of `ZRFeedback` for null and for a class without one. Any thread.
[[nodiscard]] const FeedbackClass& feedbackClassOf(const ZRFeedback& record);
[[nodiscard]] const FeedbackClass& feedbackClassOf(const ArchivedFeedback& record);

} // namespace tavrin
