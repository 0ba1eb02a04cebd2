#pragma once

#include <string>
#include <vector>

namespace platform {
struct Directories;
}

namespace tavrin {

/// Removes everything that the daemon keeps about its users: its directories of caches, state and data, unfinished
/// upload bodies, and the settings that it wrote itself; with `settings`, all settings. What the device's maker and
/// other applications own stays: device.json and subscriptions.d. Returns a line for each file that could not be
/// removed.
///
/// No daemon may run in these directories. Follows no symbolic links.
[[nodiscard]] std::vector<std::string> removeTraces(const platform::Directories& directories, bool settings);

} // namespace tavrin
