#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Date.h"
#include "tools/fleet/Assumptions.h"
#include "tools/fleet/Random.h"

namespace tavrin::fleet {

using platform::Duration;

/// Where devices are: their offset from UTC, and their share.
struct Zone {
    std::chrono::minutes offset;
    double share;
    bool changesClock; ///< set back by an hour in the scenario's night
};
/// Returns the zones of this name, "world" or "one"; nothing for other names.
[[nodiscard]] std::optional<std::vector<Zone>> zonesNamed(std::string_view name);

/// How much people search at which local time. Times are since local midnight of some day; any day is like another.
class DailyCurve {
public:
    DailyCurve();
    /// Returns when an event of a Poisson process happens whose rate follows the curve, with `perDay` events a day: the
    /// first one after `local`.
    [[nodiscard]] Duration next(Duration local, double perDay, Random& random) const;
    /// Returns the rate over its daily mean.
    [[nodiscard]] double at(Duration local) const;

private:
    std::array<double, 24 * 60 + 1> _cumulative{}; ///< share of the day's events before each minute
};

/// Returns the UTC hour of the day, from 0, in which all zones together search the most.
[[nodiscard]] int busiestHour(const std::vector<Zone>& zones, const DailyCurve& curve);

/// The habits of one device: when it is on, online and unmetered. They depend on the device and the day alone; days are
/// kept because they are asked for again and again. All times are local.
class Habits {
public:
    Habits(const Assumptions& assumptions, Random& random, std::uint64_t seed);

    [[nodiscard]] bool isOn(Duration local);
    /// Returns the next change of `isOn` after `local`; nothing for a device that is always on.
    [[nodiscard]] std::optional<Duration> nextPowerChange(Duration local);
    /// Returns true if the night is a suspend, in which the daemon keeps its state.
    [[nodiscard]] bool suspends() const { return _suspends; }

    [[nodiscard]] bool isOnline(Duration local);
    [[nodiscard]] bool isMetered(Duration local);
    /// Returns the end of the offline spell at `local`, or else of the next one; at most a day later.
    [[nodiscard]] Duration nextOfflineEnd(Duration local);
    /// Returns when the metered hours end, at `local` or later.
    [[nodiscard]] Duration meteredEnd(Duration local);

private:
    struct Span {
        Duration begin{}, end{};
        [[nodiscard]] bool contains(Duration at) const { return at >= begin && at < end; }
    };
    struct Day {
        std::int64_t number = INT64_MIN;
        Span on, offline, metered;
    };
    [[nodiscard]] const Day& day(std::int64_t number);

    const Assumptions& _assumptions;
    const std::uint64_t _seed;
    const bool _alwaysOn;
    const bool _suspends;
    const bool _hasMeteredHours;
    std::array<Day, 4> _days;
};

} // namespace tavrin::fleet
