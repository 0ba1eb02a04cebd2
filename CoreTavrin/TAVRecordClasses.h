#pragma once

#include "platform/values/Record.h"

namespace tavrin {

/// Every record that may cross IPC: the search records and those of this layer. Any thread.
[[nodiscard]] const platform::RecordClasses& coreRecordClasses();

} // namespace tavrin
