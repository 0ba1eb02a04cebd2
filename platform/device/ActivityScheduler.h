#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <string>

#include "platform/base/Date.h"

namespace platform {

class Clock;
class DeviceUseSource;
class Executor;
class FileSystem;

/// When an activity may run. Spans are a year at most.
struct ActivityCriteria {
    bool repeating = false;
    Duration delay{};       ///< from the registration to the first run, at least
    Duration gracePeriod{}; ///< how long after it is due a run may wait for company
    Duration interval{};    ///< from run to run, for a repeating activity; a second at least
    bool allowBattery = true;
    bool maintenance = false;        ///< work that nobody waits for: at background priority
    bool requireScreenSleep = false; ///< only while the device isn't used
    bool requireFirstUnlock = false; ///< only once the user has unlocked the device since it started
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
    /// Whether the criteria that let the run begin no longer hold, as last heard; the device is asked again for the
    /// next call.
    [[nodiscard]] virtual bool shouldDefer() const = 0;
    /// In the state CheckIn: replaces the criteria.
    virtual void setCriteria(ActivityCriteria criteria) = 0;
    [[nodiscard]] virtual ActivityCriteria criteria() const = 0;
};

/// Runs activities when they are due and their criteria hold.
///
/// A registered activity is called once in the state CheckIn, then in the state Run for every run. A handler that
/// returns in the state Run is done; one that moved to Continue says when it is done or deferred, and is taken as done
/// once nobody holds the activity any more. A repeating activity is then due `interval` after its run began; a deferred
/// one, and one whose criteria don't hold, again in five minutes. An activity that doesn't repeat is forgotten after
/// its run.
///
/// Due times are kept on disk under the identifier, written before a run begins: a daemon that is started and killed
/// often still runs its activities, and no more often. They are counts of `LivedTime`: setting the system clock neither
/// delays a run nor brings it forward. No activity runs earlier than its delay after its registration.
///
/// Nothing wakes but a timer for the next activity that is due. Handlers are called on a worker thread. Any thread.
class ActivityScheduler {
public:
    using Handler = std::function<void(const std::shared_ptr<Activity>&)>;
    virtual ~ActivityScheduler() = default;
    /// Registers the activity, in place of one of that name.
    virtual void registerActivity(const std::string& identifier, ActivityCriteria criteria, Handler handler) = 0;
    /// Forgets the activity and its due time; a run under way ends on its own.
    virtual void unregister(const std::string& identifier) = 0;
};

/// What the scheduler works with; all of it must outlive it.
struct ActivityEnvironment {
    Clock& clock;
    Executor& executor;
    FileSystem& files;
    DeviceUseSource& use;
    std::filesystem::path file; ///< keeps the due times; read with the first registration, made with the first run
};

[[nodiscard]] std::unique_ptr<ActivityScheduler> makeActivityScheduler(ActivityEnvironment environment);

} // namespace platform
