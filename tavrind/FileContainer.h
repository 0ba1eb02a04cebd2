#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>

#include "platform/run/Reply.h"
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
class StoredSession;
class TavrinDiagnosticDataReporter;
enum class FeedbackFate : std::uint8_t;

/// The state that the containers of one storage share and own together. The objects that it refers to must outlive
/// them.
struct FileContainerStore {
    platform::FileSystem& files;
    platform::Transactions& transactions;
    TavrinDiagnosticDataReporter& diagnosticData;
    std::shared_ptr<platform::Queue> queue; ///< serial; every access to a file runs on it
    std::string version;                    ///< the first record of every file; files with another version are not read
    std::uint64_t maxFileSize;              ///< in bytes; a written file is smaller, a file of this size is still read
};

/// The purpose of a session file.
enum class FileUse {
    Session,
    OneOff, ///< a session of one record, which a client may cause with every message
};

/// The result of reading a session file.
struct FileReading {
    std::shared_ptr<StoredSession> session; ///< null if nothing could be read
    std::uint64_t lost = 0;                 ///< events of the file that are not in `session`
    FeedbackFate fate{};                    ///< of those
};

/// One session's file, record by record (docs/formats.md): the version, the session's header, its events.
///
///     new, open ──writeSessionHeader, writeFeedback …──► close ──► closed ──read──► read once, then deleted
///     found on disk ──countFeedback────────────────────────────────────┘
///
/// A record that doesn't fit or can't be written completely leaves the file unchanged; later records may still fit. A
/// damaged file is read up to the damage. Failures are logged and reported to the caller. Any thread.
class FileContainer : public std::enable_shared_from_this<FileContainer> {
public:
    /// Refers to an existing, closed file.
    FileContainer(std::shared_ptr<const FileContainerStore> store, std::filesystem::path fileUrl);
    /// Refers to a new file that is open for writing.
    FileContainer(std::shared_ptr<const FileContainerStore> store, std::filesystem::path fileUrl,
                  std::unique_ptr<platform::AppendFile> fileHandle, FileUse use = FileUse::Session);
    ~FileContainer();

    /// Appends the version and the header, asynchronously. If either fails, closes the file, which then accepts no
    /// events.
    void writeSessionHeader(ClientSessionHeader header);
    /// Appends an event, asynchronously; the caller must not modify it from then on. Then calls `done` (may be empty)
    /// with whether it was written. Abandons `done` if the file is not open.
    void writeFeedback(std::shared_ptr<const TavrinFeedback> feedback, platform::Reply<bool> done);
    /// Reads the session with all events before the first damaged record. Blocks on the queue.
    [[nodiscard]] FileReading read();
    /// Closes the file, asynchronously.
    void close();

    [[nodiscard]] const std::filesystem::path& fileUrl() const { return _fileUrl; }
    [[nodiscard]] FileUse use() const { return _use; }

    // On the queue.

    /// Closes the file if it is open.
    void closeFile();
    /// Counts the complete events in a file of an earlier process, for `feedbackCount`.
    void countFeedback();
    /// Returns the number of events in the file: written by this process, or counted.
    [[nodiscard]] std::uint64_t feedbackCount() const { return _feedbackCount; }

private:
    /// Appends a text or a record, on the queue. Returns false if it was not written.
    template <class Object> bool _archiveObject(const Object& object);
    bool _append(const std::string& archive);
    [[nodiscard]] FileReading _read();
    [[nodiscard]] FileReading _unarchiveObject(const platform::Bytes& data);
    /// Logs `text` and returns a reading without a session.
    [[nodiscard]] FileReading _notRead(FeedbackFate fate, const std::string& text) const;

    const std::shared_ptr<const FileContainerStore> _store;
    const std::filesystem::path _fileUrl;
    const FileUse _use = FileUse::Session;
    std::unique_ptr<platform::AppendFile> _fileHandle; // on the queue, like the count; null if closed
    std::uint64_t _feedbackCount = 0;
};

} // namespace tavrin
