#pragma once

#include <cstddef>
#include <expected>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Error.h"
#include "platform/values/Value.h"

namespace platform {

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

/// A JSON document that was read, and from which values are made where they are wanted: reading takes a fifth of the
/// time that making all of its values does. It doesn't need the text any more. Immutable, hence any thread.
class JsonDocument {
public:
    /// As `parseJson` does.
    [[nodiscard]] static std::expected<JsonDocument, Error> parse(std::string_view text,
                                                                  std::size_t maximumSize = 64u << 20);
    JsonDocument(JsonDocument&&) noexcept;
    JsonDocument& operator=(JsonDocument&&) noexcept;
    ~JsonDocument();

    /// The whole document.
    [[nodiscard]] Value value() const;
    /// Elements of a document that is an array; 0 for any other.
    [[nodiscard]] std::size_t count() const;
    /// True if a dictionary among the array's elements has an entry `key`.
    [[nodiscard]] bool anyElementHas(std::string_view key) const;
    /// The entry `key` of the dictionary that is the array's first element; the null value where there is none.
    [[nodiscard]] Value entryOfFirst(std::string_view key) const;

    // Of a document that is a dictionary. Of duplicate keys the last counts.

    /// The text that is the entry `key`, for as long as the document lives; none where it is something else.
    [[nodiscard]] std::optional<std::string_view> textOf(std::string_view key) const;
    /// Whether the entry `key` is a dictionary.
    [[nodiscard]] bool hasDictionary(std::string_view key) const;
    /// Calls `take` with each entry of the dictionary that is the entry `key` whose name is `wanted`, in their order;
    /// of duplicate names with each. Only the values of these are made.
    void eachEntryOf(std::string_view key, const std::function<bool(std::string_view name)>& wanted,
                     const std::function<void(std::string_view name, Value value)>& take) const;

private:
    struct Parsed;
    explicit JsonDocument(std::unique_ptr<Parsed> parsed);
    std::unique_ptr<Parsed> _parsed;
};

} // namespace platform
