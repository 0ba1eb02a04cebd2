#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "platform/base/Date.h"

namespace tavrin::fleet {

using platform::Duration;

/// Times of a simulation, from its start: a Sunday, 0:00 UTC. The first day fills bags, sessions and queues, and isn't
/// measured.
inline constexpr platform::Date kStart = std::chrono::sys_days(std::chrono::year(2026) / 10 / 18);
inline constexpr Duration kWarmUp = std::chrono::hours(24);

struct Window {
    Duration begin{}, end{};
    [[nodiscard]] bool contains(Duration at) const { return at >= begin && at < end; }
};

/// What happens to the service and to the devices during a simulation, by the clock: no device influences another.
struct Scenario {
    std::string_view name;
    Window incident{};                     ///< the part to be looked at; empty if nothing happens
    std::optional<Window> outage{};        ///< no request is answered
    std::optional<Window> busy{};          ///< uploads get 503, with the end of the window as Retry-After
    std::optional<Duration> newBag{};      ///< the service has bag 2 from here on
    bool announced = false;                ///< responses to searches announce it
    bool newResources = false;             ///< it lists another file for each resource
    std::optional<Duration> update{};      ///< devices install a new daemon, within an hour
    std::optional<Duration> clockChange{}; ///< clocks are set back by an hour, in zones that do so

    [[nodiscard]] int bagVersion(Duration at) const { return newBag && at >= *newBag ? 2 : 1; }
};

struct ScenarioName {
    std::string_view name, help;
};
[[nodiscard]] std::span<const ScenarioName> scenarioNames();
/// Returns the scenario of one of these names. What happens, happens at `hour` UTC of the third of `days` measured
/// days, or of the last one if there are fewer; a clock change in the night to the last day.
[[nodiscard]] std::optional<Scenario> scenarioNamed(std::string_view name, int days, int hour);

} // namespace tavrin::fleet
