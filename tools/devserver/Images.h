#pragma once

#include <string>
#include <string_view>

namespace devserver {

/// A PNG of 96 × 96 pixels, drawn from the identifier: the same one always, and for two different ones hardly ever the
/// same.
[[nodiscard]] std::string imageFor(std::string_view identifier);

} // namespace devserver
