#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "platform/base/Date.h"
#include "platform/net/UrlSession.h"

namespace platform {

// What HTTP asks of a cache that serves one user (RFC 9111), as functions of a request, an answer and the time. Times
// are whole seconds, as they are in header fields. Any thread.

/// An answer that a cache keeps. The body is shared with the cache: bytes in memory, or a mapped file.
struct CachedResponse {
    UrlResponse response;
    Bytes body;
};

/// The same with what its reuse depends on.
struct StoredResponse : CachedResponse {
    std::string selecting; ///< what `selectingFields` made of the request that it answered
    Date requested;        ///< when that was sent, or later confirmed
    Date received;         ///< when the answer, or its confirmation, came
    bool mapped = false;   ///< the body is a mapped file
};

/// What an answer is kept under: the URL without its fragment.
[[nodiscard]] std::string cacheKey(const Url& url);

/// What a data task has to do with a cache.
enum class CacheUse {
    None,
    Fill,       ///< its answer may be kept
    Ask,        ///< it may be answered from the cache, else the same
    Invalidate, ///< its success means that what is kept for the URL is no longer true
};
/// Requests with credentials, for a part, with a body or with conditions of their own have nothing to do with it.
[[nodiscard]] CacheUse cacheUse(const UrlRequest& request);

/// The request's values of the fields that the answer's Vary names, one line each; nothing for "*", which no request
/// matches.
[[nodiscard]] std::optional<std::string> selectingFields(const UrlResponse& response, const UrlRequest& request);

/// Whether the answer to a request that may fill a cache may be kept, and could ever be used: it is fresh for a time,
/// or can be confirmed. Only answers of the statuses that are cacheable by default are kept.
[[nodiscard]] bool isStorable(const UrlRequest& request, const UrlResponse& response, Date received);

/// How long an answer is fresh: "max-age", else "Expires", else a tenth of the time since "Last-Modified". None for
/// one that must be confirmed each time, and for one that says it wrongly.
[[nodiscard]] std::chrono::seconds freshnessLifetime(const UrlResponse& response, Date received);

/// How long ago the answer left its origin, at least.
[[nodiscard]] std::chrono::seconds currentAge(const StoredResponse& stored, Date now);

/// What a kept answer is worth to a request. A stale one is never answered unconfirmed, so "must-revalidate" adds
/// nothing.
enum class Reuse { Answer, Confirm, None };
[[nodiscard]] Reuse reuse(const StoredResponse& stored, const UrlRequest& request, Date now);

/// The request, with the condition that the kept answer is no longer true.
[[nodiscard]] UrlRequest confirmationRequest(const StoredResponse& stored, UrlRequest request);
/// Whether an answer of status 304 is about the kept answer.
[[nodiscard]] bool confirms(const UrlResponse& notModified, const StoredResponse& stored);
/// The kept answer, updated by what the confirmation says.
[[nodiscard]] StoredResponse confirmed(StoredResponse stored, const UrlResponse& notModified, Date requested,
                                       Date received);

} // namespace platform
