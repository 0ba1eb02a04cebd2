#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "platform/base/Date.h"
#include "platform/net/UrlSession.h"

namespace platform {

// The rules of HTTP for a private cache (RFC 9111) as pure functions of a request, a response and the time. Times are
// whole seconds, as in header fields. Any thread.

/// A cached response. The body is shared with the cache: bytes in memory, or a mapped file.
struct CachedResponse {
    UrlResponse response;
    Bytes body;
};

/// A cached response with the data on which its reuse depends.
struct StoredResponse : CachedResponse {
    std::string selecting; ///< `selectingFields` of its request
    Date requested;        ///< when its request, or the last revalidation, was sent
    Date received;         ///< when the response, or the last revalidation, was received
    bool mapped = false;   ///< the body is a mapped file
};

/// Returns the key of a response in a cache: the URL without its fragment.
[[nodiscard]] std::string cacheKey(const Url& url);

/// How a data task uses a cache.
enum class CacheUse {
    None,
    Fill,       ///< its response may be stored
    Ask,        ///< a cached response may be used; otherwise as Fill
    Invalidate, ///< a successful response removes the cached one
};
/// Returns how this request uses a cache: None if it has credentials, a range, a body or conditions of its own.
[[nodiscard]] CacheUse cacheUse(const UrlRequest& request);

/// Returns the request's values of the fields that the response's Vary names, one line each; nullopt for "*", which no
/// request matches.
[[nodiscard]] std::optional<std::string> selectingFields(const UrlResponse& response, const UrlRequest& request);

/// Returns true if a response may be stored and reused: its status is cacheable by default, and it is fresh for some
/// time or can be revalidated. `cacheUse` of the request must be Fill or Ask.
[[nodiscard]] bool isStorable(const UrlRequest& request, const UrlResponse& response, Date received);

/// Returns how long a response is fresh: "max-age", else "Expires", else a tenth of the time since "Last-Modified".
/// Returns 0 if it must be revalidated each time, or if those fields can't be parsed.
[[nodiscard]] std::chrono::seconds freshnessLifetime(const UrlResponse& response, Date received);

/// Returns the age of a cached response (RFC 9111, 4.2.3).
[[nodiscard]] std::chrono::seconds currentAge(const StoredResponse& stored, Date now);

/// How a cached response serves a request: as it is (Answer), after revalidation (Confirm), or not. A stale response is
/// never used without revalidation, so "must-revalidate" makes no difference.
enum class Reuse { Answer, Confirm, None };
[[nodiscard]] Reuse reuse(const StoredResponse& stored, const UrlRequest& request, Date now);

/// Returns the request with If-None-Match and If-Modified-Since from the cached response's validators.
[[nodiscard]] UrlRequest confirmationRequest(const StoredResponse& stored, UrlRequest request);
/// Returns true if a response of status 304 confirms the cached one: its ETag, if it has one, matches.
[[nodiscard]] bool confirms(const UrlResponse& notModified, const StoredResponse& stored);
/// Returns the cached response with the header fields and times of its revalidation.
[[nodiscard]] StoredResponse confirmed(StoredResponse stored, const UrlResponse& notModified, Date requested,
                                       Date received);

} // namespace platform
