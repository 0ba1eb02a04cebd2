#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// An absolute URL that has been checked: it has a scheme and an authority or absolute path (no "mailto:"), and its
/// text holds no character that a URL can't hold (RFC 3986).
class Url {
public:
    Url() = default;

    /// Nothing for text that is no absolute URL, has control characters or is longer than 64 KiB. Characters that a URL
    /// can't hold, and a "%" that begins no escape, are percent-encoded first, as a user would expect of a pasted one.
    [[nodiscard]] static std::optional<Url> parse(std::string_view text);

    /// The URL's text, as it goes on the wire. Empty for a default `Url`.
    [[nodiscard]] const std::string& string() const { return _text; }
    [[nodiscard]] bool empty() const { return _text.empty(); }

    [[nodiscard]] std::string scheme() const; ///< lower-case
    [[nodiscard]] std::string host() const;   ///< lower-case; empty if there is none
    [[nodiscard]] std::optional<unsigned> port() const;
    [[nodiscard]] std::string path() const;                 ///< percent-encoded, as it stands
    [[nodiscard]] std::optional<std::string> query() const; ///< percent-encoded, as it stands
    /// The decoded value of the first query item of that name.
    [[nodiscard]] std::optional<std::string> queryValue(std::string_view name) const;

    friend bool operator==(const Url&, const Url&) = default;

private:
    friend class UrlComponents;
    explicit Url(std::string text) : _text(std::move(text)) {}
    std::string _text;
};

/// One name and value of a query. Names and values are plain text, not encoded; no value is a bare name.
struct QueryItem {
    std::string name;
    std::optional<std::string> value;
    /// The item as it stood in the URL that it was read from; it is written back unchanged, so that what the
    /// service encoded in its own way ("a+b", "%7e") stays that way. None for an item of ours.
    std::optional<std::string> encoded;

    QueryItem(std::string name_, std::optional<std::string> value_ = std::nullopt)
        : name(std::move(name_)), value(std::move(value_))
    {}
    friend bool operator==(const QueryItem&, const QueryItem&) = default;
};

/// A URL taken apart, to change its query.
class UrlComponents {
public:
    explicit UrlComponents(const Url& url);

    /// The query's items in their order, duplicates included. "+" is a plus sign.
    [[nodiscard]] std::vector<QueryItem> queryItems() const;
    /// Replaces the query; an empty list leaves no "?".
    void setQueryItems(const std::vector<QueryItem>& items);
    [[nodiscard]] const std::optional<std::string>& percentEncodedQuery() const { return _query; }
    void setPercentEncodedQuery(std::optional<std::string> query);

    [[nodiscard]] Url url() const;

private:
    std::string _beforeQuery;
    std::optional<std::string> _query;
    std::string _fragment; // with its "#"
};

/// Percent-encodes a query item's name or value: what RFC 3986 allows in a query stays, except "&", "=", "#" and
/// "+"; the rest becomes UTF-8 bytes in "%XX" with capital digits.
[[nodiscard]] std::string percentEncodeQueryComponent(std::string_view text);
/// Percent-encodes everything but RFC 3986's unreserved characters, for use inside a path segment.
[[nodiscard]] std::string percentEncodePathSegment(std::string_view text);
/// Undoes percent-encoding; an incomplete "%" stands for itself.
[[nodiscard]] std::string percentDecode(std::string_view text);

} // namespace platform
