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
/// ("bagError": platform::Error). It is posted inside the controller's barrier: observers must do their work on another
/// queue, and must not read the controller.
inline constexpr const char* TAVBagChangeNotification = "TAVBagChangeNotification";
/// Posted by the request factory after a change of something that the bag depends on.
inline constexpr const char* TAVBagRefreshRequired = "TAVBagRefreshRequired";

/// System-wide names that tell other processes whether the news client may use the service.
inline constexpr const char* kNewsEnabledNotifyName = "com.quorvane.tavrin.news.enabled";
inline constexpr const char* kNewsDisabledNotifyName = "com.quorvane.tavrin.news.disabled";

/// Why a cached bag must be fetched again.
enum class BagStaleness { Fresh, Expired, NoUrl, UrlChanged };

/// Decides by time, then by URL. `expiration` is the time until which the bag is trusted, in seconds since 1970;
/// default 0. The bag expires 600 s before it. A bag with more than four hours left has expired as well: no fetch
/// grants so much, so the clock was wrong. `cachedUrl` is the bag cache request's URL at the time of the fetch.
/// `currentUrl` returns the current one; it is called only if the time doesn't decide.
[[nodiscard]] BagStaleness bagStaleness(std::optional<double> expiration, const std::string* cachedUrl,
                                        platform::Date now, const std::function<std::string()>& currentUrl);

/// Returns until when a bag that was fetched at `fetched` is trusted, in seconds since 1970.
[[nodiscard]] double bagExpiration(platform::Date fetched);

/// Returns whether version `a` precedes `b`. Runs of digits compare as numbers: "9" precedes "10".
[[nodiscard]] bool versionPrecedes(std::string_view a, std::string_view b);

/// Limits the fetches for a version that the service announces but does not deliver: the first one is immediate, the
/// next ones follow at intervals that double from one minute to four hours. A higher version starts again only after
/// the last one was delivered. A failed fetch ends the limit: assign a new one. Not thread-safe.
class AnnouncedVersion {
public:
    /// Returns whether to fetch for `version` at `now`, in host ticks, while the bag has version `current`. If so,
    /// counts the fetch as done.
    [[nodiscard]] bool take(std::string_view version, std::string_view current, std::uint64_t now);

private:
    std::string _version;
    platform::Duration _interval{};
    std::uint64_t _due = 0;
};

/// Fetches the bag, keeps one copy in memory and one on disk, and notifies the daemon of a new one.
///
/// Life: the daemon starts with the copy on disk, stale or not. A bag becomes stale 3 h 50 min after its fetch, or when
/// the URL of its fetch changes. Reading a stale bag returns it and starts a fetch. One fetch runs at a time, for two
/// minutes at most; further ones are dropped. A failed fetch does not change the bag. The next read of the stale bag
/// repeats it; there is no timer.
///
/// Any thread. The assembly must outlive it.
class TavrinBagController : public std::enable_shared_from_this<TavrinBagController> {
public:
    /// Reads the disk cache, and observes TAVBagRefreshRequired of the assembly's request factory.
    static std::shared_ptr<TavrinBagController> make(Assembly& assembly);
    explicit TavrinBagController(Assembly& assembly);
    ~TavrinBagController();

    /// Returns the URL from which a device in `country` fetches its bag.
    [[nodiscard]] platform::Url bagFetchURLWithCountry(const std::string& country) const;

    /// Returns the bag, or null. Starts a fetch if there is no bag or a stale one.
    [[nodiscard]] std::shared_ptr<const TAVBag> currentBag();
    /// Returns the bag, or null. Starts a fetch asynchronously if the bag is stale.
    [[nodiscard]] std::shared_ptr<const TAVBag> cachedBagState();
    /// Returns the bag, or null. Starts no fetch.
    [[nodiscard]] std::shared_ptr<const TAVBag> inMemoryBag() const;
    /// Returns the bag's warm-up URL, if any. Starts fetches like `currentBag`.
    [[nodiscard]] std::optional<platform::Url> warmURL();

    /// Fetches the version that the service announces, a number under "bag", if the bag in memory is older and
    /// `AnnouncedVersion` permits it. Does nothing without a bag or a number.
    void forceFetchBag(const platform::Value& announcement);

    [[nodiscard]] bool fetchInProgress() const { return _fetchInProgress; }
    /// Describes the last attempt to fetch a bag: {"at": seconds since 1970, "url"}, then "status" if there was a
    /// response, "reason" and "code" if it failed, and "serverDate" if the response has a Date header. Null before the
    /// first. For diagnostics; starts no fetch.
    [[nodiscard]] platform::Value lastFetch() const;

private:
    using Completion = std::move_only_function<void(std::shared_ptr<const TAVBag>, std::optional<platform::Error>)>;
    struct Fetch;
    /// The URL of the bag cache request, with its inputs. Cached, because each read of the bag compares it.
    struct CacheUrl {
        std::uint64_t context;
        std::optional<std::string> configured;
        std::string url;
    };

    [[nodiscard]] platform::Value diskCachedBagDictionary();
    [[nodiscard]] platform::Value cacheBagDictionary(const platform::Value& fetched, const std::string& cacheUrl);
    void cacheBagState(std::shared_ptr<const TAVBag> bag, bool fromDisk);
    [[nodiscard]] platform::Result<std::string> _pathToCachedBag();
    [[nodiscard]] platform::Value _dictionaryToCacheBag(const platform::Value& fetched, const std::string& cacheUrl);
    [[nodiscard]] bool _isRefreshRequiredForCachedBag(const platform::Value& rawBag);
    [[nodiscard]] std::string _bagCacheURL();
    void _fetchBagStateWithVersion(const std::string& version);
    void _fetchBagStateWithVersion(const std::string& version, Completion completion);
    void _fetchCompleted(Fetch& fetch, std::optional<platform::Bytes> data,
                         std::optional<platform::UrlResponse> response, std::optional<platform::Error> error);
    void _noteAttempt(const std::string& url, const platform::UrlResponse* response, const platform::Error* error);
    void _handleRefreshNotification();

    Assembly& _assembly;
    std::shared_ptr<const TAVBag> _inMemoryBag; // on _inMemoryBagCacheAccessQueue
    AnnouncedVersion _announced;                // on _inMemoryBagCacheAccessQueue
    std::shared_ptr<platform::Queue> _inMemoryBagCacheAccessQueue;
    std::string _userAgent;
    std::atomic<std::shared_ptr<const CacheUrl>> _cacheUrl;
    std::atomic<bool> _fetchInProgress = false;
    std::atomic<std::shared_ptr<const platform::Value>> _lastFetch;
    platform::NotificationCenter::Token _refreshObserver;
};

} // namespace tavrin
