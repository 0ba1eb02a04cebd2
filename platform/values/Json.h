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

/// Reads one JSON document (RFC 8259) of at most `maximumSize` bytes, as a browser does: a leading byte order mark is
/// skipped, the last of duplicate keys wins, a lone surrogate escape reads as U+FFFD, an integer beyond 64 bits as a
/// double, a number beyond a double as the largest one. The error has a reason for what is refused: anything else that
/// is not JSON, invalid UTF-8, nesting beyond `kMaximumDepth`, text after the document. Any thread.
[[nodiscard]] std::expected<Value, Error> parseJson(std::string_view text, std::size_t maximumSize = 64u << 20);

enum class JsonStyle { Compact, Pretty };

/// Writes a value as JSON: doubles in the shortest form that reads back exactly, integers as integers, bytes as base64,
/// dates as seconds since 1970, non-finite numbers as null. Each byte of invalid UTF-8 becomes U+FFFD.
[[nodiscard]] std::string toJson(const Value& value, JsonStyle style = JsonStyle::Compact);
/// Returns the length of `toJson(value)` without making the text.
[[nodiscard]] std::size_t jsonSize(const Value& value);

/// A parsed JSON document that makes values on demand: parsing takes a fifth of the time that making all values does.
///
/// The text may go after parsing. Immutable: any thread.
class JsonDocument {
public:
    /// Reads what `parseJson` reads.
    [[nodiscard]] static std::expected<JsonDocument, Error> parse(std::string_view text,
                                                                  std::size_t maximumSize = 64u << 20);
    JsonDocument(JsonDocument&&) noexcept;
    JsonDocument& operator=(JsonDocument&&) noexcept;
    ~JsonDocument();

    /// The whole document.
    [[nodiscard]] Value value() const;

    // For a document that is an array

    /// The number of elements; 0 if the document is no array.
    [[nodiscard]] std::size_t count() const;
    /// Returns true if a dictionary among the elements has an entry `key`.
    [[nodiscard]] bool anyElementHas(std::string_view key) const;
    /// Returns the entry `key` of the first element; null if that is no dictionary or has no such entry.
    [[nodiscard]] Value entryOfFirst(std::string_view key) const;

    // For a document that is a dictionary; the last of duplicate keys counts

    /// Returns the text under `key`, or nothing for any other value. The document owns the text.
    [[nodiscard]] std::optional<std::string_view> textOf(std::string_view key) const;
    /// Returns true if the value under `key` is a dictionary.
    [[nodiscard]] bool hasDictionary(std::string_view key) const;
    /// Calls `take` for each entry of the dictionary under `key` whose name is `wanted`, in the document's order and
    /// once for each duplicate. Makes only these values.
    void eachEntryOf(std::string_view key, const std::function<bool(std::string_view name)>& wanted,
                     const std::function<void(std::string_view name, Value value)>& take) const;

private:
    struct Parsed;
    explicit JsonDocument(std::unique_ptr<Parsed> parsed);
    std::unique_ptr<Parsed> _parsed;
};

} // namespace platform
