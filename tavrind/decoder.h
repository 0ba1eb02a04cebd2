#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

// Decodes the signatures of encoder.h, as a service does. The daemon only writes them. Pure functions: any thread.

namespace tavrin {

/// Returns the stored length of a run, its number of bits minus 1. `lengths` begins with the first run's byte.
[[nodiscard]] inline unsigned getRunLength(std::string_view lengths, std::size_t run)
{
    return static_cast<unsigned char>(lengths[run]);
}

/// Decodes the bitmap of `outputLength` bytes that `rle_compress` coded into `buffer`: `payloadLength` bytes at
/// `payloadOffset`, after the four of the digest. Returns nothing if the lengths don't agree or the runs have more bits
/// than the bitmap.
[[nodiscard]] std::optional<std::string> rle_expand(std::string_view buffer, std::size_t payloadOffset,
                                                    std::size_t payloadLength, std::size_t outputLength,
                                                    bool compressed);

struct AppSignature {
    unsigned version = 0; ///< the last two bytes of the list's version, without their highest bit
    bool compressed = false;
    std::string bitmap;
};

/// Decodes a signature's base64 text and verifies both checksums. The error says what is wrong.
[[nodiscard]] platform::Result<AppSignature> readSignature(std::string_view text);

} // namespace tavrin
