#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "platform/base/Date.h"
#include "platform/net/UrlSession.h"

namespace platform {

// The rules of HTTP for a cache of one user (RFC 9111), as pure functions of a request, an answer and the time. Times
// are whole seconds, as in header fields. Any thread.

/// A cached answer. The body is shared with the cache: bytes in memory, or a mapped file.
struct CachedResponse {
    UrlResponse response;
    Bytes body;
};

/// A cached answer with what its reuse depends on.
struct StoredResponse : CachedResponse {
    std::string selecting; ///< `selectingFields` of the request that it answered
    Date requested;        ///< when that request, or the last confirmation, was sent
    Date received;         ///< when the answer, or the last confirmation, was received
    bool mapped = false;   ///< the body is a mapped file
};

/// The key of an answer in a cache: the URL without its fragment.
[[nodiscard]] std::string cacheKey(const Url& url);

/// How a data task uses a cache.
enum class CacheUse {
    None,
    Fill,       ///< its answer may be stored
    Ask,        ///< a cached answer may be used; otherwise as Fill
    Invalidate, ///< its success removes what is stored for the URL
};
/// How this request uses a cache. None if it has credentials, a range, a body or conditions of its own.
[[nodiscard]] CacheUse cacheUse(const UrlRequest& request);

/// The request's values of the fields named by the answer's Vary, one line each; nullopt for "*", which no request
/// matches.
[[nodiscard]] std::optional<std::string> selectingFields(const UrlResponse& response, const UrlRequest& request);

/// Whether an answer may be stored and could be used: it stays fresh for some time, or can be confirmed. Only statuses
/// that are cacheable by default qualify. The request must be one that may fill a cache.
[[nodiscard]] bool isStorable(const UrlRequest& request, const UrlResponse& response, Date received);

/// How long an answer is fresh: "max-age", else "Expires", else a tenth of the time since "Last-Modified". 0 if it must
/// be confirmed each time, or if those fields can't be parsed.
[[nodiscard]] std::chrono::seconds freshnessLifetime(const UrlResponse& response, Date received);

/// The least time since the answer left its origin.
[[nodiscard]] std::chrono::seconds currentAge(const StoredResponse& stored, Date now);

/// How a cached answer serves a request. A stale answer is never used unconfirmed, so "must-revalidate" changes
/// nothing.
enum class Reuse { Answer, Confirm, None };
[[nodiscard]] Reuse reuse(const StoredResponse& stored, const UrlRequest& request, Date now);

/// The request with conditions that the cached answer's validators have changed.
[[nodiscard]] UrlRequest confirmationRequest(const StoredResponse& stored, UrlRequest request);
/// Whether an answer of status 304 confirms this cached answer: its ETag, if it has one, matches.
[[nodiscard]] bool confirms(const UrlResponse& notModified, const StoredResponse& stored);
/// The cached answer updated with the header fields and times of its confirmation.
[[nodiscard]] StoredResponse confirmed(StoredResponse stored, const UrlResponse& notModified, Date requested,
                                       Date received);

} // namespace platform
