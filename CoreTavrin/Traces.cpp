#include "CoreTavrin/Traces.h"

#include <cerrno>
#include <filesystem>
#include <memory>
#include <sys/stat.h>
#include <unistd.h>

#include <fmt/format.h>

#include "CoreTavrin/TAVSettings.h"
#include "platform/base/Uuid.h"
#include "platform/files/Files.h"
#include "platform/files/UserDefaults.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

namespace tavrin {

namespace fs = std::filesystem;

namespace {

constexpr const char* kService = "com.quorvane.tavrind";
constexpr const char* kSharedSuite = "com.quorvane.lookup.shared";
constexpr std::string_view kTransfersPrefix = "background-transfers-"; // and a UUID: a store that ends with its process
constexpr std::size_t kLargestSettings = 4u << 20;                     // bytes

class Removal {
public:
    void remove(const fs::path& path)
    {
        std::error_code error;
        const bool isLink = fs::is_symlink(path, error);
        const std::uintmax_t removed = fs::remove_all(path, error);
        if (error)
            add(path, error.message());
        else if (removed > 0)
            if (const auto synced = _files->syncDirectory(path.parent_path()); !synced)
                add(path, "may come back after a power cut: " + synced.error().reason());
        if (!error && isLink) add(path, "was a symbolic link; what it points to stays");
    }
    /// Removes the temporary files that a killed daemon left. Other programs use this directory, too.
    void removeTemporary(const fs::path& directory)
    {
        std::error_code error;
        for (fs::directory_iterator file(directory, error), end; !error && file != end; file.increment(error)) {
            const std::string name = file->path().filename().string();
            struct stat status{};
            if (lstat(file->path().c_str(), &status) != 0 || status.st_uid != geteuid()) continue;
            const bool isTransfers =
                name.starts_with(kTransfersPrefix) && platform::Uuid::parse(name.substr(kTransfersPrefix.size()));
            if (S_ISREG(status.st_mode) ? isUploadBody(name) : S_ISDIR(status.st_mode) && isTransfers)
                remove(file->path());
        }
    }
    /// Removes the daemon's own settings from a settings file, and the copy that was kept of a damaged file.
    void removeDaemonSettings(const fs::path& path)
    {
        remove(path.string() + ".corrupt");
        const auto bytes = _files->read(path, kLargestSettings);
        if (!bytes && bytes.error().code == ENOENT) return;
        const auto parsed = bytes ? platform::parseJson(bytes->view()) : std::unexpected(bytes.error());
        if (!parsed || !parsed->asDictionary()) return add(path, parsed ? "not an object" : parsed.error().reason());
        platform::UserDefaults settings(*_files, path, nullptr);
        for (const auto& [key, value] : *parsed->asDictionary())
            if (const KnownSetting* known = knownSetting(key); known && known->isDaemons) settings.remove(key);
        if (const auto written = settings.synchronize(); !written) add(path, written.error().reason());
    }

    std::vector<std::string> problems;

private:
    void add(const fs::path& path, const std::string& problem)
    {
        problems.push_back(fmt::format("{}: {}", path.string(), problem));
    }

    const std::unique_ptr<platform::FileSystem> _files = platform::makeSystemFiles();
};

} // namespace

bool isUploadBody(std::string_view name)
{
    if (!name.starts_with(kUploadBodyPrefix) || name.size() != kUploadBodyPrefix.size() + kUploadBodyDigits)
        return false;
    return name.find_first_not_of("0123456789abcdefABCDEF", kUploadBodyPrefix.size()) == std::string_view::npos;
}

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
