#include "platform/files/Files.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <dirent.h>
#include <fcntl.h>
#include <pwd.h>
#include <span>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/uio.h>
#include <unistd.h>

#include <fmt/format.h>

#include "platform/base/Uuid.h"
#include "platform/base/WriteAll.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

std::unexpected<Error> failure(const fs::path& path)
{
    return std::unexpected(Error::posix(errno, path.string()));
}

/// EINTR is no failure.
template <class Call> auto retried(Call call)
{
    decltype(call()) result;
    do result = call();
    while (result < 0 && errno == EINTR);
    return result;
}

Date dateOf(const statx_timestamp& time)
{
    return Date(std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec));
}

bool copyAll(int from, int to)
{
    std::array<char, 64 * 1024> chunk;
    while (true) {
        const ssize_t count = retried([&] { return read(from, chunk.data(), chunk.size()); });
        if (count <= 0) return count == 0;
        if (!writeAll(to, {chunk.data(), static_cast<std::size_t>(count)})) return false;
    }
}

FileInfo infoOf(const struct statx& status)
{
    FileInfo info;
    info.kind = S_ISREG(status.stx_mode)   ? FileInfo::Kind::File
                : S_ISDIR(status.stx_mode) ? FileInfo::Kind::Directory
                                           : FileInfo::Kind::Other;
    info.size = status.stx_size;
    info.modified = dateOf(status.stx_mtime);
    info.created = status.stx_mask & STATX_BTIME ? dateOf(status.stx_btime) : info.modified;
    return info;
}

