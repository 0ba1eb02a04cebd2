#pragma once

#include <cstdint>
#include <filesystem>
#include <initializer_list>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Bytes.h"
#include "platform/base/Date.h"
#include "platform/base/FileHandle.h"
#include "platform/files/Sqlite.h"
#include "platform/values/Error.h"

namespace platform {

struct FileInfo {
    enum class Kind { File, Directory, Other };
    Kind kind = Kind::File;
    std::uint64_t size = 0;
    Date modified;
    Date created;             ///< birth time if the file system stores it, else `modified`
    std::uint64_t number = 0; ///< of the inode; changes if the file is replaced
};

/// A file to which whole records are appended. One thread at a time.
class AppendFile {
public:
    virtual ~AppendFile() = default;
    /// Returns the size in bytes.
    [[nodiscard]] virtual std::uint64_t size() const = 0;
    /// Appends the bytes of `parts` (at most four) in one write; doesn't sync. A failure truncates the file to its old
    /// size; if that fails too, every later call fails with EIO.
    [[nodiscard]] virtual Result<void> append(std::initializer_list<std::string_view> parts) = 0;
};

/// The file system operations that the daemon needs. Paths are absolute. A symbolic link in the last component is never
/// followed. Errors have domain "POSIX" and the system's `errno`. Blocking calls; any thread.
///
/// tests/support has an implementation in memory that fails on demand.
class FileSystem {
public:
    virtual ~FileSystem() = default;

