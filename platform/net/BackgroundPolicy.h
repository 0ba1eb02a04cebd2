#pragma once

#include <optional>
#include <string_view>

#include "platform/base/Date.h"
#include "platform/values/Error.h"

namespace platform {

// The decisions of background transfers. Pure functions; any thread. `jitter` is a random number from 0 to 1: without
// it, all devices that lost the service together would come back together.

/// Returns the delay after the `failures`th failed attempt (from 1): 15 to 30 s, which is enough for a lost connection;
/// then half an hour to two hours, then one to four hours. So the transfers that an hour's outage has held up arrive
/// within two hours: they add less to the usual ones than these are.
[[nodiscard]] Duration retryDelay(unsigned failures, double jitter);

/// Returns the delay before the first attempt of a task that may start at any time within `window`.
[[nodiscard]] Duration startDelay(Duration window, double jitter);

/// Returns true if another attempt may succeed after this error.
[[nodiscard]] bool isTransient(const Error& error);

/// Parses a Retry-After field (RFC 9110, 10.2.3), seconds or a date, and returns the delay: the seconds and up to half
/// as many, or until the date and up to half an hour, because a date is the same for all devices. At most one day; zero
/// for a date in the past. Returns nothing for an invalid field.
[[nodiscard]] std::optional<Duration> retryAfter(std::string_view field, Date now, double jitter);

} // namespace platform
