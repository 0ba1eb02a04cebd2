#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "tools/fleet/Scenario.h"
#include "tools/fleet/Traffic.h"

namespace tavrin::fleet {

/// A run, and what it cost to simulate.
struct Run {
    std::uint64_t devices = 0;
    int days = 0;
    double processorSeconds = 0;
    double peakMemory = 0; ///< bytes
    std::uint64_t deviceDays = 0;
};

/// How much an incident raises the requests of a kind over their mean of the day before it. Bins as in the traffic.
struct Peak {
    double mean = 0;   ///< requests a second, of the day before the incident
    double usual = 0;  ///< the highest bin of that day over the mean
    double during = 0; ///< the highest bin of the incident over the mean, failed requests included
    double after = 0;  ///< the highest bin of the day after its end over the mean
    /// From the end of the incident until the requests differ from those without it by less than a tenth of the mean,
    /// or by what chance explains, for good, in means of five bins.
    Duration untilNormal{};
};
/// `usual` is the traffic of the same devices without the incident.
[[nodiscard]] Peak peakOf(const Traffic& traffic, const Traffic& usual, const Window& incident,
                          std::optional<Kind> kind);

/// Returns the tables for people. `usual` is null for a scenario without an incident.
[[nodiscard]] std::string reportText(const Run& run, const Scenario& scenario, const Traffic& traffic,
                                     const Traffic* usual);
/// Returns the requests of each kind in each bin after the first day as CSV: "hours" since then, a column a kind with
/// requests a second, "refused" for those that found the service dead, "all", and "usual" for "all" without the
/// incident.
[[nodiscard]] std::string csv(const Traffic& traffic, const Traffic* usual);

} // namespace tavrin::fleet
