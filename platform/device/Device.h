#pragma once

#include <array>
#include <memory>
#include <string>
#include <vector>

#include "platform/device/SystemNotifier.h"
#include "platform/files/Files.h"
#include "platform/run/Queue.h"

namespace platform {

class ActivityScheduler;
class BackgroundSessions;
class Clock;
class CounterStore;
class DataDetectorStore;
class DeviceProfileSource;
class InstalledApplications;
class LocaleSource;
class LocationSource;
class MemoryPressure;
class NetworkStatus;
class NotificationCenter;
class ProcessIdentity;
class RunLoop;
class SubscriptionServices;
class SystemNotifier;
class Transactions;
class UrlLoader;
class UserDefaults;
namespace ipc {
class Transport;
}

/// The device that the daemon runs on: everything that services need from outside, by role.
///
/// Constant after its creation: any thread may read it. The creator owns the parts, which must outlive every service.
/// `SystemDevice` is the real one; tests/support has one of fakes.
struct Device {
    Clock& clock;
    Executor& executor;     ///< worker threads
    Executor& mainExecutor; ///< the main thread's run loop
    FileSystem& files;
    Directories directories;
    UserDefaults& userDefaults;   ///< the daemon's own suite
    UserDefaults& lookupDefaults; ///< the suite shared with lookup clients
    NotificationCenter& notifications;
    CounterStore& counters;
    Transactions& transactions;
    LocaleSource& locale;
    LocationSource& location;
    DeviceProfileSource& profile;
    InstalledApplications& applications;
    SubscriptionServices& subscriptions;
    DataDetectorStore& dataDetectors;
    ProcessIdentity& processes;
    MemoryPressure& memoryPressure;
    SystemNotifier& systemNotifier;
    UrlLoader& urlLoader;
    NetworkStatus& network;
    BackgroundSessions& backgroundSessions;
    ActivityScheduler& activities;
    ipc::Transport& ipc;
    std::vector<std::string> launchEvents{}; ///< the units or sockets for which the process was started

    [[nodiscard]] std::shared_ptr<Queue> serialQueue(std::string label, Rank rank,
                                                     Priority priority = Priority::Default) const;
    [[nodiscard]] std::shared_ptr<Queue> concurrentQueue(std::string label, Rank rank,
                                                         Priority priority = Priority::Default) const;
    /// Returns the shared concurrent queue of a priority, for work that guards no state.
    [[nodiscard]] std::shared_ptr<Queue> globalQueue(Priority priority) const;
    /// Returns a queue whose tasks run on the main thread.
    [[nodiscard]] std::shared_ptr<Queue> mainQueue() const;

    std::array<std::shared_ptr<Queue>, 3> globalQueues{}; ///< by Priority; set by makeQueues
    std::shared_ptr<Queue> main{};
    /// Creates the queues above. The creator of a Device calls it once.
    void makeQueues();
};

} // namespace platform
