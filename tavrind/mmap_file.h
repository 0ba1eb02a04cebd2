#pragma once

#include "platform/base/Bytes.h"
#include "platform/files/Files.h"

namespace tavrin {

/// Returns the bytes of a whole file. The handle may be closed at once. Fails with the system's error ("POSIX"): EINVAL
/// for an empty file, EFBIG for one of more than 64 MiB, EIO for one that became shorter meanwhile.
///
/// A nameless file in memory is mapped. Any other file is read: reading a mapping beyond the end of a file that another
/// program cut short would kill the process.
[[nodiscard]] platform::Result<platform::Bytes> mmapFileHandle(const platform::FileHandle& file);

} // namespace tavrin
