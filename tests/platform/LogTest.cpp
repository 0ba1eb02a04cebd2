#include "platform/base/Log.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

struct LogTest : testing::Test {
    LogTest() { Log::threshold = LogLevel::Fault; }
    const Log log{"com.quorvane.test", "category"};
};

TEST_F(LogTest, TextsFromOutsideCannotForgeLines)
{
    std::vector<std::string> lines;
    const LogTap tap([&](const LogLine& line) { lines.emplace_back(line.text); });
    for (const char* text : {"a\nfault forged", "a\r\tb", "\x1b[2J", "\x7f", "ü 日 \\n {}"}) log.error("{}", text);
    EXPECT_EQ(lines,
              (std::vector<std::string>{"a\\x0afault forged", "a\\x0d\\x09b", "\\x1b[2J", "\\x7f", "ü 日 \\n {}"}));
}

TEST_F(LogTest, ArgumentsAreCutAndPrivateOnesAreHidden)
{
    std::vector<std::string> lines;
    const LogTap tap([&](const LogLine& line) { lines.emplace_back(line.text); });
    const std::string query = "wea", longText = std::string(199, 'x') + "ü and so on";
    const auto writeAll = [&](bool privateData) {
        Log::privateData = privateData;
        log.log("{} {}", 1, Private{query});
        log.error("{:.1f} {}", 0.5, Private{query + "ther"});
        log.debug("'{}'", Private{query});
        log.info("'{}' '{}'", longText, Private{longText});
    };
    writeAll(false);
    writeAll(true);
    Log::privateData = false;
    const std::string cut = "'" + std::string(199, 'x') + "…'";
    EXPECT_EQ(lines, (std::vector<std::string>{"1 <private>", "0.5 <private>", "'wea'", cut + " '<private>'", "1 wea",
                                               "0.5 weather", "'wea'", cut + " " + cut}));
}

TEST_F(LogTest, ATapSeesEveryLevelAndThenLeavesThemAsTheyWere)
{
    std::string seen;
    const auto writeAll = [&] {
        log.debug("d");
        log.info("i");
        log.log("l");
        log.error("e {}", 1);
    };
    writeAll();
    {
        const LogTap tap([&](const LogLine& line) {
            seen += std::string(logLevelName(line.level)) + "/" + std::string(line.category) + "/" +
                    std::string(line.text) + " ";
            EXPECT_EQ(line.subsystem, "com.quorvane.test");
        });
        writeAll();
    }
    writeAll();
    EXPECT_EQ(seen, "debug/category/d info/category/i default/category/l error/category/e 1 ");
    EXPECT_EQ(Log::threshold, LogLevel::Fault);
}

} // namespace
} // namespace platform
