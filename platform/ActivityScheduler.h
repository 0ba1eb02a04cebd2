#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/Date.h"

namespace platform {

/// When an activity may run.
struct ActivityCriteria {
    bool repeating = false;
    Duration delay{};       ///< from the registration to the first run, at least
    Duration gracePeriod{}; ///< how long after it is due a run may wait for company or for a better moment
    Duration interval{};    ///< from run to run, for a repeating activity
    bool allowBattery = true;
    bool maintenance = false;         ///< work that nobody waits for: at background priority
    bool requireScreenSleep = false;  ///< only while the device isn't used
    bool requireFirstUnlock = false;  ///< only once the user has unlocked the device since it started
};

/// The numbers are the scheduler's own.
enum class ActivityState : int { CheckIn = 0, Wait = 1, Run = 2, Defer = 3, Continue = 4, Done = 5 };

/// A registered activity, as its handler gets it. Any thread.
class Activity {
public:
    virtual ~Activity() = default;
    [[nodiscard]] virtual const std::string& identifier() const = 0;
    [[nodiscard]] virtual ActivityState state() const = 0;
    /// Moves on: Run to Continue, Defer or Done; Continue to Defer or Done. False for anything else.
    virtual bool setState(ActivityState state) = 0;
    /// Whether the criteria that let the run begin no longer hold.
    [[nodiscard]] virtual bool shouldDefer() const = 0;
    /// In the state CheckIn: replaces the criteria.
    virtual void setCriteria(ActivityCriteria criteria) = 0;
    [[nodiscard]] virtual ActivityCriteria criteria() const = 0;
};

/// Runs activities when they are due and their criteria hold.
///
/// A registered activity is called once in the state CheckIn, then in the state Run for every run. A handler that
/// returns in the state Run is done; one that moved to Continue says when it is done or deferred. A repeating activity
/// is then due `interval` after its run began; a deferred one again soon. Due times are kept on disk under the
/// identifier, so that a daemon that is started and killed often still runs its activities, and none more often; no
/// activity runs earlier than its delay after its registration.
///
/// Handlers are called on a worker thread. Any thread.
class ActivityScheduler {
public:
    using Handler = std::function<void(const std::shared_ptr<Activity>&)>;
    virtual ~ActivityScheduler() = default;
    /// Registers, in place of an activity of that name.
    virtual void registerActivity(const std::string& identifier, ActivityCriteria criteria, Handler handler) = 0;
    /// Forgets the activity; a run under way ends on its own.
    virtual void unregister(const std::string& identifier) = 0;
};

[[nodiscard]] std::unique_ptr<ActivityScheduler> makeActivityScheduler();

} // namespace platform
