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
    Date created;             ///< birth time if the file system has one, else `modified`
    std::uint64_t number = 0; ///< the inode's: another file in the same place has another
};

/// A file that grows: whole records are added at its end. One thread at a time.
class AppendFile {
public:
    virtual ~AppendFile() = default;
    /// Bytes in the file.
    [[nodiscard]] virtual std::uint64_t size() const = 0;
    /// Adds the bytes of `parts` (four at most) at the end, in one write. After a failure the file is as long as
    /// before: what was written of a record is cut off, and if that fails too every later call fails with EIO. Not
    /// synced.
    [[nodiscard]] virtual Result<void> append(std::initializer_list<std::string_view> parts) = 0;
};

/// The file system, as far as the device's services need it. Paths are absolute. The last component of a path is
/// never followed when it is a link. Failures have the system's error number, in the domain "POSIX". Any thread.
///
/// A twin in tests/support keeps files in memory and fails on demand.
class FileSystem {
public:
    virtual ~FileSystem() = default;

    /// Returns the whole file. Fails with EFBIG if it is larger than `maximumSize` bytes.
    [[nodiscard]] virtual Result<Bytes> read(const std::filesystem::path& path, std::size_t maximumSize) = 0;
    /// Publishes a file whole: writes a temporary beside it, syncs, renames it over `path`, syncs the directory.
    /// A failure leaves the old file as it was, or, if only the directory couldn't be synced, the new one, which a
    /// power cut may undo. Mode 0600.
    [[nodiscard]] virtual Result<void> writeAtomically(const std::filesystem::path& path,
                                                       std::string_view contents) = 0;
    /// Publishes the file `source` as `path`, in one step: syncs and renames it, or, from another file system, copies
    /// it beside `path` first. Whoever has the old file open keeps reading that. A failure leaves the old file and
    /// `source` as they were. Mode 0600.
    [[nodiscard]] virtual Result<void> replace(const std::filesystem::path& path,
                                               const std::filesystem::path& source) = 0;
    /// Publishes a copy of what `source` holds as `path`, whole, like `writeAtomically`. Fails with EFBIG if that is
    /// more than `maximumSize` bytes.
    [[nodiscard]] virtual Result<void> copy(const std::filesystem::path& path, const FileHandle& source,
                                            std::uint64_t maximumSize = UINT64_MAX) = 0;
    /// Like `writeAtomically`, but without syncing: after a power cut the file may be the old one, empty or damaged.
    /// For what can be had again.
    [[nodiscard]] virtual Result<void> writeUnsynced(const std::filesystem::path& path, std::string_view contents) = 0;
    /// Makes an empty file, mode 0600, in place of any that is there, and opens it for reading and writing.
    [[nodiscard]] virtual Result<FileHandle> create(const std::filesystem::path& path) = 0;
    /// Returns once the file's contents and its name outlive a power cut.
    [[nodiscard]] virtual Result<void> sync(const std::filesystem::path& path) = 0;
    /// Makes the directory and its missing parents, with mode 0700. Does nothing if it is there already.
    [[nodiscard]] virtual Result<void> createDirectories(const std::filesystem::path& path) = 0;
    [[nodiscard]] virtual Result<FileInfo> info(const std::filesystem::path& path) = 0;
    /// Removes a file. Fails with ENOENT if it isn't there.
    [[nodiscard]] virtual Result<void> remove(const std::filesystem::path& path) = 0;
    /// Removes a directory with everything in it. One that isn't there is fine.
    [[nodiscard]] virtual Result<void> removeDirectory(const std::filesystem::path& path) = 0;
    /// Makes what was created in a directory, and removed from it, last over a power cut.
    [[nodiscard]] virtual Result<void> syncDirectory(const std::filesystem::path& path) = 0;
    /// The names in a directory, in no order, without "." and "..".
    [[nodiscard]] virtual Result<std::vector<std::string>> list(const std::filesystem::path& path) = 0;
    [[nodiscard]] virtual Result<FileHandle> openForReading(const std::filesystem::path& path) = 0;
    /// Makes an empty file, mode 0600, and opens it. Fails with EEXIST if it is there already.
    [[nodiscard]] virtual Result<std::unique_ptr<AppendFile>> createForAppending(const std::filesystem::path& path) = 0;
    /// Locks a file against other processes for as long as the handle lives; makes the file if it is missing. Never
    /// waits: fails with EWOULDBLOCK while another process has the lock.
    [[nodiscard]] virtual Result<FileHandle> lock(const std::filesystem::path& path) = 0;
    /// Takes a directory for this process: makes it if it is missing, sets its mode to 0700, and locks the file "lock"
    /// in it for as long as the handle lives. Fails for a link (ENOTDIR), for another user's (EPERM), and while another
    /// process has it (EWOULDBLOCK).
    [[nodiscard]] virtual Result<FileHandle> takeDirectory(const std::filesystem::path& path) = 0;
    /// Opens a database as `Sqlite::open` does.
    [[nodiscard]] virtual Result<Sqlite> openDatabase(const std::filesystem::path& path, Sqlite::Access access) = 0;
    /// Makes an empty file in memory, without a name, for reading and writing; it is freed with its last handle.
    /// (Making and removing one in a directory was measured at a quarter of a millisecond, for the file system's
    /// journal.)
    [[nodiscard]] virtual Result<FileHandle> createTemporary() = 0;
};

[[nodiscard]] std::unique_ptr<FileSystem> makeSystemFiles();

/// Takes access to a directory of this user's from everybody else: mode 0700. Does nothing if it isn't there, or is a
/// link or another user's. Any thread.
void makePrivate(const std::filesystem::path& directory);

// Of open files. Any thread.

[[nodiscard]] Result<FileInfo> fileInfo(const FileHandle& file);
/// The whole file, whatever the handle's position. Fails with EFBIG if it is larger than `maximumSize` bytes.
[[nodiscard]] Result<Bytes> readFile(const FileHandle& file, std::size_t maximumSize);
/// Maps the first `size` bytes, read-only; the last copy of the bytes unmaps them. `size` must not be 0 (EINVAL). Only
/// for a file that nobody shortens while it is in use: reading beyond its end kills the process.
[[nodiscard]] Result<Bytes> mapFile(const FileHandle& file, std::size_t size);

/// The user's directories. Whoever writes to one makes it; start-up makes none.
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
