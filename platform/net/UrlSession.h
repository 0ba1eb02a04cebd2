#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

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
class NetworkStatus;
class Queue;

/// Describes the response that named a URL. Such a URL is limited like a redirect: never from https to http, and never
/// from a public host to an address that isn't public.
struct UrlSource {
    bool secure = false;   ///< it came over https
    bool isPublic = false; ///< it came from a public address
    friend bool operator==(const UrlSource&, const UrlSource&) = default;
};

/// A request. A plain value.
struct UrlRequest {
    Url url;
    std::string method = "GET";
    HttpHeaders headers;
    Bytes body;
    /// The longest time without a received byte; nullopt selects the session's `requestTimeout`.
    std::optional<Duration> timeout;
    /// Limit of the response's decoded body in bytes; nullopt selects the session's limit. A larger body fails the load
    /// with kUrlTooLarge.
    std::optional<std::size_t> maximumResponseSize = std::nullopt;
    /// ReloadIgnoringCache uses neither cached responses nor their validators. The response may still be stored.
    enum class CachePolicy { Protocol, ReloadIgnoringCache } cachePolicy = CachePolicy::Protocol;
    /// Set it to `sourceOf` the response that named the URL (UrlRedirect.h). It limits where the URL may lead, and user
    /// information in the URL is not sent.
    std::optional<UrlSource> source = std::nullopt;
};

/// The head of a response. A response to a URL other than http and https has no status, and `isHttp` is false.
struct UrlResponse {
    Url url; ///< of the last hop, after redirects
    bool isHttp = true;
    int statusCode = 0;
    HttpHeaders headers;
    /// True if any host of the redirect chain had a public address; nullopt if unknown.
    std::optional<bool> publicPeer = std::nullopt;
};

/// Errors of URL loading have the domain kUrlErrorDomain, a code below and a reason in words.
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
    kUrlForbiddenRedirect =
        -1201, ///< to another scheme, to an address that isn't public, or with a body to another host
};
/// Returns an error of URL loading. Any thread.
[[nodiscard]] inline Error urlError(std::int64_t code, std::string reason)
{
    return Error::withReason(kUrlErrorDomain, code, std::move(reason));
}

/// One load. It is created suspended and starts with `resume()`. Any thread.
///
/// A resumed task calls its completion exactly once; `cancel` completes it with kUrlCancelled. It keeps itself alive
/// until then. A task that is dropped without `resume()` never completes.
class UrlTask {
public:
    virtual ~UrlTask() = default;
    virtual void resume() = 0;
    virtual void cancel() = 0;
    /// Identifies the task within its session, from 1.
    [[nodiscard]] virtual std::uint64_t identifier() const = 0;
    [[nodiscard]] virtual const UrlRequest& originalRequest() const = 0;
    /// Returns when the stages of the load began and ended (seconds of the monotonic clock) and the peer's address: a
    /// dictionary whose keys begin with "_kCFNTimingData" (docs/timing.md). Null before the completion.
    [[nodiscard]] virtual Value timingData() const = 0;
};

/// Files that replace bodies in memory, for loads of any size.
struct TransferFiles {
    FileHandle upload;   ///< the request's body, sent from its start; if empty, `UrlRequest::body` is sent
    FileHandle download; ///< an empty file for the response's body; if the handle is empty, the body is dropped
    /// Called with the bytes of the upload sent so far. Runs on the loader's queue and must not block.
    std::function<void(std::uint64_t sent, std::uint64_t expected)> progress;
};

/// Loads URLs. Any thread.
///
/// - A request lost on a reused connection before any byte of its response is sent once more, on a new connection.
/// - Redirects follow the rules of UrlRedirect.h.
/// - A response whose body ends before its content coding does is an error.
class UrlSession {
public:
    /// data: the body; nullopt if there is an error. response: nullopt if none was received. error: a transport error.
    /// An HTTP error status is not an error.
    using DataCompletion = std::move_only_function<void(std::optional<Bytes> data, std::optional<UrlResponse> response,
                                                        std::optional<Error> error)>;

    virtual ~UrlSession() = default;
    /// `completion` runs on the session's delegate queue.
    [[nodiscard]] virtual std::shared_ptr<UrlTask> dataTask(UrlRequest request, DataCompletion completion) = 0;
    /// Like a data task, with bodies in files; the completion's data is empty. A sent byte postpones the time-out like
    /// a received one. If a file can't be read or written, the load fails with an error in kPosixErrorDomain. An upload
    /// without a download file completes with its final status, even if that arrives before the body is sent or the
    /// connection fails after it.
    [[nodiscard]] virtual std::shared_ptr<UrlTask> transferTask(UrlRequest request, TransferFiles files,
                                                                DataCompletion completion) = 0;
    /// Returns the session's cache; null if it has none.
    [[nodiscard]] virtual std::shared_ptr<HttpCache> cache() const { return nullptr; }
};

/// Size and place of a session's cache.
struct HttpCacheConfiguration {
    std::size_t memoryCapacity = 1u << 20;   ///< bytes
    std::uint64_t diskCapacity = 100u << 20; ///< bytes
    std::size_t minimumMappedSize = 16384; ///< bodies of at least this many bytes are separate files, mapped when read
    std::filesystem::path directory;       ///< created when first needed; if empty, nothing is stored on disk
    FileSystem* files = nullptr;           ///< must outlive the cache; null only without a directory
    std::shared_ptr<Queue> queue;          ///< a serial queue for disk work; null only without a directory
    Clock* clock = nullptr;                ///< must outlive the cache
};

/// Options of a session.
struct UrlSessionConfiguration {
    /// A data task times out after this time without a received byte; a transfer, without a received or sent byte.
    Duration requestTimeout = std::chrono::seconds(60);
    /// Limit of a load's total duration with redirects. It ends loads that keep receiving a byte at a time.
    Duration totalTimeout = std::chrono::minutes(5);
    /// TCP Fast Open and TLS session tickets.
    bool allowFastOpenAndTickets = false;
    /// Transfers over https wait for a connection that may multiplex instead of opening another.
    bool pipelining = false;
    /// While `network` is metered, connections idle for longer than this are not reused. Otherwise, or if nullopt,
    /// libcurl's default applies (118 s).
    std::optional<Duration> meteredPurgeTimeout;
    NetworkStatus* network = nullptr; ///< must outlive the loader
    /// Limit of a body in bytes, encoded and decoded. Header fields are limited to 256 KiB. A larger response fails the
    /// load with kUrlTooLarge.
    std::size_t maximumResponseSize = 8u << 20;
    unsigned maximumRedirects = 16;
    /// A PEM file of certification authorities that replaces the system's. If empty, the system's apply.
    std::string caFile;
    /// The cache of data tasks, if they have one.
    std::optional<HttpCacheConfiguration> cache;
};

/// Creates sessions. One for each process. Any thread.
class UrlLoader {
public:
    virtual ~UrlLoader() = default;
    /// Creates a foreground session whose completions run on `delegateQueue`.
    [[nodiscard]] virtual std::shared_ptr<UrlSession> makeSession(UrlSessionConfiguration configuration,
                                                                  std::shared_ptr<Queue> delegateQueue) = 0;
};

} // namespace platform
