#include "platform/files/UserDefaults.h"

#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/run/Queue.h"
#include "platform/run/RunLoop.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tests/support/ByHand.h"
#include "tests/support/LogCapture.h"
#include "tests/support/MemoryFiles.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using test::writeFile;

struct UserDefaultsTest : testing::Test, test::ByHand {
    ~UserDefaultsTest() override { drain(); } // a write that waits holds its queue

    std::string text(const fs::path& file) const
    {
        const auto bytes = files->read(file, 8 << 20);
        return bytes ? std::string(bytes->view()) : bytes.error().description();
    }
    Value file() const { return parseJson(text(path), 8 << 20).value_or(Value()); }

    test::TemporaryDirectory directory;
    const fs::path path = directory / "config/suite.json";
    std::shared_ptr<Queue> queue = makeQueue("test.writes");
    std::unique_ptr<FileSystem> files = makeSystemFiles();
    test::LogCapture log;
};

TEST_F(UserDefaultsTest, ReadsTheFileThenWhatWasRegistered)
{
    fs::create_directory(path.parent_path());
    writeFile(path, R"({"a": 1, "b": "file"})");
    UserDefaults defaults(*files, path, queue);
    defaults.registerDefaults(Dictionary{{"b", "registered"}, {"c", "registered"}});
    defaults.registerDefaults(Dictionary{{"d", "later"}});
    EXPECT_EQ(defaults.string("b"), "file");
    EXPECT_EQ(defaults.string("c"), "registered");
    EXPECT_EQ(defaults.string("d"), "later");
    EXPECT_TRUE(defaults.value("e").isNull());
    EXPECT_EQ(defaults.contents().size(), 2u) << "what is registered is no content";
    defaults.remove("b");
    EXPECT_EQ(defaults.string("b"), "registered");
}

TEST_F(UserDefaultsTest, ValuesOfTheWrongTypeReadAsTheirNearestOrNothing)
{
    const struct {
        Value value;
        bool boolean;
        std::optional<std::string> string;
        std::optional<std::int64_t> integer;
        bool isDate;
    } cases[]{
        {true, true, {}, {}, false},
        {1, true, {}, 1, true},
        {0, false, {}, 0, true},
        {-2.5, true, {}, {}, true},
        {3.0, true, {}, 3, true},
        {1e300, true, {}, {}, true},
        {"true", true, "true", {}, false},
        {"YES", true, "YES", {}, false},
        {"1", true, "1", 1, false},
        {"-12", false, "-12", -12, false},
        {"12x", false, "12x", {}, false},
        {"99999999999999999999", false, "99999999999999999999", {}, false},
        {"no", false, "no", {}, false},
        {"", false, {}, {}, false},
        {Value(), false, {}, {}, false},
        {Value(Value::Array{1}), false, {}, {}, false},
        {Dictionary{{"a", 1}}, false, {}, {}, false},
    };
    UserDefaults defaults;
    for (const auto& c : cases) {
        defaults.set("key", c.value);
        EXPECT_EQ(defaults.boolean("key"), c.boolean) << toJson(c.value);
        EXPECT_EQ(defaults.string("key"), c.string) << toJson(c.value);
        EXPECT_EQ(defaults.integer("key"), c.integer) << toJson(c.value);
        EXPECT_EQ(defaults.date("key").has_value(), c.isDate) << toJson(c.value);
    }
}

