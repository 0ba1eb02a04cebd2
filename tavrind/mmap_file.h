#pragma once

#include "platform/base/Bytes.h"
#include "platform/files/Files.h"

namespace tavrin {

/// The largest file that `mmapFileHandle` returns, in bytes: as large as the largest resource, and many times
/// the largest image.
inline constexpr std::size_t kLargestMappedFile = 64u << 20;

/// Returns the bytes of a whole file, which stay valid after the handle is closed. Fails with the system's error
/// ("POSIX"): EINVAL for an empty file, EFBIG for one beyond `kLargestMappedFile`, EIO for one that was truncated
/// during the call.
///
/// A nameless file in memory is mapped. Any other file is read, because another program may truncate it: reading a
/// mapping beyond the end of its file kills the process (SIGBUS).
[[nodiscard]] platform::Result<platform::Bytes> mmapFileHandle(const platform::FileHandle& file);

} // namespace tavrin
