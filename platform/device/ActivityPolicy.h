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
/// The moment to wake for: as many of the activities together as can be, none before it is due or after its grace, and
/// the first not later than company makes worth while. Nothing without activities.
[[nodiscard]] std::optional<Duration> wakeTime(std::span<const ActivityWindow> windows);

/// When an activity that is registered at `registered` is due: not before its delay, nor before what an earlier process
/// left (`kept`), which is believed as far as the activity itself could have put it.
[[nodiscard]] Duration firstDue(const ActivityCriteria& criteria, Duration registered, std::optional<Duration> kept);

} // namespace platform
