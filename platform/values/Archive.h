#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/values/Record.h"

namespace platform {

// Archives are MessagePack, the form that files store (docs/formats.md). Any thread.

/// Encodes a record. Null fields are left out.
[[nodiscard]] std::string archive(const Record& record);
/// Decodes a record of one of `classes`. Returns an error of domain "Format" for bytes that are not such a record and
/// for trailing bytes. Checks declared lengths against the input's size before it reserves memory.
[[nodiscard]] Result<std::shared_ptr<Record>> unarchive(std::string_view bytes, const RecordClasses& classes);

/// Encodes a plain value.
[[nodiscard]] std::string archiveValue(const Value& value);
/// Decodes an archive into plain values. A record of any class becomes a dictionary with its class name under "class".
/// Errors and limits are those of `unarchive`.
[[nodiscard]] Result<Value> valueFromArchive(std::string_view bytes);

} // namespace platform
