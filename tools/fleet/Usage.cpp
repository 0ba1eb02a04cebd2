#include "tools/fleet/Usage.h"

#include <algorithm>

namespace tavrin::fleet {

using namespace std::chrono_literals;

namespace {

std::int64_t dayOf(Duration local)
{
    return std::chrono::floor<std::chrono::days>(local).count();
}

Duration midnight(std::int64_t day)
{
    return std::chrono::days(day);
}

Duration around(Duration center, Duration spread, Random& random)
{
    return center + std::chrono::duration_cast<Duration>(spread * (2 * random.uniform() - 1));
}

} // namespace

std::optional<std::vector<Zone>> zonesNamed(std::string_view name)
{
    if (name == "one") return std::vector<Zone>{{1h, 1, true}};
    if (name != "world") return std::nullopt;
    return std::vector<Zone>{{-8h, 0.12, false}, {-6h, 0.08, false}, {-5h, 0.16, false}, {-3h, 0.06, false},
                             {0h, 0.12, true},   {1h, 0.22, true},   {2h, 0.06, true},   {330min, 0.06, false},
                             {8h, 0.08, false},  {9h, 0.04, false}};
}

DailyCurve::DailyCurve()
{
    // Searches in each local hour: few at night, most in the evening.
    constexpr std::array<double, 24> kHours{35,  20,  12,  8,   8,   15,  40,  80,  110, 120, 125, 125,
                                            130, 125, 120, 120, 120, 125, 140, 160, 175, 170, 130, 75};
    double sum = 0;
    for (std::size_t minute = 0; minute + 1 < _cumulative.size(); ++minute) {
        const std::size_t hour = minute / 60;
        const double next = static_cast<double>(minute % 60) / 60;
        sum += kHours[hour] * (1 - next) + kHours[(hour + 1) % 24] * next;
        _cumulative[minute + 1] = sum;
    }
    for (double& value : _cumulative) value /= sum;
}

Duration DailyCurve::next(Duration local, double perDay, Random& random) const
{
    const std::int64_t day = dayOf(local);
    const double minutes = platform::toSeconds(local - midnight(day)) / 60;
    const auto minute = static_cast<std::size_t>(minutes);
    const double share =
        _cumulative[minute] + (minutes - static_cast<double>(minute)) * (_cumulative[minute + 1] - _cumulative[minute]);
    const double target = share + random.exponential() / perDay;
    const double rest = target - std::floor(target);
    const auto above = std::ranges::upper_bound(_cumulative, rest);
    const auto index = static_cast<std::size_t>(above - _cumulative.begin()) - 1;
    const double within = (rest - _cumulative[index]) / (_cumulative[index + 1] - _cumulative[index]);
    return midnight(day + static_cast<std::int64_t>(std::floor(target))) +
           platform::durationFromSeconds(60 * (static_cast<double>(index) + within));
}

double DailyCurve::at(Duration local) const
{
    const auto minute = static_cast<std::size_t>((local - midnight(dayOf(local))) / 1min);
    return (_cumulative[minute + 1] - _cumulative[minute]) * static_cast<double>(_cumulative.size() - 1);
}

int busiestHour(const std::vector<Zone>& zones, const DailyCurve& curve)
{
    const auto rate = [&](int hour) {
        double sum = 0;
        for (const Zone& zone : zones) sum += zone.share * curve.at(std::chrono::hours(hour) + 30min + zone.offset);
        return sum;
    };
    int busiest = 0;
    for (int hour = 1; hour < 24; ++hour)
        if (rate(hour) > rate(busiest)) busiest = hour;
    return busiest;
}

Habits::Habits(const Assumptions& assumptions, Random& random, std::uint64_t seed)
    : _assumptions(assumptions), _seed(seed), _alwaysOn(random.chance(assumptions.alwaysOn)),
      _suspends(random.chance(assumptions.suspends)), _hasMeteredHours(random.chance(assumptions.meteredShare))
{}

const Habits::Day& Habits::day(std::int64_t number)
{
    Day& day = _days[static_cast<std::size_t>(number) % _days.size()];
    if (day.number == number) return day;
    const Duration midnight = std::chrono::days(number);
    Random random(_seed ^ mixed(static_cast<std::uint64_t>(number)));
    day = {.number = number, .on = {}, .offline = {}, .metered = {}};
    day.on = {midnight + around(7h + 30min, 90min, random), midnight + around(22h + 30min, 85min, random)};
    if (_hasMeteredHours) day.metered = {midnight + around(8h, 1h, random), midnight + around(18h, 90min, random)};
    if (random.chance(_assumptions.offlineDays)) {
        const Duration begin = midnight + around(12h, 12h, random);
        const double minutes = std::min(random.exponential() * _assumptions.offlineMinutes, 24.0 * 60);
        day.offline = {begin, begin + platform::durationFromSeconds(60 * minutes)};
    }
    return day;
}

bool Habits::isOn(Duration local)
{
    return _alwaysOn || day(dayOf(local)).on.contains(local);
}

std::optional<Duration> Habits::nextPowerChange(Duration local)
{
    if (_alwaysOn) return std::nullopt;
    const Span on = day(dayOf(local)).on;
    if (local < on.begin) return on.begin;
    return local < on.end ? on.end : day(dayOf(local) + 1).on.begin;
}

bool Habits::isOnline(Duration local)
{
    return !day(dayOf(local)).offline.contains(local) && !day(dayOf(local) - 1).offline.contains(local);
}

Duration Habits::nextOfflineEnd(Duration local)
{
    Duration earliest = local + 24h;
    for (std::int64_t number = dayOf(local) - 1; number <= dayOf(local) + 1; ++number)
        if (const Span spell = day(number).offline; spell.end > local) earliest = std::min(earliest, spell.end);
    return earliest;
}

bool Habits::isMetered(Duration local)
{
    return day(dayOf(local)).metered.contains(local);
}

Duration Habits::meteredEnd(Duration local)
{
    return isMetered(local) ? day(dayOf(local)).metered.end : local;
}

} // namespace tavrin::fleet
