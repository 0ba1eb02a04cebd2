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
/// What a request must carry is forced and replaces what is there; what it may carry is defaulted and never does. The
/// base URL's own query items are forced first. There is one item for each name and one header for each name (compared
/// exactly), and the query is sorted by name, so equal items always give the same URL.
///
/// Short-lived; one thread.
class TavrinURLRequestBuilder {
public:
    [[nodiscard]] static TavrinURLRequestBuilder requestBuilderWithURL(const platform::Url& url);
    explicit TavrinURLRequestBuilder(platform::UrlComponents components);

    [[nodiscard]] bool containsQueryItemWithName(std::string_view name) const { return _queryItems.contains(name); }
    void forceQueryItem(platform::QueryItem item);
    /// Without a value: a bare name, without "=".
    void forceQueryItemWithName(std::string name, std::optional<std::string> value);
    void forceQueryItemsFromArray(const std::vector<platform::QueryItem>& items);
    void defaultQueryItem(platform::QueryItem item);
    void defaultQueryItemWithName(std::string_view name, std::optional<std::string> value);

    [[nodiscard]] bool containsHttpHeaderWithName(std::string_view name) const { return _httpHeaders.contains(name); }
    /// Without a value: removes the header.
    void forceHttpHeaderWithName(std::string name, std::optional<std::string> value);
    void defaultHttpHeaderWithName(std::string_view name, std::string value);

    /// The request so far, to be changed further; may be called again.
    [[nodiscard]] platform::UrlRequest createMutableUrlRequest() const;
    [[nodiscard]] const platform::UrlRequest createUrlRequest() const { return createMutableUrlRequest(); }

private:
    platform::UrlComponents _urlComponents;
    std::map<std::string, platform::QueryItem, std::less<>> _queryItems;
    std::map<std::string, std::string, std::less<>> _httpHeaders;
};

} // namespace tavrin
