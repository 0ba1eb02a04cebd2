#pragma once

#include <cstdint>
#include <string_view>

#include "tavrind/FeedbackTypes.h"

namespace tavrin {

class JsonFields;
class SessionProcessingHelper;
struct ZRFeedback;

/// What the daemon knows about a class of event records. FeedbackClasses.cpp lists all classes, one row each; nothing
/// else does. The functions accept only records of their class.
struct FeedbackClass {
    std::string_view name;
    /// Returns the type of the event that a record reports.
    EventType (*eventType)(const ZRFeedback& record);
    /// Returns the client's number of the query that a record refers to; 0 if it refers to none.
    std::uint64_t (*clientQueryId)(const ZRFeedback& record);
    /// Adds a record's own fields to its event.
    void (*addFields)(JsonFields& fields, const ZRFeedback& record);
    /// Replaces the identifiers of the results and suggestions that a record shows or refers to.
    ///
    /// Call it once for a record: a second call would replace the replacements. A result that the helper keeps as
    /// missing is shared with the record.
    void (*process)(ZRFeedback& record, SessionProcessingHelper& helper);
};

/// Returns the row of a record's class, or the row of `ZRFeedback` for a class without one. Any thread.
[[nodiscard]] const FeedbackClass& feedbackClassOf(const ZRFeedback& record);

} // namespace tavrin
