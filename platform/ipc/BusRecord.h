#pragma once

#include <memory>

#include "platform/ipc/BusValue.h"

namespace platform {
class Record;
class RecordClasses;
} // namespace platform

/// Reads and writes records of bus messages as a{sv} with the class under "class", field by field.
namespace platform::ipc {

/// Reads the next argument, an a{sv}, as a record of one of `classes`, like `recordFromValue` reads its dictionary.
/// Returns null for a record that it can't read, and for one that only `recordFromValue` reads: its class is not its
/// first entry, or an entry is there twice or in a nested variant. The reader is then unusable; read the message again.
[[nodiscard]] std::shared_ptr<Record> readRecord(BusReader& reader, const RecordClasses& classes);

/// Appends a record; writes the same bytes as `BusWriter::append` of `toValue(record)`.
[[nodiscard]] bool appendRecord(BusWriter& writer, const Record& record);

} // namespace platform::ipc
