#pragma once

#include <string>
#include <string_view>

#include "platform/values/Value.h"

/// What "tavrinctl defaults" says about the daemon's settings.
namespace tavrin::ctl {

/// Parses a typed value as JSON. Uses it as a string if it is not JSON, or if the key is known to be a string. Throws
/// `Failure` if the key is known to have another type.
[[nodiscard]] platform::Value settingValue(std::string_view key, const std::string& typed);

/// Returns what the user must know after a change of this key: that the daemon doesn't know it, or when it reads it.
/// Empty if the change takes effect at once.
[[nodiscard]] std::string noteOnChange(std::string_view key);

} // namespace tavrin::ctl
