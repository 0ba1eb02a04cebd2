#include "platform/device/InstalledApplications.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <map>
#include <set>
#include <sys/stat.h>
#include <unistd.h>

#include <expat.h>

#include "platform/base/Date.h"
#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
#include "platform/files/Files.h"
#include "platform/files/FileWatch.h"
#include "platform/run/Clock.h"
#include "platform/run/RunLoop.h"
#include "platform/text/Text.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

constexpr std::size_t kMaximumApplications = 10'000;
constexpr int kMaximumDepth = 4;
constexpr std::size_t kMaximumFolders = 1'000; // below one data directory, like the next
constexpr std::size_t kMaximumNames = 100'000;
/// Small, because all processes of a user share the limit of inotify watches.
constexpr std::size_t kMaximumWatches = 32;
constexpr std::size_t kMaximumDesktopEntry = 1u << 20;
constexpr std::size_t kMaximumMetadataSize = 4u << 20;
constexpr Duration kSettleTime = std::chrono::seconds(2);
constexpr std::string_view kSuffix = ".desktop";

/// Returns the keys of an entry's main group; values are not unescaped.
std::map<std::string, std::string, std::less<>> mainGroup(std::string_view entry)
{
    std::map<std::string, std::string, std::less<>> keys;
    bool inside = false;
    while (!entry.empty()) {
        std::string_view line = entry.substr(0, entry.find('\n'));
        entry.remove_prefix(std::min(line.size() + 1, entry.size()));
        line = trimmed(line);
        if (line.starts_with('[')) {
            if (inside) break;
            inside = line == "[Desktop Entry]";
            continue;
        }
        const std::size_t equals = line.find('=');
        if (inside && !line.starts_with('#') && equals != std::string_view::npos)
            keys.emplace(trimmed(line.substr(0, equals)), trimmed(line.substr(equals + 1)));
    }
    return keys;
}

bool isExecutable(const std::string& program)
{
    if (program.starts_with('/')) return access(program.c_str(), X_OK) == 0;
    const char* variable = std::getenv("PATH");
    std::string_view path = variable ? variable : "/usr/local/bin:/usr/bin:/bin";
    while (!path.empty()) {
        const std::string_view directory = path.substr(0, path.find(':'));
        path.remove_prefix(std::min(directory.size() + 1, path.size()));
        if (!directory.empty() && access((fs::path(directory) / program).c_str(), X_OK) == 0) return true;
    }
    return false;
}

/// Reads a file; follows symbolic links.
Result<Bytes> readThroughLinks(FileSystem& files, const fs::path& path, std::size_t limit)
{
    std::error_code error;
    const fs::path target = fs::canonical(path, error);
    if (error) return std::unexpected(Error::posix(error.value(), path.string()));
    return files.read(target, limit);
}

std::string versionOf(FileSystem& files, const fs::path& dataDirectory, const std::string& identifier)
{
    for (const char* place : {"metainfo/{}.metainfo.xml", "metainfo/{}.appdata.xml", "appdata/{}.appdata.xml"}) {
        const fs::path path = dataDirectory / fmt::format(fmt::runtime(place), identifier);
        const auto metadata = readThroughLinks(files, path, kMaximumMetadataSize);
        if (!metadata) {
            if (metadata.error().code != ENOENT)
                defaultLog().info("application metadata can't be read: {}", metadata.error().description());
            continue;
        }
        if (auto version = firstReleaseVersion(metadata->view())) return *version;
    }
    return "0";
}

/// Changes when entries are added to or removed from a directory. The time alone is too coarse.
struct FolderState {
    std::int64_t changed = 0; ///< ctime, nanoseconds since 1970; 0 if the directory is missing
    std::size_t names = 0;
    bool operator==(const FolderState&) const = default;
};
using FolderStates = std::map<fs::path, FolderState>;

/// The desktop entries below one directory by file ID, and the directories that were scanned.
///
/// Follows symbolic links to directories, but scans each directory once, however many paths lead to it.
struct EntryFolder {
    std::map<std::string, fs::path> entries;
    FolderStates folders;

