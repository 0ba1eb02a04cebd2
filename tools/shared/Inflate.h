#pragma once

#include <cstddef>
#include <expected>
#include <string>
#include <string_view>

namespace tavrin::tools {

/// Maximum size of an unpacked upload in bytes, for every tool.
inline constexpr std::size_t kMaximumUpload = 32u << 20;

/// Unpacks raw DEFLATE (RFC 1951). Returns a reason if the stream is broken or truncated, if bytes follow it, or if it
/// unpacks to more than `maximumSize` bytes.
[[nodiscard]] std::expected<std::string, std::string> inflateRaw(std::string_view packed, std::size_t maximumSize);

} // namespace tavrin::tools
