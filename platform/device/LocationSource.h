#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>

namespace platform {

/// A place that has been made coarse.
struct Location {
    double latitude = 0;  ///< degrees, on the grid of `fuzz`
    double longitude = 0; ///< degrees, on the grid of `fuzz`
    std::string source;   ///< "gps", "cell" or "wifi"

    bool operator==(const Location&) const = default;
};

/// Moves a place to the middle of its grid cell: 0.01 degrees of latitude (1.1 km), and the same distance in
/// longitude. Nobody above this layer sees a finer place.
[[nodiscard]] Location fuzz(double latitude, double longitude, std::string source);

/// Whether two places are 10 km or more apart: what is of interest at one may not be at the other.
[[nodiscard]] bool isSignificantMove(const Location& from, const Location& to);

/// Where the device is, as coarsely as `fuzz` makes it. Any thread.
class LocationSource {
public:
    virtual ~LocationSource() = default;
    /// Starts using the sources named ("gps", "cell", "wifi"); an empty set stops and forgets the location.
    virtual void setAllowedSources(std::set<std::string> sources) = 0;
    /// The last known location, if there is one.
    [[nodiscard]] virtual std::optional<Location> current() = 0;
    /// Asks for a newer fix; it comes through `onChange`, if it comes.
    virtual void requestUpdate() = 0;
    /// Called on the run loop's thread with a new location, or none when it is lost ("reason" says why). One handler.
    using Handler = std::function<void(const std::optional<Location>&, const std::string& reason)>;
    virtual void onChange(Handler handler) = 0;
};

} // namespace platform
