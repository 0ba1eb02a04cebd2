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

/// Parses one JSON document (RFC 8259) of at most `maximumSize` bytes, as leniently as a browser: skips a leading byte
/// order mark, keeps the last of duplicate keys, reads a lone surrogate escape as U+FFFD, an integer beyond 64 bits as
/// a double, and a number beyond a double as the largest double. Returns an error of domain "Format", with a reason,
/// for anything else that is not JSON, invalid UTF-8, nesting beyond `kMaximumDepth`, and text after the document. Any
/// thread.
[[nodiscard]] std::expected<Value, Error> parseJson(std::string_view text, std::size_t maximumSize = 64u << 20);

enum class JsonStyle { Compact, Pretty };

/// Writes a value as JSON: doubles in the shortest form that reads back exactly, integers as integers, bytes as base64,
/// dates as seconds since 1970, non-finite numbers as null. Each byte of invalid UTF-8 becomes U+FFFD. Any thread.
[[nodiscard]] std::string toJson(const Value& value, JsonStyle style = JsonStyle::Compact);
/// Returns the length of `toJson(value)` in bytes without building the text.
[[nodiscard]] std::size_t jsonSize(const Value& value);

/// A parsed JSON document that builds values on demand: parsing takes a fifth of the time of building all values.
///
/// Owns a copy of what it needs: the text may be freed after parsing. Immutable: any thread.
class JsonDocument {
public:
    /// Accepts the same documents as `parseJson`, if they have at most about `maximumValues` values: small values take
    /// many times their text in memory. Separators inside texts count as well.
    [[nodiscard]] static std::expected<JsonDocument, Error>
    parse(std::string_view text, std::size_t maximumSize = 64u << 20, std::size_t maximumValues = SIZE_MAX);
    JsonDocument(JsonDocument&&) noexcept;
    JsonDocument& operator=(JsonDocument&&) noexcept;
    ~JsonDocument();

    /// Returns the whole document as a value.
    [[nodiscard]] Value value() const;

    // For a document that is an array

    /// Returns the number of elements; 0 if the document is not an array.
    [[nodiscard]] std::size_t count() const;
    /// Returns true if any element is a dictionary with an entry `key`.
    [[nodiscard]] bool anyElementHas(std::string_view key) const;
    /// Returns the entry `key` of the first element; null if that is not a dictionary or lacks the entry.
    [[nodiscard]] Value entryOfFirst(std::string_view key) const;

    // For a document that is a dictionary; the last of duplicate keys wins

    /// Returns the text under `key`, or nothing for a value of another type. The document owns the text.
    [[nodiscard]] std::optional<std::string_view> textOf(std::string_view key) const;
    /// Returns true if the value under `key` is a dictionary.
    [[nodiscard]] bool hasDictionary(std::string_view key) const;
    /// Calls `take` for each entry of the dictionary under `key` for whose name `wanted` returns true, in the
    /// document's order and once for each duplicate. Builds only these values.
    void eachEntryOf(std::string_view key, const std::function<bool(std::string_view name)>& wanted,
                     const std::function<void(std::string_view name, Value value)>& take) const;

private:
    struct Parsed;
    explicit JsonDocument(std::unique_ptr<Parsed> parsed);
    std::unique_ptr<Parsed> _parsed;
};

} // namespace platform
