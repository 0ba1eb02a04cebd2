#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <deque>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
struct FileContainerStore;
class FileContainer;
enum class FileUse;

/// The user defaults "TAVSessionSizeLimit", in bytes, and "TAVSessionMaxAge", in seconds, if they are not set.
inline constexpr std::int64_t kDefaultMaxFileSize = 4 << 20;
inline constexpr std::int64_t kDefaultMaxFileAge = 48 * 60 * 60;

/// The directory of session files.
///
/// A file is open while its session lasts, then closed and listed until it is uploaded, then deleted. Files of an
/// earlier process are listed from the start, except those that are too old. Any thread.
class TavrinPersistentStorage : public std::enable_shared_from_this<TavrinPersistentStorage> {
public:
    /// Scans the directory. Afterwards, on the queue and file by file, counts the events in the found files and deletes
    /// files that are too old.
    static std::shared_ptr<TavrinPersistentStorage> make(Assembly& assembly);
    explicit TavrinPersistentStorage(Assembly& assembly);
    ~TavrinPersistentStorage();

    /// Creates a file for one session, open for writing; null if that fails or too many files of this use exist.
    [[nodiscard]] std::shared_ptr<FileContainer> createFileContainerForWriting(FileUse use);
    /// Returns the closed files in the order of their numbers. They stay in the list. Blocks on the queue.
    [[nodiscard]] std::vector<std::shared_ptr<FileContainer>> getAvailableSessionHandles();
    /// Returns the files of sessions that have not ended, for reading only. Blocks on the queue.
    [[nodiscard]] std::vector<std::shared_ptr<FileContainer>> getOpenSessionHandles();
    /// Closes a file and lists it, asynchronously.
    void closeSessionWithFileContainer(std::shared_ptr<FileContainer> container);
    /// Deletes a file and removes it from the list. Returns false, and keeps it in the list, if the file stays. Blocks
    /// on the queue.
    bool deleteSessionWithFileContainer(const std::shared_ptr<FileContainer>& container);
    /// Blocks until the files deleted so far cannot reappear after a power failure. Writes to disk; must not be called
    /// on the queue.
    void syncDeletions();

    [[nodiscard]] const FileContainerStore& store() const { return *_store; }

private:
    void _scanCacheDirectory();
    /// Lists a file of an earlier process unless it is too old. Returns its number if the file stays.
    [[nodiscard]] std::optional<std::int32_t> _adopt(const std::string& name);
    /// Books the events of the next file of an earlier process, and deletes it if it is too old. On the queue.
    void _settle();
    /// Settles all files, one task each.
    void _settleSoon();
    [[nodiscard]] std::optional<std::filesystem::path> _newFileUrl();

    Assembly& _assembly;
    std::shared_ptr<platform::Queue> _queue;
    std::filesystem::path _cachesUrl;
    std::shared_ptr<const FileContainerStore> _store;
    struct Found {
        std::shared_ptr<FileContainer> container;
        bool isTooOld;
    };

    double _maxFileAge = 0; ///< in seconds
    std::atomic<std::int32_t> _handleId = 0;
    std::array<std::atomic<int>, 2> _fileCounts{};               ///< files open and listed, by `FileUse`
    std::vector<std::shared_ptr<FileContainer>> _fileContainers; // on _queue
    std::deque<Found> _unsettled;                                // on _queue
};

} // namespace tavrin
