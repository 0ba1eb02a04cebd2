#pragma once

#include <memory>
#include <optional>

#include "platform/UrlSession.h"

namespace platform {

/// An answer that a cache keeps. The body is shared with the cache: bytes in memory, or a mapped file.
struct CachedResponse {
    UrlResponse response;
    Bytes body;
};

/// What a URL session keeps of the answers that it got (RFC 9111): in memory, and on disk where it has a directory. The
/// session's data tasks keep to what the answers say about freshness; the operations here ask for none.
///
/// One answer is kept for each URL, whose fragment doesn't count. What was used least recently goes first. Disk work is
/// done on the configuration's queue, where the directory is opened with the first need. Any thread.
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
    /// Keeps the answer for the URL in place of an earlier one, whatever its header fields say. `find` has it from the
    /// moment that this returns. What takes more than a tenth of a capacity isn't kept there.
    void store(const Url& url, UrlResponse response, Bytes body);
    /// Forgets what is kept for the URL.
    void remove(const Url& url);

private:
    struct Impl;
    explicit HttpCache(std::shared_ptr<Impl> impl);
    std::shared_ptr<Impl> _impl;
};

} // namespace platform
