#include <algorithm>

#include "fuzz/Check.h"
#include "platform/net/Url.h"

using namespace platform;

namespace {

constexpr std::size_t kLongestUrl = 64u << 10;

void checkEncoding(std::string_view text)
{
    for (const std::string& encoded : {percentEncodeQueryComponent(text), percentEncodePathSegment(text)}) {
        check(percentDecode(encoded) == text, encoded);
        check(encoded.find_first_of("&=#+ []<>\"\\") == std::string::npos, encoded);
        check(std::ranges::all_of(encoded, [](unsigned char c) { return c > 0x20 && c < 0x7f; }), encoded);
    }
}

void checkItems(const Url& url, std::vector<QueryItem> items)
{
    UrlComponents components(url);
    components.setQueryItems(items);
    const Url changed = components.url();
    const auto reparsed = Url::parse(changed.string());
    if (!reparsed) return check(changed.string().size() > kLongestUrl, changed.string());
    check(*reparsed == changed && changed.host() == url.host() && changed.path() == url.path(), changed.string());

    const auto read = UrlComponents(changed).queryItems();
    check(std::ranges::equal(read, items,
                             [](const QueryItem& a, const QueryItem& b) {
                                 return a.name == b.name && a.value == b.value &&
                                        (!b.encoded || a.encoded == b.encoded);
                             }),
          changed.string());
}

} // namespace

/// The input is a URL, and on lines of their own a name and a value to add to its query. A URL is the same when it is
/// parsed again and when it is put together again, and its query holds what was put in.
void runInput(std::string_view input)
{
    const auto url = Url::parse(takeLine(input));
    const std::string name(takeLine(input));
    const std::string value(input);
    checkEncoding(name);
    checkEncoding(value);
    if (!url) return;

    check(Url::parse(url->string()) == url, url->string());
    check(UrlComponents(*url).url() == *url, url->string());
    const std::string scheme = url->scheme();
    check(!scheme.empty() && std::ranges::none_of(scheme, [](char c) { return c >= 'A' && c <= 'Z'; }), scheme);
    check(!url->port() || *url->port() <= 65535, url->string());

    auto items = UrlComponents(*url).queryItems();
    checkItems(*url, items);
    for (QueryItem& item : items) item.encoded.reset();
    checkItems(*url, items);
    if (!name.empty()) items.emplace_back(name, value);
    items.emplace_back("=&#", std::nullopt);
    checkItems(*url, items);
}
