#include "platform/device/AppActivities.h"

#include <algorithm>
#include <limits>

#include <fmt/format.h>

#include "platform/files/Files.h"
#include "platform/files/Sqlite.h"

namespace platform {

namespace {

using std::chrono::seconds;

/// The version of the table below. A database of another version is neither read nor changed.
constexpr std::int64_t kVersion = 1;

constexpr const char* kTable = R"(
CREATE TABLE app_activity (
    identifier INTEGER PRIMARY KEY,
    app TEXT NOT NULL,
    start INTEGER NOT NULL,
    related_unique_identifier TEXT,
    content_url TEXT,
    publicly_indexable INTEGER NOT NULL DEFAULT 0
);
CREATE INDEX app_activity_start ON app_activity (start);
PRAGMA user_version = 1;
)";

Result<std::int64_t> versionOf(Sqlite& database)
{
    std::int64_t version = 0;
    if (auto read = database.run("PRAGMA user_version", {}, [&](const Sqlite::Row& row) { version = row.integer(0); });
        !read)
        return std::unexpected(std::move(read.error()));
    return version;
}

std::optional<std::string> textOf(const Sqlite::Row& row, int column)
{
    return row.isNull(column) ? std::nullopt : std::optional(std::string(row.text(column)));
}

Sqlite::Parameter parameter(const std::optional<std::string>& text)
{
    return text ? Sqlite::Parameter(std::string_view(*text)) : Sqlite::Parameter();
}

} // namespace

Result<std::vector<AppActivity>> AppActivities::queryAppActivitiesAfterDate(Date from, Date to, std::size_t limit) const
{
    auto database = _files.openDatabase(_path, Sqlite::Access::ReadOnly);
    if (!database) return std::unexpected(std::move(database.error()));
    const auto version = versionOf(*database);
    if (!version) return std::unexpected(version.error());
    if (*version != kVersion) return malformed(fmt::format("{} has version {}", _path.string(), *version));

    std::vector<AppActivity> activities;
    const auto atMost = std::min<std::size_t>(limit, std::numeric_limits<std::int64_t>::max());
    auto read =
        database->run("SELECT start, app, related_unique_identifier, content_url, publicly_indexable FROM app_activity "
                      "WHERE start >= ? AND start <= ? ORDER BY start, identifier LIMIT ?",
                      {std::chrono::ceil<seconds>(from).time_since_epoch().count(),
                       std::chrono::floor<seconds>(to).time_since_epoch().count(), static_cast<std::int64_t>(atMost)},
                      [&](const Sqlite::Row& row) {
                          activities.push_back({.start = Date(seconds(row.integer(0))),
                                                .bundleIdentifier = std::string(row.text(1)),
                                                .relatedUniqueIdentifier = textOf(row, 2),
                                                .contentUrl = textOf(row, 3),
                                                .publiclyIndexable = row.integer(4) != 0});
                      });
    if (!read) return std::unexpected(std::move(read.error()));
    return activities;
}

Result<void> AppActivities::add(const AppActivity& activity, Date now) const
{
    const auto start = std::chrono::floor<seconds>(activity.start);
    const auto oldest = std::chrono::floor<seconds>(now) - kKeptFor;
    if (start < oldest) return malformed("the activity began more than seven days ago");

    if (auto made = _files.createDirectories(_path.parent_path()); !made) return made;
    auto database = _files.openDatabase(_path, Sqlite::Access::Shared);
    if (!database) return std::unexpected(std::move(database.error()));
    return database->transaction([&]() -> Result<void> {
        const auto version = versionOf(*database);
        if (!version) return std::unexpected(version.error());
        if (*version != 0 && *version != kVersion)
            return malformed(fmt::format("{} has version {}", _path.string(), *version));
        if (*version == 0)
            if (auto made = database->execute(kTable); !made) return made;
        if (auto forgotten =
                database->run("DELETE FROM app_activity WHERE start < ?", {oldest.time_since_epoch().count()});
            !forgotten)
            return forgotten;
        return database->run("INSERT INTO app_activity (app, start, related_unique_identifier, content_url, "
                             "publicly_indexable) VALUES (?, ?, ?, ?, ?)",
                             {activity.bundleIdentifier, start.time_since_epoch().count(),
                              parameter(activity.relatedUniqueIdentifier), parameter(activity.contentUrl),
                              std::int64_t(activity.publiclyIndexable)});
    });
}

} // namespace platform
