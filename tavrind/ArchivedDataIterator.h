#pragma once

#include <cstdint>
#include <expected>
#include <optional>
#include <string_view>

#include "platform/base/Bytes.h"

namespace tavrin {

/// Walks the records of a session file in memory: each is a length of 8 bytes in the host's byte order, then the
/// archive (docs/formats.md). One thread at a time.
class ArchivedDataIterator {
public:
    explicit ArchivedDataIterator(platform::Bytes data) : _data(std::move(data)) {}

    /// Returns whether another length fits before the end. Its record may be missing.
    [[nodiscard]] bool hasMore() const { return _position + kLengthSize <= _data.size(); }
    /// Returns the next record's archive, which is valid as long as the iterator. At the end or at a broken record,
    /// logs the reason, returns nothing and does not advance.
    [[nodiscard]] std::optional<std::string_view> readNextObject();
    /// Moves to the first broken record or the end, without a log line, and returns the number of records passed.
    std::uint64_t countRecords();

    /// Returns the offset of the next record's length.
    [[nodiscard]] std::uint64_t position() const { return _position; }
    [[nodiscard]] std::uint64_t size() const { return _data.size(); }

    static constexpr std::uint64_t kLengthSize = sizeof(std::uint64_t);

private:
    /// Moves past the next record and returns its archive. Returns the reason if that fails.
    std::expected<std::string_view, const char*> _next();

    platform::Bytes _data;
    std::uint64_t _position = 0;
};

} // namespace tavrin
