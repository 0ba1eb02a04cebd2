#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <string_view>

namespace platform {

// Randomised response: a text is hashed to one bit of 256, and every bit is flipped at random, twice. docs/privacy.md
// derives what that hides. Pure functions.

/// Bits by number: bit n is the nth, from the least significant of the first byte on.
using PrivacyBits = std::array<std::uint8_t, 32>;
inline constexpr unsigned kPrivacyBits = 256;
inline constexpr unsigned kPrivacyCohorts = 8;
/// The chance that each of the two responses flips a bit.
inline constexpr double kPrivacyFlip = 1.0 / 4;

/// The chance that a report has its text's own bit set, and any other bit.
inline constexpr double kTrueBitRate = 5.0 / 8;
inline constexpr double kOtherBitRate = 3.0 / 8;
/// The most that is lost by one report of a text, 2 ln(5/3), and by any number of reports of that text, 2 ln 3.
inline constexpr double kReportEpsilon = 1.0216512475319814;
inline constexpr double kPermanentEpsilon = 2.1972245773362196;

/// Known to the device alone.
using DeviceSecret = std::array<std::uint8_t, 32>;
/// Random bytes for one report.
using PrivacyRandom = std::array<std::uint8_t, 64>;

/// The group of devices that this one belongs to, for ever. In each group other texts share a bit.
[[nodiscard]] unsigned privacyCohort(const DeviceSecret& secret);
/// The bit that stands for a text under a key. Anyone can compute it.
[[nodiscard]] unsigned privacyBit(unsigned cohort, std::string_view key, std::string_view text);
/// The bits that this device flips whenever it reports that text under that key: the permanent response.
[[nodiscard]] PrivacyBits permanentFlips(const DeviceSecret& secret, std::string_view key, std::string_view text);
/// The bits that random bytes flip: the instantaneous response.
[[nodiscard]] PrivacyBits flips(std::span<const std::uint8_t, 64> random);

struct PrivacyReport {
    unsigned cohort = 0;
    PrivacyBits bits{};
};
/// A report of a text, through both responses. `random` must not be used again.
[[nodiscard]] PrivacyReport privatised(const DeviceSecret& secret, std::string_view key, std::string_view text,
                                       const PrivacyRandom& random);

[[nodiscard]] inline bool hasBit(const PrivacyBits& bits, unsigned number)
{
    return (bits[number / 8] >> (number % 8) & 1) != 0;
}

} // namespace platform
