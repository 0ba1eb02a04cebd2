#include "platform/run/LivedTime.h"

#include <algorithm>

#include "platform/run/Clock.h"

namespace platform {

namespace {

constexpr Duration kLongestAbsence = std::chrono::hours(24 * 366);
/// Counts beyond are no counts of ours. Leaves room for every deadline.
constexpr Duration kLongestLife = std::chrono::hours(24 * 366 * 100);

/// The span between two dates, of which one may come from a damaged file.
Duration between(Date from, Date to)
{
    Duration::rep span = 0;
    if (__builtin_sub_overflow(to.time_since_epoch().count(), from.time_since_epoch().count(), &span))
        return to < from ? Duration::min() : Duration::max();
    return Duration(span);
}

} // namespace

Duration timePassed(Duration bySystemClock, Duration byHostTicks)
{
    const bool plausible = bySystemClock >= byHostTicks && bySystemClock - byHostTicks <= kLongestAbsence;
    return plausible ? bySystemClock : byHostTicks;
}

LivedTime::LivedTime(Clock& clock, std::optional<Mark> saved)
    : _clock(&clock), _mark{Duration::zero(), clock.wallNow()}, _ticks(clock.hostTicks())
{
    if (!saved) return;
    const Duration lived = std::clamp(saved->lived, Duration::zero(), kLongestLife);
    _mark.lived = lived + timePassed(between(saved->wall, _mark.wall), Duration::zero());
}

Duration LivedTime::now()
{
    const Date wall = _clock->wallNow();
    const std::uint64_t ticks = _clock->hostTicks();
    _mark.lived += timePassed(between(_mark.wall, wall), Duration(ticks - _ticks));
    _mark.wall = wall;
    _ticks = ticks;
    return _mark.lived;
}

LivedTime::Mark LivedTime::mark()
{
    (void)now();
    return _mark;
}

} // namespace platform
