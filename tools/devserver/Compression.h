#pragma once

#include <cstddef>
#include <expected>
#include <string>
#include <string_view>

namespace devserver {

/// A gzip stream that unpacks to that many blanks.
[[nodiscard]] std::string gzipOfBlanks(std::size_t count);

/// Unpacks raw DEFLATE (RFC 1951). Refused with a reason: broken or cut streams, anything after the stream, and more
/// than `maximumSize` bytes.
[[nodiscard]] std::expected<std::string, std::string> inflateRaw(std::string_view packed, std::size_t maximumSize);

/// A zlib stream (RFC 1950), as PNG wants it.
[[nodiscard]] std::string zlibPacked(std::string_view bytes);

} // namespace devserver
