#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace devserver {

/// A PNG of 96 × 96 pixels that depends on the identifier alone; two identifiers rarely share one. If `size` is more
/// bytes than the picture needs, a chunk that readers skip fills it up.
[[nodiscard]] std::string imageFor(std::string_view identifier, std::size_t size = 0);

} // namespace devserver
