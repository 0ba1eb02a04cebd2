#pragma once

#include <chrono>
#include <cmath>
#include <cstdint>

namespace platform {

/// A point in time on the system clock, as `Clock::wallNow()` returns it.
using Date = std::chrono::sys_time<std::chrono::nanoseconds>;

/// A span of time.
using Duration = std::chrono::nanoseconds;

// Conversions treat whole seconds and the fraction separately: a double can't hold nanoseconds since 1970 exactly. Pure
// functions: any thread.

/// Returns the number of seconds in `d`, rounded to the nearest double.
[[nodiscard]] inline double toSeconds(Duration d)
{
    const auto whole = std::chrono::duration_cast<std::chrono::seconds>(d);
    return static_cast<double>(whole.count()) + std::chrono::duration<double>(d - whole).count();
}

/// Returns the seconds since 1970, UTC.
[[nodiscard]] inline double secondsSince1970(Date date)
{
    return toSeconds(date.time_since_epoch());
}

/// Returns the duration of `seconds`, rounded to a nanosecond. Clamps values that 64-bit nanoseconds can't hold (292
/// years); returns zero for NaN.
[[nodiscard]] inline Duration durationFromSeconds(double seconds)
{
    constexpr double kLimit = 9.2e9;
    if (!(seconds == seconds)) return Duration::zero();
    if (seconds > kLimit) seconds = kLimit;
    if (seconds < -kLimit) seconds = -kLimit;
    const double whole = std::trunc(seconds);
    return std::chrono::seconds(static_cast<std::int64_t>(whole)) + Duration(std::llround((seconds - whole) * 1e9));
}

/// Converts a time of the operating system (a `timespec`: seconds since 1970 and nanoseconds). Clamps to the years 1970
/// to 2199, so that neither the difference of two such dates nor a sum with less than 60 years overflows.
[[nodiscard]] constexpr Date dateFromSystemTime(std::int64_t seconds, std::int64_t nanoseconds)
{
    constexpr std::int64_t kLatest = 7'258'118'400;
    if (seconds < 0 || seconds >= kLatest) return Date(std::chrono::seconds(seconds < 0 ? 0 : kLatest));
    return Date(std::chrono::seconds(seconds) + std::chrono::nanoseconds(nanoseconds));
}

/// Returns the date `seconds` after 1970, clamped like `durationFromSeconds`.
[[nodiscard]] inline Date dateFromSecondsSince1970(double seconds)
{
    return Date(durationFromSeconds(seconds));
}

} // namespace platform
