#pragma once

#include <array>
#include <compare>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// A 128-bit identifier (RFC 4122). The default is the nil UUID, all zero.
class Uuid {
public:
    Uuid() = default;
    explicit Uuid(const std::array<std::uint8_t, 16>& bytes) : _bytes(bytes) {}

    /// Returns a new random UUID (version 4) from the cryptographic generator; aborts if the generator fails. Any
    /// thread.
    [[nodiscard]] static Uuid random();

    /// Reads the 36-character text form in either case; returns nothing for any other text.
    [[nodiscard]] static std::optional<Uuid> parse(std::string_view text);

    /// Returns the 36-character text form in upper case.
    [[nodiscard]] std::string string() const;

    [[nodiscard]] bool isNil() const { return _bytes == std::array<std::uint8_t, 16>{}; }

    auto operator<=>(const Uuid&) const = default;

private:
    std::array<std::uint8_t, 16> _bytes{};
};

} // namespace platform
