#include "platform/device/LocationSource.h"

#include <cmath>
#include <numbers>
#include <set>

#include <gtest/gtest.h>

namespace platform {
namespace {

constexpr double kKilometresPerDegree = 111.2;

/// Kilometres between near places.
double distance(const Location& a, double latitude, double longitude)
{
    const double north = a.latitude - latitude;
    const double east = (a.longitude - longitude) * std::cos(latitude * std::numbers::pi / 180);
    return std::hypot(north, east) * kKilometresPerDegree;
}

TEST(LocationFuzz, HidesThePlaceButNotTheTown)
{
    for (double latitude = -88; latitude <= 88; latitude += 0.731) {
        for (double longitude = -179.9; longitude <= 179.9; longitude += 7.313) {
            const Location place = fuzz(latitude, longitude, "gps");
            EXPECT_LT(distance(place, latitude, longitude), 0.82) << latitude << " " << longitude;
            const Location again = fuzz(place.latitude, place.longitude, "gps");
            EXPECT_NEAR(again.latitude, place.latitude, 1e-9) << "asking again narrows nothing down";
            EXPECT_NEAR(again.longitude, place.longitude, 1e-9);
        }
    }
}

TEST(LocationFuzz, AWalkWithinOneCellIsOnePlace)
{
    // Cells of 1.1 km in each direction, wherever: steps of 10 m over 11 km must show about ten places each way.
    for (const double latitude : {0.0, 47.37, -33.86, 69.65, 85.0}) {
        std::set<std::pair<double, double>> northward, eastward;
        for (int step = 0; step < 1100; ++step) {
            const double metre10 = step * 0.01 / kKilometresPerDegree;
            const Location north = fuzz(latitude + metre10, 8.5, "gps");
            const Location east = fuzz(latitude, 8.5 + metre10 / std::cos(latitude * std::numbers::pi / 180), "gps");
            northward.emplace(north.latitude, 0);
            eastward.emplace(east.latitude, east.longitude);
        }
        EXPECT_NEAR(static_cast<double>(northward.size()), 10, 1.5) << latitude;
        EXPECT_NEAR(static_cast<double>(eastward.size()), 10, 1.5) << latitude;
    }
}

TEST(LocationFuzz, StaysOnTheGlobe)
{
    for (const auto& [latitude, longitude] : {std::pair(90.0, 0.0),
                                              {-90.0, 180.0},
                                              {90.0, -180.0},
                                              {89.9999, 179.9999},
                                              {0.0, 180.0},
                                              {0.0, -180.0},
                                              {1e9, 1e9},
                                              {-1e300, -1e300}}) {
        const Location place = fuzz(latitude, longitude, "wifi");
        EXPECT_TRUE(std::abs(place.latitude) <= 90 && std::abs(place.longitude) <= 180) << latitude << " " << longitude;
        EXPECT_EQ(place.source, "wifi");
    }
    EXPECT_EQ(fuzz(-0.001, -0.001, "").latitude, -0.005) << "cells don't straddle the equator";
}

} // namespace
} // namespace platform
