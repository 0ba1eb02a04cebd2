#pragma once

#include <atomic>
#include <cstdint>
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

/// The number in the name of a session file ("session.17"); none for another name, or a number that leaves no room for
/// later ones.
[[nodiscard]] std::optional<std::int32_t> sessionNumber(std::string_view fileName);

/// The directory of session files.
///
/// A file is created and open while its session goes on, closed and listed until it is uploaded, then deleted. Files of
/// an earlier process are listed from the start, those that are too old are deleted. Any thread.
class TavrinPersistentStorage : public std::enable_shared_from_this<TavrinPersistentStorage> {
public:
    /// Scans the directory.
    explicit TavrinPersistentStorage(Assembly& assembly);
    ~TavrinPersistentStorage();

    /// A new file, open for one session; null if there can be none.
    [[nodiscard]] std::shared_ptr<FileContainer> createFileContainerForWriting();
    /// The closed files, oldest first as far as their numbers tell. They stay in the list.
    [[nodiscard]] std::vector<std::shared_ptr<FileContainer>> getAvailableSessionHandles();
    /// Closes a file, soon, and lists it.
    void closeSessionWithFileContainer(std::shared_ptr<FileContainer> container);
    /// Deletes a file, soon, and lists it no longer.
    void deleteSessionWithFileContainer(std::shared_ptr<FileContainer> container);

    [[nodiscard]] const FileContainerStore& store() const { return *_store; }

private:
    void _scanCacheDirectory();
    [[nodiscard]] std::optional<std::int32_t> _adopt(const std::string& name);
    [[nodiscard]] std::optional<std::filesystem::path> _newFileUrl();

    Assembly& _assembly;
    std::shared_ptr<platform::Queue> _queue;
    std::filesystem::path _cachesUrl;
    std::shared_ptr<const FileContainerStore> _store;
    double _maxFileAge = 0; ///< seconds
    std::atomic<std::int32_t> _handleId = 0;
    std::atomic<int> _fileCount = 0;                             ///< session files, open and listed
    std::vector<std::shared_ptr<FileContainer>> _fileContainers; // on _queue
};

} // namespace tavrin
