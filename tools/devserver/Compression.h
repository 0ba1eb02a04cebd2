#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace devserver {

/// A gzip stream that unpacks to that many blanks.
[[nodiscard]] std::string gzipOfBlanks(std::size_t count);

/// A zlib stream (RFC 1950), as PNG wants it.
[[nodiscard]] std::string zlibPacked(std::string_view bytes);

} // namespace devserver
