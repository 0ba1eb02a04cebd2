#include "platform/SystemDevice.h"

#include <cstdlib>
#include <sys/resource.h>

#include <systemd/sd-daemon.h>

#include "platform/ActivityScheduler.h"
#include "platform/BackgroundSession.h"
#include "platform/Clock.h"
#include "platform/Counters.h"
#include "platform/DataDetectorStore.h"
#include "platform/Device.h"
#include "platform/DeviceProfile.h"
#include "platform/DeviceUse.h"
#include "platform/InstalledApplications.h"
#include "platform/Ipc.h"
#include "platform/LocaleSource.h"
#include "platform/LocationSource.h"
#include "platform/MemoryPressure.h"
#include "platform/NetworkStatus.h"
#include "platform/NotificationCenter.h"
#include "platform/Process.h"
#include "platform/RunLoop.h"
#include "platform/SubscriptionServices.h"
#include "platform/Transactions.h"
#include "platform/UrlSession.h"
#include "platform/UserDefaults.h"

namespace platform {

namespace {

/// What the service manager started this process for: a timer, or else the names of its sockets.
std::vector<std::string> launchEvents()
{
    if (const char* unit = std::getenv("TRIGGER_UNIT"); unit && *unit) return {unit};
    char** names = nullptr;
    std::vector<std::string> events;
    const int count = sd_listen_fds_with_names(false, &names);
    for (int i = 0; i < count; ++i) {
        events.emplace_back(names[i]);
        std::free(names[i]);
    }
    std::free(names);
    return events;
}

/// The user's and the system's, in the order in which they are looked through.
std::vector<std::filesystem::path> dataDirectories(const Directories& directories)
{
    std::vector<std::filesystem::path> all = directories.systemData;
    all.insert(all.begin(), directories.data);
    return all;
}

} // namespace

struct SystemDevice::Impl {
    Impl(RunLoop& runLoop, const std::string& name, const std::string& sharedSuite)
        : clock(makeSystemClock(runLoop)),
          storeQueue(Queue::make(name + ".store", Queue::Kind::Serial, pool, *clock, Priority::Background)),
          files(makeSystemFiles()), directories(Directories::fromEnvironment()),
          userDefaults(*files, directories.config / (name + ".json"), storeQueue),
          lookupDefaults(*files, directories.config / (sharedSuite + ".json"), storeQueue),
          counters(*files, directories.state / name / "counters.json", storeQueue), locale(makeLocaleSource(runLoop)),
          location(makeGeoClueLocationSource(runLoop)),
          profile(makeDeviceProfileSource(*files, directories.config / name / "device.json", runLoop)),
          applications(makeInstalledApplications(*files, dataDirectories(directories), runLoop, *clock)),
          subscriptions(makeSubscriptionServices(*files, directories.config / name / "subscriptions.d", runLoop, *clock)),
          dataDetectors(makeDataDetectorStore(*files, directories.data / name / "data-detectors")),
          processes(makeProcessIdentity()), memoryPressure(makeMemoryPressure(runLoop)),
          notifier(makeSessionBusNotifier(runLoop)),
          ipc(ipc::makeBusTransport(runLoop, pool, *clock, directories.runtime / name)), loader(makeCurlLoader()),
          network(makeNetworkManagerStatus(runLoop)),
          backgroundSessions(makeBackgroundSessions({.loader = *loader,
                                                     .network = *network,
                                                     .clock = *clock,
                                                     .executor = pool,
                                                     .directory = directories.state / name / "transfers",
                                                     .temporary = directories.temporary})),
          deviceUse(makeSystemDeviceUse(runLoop)),
          activities(makeActivityScheduler({.clock = *clock,
                                            .executor = pool,
                                            .files = *files,
                                            .use = *deviceUse,
                                            .file = directories.state / name / "activities.json"})),
          device{.clock = *clock,
                 .executor = pool,
                 .mainExecutor = runLoop,
                 .files = *files,
                 .directories = directories,
                 .userDefaults = userDefaults,
                 .lookupDefaults = lookupDefaults,
                 .notifications = notifications,
                 .counters = counters,
                 .transactions = transactions,
                 .locale = *locale,
                 .location = *location,
                 .profile = *profile,
                 .applications = *applications,
                 .subscriptions = *subscriptions,
                 .dataDetectors = *dataDetectors,
                 .processes = *processes,
                 .memoryPressure = *memoryPressure,
                 .systemNotifier = *notifier,
                 .urlLoader = *loader,
                 .network = *network,
                 .backgroundSessions = *backgroundSessions,
                 .activities = *activities,
                 .ipc = *ipc}
    {
        device.launchEvents = launchEvents();
        device.makeQueues();
        userDefaults.watch(runLoop);
        lookupDefaults.watch(runLoop);
    }

    WorkerPool pool;
    std::unique_ptr<Clock> clock;
    std::shared_ptr<Queue> storeQueue;
    std::unique_ptr<FileSystem> files;
    Directories directories;
    UserDefaults userDefaults;
    UserDefaults lookupDefaults;
    NotificationCenter notifications;
    CounterStore counters;
    Transactions transactions;
    std::unique_ptr<LocaleSource> locale;
    std::unique_ptr<LocationSource> location;
    std::unique_ptr<DeviceProfileSource> profile;
    std::unique_ptr<InstalledApplications> applications;
    std::unique_ptr<SubscriptionServices> subscriptions;
    std::unique_ptr<DataDetectorStore> dataDetectors;
    std::unique_ptr<ProcessIdentity> processes;
    std::unique_ptr<MemoryPressure> memoryPressure;
    std::unique_ptr<SystemNotifier> notifier;
    std::unique_ptr<ipc::Transport> ipc;
    std::unique_ptr<UrlLoader> loader;
    std::unique_ptr<NetworkStatus> network;
    std::unique_ptr<BackgroundSessions> backgroundSessions;
    std::unique_ptr<DeviceUseSource> deviceUse;
    std::unique_ptr<ActivityScheduler> activities;
    Device device;
};

namespace {

/// Every client takes a descriptor, and the usual soft limit is made for select(), which is used nowhere here.
void raiseDescriptorLimit()
{
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
    limit.rlim_cur = limit.rlim_max;
    setrlimit(RLIMIT_NOFILE, &limit);
}

} // namespace

SystemDevice::SystemDevice(RunLoop& runLoop, const std::string& name, const std::string& sharedSuite)
{
    raiseDescriptorLimit();
    _impl = std::make_unique<Impl>(runLoop, name, sharedSuite);
}

SystemDevice::~SystemDevice() = default;

Device& SystemDevice::device()
{
    return _impl->device;
}

} // namespace platform
