#include "tavrind/Startup.h"

#include <cstdlib>
#include <random>

#include "CoreTavrin/TAVProtocols.h"
#include "platform/base/Log.h"
#include "platform/device/Device.h"
#include "platform/files/UserDefaults.h"
#include "platform/net/BackgroundSession.h"
#include "platform/net/UrlSession.h"
#include "platform/run/NotificationCenter.h"
#include "tavrind/AppWhitelistController.h"
#include "tavrind/BackgroundActivitiesManager.h"
#include "tavrind/ClientStateManager.h"
#include "tavrind/DownloadManager.h"
#include "tavrind/Lookup.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinDPAppDeepLinkIngester.h"
#include "tavrind/TavrinDPPeriodicTaskManager.h"
#include "tavrind/TavrinFeedbackFlusher.h"
#include "tavrind/TavrinPersistentStorage.h"
#include "tavrind/TavrinService.h"
#include "tavrind/TavrinSubscriptionManager.h"
#include "tavrind/TAVTracing.h"

namespace tavrin {

namespace {

using namespace std::chrono_literals;

platform::UrlSessionConfiguration foregroundConfiguration(const Assembly& assembly)
{
    const platform::Device& device = assembly.device;
    return {.allowFastOpenAndTickets = !device.userDefaults.boolean("TAVNoParallax"),
            .pipelining = true,
            .meteredPurgeTimeout = 10s,
            .network = &device.network,
            .caFile = assembly.caFile,
            .cache = platform::HttpCacheConfiguration{
                .memoryCapacity = 1u << 20,
                .diskCapacity = 100u << 20,
                .minimumMappedSize = 16384,
                .directory = device.directories.caches / "com.quorvane.tavrind" / "http",
                .files = &device.files,
                .queue = device.serialQueue("com.quorvane.tavrind.httpCache", rank::kContext),
                .clock = &device.clock}};
}

} // namespace

platform::BackgroundSessionConfiguration downloadConfiguration(std::string caFile)
{
    return {.identifier = "com.quorvane.tavrind",
            .allowsMetered = false,
            .resourceTimeout = 24h,
            .caFile = std::move(caFile),
            .rank = rank::kContext};
}

platform::BackgroundSessionConfiguration uploadConfiguration(std::string caFile)
{
    return {.identifier = "com.quorvane.tavrind.flusher.nsurlsession",
            .requestTimeout = 300s,
            .resourceTimeout = std::chrono::days(7),
            .caFile = std::move(caFile),
            .rank = rank::kContext};
}

Daemon::Daemon(platform::Device& device) : assembly(device) {}
Daemon::~Daemon() = default;

platform::Result<std::unique_ptr<Daemon>> startUp(platform::Device& device, StartOptions options)
{
    TAVTracingSetup(device.userDefaults);
    if (device.userDefaults.boolean("TAVLogPrivateData")) platform::Log::privateData = true;
    device.userDefaults.registerDefaults({{"TAVSharedSession", true},
                                          {"TAVSessionSizeLimit", kDefaultMaxFileSize},
                                          {"TAVSessionMaxAge", kDefaultMaxFileAge}});

    auto daemon = std::make_unique<Daemon>(device);
    Assembly& assembly = daemon->assembly;
    if (const char* authorities = std::getenv("SSL_CERT_FILE")) assembly.caFile = authorities; // as OpenSSL
    const auto sessionQueue = [&](const char* label) { return device.concurrentQueue(label, rank::kRoot); };

    assembly.urlSession = device.urlLoader.makeSession(foregroundConfiguration(assembly),
                                                       sessionQueue("com.quorvane.tavrind.urlSession"));
    assembly.requestFactory = TAVNetworkRequestFactory::make(assembly);
    assembly.subscriptionManager = TavrinSubscriptionManager::make(assembly, assembly.requestFactory);
    assembly.downloadManager = DownloadManager::make(assembly);
    assembly.persistentStorage = TavrinPersistentStorage::make(assembly);
    assembly.crowdsourcingFeedbackFlusher = TavrinFeedbackFlusher::make(assembly, FlusherIdentity::Crowdsourcing);
    assembly.backgroundFlusher = BackgroundActivitiesManager::make(assembly);
    assembly.downloadURLSession =
        device.backgroundSessions.make(downloadConfiguration(assembly.caFile), assembly.downloadManager,
                                       device.serialQueue("com.quorvane.tavrind.downloadSession", rank::kRoot));
    assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.launch");
    assembly.bagSession = device.urlLoader.makeSession(
        {.meteredPurgeTimeout = 10s, .network = &device.network, .caFile = assembly.caFile},
        sessionQueue("com.quorvane.tavrind.bagSession"));
    assembly.uploadURLSession =
        device.backgroundSessions.make(uploadConfiguration(assembly.caFile), assembly.backgroundFlusher,
                                       device.serialQueue("com.quorvane.tavrind.uploadSession", rank::kRoot));
    assembly.backgroundFlusher->findUploads();
    assembly.lookup = Lookup::make(assembly);
    assembly.bagController = TavrinBagController::make(assembly);
    assembly.clientStateManager = ClientStateManager::make(assembly);
    assembly.appWhitelistController = AppWhitelistController::make(assembly);
    assembly.periodicTaskManager = std::make_shared<TavrinDPPeriodicTaskManager>(assembly);
    daemon->deepLinkIngester = std::make_shared<TavrinDPAppDeepLinkIngester>(assembly, std::random_device()());
    daemon->deepLinkIngester->scheduleMaintenance();
    daemon->service = TavrinService::make(assembly, std::move(options));

    auto listener = device.ipc.listen(daemonInterface(), "com.quorvane.tavrind.connection");
    if (!listener) {
        // Running tasks refer to the services, so these are never destroyed.
        (void)daemon.release();
        return std::unexpected(std::move(listener.error()));
    }
    daemon->listener = std::move(*listener);
    daemon->listener->setAcceptor([service = daemon->service](std::shared_ptr<platform::ipc::Connection> connection) {
        service->listenerShouldAcceptNewConnection(std::move(connection));
    });
    daemon->listener->resume();

    const auto launchEventQueue = device.serialQueue("com.quorvane.tavrind.xpc_event", rank::kRoot);
    for (const std::string& event : device.launchEvents)
        launchEventQueue->async([event] { platform::defaultLog().log("launch event for {}", event); });

    device.globalQueue(platform::Priority::Background)->async([bagController = assembly.bagController] {
        (void)bagController->currentBag(); // starts the first load
    });
    device.globalQueue(platform::Priority::Default)->async([&notifications = assembly.notificationCenter] {
        notifications.post({.name = "TAVStartup"});
    });
    return daemon;
}

} // namespace tavrin
