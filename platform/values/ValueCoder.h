#pragma once

#include <memory>

#include "platform/values/Record.h"

namespace platform {

/// A record as a dictionary with its class under "class": the form that crosses IPC as a{sv}. Null fields are left out.
[[nodiscard]] Value toValue(const Record& record);
/// The record in such a dictionary. A date may be a number, seconds since 1970, as IPC messages have them. Records may
/// nest `kMaximumDepth` deep, here and in archives; so may a field of type Value in itself.
[[nodiscard]] Result<std::shared_ptr<Record>> recordFromValue(const Value& value, const RecordClasses& classes);

} // namespace platform
