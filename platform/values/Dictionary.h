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

/// Maps strings to values, in the order in which the keys were first set.
///
/// Small dictionaries are searched linearly, larger ones through a hash table. The hash is keyed with a random number
/// of the process, so that a hostile document can't choose keys that collide. Many threads may read a dictionary, or
/// one may write it.
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

    /// Returns the value of a key, or null if the key is missing. Valid until the dictionary is changed.
    [[nodiscard]] const Value* find(std::string_view key) const;
    [[nodiscard]] bool contains(std::string_view key) const { return find(key) != nullptr; }
    /// Sets the value of a key. An existing key keeps its place.
    void set(std::string key, Value value);
    /// Removes a key and returns true, or returns false if the key is missing. Takes time proportional to the size.
    bool remove(std::string_view key);
    void reserve(std::size_t count);

    [[nodiscard]] std::size_t size() const { return _entries.size(); }
    [[nodiscard]] bool empty() const { return _entries.empty(); }
    [[nodiscard]] auto begin() const { return _entries.begin(); }
    [[nodiscard]] auto end() const { return _entries.end(); }

    /// Ignores the order of entries.
    friend bool operator==(const Dictionary& a, const Dictionary& b);

private:
    struct Index;
    [[nodiscard]] std::optional<std::size_t> positionOf(std::string_view key) const;

    std::vector<Entry> _entries;
    std::unique_ptr<Index> _index; // null while the dictionary is small
};

} // namespace platform
