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
#include "platform/run/WorkerPool.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

std::unexpected<Error> failure(const fs::path& path)
{
    return std::unexpected(Error::posix(errno, path.string()));
}

/// Repeats a system call that a signal interrupted.
template <class Call> auto retried(Call call)
{
    decltype(call()) result;
    do result = call();
    while (result < 0 && errno == EINTR);
    return result;
}

Date dateOf(const statx_timestamp& time)
{
    return dateFromSystemTime(time.tv_sec, time.tv_nsec);
}

/// Copies the whole of `from`. Returns false and sets errno if that fails; EFBIG if it is more than `maximumSize`
/// bytes.
bool copyAll(int from, int to, std::uint64_t maximumSize)
{
    std::array<char, 64 * 1024> chunk;
    off_t offset = 0;
    bool byKernel = true; // until copy_file_range refuses these files
    while (static_cast<std::uint64_t>(offset) <= maximumSize) {
        ssize_t count = 0;
        if (byKernel) {
            count = retried([&] { return copy_file_range(from, &offset, to, nullptr, 8u << 20, 0); });
            if (count < 0 && errno != ENOSPC && errno != EDQUOT && offset == 0) {
                byKernel = false;
                continue;
            }
        } else {
            count = retried([&] { return pread(from, chunk.data(), chunk.size(), offset); });
            if (count > 0 && !writeAll(to, {chunk.data(), static_cast<std::size_t>(count)})) return false;
            offset += std::max<ssize_t>(count, 0);
        }
        if (count <= 0) return count == 0;
    }
    errno = EFBIG;
    return false;
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
    info.number = status.stx_ino;
    return info;
}

/// Calls fsync. Others run what this thread keeps meanwhile.
int synchronized(int fd)
{
    WorkerPool::shareKeptJobs();
    return fsync(fd);
}

