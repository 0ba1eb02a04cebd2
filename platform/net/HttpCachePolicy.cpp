#include "platform/net/HttpCachePolicy.h"

#include <algorithm>
#include <array>

#include <curl/curl.h>

namespace platform {

namespace {

using std::chrono::seconds;

/// About 68 years; larger values count as this one (RFC 9111, 1.2.2).
constexpr seconds kLongest{std::int64_t{1} << 31};

/// Calls `each` with the elements of a comma-separated list. Ignores commas inside quotation marks.
template <class Each> void forEachElement(std::string_view list, Each each)
{
    bool quoted = false;
    std::size_t begin = 0;
    for (std::size_t i = 0; i <= list.size(); ++i) {
        if (i == list.size() || (list[i] == ',' && !quoted)) {
            if (const auto element = withoutBlanks(list.substr(begin, i - begin)); !element.empty()) each(element);
            begin = i + 1;
        } else if (list[i] == '"') {
            quoted = !quoted;
        } else if (list[i] == '\\' && quoted && i + 1 < list.size()) {
            ++i;
        }
    }
}

std::optional<seconds> deltaSeconds(std::string_view text)
{
    if (text.size() >= 2 && text.front() == '"' && text.back() == '"') text = text.substr(1, text.size() - 2);
    if (text.empty() || !std::ranges::all_of(text, [](char c) { return c >= '0' && c <= '9'; })) return std::nullopt;
    seconds value{0};
    for (const char c : text) value = std::min(value * 10 + seconds(c - '0'), kLongest);
    return value;
}

struct Directives {
    bool noStore = false;
    bool noCache = false;
    std::optional<seconds> maxAge; // the smallest, if there are several; 0 for an invalid one
};

Directives directivesOf(const HttpHeaders& headers)
{
    Directives found;
    forEachElement(headers.list("Cache-Control"), [&](std::string_view element) {
        const auto equals = element.find('=');
        const std::string_view name = withoutBlanks(element.substr(0, equals));
        if (equalIgnoringCase(name, "no-store")) found.noStore = true;
        // A "no-cache" with field names concerns only those fields; revalidating the whole response is allowed, too.
        if (equalIgnoringCase(name, "no-cache")) found.noCache = true;
        if (!equalIgnoringCase(name, "max-age")) return;
        const std::string_view value = equals == std::string_view::npos ? "" : element.substr(equals + 1);
        const seconds age = deltaSeconds(withoutBlanks(value)).value_or(seconds(0));
        found.maxAge = std::min(found.maxAge.value_or(age), age);
    });
    return found;
}

Directives requestDirectives(const HttpHeaders& headers)
{
    Directives found = directivesOf(headers);
    if (!headers.find("Cache-Control"))
        forEachElement(headers.list("Pragma"), [&](std::string_view element) {
            if (equalIgnoringCase(element, "no-cache")) found.noCache = true;
        });
    return found;
}

/// Returns the date in a field, in seconds since 1970; nothing if it is missing or invalid.
std::optional<seconds> dateIn(const HttpHeaders& headers, std::string_view name)
{
    const std::string* field = headers.find(name);
    if (!field) return std::nullopt;
    const time_t date = curl_getdate(field->c_str(), nullptr);
    return date < 0 ? std::nullopt : std::optional(std::min(seconds(date), 4 * kLongest));
}

seconds sinceEpoch(Date date)
{
    return std::chrono::floor<seconds>(date.time_since_epoch());
}

bool isCacheableByDefault(int status)
{
    constexpr std::array kStatuses{200, 203, 204, 300, 301, 308, 404, 405, 410, 414, 501}; // RFC 9110, 15.1
    return std::ranges::find(kStatuses, status) != kStatuses.end();
}

bool hasValidator(const HttpHeaders& headers)
{
    const std::string* tag = headers.find("ETag");
    return (tag && !tag->empty()) || dateIn(headers, "Last-Modified");
}

/// Compares two ETags weakly (RFC 9110, 8.8.3.2).
bool equalWeakly(std::string_view a, std::string_view b)
{
    if (a.starts_with("W/")) a.remove_prefix(2);
    if (b.starts_with("W/")) b.remove_prefix(2);
    return a == b;
}

/// Returns true for fields that a 304 doesn't update: those of the connection, and those that describe the stored body
/// (RFC 9111, 3.1 and 3.2).
bool keepsItsOwn(std::string_view name)
{
    constexpr std::array<std::string_view, 13> kNames{"Connection",
                                                      "Keep-Alive",
                                                      "Proxy-Authenticate",
                                                      "Proxy-Authentication-Info",
                                                      "Proxy-Authorization",
                                                      "Proxy-Connection",
                                                      "TE",
                                                      "Transfer-Encoding",
                                                      "Upgrade",
                                                      "Content-Encoding",
                                                      "Content-Type",
                                                      "Content-Range",
                                                      "Content-Length"};
    return std::ranges::any_of(kNames, [name](std::string_view own) { return equalIgnoringCase(own, name); });
}

} // namespace

std::string cacheKey(const Url& url)
{
    return url.string().substr(0, url.string().find('#'));
}

CacheUse cacheUse(const UrlRequest& request)
{
    if (!request.url.scheme().starts_with("http")) return CacheUse::None;
    if (request.method != "GET") {
        const bool safe = request.method == "HEAD" || request.method == "OPTIONS" || request.method == "TRACE";
        return safe ? CacheUse::None : CacheUse::Invalidate;
    }
    if (!request.body.empty()) return CacheUse::None;
    for (const char* name : {"Authorization", "Range", "If-Range", "If-Match", "If-None-Match", "If-Modified-Since",
                             "If-Unmodified-Since"})
        if (request.headers.find(name)) return CacheUse::None;
    if (requestDirectives(request.headers).noStore) return CacheUse::None;
    return request.cachePolicy == UrlRequest::CachePolicy::ReloadIgnoringCache ? CacheUse::Fill : CacheUse::Ask;
}

std::optional<std::string> selectingFields(const UrlResponse& response, const UrlRequest& request)
{
    std::string fields;
    bool any = false;
    forEachElement(response.headers.list("Vary"), [&](std::string_view name) {
        if (name == "*") any = true;
        fields.append(name).append(":").append(request.headers.list(name)).append("\n");
    });
    return any ? std::nullopt : std::optional(std::move(fields));
}

bool isStorable(const UrlRequest& request, const UrlResponse& response, Date received)
{
    return response.isHttp && isCacheableByDefault(response.statusCode) && !directivesOf(response.headers).noStore &&
           selectingFields(response, request) &&
           (freshnessLifetime(response, received) > seconds(0) || hasValidator(response.headers));
}

seconds freshnessLifetime(const UrlResponse& response, Date received)
{
    const HttpHeaders& headers = response.headers;
    const Directives directives = directivesOf(headers);
    if (directives.noCache) return seconds(0);
    if (directives.maxAge) return *directives.maxAge;
    const seconds date = dateIn(headers, "Date").value_or(sinceEpoch(received));
    if (headers.find("Expires"))
        return std::clamp(dateIn(headers, "Expires").value_or(date) - date, seconds(0), kLongest);
    const auto modified = dateIn(headers, "Last-Modified");
    if (!modified || !isCacheableByDefault(response.statusCode)) return seconds(0);
    return std::clamp((date - *modified) / 10, seconds(0), kLongest);
}

seconds currentAge(const StoredResponse& stored, Date now)
{
    const HttpHeaders& headers = stored.response.headers;
    const seconds received = sinceEpoch(stored.received);
    const seconds apparent = received - dateIn(headers, "Date").value_or(received);
    seconds told{0};
    if (const std::string* age = headers.find("Age"))
        told = deltaSeconds(withoutBlanks(std::string_view(*age).substr(0, age->find(',')))).value_or(seconds(0));
    const seconds corrected = told + received - sinceEpoch(stored.requested);
    return std::max({seconds(0), apparent, corrected}) + sinceEpoch(now) - received;
}

Reuse reuse(const StoredResponse& stored, const UrlRequest& request, Date now)
{
    if (selectingFields(stored.response, request) != stored.selecting) return Reuse::None;
    if (directivesOf(stored.response.headers).noStore) return Reuse::None; // stored by `HttpCache::store` only
    const Directives asked = requestDirectives(request.headers);
    const seconds age = currentAge(stored, now);
    const bool fresh = !asked.noCache && age < freshnessLifetime(stored.response, stored.received) &&
                       age <= asked.maxAge.value_or(kLongest) &&
                       now >= stored.received; // otherwise the clock was set back, and the age is unknown
    if (fresh) return Reuse::Answer;
    return hasValidator(stored.response.headers) ? Reuse::Confirm : Reuse::None;
}

UrlRequest confirmationRequest(const StoredResponse& stored, UrlRequest request)
{
    const HttpHeaders& headers = stored.response.headers;
    if (const std::string* tag = headers.find("ETag"); tag && !tag->empty()) request.headers.set("If-None-Match", *tag);
    if (const std::string* date = headers.find("Last-Modified"); date && dateIn(headers, "Last-Modified"))
        request.headers.set("If-Modified-Since", *date);
    return request;
}

bool confirms(const UrlResponse& notModified, const StoredResponse& stored)
{
    const std::string* tag = notModified.headers.find("ETag");
    if (!tag || tag->empty()) return true;
    const std::string* kept = stored.response.headers.find("ETag");
    return kept && equalWeakly(*tag, *kept);
}

StoredResponse confirmed(StoredResponse stored, const UrlResponse& notModified, Date requested, Date received)
{
    HttpHeaders& headers = stored.response.headers;
    // The Age of the old response doesn't apply to the new one.
    headers.remove("Age");
    HttpHeaders newer;
    for (const auto& [name, value] : notModified.headers)
        if (!keepsItsOwn(name)) newer.add(name, value);
    headers.replaceBy(std::move(newer));
    stored.requested = requested;
    stored.received = received;
    return stored;
}

} // namespace platform
