#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <string>

#include "platform/base/Date.h"
#include "platform/values/Value.h"

namespace platform {

class Clock;
class DeviceUseSource;
class Executor;
class FileSystem;

/// When an activity may run. Durations are clamped to one year.
struct ActivityCriteria {
    bool repeating = false;
    Duration delay{};       ///< least time from the registration to the first run
    Duration gracePeriod{}; ///< how long a due run may wait to run together with others
    Duration interval{};    ///< from run to run of a repeating activity; at least one second
    bool allowBattery = true;
    bool maintenance = false;        ///< runs at background priority
    bool requireScreenSleep = false; ///< runs only while nobody uses the screen
    bool requireFirstUnlock = false; ///< runs only after the user has unlocked the device once since it started
};

enum class ActivityState : int { CheckIn = 0, Wait = 1, Run = 2, Defer = 3, Continue = 4, Done = 5 };

/// One call of a registered activity's handler. Any thread.
class Activity {
public:
    virtual ~Activity() = default;
    [[nodiscard]] virtual const std::string& identifier() const = 0;
    [[nodiscard]] virtual ActivityState state() const = 0;
    /// Changes the state from Run to Continue, Defer or Done, or from Continue to Defer or Done. Returns false and does
    /// nothing for any other change.
    virtual bool setState(ActivityState state) = 0;
    /// Returns true if the criteria no longer hold by the last known use of the device. Requests an update of the use
    /// for the next call.
    [[nodiscard]] virtual bool shouldDefer() const = 0;
    /// Replaces the criteria in the state CheckIn; does nothing in other states.
    virtual void setCriteria(ActivityCriteria criteria) = 0;
    [[nodiscard]] virtual ActivityCriteria criteria() const = 0;
};

/// Runs activities when they are due and their criteria hold.
///
/// The handler of a registered activity is called once in the state CheckIn, then in the state Run for every run. The
/// run is done if the handler returns in the state Run. If it set Continue, it sets Done or Defer later; releasing the
/// activity counts as Done. A repeating activity is next due `interval` after the start of its run; a deferred one, and
/// one whose criteria don't hold, in five minutes. An activity that doesn't repeat is removed after its run.
///
/// Due times are saved on disk under the identifier before a run starts: a daemon that is often started and killed
/// runs its activities as often as one that keeps running. They are values of `LivedTime`, so that setting the system
/// clock changes nothing. No activity runs earlier than its delay after its registration.
///
/// The only wake-up is a timer for the next due activity. Handlers run on worker threads. Any thread.
class ActivityScheduler {
public:
    using Handler = std::function<void(const std::shared_ptr<Activity>&)>;
    virtual ~ActivityScheduler() = default;
    /// Registers an activity; replaces one with the same identifier.
    virtual void registerActivity(const std::string& identifier, ActivityCriteria criteria, Handler handler) = 0;
    /// Removes the activity and its due time. A run in progress is not stopped.
    virtual void unregister(const std::string& identifier) = 0;
    /// Passes a description of each activity to `callback`, on a worker: {"identifier", "state", "inSeconds" until it
    /// is due}, and for one that was put off "waitsFor": "power", "screen sleep", "first login" or "itself". "state" is
    /// "waiting", "running" or "starting".
    virtual void describe(std::move_only_function<void(Value::Array)> callback) = 0;
};

/// The services that the scheduler uses. All must outlive it.
struct ActivityEnvironment {
    Clock& clock;
    Executor& executor;
    FileSystem& files;
    DeviceUseSource& use;
    std::filesystem::path file; ///< has the due times; read with the first registration, created with the first run
};

/// Returns a scheduler. Destroying it cancels its timer; running handlers are not interrupted.
[[nodiscard]] std::unique_ptr<ActivityScheduler> makeActivityScheduler(ActivityEnvironment environment);

} // namespace platform
