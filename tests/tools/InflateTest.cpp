#include "tools/shared/Inflate.h"

#include <gtest/gtest.h>

namespace tavrin::tools {
namespace {

TEST(Inflate, BrokenStreamsAreRefused)
{
    const std::string whole("\x4b\x04\x00", 3); // "a"
    EXPECT_EQ(inflateRaw(whole, 10), "a");
    EXPECT_EQ(inflateRaw(std::string("\x03\x00", 2), 0), "") << "an empty stream";
    EXPECT_FALSE(inflateRaw("", 10));
    EXPECT_FALSE(inflateRaw(std::string_view(whole).substr(0, 2), 10)) << "cut";
    EXPECT_FALSE(inflateRaw(whole + "x", 10)) << "bytes after it";
    EXPECT_FALSE(inflateRaw(whole, 0)) << "too large";
    EXPECT_FALSE(inflateRaw("\xFF\xFF\xFF", 10));
}

} // namespace
} // namespace tavrin::tools
