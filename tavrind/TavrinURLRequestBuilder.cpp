#include "tavrind/TavrinURLRequestBuilder.h"

namespace tavrin {

using platform::QueryItem;

TavrinURLRequestBuilder TavrinURLRequestBuilder::requestBuilderWithURL(const platform::Url& url)
{
    return TavrinURLRequestBuilder(platform::UrlComponents(url));
}

TavrinURLRequestBuilder::TavrinURLRequestBuilder(platform::UrlComponents components)
    : _urlComponents(std::move(components))
{
    forceQueryItemsFromArray(_urlComponents.queryItems());
}

void TavrinURLRequestBuilder::forceQueryItem(QueryItem item)
{
    std::string name = item.name;
    _queryItems.insert_or_assign(std::move(name), std::move(item));
}

void TavrinURLRequestBuilder::forceQueryItemWithName(std::string name, std::optional<std::string> value)
{
    forceQueryItem(QueryItem(std::move(name), std::move(value)));
}

void TavrinURLRequestBuilder::forceQueryItemsFromArray(const std::vector<QueryItem>& items)
{
    for (const QueryItem& item : items) forceQueryItem(item);
}

void TavrinURLRequestBuilder::defaultQueryItem(QueryItem item)
{
    if (!containsQueryItemWithName(item.name)) forceQueryItem(std::move(item));
}

void TavrinURLRequestBuilder::defaultQueryItemWithName(std::string_view name, std::optional<std::string> value)
{
    if (!containsQueryItemWithName(name)) forceQueryItemWithName(std::string(name), std::move(value));
}

void TavrinURLRequestBuilder::forceHttpHeaderWithName(std::string name, std::optional<std::string> value)
{
    if (value)
        _httpHeaders.insert_or_assign(std::move(name), std::move(*value));
    else
        _httpHeaders.erase(name);
}

void TavrinURLRequestBuilder::defaultHttpHeaderWithName(std::string_view name, std::string value)
{
    if (!containsHttpHeaderWithName(name)) _httpHeaders.emplace(name, std::move(value));
}

platform::UrlRequest TavrinURLRequestBuilder::createMutableUrlRequest() const
{
    std::vector<QueryItem> items;
    items.reserve(_queryItems.size());
    for (const auto& [name, item] : _queryItems) items.push_back(item);

    platform::UrlComponents components = _urlComponents;
    components.setQueryItems(items);
    if (const auto query = components.percentEncodedQuery()) {
        // RFC 3986 allows ";" in a query, but some servers split the query there.
        std::string encoded;
        encoded.reserve(query->size());
        for (const char c : *query) {
            if (c == ';')
                encoded += "%3B";
            else
                encoded += c;
        }
        components.setPercentEncodedQuery(std::move(encoded));
    }

    platform::UrlRequest request;
    request.url = components.url();
    for (const auto& [name, value] : _httpHeaders) request.headers.set(name, value);
    return request;
}

} // namespace tavrin
