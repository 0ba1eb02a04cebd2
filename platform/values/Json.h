#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <expected>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

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

/// A value inside a `JsonDocument`, which must outlive it. Null if what was asked for doesn't exist. Immutable: any
/// thread.
class JsonView {
public:
    JsonView() = default;

    [[nodiscard]] bool isArray() const;
    [[nodiscard]] bool isDictionary() const;
    /// Returns the text, which the document owns, or nothing for a value of another type.
    [[nodiscard]] std::optional<std::string_view> asString() const;
    /// Returns the entry `key` of a dictionary, the last of duplicates; null if there is none.
    [[nodiscard]] JsonView operator[](std::string_view key) const;
    /// Returns true for a dictionary with an entry `key`, whose value may be null.
    [[nodiscard]] bool has(std::string_view key) const;
    /// Returns the elements of an array; nothing for a value of another type.
    [[nodiscard]] std::vector<JsonView> elements() const;
    /// Returns the entries of a dictionary that are themselves dictionaries or arrays, as `value` has them: the last of
    /// duplicates at the place of the first. Of an array, returns such elements, with empty keys. Nothing for a value
    /// of another type. Takes little time if there are few.
    [[nodiscard]] std::vector<std::pair<std::string_view, JsonView>> containers() const;
    /// Calls `take` for each entry of a dictionary in the document's order, and once for each duplicate.
    void eachEntry(const std::function<void(std::string_view key, JsonView entry)>& take) const;

    [[nodiscard]] Value value() const;
    /// Returns `toJson(value())` without building the value.
    [[nodiscard]] std::string json() const;

private:
    friend class JsonDocument;
    struct Access;
    std::array<std::uintptr_t, 2> _place{}; ///< the parser's own reference; 0 for null
};

/// A parsed JSON document: parsing takes a fifth of the time of building all values.
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

    [[nodiscard]] JsonView root() const;

private:
    struct Parsed;
    explicit JsonDocument(std::unique_ptr<Parsed> parsed);
    std::unique_ptr<Parsed> _parsed;
};

} // namespace platform
