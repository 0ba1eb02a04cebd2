#pragma once

#include <initializer_list>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace platform {

/// Header fields in the order in which they stand. Names compare without regard to case (RFC 9110).
class HttpHeaders {
public:
    using Entry = std::pair<std::string, std::string>;

    HttpHeaders() = default;
    HttpHeaders(std::initializer_list<Entry> entries) : _entries(entries) {}

    /// The first field of that name.
    [[nodiscard]] const std::string* find(std::string_view name) const;
    /// The values of all fields of that name, with commas between them: one list (RFC 9110, 5.3).
    [[nodiscard]] std::string list(std::string_view name) const;
    /// Sets a field in place of every one of that name.
    void set(std::string name, std::string value);
    /// Adds a field beside those that are there.
    void add(std::string name, std::string value) { _entries.emplace_back(std::move(name), std::move(value)); }
    void remove(std::string_view name);

    [[nodiscard]] auto begin() const { return _entries.begin(); }
    [[nodiscard]] auto end() const { return _entries.end(); }
    [[nodiscard]] std::size_t size() const { return _entries.size(); }
    [[nodiscard]] bool empty() const { return _entries.empty(); }
    friend bool operator==(const HttpHeaders&, const HttpHeaders&) = default;

private:
    std::vector<Entry> _entries;
};

} // namespace platform