TEST_F(UserDefaultsTest, WhatIsSetIsSeenAtOnceAndWrittenTogether)
{
    const Date date = dateFromSecondsSince1970(1'700'000'000.25);
    {
        UserDefaults defaults(*files, path, queue);
        defaults.set("a", 1);
        defaults.set("date", date);
        defaults.set("gone", 1);
        defaults.remove("gone");
        EXPECT_EQ(defaults.integer("a"), 1);
        EXPECT_FALSE(fs::exists(path)) << "written later, on the queue";
    }
    drain();
    EXPECT_EQ(toJson(file()), R"({"a":1,"date":1700000000.25})");
    EXPECT_EQ(UserDefaults(*files, path, queue).date("date"), date);
    EXPECT_EQ(test::modeOf(path), 0600u);
}

TEST_F(UserDefaultsTest, KeysThatOthersChangedMeanwhileAreKept)
{
    UserDefaults mine(*files, path, queue), theirs(*files, path, queue);
    mine.set("mine", 1);
    mine.set("both", "mine");
    mine.synchronize();
    theirs.set("theirs", 2);
    theirs.set("both", "theirs");
    theirs.synchronize();
    mine.set("mine", 3);
    mine.synchronize();
    EXPECT_EQ(file()["mine"], Value(3));
    EXPECT_EQ(file()["theirs"], Value(2));
    EXPECT_EQ(file()["both"], Value("theirs")) << "only what was set since the last write is ours";
    EXPECT_EQ(mine.integer("theirs"), 2);
}

TEST_F(UserDefaultsTest, AnEditedFileIsReadAgain)
{
    RunLoop loop;
    UserDefaults defaults(*files, path, queue);
    defaults.watch(loop); // the directory isn't there yet
    const auto seen = [&](std::int64_t wanted) {
        return test::runUntil(loop, [&] {
            drain();
            return defaults.integer("key") == wanted;
        });
    };
    fs::create_directory(path.parent_path());
    writeFile(path, R"({"key": 1})");
    EXPECT_TRUE(seen(1)) << "made";
    writeFile(path, R"({"key": 2})");
    EXPECT_TRUE(seen(2)) << "written in place";
    EXPECT_TRUE(files->writeAtomically(path, R"({"key": 3})"));
    EXPECT_TRUE(seen(3)) << "replaced";
    defaults.set("other", 1); // not written yet
    writeFile(path, R"({"key": 4})");
    EXPECT_TRUE(seen(4));
    EXPECT_EQ(defaults.integer("other"), 1) << "what was set outlives a reload";
    fs::remove(path);
    EXPECT_TRUE(test::runUntil(loop, [&] { return drain(), defaults.value("key").isNull(); })) << "removed";
}

TEST_F(UserDefaultsTest, BrokenFilesReadAsEmptyAndAreKeptBeside)
{
    fs::create_directory(path.parent_path());
    std::string deep = "{\"a\":";
    for (int i = 0; i < 500; ++i) deep += "[";
    for (const std::string& broken :
         {std::string(), std::string("{\"a\": 1"), std::string("[1]"), std::string("{\"a\": \"\xff\"}"), deep,
          "{\"a\": \"" + std::string(5 << 20, 'x') + "\"}"}) {
        writeFile(path, broken);
        UserDefaults defaults(*files, path, queue);
        defaults.registerDefaults(Dictionary{{"a", "registered"}});
        EXPECT_EQ(defaults.string("a"), "registered") << broken.substr(0, 20);
        defaults.synchronize();
        EXPECT_EQ(text(path), broken) << "nothing was set, nothing is overwritten";
        defaults.set("b", 2);
        defaults.synchronize();
        EXPECT_EQ(file(), Value(Dictionary{{"b", 2}}));
        EXPECT_EQ(text(path.string() + ".corrupt"), broken);
    }
    EXPECT_TRUE(log.has(LogLevel::Error, "default", "can't be read, defaults apply"));
}

TEST_F(UserDefaultsTest, ALockThatAnotherProcessKeepsPutsAWriteOffButNotForEver)
{
    fs::create_directory(path.parent_path());
    UserDefaults defaults(*files, path, queue);
    for (const Duration held : {Duration(500ms), Duration(1h)}) {
        fs::remove(path);
        auto lock = files->lock(path.string() + ".lock");
        defaults.set("a", 1);
        drain();
        for (int i = 0; i < 4; ++i, advance(100ms)) defaults.set("b", i);
        EXPECT_FALSE(fs::exists(path)) << "tried, and put off";
        EXPECT_EQ(clock.pendingTimers(), 1u);
        if (held < 2s) lock = FileHandle();
        advance(held < 2s ? Duration(100ms) : Duration(2s));
        EXPECT_EQ(file(), Value(Dictionary{{"a", 1}, {"b", 3}})) << toSeconds(held);
        EXPECT_EQ(clock.pendingTimers(), 0u);
        EXPECT_EQ(log.count("are written without a lock"), held < 2s ? 0 : 1);
        defaults.set("a", 2);
        EXPECT_TRUE(defaults.synchronize()) << "waits for nobody";
        EXPECT_EQ(file()["a"], Value(2));
    }
}

TEST_F(UserDefaultsTest, WhatFailedIsTriedAgain)
{
    for (const std::string operation : {"read", "mkdir", "write"}) {
        test::MemoryFiles memory;
        memory.files["/config/suite.json"] = R"({"theirs": 1})";
        memory.fault = [&](std::string_view asked, const fs::path&) { return asked == operation ? EMFILE : 0; };
        UserDefaults defaults(memory, "/config/suite.json", queue);
        defaults.set("mine", 2);
        drain();
        EXPECT_EQ(defaults.synchronize().error().code, EMFILE);
        EXPECT_EQ(defaults.integer("mine"), 2) << "readers see it all the same";
        EXPECT_EQ(memory.files.size(), 1u) << operation << ": nothing is put aside";
        for (int minute = 0; minute < 10; ++minute) advance(1min);
        EXPECT_EQ(clock.pendingTimers(), 1u);
        memory.fault = nullptr;
        defaults.reload();
        EXPECT_EQ(defaults.integer("theirs"), 1);
        memory.fault = [&](std::string_view asked, const fs::path&) { return asked == operation ? EMFILE : 0; };
        defaults.reload();
        EXPECT_EQ(defaults.integer("theirs"), 1) << operation << ": the last values apply";
        memory.fault = nullptr;
        advance(1min);
        EXPECT_EQ(parseJson(memory.files.at("/config/suite.json"), 1 << 20),
                  Value(Dictionary{{"theirs", 1}, {"mine", 2}}));
        EXPECT_EQ(clock.pendingTimers(), 0u);
    }
    EXPECT_LT(log.count("trying again later"), 20) << "less and less often";
}

} // namespace
} // namespace platform