    explicit EntryFolder(const fs::path& root)
    {
        walk(root, "", 1);
        if (folders.size() == kMaximumFolders || _names >= kMaximumNames)
            defaultLog().error("{} is scanned only in part: {} directories, {} names", root.string(), folders.size(),
                               _names);
        folders.try_emplace(root); // a missing one may be created later
    }

private:
    void walk(const fs::path& folder, const std::string& prefix, int depth)
    {
        struct stat status{};
        if (stat(folder.c_str(), &status) != 0 || folders.size() == kMaximumFolders) return;
        if (!_seen.emplace(status.st_dev, status.st_ino).second) return;
        std::error_code error;
        fs::directory_iterator each(folder, error);
        if (error) return;
        FolderState& state = folders[folder];
        state.changed = dateFromSystemTime(status.st_ctim.tv_sec, status.st_ctim.tv_nsec).time_since_epoch().count();
        // Directories before links to directories: the result doesn't depend on the order of the listing.
        std::set<std::pair<bool, std::string>> inner;
        for (; each != fs::directory_iterator() && _names < kMaximumNames; each.increment(error), ++_names) {
            if (error) break;
            ++state.names;
            const std::string name = each->path().filename();
            std::error_code ignored;
            if (name.ends_with(kSuffix)) {
                if (entries.size() < kMaximumApplications)
                    entries.emplace(prefix + name.substr(0, name.size() - kSuffix.size()), each->path());
            } else if (depth < kMaximumDepth && each->is_directory(ignored)) {
                inner.emplace(each->is_symlink(ignored), name);
            }
        }
        for (const auto& [isLink, name] : inner) walk(folder / name, prefix + name + "-", depth + 1);
    }

    std::set<std::pair<dev_t, ino_t>> _seen;
    std::size_t _names = 0;
};

class DesktopEntries final : public InstalledApplications {
public:
    DesktopEntries(FileSystem& files, std::vector<fs::path> dataDirectories, RunLoop& runLoop, Executor& executor,
                   Clock& clock)
        : _files(files), _dataDirectories(std::move(dataDirectories)), _runLoop(runLoop), _executor(executor),
          _clock(clock)
    {}
    ~DesktopEntries() override
    {
        if (_settling) _clock.cancel(*_settling);
    }

    std::vector<InstalledApplication> applications() override
    {
        std::map<std::string, std::optional<std::string>> found; // identifier to version; no version: not installed
        for (const fs::path& directory : _dataDirectories) {
            for (const auto& [identifier, path] : EntryFolder(directory / "applications").entries) {
                if (found.contains(identifier)) continue;
                const auto entry = readThroughLinks(_files, path, kMaximumDesktopEntry);
                if (!entry) {
                    defaultLog().info("a desktop entry can't be read: {}", entry.error().description());
                    continue;
                }
                if (found.size() == kMaximumApplications) {
                    defaultLog().error("more than {} applications are installed", kMaximumApplications);
                    return installed(found);
                }
                const bool starts = isInstalledApplication(entry->view(), isExecutable);
                found[identifier] = starts ? std::optional(versionOf(_files, directory, identifier)) : std::nullopt;
            }
        }
        return installed(found);
    }

    void onChange(std::function<void()> handler) override
    {
        MutexLock lock(_mutex);
        _handler = std::move(handler);
        if (std::exchange(_watching, true)) return;
        _runLoop.execute(Priority::Default, [this] {
            look(false);
            afterSettling([this] { look(false); }); // creates the watches, after the start of the process
        });
    }

private:
    static std::vector<InstalledApplication> installed(const std::map<std::string, std::optional<std::string>>& found)
    {
        std::vector<InstalledApplication> result;
        for (const auto& [identifier, version] : found)
            if (version) result.push_back({identifier, *version});
        return result;
    }

    /// Makes a worker scan all directories. Afterwards calls the handler if `tell` is set or a directory has changed.
    void look(bool tell)
    {
        _tell = _tell || tell;
        if (std::exchange(_looking, true)) {
            _lookAgain = true;
            return;
        }
        _executor.execute(Priority::Background,
                          [alive = std::weak_ptr(_alive), this, &runLoop = _runLoop, directories = _dataDirectories] {
                              FolderStates folders;
                              for (const fs::path& directory : directories)
                                  folders.merge(EntryFolder(directory / "applications").folders);
                              runLoop.execute(Priority::Default, [alive, this, folders = std::move(folders)]() mutable {
                                  if (!alive.expired())
                                      looked(std::move(folders)); // `this` is destroyed on the same thread
                              });
                          });
    }

