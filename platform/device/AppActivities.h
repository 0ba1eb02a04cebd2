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

/// Something that the user did in an application, as the application told it.
struct AppActivity {
    Date start; ///< whole seconds
    std::string bundleIdentifier;
    std::optional<std::string> relatedUniqueIdentifier;
    std::optional<std::string> contentUrl;
    bool publiclyIndexable = false; ///< whether its content is open to everyone
};

/// What the user does in applications: a database (docs/formats.md) that applications add to and the daemon only reads.
/// It is opened for each call, and nothing is kept of it in between. Any thread.
class AppActivities {
public:
    /// Activities that began earlier than this are removed when one is added.
    static constexpr auto kKeptFor = std::chrono::days(7);

    /// `directory` holds the database, which need not be there. `files` must outlive this.
    AppActivities(FileSystem& files, const std::filesystem::path& directory)
        : _files(files), _path(directory / "app-activities.db")
    {}

    /// Returns the first `limit` activities that began from `from` to `to`, both included, by date; those of the same
    /// second in the order in which they were added. Waits for nobody: fails at once if the database isn't there
    /// (ENOENT), is locked or damaged, or has another version.
    [[nodiscard]] Result<std::vector<AppActivity>> queryAppActivitiesAfterDate(Date from, Date to,
                                                                               std::size_t limit) const;

    /// Adds one; makes the database and its directory if they are missing. Waits up to a second for others that add.
    /// Fails for an activity older than `kKeptFor`.
    [[nodiscard]] Result<void> add(const AppActivity& activity, Date now) const;

private:
    FileSystem& _files;
    const std::filesystem::path _path;
};

} // namespace platform
