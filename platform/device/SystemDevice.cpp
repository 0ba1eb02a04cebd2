#include "platform/device/SystemDevice.h"

#include <cstdlib>
#include <sys/resource.h>

#include <systemd/sd-daemon.h>

#include "platform/device/ActivityScheduler.h"
#include "platform/device/DataDetectorStore.h"
#include "platform/device/Device.h"
#include "platform/device/DeviceProfile.h"
#include "platform/device/DeviceUse.h"
#include "platform/device/DeviceUseLogind.h"
#include "platform/device/InstalledApplications.h"
#include "platform/device/LocaleSource.h"
#include "platform/device/LocaleSourceIcu.h"
#include "platform/device/LocationSource.h"
#include "platform/device/LocationSourceGeoClue.h"
#include "platform/device/MemoryPressure.h"
#include "platform/device/MemoryPressurePsi.h"
#include "platform/device/ProcessIdentity.h"
#include "platform/device/SubscriptionServices.h"
#include "platform/device/SystemNotifier.h"
#include "platform/device/SystemNotifierSessionBus.h"
#include "platform/files/Counters.h"
#include "platform/files/Files.h"
#include "platform/files/UserDefaults.h"
#include "platform/ipc/BusTransport.h"
#include "platform/ipc/Ipc.h"
#include "platform/net/BackgroundSession.h"
#include "platform/net/NetworkStatus.h"
#include "platform/net/NetworkStatusNetworkManager.h"
#include "platform/net/UrlSession.h"
#include "platform/net/UrlSessionCurl.h"
#include "platform/run/Clock.h"
#include "platform/run/NotificationCenter.h"
#include "platform/run/RunLoop.h"
#include "platform/run/SystemClock.h"
#include "platform/run/Transactions.h"
#include "platform/run/WorkerPool.h"

namespace platform {

namespace {

/// Returns why the service manager started this process: the timer unit, else the names of the sockets.
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

/// Returns the data directories in order of precedence: the user's, then the system's.
std::vector<std::filesystem::path> dataDirectories(const Directories& directories)
{
    std::vector<std::filesystem::path> all = directories.systemData;
    all.insert(all.begin(), directories.data);
    return all;
}

} // namespace

struct SystemDevice::Impl {
    Impl(RunLoop& runLoop, const DeviceNames& names)
        : clock(makeSystemClock(runLoop)), storeQueue(Queue::make(names.service + ".store", Queue::Kind::Serial, pool,
                                                                  *clock, Rank::Root, Priority::Background)),
          files(makeSystemFiles()), directories(Directories::fromEnvironment()),
          userDefaults(*files, directories.config / (names.service + ".json"), storeQueue),
          lookupDefaults(*files, directories.config / (names.sharedSuite + ".json"), storeQueue),
          counters(*files, directories.state / names.service / "counters.json", storeQueue),
          locale(makeLocaleSource(runLoop, names.etc)), location(makeGeoClueLocationSource(runLoop, names.service)),
          profile(makeDeviceProfileSource(*files, directories.config / names.service / "device.json", runLoop)),
          applications(makeInstalledApplications(*files, dataDirectories(directories), runLoop, pool, *clock)),
          subscriptions(makeSubscriptionServices(*files, directories.config / names.service / "subscriptions.d",
                                                 runLoop, *clock)),
          dataDetectors(makeDataDetectorStore(*files, directories.data / names.service / "data-detectors")),
          processes(makeProcessIdentity()), memoryPressure(makeMemoryPressure(runLoop)),
          notifier(makeSessionBusNotifier(runLoop, names.objectPath, names.notifyInterface)),
          ipc(ipc::makeBusTransport(runLoop, pool, *clock, directories.runtime / names.service)),
          loader(makeCurlLoader(pool, *clock)), network(makeNetworkManagerStatus(runLoop, *clock)),
          backgroundSessions(makeBackgroundSessions({.files = *files,
                                                     .loader = *loader,
                                                     .network = *network,
                                                     .clock = *clock,
                                                     .executor = pool,
                                                     .directory = directories.state / names.service / "transfers",
                                                     .temporary = directories.temporary})),
          deviceUse(makeSystemDeviceUse(runLoop)),
          activities(makeActivityScheduler({.clock = *clock,
                                            .executor = pool,
                                            .files = *files,
                                            .use = *deviceUse,
                                            .file = directories.state / names.service / "activities.json"})),
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
        // An installer or an application may have created these directories with a wider mode.
        for (const auto* parent : {&directories.caches, &directories.config, &directories.state, &directories.data})
            makePrivate(*parent / names.service);
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

/// Raises the soft limit, because every client takes a descriptor. The usual limit exists for select(2), which this
/// program doesn't use.
void raiseDescriptorLimit()
{
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
    limit.rlim_cur = limit.rlim_max;
    setrlimit(RLIMIT_NOFILE, &limit);
}

} // namespace

SystemDevice::SystemDevice(RunLoop& runLoop, const DeviceNames& names)
{
    raiseDescriptorLimit();
    _impl = std::make_unique<Impl>(runLoop, names);
}

SystemDevice::~SystemDevice() = default;

Device& SystemDevice::device()
{
    return _impl->device;
}

} // namespace platform
