#pragma once

namespace tavrin {

/// Switches that are fixed at build time.
class Flags {
public:
    [[nodiscard]] static constexpr bool diskBagCacheEnabled() { return true; }
};

} // namespace tavrin
