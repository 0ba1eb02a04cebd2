#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

class Clock;
class Executor;
class FileSystem;
class RunLoop;

struct InstalledApplication {
    std::string identifier; ///< the desktop file ID without ".desktop": "org.gnome.Terminal"
    std::string version;    ///< from its AppStream metadata, else "0"
    bool operator==(const InstalledApplication&) const = default;
};

/// The applications that the user can start. Any thread.
class InstalledApplications {
public:
    virtual ~InstalledApplications() = default;
    /// Returns the applications, ordered by identifier. Reads many files: don't call it on the run loop's thread.
    [[nodiscard]] virtual std::vector<InstalledApplication> applications() = 0;
    /// Calls `handler` on the run loop's thread after applications were installed or removed: once for all changes
    /// within two seconds, because a package manager makes many. One handler; a new one replaces it.
    virtual void onChange(std::function<void()> handler) = 0;
};

/// Returns the applications of the desktop entries in the directories "applications" of `dataDirectories` (Desktop
/// Entry and XDG Base Directory specifications). If several entries have the same file ID, the one in the first
/// directory counts. Hidden entries don't count, nor do entries whose TryExec names a missing program. The version is
/// that of the first release in the AppStream metadata, "metainfo/IDENTIFIER.metainfo.xml" or ".appdata.xml".
///
/// The first `onChange` makes `executor` scan the directories; watches follow two seconds later, and report changes in
/// between. Symbolic links are followed, because some package formats install links, but each directory is scanned
/// once. Limits, logged when reached: 10,000 applications; below each data directory 1,000 directories at most four
/// levels deep with 100,000 names; 32 watched directories; 1 MiB for an entry; 4 MiB for metadata.
///
/// The arguments must outlive the object. Destroy it on the run loop's thread.
[[nodiscard]] std::unique_ptr<InstalledApplications>
makeInstalledApplications(FileSystem& files, std::vector<std::filesystem::path> dataDirectories, RunLoop& runLoop,
                          Executor& executor, Clock& clock);

/// Returns true if the text of a desktop entry describes an application that can be started. Calls `isExecutable` with
/// the program of TryExec, if there is one.
[[nodiscard]] bool isInstalledApplication(std::string_view entry,
                                          const std::function<bool(const std::string&)>& isExecutable);
/// Returns the version of the first release in AppStream metadata; nothing if there is none, or if the XML before it is
/// malformed.
[[nodiscard]] std::optional<std::string> firstReleaseVersion(std::string_view metadata);

} // namespace platform
