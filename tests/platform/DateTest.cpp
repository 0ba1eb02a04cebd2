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

} // namespace
} // namespace platform
