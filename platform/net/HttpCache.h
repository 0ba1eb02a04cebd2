#pragma once

#include <functional>
#include <memory>
#include <optional>

#include "platform/net/HttpCachePolicy.h"
#include "platform/net/UrlSession.h"

namespace platform {

/// The cached responses of a URL session: in memory, and on disk if it has a directory. The session's data tasks follow
/// the freshness rules of HTTP (HttpCachePolicy.h); `find` and `store` ignore them.
///
/// The cache has one response for each URL without its fragment; the least recently used ones are evicted. Disk work
/// runs on the configuration's queue, in the order of the calls, which also opens the directory when it is first
/// needed. If that fails, logs an error and retries after a minute or later. Any thread.
class HttpCache {
public:
    /// Creates a cache; in memory only if the configuration has no directory.
    [[nodiscard]] static std::shared_ptr<HttpCache> make(HttpCacheConfiguration configuration);
    ~HttpCache();
    HttpCache(const HttpCache&) = delete;
    HttpCache& operator=(const HttpCache&) = delete;

    /// Returns the cached response of the URL, fresh or not; nothing if there is none. Blocks while it is read from
    /// disk. Must not be called on the cache's queue.
    [[nodiscard]] std::optional<CachedResponse> find(const Url& url);
    /// Stores a response, whatever its header fields say; replaces an earlier one. `find` and `lookUp` see it after
    /// this returns. A response larger than a tenth of the memory or disk capacity is not stored there.
    void store(const Url& url, UrlResponse response, Bytes body);
    /// Removes the cached response of the URL.
    void remove(const Url& url);

    // For the session's tasks.

    /// Receives null if nothing is cached.
    using Found = std::move_only_function<void(std::shared_ptr<const StoredResponse>)>;
    /// Calls `found` with the cached response: before this returns if that is in memory, otherwise on the cache's
    /// queue, which `found` must not block.
    void lookUp(const Url& url, Found found);
    void store(const Url& url, StoredResponse stored);
    /// Returns the time of the configuration's clock; 1970 without one.
    [[nodiscard]] Date now() const;

private:
    struct Impl;
    explicit HttpCache(std::shared_ptr<Impl> impl);
    std::shared_ptr<Impl> _impl;
};

} // namespace platform
