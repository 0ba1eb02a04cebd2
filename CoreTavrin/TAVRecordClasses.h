#pragma once

#include "platform/values/Record.h"

namespace tavrin {

/// Returns the classes of all records that may cross IPC: the search records and those of this layer. Any thread.
[[nodiscard]] const platform::RecordClasses& coreRecordClasses();

} // namespace tavrin