    /// Returns the whole file. Fails with EFBIG if it is larger than `maximumSize` bytes.
    [[nodiscard]] virtual Result<Bytes> read(const std::filesystem::path& path, std::size_t maximumSize) = 0;
    /// Replaces a file atomically: writes a temporary in the same directory, syncs it, renames it over `path`, syncs
    /// the directory. Mode 0600. A failure leaves the old file unchanged; if only the sync of the directory fails, the
    /// new file is there, but a power cut may undo the rename.
    [[nodiscard]] virtual Result<void> writeAtomically(const std::filesystem::path& path,
                                                       std::string_view contents) = 0;
    /// Moves the file `source` to `path` atomically: syncs and renames it, or, from another file system, copies it to a
    /// temporary first. Processes that have the old file open keep reading it. Mode 0600. A failure leaves the old file
    /// and `source` unchanged.
    [[nodiscard]] virtual Result<void> replace(const std::filesystem::path& path,
                                               const std::filesystem::path& source) = 0;
    /// Copies the contents of `source` to `path` like `writeAtomically`. Fails with EFBIG if they are more than
    /// `maximumSize` bytes.
    [[nodiscard]] virtual Result<void> copy(const std::filesystem::path& path, const FileHandle& source,
                                            std::uint64_t maximumSize = UINT64_MAX) = 0;
    /// Like `writeAtomically` without syncs: after a power cut the file may be the old one, empty or damaged. For data
    /// that can be fetched again.
    [[nodiscard]] virtual Result<void> writeUnsynced(const std::filesystem::path& path, std::string_view contents) = 0;
    /// Creates an empty file, mode 0600, in place of any existing one, and opens it for reading and writing.
    [[nodiscard]] virtual Result<FileHandle> create(const std::filesystem::path& path) = 0;
    /// Makes the file's contents and name durable: returns after they would survive a power cut.
    [[nodiscard]] virtual Result<void> sync(const std::filesystem::path& path) = 0;
    /// Creates the directory and its missing parents, mode 0700, and makes them durable. Succeeds if it exists.
    [[nodiscard]] virtual Result<void> createDirectories(const std::filesystem::path& path) = 0;
    [[nodiscard]] virtual Result<FileInfo> info(const std::filesystem::path& path) = 0;
    /// Removes a file. Fails with ENOENT if it is missing.
    [[nodiscard]] virtual Result<void> remove(const std::filesystem::path& path) = 0;
    /// Removes a directory and its contents. Succeeds if it is missing.
    [[nodiscard]] virtual Result<void> removeDirectory(const std::filesystem::path& path) = 0;
    /// Makes the creation and removal of a directory's entries durable.
    [[nodiscard]] virtual Result<void> syncDirectory(const std::filesystem::path& path) = 0;
    /// Returns the names in a directory, unordered, without "." and "..".
    [[nodiscard]] virtual Result<std::vector<std::string>> list(const std::filesystem::path& path) = 0;
    /// Opens a regular file. Fails with EISDIR for a directory, EINVAL for a pipe or device.
    [[nodiscard]] virtual Result<FileHandle> openForReading(const std::filesystem::path& path) = 0;
    /// Creates an empty file, mode 0600, and opens it. Fails with EEXIST if it exists.
    [[nodiscard]] virtual Result<std::unique_ptr<AppendFile>> createForAppending(const std::filesystem::path& path) = 0;
    /// Locks a file against other processes until the handle is destroyed; creates the file if it is missing. Never
    /// waits: fails with EWOULDBLOCK if another process holds the lock.
    [[nodiscard]] virtual Result<FileHandle> lock(const std::filesystem::path& path) = 0;
    /// Reserves a directory for this process: creates it if it is missing, sets mode 0700, and locks the file "lock" in
    /// it until the handle is destroyed. Fails with ENOTDIR for a symbolic link, with EPERM if another user owns it,
    /// and with EWOULDBLOCK if another process holds the lock.
    [[nodiscard]] virtual Result<FileHandle> takeDirectory(const std::filesystem::path& path) = 0;
    /// Opens a database like `Sqlite::open`.
    [[nodiscard]] virtual Result<Sqlite> openDatabase(const std::filesystem::path& path, Sqlite::Access access) = 0;
    /// Creates an unnamed file in memory for reading and writing; it is freed with its last handle. (Creating and
    /// removing a file in a directory took 0.25 ms, because of the file system's journal.)
    [[nodiscard]] virtual Result<FileHandle> createTemporary() = 0;
};

/// Returns the real file system.
[[nodiscard]] std::unique_ptr<FileSystem> makeSystemFiles();

/// Sets the mode of a directory to 0700. Does nothing if it is missing, a symbolic link, or owned by another user. Any
/// thread.
void makePrivate(const std::filesystem::path& directory);

// Operations on open files. Any thread.

[[nodiscard]] Result<FileInfo> fileInfo(const FileHandle& file);
/// Returns the whole file; ignores the handle's position. Fails with EFBIG if it is larger than `maximumSize` bytes.
[[nodiscard]] Result<Bytes> readFile(const FileHandle& file, std::size_t maximumSize);
/// Maps the first `size` bytes read-only; the last copy of the bytes unmaps them. Fails with EINVAL if `size` is 0. The
/// file must not be truncated while it is mapped: reading beyond its end raises SIGBUS.
[[nodiscard]] Result<Bytes> mapFile(const FileHandle& file, std::size_t size);

/// The user's directories (XDG Base Directory Specification). May not exist: the code that writes to one creates it.
struct Directories {
    std::filesystem::path caches;                  ///< $XDG_CACHE_HOME, else ~/.cache
    std::filesystem::path config;                  ///< $XDG_CONFIG_HOME, else ~/.config
    std::filesystem::path state;                   ///< $XDG_STATE_HOME, else ~/.local/state
    std::filesystem::path data;                    ///< $XDG_DATA_HOME, else ~/.local/share
    std::filesystem::path runtime;                 ///< $XDG_RUNTIME_DIR, else $TMPDIR/runtime-UID
    std::filesystem::path temporary;               ///< $TMPDIR, else /tmp
    std::vector<std::filesystem::path> systemData; ///< $XDG_DATA_DIRS, else /usr/local/share and /usr/share

    [[nodiscard]] static Directories fromEnvironment();
};

} // namespace platform
