#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/files/Files.h"
#include "platform/files/Sqlite.h"
#include "platform/net/UrlSession.h"
#include "platform/run/LivedTime.h"

namespace platform {

/// A background task, as it is kept on disk. Times are counts of the store's `LivedTime`.
struct StoredTask {
    /// How it ended. Kept until its owner has been told.
    struct Outcome {
        std::optional<UrlResponse> response;
        std::optional<Error> error;
    };

    std::uint64_t identifier = 0;
    bool isUpload = false;
    std::shared_ptr<const UrlRequest> request;
    std::uint64_t bodySize = 0; ///< bytes of an upload
    Value note;
    bool resumed = false;
    Duration deadline{}; ///< of a resumed task
    unsigned failures = 0;
    Duration notBefore{}; ///< when the next attempt may begin
    std::optional<Outcome> outcome;
};

/// The tasks of one background session on disk: a directory (0700) with a database of the tasks and one file (0600) for
/// each body. What a call reports done outlives a kill and a power cut. One thread at a time.
///
/// A lock gives the directory to one process. A database that is damaged or has other tables is logged and replaced by
/// an empty one. Files that belong to no task, which a kill left, are removed when the store is opened.
class BackgroundStore {
public:
    struct Contents {
        std::vector<StoredTask> tasks;         ///< in order of their identifiers
        std::map<std::string, Duration> holds; ///< hosts that asked to be left alone, and until when
        std::optional<LivedTime::Mark> time;
    };

    /// Whether there is a store in that directory.
    [[nodiscard]] static bool exists(FileSystem& files, const std::filesystem::path& directory);
    /// Opens or makes it; `files` must outlive it. Fails with EWOULDBLOCK while another process has it open.
    [[nodiscard]] static Result<std::unique_ptr<BackgroundStore>> open(FileSystem& files,
                                                                       const std::filesystem::path& directory);
    /// Makes one in a directory of its own under `parent`, which is removed with the store. Removes those that killed
    /// processes left there.
    [[nodiscard]] static Result<std::unique_ptr<BackgroundStore>> openTemporary(FileSystem& files,
                                                                                const std::filesystem::path& parent);
    ~BackgroundStore();

    /// What was in the store when it was opened. Once.
    [[nodiscard]] Contents takeContents() { return std::exchange(_contents, {}); }
    /// Adds the task with a copy of `body` (null for none), and sets its identifier and size. Fails with kUrlTooLarge
    /// if the body has more than `maximumBody` bytes. Nothing is left of a task that couldn't be added.
    [[nodiscard]] Result<void> add(StoredTask& task, const FileHandle* body, std::uint64_t maximumBody);
    /// Keeps what has changed of it; the request and the body can't.
    [[nodiscard]] Result<void> save(const StoredTask& task, const LivedTime::Mark& time);
    [[nodiscard]] Result<void> saveHold(const std::string& host, Duration until, const LivedTime::Mark& time);
    /// Removes the task and its files.
    [[nodiscard]] Result<void> forget(std::uint64_t identifier);

    /// Fails with EIO if the file no longer has the size that was copied.
    [[nodiscard]] Result<FileHandle> openBody(const StoredTask& task) const;
    /// Where a download's body goes.
    [[nodiscard]] std::filesystem::path downloadPath(std::uint64_t identifier) const;
    [[nodiscard]] bool hasDownload(std::uint64_t identifier) const;
    /// A new, empty file there, in place of what an earlier attempt left.
    [[nodiscard]] Result<FileHandle> createDownload(std::uint64_t identifier) const;
    /// Returns once the downloaded file outlives a power cut.
    [[nodiscard]] Result<void> syncDownload(std::uint64_t identifier) const;

private:
    BackgroundStore(FileSystem& files, std::filesystem::path directory, FileHandle lock)
        : _files(files), _directory(std::move(directory)), _lock(std::move(lock))
    {}
    [[nodiscard]] Result<void> openDatabase();
    [[nodiscard]] Result<void> checkDatabase();
    [[nodiscard]] Result<void> load();
    [[nodiscard]] std::filesystem::path bodyPath(std::uint64_t identifier) const;
    [[nodiscard]] Result<void> saveTime(const LivedTime::Mark& time);
    void sweep(const std::vector<StoredTask>& tasks) const;

    FileSystem& _files;
    const std::filesystem::path _directory;
    const FileHandle _lock; // the directory is this process's while it lives
    std::optional<Sqlite> _database;
    Contents _contents;
    bool _temporary = false;
};

} // namespace platform
