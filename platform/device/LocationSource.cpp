#include "platform/device/LocationSource.h"

#include <algorithm>
#include <cmath>
#include <numbers>

namespace platform {

Location fuzz(double latitude, double longitude, std::string source)
{
    constexpr double kCell = 0.01; // degrees of latitude: 1.1 km
    const auto middle = [](double value, double cell) { return (std::floor(value / cell) + 0.5) * cell; };
    latitude = std::clamp(latitude, -90.0, 90.0);
    const double row = std::clamp(middle(latitude, kCell), -90.0, 90.0);
    // A degree of longitude shrinks towards the poles; the cell widens by the same factor, up to a full circle.
    const double shrink = std::max(std::cos(row * std::numbers::pi / 180), kCell / 360);
    const double column = middle(longitude, kCell / shrink);
    return {.latitude = row, .longitude = std::clamp(column, -180.0, 180.0), .source = std::move(source)};
}

bool isSignificantMove(const Location& from, const Location& to)
{
    constexpr double kEarthRadius = 6371; // km
    constexpr double kSignificant = 10;   // km
    constexpr double kRadians = std::numbers::pi / 180;
    // The haversine formula is accurate for short distances, which matter here, and stable for all others.
    const double rows = std::sin((to.latitude - from.latitude) * kRadians / 2);
    const double columns = std::sin((to.longitude - from.longitude) * kRadians / 2);
    const double a =
        rows * rows + std::cos(from.latitude * kRadians) * std::cos(to.latitude * kRadians) * columns * columns;
    return 2 * kEarthRadius * std::asin(std::min(1.0, std::sqrt(a))) >= kSignificant;
}

} // namespace platform
