#include "platform/base/Date.h"

#include <cmath>

#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(Date, SecondsAndDatesConvertBothWays)
{
    for (const double seconds :
         {0.0, 0.1, -0.1, 1.5e-9, 1'700'000'000.25, 1'767'225'600.123456, -86'400.75, 9.2e9, -9.2e9})
        EXPECT_NEAR(secondsSince1970(dateFromSecondsSince1970(seconds)), seconds, 1e-9) << seconds;
    EXPECT_EQ(durationFromSeconds(1e30), durationFromSeconds(9.2e9));
    EXPECT_EQ(durationFromSeconds(-INFINITY), durationFromSeconds(-9.2e9));
    EXPECT_EQ(durationFromSeconds(NAN), Duration::zero());
}

TEST(Date, SystemTimesOfAnyYearCanBeSubtractedAndAdded)
{
    using namespace std::chrono_literals;
    EXPECT_EQ(dateFromSystemTime(1'700'000'000, 250'000'000), dateFromSecondsSince1970(1'700'000'000.25));
    const Date earliest = dateFromSystemTime(INT64_MIN, 0), latest = dateFromSystemTime(INT64_MAX, 999'999'999);
    EXPECT_EQ(earliest, Date());
    EXPECT_LT(dateFromSystemTime(7'000'000'000, 0), latest); // the year 2191
    EXPECT_EQ(dateFromSystemTime(9'300'000'000, 0), latest); // 2264
    EXPECT_GT(latest - earliest, 24h * 365 * 229);
    EXPECT_GT(latest + 24h * 365 * 60, latest);
}

} // namespace
} // namespace platform
