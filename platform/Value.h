#pragma once

#include <cstdint>
#include <expected>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <variant>
#include <vector>

#include "platform/Bytes.h"
#include "platform/Date.h"

namespace platform {

struct Error;
class Dictionary;

/// One value of a JSON document, a property list or an IPC message.
///
/// Copies are cheap: strings, arrays and dictionaries are shared and copied when one holder changes its own
/// (`mutableArray()`, `mutableDictionary()`). A value handed to another thread is safe to read there; one
/// object must not be written by two threads, as with any other type.
///
/// Reading never fails: an accessor that doesn't fit answers "nothing", and `operator[]` on what isn't there
/// answers the null value, so `bag["a"]["b"].asString()` needs no checks in between.
class Value {
public:
    enum class Type : std::uint8_t { Null, Bool, Int, UInt, Double, String, Bytes, Date, Array, Dictionary };
    using Array = std::vector<Value>;

    Value() = default;
    Value(std::nullptr_t) {}
    Value(bool b) : _storage(b) {}
    /// Any other integer. Unsigned ones that fit are kept as signed, so equal numbers compare equal.
    template <class I>
        requires(std::is_integral_v<I> && !std::is_same_v<I, bool>)
    Value(I i)
    {
        if (std::is_signed_v<I> || static_cast<std::uint64_t>(i) <= static_cast<std::uint64_t>(INT64_MAX))
            _storage = static_cast<std::int64_t>(i);
        else
            _storage = static_cast<std::uint64_t>(i);
    }
    Value(double d) : _storage(d) {}
    Value(std::string s);
    Value(std::string_view s) : Value(std::string(s)) {}
    Value(const char* s) : Value(std::string(s)) {}
    Value(platform::Bytes bytes);
    Value(platform::Date date) : _storage(date) {}
    Value(Array array);
    Value(Dictionary dictionary);
    Value(const Value&) = default;
    Value(Value&& other) noexcept : _storage(std::exchange(other._storage, std::monostate{})) {}
    Value& operator=(const Value& other);
    Value& operator=(Value&& other) noexcept;
    ~Value();

    /// A dictionary of the pairs given, in their order.
    static Value dictionaryOf(std::initializer_list<std::pair<std::string, Value>> entries);

    [[nodiscard]] Type type() const { return static_cast<Type>(_storage.index()); }
    [[nodiscard]] bool isNull() const { return type() == Type::Null; }
    [[nodiscard]] bool isNumber() const;

    [[nodiscard]] std::optional<bool> asBool() const;
    /// Integers that fit, and doubles that are whole and fit.
    [[nodiscard]] std::optional<std::int64_t> asInt() const;
    [[nodiscard]] std::optional<std::uint64_t> asUInt() const;
    /// Any number.
    [[nodiscard]] std::optional<double> asDouble() const;
    /// The string, or null for another type. Lives as long as this value is unchanged.
    [[nodiscard]] const std::string* asString() const;
    [[nodiscard]] const platform::Bytes* asBytes() const;
    [[nodiscard]] std::optional<platform::Date> asDate() const;
    [[nodiscard]] const Array* asArray() const;
    [[nodiscard]] const Dictionary* asDictionary() const;

    /// The entry of a dictionary; the null value where there is none.
    [[nodiscard]] const Value& operator[](std::string_view key) const;
    /// Without this, a literal would be taken for an index.
    [[nodiscard]] const Value& operator[](const char* key) const { return (*this)[std::string_view(key)]; }
    /// The element of an array; the null value where there is none.
    template <class I>
        requires std::is_integral_v<I>
    [[nodiscard]] const Value& operator[](I index) const
    {
        return element(static_cast<std::size_t>(index));
    }
    /// Elements of an array or entries of a dictionary; 0 for anything else.
    [[nodiscard]] std::size_t count() const;

    /// This value's own array to change; anything else becomes an empty array first.
    [[nodiscard]] Array& mutableArray();
    /// This value's own dictionary to change; anything else becomes an empty dictionary first.
    [[nodiscard]] Dictionary& mutableDictionary();

    /// Equal type and contents; integers compare by number whatever their signedness; dictionaries compare
    /// without regard to order.
    friend bool operator==(const Value& a, const Value& b);

private:
    [[nodiscard]] const Value& element(std::size_t index) const;

    template <class T> using Shared = std::shared_ptr<T>;
    std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, Shared<std::string>,
                 Shared<platform::Bytes>, platform::Date, Shared<Array>, Shared<Dictionary>>
        _storage;
};

/// "null", "bool", … for error texts.
[[nodiscard]] std::string_view typeName(Value::Type type);

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

/// How deep arrays and dictionaries may nest in anything that is read from outside.
constexpr std::size_t kMaximumDepth = 128;

/// Reads one JSON document (RFC 8259) of at most `maximumSize` bytes. A leading byte order mark is skipped;
/// of duplicate keys the last wins. Refused with a reason: invalid UTF-8, integers beyond 64 bits, nesting
/// beyond `kMaximumDepth`, anything after the document.
[[nodiscard]] std::expected<Value, Error> parseJson(std::string_view text, std::size_t maximumSize = 64u << 20);

enum class JsonStyle { Compact, Pretty };

/// Writes a value as JSON: doubles shortest-exact, integers as integers, bytes as base64, dates as seconds since
/// 1970, non-finite numbers as null. Invalid UTF-8 in a string is written as U+FFFD.
[[nodiscard]] std::string toJson(const Value& value, JsonStyle style = JsonStyle::Compact);
/// The length of `toJson(value)`, without making it.
[[nodiscard]] std::size_t jsonSize(const Value& value);

/// Reads a binary property list of at most `maximumSize` bytes, nested at most `kMaximumDepth` deep.
/// Types that JSON doesn't know but for dates and data are refused.
[[nodiscard]] std::expected<Value, Error> parsePropertyList(std::string_view bytes, std::size_t maximumSize = 64u << 20);

/// Writes a binary property list. Null entries of dictionaries and arrays are left out: the format has none. Integers
/// beyond 2^63-1 become reals, dates are kept to the microsecond. Refused: a null, texts with a NUL or broken UTF-8,
/// dates beyond 2001 by more than 68 years, nesting beyond `kMaximumDepth`.
[[nodiscard]] std::expected<std::string, Error> toPropertyList(const Value& value);

} // namespace platform
