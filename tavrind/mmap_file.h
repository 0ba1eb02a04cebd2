#pragma once

#include "platform/base/Bytes.h"
#include "platform/files/Files.h"

namespace tavrin {

/// Maps a whole file, read-only and private; the last copy of the bytes unmaps it. The handle may be closed at once. An
/// error of the system's ("POSIX") where it can't be mapped: an empty file (EINVAL), say.
///
/// Only for files that are replaced, never cut short, while they are in use: reading beyond a new end is fatal.
[[nodiscard]] platform::Result<platform::Bytes> mmapFileHandle(const platform::FileHandle& file);

} // namespace tavrin
