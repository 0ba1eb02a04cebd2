#include "CoreTavrin/Traces.h"

#include <array>
#include <filesystem>
#include <sys/stat.h>
#include <unistd.h>

#include <fmt/format.h>

#include "CoreTavrin/TAVSettings.h"
#include "platform/files/Files.h"
#include "platform/files/UserDefaults.h"

namespace tavrin {

namespace fs = std::filesystem;

namespace {

constexpr const char* kService = "com.quorvane.tavrind";
constexpr const char* kSharedSuite = "com.quorvane.lookup.shared";
/// The temporary files that a killed daemon leaves.
constexpr std::array<std::string_view, 2> kTemporary{"flusher_", "background-transfers-"};

class Removal {
public:
    void remove(const fs::path& path)
    {
        std::error_code error;
        fs::remove_all(path, error);
        if (error) problems.push_back(fmt::format("{}: {}", path.string(), error.message()));
    }
    void removeTemporary(const fs::path& directory)
    {
        std::error_code error;
        for (fs::directory_iterator file(directory, error), end; !error && file != end; file.increment(error)) {
            const std::string name = file->path().filename().string();
            struct stat status{};
            const bool isOurs = lstat(file->path().c_str(), &status) == 0 && status.st_uid == geteuid();
            for (const std::string_view prefix : kTemporary)
                if (isOurs && name.starts_with(prefix)) remove(file->path());
        }
    }
    /// Removes what the daemon wrote from a settings file, and the copy of a damaged one.
    void removeDaemonSettings(const fs::path& path)
    {
        remove(path.string() + ".corrupt");
        std::error_code ignored;
        if (!fs::exists(path, ignored)) return;
        const auto files = platform::makeSystemFiles();
        platform::UserDefaults settings(*files, path, nullptr);
        for (const auto& [key, value] : settings.contents())
            if (const KnownSetting* known = knownSetting(key); known && known->isDaemons) settings.remove(key);
        if (const auto written = settings.synchronize(); !written)
            problems.push_back(fmt::format("{}: {}", path.string(), written.error().reason()));
    }

    std::vector<std::string> problems;
};

} // namespace

std::vector<std::string> removeTraces(const platform::Directories& directories, bool settings)
{
    Removal removal;
    for (const fs::path* parent : {&directories.caches, &directories.state, &directories.data})
        removal.remove(*parent / kService);
    removal.removeTemporary(directories.temporary);
    for (const char* suite : {kService, kSharedSuite}) {
        const fs::path file = directories.config / (std::string(suite) + ".json");
        if (!settings) {
            removal.removeDaemonSettings(file);
            continue;
        }
        for (const char* suffix : {"", ".corrupt", ".lock"}) removal.remove(file.string() + suffix);
    }
    return std::move(removal.problems);
}

} // namespace tavrin
