#include "platform/net/Url.h"

#include <algorithm>
#include <charconv>
#include <memory>

#include <curl/curl.h>
#include <unicode/uidna.h>

#include "platform/net/UrlScheme.h"

namespace platform {

namespace {

constexpr std::size_t kMaximumLength = 64u << 10;
/// Bytes. An ASCII host name has at most 253 characters; its Unicode form in UTF-8 isn't much longer.
constexpr std::size_t kMaximumHost = 1024;
/// Flags for resolving, which removes dot segments. Parsing adds CURLU_PATH_AS_IS, which keeps them.
constexpr unsigned kFlags = CURLU_NON_SUPPORT_SCHEME | CURLU_NO_AUTHORITY;

using Handle = std::unique_ptr<CURLU, decltype(&curl_url_cleanup)>;

/// Parses a URL; returns null if it is invalid.
Handle parsed(const std::string& text)
{
    Handle handle(curl_url(), curl_url_cleanup);
    if (!handle || curl_url_set(handle.get(), CURLUPART_URL, text.c_str(), kFlags | CURLU_PATH_AS_IS) != CURLUE_OK)
        return {nullptr, curl_url_cleanup};
    return handle;
}

std::optional<std::string> part(const std::string& text, CURLUPart which)
{
    const Handle handle = parsed(text);
    char* found = nullptr;
    if (!handle || curl_url_get(handle.get(), which, &found, 0) != CURLUE_OK) return std::nullopt;
    std::string result(found);
    curl_free(found);
    return result;
}

std::string lowerCased(std::string text)
{
    std::ranges::transform(text, text.begin(),
                           [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; });
    return text;
}

bool isUnreserved(unsigned char c)
{
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' || c == '.' ||
           c == '_' || c == '~';
}

template <class Keep> std::string percentEncode(std::string_view text, Keep keep)
{
    static constexpr char kDigits[] = "0123456789ABCDEF";
    std::string result;
    result.reserve(text.size());
    for (const char character : text) {
        const auto c = static_cast<unsigned char>(character);
        if (keep(c)) {
            result.push_back(character);
        } else {
            result.push_back('%');
            result.push_back(kDigits[c >> 4]);
            result.push_back(kDigits[c & 15]);
        }
    }
    return result;
}

/// Returns true for characters that a URL may contain unencoded, and for "%".
bool isUrlCharacter(unsigned char c)
{
    return isUnreserved(c) || std::string_view(":/?#[]@!$&'()*+,;=%").contains(static_cast<char>(c));
}

int hexDigit(char c)
{
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

/// Returns the byte that the escape at `at` encodes; -1 if there is no complete escape.
int escapedByte(std::string_view text, std::size_t at)
{
    if (text[at] != '%' || at + 2 >= text.size()) return -1;
    const int high = hexDigit(text[at + 1]);
    const int low = hexDigit(text[at + 2]);
    return high < 0 || low < 0 ? -1 : high << 4 | low;
}

/// Positions in "scheme://user@host:port/path". All are npos for a text without "://".
struct Authority {
    std::size_t begin = std::string_view::npos; // after "//"
    std::size_t host = std::string_view::npos;
    std::size_t hostEnd = std::string_view::npos;
};

Authority authorityIn(std::string_view text)
{
    const std::size_t mark = text.find("://");
    if (mark == std::string_view::npos || !isUrlScheme(text.substr(0, mark))) return {};
    Authority found{.begin = mark + 3};
    const std::size_t end = std::min(text.find_first_of("/?#", found.begin), text.size());
    const std::string_view authority = text.substr(found.begin, end - found.begin);
    const std::size_t at = authority.rfind('@');
    found.host = at == std::string_view::npos ? found.begin : found.begin + at + 1;
    // The colons of an IPv6 address are inside brackets.
    const std::size_t colon =
        text.find(':', text.substr(found.host).starts_with('[') ? text.find(']', found.host) : found.host);
    found.hostEnd = std::min(colon, end);
    return found;
}

/// Returns the ASCII name of a Unicode host; nullopt if it has none.
std::optional<std::string> asciiHost(const std::string& host)
{
    if (host.size() > kMaximumHost) return std::nullopt;
    struct Processor {
        UErrorCode error = U_ZERO_ERROR;
        UIDNA* idna = uidna_openUTS46(UIDNA_CHECK_BIDI | UIDNA_CHECK_CONTEXTJ | UIDNA_NONTRANSITIONAL_TO_ASCII, &error);
        ~Processor() { uidna_close(idna); }
    };
    static const Processor processor;
    UErrorCode error = processor.error;
    UIDNAInfo info = UIDNA_INFO_INITIALIZER;
    std::string name(kMaximumHost, '\0');
    const std::int32_t length =
        uidna_nameToASCII_UTF8(processor.idna, host.data(), static_cast<std::int32_t>(host.size()), name.data(),
                               static_cast<std::int32_t>(name.size()), &info, &error);
    if (U_FAILURE(error) || info.errors != 0 || length <= 0) return std::nullopt;
    name.resize(static_cast<std::size_t>(length));
    // Compatibility characters may map to delimiters ("℀" to "a/c"), at which the host would end.
    return std::ranges::all_of(name, isUnreserved) ? std::optional(std::move(name)) : std::nullopt;
}

/// Replaces a Unicode host, percent-encoded or not, by its ASCII name. Returns other URLs unchanged, and nullopt if the
/// host has no ASCII name.
std::optional<std::string> withAsciiHost(std::string_view text)
{
    const Authority at = authorityIn(text);
    if (at.host == std::string_view::npos) return std::string(text);
    const std::string scheme = lowerCased(std::string(text.substr(0, text.find(':'))));
    const std::string host = percentDecode(text.substr(at.host, at.hostEnd - at.host));
    const bool isUnicode = std::ranges::any_of(host, [](unsigned char c) { return c >= 0x80; });
    if (!isUnicode || (scheme != "http" && scheme != "https")) return std::string(text);
    const auto name = asciiHost(host);
    if (!name) return std::nullopt;
    return std::string(text.substr(0, at.host)) + *name + std::string(text.substr(at.hostEnd));
}

/// Encodes each "%" that starts no escape.
std::string withWholeEscapes(std::string_view text)
{
    std::string result;
    for (std::size_t i = 0; i < text.size(); ++i) {
        result.push_back(text[i]);
        if (text[i] == '%' && escapedByte(text, i) < 0) result += "25";
    }
    return result;
}

} // namespace

std::string percentEncodeQueryComponent(std::string_view text)
{
    return percentEncode(text, [](unsigned char c) {
        return isUnreserved(c) || std::string_view("/?:@!$'()*,;").contains(static_cast<char>(c));
    });
}

std::string percentEncodePathSegment(std::string_view text)
{
    return percentEncode(text, isUnreserved);
}

std::string percentDecode(std::string_view text)
{
    std::string result;
    result.reserve(text.size());
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (const int byte = escapedByte(text, i); byte >= 0) {
            result.push_back(static_cast<char>(byte));
            i += 2;
        } else {
            result.push_back(text[i]);
        }
    }
    return result;
}

std::optional<Url> Url::parse(std::string_view text)
{
    const auto isControl = [](unsigned char c) { return c < 0x20 || c == 0x7f; };
    if (text.empty() || text.size() > kMaximumLength || std::ranges::any_of(text, isControl)) return std::nullopt;

    const auto ascii = withAsciiHost(text);
    if (!ascii) return std::nullopt;
    std::string encoded = percentEncode(*ascii, isUrlCharacter);
    if (encoded.contains('%')) encoded = withWholeEscapes(encoded);
    const std::size_t colon = encoded.find(':');
    const std::string_view scheme = std::string_view(encoded).substr(0, colon);
    if (colon == std::string::npos || !isUrlScheme(scheme) || encoded.size() > kMaximumLength || !parsed(encoded))
        return std::nullopt;
    return Url(std::move(encoded));
}

std::optional<Url> Url::resolve(std::string_view reference) const
{
    if (const std::size_t mark = reference.find_first_of(":/?#");
        mark != std::string_view::npos && reference[mark] == ':' && isUrlScheme(reference.substr(0, mark)))
        return parse(reference);
    if (reference.starts_with("//")) return parse(scheme() + ":" + std::string(reference));
    const Handle handle = parsed(_text);
    const std::string encoded = withWholeEscapes(percentEncode(reference, isUrlCharacter));
    char* found = nullptr;
    if (!handle || encoded.size() > kMaximumLength ||
        curl_url_set(handle.get(), CURLUPART_URL, encoded.c_str(), kFlags) != CURLUE_OK ||
        curl_url_get(handle.get(), CURLUPART_URL, &found, 0) != CURLUE_OK)
        return std::nullopt;
    const std::unique_ptr<char, decltype(&curl_free)> owner(found, curl_free);
    return parse(found);
}

Url Url::withoutUserInfo() const
{
    const Authority at = authorityIn(_text);
    if (at.host == at.begin) return *this;
    return Url(_text.substr(0, at.begin) + _text.substr(at.host));
}

std::string Url::scheme() const
{
    return lowerCased(_text.substr(0, _text.find(':')));
}

std::string Url::host() const
{
    return lowerCased(part(_text, CURLUPART_HOST).value_or(""));
}

std::optional<unsigned> Url::port() const
{
    const auto text = part(_text, CURLUPART_PORT);
    unsigned port = 0;
    if (!text || std::from_chars(text->data(), text->data() + text->size(), port).ec != std::errc())
        return std::nullopt;
    return port;
}

std::string Url::path() const
{
    return part(_text, CURLUPART_PATH).value_or("");
}

std::optional<std::string> Url::query() const
{
    return UrlComponents(*this).percentEncodedQuery();
}

std::optional<std::string> Url::queryValue(std::string_view name) const
{
    for (QueryItem& item : UrlComponents(*this).queryItems())
        if (item.name == name) return std::move(item.value);
    return std::nullopt;
}

UrlComponents::UrlComponents(const Url& url)
{
    std::string_view rest = url.string();
    const std::size_t hash = rest.find('#');
    if (hash != std::string_view::npos) _fragment = rest.substr(hash);
    rest = rest.substr(0, hash);
    const std::size_t mark = rest.find('?');
    if (mark != std::string_view::npos) _query = rest.substr(mark + 1);
    _beforeQuery = rest.substr(0, mark);
}

std::vector<QueryItem> UrlComponents::queryItems() const
{
    std::vector<QueryItem> items;
    std::string_view rest = _query ? std::string_view(*_query) : std::string_view();
    while (!rest.empty()) {
        const std::string_view piece = rest.substr(0, rest.find('&'));
        rest.remove_prefix(std::min(piece.size() + 1, rest.size()));
        if (piece.empty()) continue;
        const std::size_t equals = piece.find('=');
        QueryItem item(percentDecode(piece.substr(0, equals)));
        if (equals != std::string_view::npos) item.value = percentDecode(piece.substr(equals + 1));
        item.encoded = std::string(piece);
        items.push_back(std::move(item));
    }
    return items;
}

void UrlComponents::setQueryItems(const std::vector<QueryItem>& items)
{
    std::string query;
    for (const QueryItem& item : items) {
        if (!query.empty()) query.push_back('&');
        if (item.encoded) {
            query += *item.encoded;
            continue;
        }
        query += percentEncodeQueryComponent(item.name);
        if (item.value) query += "=" + percentEncodeQueryComponent(*item.value);
    }
    _query = items.empty() ? std::nullopt : std::optional(std::move(query));
}

void UrlComponents::setPercentEncodedQuery(std::optional<std::string> query)
{
    _query = std::move(query);
}

Url UrlComponents::url() const
{
    return Url(_beforeQuery + (_query ? "?" + *_query : "") + _fragment);
}

} // namespace platform
