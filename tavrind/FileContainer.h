#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>

#include "platform/values/Value.h"

namespace platform {
class AppendFile;
class FileSystem;
class Queue;
class Record;
class Transactions;
} // namespace platform

namespace tavrin {

struct ClientSessionHeader;
struct TavrinFeedback;
class FeedbackBooks;
class StoredSession;
class TavrinDiagnosticDataReporter;
enum class FeedbackFate : std::uint8_t;

/// What the containers of one storage share; they keep it alive, and what it refers to must outlive them.
struct FileContainerStore {
    platform::FileSystem& files;
    platform::Transactions& transactions;
    TavrinDiagnosticDataReporter& diagnosticData;
    FeedbackBooks& books;
    std::shared_ptr<platform::Queue> queue; ///< serial; every access to a file runs on it
    std::string version;                    ///< first record of every file; a file with another one isn't read
    std::uint64_t maxFileSize;              ///< bytes; a file grows to fewer, and is read up to as many
};

/// One session's file, record by record (docs/formats.md): the version, the session's header, its events.
///
///     new, open ──writeSessionHeader, writeFeedback …──► close ──► closed ──read──► read once, then deleted
///     found on disk ───────────────────────────────────────────────────┘
///
/// A record that doesn't fit, or can't be written whole, leaves the file as it was; later ones may still fit. A damaged
/// file is read up to the damage. Failures are logged and booked. Any thread.
class FileContainer : public std::enable_shared_from_this<FileContainer> {
public:
    /// A file that is there already, with `feedbackCount` events as far as is known.
    FileContainer(std::shared_ptr<const FileContainerStore> store, std::filesystem::path fileUrl,
                  std::uint64_t feedbackCount = 0);
    /// A new file, open.
    FileContainer(std::shared_ptr<const FileContainerStore> store, std::filesystem::path fileUrl,
                  std::unique_ptr<platform::AppendFile> fileHandle);
    ~FileContainer();

    /// Appends the version and the header, soon. If either fails, the file is closed and takes no events.
    void writeSessionHeader(ClientSessionHeader header);
    /// Appends an event, soon, which nobody changes meanwhile; then calls `done` (may be empty), also if it did not
    /// fit. A file that isn't open takes nothing and calls nobody.
    void writeFeedback(std::shared_ptr<const TavrinFeedback> feedback, std::move_only_function<void()> done);
    /// The session with all its events that can be read; null if nothing can. Waits for the queue.
    [[nodiscard]] std::shared_ptr<StoredSession> read();
    /// Closes the file, soon; its events are then booked as closed.
    void close();

    [[nodiscard]] const std::filesystem::path& fileUrl() const { return _fileUrl; }

    /// Closes the file, if it is open. On the queue.
    void closeFile();

    /// Events in a session file, however damaged. Reads the lengths alone, up to the size that may be read.
    [[nodiscard]] static std::uint64_t countFeedback(const FileContainerStore& store,
                                                     const std::filesystem::path& fileUrl);

private:
    /// Appends a text or a record. On the queue; false if it was not written.
    template <class Object> bool _archiveObject(const Object& object);
    bool _append(const std::string& archive);
    [[nodiscard]] std::shared_ptr<StoredSession> _read();
    [[nodiscard]] std::shared_ptr<StoredSession> _unarchiveObject(const platform::Bytes& data);
    /// Logs why nothing was read, and books the file's events.
    [[nodiscard]] std::shared_ptr<StoredSession> _notRead(FeedbackFate fate, const std::string& text);

    const std::shared_ptr<const FileContainerStore> _store;
    const std::filesystem::path _fileUrl;
    std::unique_ptr<platform::AppendFile> _fileHandle; // on the queue, like the count; null when closed
    std::uint64_t _feedbackCount = 0;
};

} // namespace tavrin
