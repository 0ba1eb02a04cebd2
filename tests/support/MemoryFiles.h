#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <set>

#include "platform/files/Files.h"

namespace platform::test {

/// Files in memory. An operation fails when the test says so.
class MemoryFiles final : public FileSystem {
public:
    /// Asked before every operation ("read", "write", "replace", "mkdir", "info", "remove", "list", "create", "append",
    /// "lock", "temporary") with its path; a number other than 0 is the errno that it fails with.
    std::function<int(std::string_view operation, const std::filesystem::path& path)> fault;

    std::map<std::filesystem::path, std::string> files;
    std::map<std::filesystem::path, Date> created; ///< where a test cares; else 2026-01-01, when the test's clock began
    std::set<std::filesystem::path> directories;

    Result<Bytes> read(const std::filesystem::path& path, std::size_t maximumSize) override;
    Result<void> writeAtomically(const std::filesystem::path& path, std::string_view contents) override;
    Result<void> replace(const std::filesystem::path& path, const std::filesystem::path& source) override;
    Result<void> copy(const std::filesystem::path& path, const FileHandle& source) override;
    Result<void> createDirectories(const std::filesystem::path& path) override;
    Result<FileInfo> info(const std::filesystem::path& path) override;
    Result<void> remove(const std::filesystem::path& path) override;
    Result<std::vector<std::string>> list(const std::filesystem::path& path) override;
    Result<FileHandle> openForReading(const std::filesystem::path& path) override;
    Result<std::unique_ptr<AppendFile>> createForAppending(const std::filesystem::path& path) override;
    Result<FileHandle> lock(const std::filesystem::path& path) override;
    Result<FileHandle> createTemporary() override;

private:
    class Appending;
    [[nodiscard]] int faultOf(std::string_view operation, const std::filesystem::path& path) const;
    std::mutex _mutex;
};

} // namespace platform::test
