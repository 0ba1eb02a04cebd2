#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

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

/// A resource's file was replaced: "identifier" (std::string) and "url" (std::filesystem::path, the file).
inline constexpr const char* TAVFileDownloadCompletedNotification = "TAVFileDownloadCompletedNotification";
/// A resource was deleted, or must be fetched again for another place: "identifier".
inline constexpr const char* TAVFileDeletedNotification = "TAVFileDeletedNotification";

/// What the download manager needs to know of lookup hints, from whoever installs them. Any thread.
class LookupResources {
public:
    virtual ~LookupResources() = default;
    [[nodiscard]] virtual bool lookupEnabled() const = 0;
    /// The version of the hints at a URL; nothing if the URL has none.
    [[nodiscard]] virtual std::optional<std::string> signatureFromURL(const platform::Url& url) const = 0;
};

/// Keeps a local copy of each resource file that the bag lists.
///
/// Every bag cancels the downloads that are under way and checks each resource for a reason to be downloaded
/// (`downloadReason`). A download starts 60 s later (the user default "TAVDownloadDelay", if it is set), if the reason
/// still holds; a bag that comes meanwhile updates its URL. The session has a day to carry it out, across restarts: a
/// download of an earlier process goes on until there is a bag, which may be the one on disk; what has arrived by then
/// is installed all the same. An answer of status 200 replaces the file in one step, 304 leaves it; only then is the
/// resource's URL noted, so a download that failed has its reason again with the next bag. A resource that the bag no
/// longer lists is deleted.
///
/// Any thread.
class DownloadManager : public platform::BackgroundSessionDelegate,
                        public std::enable_shared_from_this<DownloadManager> {
public:
    /// Begins to follow the bag.
    static std::shared_ptr<DownloadManager> make(Assembly& assembly);
    explicit DownloadManager(Assembly& assembly);
    ~DownloadManager() override;

    /// Until this is called, lookups count as enabled, and their hints have no version.
    void setLookupResources(std::weak_ptr<LookupResources> lookupResources);

    /// What the last change left; never waits for one that is under way.
    [[nodiscard]] std::optional<DownloadResource> resourceForKey(const std::string& identifier) const;
    /// Resource identifier to version, for resources that have a version. Never waits either: every new session asks.
    [[nodiscard]] platform::Dictionary resourceVersions() const;

    struct Resource {
        platform::FileHandle file;
        platform::Value attributes; ///< dictionary: "size" (bytes), "modified" and "created" (dates)
    };
    /// Returns a handle of its own for each call, which keeps reading the same file when that is replaced. Fails with
    /// error 404 if the resource isn't there, and 500 if it can't be read.
    [[nodiscard]] platform::Result<Resource> fileHandleForResource(const std::string& identifier) const;

    // From the download session, on its delegate queue.
    void taskDidFinishDownloading(const std::shared_ptr<platform::BackgroundTask>& task,
                                  const std::filesystem::path& file, const platform::UrlResponse& response) override;
    void taskDidComplete(const std::shared_ptr<platform::BackgroundTask>& task,
                         const std::optional<platform::UrlResponse>& response,
                         const std::optional<platform::Error>& error) override;

private:
    enum class File { Keep, Remove };
    /// A download whose delay runs.
    struct Pending {
        platform::Url url;       ///< the latest; a later bag may replace it
        std::uint64_t timer = 0; ///< a timer of another number was called off
    };
    /// What any thread may read: replaced whole, never changed.
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
    [[nodiscard]] platform::Duration _delay() const;
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
    mutable std::mutex _publishedMutex;
    std::shared_ptr<const Published> _published; // under the mutex, any thread
    std::once_flag _started;                     // any thread
    platform::NotificationCenter::Token _bagObserver;
    platform::NotificationCenter::Token _locationObserver;
};

} // namespace tavrin
