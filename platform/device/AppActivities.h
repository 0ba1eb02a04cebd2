#pragma once

#include <cstddef>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "platform/base/Date.h"
#include "platform/values/Error.h"

namespace platform {

class FileSystem;

/// Something that the user did in an application, as the application reported it.
struct AppActivity {
    Date start; ///< whole seconds
    std::string bundleIdentifier;
    std::optional<std::string> relatedUniqueIdentifier;
    std::optional<std::string> contentUrl;
    bool publiclyIndexable = false; ///< the content is open to everyone
};

/// The database of what the user does in applications (docs/formats.md). Applications add to it; the daemon only reads.
/// Opens the database for each call and keeps nothing in memory. Any thread.
class AppActivities {
public:
    /// `add` removes activities that are older than this.
    static constexpr auto kKeptFor = std::chrono::days(7);

    /// `directory` is the database's; neither need exist. `files` must outlive this object.
    AppActivities(FileSystem& files, const std::filesystem::path& directory)
        : _files(files), _path(directory / "app-activities.db")
    {}

    /// Returns the first `limit` activities that began between `from` and `to`, both included, ordered by second, then
    /// by insertion. Never waits: fails if the database is missing (ENOENT), locked, damaged, or of another version.
    [[nodiscard]] Result<std::vector<AppActivity>> queryAppActivitiesAfterDate(Date from, Date to,
                                                                               std::size_t limit) const;

    /// Adds an activity; creates the database and its directory if they are missing. Waits up to one second for other
    /// writers. Fails for an activity older than `kKeptFor`.
    [[nodiscard]] Result<void> add(const AppActivity& activity, Date now) const;

private:
    FileSystem& _files;
    const std::filesystem::path _path;
};

} // namespace platform
