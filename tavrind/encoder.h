#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

// The signature of a set of small numbers: a bitmap, run-length coded if that is shorter, framed with a checksum.
// docs/formats.md describes every byte. Pure functions: any thread.

namespace tavrin {

/// The largest number that a signature can hold: the bitmap's length has 16 bits.
inline constexpr std::uint32_t kMaximumEncodingId = 524'279;

/// How many bytes of the bitmap's MD5 digest, from its end, precede the payload.
inline constexpr std::size_t kDigestTail = 4;

/// Returns a bitmap with bit n set for every n of `ids`, counted from the most significant bit of the first byte. `ids`
/// are in ascending order and at most kMaximumEncodingId. The length in bytes is the largest id divided by 8, rounded
/// up: if that id is a multiple of 8, its bit is lost. Services rely on this.
[[nodiscard]] std::string bitmapOf(std::span<const std::uint32_t> ids);

struct RunLengthCoding {
    std::string bytes;
    bool compressed = false; ///< if false, the bytes are the bitmap itself
};

/// Returns the run-length coding of a bitmap of at most 65,535 bytes, or the bitmap if the coding isn't shorter.
[[nodiscard]] RunLengthCoding encodeRun(std::string_view bitmap);

/// Returns the same after the last four bytes of the bitmap's MD5 digest.
[[nodiscard]] RunLengthCoding rle_compress(std::string_view bitmap);

/// Returns the base64 text that is sent. `payload` is the result of `rle_compress` for a bitmap of `bitmapLength`
/// bytes. `version` is the list's version in hexadecimal, of which the last two bytes are used; missing ones are 0.
/// Returns nothing if the version is not a whole number of hexadecimal bytes.
[[nodiscard]] std::optional<std::string> makeSignature(std::uint16_t bitmapLength, const RunLengthCoding& payload,
                                                       std::string_view version);

} // namespace tavrin
