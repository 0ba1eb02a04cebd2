#pragma once

#include <optional>
#include <string>

#include "platform/net/UrlSession.h"

namespace platform {

// The rules for following redirects and URLs that a response names. Pure functions; any thread.

/// Returns true if an IP address in text form is globally reachable by IANA's registries of special-purpose addresses.
/// Returns false for addresses of this device or an internal network (loopback, private, link-local, carrier-grade
/// NAT), for those of no host (documentation, benchmarking, multicast, reserved), and for text that is not an address.
/// An IPv6 address that embeds an IPv4 address is judged by the latter.
[[nodiscard]] bool isPublicAddress(const std::string& address);

/// Returns the limits for URLs that a response names. If the peer's address isn't known, a host name other than
/// "localhost" counts as public.
[[nodiscard]] UrlSource sourceOf(const UrlResponse& response);
/// Returns the limits for URLs in a future response from this URL.
[[nodiscard]] UrlSource sourceOf(const Url& url);

/// Applies `request.source` to the request: removes the URL's user information. Fails with kUrlForbiddenRedirect if the
/// URL is neither http nor https, or if it leads from https to http. Doesn't check the host's address, which is known
/// only after connecting.
[[nodiscard]] Result<UrlRequest> withinSource(UrlRequest request);

/// Returns the request that follows a redirect, or nothing if the response is not a redirect. It has the URL of
/// "Location", `source` as its source, and the method of RFC 9110, 15.4. To another origin it has only fields that
/// describe the wanted response ("Accept" and the like), because others may contain identifiers or credentials. Fails
/// with kUrlForbiddenRedirect if a body would be sent to another origin, or if `source` doesn't allow the URL.
[[nodiscard]] std::optional<Result<UrlRequest>> redirected(const UrlRequest& request, bool hasBody,
                                                           const UrlResponse& answer, UrlSource source);

} // namespace platform
