#pragma once

#include <span>
#include <string_view>

/// The daemon's settings, as docs/device.md lists them. Constant data; any thread.
namespace tavrin {

struct KnownSetting {
    std::string_view key;    ///< "…" at its end stands for any text
    std::string_view type;   ///< "boolean", "number", "string" or "object"
    std::string_view effect; ///< for "tavrinctl defaults list"
    std::string_view read;   ///< when the daemon reads it: "at start", "at every fetch", …
    bool isDaemons = false;  ///< written by the daemon, about its users
};
[[nodiscard]] std::span<const KnownSetting> knownSettings();
/// Returns the setting of this key, or null.
[[nodiscard]] const KnownSetting* knownSetting(std::string_view key);

} // namespace tavrin
