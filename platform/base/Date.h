#pragma once

#include <chrono>
#include <cmath>
#include <cstdint>

namespace platform {

/// A moment on the system clock, as read from `Clock::wallNow()`.
using Date = std::chrono::sys_time<std::chrono::nanoseconds>;

/// A span of time.
using Duration = std::chrono::nanoseconds;

// Conversions treat whole seconds and the rest apart: a double doesn't hold nanoseconds since 1970 exactly.

/// The seconds nearest to `d`.
[[nodiscard]] inline double toSeconds(Duration d)
{
    const auto whole = std::chrono::duration_cast<std::chrono::seconds>(d);
    return static_cast<double>(whole.count()) + std::chrono::duration<double>(d - whole).count();
}

/// Seconds since 1970, UTC.
[[nodiscard]] inline double secondsSince1970(Date date)
{
    return toSeconds(date.time_since_epoch());
}

/// The span nearest to `seconds`. Values beyond what nanoseconds hold (292 years) are clamped, NaN is zero.
[[nodiscard]] inline Duration durationFromSeconds(double seconds)
{
    constexpr double kLimit = 9.2e9;
    if (!(seconds == seconds)) return Duration::zero();
    if (seconds > kLimit) seconds = kLimit;
    if (seconds < -kLimit) seconds = -kLimit;
    const double whole = std::trunc(seconds);
    return std::chrono::seconds(static_cast<std::int64_t>(whole)) + Duration(std::llround((seconds - whole) * 1e9));
}

/// The moment of a time of the operating system: seconds since 1970 and the nanoseconds beyond them. Clamped to the
/// years 1970 to 2199, so that neither the difference of two such moments nor a sum with less than 60 years overflows.
[[nodiscard]] constexpr Date dateFromSystemTime(std::int64_t seconds, std::int64_t nanoseconds)
{
    constexpr std::int64_t kLatest = 7'258'118'400;
    if (seconds < 0 || seconds >= kLatest) return Date(std::chrono::seconds(seconds < 0 ? 0 : kLatest));
    return Date(std::chrono::seconds(seconds) + std::chrono::nanoseconds(nanoseconds));
}

/// The moment `seconds` after 1970, clamped like `durationFromSeconds`.
[[nodiscard]] inline Date dateFromSecondsSince1970(double seconds)
{
    return Date(durationFromSeconds(seconds));
}

} // namespace platform
