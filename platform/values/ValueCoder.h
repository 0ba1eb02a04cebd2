#pragma once

#include <memory>

#include "platform/values/Record.h"

namespace platform {

/// Encodes a record as a dictionary with its class name under "class": the form that IPC sends as a{sv}. Null fields
/// are left out. Any thread.
[[nodiscard]] Value toValue(const Record& record);
/// Decodes a dictionary of that form. A date may be a number (seconds since 1970), as in IPC messages. Returns an error
/// of domain "Format" for an unknown class, a field of the wrong type, or records nested deeper than `kMaximumDepth`. A
/// field of type Value may nest as deep again. Any thread.
[[nodiscard]] Result<std::shared_ptr<Record>> recordFromValue(const Value& value, const RecordClasses& classes);

} // namespace platform
