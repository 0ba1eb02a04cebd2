#include "platform/device/InstalledApplications.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <map>
#include <mutex>
#include <unistd.h>

#include <expat.h>

#include "platform/base/Log.h"
#include "platform/files/Files.h"
#include "platform/files/FileWatch.h"
#include "platform/run/Clock.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

constexpr std::size_t kMaximumApplications = 10'000;
constexpr int kMaximumDepth = 4;
/// Folders: each takes one of the inotify instances of which a user has, by default, 128.
constexpr std::size_t kMaximumWatches = 32;
constexpr std::size_t kMaximumEntrySize = 1u << 20;
constexpr std::size_t kMaximumMetadataSize = 4u << 20;
constexpr Duration kSettleTime = std::chrono::seconds(2);
constexpr std::string_view kSuffix = ".desktop";

std::string_view trimmed(std::string_view text)
{
    const std::size_t begin = std::min(text.find_first_not_of(" \t\r"), text.size());
    return text.substr(begin, text.find_last_not_of(" \t\r") + 1 - begin);
}

/// The keys of an entry's main group, as they stand.
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

/// Reads the file that a path leads to, over links.
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
                defaultLog().info("application metadata is not read: {}", metadata.error().description());
            continue;
        }
        if (auto version = firstReleaseVersion(metadata->view())) return *version;
    }
    return "0";
}

/// The desktop entries below one folder, by file ID, and the folders themselves.
struct EntryFolder {
    std::map<std::string, fs::path> entries;
    std::vector<fs::path> folders;

    explicit EntryFolder(const fs::path& root) { walk(root, "", 1); }

private:
    void walk(const fs::path& folder, const std::string& prefix, int depth)
    {
        std::error_code error;
        fs::directory_iterator each(folder, error);
        if (error) return;
        folders.push_back(folder);
        for (; each != fs::directory_iterator(); each.increment(error)) {
            if (error) return;
            const std::string name = each->path().filename();
            std::error_code ignored;
            if (name.ends_with(kSuffix)) {
                if (entries.size() < kMaximumApplications)
                    entries.emplace(prefix + name.substr(0, name.size() - kSuffix.size()), each->path());
            } else if (each->is_directory(ignored) && depth < kMaximumDepth) {
                walk(each->path(), prefix + name + "-", depth + 1);
            }
        }
    }
};

class DesktopEntries final : public InstalledApplications {
public:
    DesktopEntries(FileSystem& files, std::vector<fs::path> dataDirectories, RunLoop& runLoop, Clock& clock)
        : _files(files), _dataDirectories(std::move(dataDirectories)), _runLoop(runLoop), _clock(clock)
    {}
    ~DesktopEntries() override
    {
        if (_settling) _clock.cancel(*_settling);
    }

    std::vector<InstalledApplication> applications() override
    {
        std::map<std::string, std::optional<std::string>> found; // identifier to version; none is not installed
        for (const fs::path& directory : _dataDirectories) {
            for (const auto& [identifier, path] : EntryFolder(directory / "applications").entries) {
                if (found.contains(identifier)) continue;
                const auto entry = readThroughLinks(_files, path, kMaximumEntrySize);
                if (!entry) {
                    defaultLog().info("desktop entry is not read: {}", entry.error().description());
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
        std::lock_guard lock(_mutex);
        _handler = std::move(handler);
        if (std::exchange(_watching, true)) return;
        _runLoop.execute(Priority::Default, [this] {
            afterSettling([this] { watchFolders(); }); // not now, for the start of the process isn't to wait for it
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

    void watchFolders()
    {
        std::map<fs::path, std::unique_ptr<FileWatch>> watches;
        for (const fs::path& directory : _dataDirectories) {
            std::vector<fs::path> folders = EntryFolder(directory / "applications").folders;
            if (folders.empty()) folders.push_back(directory / "applications");
            for (const fs::path& folder : folders) {
                if (watches.size() == kMaximumWatches) {
                    defaultLog().error("of the folders of applications {} are watched", kMaximumWatches);
                    break;
                }
                auto known = _watches.extract(folder);
                watches[folder] = known ? std::move(known.mapped())
                                        : std::make_unique<FileWatch>(_runLoop, folder / "", [this] { changed(); });
            }
        }
        _watches = std::move(watches);
    }

    void changed()
    {
        if (!_settling) afterSettling([this] { settled(); });
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

    void settled()
    {
        watchFolders(); // some may have come
        std::function<void()> handler;
        {
            std::lock_guard lock(_mutex);
            handler = _handler;
        }
        if (handler) handler();
    }

    FileSystem& _files;
    const std::vector<fs::path> _dataDirectories;
    RunLoop& _runLoop;
    Clock& _clock;
    std::mutex _mutex;
    std::function<void()> _handler;                          // under the mutex
    bool _watching = false;                                  // under the mutex
    std::map<fs::path, std::unique_ptr<FileWatch>> _watches; // loop's thread, like the next
    std::optional<Clock::TimerId> _settling;                 // until changes are told, or first looked for
};

/// What the XML parser has met so far.
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

std::unique_ptr<InstalledApplications>
makeInstalledApplications(FileSystem& files, std::vector<fs::path> dataDirectories, RunLoop& runLoop, Clock& clock)
{
    return std::make_unique<DesktopEntries>(files, std::move(dataDirectories), runLoop, clock);
}

} // namespace platform
