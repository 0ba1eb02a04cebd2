#pragma once

#include <memory>

#include "tavrind/FeedbackBooks.h"
#include "tavrind/TavrinDiagnosticDataReporter.h"

namespace platform {
class BackgroundSession;
struct Device;
class FileSystem;
class NotificationCenter;
class Queue;
class UrlSession;
class UserDefaults;
} // namespace platform

namespace tavrin {

class AppWhitelistController;
class BackgroundActivitiesManager;
class ClientSessionManager;
class ClientStateManager;
class DownloadManager;
class Lookup;
class TAVNetworkRequestFactory;
class TavrinBagController;
class TavrinDPPeriodicTaskManager;
class TavrinFeedbackFlusher;
class TavrinFlusherXPC;
class TavrinPersistentStorage;
class TavrinSubscriptionManager;
class TavrinUserGUIDController;

/// Holds every long-lived service of the daemon.
///
/// Services are made once, in the order of Startup.cpp, and live as long as the assembly. Each takes the assembly and
/// reaches its siblings through it when it needs them; during start-up, siblings that come later are null. After
/// start-up nothing here changes: any thread may read it.
struct Assembly {
    explicit Assembly(platform::Device& device);
    ~Assembly();
    Assembly(const Assembly&) = delete;
    Assembly& operator=(const Assembly&) = delete;

    platform::Device& device;
    TavrinDiagnosticDataReporter diagnosticData;
    FeedbackBooks feedbackBooks;

    std::shared_ptr<platform::UrlSession> urlSession;                ///< foreground: every request of a client
    std::shared_ptr<platform::UrlSession> bagSession;                ///< without caching
    std::shared_ptr<platform::BackgroundSession> downloadURLSession; ///< resources
    std::shared_ptr<platform::BackgroundSession> uploadURLSession;   ///< feedback
    platform::UserDefaults& userDefaults;
    platform::FileSystem& fileManager;
    platform::NotificationCenter& notificationCenter;
    std::shared_ptr<TAVNetworkRequestFactory> requestFactory;
    std::shared_ptr<TavrinBagController> bagController;
    std::shared_ptr<DownloadManager> downloadManager;
    std::shared_ptr<ClientStateManager> clientStateManager;
    std::shared_ptr<BackgroundActivitiesManager> backgroundFlusher;
    std::shared_ptr<TavrinUserGUIDController> guidController;
    std::shared_ptr<ClientSessionManager> clientSessionManager;
    std::shared_ptr<platform::Queue> dateQueue; ///< sessions decide on it which is the day's first
    std::shared_ptr<Lookup> lookup;
    bool sharedSession;         ///< all clients share one session and one GUID
    bool testFeedbacks = false; ///< sessions also keep their feedback in memory
    std::shared_ptr<TavrinSubscriptionManager> subscriptionManager;
    std::shared_ptr<TavrinFeedbackFlusher> crowdsourcingFeedbackFlusher;
    std::shared_ptr<TavrinFlusherXPC> flusherXPCListener;
    std::shared_ptr<AppWhitelistController> appWhitelistController;
    std::shared_ptr<TavrinPersistentStorage> persistentStorage;
    std::shared_ptr<TavrinDPPeriodicTaskManager> periodicTaskManager;
};

} // namespace tavrin
