#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace platform {
struct Directories;
}

namespace tavrin {

/// The names of the temporary files for upload bodies: this prefix and so many hexadecimal digits.
inline constexpr std::string_view kUploadBodyPrefix = "flusher_";
inline constexpr std::size_t kUploadBodyDigits = 6;
[[nodiscard]] bool isUploadBody(std::string_view name);

/// Removes everything that the daemon keeps about its users: its directories of caches, state and data, unfinished
/// upload bodies, and the settings that it wrote itself; with `settings`, all settings. What the device's maker and
/// other applications own stays: device.json and subscriptions.d. What is removed stays so after a power cut. Returns a
/// line for each file that could not be removed.
///
/// No daemon may run in these directories. Follows no symbolic links: a link in place of a directory is removed, and
/// reported, because the traces behind it stay.
[[nodiscard]] std::vector<std::string> removeTraces(const platform::Directories& directories, bool settings);

} // namespace tavrin
