#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/net/Url.h"
#include "platform/run/NotificationCenter.h"
#include "platform/values/Error.h"

namespace platform {
class Queue;
struct UrlResponse;
} // namespace platform

namespace tavrin {

struct Assembly;
class ClientSession;
class TAVBag;
struct ZRStartNetworkSearchFeedback;

/// Posted, without an object, when a bag is installed ("bag": shared_ptr<const TAVBag>) and when a fetch failed
/// ("bagError": platform::Error). It is posted inside the controller's barrier: observers hand their work on and don't
/// read the controller.
inline constexpr const char* TAVBagChangeNotification = "TAVBagChangeNotification";
/// Posted by the request factory when something changed that the bag depends on.
inline constexpr const char* TAVBagRefreshRequired = "TAVBagRefreshRequired";

/// System-wide names that tell other processes whether the news client may use the service.
inline constexpr const char* kNewsEnabledNotifyName = "com.quorvane.tavrin.news.enabled";
inline constexpr const char* kNewsDisabledNotifyName = "com.quorvane.tavrin.news.disabled";

/// Why a cached bag must be fetched again.
enum class BagStaleness { Fresh, Expired, NoUrl, UrlChanged };

/// Decides by time, then by URL. `expiration` is the moment from which the bag is no longer trusted, in seconds since
/// 1970; none counts as 1970. The bag has expired from 600 s before that moment on, and while that moment is more than
/// four hours ahead, which no fetch makes it. `cachedUrl` is the bag cache request's URL at the time of the fetch;
/// `currentUrl` makes the one of now, and is called only if the time doesn't decide.
[[nodiscard]] BagStaleness bagStaleness(std::optional<double> expiration, const std::string* cachedUrl,
                                        platform::Date now, const std::function<std::string()>& currentUrl);

/// Orders version texts with runs of digits compared as numbers: "9" before "10".
[[nodiscard]] bool versionPrecedes(std::string_view a, std::string_view b);

/// When to fetch for a version that the service announces and that doesn't come with the next bag: the first time at
/// once, then again at intervals that double from one minute to four hours. A higher version is new. Not thread-safe.
class AnnouncedVersion {
public:
    /// Whether to fetch for `version` at `now`, in host ticks. If so, that counts as done.
    [[nodiscard]] bool take(std::string_view version, std::uint64_t now);

private:
    std::string _version;
    platform::Duration _interval{};
    std::uint64_t _due = 0;
};

/// Fetches the bag, keeps one copy in memory and one on disk, and tells the daemon when there is a new one.
///
/// Life: the copy on disk, stale or not, is used from the start. A bag is stale from 3 h 50 min after its fetch on, and
/// when the URL that it was fetched from would be another now; whoever reads a stale bag gets it, and starts a fetch.
/// One fetch runs at a time, for two minutes at most; further ones are dropped. A failed fetch leaves the bag as it
/// was. No timer repeats it: the next reading of the stale bag does.
///
/// Any thread. The assembly must outlive it.
class TavrinBagController : public std::enable_shared_from_this<TavrinBagController> {
public:
    /// Reads the disk cache, and observes TAVBagRefreshRequired of the assembly's request factory.
    static std::shared_ptr<TavrinBagController> make(Assembly& assembly);
    explicit TavrinBagController(Assembly& assembly);
    ~TavrinBagController();

    /// Where a device in `country` fetches its bag.
    [[nodiscard]] platform::Url bagFetchURLWithCountry(const std::string& country) const;

    /// The bag; none starts a fetch.
    [[nodiscard]] std::shared_ptr<const TAVBag> currentBag();
    /// The bag, stale or not; a stale one starts a fetch soon.
    [[nodiscard]] std::shared_ptr<const TAVBag> cachedBagState();
    /// The bag as it is; starts nothing.
    [[nodiscard]] std::shared_ptr<const TAVBag> inMemoryBag() const;
    [[nodiscard]] std::optional<platform::Url> warmURL();

    /// Fetches the version that the service announces, a number under "bag", if the bag in memory precedes it and
    /// `AnnouncedVersion` agrees. Does nothing without a bag or a number.
    void forceFetchBag(const platform::Value& announcement);

    [[nodiscard]] bool fetchInProgress() const { return _fetchInProgress; }

private:
    using Completion = std::move_only_function<void(std::shared_ptr<const TAVBag>, std::optional<platform::Error>)>;
    struct Fetch;
    /// The URL of the bag cache request, and what it was made of: each read of the bag compares it.
    struct CacheUrl {
        std::uint64_t context;
        std::optional<std::string> configured;
        std::string url;
    };

    [[nodiscard]] platform::Value diskCachedBagDictionary();
    [[nodiscard]] platform::Value cacheBagDictionary(const platform::Value& fetched);
    void cacheBagState(std::shared_ptr<const TAVBag> bag, bool fromDisk);
    [[nodiscard]] platform::Result<std::string> _pathToCachedBag();
    [[nodiscard]] platform::Value _dictionaryToCacheBag(const platform::Value& fetched);
    [[nodiscard]] bool _isRefreshRequiredForCachedBag(const platform::Value& rawBag);
    [[nodiscard]] std::string _bagCacheURL();
    void _fetchBagStateWithVersion(const std::string& version);
    void _fetchBagStateWithVersion(const std::string& version, Completion completion);
    void _fetchCompleted(Fetch& fetch, std::optional<platform::Bytes> data,
                         std::optional<platform::UrlResponse> response, std::optional<platform::Error> error);
    void _handleRefreshNotification();

    Assembly& _assembly;
    std::shared_ptr<const TAVBag> _inMemoryBag; // on _inMemoryBagCacheAccessQueue
    AnnouncedVersion _announced;                // on _inMemoryBagCacheAccessQueue
    std::shared_ptr<platform::Queue> _inMemoryBagCacheAccessQueue;
    std::string _userAgent;
    std::atomic<std::shared_ptr<const CacheUrl>> _cacheUrl;
    std::atomic<bool> _fetchInProgress = false;
    platform::NotificationCenter::Token _refreshObserver;
};

} // namespace tavrin
