#pragma once

#include <functional>
#include <string>
#include <vector>

#include "platform/device/DataDetectorStore.h"
#include "platform/device/Device.h"
#include "platform/device/DeviceProfile.h"
#include "platform/device/InstalledApplications.h"
#include "platform/device/LocaleSource.h"
#include "platform/device/LocationSource.h"
#include "platform/device/MemoryPressure.h"
#include "platform/device/ProcessIdentity.h"
#include "platform/device/SubscriptionServices.h"
#include "platform/device/SystemNotifier.h"
#include "platform/files/Counters.h"
#include "platform/files/UserDefaults.h"
#include "platform/net/NetworkStatus.h"
#include "platform/run/NotificationCenter.h"
#include "platform/run/Transactions.h"
#include "tests/support/BackgroundLoads.h"
#include "tests/support/ByHand.h"
#include "tests/support/FakeActivities.h"
#include "tests/support/FakeIpc.h"
#include "tests/support/FakeUrlLoader.h"
#include "tests/support/LogCapture.h"
#include "tests/support/MemoryFiles.h"

namespace platform::test {

struct FakeLocale final : LocaleSource {
    LocaleContext context;
    std::string zone = "Europe/Zurich";
    std::string inputMode;
    std::function<void(Change)> handler;
    LocaleContext locale() override { return context; }
    std::string timeZone() override { return zone; }
    std::string keyboardInputMode() override { return inputMode; }
    std::string defaultInputMode() override { return "en_US@layout=default"; }
    void onChange(std::function<void(Change)> newHandler) override { handler = std::move(newHandler); }
};

struct FakeLocation final : LocationSource {
    std::set<std::string> allowed;
    int updatesRequested = 0;
    std::optional<Location> place;
    Handler handler;
    void setAllowedSources(std::set<std::string> sources) override { allowed = std::move(sources); }
    std::optional<Location> current() override { return place; }
    void requestUpdate() override { ++updatesRequested; }
    void onChange(Handler newHandler) override { handler = std::move(newHandler); }
    void moveTo(std::optional<Location> location);
};

struct FakeProfile final : DeviceProfileSource {
    DeviceProfile current;
    std::vector<std::function<void(const DeviceProfile&)>> handlers;
    DeviceProfile profile() override { return current; }
    void onChange(std::function<void(const DeviceProfile&)> handler) override
    {
        handlers.push_back(std::move(handler));
    }
    void change(DeviceProfile profile);
};

struct FakeApplications final : InstalledApplications {
    std::vector<InstalledApplication> installed;
    int readings = 0;
    std::function<void()> onReading; ///< what happens meanwhile
    std::function<void()> handler;
    std::vector<InstalledApplication> applications() override
    {
        ++readings;
        if (onReading) onReading();
        return installed;
    }
    void onChange(std::function<void()> newHandler) override { handler = std::move(newHandler); }
};

struct FakeSubscriptions final : SubscriptionServices {
    Result<std::map<std::string, Value>> services;
    SubscriptionQuery asked;
    std::function<void()> handler;
    Result<std::map<std::string, Value>> activeServices(const SubscriptionQuery& query) override
    {
        asked = query;
        return services;
    }
    void onChange(std::function<void()> newHandler) override { handler = std::move(newHandler); }
};

struct FakeProcesses final : ProcessIdentity {
    std::map<pid_t, std::string> applications;
    std::map<pid_t, std::string> paths;
    std::optional<std::string> applicationId(pid_t pid) override;
    Result<std::string> executablePath(pid_t pid) override;
};

struct FakeMemoryPressure final : MemoryPressure {
    int watchers = 0;
    std::unique_ptr<Watch> watch(std::function<void()> critical) override;
    void raise() { center.post({.name = "critical"}); }

private:
    struct Registration;
    NotificationCenter center;
};

struct FakeNotifier final : SystemNotifier {
    std::vector<std::string> posted;
    void post(const std::string& name) override { posted.push_back(name); }
};

/// A device of twins, on one thread. Its files are in memory, its settings nowhere; or both are in a directory of
/// another file system.
struct TestDevice : ByHand {
    explicit TestDevice(FileSystem* disk = nullptr, std::filesystem::path root = "/");
    ~TestDevice();

    MemoryFiles files;
    FileSystem& disk;
    const std::filesystem::path root;
    UserDefaults userDefaults =
        &disk == &files ? UserDefaults() : UserDefaults(disk, root / "config/settings.json", makeQueue("settings"));
    UserDefaults lookupDefaults;
    NotificationCenter notifications;
    CounterStore counters{disk, root / "state/counters.json", makeQueue("counters")};
    Transactions transactions;
    FakeLocale locale;
    FakeLocation location;
    FakeProfile profile;
    FakeApplications applications;
    FakeSubscriptions subscriptions;
    std::unique_ptr<DataDetectorStore> dataDetectors = makeDataDetectorStore(disk, root / "data/data-detectors");
    FakeProcesses processes;
    FakeMemoryPressure memoryPressure;
    FakeNotifier notifier;
    FakeUrlLoader loader;
    NetworkStatus network; ///< nothing is known until a test sets it
    BackgroundLoads background{disk, root, clock, executor};
    FakeActivityScheduler activities;
    FakeTransport ipc{executor, clock};
    Device device{.clock = clock,
                  .executor = executor,
                  .mainExecutor = executor,
                  .files = disk,
                  .directories = {.caches = root / "caches",
                                  .config = root / "config",
                                  .state = root / "state",
                                  .data = root / "data",
                                  .runtime = root / "run",
                                  .temporary = root / "tmp"},
                  .userDefaults = userDefaults,
                  .lookupDefaults = lookupDefaults,
                  .notifications = notifications,
                  .counters = counters,
                  .transactions = transactions,
                  .locale = locale,
                  .location = location,
                  .profile = profile,
                  .applications = applications,
                  .subscriptions = subscriptions,
                  .dataDetectors = *dataDetectors,
                  .processes = processes,
                  .memoryPressure = memoryPressure,
                  .systemNotifier = notifier,
                  .urlLoader = loader,
                  .network = network,
                  .backgroundSessions = background,
                  .activities = activities,
                  .ipc = ipc};
};

} // namespace platform::test
