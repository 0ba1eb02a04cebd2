#pragma once

#include <memory>

#include "platform/values/Record.h"

namespace platform {

/// Encodes a record as a dictionary with its class under "class", the form that crosses IPC as a{sv}. Null fields are
/// left out. Any thread, like all of these.
[[nodiscard]] Value toValue(const Record& record);
/// Decodes such a dictionary. A date may be a number: seconds since 1970, as in IPC messages. Records may nest
/// `kMaximumDepth` deep, here and in archives, and so may each field of type Value.
[[nodiscard]] Result<std::shared_ptr<Record>> recordFromValue(const Value& value, const RecordClasses& classes);

} // namespace platform
