#pragma once

#include <chrono>

namespace platform {

/// A moment on the system clock, as read from `Clock::wallNow()`.
using Date = std::chrono::sys_time<std::chrono::nanoseconds>;

/// A span of time.
using Duration = std::chrono::nanoseconds;

[[nodiscard]] inline double toSeconds(Duration d) { return std::chrono::duration<double>(d).count(); }

/// Seconds since 1970, UTC.
[[nodiscard]] inline double secondsSince1970(Date date) { return toSeconds(date.time_since_epoch()); }

/// The span nearest to `seconds`. Values beyond what nanoseconds hold (292 years) are clamped, NaN is zero.
[[nodiscard]] inline Duration durationFromSeconds(double seconds)
{
    constexpr double kLimit = 9.2e9;
    if (!(seconds == seconds)) return Duration::zero();
    if (seconds > kLimit) seconds = kLimit;
    if (seconds < -kLimit) seconds = -kLimit;
    return std::chrono::duration_cast<Duration>(std::chrono::duration<double>(seconds));
}

/// The moment `seconds` after 1970, clamped like `durationFromSeconds`.
[[nodiscard]] inline Date dateFromSecondsSince1970(double seconds) { return Date(durationFromSeconds(seconds)); }

} // namespace platform
