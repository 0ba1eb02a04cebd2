#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <string_view>

namespace platform {

// Randomised response: a text is hashed to one bit of 256 (a Bloom filter with one hash function), and every bit is
// flipped at random, twice. docs/privacy.md derives the privacy loss. Pure functions; any thread.

/// Bit n is bit n % 8 of byte n / 8, counted from the least significant.
using PrivacyBits = std::array<std::uint8_t, 32>;
inline constexpr unsigned kPrivacyBits = 256;
inline constexpr unsigned kPrivacyCohorts = 8;
/// The probability with which each of the two responses flips a bit.
inline constexpr double kPrivacyFlip = 1.0 / 4;

/// The probability that a report has the bit of its text set, and the probability for any other bit.
inline constexpr double kTrueBitRate = 5.0 / 8;
inline constexpr double kOtherBitRate = 3.0 / 8;
/// Upper bounds of the privacy loss of one report of a text, 2 ln(5/3), and of any number of reports of it, 2 ln 3.
inline constexpr double kReportEpsilon = 1.0216512475319814;
inline constexpr double kPermanentEpsilon = 2.1972245773362196;

/// Never leaves the device.
using DeviceSecret = std::array<std::uint8_t, 32>;
/// Random bytes for one report.
using PrivacyRandom = std::array<std::uint8_t, 64>;

/// Returns the device's cohort, which never changes: 0 to `kPrivacyCohorts` - 1. Two texts that share a bit in one
/// cohort rarely share one in another.
[[nodiscard]] unsigned privacyCohort(const DeviceSecret& secret);
/// Returns the number of the bit for a text under a key. It depends on nothing secret.
[[nodiscard]] unsigned privacyBit(unsigned cohort, std::string_view key, std::string_view text);
/// Returns the permanent response: the bits that this device flips in every report of that text under that key.
[[nodiscard]] PrivacyBits permanentFlips(const DeviceSecret& secret, std::string_view key, std::string_view text);
/// Returns the instantaneous response: each bit is set with probability `kPrivacyFlip`.
[[nodiscard]] PrivacyBits flips(std::span<const std::uint8_t, 64> random);

struct PrivacyReport {
    unsigned cohort = 0;
    PrivacyBits bits{};
};
/// Returns a report of a text with both responses applied. `random` must not be used again.
[[nodiscard]] PrivacyReport privatised(const DeviceSecret& secret, std::string_view key, std::string_view text,
                                       const PrivacyRandom& random);

[[nodiscard]] inline bool hasBit(const PrivacyBits& bits, unsigned number)
{
    return (bits[number / 8] >> (number % 8) & 1) != 0;
}

} // namespace platform
