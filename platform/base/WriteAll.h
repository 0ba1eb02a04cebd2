#pragma once

#include <string_view>

namespace platform {

/// Writes all contents to the descriptor, in as many calls as that takes, and blocks if they block. Returns false, with
/// errno set, if one fails; part of the contents may be written then. Any thread.
[[nodiscard]] bool writeAll(int fd, std::string_view contents);

} // namespace platform
