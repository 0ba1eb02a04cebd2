#pragma once

namespace tavrin {

/// Switches that are settled when the daemon is built.
class Flags {
public:
    [[nodiscard]] static constexpr bool diskBagCacheEnabled() { return true; }
};

} // namespace tavrin
