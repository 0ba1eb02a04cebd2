#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>

namespace platform {

/// A coarse location.
struct Location {
    double latitude = 0;  ///< degrees, on the grid of `fuzz`
    double longitude = 0; ///< degrees, on the grid of `fuzz`
    std::string source;   ///< "gps", "cell" or "wifi"

    bool operator==(const Location&) const = default;
};

/// Moves a location to the centre of its grid cell: 0.01 degrees of latitude (1.1 km), and the same distance in
/// longitude. No caller of this layer sees a finer location. Out-of-range degrees are clamped.
[[nodiscard]] Location fuzz(double latitude, double longitude, std::string source);

/// Returns true if two locations are at least 10 km apart: what was downloaded for one may be of no use at the other.
[[nodiscard]] bool isSignificantMove(const Location& from, const Location& to);

/// Reports where the device is, as coarsely as `fuzz` makes it. Any thread.
class LocationSource {
public:
    virtual ~LocationSource() = default;
    /// Starts using exactly these sources ("gps", "cell", "wifi"). An empty set stops, and forgets the location.
    virtual void setAllowedSources(std::set<std::string> sources) = 0;
    /// Returns the last known location, or nothing.
    [[nodiscard]] virtual std::optional<Location> current() = 0;
    /// Asks for a newer location, which is reported through `onChange` if it comes.
    virtual void requestUpdate() = 0;
    using Handler = std::function<void(const std::optional<Location>&, const std::string& reason)>;
    /// Calls `handler` on the run loop's thread with every new location, or with nothing and the reason when it is
    /// lost. One handler; a new one replaces it.
    virtual void onChange(Handler handler) = 0;
};

} // namespace platform
