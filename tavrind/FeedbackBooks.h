#pragma once

#include <array>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <mutex>
#include <string>

#include "platform/values/Value.h"

namespace platform {
class FileSystem;
class Queue;
} // namespace platform

namespace tavrin {

/// Where a recorded event is now, or what became of it.
enum class FeedbackFate : std::uint8_t {
    Open,      ///< in a session that goes on, or about to be sent on its own
    Closed,    ///< in a closed session file
    Uploading, ///< in an upload that has not ended
    Sent,      ///< the service has it
    NotSent,   ///< its upload failed
    Unknown,   ///< it was somewhere when an earlier process ended, and wasn't found again
    // Dropped, because
    FeedbackOff,   ///< the bag doesn't want feedback
    NoContainer,   ///< the session has no file
    RefusedAppend, ///< it did not fit into the session's file, or could not be written there
    FileTooBig,    ///< the session's file was larger than may be read
    TooOld,        ///< the session's file was too old
    Unreadable,    ///< the session's file could not be read
    OtherVersion,  ///< another version of the daemon wrote the session's file
    DamagedTail,   ///< it stood behind a damaged record
    NotJson,       ///< it can't be written as JSON
    NoBody,        ///< the upload's body could not be written
    NoTask,        ///< the upload could not be made
    EndpointUnset, ///< there was nowhere to send it to
    BufferFull,    ///< too many waited to be sent already
};
inline constexpr std::size_t kFeedbackFates = static_cast<std::size_t>(FeedbackFate::BufferFull) + 1;

/// The books of the feedback pipeline, in events: every event that was recorded is in exactly one place, so that
/// `recorded` is at all times the sum over all fates.
///
/// They outlive the process. They are saved where events change hands between files (a session is closed, read,
/// uploaded), not with every event. A new process takes all that was under way for unknown, and moves to their places
/// the events that it finds again in session files and unfinished uploads; what it finds beyond the books, written
/// after they were last saved, it books as recorded. It can't tell one event from another: one that was written since
/// then takes the place of one that is gone, and an upload that is reported again after a kill is booked again. Any
/// thread.
class FeedbackBooks {
public:
    /// Reads `path`; a damaged file is logged, and the books begin anew.
    /// `queue` (serial) runs the saving.
    FeedbackBooks(platform::FileSystem& files, std::filesystem::path path, std::shared_ptr<platform::Queue> queue);

    /// An event was recorded, and is at, or dropped for, `fate`.
    void record(FeedbackFate fate, std::uint64_t events = 1);
    /// Events went on.
    void move(FeedbackFate from, FeedbackFate to, std::uint64_t events);
    /// Events of an earlier process were found.
    void find(FeedbackFate fate, std::uint64_t events);
    /// Writes them out; a failure is logged, and the books go on in memory.
    void save();
    /// The same, soon, and once for calls that come close together.
    void saveSoon();

    /// Names this process's part of the books, unlike that of any other.
    [[nodiscard]] const std::string& process() const { return _process; }

    [[nodiscard]] std::int64_t recorded() const;
    [[nodiscard]] std::int64_t count(FeedbackFate fate) const;
    /// {"recorded", "open", "closed", "uploading", "sent", "notSent", "unknown", "dropped": {reason: events}}; every
    /// reason is there.
    [[nodiscard]] platform::Value description() const;

private:
    void _load();

    platform::FileSystem& _files;
    const std::filesystem::path _path;
    const std::string _process;
    mutable std::mutex _mutex; // guards all below
    std::int64_t _recorded = 0;
    std::array<std::int64_t, kFeedbackFates> _counts{};
    std::int64_t _unresolved = 0; ///< of the unknown ones, those that may still be found
    bool _saveQueued = false;
    std::shared_ptr<platform::Queue> _queue;
    std::mutex _saving; // keeps an older state from overwriting a newer one
};

} // namespace tavrin
