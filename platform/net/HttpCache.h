#pragma once

#include <functional>
#include <memory>
#include <optional>

#include "platform/net/HttpCachePolicy.h"
#include "platform/net/UrlSession.h"

namespace platform {

/// The answers that a URL session keeps: in memory, and on disk if it has a directory. The session's data tasks obey
/// the answers' own rules of freshness (HttpCachePolicy.h); `find` and `store` ignore them.
///
/// One answer is kept for each URL without its fragment; the least recently used ones are evicted. Disk work is done on
/// the configuration's queue, in the order of the calls; the directory is opened there when it is first needed. If it
/// can't be used, a line is logged, and it is tried again a minute later at the earliest. Any thread.
class HttpCache {
public:
    /// Without a directory in the configuration it keeps what fits into memory.
    [[nodiscard]] static std::shared_ptr<HttpCache> make(HttpCacheConfiguration configuration);
    ~HttpCache();
    HttpCache(const HttpCache&) = delete;
    HttpCache& operator=(const HttpCache&) = delete;

    /// Returns what is kept for the URL, fresh or not. Blocks while the file is read from disk. Must not be called from
    /// a task of the cache's queue.
    [[nodiscard]] std::optional<CachedResponse> find(const Url& url);
    /// Keeps the answer for the URL in place of an earlier one, whatever its header fields say. `find` and `lookUp` see
    /// it once this returns. An answer that takes more than a tenth of a capacity isn't kept there.
    void store(const Url& url, UrlResponse response, Bytes body);
    /// Forgets what is kept for the URL.
    void remove(const Url& url);

    // For the session's tasks.

    /// Null: nothing is kept.
    using Found = std::move_only_function<void(std::shared_ptr<const StoredResponse>)>;
    /// Calls `found` with what is kept: before this returns if the answer is in memory, else on the cache's queue,
    /// which `found` must not hold up.
    void lookUp(const Url& url, Found found);
    void store(const Url& url, StoredResponse stored);
    /// The clock's.
    [[nodiscard]] Date now() const;

private:
    struct Impl;
    explicit HttpCache(std::shared_ptr<Impl> impl);
    std::shared_ptr<Impl> _impl;
};

} // namespace platform
