#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/base/Bytes.h"

namespace tavrin {

/// Walks the records of a session file in memory: each a length of 8 bytes in the host's order and so many bytes of
/// archive (docs/formats.md). Failures are logged. One thread at a time.
class ArchivedDataIterator {
public:
    explicit ArchivedDataIterator(platform::Bytes data) : _data(std::move(data)) {}

    /// Whether a length fits before the end. It may still turn out that no record follows.
    [[nodiscard]] bool hasMore() const { return _position + kLengthSize <= _data.size(); }
    /// The next record's archive; none at the end or at a broken record, and the position stays.
    [[nodiscard]] std::optional<std::string_view> readNextObject();

    /// Where the next record's length begins.
    [[nodiscard]] std::uint64_t position() const { return _position; }
    [[nodiscard]] std::uint64_t size() const { return _data.size(); }

    static constexpr std::uint64_t kLengthSize = sizeof(std::uint64_t);

private:
    /// The length at the position, which must be within the data.
    [[nodiscard]] std::uint64_t _length() const;

    platform::Bytes _data;
    std::uint64_t _position = 0;
};

} // namespace tavrin
