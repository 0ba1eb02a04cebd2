#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace devserver {

/// Returns a PNG of 96 × 96 pixels that depends only on the identifier; two identifiers rarely share one. If it has
/// less than `size` bytes, a chunk that readers skip pads it.
[[nodiscard]] std::string imageFor(std::string_view identifier, std::size_t size = 0);

} // namespace devserver
