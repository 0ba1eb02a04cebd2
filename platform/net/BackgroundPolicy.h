#pragma once

#include <optional>
#include <string_view>

#include "platform/base/Date.h"
#include "platform/values/Error.h"

namespace platform {

// What background transfers decide: pure functions.

/// How long to wait after an attempt failed, for the `failures`th time (from 1): grows from about half a minute to an
/// hour. `jitter`, from 0 to 1, spreads the devices that lost the same service at the same moment.
[[nodiscard]] Duration retryDelay(unsigned failures, double jitter);

/// Whether another attempt may end better than with this error.
[[nodiscard]] bool mayGetBetter(const Error& error);

/// The wait that a Retry-After field asks for (RFC 9110, 10.2.3): seconds, or a date; a day at most. Nothing for a
/// field that says neither.
[[nodiscard]] std::optional<Duration> retryAfter(std::string_view field, Date now);

} // namespace platform
