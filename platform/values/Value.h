#pragma once

#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <variant>
#include <vector>

#include "platform/base/Bytes.h"
#include "platform/base/Date.h"

namespace platform {

struct Error;
class Dictionary;

/// One value of a JSON document, a property list or an IPC message.
///
/// Copies are cheap: they share strings, arrays and dictionaries, which are copied on write (`mutableArray()`,
/// `mutableDictionary()`). Different threads may use copies; many threads may read one object, or one may write it.
///
/// Reading never fails: an accessor returns nothing for a value of another type, and `operator[]` returns the null
/// value for a missing entry, so that `bag["a"]["b"].asString()` needs no checks in between.
class Value {
public:
    enum class Type : std::uint8_t { Null, Bool, Int, UInt, Double, String, Bytes, Date, Array, Dictionary };
    using Array = std::vector<Value>;

    Value() = default;
    Value(std::nullptr_t) {}
    Value(bool b) : _storage(b) {}
    /// Stores unsigned numbers that fit as signed ones, so that equal numbers compare equal.
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

    /// Returns a dictionary of the entries, in their order.
    static Value dictionaryOf(std::initializer_list<std::pair<std::string, Value>> entries);

    [[nodiscard]] Type type() const { return static_cast<Type>(_storage.index()); }
    [[nodiscard]] bool isNull() const { return type() == Type::Null; }
    [[nodiscard]] bool isNumber() const;

    [[nodiscard]] std::optional<bool> asBool() const;
    /// Returns an integer, or a double that is a whole number, if it is in range; otherwise nothing.
    [[nodiscard]] std::optional<std::int64_t> asInt() const;
    [[nodiscard]] std::optional<std::uint64_t> asUInt() const;
    /// Returns any number; an integer beyond 2^53 is rounded.
    [[nodiscard]] std::optional<double> asDouble() const;
    /// This and the next four return null (or nothing) for a value of another type. Pointers are valid until this value
    /// is changed.
    [[nodiscard]] const std::string* asString() const;
    [[nodiscard]] const platform::Bytes* asBytes() const;
    [[nodiscard]] std::optional<platform::Date> asDate() const;
    [[nodiscard]] const Array* asArray() const;
    [[nodiscard]] const Dictionary* asDictionary() const;

    /// Returns the entry of a dictionary, or the null value.
    [[nodiscard]] const Value& operator[](std::string_view key) const;
    /// Returns the element of an array, or the null value.
    template <class I>
        requires std::is_integral_v<I>
    [[nodiscard]] const Value& operator[](I index) const
    {
        return element(static_cast<std::size_t>(index));
    }
    /// Returns the number of elements of an array or entries of a dictionary; 0 for other types.
    [[nodiscard]] std::size_t count() const;

    /// Returns the array for writing; copies it first if it is shared. Turns a value of another type into an empty
    /// array.
    [[nodiscard]] Array& mutableArray();
    /// Likewise for a dictionary.
    [[nodiscard]] Dictionary& mutableDictionary();

    /// Compares types and contents; ignores the order of dictionaries.
    friend bool operator==(const Value& a, const Value& b);

private:
    [[nodiscard]] const Value& element(std::size_t index) const;

    template <class T> using Shared = std::shared_ptr<T>;
    std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, Shared<std::string>,
                 Shared<platform::Bytes>, platform::Date, Shared<Array>, Shared<Dictionary>>
        _storage;
};

/// Returns "null", "bool", "integer", …, for error texts.
[[nodiscard]] std::string_view typeName(Value::Type type);

/// The limit of nesting of arrays and dictionaries in input from outside.
constexpr std::size_t kMaximumDepth = 128;

} // namespace platform
