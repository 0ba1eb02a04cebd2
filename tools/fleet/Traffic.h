#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

#include "tools/fleet/Scenario.h"

namespace tavrin::fleet {

/// The kinds of requests.
enum class Kind { Search, Lookup, Other, Image, Warm, Bag, Resource, Upload };
inline constexpr std::array<std::string_view, 8> kKinds{"search", "lookup", "other",    "image",
                                                        "warm",   "bag",    "resource", "upload"};

/// The requests that reach the service, by kind and time, and what became of the devices' data.
class Traffic {
public:
    using Counts = std::array<std::uint32_t, kKinds.size()>;
    struct Total {
        std::uint64_t requests = 0; ///< answered
        double up = 0, down = 0;    ///< bytes
    };

    Traffic(Duration end, Duration bin);

    /// Adds requests at a time that are answered, with their bytes, or that find the service dead.
    void answered(Kind kind, Duration at, unsigned count, double up, double down);
    void refused(Kind kind, Duration at, unsigned count);

    [[nodiscard]] Duration bin() const { return _bin; }
    [[nodiscard]] std::size_t size() const { return _answered.size(); } ///< bins, from the simulation's start
    [[nodiscard]] const Counts& answered(std::size_t bin) const { return _answered[bin]; }
    [[nodiscard]] const Counts& refused(std::size_t bin) const { return _refused[bin]; }
    [[nodiscard]] const Total& total(Kind kind) const { return _totals[static_cast<std::size_t>(kind)]; }
    /// Returns all requests of a kind in a bin, answered or not; of all kinds for nothing.
    [[nodiscard]] double requests(std::size_t bin, std::optional<Kind> kind) const;

    // After the first day.
    std::uint64_t visits = 0, queries = 0;
    std::uint64_t keys = 0, hits = 0;         ///< keys that ask for a search, and those that the query cache answers
    std::uint64_t images = 0, keptImages = 0; ///< that responses name, and those of them that the device has
    std::uint64_t confirmed = 0;              ///< resources that were not sent again

    // From the simulation's start. Every session that ended becomes an upload, which ends in one of these ways.
    std::uint64_t sessions = 0;
    std::uint64_t sent = 0, lost = 0, expired = 0; ///< lost: answered with another status than 200
    std::uint64_t waiting = 0;                     ///< at the end, in a file or as an upload

private:
    [[nodiscard]] std::size_t binOf(Duration at) const { return static_cast<std::size_t>(at / _bin); }

    const Duration _bin;
    std::vector<Counts> _answered, _refused;
    std::array<Total, kKinds.size()> _totals{};
};

} // namespace tavrin::fleet
