#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/base/Bytes.h"
#include "platform/base/Date.h"
#include "platform/files/Files.h"
#include "platform/net/HttpHeaders.h"
#include "platform/net/Url.h"
#include "platform/values/Error.h"

namespace platform {

class Clock;
class FileSystem;
class HttpCache;
class Queue;

/// What to load. A plain value.
struct UrlRequest {
    Url url;
    std::string method = "GET";
    HttpHeaders headers;
    Bytes body;
    /// The longest the request may go without receiving anything; none is the session's.
    std::optional<Duration> timeout;
    /// Bytes of the answer's body, unpacked; none is the session's limit. More is kUrlTooLarge.
    std::optional<std::size_t> maximumResponseSize = std::nullopt;
    /// ReloadIgnoringCache neither answers from a cache nor asks it for validators.
    enum class CachePolicy { Protocol, ReloadIgnoringCache } cachePolicy = CachePolicy::Protocol;
};

/// What came back. An answer to a URL that isn't http or https has no status and `isHttp` false.
struct UrlResponse {
    Url url; ///< where the answer came from, after redirects
    bool isHttp = true;
    int statusCode = 0;
    HttpHeaders headers;
};

/// Errors of URL loading: domain kUrlErrorDomain, codes below, the reason in words.
inline constexpr std::string_view kUrlErrorDomain = "UrlErrorDomain";
enum UrlErrorCode : std::int64_t {
    kUrlCancelled = -999,
    kUrlBadUrl = -1000,
    kUrlTimedOut = -1001,
    kUrlUnsupported = -1002,
    kUrlCannotFindHost = -1003,
    kUrlCannotConnect = -1004,
    kUrlConnectionLost = -1005,
    kUrlTooManyRedirects = -1007,
    kUrlNotConnected = -1009,
    kUrlBadResponse = -1011,
    kUrlTooLarge = -1103,
    kUrlTlsFailed = -1200,
    kUrlForbiddenRedirect = -1201, ///< to another scheme, or from a public host to a private address
};

/// One load. Made suspended; nothing happens before `resume()`. Any thread.
///
/// A task ends exactly once, in its completion; `cancel` ends it with kUrlCancelled. A resumed task keeps itself alive
/// until then; one that is dropped without `resume()` never completes.
class UrlTask {
public:
    virtual ~UrlTask() = default;
    virtual void resume() = 0;
    virtual void cancel() = 0;
    /// Identifies the task within its session, from 1.
    [[nodiscard]] virtual std::uint64_t identifier() const = 0;
    [[nodiscard]] virtual const UrlRequest& originalRequest() const = 0;
    /// When the stages of the load began and ended, in seconds on the loader's clock, and the peer's address; a
    /// dictionary whose keys begin with "_kCFNTimingData" (docs/timing.md), null before the completion.
    [[nodiscard]] virtual Value timingData() const = 0;
};

/// Files in place of the bodies in memory, for loads of any size.
struct TransferFiles {
    FileHandle upload;   ///< sent whole, from its start, as the request's body; none: the request's own
    FileHandle download; ///< an empty file that takes the answer's body; none: the body is counted and dropped
    /// Is told how many bytes of an upload have left, on the loader's thread: it must only hand work on.
    std::function<void(std::uint64_t sent, std::uint64_t expected)> progress;
};

/// Loads URLs. Any thread.
class UrlSession {
public:
    /// data: the body, none with a transport error. response: none where none came. error: a transport error; an HTTP
    /// error status is none.
    using DataCompletion = std::move_only_function<void(std::optional<Bytes> data, std::optional<UrlResponse> response,
                                                        std::optional<Error> error)>;

    virtual ~UrlSession() = default;
    /// `completion` runs on the session's delegate queue.
    [[nodiscard]] virtual std::shared_ptr<UrlTask> dataTask(UrlRequest request, DataCompletion completion) = 0;
    /// The same with bodies in files; the completion's data is empty. Sending counts as progress like receiving. A file
    /// that can't be read or written is an error of the load, in kPosixErrorDomain.
    [[nodiscard]] virtual std::shared_ptr<UrlTask> transferTask(UrlRequest request, TransferFiles files,
                                                                DataCompletion completion) = 0;
    /// What the session keeps of its answers; null where it keeps none.
    [[nodiscard]] virtual std::shared_ptr<HttpCache> cache() const { return nullptr; }
};

/// What a session may keep of its answers, and where.
struct HttpCacheConfiguration {
    std::size_t memoryCapacity = 1u << 20;   ///< bytes
    std::uint64_t diskCapacity = 100u << 20; ///< bytes
    std::size_t minimumMappedSize = 16384;   ///< bodies of so many bytes are files of their own, mapped when read
    std::filesystem::path directory;         ///< made with the first need; empty: nothing is kept on disk
    FileSystem* files = nullptr;             ///< outlives the cache; null only without a directory
    std::shared_ptr<Queue> queue;            ///< a serial one for the disk's work; null only without a directory
    Clock* clock = nullptr;                  ///< outlives the cache
};

/// How a session loads.
struct UrlSessionConfiguration {
    /// Without anything received for this long a request times out; a transfer, without anything sent either.
    Duration requestTimeout = std::chrono::seconds(60);
    /// TCP Fast Open and TLS session tickets.
    bool allowFastOpenAndTickets = false;
    bool pipelining = false; ///< wait for a connection that may be multiplexed rather than open another
    /// Idle connections older than this aren't used again; none is curl's default (118 s).
    std::optional<Duration> connectionPurgeTimeout;
    /// Bytes of a body, unpacked. Header fields may take 256 KiB in all. More is kUrlTooLarge.
    std::size_t maximumResponseSize = 64u << 20;
    unsigned maximumRedirects = 16;
    /// A PEM file of certification authorities in place of the system's; empty is the system's.
    std::string caFile;
    /// What is kept of answers to data tasks; none is nothing.
    std::optional<HttpCacheConfiguration> cache;
};

/// Makes sessions. One for the process; a twin in tests/support answers by hand. Any thread.
class UrlLoader {
public:
    virtual ~UrlLoader() = default;
    /// A foreground session. `delegateQueue` runs the completions.
    [[nodiscard]] virtual std::shared_ptr<UrlSession> makeSession(UrlSessionConfiguration configuration,
                                                                  std::shared_ptr<Queue> delegateQueue) = 0;
};

} // namespace platform