/// Synced, it keeps what was renamed in it over a power cut.
FileHandle openDirectory(const fs::path& directory)
{
    return FileHandle(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

class SystemAppendFile final : public AppendFile {
public:
    /// `file` is new, and nobody else's.
    explicit SystemAppendFile(FileHandle file) : _file(std::move(file)) {}

    std::uint64_t size() const override { return _size; }

    Result<void> append(std::initializer_list<std::string_view> parts) override
    {
        if (_broken) return std::unexpected(Error::posix(EIO, "ends in a half-written record"));
        std::array<iovec, kMaximumParts> rest;
        std::size_t count = 0;
        std::uint64_t total = 0;
        for (const std::string_view part : parts) {
            rest.at(count++) = {const_cast<char*>(part.data()), part.size()};
            total += part.size();
        }
        for (std::span<iovec> left(rest.data(), count); !left.empty();) {
            const ssize_t written =
                retried([&] { return writev(_file.fd(), left.data(), static_cast<int>(left.size())); });
            if (written < 0) {
                const int error = errno;
                if (ftruncate(_file.fd(), static_cast<off_t>(_size)) != 0) _broken = true;
                return std::unexpected(Error::posix(error));
            }
            auto done = static_cast<std::size_t>(written);
            while (!left.empty() && done >= left.front().iov_len) {
                done -= left.front().iov_len;
                left = left.subspan(1);
            }
            if (done > 0)
                left.front() = {static_cast<char*>(left.front().iov_base) + done, left.front().iov_len - done};
        }
        _size += total;
        return {};
    }

private:
    static constexpr std::size_t kMaximumParts = 4;
    FileHandle _file;
    std::uint64_t _size = 0;
    bool _broken = false; // ends in a half-written record that could not be cut off
};

class SystemFiles final : public FileSystem {
public:
    Result<Bytes> read(const fs::path& path, std::size_t maximumSize) override
    {
        auto file = openForReading(path);
        if (!file) return std::unexpected(std::move(file.error()));
        std::string contents;
        std::array<char, 64 * 1024> chunk;
        while (true) {
            const ssize_t count = retried([&] { return ::read(file->fd(), chunk.data(), chunk.size()); });
            if (count < 0) return failure(path);
            if (count == 0) return Bytes(std::move(contents));
            contents.append(chunk.data(), static_cast<std::size_t>(count));
            if (contents.size() > maximumSize) return std::unexpected(Error::posix(EFBIG, path.string()));
        }
    }

    Result<void> writeAtomically(const fs::path& path, std::string_view contents) override
    {
        return publish(path, [&](int fd) { return writeAll(fd, contents); });
    }

    Result<void> replace(const fs::path& path, const fs::path& source) override
    {
        auto file = openForReading(source);
        if (!file) return std::unexpected(std::move(file.error()));
        if (fchmod(file->fd(), 0600) != 0 || fsync(file->fd()) != 0) return failure(source);
        if (rename(source.c_str(), path.c_str()) == 0) {
            if (const FileHandle directory = openDirectory(path.parent_path())) fsync(directory.fd());
            return {}; // the source is gone
        }
        if (errno != EXDEV) return failure(path);
        auto published = publish(path, [&](int fd) { return copyAll(file->fd(), fd); });
        if (published) unlink(source.c_str());
        return published;
    }

    Result<void> copy(const fs::path& path, const FileHandle& source) override
    {
        if (lseek(source.fd(), 0, SEEK_SET) != 0) return std::unexpected(Error::posix(errno));
        return publish(path, [&](int fd) { return copyAll(source.fd(), fd); });
    }

    Result<void> createDirectories(const fs::path& path) override
    {
        if (mkdir(path.c_str(), 0700) == 0) return {};
        if (errno == ENOENT && path.has_relative_path()) {
            if (auto parent = createDirectories(path.parent_path()); !parent) return parent;
            if (mkdir(path.c_str(), 0700) == 0) return {};
        }
        if (errno != EEXIST) return failure(path);
        struct stat status{};
        if (stat(path.c_str(), &status) != 0) return failure(path);
        if (!S_ISDIR(status.st_mode)) return std::unexpected(Error::posix(ENOTDIR, path.string()));
        return {};
    }

    Result<FileInfo> info(const fs::path& path) override
    {
        struct statx status{};
        if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS | STATX_BTIME, &status) != 0)
            return failure(path);
        return infoOf(status);
    }

    Result<void> remove(const fs::path& path) override
    {
        if (unlink(path.c_str()) != 0) return failure(path);
        return {};
    }

    Result<std::vector<std::string>> list(const fs::path& path) override
    {
        const std::unique_ptr<DIR, int (*)(DIR*)> directory(opendir(path.c_str()), closedir);
        if (!directory) return failure(path);
        std::vector<std::string> names;
        while (const dirent* entry = readdir(directory.get())) {
            const std::string_view name = entry->d_name;
            if (name != "." && name != "..") names.emplace_back(name);
        }
        return names;
    }

    Result<FileHandle> openForReading(const fs::path& path) override
    {
        // Non-blocking, or a pipe in the file's place would hold us until someone writes.
        FileHandle file(retried([&] { return open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC); }));
        struct stat status{};
        if (!file || fstat(file.fd(), &status) != 0) return failure(path);
        if (!S_ISREG(status.st_mode))
            return std::unexpected(Error::posix(S_ISDIR(status.st_mode) ? EISDIR : EINVAL, path.string()));
        return file;
    }

    Result<std::unique_ptr<AppendFile>> createForAppending(const fs::path& path) override
    {
        FileHandle file(retried(
            [&] { return open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_APPEND | O_NOFOLLOW | O_CLOEXEC, 0600); }));
        if (!file) return failure(path);
        return std::make_unique<SystemAppendFile>(std::move(file));
    }

    Result<FileHandle> lock(const fs::path& path) override
    {
        FileHandle file(retried([&] { return open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600); }));
        if (!file || flock(file.fd(), LOCK_EX | LOCK_NB) != 0) return failure(path);
        return file;
    }
    Result<FileHandle> createTemporary() override
    {
        FileHandle file(memfd_create("temporary", MFD_CLOEXEC));
        if (!file) return failure("memfd:temporary");
        return file;
    }

