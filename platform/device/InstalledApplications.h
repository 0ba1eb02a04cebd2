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
class FileSystem;
class RunLoop;

struct InstalledApplication {
    std::string identifier; ///< the desktop file ID, without ".desktop": "org.gnome.Terminal"
    std::string version;    ///< of its AppStream metadata, else "0"
    bool operator==(const InstalledApplication&) const = default;
};

/// The applications that the user can start. Any thread.
class InstalledApplications {
public:
    virtual ~InstalledApplications() = default;
    /// Reads them anew, ordered by identifier.
    [[nodiscard]] virtual std::vector<InstalledApplication> applications() = 0;
    /// Called on the run loop's thread some time after applications came or went: once for all that changes within
    /// two seconds, as a package manager does it. One handler.
    virtual void onChange(std::function<void()> handler) = 0;
};

/// The entries of type Application in the folders "applications" of `dataDirectories`, the first directory of that
/// file ID wins. Not among them: what is hidden, and what names a program to try that isn't there. The version is that
/// of the first release in the metadata beside them, "metainfo/IDENTIFIER.metainfo.xml" or ".appdata.xml".
///
/// Nothing is read before it is asked for; changes are watched from two seconds behind the first `onChange` on. Links
/// are followed: the directories are the system's, and some package formats install links. Limits, logged when they are
/// met: 10,000 applications, folders four deep and 32 of them watched, 1 MiB an entry, 4 MiB of metadata.
[[nodiscard]] std::unique_ptr<InstalledApplications>
makeInstalledApplications(FileSystem& files, std::vector<std::filesystem::path> dataDirectories, RunLoop& runLoop,
                          Clock& clock);

/// Whether the text of a desktop entry is an application's that can be started. `isExecutable` is asked about the
/// program that the entry says to try.
[[nodiscard]] bool isInstalledApplication(std::string_view entry,
                                          const std::function<bool(const std::string&)>& isExecutable);
/// The version of the first release in AppStream metadata; none where there is none, or the XML is broken before it.
[[nodiscard]] std::optional<std::string> firstReleaseVersion(std::string_view metadata);

} // namespace platform