    void looked(FolderStates folders)
    {
        _looking = false;
        const bool first = !_folders;
        const bool same = first || *_folders == folders;
        _folders = std::move(folders);
        const bool tell = std::exchange(_tell, false) || !same;
        // Another scan finds changes between this one and its watches.
        if ((!first && watchFolders()) || std::exchange(_lookAgain, false)) look(false);
        if (!tell) return;
        std::function<void()> handler;
        {
            MutexLock lock(_mutex);
            handler = _handler;
        }
        if (handler) handler();
    }

    /// Watches the known directories; returns true if a watch is new.
    bool watchFolders()
    {
        bool isNew = false;
        std::map<fs::path, std::unique_ptr<FileWatch>> watches;
        for (const auto& [folder, state] : *_folders) {
            if (watches.size() == kMaximumWatches) {
                defaultLog().error("{} of {} directories of applications are watched", kMaximumWatches,
                                   _folders->size());
                break;
            }
            auto known = _watches.extract(folder);
            isNew = isNew || !known;
            watches[folder] = known ? std::move(known.mapped())
                                    : std::make_unique<FileWatch>(_runLoop, folder / "", [this] { changed(); });
        }
        _watches = std::move(watches);
        return isNew;
    }

    void changed()
    {
        if (!_settling) afterSettling([this] { look(true); });
    }

    template <class Job> void afterSettling(Job job)
    {
        _settling = _clock.after(kSettleTime, [this, job] {
            _runLoop.execute(Priority::Default, [this, job] {
                _settling.reset();
                job();
            });
        });
    }

    FileSystem& _files;
    const std::vector<fs::path> _dataDirectories;
    RunLoop& _runLoop;
    Executor& _executor;
    Clock& _clock;
    Mutex _mutex;
    std::function<void()> _handler GUARDED_BY(_mutex);
    bool _watching GUARDED_BY(_mutex) = false;

    // Run loop's thread
    std::map<fs::path, std::unique_ptr<FileWatch>> _watches;
    std::optional<Clock::TimerId> _settling; // set until the next scan
    std::optional<FolderStates> _folders;    // of the last scan
    bool _looking = false;
    bool _lookAgain = false;
    bool _tell = false;
    const std::shared_ptr<void> _alive = std::make_shared<int>();
};

/// The state of the XML parser's handler.
struct MetadataReader {
    XML_Parser parser;
    std::optional<std::string> version;

    static void begin(void* reader, const XML_Char* name, const XML_Char** attributes)
    {
        auto& self = *static_cast<MetadataReader*>(reader);
        if (std::string_view(name) != "release") return;
        for (; *attributes; attributes += 2)
            if (std::string_view(attributes[0]) == "version" && attributes[1][0] != '\0') self.version = attributes[1];
        if (self.version) XML_StopParser(self.parser, XML_FALSE);
    }
};

} // namespace

bool isInstalledApplication(std::string_view entry, const std::function<bool(const std::string&)>& isExecutable)
{
    const auto keys = mainGroup(entry);
    const auto value = [&](std::string_view key) {
        const auto found = keys.find(key);
        return found == keys.end() ? std::string() : found->second;
    };
    if (value("Type") != "Application" || value("Hidden") == "true") return false;
    const std::string program = value("TryExec");
    return program.empty() || isExecutable(program);
}

std::optional<std::string> firstReleaseVersion(std::string_view metadata)
{
    const std::unique_ptr<XML_ParserStruct, void (*)(XML_Parser)> parser(XML_ParserCreate(nullptr), XML_ParserFree);
    if (!parser || metadata.size() > kMaximumMetadataSize) return std::nullopt;
    MetadataReader reader{parser.get(), std::nullopt};
    XML_SetUserData(parser.get(), &reader);
    XML_SetStartElementHandler(parser.get(), &MetadataReader::begin);
    XML_Parse(parser.get(), metadata.data(), static_cast<int>(metadata.size()), XML_TRUE);
    return reader.version;
}

std::unique_ptr<InstalledApplications> makeInstalledApplications(FileSystem& files,
                                                                 std::vector<fs::path> dataDirectories,
                                                                 RunLoop& runLoop, Executor& executor, Clock& clock)
{
    return std::make_unique<DesktopEntries>(files, std::move(dataDirectories), runLoop, executor, clock);
}

} // namespace platform
