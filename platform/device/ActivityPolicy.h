#pragma once

#include <optional>
#include <span>

#include "platform/device/ActivityScheduler.h"
#include "platform/device/DeviceUse.h"

namespace platform {

// What the activity scheduler decides: pure functions.

/// Whether an activity may run while the device is used like this.
[[nodiscard]] bool criteriaHold(const ActivityCriteria& criteria, const DeviceUse& use);
/// Whether that depends on the device's use at all.
[[nodiscard]] bool dependOnUse(const ActivityCriteria& criteria);

/// When an activity is due, and how much later it may still run.
struct ActivityWindow {
    Duration due{};
    Duration gracePeriod{};
};
/// When to wake: at the last due time that lies within every activity's grace, so that as many as possible run together
/// and none before it is due. Nothing without activities.
[[nodiscard]] std::optional<Duration> wakeTime(std::span<const ActivityWindow> windows);

/// When an activity that is registered at `registered` is first due: after its delay, and not before the time that an
/// earlier process kept for it. `kept` counts for one interval at most, so that a damaged file can't put it off for
/// long.
[[nodiscard]] Duration firstDue(const ActivityCriteria& criteria, Duration registered, std::optional<Duration> kept);

} // namespace platform
