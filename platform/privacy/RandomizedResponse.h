#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <string_view>

namespace platform {

// How a text is told without being given away: one bit of 256 stands for it, and every bit is turned over by chance,
// twice. docs/privacy.md derives what that hides. Pure functions.

/// Bits by number: bit n is the nth, from the least significant of the first byte on.
using PrivacyBits = std::array<std::uint8_t, 32>;
inline constexpr unsigned kPrivacyBits = 256;
inline constexpr unsigned kPrivacyCohorts = 8;
/// With what chance each of the two responses turns a bit over.
inline constexpr double kPrivacyFlip = 1.0 / 4;

/// With what chance a report has a bit that stands for its text, and one that doesn't.
inline constexpr double kTrueBitRate = 5.0 / 8;
inline constexpr double kOtherBitRate = 3.0 / 8;
/// What is lost at most by one report of a text; and by all reports of that text together, however many: 2 ln(5/3) and
/// 2 ln 3.
inline constexpr double kReportEpsilon = 1.0216512475319814;
inline constexpr double kPermanentEpsilon = 2.1972245773362196;

/// What the device knows and nobody else.
using DeviceSecret = std::array<std::uint8_t, 32>;
/// Random bytes for one report.
using PrivacyRandom = std::array<std::uint8_t, 64>;

/// The group of devices that this one belongs to, for good. In each group other texts share a bit.
[[nodiscard]] unsigned privacyCohort(const DeviceSecret& secret);
/// The bit that stands for a text under a key. Anyone can compute it.
[[nodiscard]] unsigned privacyBit(unsigned cohort, std::string_view key, std::string_view text);
/// The bits that this device turns over whenever it reports that text under that key: the permanent response.
[[nodiscard]] PrivacyBits permanentFlips(const DeviceSecret& secret, std::string_view key, std::string_view text);
/// The bits that random bytes turn over: the instantaneous response.
[[nodiscard]] PrivacyBits flips(std::span<const std::uint8_t, 64> random);

struct PrivacyReport {
    unsigned cohort = 0;
    PrivacyBits bits{};
};
/// What a report says of a text, through both responses. `random` must be used once.
[[nodiscard]] PrivacyReport privatised(const DeviceSecret& secret, std::string_view key, std::string_view text,
                                       const PrivacyRandom& random);

[[nodiscard]] inline bool hasBit(const PrivacyBits& bits, unsigned number)
{
    return (bits[number / 8] >> (number % 8) & 1) != 0;
}

} // namespace platform
