#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace devserver {

/// Returns a gzip stream that decompresses to `count` blanks.
[[nodiscard]] std::string gzipOfBlanks(std::size_t count);

/// Compresses to a gzip stream (RFC 1952).
[[nodiscard]] std::string gzipPacked(std::string_view bytes);

/// Compresses to a zlib stream (RFC 1950), as in PNG.
[[nodiscard]] std::string zlibPacked(std::string_view bytes);

} // namespace devserver
