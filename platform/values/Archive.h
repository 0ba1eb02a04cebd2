#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/values/Record.h"

namespace platform {

/// A record as a MessagePack archive, the form that is stored. Null fields are left out.
[[nodiscard]] std::string archive(const Record& record);
/// The record in an archive. Trailing bytes are an error; declared lengths are checked against what is there.
[[nodiscard]] Result<std::shared_ptr<Record>> unarchive(std::string_view bytes, const RecordClasses& classes);

/// A plain value as an archive.
[[nodiscard]] std::string archiveValue(const Value& value);
/// What an archive holds, as plain values: a record is a dictionary with its class under "class", of any class. Limits
/// as for `unarchive`.
[[nodiscard]] Result<Value> valueFromArchive(std::string_view bytes);

} // namespace platform
