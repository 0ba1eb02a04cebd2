#pragma once

#include <string_view>

namespace platform {

/// Writes all of `contents` to the descriptor, in as many calls of write(2) as needed. Blocks if the descriptor blocks.
/// Returns false and leaves errno set if a call fails; part of the contents may have been written. Any thread.
[[nodiscard]] bool writeAll(int fd, std::string_view contents);

} // namespace platform
