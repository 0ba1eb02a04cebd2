#include "platform/device/ActivityPolicy.h"

#include <algorithm>

namespace platform {

bool criteriaHold(const ActivityCriteria& criteria, const DeviceUse& use)
{
    return unmetCriterion(criteria, use).empty();
}

std::string_view unmetCriterion(const ActivityCriteria& criteria, const DeviceUse& use)
{
    if (!criteria.allowBattery && use.onBattery) return "power";
    if (criteria.requireScreenSleep && use.screenInUse) return "screen sleep";
    if (criteria.requireFirstUnlock && !use.unlocked) return "first login";
    return "";
}

bool dependOnUse(const ActivityCriteria& criteria)
{
    return !criteria.allowBattery || criteria.requireScreenSleep || criteria.requireFirstUnlock;
}

std::optional<Duration> wakeTime(std::span<const ActivityWindow> windows)
{
    if (windows.empty()) return std::nullopt;
    Duration latest = Duration::max();
    for (const ActivityWindow& window : windows) latest = std::min(latest, window.due + window.gracePeriod);
    Duration wake = Duration::min();
    for (const ActivityWindow& window : windows)
        if (window.due <= latest) wake = std::max(wake, window.due);
    return wake;
}

Duration firstDue(const ActivityCriteria& criteria, Duration registered, std::optional<Duration> stored)
{
    const Duration earliest = registered + criteria.delay;
    if (!stored || !criteria.repeating) return earliest;
    return std::max(earliest, std::min(*stored, registered + criteria.interval));
}

} // namespace platform
