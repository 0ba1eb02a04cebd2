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
    /// Reads the applications, ordered by identifier. Takes time: not on the run loop's thread.
    [[nodiscard]] virtual std::vector<InstalledApplication> applications() = 0;
    /// Calls `handler` on the run loop's thread after applications came or went: once for all changes within two
    /// seconds, as a package manager makes them. One handler; a new one replaces it.
    virtual void onChange(std::function<void()> handler) = 0;
};

/// Reads the entries of type Application in the folders "applications" of `dataDirectories`; of several entries with
/// one file ID the first directory's counts. Hidden entries don't count, nor do those that name a missing program to
/// try. The version is that of the first release in the metadata, "metainfo/IDENTIFIER.metainfo.xml" or ".appdata.xml".
///
/// The first `onChange` has `executor` look through the folders; watches follow two seconds later, and report what
/// changed in between. Links are followed, since some package formats install links, but every folder is looked through
/// once. Limits, logged if met: 10,000 applications; below each data directory 1,000 folders, four deep, with 100,000
/// names; 32 folders watched; 1 MiB an entry; 4 MiB of metadata.
///
/// Everything passed in must outlive the object. Destroyed on the run loop's thread.
[[nodiscard]] std::unique_ptr<InstalledApplications>
makeInstalledApplications(FileSystem& files, std::vector<std::filesystem::path> dataDirectories, RunLoop& runLoop,
                          Executor& executor, Clock& clock);

/// Returns true if the text of a desktop entry is that of an application that can be started. `isExecutable` is asked
/// about the program that the entry says to try.
[[nodiscard]] bool isInstalledApplication(std::string_view entry,
                                          const std::function<bool(const std::string&)>& isExecutable);
/// Returns the version of the first release in AppStream metadata; nothing if there is none or the XML is broken before
/// it.
[[nodiscard]] std::optional<std::string> firstReleaseVersion(std::string_view metadata);

} // namespace platform
