#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace devserver {

/// A PNG of 96 × 96 pixels, drawn from the identifier: the same one always, and for two different ones hardly ever the
/// same. It takes `size` bytes, where that is more than the picture needs: the rest is a chunk that readers skip.
[[nodiscard]] std::string imageFor(std::string_view identifier, std::size_t size = 0);

} // namespace devserver
