#pragma once

#include <string>

#include "platform/device/ActivityScheduler.h"

namespace tavrin {

struct Assembly;

/// Assembles the criteria of a background activity entry by entry.
struct TavrinXPCCriteria {
    [[nodiscard]] static platform::ActivityCriteria createCriteria() { return {}; }
    static void setRepeating(bool repeating, platform::ActivityCriteria& criteria) { criteria.repeating = repeating; }
    static void setDelay(std::chrono::seconds delay, platform::ActivityCriteria& criteria) { criteria.delay = delay; }
    static void setGracePeriod(std::chrono::seconds period, platform::ActivityCriteria& criteria)
    {
        criteria.gracePeriod = period;
    }
    static void setAllowBatteryUsage(bool allow, platform::ActivityCriteria& criteria)
    {
        criteria.allowBattery = allow;
    }
    static void setInterval(std::chrono::seconds interval, platform::ActivityCriteria& criteria)
    {
        criteria.interval = interval;
    }
};

/// Operations on the device's background activities. Any thread.
struct TavrinXPCActivity {
    using Handler = platform::ActivityScheduler::Handler;
    static void registerActivity(Assembly& assembly, const std::string& identifier, platform::ActivityCriteria criteria,
                                 Handler handler);
    static void unregister(Assembly& assembly, const std::string& identifier);
    /// Returns true if the activity changed to `state`.
    [[nodiscard]] static bool setState(platform::ActivityState state, platform::Activity& activity);
    [[nodiscard]] static platform::ActivityState getStateForActivity(const platform::Activity& activity);
    /// Returns true if the current run should stop and wait for a better moment.
    [[nodiscard]] static bool shouldDefer(const platform::Activity& activity);
};

} // namespace tavrin
