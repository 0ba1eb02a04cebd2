#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/values/Record.h"

namespace platform {

/// Encodes a record as a MessagePack archive, the form that is stored. Null fields are left out. Any thread, like all
/// of these.
[[nodiscard]] std::string archive(const Record& record);
/// Decodes a record of one of the classes. Trailing bytes are an error. Declared lengths are checked against the bytes
/// at hand before memory is reserved.
[[nodiscard]] Result<std::shared_ptr<Record>> unarchive(std::string_view bytes, const RecordClasses& classes);

/// Encodes a plain value as an archive.
[[nodiscard]] std::string archiveValue(const Value& value);
/// Decodes an archive into plain values. A record of any class becomes a dictionary with its class under "class". The
/// limits are those of `unarchive`.
[[nodiscard]] Result<Value> valueFromArchive(std::string_view bytes);

} // namespace platform
