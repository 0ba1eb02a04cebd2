#pragma once

#include <initializer_list>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace platform {

/// Compares field names, content codings or directives: ignores the case of ASCII letters (RFC 9110, 5.1). Any thread.
[[nodiscard]] bool equalIgnoringCase(std::string_view a, std::string_view b);
/// Returns a text without the blanks and tabs around it (RFC 9110, 5.6.3). Any thread.
[[nodiscard]] std::string_view withoutBlanks(std::string_view text);

/// Header fields in order. Names are compared case-insensitively (RFC 9110, 5.1). A plain value.
class HttpHeaders {
public:
    using Entry = std::pair<std::string, std::string>;

    HttpHeaders() = default;
    HttpHeaders(std::initializer_list<Entry> entries) : _entries(entries) {}

    /// Returns the value of the first field of that name, or null. Valid until the next change.
    [[nodiscard]] const std::string* find(std::string_view name) const;
    /// Returns the values of all fields of that name, joined by commas (RFC 9110, 5.3).
    [[nodiscard]] std::string list(std::string_view name) const;
    /// Replaces all fields of that name by one.
    void set(std::string name, std::string value);
    /// Appends a field; keeps others of that name.
    void add(std::string name, std::string value) { _entries.emplace_back(std::move(name), std::move(value)); }
    void remove(std::string_view name);
    /// Removes all fields that have a name of `others`, then appends `others`, whose names may repeat.
    void replaceBy(HttpHeaders others);

    [[nodiscard]] auto begin() const { return _entries.begin(); }
    [[nodiscard]] auto end() const { return _entries.end(); }
    [[nodiscard]] std::size_t size() const { return _entries.size(); }
    [[nodiscard]] bool empty() const { return _entries.empty(); }
    friend bool operator==(const HttpHeaders&, const HttpHeaders&) = default;

private:
    std::vector<Entry> _entries;
};

} // namespace platform
