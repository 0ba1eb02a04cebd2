#pragma once

#include <string_view>

namespace platform {

/// Writes all of it to the descriptor, in as many calls as it takes; false, with errno, at the first that fails. It
/// waits where writing does. Any thread.
[[nodiscard]] bool writeAll(int fd, std::string_view contents);

} // namespace platform
