#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "platform/base/Mutex.h"
#include "platform/files/Files.h"
#include "platform/net/BackgroundSession.h"
#include "platform/run/NotificationCenter.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"
#include "tavrind/DownloadResource.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
class TAVBag;

/// Posted after a resource's file was replaced, with "identifier" (std::string) and "url" (std::filesystem::path of the
/// file).
inline constexpr const char* TAVFileDownloadCompletedNotification = "TAVFileDownloadCompletedNotification";
/// Posted after a resource was deleted, or is to be fetched again because the location changed, with "identifier".
inline constexpr const char* TAVFileDeletedNotification = "TAVFileDeletedNotification";

/// From a new bag to the download of the resources that it changes.
inline constexpr std::chrono::seconds kDownloadDelay{60};
/// Each download then starts at a random time within this, so that a bag doesn't send all devices for a file at once.
/// The next bag, which cancels downloads, is fetched later than that.
inline constexpr std::chrono::hours kDownloadWindow{1};

/// What the download manager needs to know about lookup hints. Implemented by the service that installs them. Any
/// thread.
class LookupResources {
public:
    virtual ~LookupResources() = default;
    [[nodiscard]] virtual bool lookupEnabled() const = 0;
};

/// Keeps a local copy of each resource file that the bag lists.
///
/// Each new bag cancels the running downloads and checks whether each resource needs a download (`downloadReason`). If
/// so, the download is created 60 s later if the reason still holds then, and starts within `kDownloadWindow`; with the
/// user default "TAVDownloadDelay", in seconds, it starts after exactly that. A bag that arrives before its creation
/// updates the URL. The session carries out a download within a day, across restarts. A download of an earlier process
/// continues until the first bag, which may be the one on disk; if it ends before that, its file is installed. Status
/// 200 replaces the file atomically, and 304 keeps it. Only then is the resource's URL stored, so the next bag repeats
/// a failed download. A resource that the bag no longer lists is deleted.
///
/// Any thread.
class DownloadManager : public platform::BackgroundSessionDelegate,
                        public std::enable_shared_from_this<DownloadManager> {
public:
    /// Creates the manager and starts observing the bag and the location.
    static std::shared_ptr<DownloadManager> make(Assembly& assembly);
    explicit DownloadManager(Assembly& assembly);
    ~DownloadManager() override;

    /// Sets the source of facts about lookup hints. Until then, lookups count as enabled.
    void setLookupResources(std::weak_ptr<LookupResources> lookupResources);

    /// Returns a resource as of the last complete change. Does not block.
    [[nodiscard]] std::optional<DownloadResource> resourceForKey(const std::string& identifier) const;
    /// Returns the versions of the resources that have one, by identifier. Does not block: every new session calls it.
    [[nodiscard]] platform::Dictionary resourceVersions() const;

    struct Resource {
        platform::FileHandle file;
        platform::Value attributes; ///< dictionary: "size" (bytes), "modified" and "created" (dates)
    };
    /// Opens a resource. Each call returns a new handle, which still reads the same content after a replacement. Fails
    /// with error 404 if the resource is missing, and with 500 if it can't be read.
    [[nodiscard]] platform::Result<Resource> fileHandleForResource(const std::string& identifier) const;

    // From the download session, on its delegate queue.
    void taskDidFinishDownloading(const std::shared_ptr<platform::BackgroundTask>& task,
                                  const std::filesystem::path& file, const platform::UrlResponse& response) override;
    void taskDidComplete(const std::shared_ptr<platform::BackgroundTask>& task,
                         const std::optional<platform::UrlResponse>& response,
                         const std::optional<platform::Error>& error) override;

private:
    enum class File { Keep, Remove };
    /// A download that waits for its delay.
    struct Pending {
        platform::Url url;       ///< the latest; a later bag may replace it
        std::uint64_t timer = 0; ///< identifies the valid timer; others were cancelled
    };
    /// A snapshot for any thread. It is replaced as a whole and never modified.
    struct Published {
        DownloadResources resources;
        platform::Dictionary versions;
    };

    void bagChangeNotification(const std::shared_ptr<const TAVBag>& bag);
    void _handleSignificantLocationChange();
    void _start();
    void _loadResources();
    void _saveResources();
    void _publish();
    [[nodiscard]] std::shared_ptr<const Published> _lastPublished() const;
    void _downloadBagResources(const std::shared_ptr<const TAVBag>& bag);
    void _replaceDownloads(const std::vector<std::shared_ptr<platform::BackgroundTask>>& tasks, const TAVBag& bag);
    void _addResource(const std::string& identifier, const std::optional<platform::Url>& url);
    void _deleteResource(const std::string& identifier, File file);
    void _removeFile(const std::string& identifier) const;
    void _startPending(const std::string& identifier, std::uint64_t timer);
    void _downloadResource(const DownloadResource& resource, const platform::Url& url, std::string_view reason);
    [[nodiscard]] platform::UrlRequest _createDownloadRequest(const DownloadResource& resource,
                                                              const platform::Url& url) const;
    [[nodiscard]] std::string _resourceVersion(const DownloadResource& resource) const;
    [[nodiscard]] std::optional<platform::Duration> _configuredDelay() const;
    [[nodiscard]] bool _isAllowed(const std::string& identifier) const;
    [[nodiscard]] bool _fileExists(const std::string& identifier) const;
    [[nodiscard]] platform::Result<std::filesystem::path> _pathToResource(const std::string& identifier) const;
    void _noteReceived(const std::string& identifier, const platform::Value& note, const platform::UrlRequest& request,
                       const platform::UrlResponse& response);

    Assembly& _assembly;
    const std::shared_ptr<platform::Queue> _queue; // all below is confined to it, unless it says otherwise
    DownloadResources _resources;
    std::map<std::string, Pending> _pending; // by identifier
    std::uint64_t _lastTimer = 0;
    std::weak_ptr<LookupResources> _lookupResources;
    mutable platform::Mutex _publishedMutex;
    std::shared_ptr<const Published> _published GUARDED_BY(_publishedMutex); // any thread
    std::once_flag _started;                                                 // any thread
    platform::NotificationCenter::Token _bagObserver;
    platform::NotificationCenter::Token _locationObserver;
};

} // namespace tavrin
