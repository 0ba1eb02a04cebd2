#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// A validated absolute URL: it has a scheme and an authority or absolute path (no "mailto:"), and its text has only
/// characters that a URL may contain (RFC 3986). A plain value; empty by default.
class Url {
public:
    Url() = default;

    /// Returns nullopt if the text isn't an absolute URL, has control characters or is longer than 64 KiB.
    /// Percent-encodes characters that a URL can't contain and a "%" that starts no escape, as users expect of pasted
    /// URLs. Replaces a Unicode host of an http or https URL by its ASCII name ("xn--...", UTS 46 non-transitional);
    /// the URL is invalid if the host has no ASCII name.
    [[nodiscard]] static std::optional<Url> parse(std::string_view text);
    /// Resolves a reference found in a document at this URL (RFC 3986, 5). Returns nullopt if the result is invalid.
    [[nodiscard]] std::optional<Url> resolve(std::string_view reference) const;

    /// Returns the URL's text, as it is sent.
    [[nodiscard]] const std::string& string() const { return _text; }
    [[nodiscard]] bool empty() const { return _text.empty(); }

    [[nodiscard]] std::string scheme() const; ///< lower-case
    [[nodiscard]] std::string host() const;   ///< lower-case; empty if the URL has no host
    [[nodiscard]] std::optional<unsigned> port() const;
    [[nodiscard]] std::string path() const;                 ///< percent-encoded, unchanged
    [[nodiscard]] std::optional<std::string> query() const; ///< percent-encoded, unchanged
    /// Returns the decoded value of the first query item of that name; nullopt if the item is missing or has no value.
    [[nodiscard]] std::optional<std::string> queryValue(std::string_view name) const;
    /// Returns the URL without "user:password@".
    [[nodiscard]] Url withoutUserInfo() const;

    friend bool operator==(const Url&, const Url&) = default;

private:
    friend class UrlComponents;
    explicit Url(std::string text) : _text(std::move(text)) {}
    std::string _text;
};

/// A query item. Name and value are plain text, not percent-encoded. An item without a value is written as a bare name.
struct QueryItem {
    std::string name;
    std::optional<std::string> value;
    /// The item's text in the URL from which it was read. It is written back unchanged, so that the service's own
    /// encoding ("a+b", "%7e") survives. nullopt for a new item.
    std::optional<std::string> encoded;

    QueryItem(std::string name_, std::optional<std::string> value_ = std::nullopt)
        : name(std::move(name_)), value(std::move(value_))
    {}
    friend bool operator==(const QueryItem&, const QueryItem&) = default;
};

/// A URL split at its query, for changing the query. A plain value.
class UrlComponents {
public:
    explicit UrlComponents(const Url& url);

    /// Returns the query's items in order, with duplicates. "+" is a plus sign, not a blank.
    [[nodiscard]] std::vector<QueryItem> queryItems() const;
    /// Replaces the query. An empty list removes it and its "?".
    void setQueryItems(const std::vector<QueryItem>& items);
    [[nodiscard]] const std::optional<std::string>& percentEncodedQuery() const { return _query; }
    void setPercentEncodedQuery(std::optional<std::string> query);

    [[nodiscard]] Url url() const;

private:
    std::string _beforeQuery;
    std::optional<std::string> _query;
    std::string _fragment; // with its "#"
};

/// Percent-encodes a query item's name or value. Keeps the characters that RFC 3986 allows in a query, except "&", "=",
/// "#" and "+"; the bytes of all others become "%XX" with upper-case digits.
[[nodiscard]] std::string percentEncodeQueryComponent(std::string_view text);
/// Percent-encodes all but RFC 3986's unreserved characters, for use inside a path segment.
[[nodiscard]] std::string percentEncodePathSegment(std::string_view text);
/// Decodes percent-encoding. Keeps a "%" that two hexadecimal digits don't follow.
[[nodiscard]] std::string percentDecode(std::string_view text);

} // namespace platform
