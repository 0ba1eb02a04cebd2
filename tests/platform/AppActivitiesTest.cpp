#include "platform/device/AppActivities.h"

#include <sys/stat.h>

#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/files/Sqlite.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;

const Date kStart = dateFromSecondsSince1970(1767225600);

struct AppActivitiesTest : testing::Test {
    AppActivity activity(std::string app, Duration before)
    {
        return {.start = kStart - before, .bundleIdentifier = std::move(app), .publiclyIndexable = true};
    }
    void add(const AppActivity& activity, Date now = kStart)
    {
        const auto added = store.add(activity, now);
        EXPECT_TRUE(added) << added.error().description();
    }
    std::string appsIn(Date from, Date to, std::size_t limit = 100)
    {
        const auto activities = store.queryAppActivitiesAfterDate(from, to, limit);
        if (!activities) return activities.error().description();
        std::string names;
        for (const AppActivity& each : *activities) names += each.bundleIdentifier + " ";
        return names;
    }
    std::string all() { return appsIn(kStart - 240h, kStart); }

    test::TemporaryDirectory directory;
    const fs::path file = directory / "knowledge/app-activities.db";
    const std::unique_ptr<FileSystem> files = makeSystemFiles();
    const AppActivities store{*files, directory / "knowledge"};
};

TEST_F(AppActivitiesTest, AreReadByDateWithinTheRangeAndTheLimit)
{
    add(activity("c", 1h));
    add(activity("a", 24h));
    add(activity("too-early", 24h + 1s));
    add(activity("d", 0s));
    add(activity("too-late", -1s));
    add(activity("b", 2h));
    add(activity("b-again", 2h));
    EXPECT_EQ(appsIn(kStart - 24h, kStart), "a b b-again c d ");
    EXPECT_EQ(appsIn(kStart - 24h + 1ns, kStart + 999ms), "b b-again c d ") << "activities begin at whole seconds";
    EXPECT_EQ(appsIn(kStart - 24h, kStart, 3), "a b b-again ");
    EXPECT_EQ(appsIn(kStart - 24h, kStart, SIZE_MAX), "a b b-again c d ");
    EXPECT_EQ(appsIn(kStart, kStart - 24h), "");
}

TEST_F(AppActivitiesTest, KeepEveryFieldAndTheirAbsence)
{
    AppActivity full = activity("Org.Example.News", 1h);
    full.relatedUniqueIdentifier = "item'; DROP TABLE app_activity; --";
    full.contentUrl = "https://news.example/ü?q=1";
    add(full);
    add({.start = kStart, .bundleIdentifier = "bare", .contentUrl = ""});
    const auto read = store.queryAppActivitiesAfterDate(kStart - 24h, kStart, 100).value();
    ASSERT_EQ(read.size(), 2u);
    EXPECT_EQ(read[0].bundleIdentifier, full.bundleIdentifier);
    EXPECT_EQ(read[0].relatedUniqueIdentifier, full.relatedUniqueIdentifier);
    EXPECT_EQ(read[0].contentUrl, full.contentUrl);
    EXPECT_EQ(read[0].start, full.start);
    EXPECT_TRUE(read[0].publiclyIndexable);
    EXPECT_EQ(read[1].relatedUniqueIdentifier, std::nullopt);
    EXPECT_EQ(read[1].contentUrl, "");
    EXPECT_FALSE(read[1].publiclyIndexable);

    EXPECT_EQ(test::modeOf(file), 0600u);
}

TEST_F(AppActivitiesTest, AreForgottenAfterSevenDaysAndNotTakenLater)
{
    add(activity("old", 0s));
    add(activity("new", -24h));
    add(activity("newest", -(168h + 1s)), kStart + 168h + 1s);
    EXPECT_EQ(appsIn(kStart - 24h, kStart + 240h), "new newest ");
    EXPECT_FALSE(store.add(activity("late", 168h + 1s), kStart));
    EXPECT_EQ(appsIn(kStart - 240h, kStart + 240h), "new newest ") << "nothing was done for one that is refused";
}

