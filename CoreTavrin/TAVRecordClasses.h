#pragma once

#include "platform/values/Record.h"

namespace tavrin {

/// Returns the classes of feedback: the events, and the records that are their parts. Any thread.
[[nodiscard]] const platform::RecordClasses& feedbackRecordClasses();
/// Returns the classes of all records that may cross IPC: feedback, requests, replies and the bag. Any thread.
[[nodiscard]] const platform::RecordClasses& coreRecordClasses();

} // namespace tavrin
