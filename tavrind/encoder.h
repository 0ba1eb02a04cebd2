#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

// The signature of a set of small numbers: a bitmap, run-length coded where that is shorter, framed with a checksum.
// docs/formats.md has the layout, byte by byte. Pure functions: any thread.

namespace tavrin {

/// The largest number that a signature can tell of: the bitmap's length has 16 bits.
inline constexpr std::uint32_t kMaximumEncodingId = 524'279;

/// Bit n, counted from the most significant of the first byte, is set for every n of `ids`, in ascending order and
/// kMaximumEncodingId at most. The length is the largest id divided by 8, rounded up: a largest id that is a multiple
/// of 8 falls off the end. Services rely on that.
[[nodiscard]] std::string bitmapOf(std::span<const std::uint32_t> ids);

struct RunLengthCoding {
    std::string bytes;
    bool compressed = false; ///< else the bytes hold the bitmap as it is
};

/// The run-length coding of a bitmap of 65,535 bytes at most, or the bitmap where the coding isn't shorter.
[[nodiscard]] RunLengthCoding encodeRun(std::string_view bitmap);

/// The same behind the last four bytes of the bitmap's MD5 digest.
[[nodiscard]] RunLengthCoding rle_compress(std::string_view bitmap);

/// The base64 text that is sent. `payload` is what `rle_compress` made of a bitmap of `bitmapLength` bytes; `version`
/// is the list's, in hexadecimal: its last two bytes count, and those that it doesn't have are 0. None for a version
/// that is no whole number of hexadecimal bytes.
[[nodiscard]] std::optional<std::string> makeSignature(std::uint16_t bitmapLength, const RunLengthCoding& payload,
                                                       std::string_view version);

} // namespace tavrin
