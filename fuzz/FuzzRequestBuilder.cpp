#include <algorithm>
#include <vector>

#include "fuzz/Check.h"
#include "platform/net/Url.h"
#include "tavrind/TavrinURLRequestBuilder.h"

using namespace platform;

/// The input is a URL, and below it lines "f name=value" or "d name=value" that are forced and defaulted. The request's
/// query is sorted, has each name once with the value that counts, and no ";"; made again it is the same.
void runInput(std::string_view input)
{
    const auto url = Url::parse(takeLine(input));
    if (!url) return;

    auto builder = tavrin::TavrinURLRequestBuilder::requestBuilderWithURL(*url);
    std::vector<QueryItem> expected; // each name once, the last forced value
    const auto expect = [&](const QueryItem& item, bool forced) {
        const auto found = std::ranges::find(expected, item.name, &QueryItem::name);
        if (found == expected.end())
            expected.push_back(item);
        else if (forced)
            found->value = item.value;
    };
    for (const QueryItem& item : UrlComponents(*url).queryItems()) expect(item, true);
    while (!input.empty()) {
        const std::string_view text = takeLine(input);
        if (text.size() < 3) continue; // an item without name and value is nothing
        const std::string_view pair = text.substr(2);
        const auto equals = pair.find('=');
        QueryItem item(std::string(pair.substr(0, equals)));
        if (equals != std::string_view::npos) item.value = pair.substr(equals + 1);
        const bool forced = text[0] == 'f';
        if (forced)
            builder.forceQueryItem(item);
        else
            builder.defaultQueryItem(item);
        expect(item, forced);
    }

    const Url made = builder.createMutableUrlRequest().url;
    check(builder.createMutableUrlRequest().url == made, made.string());
    check(made.host() == url->host() && made.path() == url->path(), made.string());
    check(made.query().value_or("").find(';') == std::string::npos, made.string());
    std::ranges::sort(expected, {}, &QueryItem::name);
    const auto items = UrlComponents(made).queryItems();
    check(std::ranges::equal(
              items, expected,
              [](const QueryItem& a, const QueryItem& b) { return a.name == b.name && a.value == b.value; }),
          made.string());
}