/// Opens a directory for fsync, which makes renames in it durable.
FileHandle openDirectory(const fs::path& directory)
{
    return FileHandle(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

class SystemAppendFile final : public AppendFile {
public:
    /// `file` must be empty and not be written by others.
    explicit SystemAppendFile(FileHandle file) : _file(std::move(file)) {}

    std::uint64_t size() const override { return _size; }

    Result<void> append(std::initializer_list<std::string_view> parts) override
    {
        if (_broken) return std::unexpected(Error::posix(EIO, "ends in a partial record"));
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
    bool _broken = false; // ends in a partial record that could not be truncated
};

class SystemFiles final : public FileSystem {
public:
    Result<Bytes> read(const fs::path& path, std::size_t maximumSize) override
    {
        auto file = openForReading(path);
        if (!file) return std::unexpected(std::move(file.error()));
        auto contents = readFile(*file, maximumSize);
        if (!contents) return std::unexpected(Error::posix(static_cast<int>(contents.error().code), path.string()));
        return contents;
    }

    Result<void> writeAtomically(const fs::path& path, std::string_view contents) override
    {
        return publish(path, [&](int fd) { return writeAll(fd, contents); });
    }

    Result<void> writeUnsynced(const fs::path& path, std::string_view contents) override
    {
        return publish(path, [&](int fd) { return writeAll(fd, contents); }, Sync::No);
    }

    Result<void> replace(const fs::path& path, const fs::path& source) override
    {
        auto file = openForReading(source);
        if (!file) return std::unexpected(std::move(file.error()));
        if (fchmod(file->fd(), 0600) != 0 || synchronized(file->fd()) != 0) return failure(source);
        if (rename(source.c_str(), path.c_str()) == 0) {
            if (const FileHandle directory = openDirectory(path.parent_path())) synchronized(directory.fd());
            return {}; // the source is gone
        }
        if (errno != EXDEV) return failure(path);
        auto published = publish(path, [&](int fd) { return copyAll(file->fd(), fd, UINT64_MAX); });
        if (published) unlink(source.c_str());
        return published;
    }

    Result<void> copy(const fs::path& path, const FileHandle& source, std::uint64_t maximumSize) override
    {
        return publish(path, [&](int fd) { return copyAll(source.fd(), fd, maximumSize); });
    }

    Result<FileHandle> create(const fs::path& path) override
    {
        unlink(path.c_str());
        FileHandle file(
            retried([&] { return open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600); }));
        if (!file) return failure(path);
        return file;
    }

    Result<void> sync(const fs::path& path) override
    {
        const auto file = openForReading(path);
        if (!file) return std::unexpected(file.error());
        const FileHandle directory = openDirectory(path.parent_path());
        if (synchronized(file->fd()) != 0 || !directory || synchronized(directory.fd()) != 0) return failure(path);
        return {};
    }

    Result<void> createDirectories(const fs::path& path) override
    {
        int made = mkdir(path.c_str(), 0700);
        if (made != 0 && errno == ENOENT && path.has_relative_path()) {
            if (auto parent = createDirectories(path.parent_path()); !parent) return parent;
            made = mkdir(path.c_str(), 0700);
        }
        if (made == 0) {
            // Files in it are durable only if it is. A parent of others may not be readable.
            if (const FileHandle parent = openDirectory(path.parent_path())) synchronized(parent.fd());
            return {};
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

    Result<void> removeDirectory(const fs::path& path) override
    {
        std::error_code error;
        fs::remove_all(path, error);
        if (error) return std::unexpected(Error::posix(error.value(), path.string()));
        return {};
    }

    Result<void> syncDirectory(const fs::path& path) override
    {
        const FileHandle directory = openDirectory(path);
        if (!directory || synchronized(directory.fd()) != 0) return failure(path);
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
        // Non-blocking: opening a pipe in the file's place would wait for a writer.
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

    Result<FileHandle> takeDirectory(const fs::path& path) override
    {
        if (auto made = createDirectories(path); !made) return std::unexpected(std::move(made.error()));
        const FileHandle directory(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        struct stat status{};
        if (!directory || fstat(directory.fd(), &status) != 0) return failure(path);
        if (status.st_uid != geteuid()) return std::unexpected(Error::posix(EPERM, path.string()));
        if ((status.st_mode & 0077) != 0 && fchmod(directory.fd(), 0700) != 0) return failure(path);
        return lock(path / "lock");
    }

    Result<Sqlite> openDatabase(const fs::path& path, Sqlite::Access access) override
    {
        return Sqlite::open(path, access);
    }

    Result<FileHandle> createTemporary() override
    {
        FileHandle file(memfd_create("temporary", MFD_CLOEXEC));
        if (!file) return failure("memfd:temporary");
        return file;
    }

private:
    enum class Sync { Yes, No };

    /// Writes a temporary file in the same directory with `fill`, and renames it to `path`.
    template <class Fill> static Result<void> publish(const fs::path& path, Fill fill, Sync sync = Sync::Yes)
    {
        const fs::path temporary = path.string() + "." + Uuid::random().string().substr(0, 8) + ".tmp";
        FileHandle file(retried(
            [&] { return open(temporary.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600); }));
        if (!file) return failure(path);
        const FileHandle directory = sync == Sync::Yes ? openDirectory(path.parent_path()) : FileHandle();
        const auto synced = [sync](const FileHandle& what) { return sync == Sync::No || synchronized(what.fd()) == 0; };
        if (fill(file.fd()) && synced(file) && (directory || sync == Sync::No) &&
            rename(temporary.c_str(), path.c_str()) == 0)
            return synced(directory) ? Result<void>() : failure(path.parent_path());
        auto error = failure(path);
        unlink(temporary.c_str());
        return error;
    }
};

fs::path fromEnvironmentOr(const char* variable, const fs::path& fallback)
{
    const char* value = std::getenv(variable);
    return value && *value == '/' ? fs::path(value) : fallback; // XDG: ignore relative paths
}

/// Returns the absolute paths of a list separated by ":".
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

void makePrivate(const fs::path& directory)
{
    const FileHandle opened(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    struct stat status{};
    if (!opened || fstat(opened.fd(), &status) != 0 || status.st_uid != geteuid()) return;
    if ((status.st_mode & 0077) != 0) fchmod(opened.fd(), 0700);
}

Result<FileInfo> fileInfo(const FileHandle& file)
{
    struct statx status{};
    if (statx(file.fd(), "", AT_EMPTY_PATH, STATX_BASIC_STATS | STATX_BTIME, &status) != 0)
        return std::unexpected(Error::posix(errno));
    return infoOf(status);
}

Result<Bytes> readFile(const FileHandle& file, std::size_t maximumSize)
{
    std::string contents;
    std::array<char, 64 * 1024> chunk;
    while (true) {
        const ssize_t count =
            retried([&] { return pread(file.fd(), chunk.data(), chunk.size(), static_cast<off_t>(contents.size())); });
        if (count < 0) return std::unexpected(Error::posix(errno));
        if (count == 0) return Bytes(std::move(contents));
        contents.append(chunk.data(), static_cast<std::size_t>(count));
        if (contents.size() > maximumSize) return std::unexpected(Error::posix(EFBIG));
    }
}

Result<Bytes> mapFile(const FileHandle& file, std::size_t size)
{
    void* address = mmap(nullptr, size, PROT_READ, MAP_PRIVATE | MAP_POPULATE, file.fd(), 0);
    if (address == MAP_FAILED) return std::unexpected(Error::posix(errno));
    const std::shared_ptr<const void> owner(address, [size](void* mapped) { munmap(mapped, size); });
    return Bytes(owner, {static_cast<const char*>(address), size});
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
