#pragma once

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/net/Url.h"
#include "platform/net/UrlSession.h"

namespace tavrin {

/// Collects the query items and headers of one request.
///
/// A forced item or header replaces the one of its name; a default is only added if there is none of its name. The base
/// URL's own query items are forced first, so that a default never replaces them. There is one item and one header for
/// each name, compared exactly. The query is sorted by name: equal items always give the same URL, regardless of the
/// order of their addition.
///
/// Short-lived. Not synchronised: one thread at a time.
class TavrinURLRequestBuilder {
public:
    [[nodiscard]] static TavrinURLRequestBuilder requestBuilderWithURL(const platform::Url& url);
    explicit TavrinURLRequestBuilder(platform::UrlComponents components);

    [[nodiscard]] bool containsQueryItemWithName(std::string_view name) const { return _queryItems.contains(name); }
    void forceQueryItem(platform::QueryItem item);
    /// An item without a value is sent as its bare name, without "=".
    void forceQueryItemWithName(std::string name, std::optional<std::string> value);
    void forceQueryItemsFromArray(const std::vector<platform::QueryItem>& items);
    void defaultQueryItem(platform::QueryItem item);
    void defaultQueryItemWithName(std::string_view name, std::optional<std::string> value);

    [[nodiscard]] bool containsHttpHeaderWithName(std::string_view name) const { return _httpHeaders.contains(name); }
    /// Without a value, removes the header.
    void forceHttpHeaderWithName(std::string name, std::optional<std::string> value);
    void defaultHttpHeaderWithName(std::string_view name, std::string value);

    /// Returns the request collected so far, with default method, cache policy and time-out. May be called repeatedly.
    [[nodiscard]] platform::UrlRequest createMutableUrlRequest() const;
    [[nodiscard]] const platform::UrlRequest createUrlRequest() const { return createMutableUrlRequest(); }

private:
    platform::UrlComponents _urlComponents;
    std::map<std::string, platform::QueryItem, std::less<>> _queryItems;
    std::map<std::string, std::string, std::less<>> _httpHeaders;
};

} // namespace tavrin
