#pragma once

#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/values/Value.h"

namespace platform {

/// String keys to values, in the order in which the keys were first set.
///
/// Look-up is linear up to a few entries and hashed above, so a hostile document of a million keys costs no
/// more than its length.
class Dictionary {
public:
    using Entry = std::pair<std::string, Value>;

    Dictionary();
    Dictionary(std::initializer_list<Entry> entries);
    Dictionary(const Dictionary&);
    Dictionary(Dictionary&&) noexcept;
    Dictionary& operator=(const Dictionary&);
    Dictionary& operator=(Dictionary&&) noexcept;
    ~Dictionary();

    [[nodiscard]] const Value* find(std::string_view key) const;
    [[nodiscard]] bool contains(std::string_view key) const { return find(key) != nullptr; }
    /// Sets the value of a key, keeping its place if it is there already.
    void set(std::string key, Value value);
    /// True if the key was there. Costs as much as the dictionary is long.
    bool remove(std::string_view key);
    void reserve(std::size_t count);

    [[nodiscard]] std::size_t size() const { return _entries.size(); }
    [[nodiscard]] bool empty() const { return _entries.empty(); }
    [[nodiscard]] auto begin() const { return _entries.begin(); }
    [[nodiscard]] auto end() const { return _entries.end(); }

    friend bool operator==(const Dictionary& a, const Dictionary& b);

private:
    struct Index;
    [[nodiscard]] std::optional<std::size_t> positionOf(std::string_view key) const;

    std::vector<Entry> _entries;
    std::unique_ptr<Index> _index; // made when the dictionary grows past the linear limit
};

} // namespace platform
