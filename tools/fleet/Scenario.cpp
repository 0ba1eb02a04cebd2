#include "tools/fleet/Scenario.h"

#include <algorithm>

namespace tavrin::fleet {

using namespace std::chrono_literals;

std::span<const ScenarioName> scenarioNames()
{
    static constexpr ScenarioName kNames[]{
        {"week", "nothing happens"},
        {"outage", "the service is dead for the busiest hour"},
        {"busy", "for the busiest hour, uploads get 503 with its end as Retry-After"},
        {"force-fetch", "a new bag is announced to all devices"},
        {"new-bag", "a new bag lists ten new resources"},
        {"new-bag-announced", "the same, announced to all devices"},
        {"update", "all devices install a new daemon within an hour"},
        {"clock-change", "clocks are set back by an hour at night"},
    };
    return kNames;
}

std::optional<Scenario> scenarioNamed(std::string_view name, int days, int hour)
{
    const auto names = scenarioNames();
    const auto found = std::ranges::find(names, name, &ScenarioName::name);
    if (found == names.end()) return std::nullopt;
    Scenario scenario{.name = found->name};
    if (name == "week") return scenario;

    const Duration day = kWarmUp + std::chrono::days(std::min(2, days - 1));
    const Window busiest{day + std::chrono::hours(hour), day + std::chrono::hours(hour + 1)};
    scenario.incident = {busiest.begin, busiest.begin};
    if (name == "outage" || name == "busy") {
        scenario.incident = busiest;
        (name == "outage" ? scenario.outage : scenario.busy) = busiest;
    } else if (name == "update") {
        scenario.update = busiest.begin;
    } else if (name == "clock-change") {
        const Duration night = kWarmUp + std::chrono::days(days - 1) + 1h;
        scenario.incident = {night, night};
        scenario.clockChange = night;
    } else {
        scenario.newBag = busiest.begin;
        scenario.announced = name != "new-bag";
        scenario.newResources = name != "force-fetch";
    }
    return scenario;
}

} // namespace tavrin::fleet
