#pragma once

#include <functional>
#include <map>
#include <optional>
#include <set>

#include "platform/files/Files.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform::test {

/// Files in memory, for one thread. An operation fails when the test says so. A database is a real one, in a directory
/// in /dev/shm; here it is an empty file, and one that a test made has its contents.
class MemoryFiles final : public FileSystem {
public:
    /// Asked before every operation ("read", "write", "replace", "mkdir", "info", "remove", "list", "create", "append",
    /// "lock", "temporary", "unsynced", "make", "sync", "syncdir", "take", "database") with its path; a number other
    /// than 0 is the errno that it fails with.
    std::function<int(std::string_view operation, const std::filesystem::path& path)> fault;

    std::map<std::filesystem::path, std::string> files;
    std::map<std::filesystem::path, Date> created; ///< where a test cares; else 2026-01-01, when the test's clock began
    std::set<std::filesystem::path> directories;

    Result<Bytes> read(const std::filesystem::path& path, std::size_t maximumSize) override;
    Result<void> writeAtomically(const std::filesystem::path& path, std::string_view contents) override;
    Result<void> replace(const std::filesystem::path& path, const std::filesystem::path& source) override;
    Result<void> copy(const std::filesystem::path& path, const FileHandle& source, std::uint64_t maximumSize) override;
    Result<void> writeUnsynced(const std::filesystem::path& path, std::string_view contents) override;
    Result<FileHandle> create(const std::filesystem::path& path) override;
    Result<void> sync(const std::filesystem::path& path) override;
    Result<void> createDirectories(const std::filesystem::path& path) override;
    Result<FileInfo> info(const std::filesystem::path& path) override;
    Result<void> remove(const std::filesystem::path& path) override;
    Result<void> removeDirectory(const std::filesystem::path& path) override;
    Result<void> syncDirectory(const std::filesystem::path& path) override;
    Result<std::vector<std::string>> list(const std::filesystem::path& path) override;
    Result<FileHandle> openForReading(const std::filesystem::path& path) override;
    Result<std::unique_ptr<AppendFile>> createForAppending(const std::filesystem::path& path) override;
    Result<FileHandle> lock(const std::filesystem::path& path) override;
    Result<FileHandle> takeDirectory(const std::filesystem::path& path) override;
    Result<Sqlite> openDatabase(const std::filesystem::path& path, Sqlite::Access access) override;
    Result<FileHandle> createTemporary() override;

private:
    class Appending;
    [[nodiscard]] int faultOf(std::string_view operation, const std::filesystem::path& path) const;
    [[nodiscard]] Result<void> write(std::string_view operation, const std::filesystem::path& path,
                                     std::string_view contents);
    void takeIn(const std::filesystem::path& path);

    std::map<std::filesystem::path, FileHandle> _written; ///< of `create`: whoever has the handle may still write
    std::optional<TemporaryDirectory> _databases;
};

} // namespace platform::test
