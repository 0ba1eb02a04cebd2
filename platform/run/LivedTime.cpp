#include "platform/run/LivedTime.h"

#include <algorithm>
#include <charconv>
#include <limits>

#include <fmt/format.h>

#include "platform/run/Clock.h"

namespace platform {

namespace {

constexpr Duration kLongestAbsence = std::chrono::hours(24 * 366);
/// Limit of a stored count, so that no deadline overflows.
constexpr Duration kLongestLife = std::chrono::hours(24 * 366 * 100);

/// Returns the time between two dates, saturated: one may come from a damaged file.
Duration between(Date from, Date to)
{
    Duration::rep span = 0;
    if (__builtin_sub_overflow(to.time_since_epoch().count(), from.time_since_epoch().count(), &span))
        return to < from ? Duration::min() : Duration::max();
    return Duration(span);
}

Duration spanOf(std::uint64_t ticks)
{
    constexpr auto kMost = static_cast<std::uint64_t>(std::numeric_limits<Duration::rep>::max());
    return Duration(static_cast<Duration::rep>(std::min(ticks, kMost)));
}

ClockReading readingOf(const Clock& clock)
{
    return {.wall = clock.wallNow(), .bootTicks = clock.bootTicks(), .boot = clock.bootId()};
}

} // namespace

Duration timePassed(const ClockReading& from, const ClockReading& to)
{
    if (from.boot == to.boot && !to.boot.empty())
        return to.bootTicks > from.bootTicks ? spanOf(to.bootTicks - from.bootTicks) : Duration::zero();
    const Duration sinceRestart = spanOf(to.bootTicks);
    const Duration bySystemClock = between(from.wall, to.wall);
    const bool plausible = bySystemClock >= sinceRestart && bySystemClock - sinceRestart <= kLongestAbsence;
    return plausible ? bySystemClock : sinceRestart;
}

std::string LivedTime::Mark::text() const
{
    return fmt::format("{} {} {} {}", lived.count(), clock.wall.time_since_epoch().count(), clock.bootTicks,
                       clock.boot);
}

std::optional<LivedTime::Mark> LivedTime::Mark::parse(std::string_view text)
{
    const auto take = [&text](auto& number) {
        const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
        if (error != std::errc() || end == text.data() + text.size() || *end != ' ') return false;
        text.remove_prefix(static_cast<std::size_t>(end - text.data()) + 1);
        return true;
    };
    std::int64_t lived = 0;
    std::int64_t wall = 0;
    Mark mark;
    if (!take(lived) || !take(wall) || !take(mark.clock.bootTicks)) return std::nullopt;
    mark.lived = Duration(lived);
    mark.clock.wall = Date(Duration(wall));
    mark.clock.boot = text;
    return mark;
}

LivedTime::LivedTime(Clock& clock, std::optional<Mark> saved) : _clock(&clock), _mark{{}, readingOf(clock)}
{
    if (!saved) return;
    const Duration lived = std::clamp(saved->lived, Duration::zero(), kLongestLife);
    _mark.lived = lived + std::min(timePassed(saved->clock, _mark.clock), kLongestLife);
}

Duration LivedTime::now()
{
    ClockReading reading = readingOf(*_clock);
    if (reading.bootTicks > _mark.clock.bootTicks) // a process lives in one boot, also if that has no identifier
        _mark.lived += spanOf(reading.bootTicks - _mark.clock.bootTicks);
    _mark.clock = std::move(reading);
    return _mark.lived;
}

LivedTime::Mark LivedTime::mark()
{
    (void)now();
    return _mark;
}

} // namespace platform
