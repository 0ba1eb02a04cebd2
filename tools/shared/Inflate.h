#pragma once

#include <cstddef>
#include <expected>
#include <string>
#include <string_view>

namespace tavrin::tools {

/// Most bytes that an upload may unpack to, wherever a tool unpacks one.
inline constexpr std::size_t kMaximumUpload = 32u << 20;

/// Unpacks raw DEFLATE (RFC 1951). Refused with a reason: broken or cut streams, anything after the stream, and more
/// than `maximumSize` bytes.
[[nodiscard]] std::expected<std::string, std::string> inflateRaw(std::string_view packed, std::size_t maximumSize);

} // namespace tavrin::tools
