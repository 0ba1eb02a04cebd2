#include "tavrind/DeepLinks.h"

#include <algorithm>

#include "platform/net/Url.h"
#include "platform/net/UrlScheme.h"
#include "platform/text/Text.h"

namespace tavrin {

namespace {

constexpr std::size_t kLongestLink = 64u << 10;
// Characters that need no escape in a host or a path, besides letters and digits (RFC 3986, sections 3.2.2 and 3.3).
constexpr std::string_view kUnreserved = "-._~";
constexpr std::string_view kHostMarks = "!$&'()*+,;=";
constexpr std::string_view kPathMarks = "!$&'()*+,;=:@/";

bool isDigit(char c)
{
    return c >= '0' && c <= '9';
}

bool isUnreserved(char c)
{
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || isDigit(c) || kUnreserved.contains(c);
}

/// Percent-encodes all but `marks` and unreserved characters.
std::string encoded(std::string_view text, std::string_view marks)
{
    std::string result;
    for (const char c : text) {
        if (marks.contains(c))
            result += c;
        else
            result += platform::percentEncodePathSegment({&c, 1});
    }
    return result;
}

/// Decodes needless escapes and encodes characters that need an escape. Keeps all other escapes: decoding them would
/// change the path's meaning.
std::string normalizedPath(std::string_view path)
{
    std::string result;
    while (!path.empty()) {
        const std::string_view escape = path.substr(0, 3);
        const std::string byte = platform::percentDecode(escape);
        const bool escaped = escape.front() == '%' && byte.size() == 1 && escape.size() == 3;
        result += escaped ? encoded(byte, "") : encoded(path.substr(0, 1), kPathMarks);
        path.remove_prefix(escaped ? 3 : 1);
    }
    return result;
}

/// Returns the host of an authority; nothing if the authority is invalid.
std::optional<std::string> hostOf(std::string_view authority)
{
    if (const auto at = authority.rfind('@'); at != std::string_view::npos) authority.remove_prefix(at + 1);
    const auto bracket = authority.starts_with('[') ? authority.find(']') : std::string_view::npos;
    const auto colon = authority.find(':', bracket == std::string_view::npos ? 0 : bracket);
    if (colon != std::string_view::npos && !std::ranges::all_of(authority.substr(colon + 1), isDigit))
        return std::nullopt;
    const std::string_view host = authority.substr(0, colon);
    if (!host.starts_with('[')) return encoded(platform::lowerCased(platform::percentDecode(host)), kHostMarks);
    const auto inAddress = [](char c) { return isUnreserved(c) || c == ':'; };
    const bool address = host.ends_with(']') && std::ranges::all_of(host.substr(1, host.size() - 2), inAddress);
    return address ? std::optional(platform::lowerCased(host)) : std::nullopt;
}

/// Returns the recorded form of a link; empty if the text is not a link.
std::string recordedLink(std::string_view link)
{
    const auto components = deepLinkComponents(platform::trimmed(link));
    const std::string normalized = components ? tavrin_normalizedURLStringForDeepLinkIngest(*components) : "";
    if (normalized.empty() || DeepLinks::_isUniversalLink(*components)) return platform::lowerCased(normalized);
    return platform::lowerCased(components->scheme + "://" + normalized);
}

} // namespace

std::optional<DeepLinkComponents> deepLinkComponents(std::string_view link)
{
    const auto isControl = [](char c) { return static_cast<unsigned char>(c) < 0x20 || c == 0x7f; };
    const auto colon = link.find(':');
    if (link.size() > kLongestLink || colon == std::string_view::npos ||
        !platform::isUrlScheme(link.substr(0, colon)) || std::ranges::any_of(link, isControl))
        return std::nullopt;
    std::string_view rest = link.substr(colon + 1);
    rest = rest.substr(0, rest.find_first_of("?#"));
    std::optional<std::string> host = "";
    if (rest.starts_with("//")) {
        rest.remove_prefix(2);
        const std::string_view authority = rest.substr(0, rest.find('/'));
        rest.remove_prefix(authority.size());
        host = hostOf(authority);
    }
    if (!host) return std::nullopt;
    return DeepLinkComponents{platform::lowerCased(link.substr(0, colon)), std::move(*host), normalizedPath(rest)};
}

std::string tavrin_normalizedURLStringForDeepLinkIngest(const DeepLinkComponents& link)
{
    std::string text = (link.host.starts_with("www.") ? link.host.substr(4) : link.host) + link.path;
    while (text.ends_with('/')) text.pop_back();
    return text;
}

std::vector<DeepLinkEntry> DeepLinks::deepLinksFor(const std::vector<platform::AppActivity>& events)
{
    std::vector<DeepLinkEntry> entries;
    for (const platform::AppActivity& event : events) {
        if (!event.publiclyIndexable) continue;
        DeepLinkEntry entry{event.bundleIdentifier, {}};
        for (const auto& link : {event.relatedUniqueIdentifier, event.contentUrl})
            if (link) entry.links.push_back(*link);
        if (!entry.links.empty()) entries.push_back(std::move(entry));
    }
    return entries;
}

FilteredDeepLinks DeepLinks::_normalizeAndFilterDeepLinks(const std::vector<DeepLinkEntry>& entries,
                                                          const List& blacklist, const List& whitelist)
{
    FilteredDeepLinks result;
    for (const DeepLinkEntry& entry : entries) {
        const std::string identifier = platform::lowerCased(entry.bundleIdentifier);
        if (identifier.empty()) continue;
        if (!whitelist.contains(identifier)) {
            if (blacklist.contains(identifier)) {
                ++result.notWhitelistedButDenied;
            } else {
                save(identifier, identifier, result.submission);
                ++result.bundleIdentifiers;
            }
            continue;
        }
        for (const std::string& each : entry.links) {
            std::string link = recordedLink(each);
            if (link.empty()) continue;
            if (blacklist.contains(link)) {
                ++result.whitelistedButDenied;
            } else {
                save(identifier, std::move(link), result.submission);
                ++result.urls;
            }
        }
    }
    return result;
}

bool DeepLinks::_isUniversalLink(const DeepLinkComponents& link)
{
    return link.scheme == "http" || link.scheme == "https";
}

void DeepLinks::save(const std::string& key, std::string link, DeepLinkSubmission& submission)
{
    submission[key].insert(std::move(link));
}

std::vector<std::string> DeepLinks::recordingOrder(const DeepLinkSubmission& submission, std::mt19937_64& random)
{
    std::vector<std::string> order;
    for (const auto& [identifier, links] : submission) order.push_back(identifier);
    std::ranges::shuffle(order, random);
    return order;
}

} // namespace tavrin