private:
    /// Writes a temporary file beside `path` with `fill`, and makes it `path`.
    template <class Fill> static Result<void> publish(const fs::path& path, Fill fill)
    {
        const fs::path temporary = path.string() + "." + Uuid::random().string().substr(0, 8) + ".tmp";
        FileHandle file(retried(
            [&] { return open(temporary.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600); }));
        if (!file) return failure(path);
        const FileHandle directory = openDirectory(path.parent_path());
        if (directory && fill(file.fd()) && fsync(file.fd()) == 0 && rename(temporary.c_str(), path.c_str()) == 0)
            return fsync(directory.fd()) == 0 ? Result<void>() : failure(path.parent_path());
        auto error = failure(path);
        unlink(temporary.c_str());
        return error;
    }
};

fs::path fromEnvironmentOr(const char* variable, const fs::path& fallback)
{
    const char* value = std::getenv(variable);
    return value && *value == '/' ? fs::path(value) : fallback; // relative paths are to be ignored
}

/// The absolute paths of a list with ":" between them.
std::vector<fs::path> pathsIn(std::string_view list)
{
    std::vector<fs::path> paths;
    while (!list.empty()) {
        const std::string_view path = list.substr(0, list.find(':'));
        list.remove_prefix(std::min(path.size() + 1, list.size()));
        if (path.starts_with('/')) paths.emplace_back(path);
    }
    return paths;
}

fs::path home()
{
    if (const char* value = std::getenv("HOME"); value && *value == '/') return value;
    const passwd* entry = getpwuid(getuid());
    return entry && entry->pw_dir ? entry->pw_dir : "/";
}

} // namespace

Result<LockedDirectory> LockedDirectory::open(const fs::path& path)
{
    const auto failure = [](const fs::path& what) { return std::unexpected(Error::posix(errno, what.string())); };
    LockedDirectory opened{FileHandle(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC)), {}};
    struct stat status{};
    if (!opened.directory || fstat(opened.directory.fd(), &status) != 0) return failure(path);
    if (status.st_uid != geteuid()) return std::unexpected(Error::posix(EPERM, path.string()));
    if ((status.st_mode & 0077) != 0 && fchmod(opened.directory.fd(), 0700) != 0) return failure(path);
    constexpr const char* kLock = "lock";
    opened.lock =
        FileHandle(openat(opened.directory.fd(), kLock, O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0600));
    if (!opened.lock || flock(opened.lock.fd(), LOCK_EX | LOCK_NB) != 0) return failure(path / kLock);
    return opened;
}

Result<FileInfo> fileInfo(const FileHandle& file)
{
    struct statx status{};
    if (statx(file.fd(), "", AT_EMPTY_PATH, STATX_BASIC_STATS | STATX_BTIME, &status) != 0)
        return std::unexpected(Error::posix(errno));
    return infoOf(status);
}

std::unique_ptr<FileSystem> makeSystemFiles()
{
    return std::make_unique<SystemFiles>();
}

Directories Directories::fromEnvironment()
{
    Directories directories;
    directories.caches = fromEnvironmentOr("XDG_CACHE_HOME", home() / ".cache");
    directories.config = fromEnvironmentOr("XDG_CONFIG_HOME", home() / ".config");
    directories.state = fromEnvironmentOr("XDG_STATE_HOME", home() / ".local/state");
    directories.data = fromEnvironmentOr("XDG_DATA_HOME", home() / ".local/share");
    directories.temporary = fromEnvironmentOr("TMPDIR", "/tmp");
    const char* systemData = std::getenv("XDG_DATA_DIRS");
    directories.systemData = pathsIn(systemData && *systemData ? systemData : "/usr/local/share:/usr/share");
    directories.runtime =
        fromEnvironmentOr("XDG_RUNTIME_DIR", directories.temporary / fmt::format("runtime-{}", getuid()));
    return directories;
}

} // namespace platform
