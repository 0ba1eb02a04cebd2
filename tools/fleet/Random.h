#pragma once

#include <cmath>
#include <cstdint>
#include <numbers>

namespace tavrin::fleet {

/// Returns a number in which every bit depends on every bit of `state` (SplitMix64's output function).
[[nodiscard]] constexpr std::uint64_t mixed(std::uint64_t state)
{
    state = (state ^ (state >> 30)) * 0xbf58476d1ce4e5b9;
    state = (state ^ (state >> 27)) * 0x94d049bb133111eb;
    return state ^ (state >> 31);
}

/// Returns a number from 0 up to 1.
[[nodiscard]] constexpr double unit(std::uint64_t bits)
{
    return static_cast<double>(bits >> 11) * 0x1p-53;
}

/// A stream of random numbers: SplitMix64. Streams with different seeds are independent.
class Random {
public:
    explicit constexpr Random(std::uint64_t seed) : _state(mixed(seed + 0x9e3779b97f4a7c15)) {}
    [[nodiscard]] constexpr std::uint64_t bits() { return mixed(_state += 0x9e3779b97f4a7c15); }
    /// From 0 up to 1.
    [[nodiscard]] constexpr double uniform() { return unit(bits()); }
    /// Whole, from 0 up to `end`.
    [[nodiscard]] constexpr std::size_t below(std::size_t end)
    {
        return static_cast<std::size_t>(uniform() * static_cast<double>(end));
    }
    [[nodiscard]] constexpr bool chance(double probability) { return uniform() < probability; }
    [[nodiscard]] double exponential() { return -std::log1p(-uniform()); }
    [[nodiscard]] double normal() { return std::sqrt(2 * exponential()) * std::cos(2 * std::numbers::pi * uniform()); }
    /// A whole number with this mean: the mean rounded down, or one more.
    [[nodiscard]] unsigned about(double mean)
    {
        const double whole = std::floor(mean);
        return static_cast<unsigned>(whole) + (chance(mean - whole) ? 1 : 0);
    }

private:
    std::uint64_t _state;
};

} // namespace tavrin::fleet
