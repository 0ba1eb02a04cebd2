#pragma once

#include <functional>
#include <memory>
#include <optional>

#include "platform/net/HttpCachePolicy.h"
#include "platform/net/UrlSession.h"

namespace platform {

/// What a URL session keeps of the answers that it got: in memory, and on disk where it has a directory. The session's
/// data tasks keep to what the answers say about freshness (HttpCachePolicy.h); `find` and `store` ask for none.
///
/// One answer is kept for each URL, whose fragment doesn't count. What was used least recently goes first. Disk work is
/// done on the configuration's queue, in the order of the calls; the directory is opened there with the first need.
/// Where it can't be used, a line is logged, and it is tried again a minute later at the earliest. Any thread.
class HttpCache {
public:
    /// Without a directory in the configuration it keeps what fits into memory.
    [[nodiscard]] static std::shared_ptr<HttpCache> make(HttpCacheConfiguration configuration);
    ~HttpCache();
    HttpCache(const HttpCache&) = delete;
    HttpCache& operator=(const HttpCache&) = delete;

    /// What is kept for the URL, fresh or not. It may have to wait for the disk, as long as reading the file takes; not
    /// from a task of the cache's queue.
    [[nodiscard]] std::optional<CachedResponse> find(const Url& url);
    /// Keeps the answer for the URL in place of an earlier one, whatever its header fields say. `find` and `lookUp`
    /// have it from the moment that this returns. What takes more than a tenth of a capacity isn't kept there.
    void store(const Url& url, UrlResponse response, Bytes body);
    /// Forgets what is kept for the URL.
    void remove(const Url& url);

    // For the session's tasks.

    /// Null: nothing is kept.
    using Found = std::move_only_function<void(std::shared_ptr<const StoredResponse>)>;
    /// Calls `found` with what is kept: before this returns where memory has the answer, else on the cache's queue,
    /// which it must not hold up.
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
