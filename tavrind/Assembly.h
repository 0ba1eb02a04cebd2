#pragma once

#include <memory>
#include <string>

#include "tavrind/FeedbackBooks.h"
#include "tavrind/RequestFigures.h"
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
/// Services are created once, in the order of Startup.cpp, and live as long as the assembly. Each service reaches the
/// others through the assembly; during start-up, services that are created later are null. The assembly does not change
/// after start-up: any thread may read it.
struct Assembly {
    explicit Assembly(platform::Device& device);
    ~Assembly();
    Assembly(const Assembly&) = delete;
    Assembly& operator=(const Assembly&) = delete;

    platform::Device& device;
    TavrinDiagnosticDataReporter diagnosticData;
    FeedbackBooks feedbackBooks;
    RequestFigures requestFigures;
    std::string caFile; ///< certification authorities that replace the system's; empty: the system's

    std::shared_ptr<platform::UrlSession> urlSession; ///< foreground: every request of a client
    std::shared_ptr<platform::UrlSession> bagSession; ///< without caching; unused, the bag comes on urlSession
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
    std::shared_ptr<platform::Queue> dateQueue; ///< serialises the choice of a client's first session of the day
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
