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

/// A background task as stored on disk. Times are counts of the store's `LivedTime`.
struct StoredTask {
    /// The task's result. Stored until the delegate has been called.
    struct Outcome {
        std::optional<UrlResponse> response;
        std::optional<Error> error;
    };

    std::uint64_t identifier = 0;
    bool isUpload = false;
    std::shared_ptr<const UrlRequest> request;
    std::uint64_t bodySize = 0; ///< bytes of an upload's body
    Value note;
    bool resumed = false;
    Duration deadline{}; ///< of a resumed task
    unsigned failures = 0;
    Duration notBefore{}; ///< earliest start of the next attempt
    std::optional<Outcome> outcome;
};

/// The tasks of one background session on disk: a directory (0700) with a database of the tasks and one file (0600) for
/// each body. A change survives a kill and a power cut after its call has succeeded. One thread at a time.
///
/// One process at a time: the store holds a lock on the directory. A database that is damaged or has other tables is
/// logged and replaced by an empty one. Opening removes files without a task, which a kill left.
class BackgroundStore {
public:
    struct Contents {
        std::vector<StoredTask> tasks;         ///< in order of their identifiers
        std::map<std::string, Duration> holds; ///< hosts that sent Retry-After, and when their hold ends
        std::optional<LivedTime::Mark> time;
    };

    /// Returns true if the directory has a store.
    [[nodiscard]] static bool exists(FileSystem& files, const std::filesystem::path& directory);
    /// Opens or creates a store; `files` must outlive it. Fails with EWOULDBLOCK if another process has it open.
    [[nodiscard]] static Result<std::unique_ptr<BackgroundStore>> open(FileSystem& files,
                                                                       const std::filesystem::path& directory);
    /// Creates a store in a new subdirectory of `parent`; the destructor removes it. Removes the temporary stores of
    /// killed processes.
    [[nodiscard]] static Result<std::unique_ptr<BackgroundStore>> openTemporary(FileSystem& files,
                                                                                const std::filesystem::path& parent);
    ~BackgroundStore();

    /// Returns the contents of the store at its opening. Call it once.
    [[nodiscard]] Contents takeContents() { return std::exchange(_contents, {}); }
    /// Adds the task with a copy of `body` (null for none), and sets its identifier and size. Fails with kUrlTooLarge
    /// if the body has more than `maximumBody` bytes. A failure leaves nothing on disk.
    [[nodiscard]] Result<void> add(StoredTask& task, const FileHandle* body, std::uint64_t maximumBody);
    /// Updates the task, except for its request and body, which never change.
    [[nodiscard]] Result<void> save(const StoredTask& task, const LivedTime::Mark& time);
    [[nodiscard]] Result<void> saveHold(const std::string& host, Duration until, const LivedTime::Mark& time);
    /// Removes the task and its files.
    [[nodiscard]] Result<void> forget(std::uint64_t identifier);

    /// Opens an upload's body. Fails with EBADMSG if the file's size is not `StoredTask::bodySize`.
    [[nodiscard]] Result<FileHandle> openBody(const StoredTask& task) const;
    /// Returns the path of a download's body.
    [[nodiscard]] std::filesystem::path downloadPath(std::uint64_t identifier) const;
    [[nodiscard]] bool hasDownload(std::uint64_t identifier) const;
    /// Creates an empty file at that path; replaces the file of an earlier attempt.
    [[nodiscard]] Result<FileHandle> createDownload(std::uint64_t identifier) const;
    /// Makes the downloaded file durable.
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
    const FileHandle _lock; // reserves the directory for this process
    std::optional<Sqlite> _database;
    Contents _contents;
    bool _temporary = false;
};

} // namespace platform