TEST_F(AppActivitiesTest, WhatIsNoDatabaseIsAnErrorAndStaysAsItIs)
{
    EXPECT_FALSE(store.queryAppActivitiesAfterDate(kStart, kStart, 1));
    EXPECT_FALSE(fs::exists(file)) << "reading makes nothing";
    fs::create_directories(file);
    EXPECT_FALSE(store.queryAppActivitiesAfterDate(kStart, kStart, 1));
    EXPECT_FALSE(store.add(activity("a", 0s), kStart));
    fs::remove(file);
    ASSERT_EQ(mkfifo(file.c_str(), 0600), 0);
    EXPECT_FALSE(store.queryAppActivitiesAfterDate(kStart, kStart, 1)) << "and nobody waits for a writer";
    fs::remove(file);
    test::writeFile(file, std::string(4096, 'x'));
    EXPECT_FALSE(store.queryAppActivitiesAfterDate(kStart, kStart, 1));
    EXPECT_FALSE(store.add(activity("a", 0s), kStart));
    EXPECT_EQ(fs::file_size(file), 4096u);
    fs::rename(file, directory / "elsewhere");
    fs::create_symlink(directory / "elsewhere", file);
    EXPECT_FALSE(store.queryAppActivitiesAfterDate(kStart, kStart, 1));
    fs::remove(file);

    add(activity("a", 0s));
    fs::resize_file(file, fs::file_size(file) / 2);
    EXPECT_FALSE(store.queryAppActivitiesAfterDate(kStart - 24h, kStart, 100));
}

TEST_F(AppActivitiesTest, ADatabaseOfAnotherMakeIsAnErrorWhateverItHolds)
{
    add(activity("a", 0s));
    const std::pair<const char*, bool> cases[]{
        {"UPDATE app_activity SET start = 'today', app = x'00ff', publicly_indexable = 'yes'", true},
        {"ALTER TABLE app_activity ADD COLUMN other", true},
        {"INSERT INTO app_activity (app, start) VALUES (hex(zeroblob(1000000)), unixepoch('2026-01-01'))", false},
        {"DELETE FROM app_activity WHERE length(app) > 1000", true},
        {"ALTER TABLE app_activity DROP COLUMN content_url", false},
        {"DROP TABLE app_activity", false},
        {"CREATE VIEW app_activity AS WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n) SELECT i AS "
         "identifier, 'a' AS app, i % 2 AS start, 'b' AS related_unique_identifier, 'c' AS content_url, 1 AS "
         "publicly_indexable FROM n",
         false},
        {"PRAGMA user_version = 2", false},
    };
    for (const auto& [statements, readable] : cases) {
        ASSERT_TRUE(Sqlite::open(file, Sqlite::Access::Shared)->execute(statements)) << statements;
        EXPECT_EQ(store.queryAppActivitiesAfterDate(kStart - 24h, kStart, 100).has_value(), readable) << statements;
    }
    EXPECT_FALSE(store.add(activity("a", 0s), kStart)) << "what another version keeps is not ours to change";
}

TEST_F(AppActivitiesTest, ALockedDatabaseIsAnErrorAtOnceAndReadableAgainLater)
{
    add(activity("a", 0s));
    auto other = Sqlite::open(file, Sqlite::Access::Shared).value();
    ASSERT_TRUE(other.execute("BEGIN EXCLUSIVE"));
    const auto locked = store.queryAppActivitiesAfterDate(kStart - 24h, kStart, 100);
    ASSERT_FALSE(locked);
    EXPECT_EQ(locked.error().domain, kSqliteErrorDomain);
    EXPECT_EQ(locked.error().code, 5) << "busy";
    ASSERT_TRUE(other.execute("COMMIT"));
    EXPECT_EQ(all(), "a ");
    ASSERT_TRUE(other.execute("BEGIN IMMEDIATE"));
    EXPECT_EQ(all(), "a ") << "who only prepares a change doesn't lock readers out";
}

} // namespace
} // namespace platform
