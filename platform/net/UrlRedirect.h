#pragma once

#include <optional>
#include <string>

#include "platform/net/UrlSession.h"

namespace platform {

// Where one URL may lead to another: redirects, and URLs that an answer names. Pure functions, any thread.

/// Scheme, host and port ("https://example.com:443"): what a server is, for the purposes of HTTP (RFC 9110, 4.3.1).
[[nodiscard]] std::string originOf(const Url& url);

/// False for addresses that only lead to this device or a network of its own (loopback, private, link-local, carrier's,
/// NAT64 of one's own) or to no host at all (documentation, benchmarking, multicast, reserved), by IANA's registries
/// of special-purpose addresses. An IPv6 address that stands for an IPv4 one counts as that. `address` is in text form;
/// false for text that is no address.
[[nodiscard]] bool isPublicAddress(const std::string& address);

/// What limits the URLs that an answer names. Where the peer's address isn't known, a host counts as public unless it
/// is an address that isn't, or "localhost".
[[nodiscard]] UrlSource sourceOf(const UrlResponse& response);
/// The same of an answer that is still to come from this URL.
[[nodiscard]] UrlSource sourceOf(const Url& url);

/// The request as it may be sent to a URL that `request.source` limits: without the URL's user information. The error
/// (kUrlForbiddenRedirect) is for a URL that isn't http or https, or leads from https to http. Whether the host's
/// address is public is seen only when it is connected to.
[[nodiscard]] Result<UrlRequest> withinSource(UrlRequest request);

/// The request that a redirect leads to: the URL of "Location" with `source` as its source, and the method of RFC 9110,
/// 15.4. Nothing if the answer is no redirect. Across origins only what says how to answer goes along ("Accept" and
/// the like): other fields, identifiers and credentials among them, are for the origin that they were meant for; and a
/// body isn't sent again, which is an error, like a URL that `source` doesn't allow.
[[nodiscard]] std::optional<Result<UrlRequest>> redirected(const UrlRequest& request, bool hasBody,
                                                           const UrlResponse& answer, UrlSource source);

} // namespace platform
