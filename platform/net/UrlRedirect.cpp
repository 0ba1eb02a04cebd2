#include "platform/net/UrlRedirect.h"

#include <algorithm>
#include <arpa/inet.h>
#include <array>
#include <cstring>
#include <netinet/in.h>

#include <fmt/format.h>

#include "platform/net/CurlSupport.h"

namespace platform {

namespace {

struct Range4 {
    std::uint32_t network;
    int bits;
};

/// IPv4 networks that are not globally reachable (https://www.iana.org/assignments/iana-ipv4-special-registry), and
/// multicast.
constexpr Range4 kInner4[] = {
    {0x00000000, 8},  // this network
    {0x0a000000, 8},  // private
    {0x64400000, 10}, // shared with a carrier
    {0x7f000000, 8},  // loopback
    {0xa9fe0000, 16}, // link-local
    {0xac100000, 12}, // private
    {0xc0000000, 24}, // protocol assignments
    {0xc0000200, 24}, // documentation
    {0xc0586300, 24}, // 6to4 relays, withdrawn
    {0xc0a80000, 16}, // private
    {0xc6120000, 15}, // benchmarks
    {0xc6336400, 24}, // documentation
    {0xcb007100, 24}, // documentation
    {0xe0000000, 4},  // multicast
    {0xf0000000, 4},  // reserved, broadcast
};

struct Range6 {
    std::array<unsigned char, 4> network;
    unsigned bits;
};

/// Networks inside 2000::/3, the global unicast range, that are not globally reachable
/// (https://www.iana.org/assignments/iana-ipv6-special-registry).
constexpr Range6 kInner6[] = {
    {{0x20, 0x01, 0x00, 0x00}, 23}, // protocol assignments, Teredo
    {{0x20, 0x01, 0x0d, 0xb8}, 32}, // documentation
    {{0x3f, 0xff, 0x00, 0x00}, 20}, // documentation
};

bool isPublic(const in_addr& address)
{
    const std::uint32_t a = ntohl(address.s_addr);
    return std::ranges::none_of(kInner4,
                                [a](const Range4& range) { return (a ^ range.network) >> (32 - range.bits) == 0; });
}

/// Returns the IPv4 address embedded in an IPv6 one: mapped, compatible, NAT64 (RFC 6052) or 6to4 (RFC 3056). Null if
/// there is none.
const unsigned char* embeddedIPv4(const in6_addr& v6)
{
    constexpr unsigned char kNat64[12]{0, 0x64, 0xff, 0x9b};
    if (IN6_IS_ADDR_V4MAPPED(&v6) || IN6_IS_ADDR_V4COMPAT(&v6) || std::memcmp(v6.s6_addr, kNat64, sizeof kNat64) == 0)
        return v6.s6_addr + 12;
    return v6.s6_addr[0] == 0x20 && v6.s6_addr[1] == 0x02 ? v6.s6_addr + 2 : nullptr;
}

bool isPublic(const in6_addr& address)
{
    in_addr v4{};
    if (const unsigned char* embedded = embeddedIPv4(address)) {
        std::memcpy(&v4, embedded, sizeof v4);
        return isPublic(v4);
    }
    const auto first = [&address](const std::array<unsigned char, 4>& network, unsigned bits) {
        std::uint32_t a = 0, b = 0;
        std::memcpy(&a, address.s6_addr, sizeof a);
        std::memcpy(&b, network.data(), sizeof b);
        return (ntohl(a) ^ ntohl(b)) >> (32 - bits) == 0;
    };
    return first({0x20}, 3) &&
           std::ranges::none_of(kInner6, [&](const Range6& range) { return first(range.network, range.bits); });
}

/// Returns true for fields that describe the wanted response and don't identify the client.
bool goesToAnyOrigin(std::string_view name)
{
    constexpr std::array<std::string_view, 6> kNames{"Accept",        "Accept-Language", "Accept-Encoding",
                                                     "Cache-Control", "Range",           "User-Agent"};
    return std::ranges::any_of(kNames, [name](std::string_view other) { return equalIgnoringCase(name, other); });
}

/// Returns the URL's origin, scheme, host and port: "https://example.com:443" (RFC 9110, 4.3.1).
std::string originOf(const Url& url)
{
    const std::string scheme = url.scheme();
    return fmt::format("{}://{}:{}", scheme, url.host(), url.port().value_or(scheme == "https" ? 443 : 80));
}

} // namespace

bool isPublicAddress(const std::string& address)
{
    in_addr v4{};
    in6_addr v6{};
    if (inet_pton(AF_INET6, address.c_str(), &v6) == 1) return isPublic(v6);
    return inet_pton(AF_INET, address.c_str(), &v4) == 1 && isPublic(v4);
}

UrlSource sourceOf(const Url& url)
{
    std::string host = url.host();
    if (host.starts_with('[') && host.ends_with(']')) host = host.substr(1, host.size() - 2);
    std::array<unsigned char, sizeof(in6_addr)> bytes{};
    const bool isAddress =
        inet_pton(AF_INET, host.c_str(), bytes.data()) == 1 || inet_pton(AF_INET6, host.c_str(), bytes.data()) == 1;
    const bool isLocal = host == "localhost" || host.ends_with(".localhost");
    return {.secure = url.scheme() == "https", .isPublic = isAddress ? isPublicAddress(host) : !isLocal};
}

UrlSource sourceOf(const UrlResponse& response)
{
    UrlSource source = sourceOf(response.url);
    if (response.publicPeer) source.isPublic = *response.publicPeer;
    return source;
}

Result<UrlRequest> withinSource(UrlRequest request)
{
    if (!request.source) return request;
    const std::string scheme = request.url.scheme();
    if (scheme != "https" && (scheme != "http" || request.source->secure))
        return std::unexpected(urlError(kUrlForbiddenRedirect, fmt::format("led to the scheme \"{}\"", scheme)));
    request.url = request.url.withoutUserInfo();
    return request;
}

std::optional<Result<UrlRequest>> redirected(const UrlRequest& request, bool hasBody, const UrlResponse& answer,
                                             UrlSource source)
{
    constexpr std::array kStatuses{301, 302, 303, 307, 308};
    const std::string* location = answer.headers.find("Location");
    if (std::ranges::find(kStatuses, answer.statusCode) == kStatuses.end() || !location || location->empty())
        return std::nullopt;
    const auto url = request.url.resolve(*location);
    if (!url) return std::unexpected(urlError(kUrlForbiddenRedirect, "redirected to an invalid URL"));

    UrlRequest next = request;
    next.url = *url;
    next.source = source;
    const bool asGet =
        answer.statusCode == 303 ? request.method != "HEAD" : answer.statusCode <= 302 && request.method == "POST";
    if (asGet) {
        next.method = "GET";
        next.body = {};
        next.headers.remove("Content-Type");
        next.headers.remove("Content-Encoding");
    }
    if (originOf(*url) != originOf(request.url)) {
        if (hasBody && !asGet)
            return std::unexpected(urlError(kUrlForbiddenRedirect, "redirected to another host with a body"));
        HttpHeaders passed;
        for (const auto& [name, value] : next.headers)
            if (goesToAnyOrigin(name)) passed.add(name, value);
        next.headers = std::move(passed);
    }
    return withinSource(std::move(next));
}

} // namespace platform
