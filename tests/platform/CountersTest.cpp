#include "platform/files/Counters.h"

#include <map>
#include <thread>

#include <gtest/gtest.h>

#include "platform/run/Queue.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"
#include "tests/support/ByHand.h"
#include "tests/support/LogCapture.h"
#include "tests/support/MemoryFiles.h"

namespace platform {
namespace {

using namespace std::chrono_literals;

struct CountersTest : testing::Test, test::ByHand {
    const std::filesystem::path path = "/state/app/counters.json";
    test::MemoryFiles files;
    std::shared_ptr<Queue> queue = makeQueue("test.counters");
    test::LogCapture log;
};

TEST_F(CountersTest, AreWrittenOncePerMinuteAndOnlyAfterAChange)
{
    CounterStore counters(files, path, queue);
    advance(1h);
    EXPECT_EQ(clock.pendingTimers(), 0u) << "nobody counts, nothing wakes";
    for (int i = 0; i < 100; ++i) counters.add("a", 2);
    counters.set("b", -5);
    counters.add("c", 1);
    counters.clear("c");
    EXPECT_EQ(clock.pendingTimers(), 1u);
    advance(59s);
    EXPECT_TRUE(files.files.empty());
    advance(1s);
    EXPECT_EQ(parseJson(files.files.at(path), 1 << 20), Value(Dictionary{{"a", 200}, {"b", -5}}));
    EXPECT_EQ(clock.pendingTimers(), 0u);

    CounterStore later(files, path, queue);
    later.add("a", 1);
    EXPECT_EQ(later.snapshot(), (std::map<std::string, std::int64_t>{{"a", 201}, {"b", -5}}));
    later.clear("b");
    later.clear("never");
    advance(60s);
    EXPECT_EQ(CounterStore(files, path, queue).value("b"), 0);
}

TEST_F(CountersTest, DamagedFilesCostNoMoreThanTheyMust)
{
    const struct {
        std::string file;
        std::map<std::string, std::int64_t> read;
        const char* logged;
    } cases[]{{R"({"a": 1, "b": "x", "c": null, "d": 1.5, "e": 3})", {{"a", 1}, {"e", 3}}, nullptr},
              {R"({"a": 1)", {}, "are damaged"},
              {"[]", {}, "are damaged"},
              {"", {}, "are damaged"},
              {std::string(64 << 20, ' '), {}, "can't be read"}};
    for (const auto& c : cases) {
        files.files[path] = c.file;
        CounterStore counters(files, path, queue);
        EXPECT_EQ(counters.snapshot(), c.read) << c.file.substr(0, 60);
        EXPECT_TRUE(!c.logged || log.count(c.logged) > 0) << c.file.substr(0, 60);
        counters.add("a", 1);
        EXPECT_EQ(counters.value("a"), c.read.contains("a") ? 2 : 1);
    }
}

// Names come from clients: too long ones are dropped, of too many those that are least used, and what is kept is also
// read back.
TEST_F(CountersTest, HostileNamesFillNeitherMemoryNorFileAndEndNoOthersCounts)
{
    CounterStore counters(files, path, queue);
    for (int i = 0; i < 3; ++i) counters.add("used", 1);
    counters.add(std::string(513, 'x'), 1);
    EXPECT_EQ(counters.snapshot().size(), 1u);
    for (int i = 0; i < 5000; ++i) {
        std::string key = std::to_string(i);
        key.resize(512, '\x01'); // six bytes each in the file
        counters.add(key, 1);
    }
    EXPECT_LE(counters.snapshot().size(), 4096u);
    EXPECT_GT(counters.snapshot().size(), 3500u);
    counters.add("new", 1);
    EXPECT_EQ(counters.value("new"), 1) << "a new one still counts";
    counters.add("used", 1);
    advance(60s);
    CounterStore later(files, path, queue);
    EXPECT_EQ(later.snapshot(), counters.snapshot());
    for (int i = 0; i < 5000; ++i) later.add(std::to_string(i), 1);
    EXPECT_EQ(later.value("used"), 4) << "also after a restart";
}

TEST_F(CountersTest, WhatFailedIsTriedAgain)
{
    for (const std::string failing : {"read", "write"}) {
        files.files[path] = R"({"a": 5, "theirs": 1})";
        files.fault = [&](std::string_view operation, const auto&) { return operation == failing ? EIO : 0; };
        CounterStore counters(files, path, queue);
        counters.add("a", 1);
        advance(60s);
        EXPECT_EQ(files.files[path], R"({"a": 5, "theirs": 1})") << failing;
        files.fault = nullptr;
        counters.add("a", 1);
        advance(60s);
        EXPECT_EQ(CounterStore(files, path, queue).snapshot(),
                  (std::map<std::string, std::int64_t>{{"a", 7}, {"theirs", 1}}))
            << failing;
    }
}

TEST_F(CountersTest, OpenMetricsTextCannotBeBrokenByNames)
{
    CounterStore counters;
    counters.add("b.\"quoted\"\\", 1);
    counters.add("a\n# EOF", -2);
    counters.add("ü", 3);
    EXPECT_EQ(counters.openMetrics("probe"), "# TYPE probe unknown\n"
                                             "probe{key=\"a\\n# EOF\"} -2\n"
                                             "probe{key=\"b.\\\"quoted\\\"\\\\\"} 1\n"
                                             "probe{key=\"ü\"} 3\n"
                                             "# EOF\n");
    EXPECT_EQ(CounterStore().openMetrics("probe"), "# TYPE probe unknown\n# EOF\n");
}

TEST_F(CountersTest, ThreadsLoseNoAddition)
{
    CounterStore counters;
    {
        std::vector<std::jthread> threads;
        for (int t = 0; t < 4; ++t) {
            threads.emplace_back([&, t] {
                for (int i = 0; i < 2000; ++i) {
                    counters.add("shared", 1);
                    counters.add(std::to_string(t * 100 + i % 10), 1);
                    if (i % 100 == 0) counters.clear("none"), (void)counters.snapshot();
                }
            });
        }
    }
    EXPECT_EQ(counters.value("shared"), 8000);
    EXPECT_EQ(counters.value("305"), 200);
}

} // namespace
} // namespace platform
