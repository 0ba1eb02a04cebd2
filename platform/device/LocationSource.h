#pragma once

#include <functional>
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

/// Returns the centre of the location's grid cell: 0.01 degrees of latitude (1.1 km), and the same distance in
/// longitude. No other room sees a finer location. Clamps degrees that are out of range.
[[nodiscard]] Location fuzz(double latitude, double longitude, std::string source);

/// Returns true if two locations are at least 10 km apart: data downloaded for one may be useless at the other.
[[nodiscard]] bool isSignificantMove(const Location& from, const Location& to);

/// Reports the device's location, rounded by `fuzz`. Any thread.
class LocationSource {
public:
    virtual ~LocationSource() = default;
    /// Starts using exactly these sources ("gps", "cell", "wifi"). An empty set stops the source and clears the
    /// location.
    virtual void setAllowedSources(std::set<std::string> sources) = 0;
    /// Returns the last known location, or nothing.
    [[nodiscard]] virtual std::optional<Location> current() = 0;
    /// Requests a newer location; `onChange` reports it if there is one.
    virtual void requestUpdate() = 0;
    using Handler = std::function<void(const std::optional<Location>&, const std::string& reason)>;
    /// Calls `handler` on the run loop's thread with every new location, or with nothing and the reason if it is lost.
    /// One handler; a new one replaces it.
    virtual void onChange(Handler handler) = 0;
};

} // namespace platform
