#pragma once

#include <optional>
#include <span>
#include <string_view>

#include "platform/device/ActivityScheduler.h"
#include "platform/device/DeviceUse.h"

namespace platform {

// The decisions of the activity scheduler. Pure functions; any thread. Times are lived time.

/// Returns true if an activity may run while the device is in this use.
[[nodiscard]] bool criteriaHold(const ActivityCriteria& criteria, const DeviceUse& use);
/// Returns the first criterion that doesn't hold: "power", "screen sleep" or "first login"; empty if all hold.
[[nodiscard]] std::string_view unmetCriterion(const ActivityCriteria& criteria, const DeviceUse& use);
/// Returns true if `criteriaHold` depends on the use.
[[nodiscard]] bool dependOnUse(const ActivityCriteria& criteria);

/// When an activity is due, and how much later it may run.
struct ActivityWindow {
    Duration due{};
    Duration gracePeriod{};
};
/// Returns when to wake up: the latest due time that is within every activity's grace period, so that as many
/// activities as possible run together and none before it is due. Returns nothing for no windows.
[[nodiscard]] std::optional<Duration> wakeTime(std::span<const ActivityWindow> windows);

/// Returns when an activity is first due: after its delay, and not before `stored`, the due time that an earlier
/// process saved. At most one interval of `stored` counts, so that a damaged file can't delay the activity for long.
[[nodiscard]] Duration firstDue(const ActivityCriteria& criteria, Duration registered, std::optional<Duration> stored);

} // namespace platform
