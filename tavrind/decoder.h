#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

// The reverse of encoder.h, as a service reads a signature. The daemon only writes them. Pure functions: any thread.

namespace tavrin {

/// The stored length of a run, which is its number of bits less 1. `lengths` begins with the first run's byte.
[[nodiscard]] inline unsigned getRunLength(std::string_view lengths, std::size_t run)
{
    return static_cast<unsigned char>(lengths[run]);
}

/// The bitmap of `outputLength` bytes that `rle_compress` coded into `buffer`: `payloadLength` bytes at
/// `payloadOffset`, behind the four of the digest. None where the lengths don't agree, or the runs hold more bits than
/// the bitmap.
[[nodiscard]] std::optional<std::string> rle_expand(std::string_view buffer, std::size_t payloadOffset,
                                                    std::size_t payloadLength, std::size_t outputLength,
                                                    bool compressed);

struct AppSignature {
    unsigned version = 0; ///< the last two bytes of the list's version, without their highest bit
    bool compressed = false;
    std::string bitmap;
};

/// Takes a signature's base64 text apart, and checks both checksums. An error says what is wrong.
[[nodiscard]] platform::Result<AppSignature> readSignature(std::string_view text);

} // namespace tavrin
