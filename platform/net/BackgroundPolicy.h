#pragma once

#include <optional>
#include <string_view>

#include "platform/base/Date.h"
#include "platform/values/Error.h"

namespace platform {

// The decisions of background transfers. Pure functions; any thread.

/// Returns the delay after the `failures`th failed attempt (from 1): it doubles from 30 s to one hour, times a factor
/// between 0.5 and 1 selected by `jitter` (0 to 1), which spreads devices that lost the service at the same time.
[[nodiscard]] Duration retryDelay(unsigned failures, double jitter);

/// Returns true if another attempt may succeed after this error.
[[nodiscard]] bool isTransient(const Error& error);

/// Parses a Retry-After field (RFC 9110, 10.2.3), seconds or a date, and returns the delay, at most one day. Returns
/// nothing for an invalid field.
[[nodiscard]] std::optional<Duration> retryAfter(std::string_view field, Date now);

} // namespace platform
